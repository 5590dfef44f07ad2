#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstring>

#include "host/SettingsMessage.h"

namespace verolux::host {
namespace {

using testing::ElementsAre;
using Points = std::vector<SettingValue::Point>;

std::vector<uint32_t> words(const std::vector<SettingValue>& values) {
    android::Parcel parcel;
    writeSettingsMessage(values, parcel);
    std::vector<uint32_t> words(parcel.dataSize() / 4);
    memcpy(words.data(), parcel.data(), words.size() * 4);
    return words;
}

TEST(SettingsMessageTest, writesTheCountThenEachIdAndItsValueInOneWordPerItem) {
    // 0.5f is 0x3f000000, 0.25f 0x3e800000, 1.0f 0x3f800000; bools go as int32 0 and 1; a curve
    // as its point count, then x and y of each point.
    const Points curve = {{0.0f, 0.25f}, {1.0f, 1.0f}};
    EXPECT_THAT(
            words({{1, int32_t{-3}}, {4, 0.5f}, {2, false}, {115, true}, {21, curve}, {21, Points{}}}),
            ElementsAre(6, 1, 0xfffffffd, 4, 0x3f000000, 2, 0, 115, 1, 21, 2, 0, 0x3e800000,
                        0x3f800000, 0x3f800000, 21, 0));
    EXPECT_THAT(words({}), ElementsAre(0));
}

}  // namespace
}  // namespace verolux::host
