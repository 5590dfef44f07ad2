#include <limits>
#include <memory>

#include <binder/Parcel.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <gui/InterpolationGui.h>
#include <json/json.h>

#include <cmath>
#include <cstring>
#include <functional>

#include "SettingsController.h"
#include "Tunables.h"
#include "support/Frames.h"
#include "support/LogCapture.h"

namespace android::Interpolation {
namespace {

using test::LogCapture;
using testing::ElementsAre;

TEST(FunctionTest, dropsPointsOutOfOrderRaisesFallingOnesAndIgnoresAnOddValueButNotNaNs) {
    LogCapture log(1);
    EXPECT_THAT(Function({0.5f, 0.5f, 0.4f, 0.9f}, true).getPoints(),
                ElementsAre(Point{0, 0}, Point{0.5f, 0.5f}, Point{1, 1}));
    // The corrected point does not become the reference for the order check.
    EXPECT_THAT(Function({0, 0, 0.5f, 0.8f, 0.6f, 0.5f, 0.55f, 0.9f}, false).getPoints(),
                ElementsAre(Point{0, 0}, Point{0.5f, 0.8f}, Point{0.6f, 0.8f}, Point{0.55f, 0.9f}));
    EXPECT_THAT(Function({0.1f, 0.2f, 0.3f}, false).getPoints(), ElementsAre(Point{0.1f, 0.2f}));
    const std::vector<Point> nan = Function({0.5f, 0.5f, NAN, 0.6f, 0.7f, NAN}, true).getPoints();
    ASSERT_EQ(4u, nan.size());
    EXPECT_TRUE(std::isnan(nan[2].x) && std::isnan(nan[3].y));
    EXPECT_THAT(log.texts(),
                ElementsAre("Warning: alpha function point is out of order! Ignoring (0.400000, "
                            "0.900000)",
                            "Warning: correction applied to non-increasing sequence of Y values "
                            "used in alpha function settings! (0.600000, 0.500000) -> (0.600000, "
                            "0.800000)",
                            "Warning: odd number (3) of X-Y values used in alpha function "
                            "settings! Ignoring last value (0.300000)"));
}

TEST(FunctionTest, evaluatesSegmentsAndClampsOutsideThemWithAWarning) {
    LogCapture log(1);
    const Function curve({0, 0, 0.2f, 0, 0.8f, 1, 1, 1}, true);
    EXPECT_EQ(0.5f, curve.getY(0.5f));
    EXPECT_EQ(0.0f, curve.getY(0.1f));
    EXPECT_EQ(0.0f, curve.getY(-0.1f));
    // The end of the last segment is outside it: exactly 1 is clamped too, with the warning.
    EXPECT_EQ(1.0f, curve.getY(1.0f));
    EXPECT_EQ(1.0f, curve.getY(NAN));
    EXPECT_THAT(log.texts(),
                ElementsAre("Warning: alpha input -0.100000 out of range in alpha function "
                            "settings! Returning clamped value 0.000000",
                            "Warning: alpha input 1.000000 out of range in alpha function "
                            "settings! Returning clamped value 1.000000",
                            "Warning: alpha input nan out of range in alpha function "
                            "settings! Returning clamped value 1.000000"));

    EXPECT_EQ(0.3f, Function({}, false).getY(0.3f));  // no points: the identity
    EXPECT_EQ(0.25f, Function({0.5f, 0.25f}, false).getY(0.0f));
}

struct Word {
    Word(int32_t value) : bits(static_cast<uint32_t>(value)) {}
    Word(float value) { memcpy(&bits, &value, sizeof(bits)); }
    bool operator==(const Word& other) const { return bits == other.bits; }
    uint32_t bits;
};

struct TestObserver : SettingsController::Observer {
    explicit TestObserver(uint32_t uid) : mUid(uid) {}
    void onSettingsChanged(const Settings& settings) override {
        mReceived.push_back(settings.gameFpsLimit);
        if (mOnChanged) mOnChanged();
    }
    uint32_t getUID() const override { return mUid; }
    // When set it dies without unsubscribing, as a component that overrides this may.
    void onLastStrongRef(const void* id) override {
        if (!mStays) Observer::onLastStrongRef(id);
    }

