#include <limits>
#include <memory>

#include <binder/Parcel.h>
#include <gtest/gtest.h>

#include <cstring>

namespace android {
namespace {

std::vector<uint32_t> words(const Parcel& parcel) {
    std::vector<uint32_t> words(parcel.dataSize() / 4);
    memcpy(words.data(), parcel.data(), words.size() * 4);
    return words;
}

TEST(ParcelTest, writesLittleEndianWordsAndPadsByteArrays) {
    Parcel parcel;
    parcel.writeInt32(-2);
    parcel.writeUint32(0x80000000u);
    parcel.writeInt64(0x0000000500000007);
    parcel.writeFloat(1.0f);
    const uint8_t bytes[] = {1, 2, 3, 4, 5};
    parcel.writeByteArray(sizeof(bytes), bytes);

    EXPECT_EQ((std::vector<uint32_t>{0xfffffffe, 0x80000000, 7, 5, 0x3f800000, 5, 0x04030201,
                                     0x00000005}),
              words(parcel));

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

TEST(ParcelTest, readsPastTheEndGiveZeroAndStayAtTheEnd) {
    Parcel parcel;
    const uint8_t data[] = {1, 0, 0, 0, 9, 9};  // one int32 and half of another
    parcel.setData(data, sizeof(data));

    EXPECT_EQ(1, parcel.readInt32());
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

TEST(ParcelTest, byteArrayLongerThanTheDataIsRefused) {
    Parcel parcel;
    parcel.writeInt32(std::numeric_limits<int32_t>::max());
    parcel.writeInt32(0);
    parcel.setDataPosition(0);
    std::vector<uint8_t> read;
    EXPECT_EQ(NOT_ENOUGH_DATA, parcel.readByteVector(&read));
    EXPECT_TRUE(read.empty());
    EXPECT_EQ(0u, parcel.dataPosition());
}

}  // namespace
}  // namespace android
