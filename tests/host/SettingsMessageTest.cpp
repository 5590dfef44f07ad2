#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstring>

#include "host/SettingsMessage.h"

namespace verolux::host {
namespace {

using testing::ElementsAre;

std::vector<uint32_t> words(const android::Parcel& parcel) {
    std::vector<uint32_t> words(parcel.dataSize() / 4);
    memcpy(words.data(), parcel.data(), words.size() * 4);
    return words;
}

TEST(SettingsMessageTest, writesTheCountThenEachIdAndItsValueInOneWordPerItem) {
    android::Parcel parcel;
    writeSettingsMessage({{1, int32_t{-3}},
                          {4, 0.5f},
                          {2, false},
                          {115, true},
                          {21, std::vector<SettingValue::Point>{{0.0f, 0.25f}, {1.0f, 1.0f}}}},
                         parcel);

    // 0.5f is 0x3f000000, 0.25f 0x3e800000, 1.0f 0x3f800000; bools go as int32 0 and 1.
    EXPECT_THAT(words(parcel), ElementsAre(5, 1, 0xfffffffd, 4, 0x3f000000, 2, 0, 115, 1, 21, 2, 0,
                                           0x3e800000, 0x3f800000, 0x3f800000));
}

TEST(SettingsMessageTest, anEmptyMessageAndAnEmptyCurveKeepTheirCounts) {
    android::Parcel empty;
    writeSettingsMessage({}, empty);
    EXPECT_THAT(words(empty), ElementsAre(0));

    android::Parcel noPoints;
    writeSettingsMessage({{21, std::vector<SettingValue::Point>{}}}, noPoints);
    EXPECT_THAT(words(noPoints), ElementsAre(1, 21, 0));
}

}  // namespace
}  // namespace verolux::host