    std::vector<int32_t> mReceived;  // gameFpsLimit of every delivery
    std::function<void()> mOnChanged;
    bool mStays = false;
    const uint32_t mUid;
};

class SettingsControllerTest : public testing::Test {
protected:
    bool update(uint32_t uid, std::initializer_list<Word> words) {
        Parcel parcel;
        for (Word word : words)
            parcel.writeUint32(word.bits);
        parcel.setDataPosition(0);
        return mController->updateSettings(uid, parcel);
    }

    std::vector<Word> written(uint32_t uid) {
        Parcel parcel;
        EXPECT_TRUE(mController->writeSettings(uid, &parcel));
        const auto* words = reinterpret_cast<const Word*>(parcel.data());
        return {words, words + parcel.dataSize() / 4};
    }

    Settings stored(uint32_t uid) {
        std::lock_guard lock(mController->getMutex());
        return mController->getSettingsLocked(uid);
    }

    SettingsController* const mController = SettingsController::getInstance();
    const uint32_t mUid = test::nextTestUid();
};

TEST_F(SettingsControllerTest, unknownUidsWriteNothingAndUidZeroTakesOnlyTheTunables) {
    Parcel out;
    String8 policy("kept");
    EXPECT_FALSE(mController->writeSettings(mUid, &out));
    EXPECT_FALSE(mController->settingsToPolicy(mUid, policy));
    EXPECT_EQ(0u, out.dataSize());
    EXPECT_STREQ("kept", policy.c_str());
    EXPECT_TRUE(InterpolationGui::getInstance().mSettingsControllerCreated);

    LogCapture log(0);
    EXPECT_FALSE(update(0, {-1, 100, 5}));  // a negative count reads nothing
    EXPECT_TRUE(update(0, {6, 100, 2, 101, 7, 102, 48, 115, 5, 116, 1, 0, 30}));
    EXPECT_EQ(2, logLevel);
    EXPECT_EQ(7, queueSize);
    EXPECT_EQ(48, defaultDelay);
    EXPECT_TRUE(keepTwoHwcLayers);
    EXPECT_TRUE(applyDelayToFrames);
    EXPECT_TRUE(update(mUid, {0}));
    EXPECT_TRUE(update(mUid, {1, 116, 0}));  // a game's message may carry tunables too
    EXPECT_FALSE(applyDelayToFrames);
    update(0, {4, 101, -1, 102, 64, 115, 0, 116, 0});  // back to the initial values

    EXPECT_FALSE(mController->writeSettings(0, nullptr));
    EXPECT_EQ(written(mUid), written(0));
    EXPECT_STREQ(
            "{ 0, 64, true, 5.000000, 0.991000, 2, 0.008000, 0, true, false, -1, 0.800000, false, "
            "false, 5, 15, 120, 15, 120, 120, 5, true, (AF), 0, 0.900000, 600, 1.000000, 0, -1 }",
            stored(0).dump().c_str());
    EXPECT_THAT(stored(0).alphaFunction.getPoints(),
                ElementsAre(Point{0, 0}, Point{0, 0}, Point{0.2f, 0}, Point{0.8f, 1}, Point{1, 1},
                            Point{1, 1}));
}

// Unknown parameters are skipped with their argument, and refused modes leave the mode as it is.
TEST_F(SettingsControllerTest, fullMessageIsWrittenInIdOrderDumpedAndExportedAsPolicy) {
    LogCapture log(1);
    // clang-format off
    ASSERT_TRUE(update(mUid, {
            32,
            27, 60,    0, 60,     1, 40,      2, 0,       3, 2.5f,    4, 0.95f,   5, 3,
            6, 0.01f,  7, 3,      8, 0,       9, 0,       10, 1.5f,   11, 9,      12, 1,
            7, 6,      7, -1,     50, 1234,   -3, 0,
            13, 4,     14, 10,    15, 90,     16, 20,     17, 100,    18, 90,     19, 3,
            20, 0,     21, 2, 0.5f, 0.25f, 0.9f, 1.0f,
            22, -2,    23, 0.5f,  24, 10,     25, 0.25f,  26, 30}));
    EXPECT_EQ(std::vector<Word>({
            0, 60,     1, 40,     2, 0,       3, 2.5f,    4, 0.95f,   5, 3,       6, 0.01f,
            7, 3,      8, 0,      9, 0,       10, 1.5f,   11, 1,      12, 1,      13, 4,
            14, 10,    15, 90,    16, 20,     17, 100,    18, 90,     19, 3,      20, 0,
            21, 4, 0.0f, 0.0f, 0.5f, 0.25f, 0.9f, 1.0f, 1.0f, 1.0f,
            22, -2,    23, 0.5f,  24, 10,     25, 0.25f,  26, 30,     27, 60}),
              written(mUid));
    // clang-format on
    const std::vector<std::string> logged = {
            "Interpolation: Interpolation mode 6 not recognised. Skipping this argument.",
            "Interpolation: Interpolation mode -1 not recognised. Skipping this argument.",
            "Interpolation: Parameter 50 not recognised. Skipping it and argument.",
            "Interpolation: Parameter -3 not recognised. Skipping it and argument.",
            "Reading 2 line points for alpha function",
            "Line point: (0.500000, 0.250000)",
            "Line point: (0.900000, 1.000000)"};
    EXPECT_EQ(logged, log.texts());

    // The dump calls an offset of 0 enabled; the policy does not.
    EXPECT_STREQ(
            "{ 60, 40, false, 2.500000, 0.950000, 3, 0.010000, 3, false, true, 0, 1.500000, "
            "true, true, 4, 10, 90, 20, 100, 90, 3, false, (AF), 4294967294, 0.500000, 10, "
            "0.250000, 30, 60 }",
            stored(mUid).dump().c_str());
    String8 text("policy: ");
    ASSERT_TRUE(mController->settingsToPolicy(mUid, text));
    Json::Value policy, expected;
    ASSERT_TRUE(Json::Reader().parse(text.c_str() + 8, policy)) << text.c_str();
    ASSERT_TRUE(Json::Reader().parse(R"({"game_fps_limit": 60, "enabled": true, "mode": 3,
        "smart_delay": false, "write_to_frametracker": false, "minimum_regal_stability": 0.5,
        "max_consecutive_gl_compositions": 10, "max_percent_gl_compositions": 0.25,
        "min_acceptable_fps": 30, "max_acceptable_fps": 60, "dfs_offset": {"enabled": false,
        "value": 0, "smoothness": 1.5, "minimum": 20, "maximum": 100}, "gfps_offset": {
        "enabled": true, "value": 4, "minimum": 10, "maximum": 90}})",
                                     expected));
    EXPECT_EQ(expected, policy) << text.c_str();
}

