#include <gmock/gmock.h>

#include "RefreshRateDetector.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/TestClock.h"

namespace android {
namespace {

using namespace Interpolation;
using testing::ElementsAre;

constexpr nsecs_t SECOND = 1'000'000'000;

using Intervals = std::pair<std::vector<nsecs_t>, int>;  // and the rate they give

class RefreshRateDetectorTest : public testing::TestWithParam<Intervals> {
protected:
    void feed(const std::vector<nsecs_t>& intervals) {
        for (nsecs_t interval : intervals)
            mDetector->addVsync(mVsync += interval);
    }

    test::TestClock mClock;
    const uint32_t mUid = test::nextTestUid();
    sp<RefreshRateDetector> mDetector = new RefreshRateDetector(mUid);
    nsecs_t mVsync = 5 * SECOND;
};

TEST_P(RefreshRateDetectorTest, roundsTheMeanOfTheShortIntervalsToFiveHertz) {
    mDetector->addVsync(mVsync);
    feed(GetParam().first);
    mDetector->updateRefreshRate();
    EXPECT_EQ(GetParam().second, mDetector->getRefreshRate());
}

constexpr nsecs_t HZ60 = 16'666'666, HZ120 = 8'333'333;
INSTANTIATE_TEST_SUITE_P(
        Rates, RefreshRateDetectorTest,
        testing::Values(Intervals{{HZ60, HZ60, HZ60}, 60}, Intervals{{HZ120, HZ120}, 120},
                        Intervals{{11'111'111, 11'111'111}, 90},
                        Intervals{{17'543'859, 17'543'859}, 55},  // 57 Hz
                        Intervals{{17'241'379, 17'241'379}, 60},  // 58 Hz
                        Intervals{{2 * HZ60, HZ60, HZ60}, 60},    // the missed vsync goes
                        Intervals{{HZ60, 2 * HZ60}, 40},          // the first is never a minimum
                        Intervals{{HZ120}, 60}));                 // too few to judge

TEST_F(RefreshRateDetectorTest, dropsGlitchesAndMissedVsyncsAndLogsWithItsTag) {
    test::LogCapture log(2);
    // Rejected deltas of 1 us and 1 s still move the previous vsync.
    feed({0, HZ60, HZ60, HZ60, 1'000, HZ60, SECOND, HZ60, 2 * HZ60});
    mDetector->updateRefreshRate();
    EXPECT_EQ(60, mDetector->getRefreshRate());
    EXPECT_EQ("RefreshRateDetector", log.lines().at(1).tag);
    EXPECT_THAT(log.texts(),
                ElementsAre("RefreshRateDetector::updateRefreshRate Mean interval = 19444440",
                            "Halfway interval = 24999999",
                            "RefreshRateDetector::updateRefreshRate Average interval = 16666665, "
                            "refresh rate = 60 rounded to 60"));
}

TEST_F(RefreshRateDetectorTest, reestimatesEverySecondOfVsyncsUntilSwitchedOff) {
    const nsecs_t start = mClock.now();
    feed(std::vector<nsecs_t>(100, HZ120));
    mClock.set(start + SECOND);
    feed({HZ120});
    EXPECT_EQ(60, mDetector->getRefreshRate());  // not due yet
    mClock.set(start + SECOND + 1);
    feed({HZ120});
    EXPECT_EQ(120, mDetector->getRefreshRate());

    Settings s;
    for (bool detect : {false, true}) {
        s.detectRefreshRate = detect;
        SettingsController::getInstance()->setSettings(mUid, s);
        SettingsController::getInstance()->notifyChanges();
        mDetector->updateRefreshRate();
        EXPECT_EQ(60, mDetector->getRefreshRate());
        feed(std::vector<nsecs_t>(100, HZ60));  // the ring keeps only these
    }
}

}  // namespace
}  // namespace android
