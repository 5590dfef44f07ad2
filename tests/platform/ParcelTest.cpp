#include <limits>
#include <memory>

#include <binder/Parcel.h>
#include <gtest/gtest.h>

#include <cstring>

namespace android {
namespace {

TEST(ParcelTest, writesLittleEndianWordsAndPadsByteArrays) {
    Parcel parcel;
    parcel.writeInt32(-2);
    parcel.writeUint32(0x80000000u);
    parcel.writeInt64(0x0000000500000007);
    parcel.writeFloat(1.0f);
    const uint8_t bytes[] = {1, 2, 3, 4, 5};
    parcel.writeByteArray(sizeof(bytes), bytes);

    std::vector<uint32_t> words(parcel.dataSize() / 4);
    memcpy(words.data(), parcel.data(), words.size() * 4);
    EXPECT_EQ((std::vector<uint32_t>{0xfffffffe, 0x80000000, 7, 5, 0x3f800000, 5, 0x04030201,
                                     0x00000005}),
              words);

    parcel.setDataPosition(0);
    EXPECT_EQ(-2, parcel.readInt32());
    EXPECT_EQ(0x80000000u, parcel.readUint32());
    EXPECT_EQ(0x0000000500000007, parcel.readInt64());
    EXPECT_EQ(1.0f, parcel.readFloat());
    std::vector<uint8_t> read;
    ASSERT_EQ(NO_ERROR, parcel.readByteVector(&read));
    EXPECT_EQ(std::vector<uint8_t>(bytes, bytes + 5), read);
    EXPECT_EQ(parcel.dataSize(), parcel.dataPosition());
}

TEST(ParcelTest, refusesReadsPastTheEnd) {
    Parcel parcel;
    const uint8_t data[] = {0xff, 0xff, 0xff, 0x7f, 9, 9};  // the largest int32, half of another
    parcel.setData(data, sizeof(data));
    std::vector<uint8_t> read;
    EXPECT_EQ(NOT_ENOUGH_DATA, parcel.readByteVector(&read));  // far longer than the data
    EXPECT_TRUE(read.empty());
    EXPECT_EQ(std::numeric_limits<int32_t>::max(), parcel.readInt32());  // nothing was consumed

    // Reads past the end give zero and stay at the end.
    EXPECT_EQ(0, parcel.readInt32());
    EXPECT_EQ(0, parcel.readInt64());
    EXPECT_EQ(0.0f, parcel.readFloat());
    int32_t value = 7;
    EXPECT_EQ(NOT_ENOUGH_DATA, parcel.readInt32(&value));
    EXPECT_EQ(0, value);
    EXPECT_EQ(4u, parcel.dataPosition());
    parcel.setDataPosition(1000);
    EXPECT_EQ(sizeof(data), parcel.dataPosition());
    EXPECT_EQ(0u, parcel.readUint32());
}

}  // namespace
}  // namespace android