TEST_F(SettingsControllerTest, truncatedParcelReadsAsZerosInTimeBoundedByItsSize) {
    LogCapture log(1);
    ASSERT_TRUE(update(mUid, {3, 0, 60, 7, 3, 9, 2}));
    // The entries past the end read as parameter 0 set to 0, and the mode's missing value as 0.
    ASSERT_TRUE(update(mUid, {INT32_MAX, 1, 32, 7}));
    EXPECT_EQ(0, stored(mUid).gameFpsLimit);
    EXPECT_EQ(32, stored(mUid).delayMs);
    EXPECT_EQ(eRetimeMode, stored(mUid).mode);
    EXPECT_EQ(2, stored(mUid).rfpsOffset);

    // Missing pairs read as (0, 0), each logged and judged by the curve, as many as the parcel
    // has words (5 here, so three pairs); one more stands for the rest. Here each is corrected to
    // (0, 5).
    log.clear();
    ASSERT_TRUE(update(mUid, {1, 21, INT32_MAX, -1.0f, 5.0f}));
    EXPECT_THAT(stored(mUid).alphaFunction.getPoints(),
                ElementsAre(Point{0, 0}, Point{-1, 5}, Point{0, 5}, Point{0, 5}, Point{0, 5},
                            Point{0, 5}));
    EXPECT_TRUE(
            log.contains("Interpolation: alpha function of 2147483647 points ends after 1 in "
                         "the parcel; reading the missing ones as one (0.000000, 0.000000)"));
    EXPECT_EQ(4, log.count("Line point: (0.000000, 0.000000)"));
    // Three points claimed and one and a half sent: the reads give exactly (0.7, 0) and (0, 0).
    log.clear();
    ASSERT_TRUE(update(mUid, {2, 21, 3, 0.5f, 0.5f, 0.7f}));
    EXPECT_THAT(stored(mUid).alphaFunction.getPoints(),
                ElementsAre(Point{0, 0}, Point{0.5f, 0.5f}, Point{0.7f, 0.5f}, Point{1, 1}));
    EXPECT_THAT(log.texts(),
                ElementsAre("Reading 3 line points for alpha function",
                            "Line point: (0.500000, 0.500000)", "Line point: (0.700000, 0.000000)",
                            "Line point: (0.000000, 0.000000)",
                            "Warning: correction applied to non-increasing sequence of Y values "
                            "used in alpha function settings! (0.700000, 0.000000) -> (0.700000, "
                            "0.500000)",
                            "Warning: alpha function point is out of order! Ignoring (0.000000, "
                            "0.000000)"));
    for (int32_t count : {0, -5}) {
        ASSERT_TRUE(update(mUid, {2, 21, count, 0, 20}));
        EXPECT_THAT(stored(mUid).alphaFunction.getPoints(), ElementsAre(Point{0, 0}, Point{1, 1}));
        EXPECT_EQ(20, stored(mUid).gameFpsLimit);
    }
}

