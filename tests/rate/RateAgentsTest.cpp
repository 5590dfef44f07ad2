#include <gmock/gmock.h>

#include "GFPSAgent.h"
#include "RFPSAgent.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"
#include "support/TestClock.h"

namespace android {
namespace {

using namespace Interpolation;
using testing::ElementsAre;

class RFPSAgentTest : public testing::Test {
protected:
    RFPSAgentTest() {
        EventDispatcher::subscribe(mUid, eDFSChangedEvent | ePresentationRefusedEvent, mEvents);
        mAgent = new RFPSAgent(mUid, mName);
    }

    test::LogCapture mLog{2};
    test::TestClock mClock;
    const nsecs_t mStart = mClock.now();
    const uint32_t mUid = test::nextTestUid();
    String8 mName{"game"};
    sp<test::RecordingReceiver> mEvents = new test::RecordingReceiver();
    sp<RFPSAgent> mAgent;
};

TEST_F(RFPSAgentTest, followsTheGameRisingAtOnceFallingSmoothlyBoundedByTheRefreshRate) {
    mAgent->tick();  // a negative offset leaves the rate to the settings' fixed rfps
    Settings s;
    s.rfpsOffset = 5;
    s.rfpsSmoothness = 0.5f;  // ignored: only 1 or more is taken
    SettingsController::getInstance()->setSettings(mUid, s);
    SettingsController::getInstance()->notifyChanges();
    mClock.advance(RFPSAgent::UPDATE_PERIOD + 1);
    mAgent->update(40, 60);  // 0.8 * 60 + 0.2 * 45
    mAgent->update(70, 60);  // not due again
    mAgent->tick();          // 75 for a display of 60
    mAgent->update(5, 10);   // 0.8 * 60 + 0.2 * 10 = 50: above the minimum, not the refresh rate
    mAgent->tick();
    s.rfpsSmoothness = 1.0f;
    mAgent->onSettingsChanged(s);
    for (int fps : {40, 0}) {  // 45 at once, then 45 * 0.99999 + 0.00001 * 5
        mAgent->update(fps, 60);
        mAgent->tick();
    }
    std::vector<int> rates;
    for (const auto& event : mEvents->events())
        rates.push_back(std::get<int>(event.data));
    EXPECT_THAT(rates, ElementsAre(60, 57, 60, 10, 45, 44));
    EXPECT_TRUE(mLog.contains("RFPSAgent [game] time: 500000001 newFPS: 40, newRefreshRate: 60"));
    EXPECT_TRUE(mLog.contains("RFPSAgent [game] tick: time: 500000001 newRFPS: 57.000000"));
    EXPECT_EQ(1, mLog.count("InterpolationController: RFPS Smoothness 0.800000"));
    EXPECT_EQ(1, mLog.count("InterpolationController: RFPS Smoothness 0.999990"));
}

TEST_F(RFPSAgentTest, presentsAtFakeVsyncsAndMakesUpForFailuresAndPullsItsClockBack) {
    Settings s;
    // Rates that cannot pace a display are refused; 60 moves the first fake vsync from 8,333,333 ns
    // to 16,666,666 ns.
    for (int rfps : {0, 1001, 60}) {
        s.rfps = rfps;
        mAgent->onSettingsChanged(s);
    }
    EXPECT_EQ(1, mLog.count("RFPSAgent [game] render rate 1001 out of range, keeping the fake "
                            "vsync at 8333333 ns"));
    mClock.set(mStart + 16'666'666 - 16'666'666 / 8);  // an eighth of a period early is not enough
    EXPECT_FALSE(mAgent->shouldPresentNow());
    mClock.advance(1);
    EXPECT_TRUE(mAgent->shouldPresentNow());
    mAgent->onPresentFail();
    EXPECT_TRUE(mAgent->shouldPresentNow());  // the chance the failure earned
    mAgent->onPresentSuccess();
    EXPECT_FALSE(mAgent->shouldPresentNow());
    mAgent->onPresentFail();  // not at a fake vsync: earns nothing
    EXPECT_FALSE(mAgent->shouldPresentNow());
    EXPECT_THAT(mEvents->types(), ElementsAre(eDFSChangedEvent, ePresentationRefusedEvent,
                                              ePresentationRefusedEvent, ePresentationRefusedEvent));
    EXPECT_EQ(1,
              mLog.count("RFPSAgent [game] Missed a frame, incrementing skipped frame count to 1"));
    EXPECT_EQ(1, mLog.count("RFPSAgent [game] onPresentSuccessPresenting outside of RFPS intervals "
                            "to make up for a skipped frame. Remaining chances: 0"));

    // The next fake vsync is due at 33,333,332 ns; with the clock back at the start it lies more
    // than a period ahead, and the 60th fake vsync pulls it back, once.
    mClock.set(mStart);
    for (int i = 1; i < 2 * RFPSAgent::RESET_VSYNC_CLOCK; i++)
        mAgent->fakeVsync();
    EXPECT_EQ("RFPSAgent::fakeVsync [game] changeNext from 1033333332 to 1016666666",
              mLog.texts().back());
}

TEST(GFPSAgentTest, holdsTheGameBelowItsSmoothedRateWithinTheSettingsBounds) {
    test::LogCapture log(2);
    const uint32_t uid = test::nextTestUid();
    std::vector<int> limits;
    FunctionWrapper<void(int)> setter = [&limits](int gfps) { limits.push_back(gfps); };
    String8 name("game");
    sp<GFPSAgent> agent = new GFPSAgent(uid, name, setter, new RefreshRateDetector(uid));

    agent->update(50);  // 0.100000024 * 50 + 0.9 * 60 = 59
    agent->update(55);  // 58.6 - 5, rounded up
    agent->update(90);  // rises at once, but not above the refresh rate of 60
    Settings s;
    s.gfpsOffset = 49;  // ceil(11) is below the minimum
    SettingsController::getInstance()->setSettings(uid, s);
    SettingsController::getInstance()->notifyChanges();  // the offset is not enabled: no limit
    s.gfpsOffsetEnabled = true;
    agent->onSettingsChanged(s);
    s.gfpsMinimum = 70;
    s.gfpsMaximum = 50;
    agent->onSettingsChanged(s);
    EXPECT_THAT(limits, ElementsAre(54, 54, 55, 15, 50));
    EXPECT_THAT(log.texts(), testing::IsSupersetOf({"[game] GFPSAgent: GFPS Offset 49",
                                                    "[game] GFPSAgent: GFPS Minimum 70",
                                                    "[game] GFPSAgent: GFPS Maximum 50"}));
}

}  // namespace
}  // namespace android