TEST_F(SettingsControllerTest, changesWaitForALiveObserverOfTheirUidAndAreDeliveredOnce) {
    ASSERT_TRUE(update(mUid, {1, 0, 45}));
    mController->notifyChanges();  // nobody to tell yet: it stays pending
    LogCapture log(2);
    sp<TestObserver> observer = new TestObserver(mUid);
    sp<TestObserver> other = new TestObserver(test::nextTestUid());
    EXPECT_THAT(log.texts(),
                ElementsAre(testing::_, "Interpolation::SettingsController::Observer [" +
                                                std::to_string(other->mUid) + "] onFirstRef"));
    EXPECT_THAT(observer->mReceived, testing::IsEmpty());  // not during subscribe
    mController->notifyChanges();
    mController->notifyChanges();
    EXPECT_THAT(observer->mReceived, ElementsAre(45));
    EXPECT_THAT(other->mReceived, ElementsAre(0));  // a new subscriber gets the defaults

    other->mStays = true;
    wp<TestObserver> dead = other;
    other.clear();
    EXPECT_EQ(2, dead.get_refs()->getWeakCount());  // ours and the controller's
    mController->setSettings(mUid, defaultSettings);
    EXPECT_THAT(observer->mReceived, ElementsAre(45));  // setting alone does not notify
    observer.clear();                                   // unsubscribes
    mController->notifyChanges();
    EXPECT_EQ(1, dead.get_refs()->getWeakCount());  // dropped by the notification

    // Released as it is notified, as if on another thread: it unsubscribes once the mutex is free.
    sp<TestObserver> late = new TestObserver(mUid);
    wp<TestObserver> weak = late;
    late->mOnChanged = [&late] {
        EXPECT_THAT(late->mReceived, ElementsAre(0));
        late.clear();
    };
    mController->notifyChanges();
    EXPECT_EQ(nullptr, weak.promote());
}

}  // namespace
}  // namespace android::Interpolation
