#include <limits>
#include <memory>

#include <binder/Parcel.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <gui/InterpolationGui.h>
#include <json/json.h>

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
using testing::IsEmpty;

constexpr int32_t CLAIM_ALL = std::numeric_limits<int32_t>::max();

// One 4-byte parcel word, written from an int32 or a float.
struct Word {
    Word(int32_t value) : bits(static_cast<uint32_t>(value)) {}
    Word(float value) { memcpy(&bits, &value, sizeof(bits)); }
    uint32_t bits;
};

std::vector<uint32_t> bits(std::initializer_list<Word> words) {
    std::vector<uint32_t> out;
    for (Word word : words)
        out.push_back(word.bits);
    return out;
}

class TestObserver : public SettingsController::Observer {
public:
    explicit TestObserver(uint32_t uid) : mUid(uid) {}
    void onSettingsChanged(const Settings& settings) override {
        mReceived.push_back(settings.gameFpsLimit);
        if (mOnChanged) mOnChanged();
    }
    uint32_t getUID() const override { return mUid; }

    std::vector<int32_t> mReceived;  // gameFpsLimit of every delivery
    std::function<void()> mOnChanged;

private:
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

    std::vector<uint32_t> written(uint32_t uid) {
        Parcel parcel;
        EXPECT_TRUE(mController->writeSettings(uid, &parcel));
        std::vector<uint32_t> words(parcel.dataSize() / 4);
        memcpy(words.data(), parcel.data(), words.size() * 4);
        return words;
    }

    Settings stored(uint32_t uid) {
        std::lock_guard lock(mController->getMutex());
        return mController->getSettingsLocked(uid);
    }

    SettingsController* const mController = SettingsController::getInstance();
    const uint32_t mUid = test::nextTestUid();
};

// The default curve keeps the duplicated corners that its construction produces.
// clang-format off
const std::vector<uint32_t> DEFAULT_WORDS = bits({
        0, 0,      1, 64,     2, 1,       3, 5.0f,    4, 0.991f,  5, 2,       6, 0.008f,
        7, 0,      8, 1,      9, -1,      10, 0.8f,   11, 0,      12, 0,      13, 5,
        14, 15,    15, 120,   16, 15,     17, 120,    18, 120,    19, 5,      20, 1,
        21, 6, 0.0f, 0.0f, 0.0f, 0.0f, 0.2f, 0.0f, 0.8f, 1.0f, 1.0f, 1.0f, 1.0f, 1.0f,
        22, 0,     23, 0.9f,  24, 600,    25, 1.0f,   26, 0,      27, -1});
// clang-format on

TEST_F(SettingsControllerTest, newUidStartsFromTheDefaultsAndUnknownUidsWriteNothing) {
    Parcel out;
    EXPECT_FALSE(mController->writeSettings(mUid, &out));
    String8 policy("kept");
    EXPECT_FALSE(mController->settingsToPolicy(mUid, policy));
    EXPECT_EQ(0u, out.dataSize());
    EXPECT_STREQ("kept", policy.c_str());

    EXPECT_TRUE(update(mUid, {0}));
    EXPECT_EQ(DEFAULT_WORDS, written(mUid));
    EXPECT_FALSE(mController->writeSettings(mUid, nullptr));
    EXPECT_STREQ(
            "{ 0, 64, true, 5.000000, 0.991000, 2, 0.008000, 0, true, false, -1, 0.800000, false, "
            "false, 5, 15, 120, 15, 120, 120, 5, true, (AF), 0, 0.900000, 600, 1.000000, 0, -1 }",
            defaultSettings.dump().c_str());
    EXPECT_TRUE(InterpolationGui::getInstance().mSettingsControllerCreated);
}

class FullMessageTest : public SettingsControllerTest {
protected:
    void SetUp() override {
        // clang-format off
        ASSERT_TRUE(update(mUid, {
                28,
                27, 60,    0, 60,     1, 40,      2, 0,       3, 2.5f,    4, 0.95f,   5, 3,
                6, 0.01f,  7, 3,      8, 0,       9, 0,       10, 1.5f,   11, 9,      12, 1,
                13, 4,     14, 10,    15, 90,     16, 20,     17, 100,    18, 90,     19, 3,
                20, 0,     21, 2, 0.5f, 0.25f, 0.9f, 1.0f,
                22, -2,    23, 0.5f,  24, 10,     25, 0.25f,  26, 30}));
        // clang-format on
    }
};

TEST_F(FullMessageTest, writesEveryParameterInIdOrderWithBoolsAsOneAndTheRepairedCurve) {
    // clang-format off
    const std::vector<uint32_t> expected = bits({
            0, 60,     1, 40,     2, 0,       3, 2.5f,    4, 0.95f,   5, 3,       6, 0.01f,
            7, 3,      8, 0,      9, 0,       10, 1.5f,   11, 1,      12, 1,      13, 4,
            14, 10,    15, 90,    16, 20,     17, 100,    18, 90,     19, 3,      20, 0,
            21, 4, 0.0f, 0.0f, 0.5f, 0.25f, 0.9f, 1.0f, 1.0f, 1.0f,
            22, -2,    23, 0.5f,  24, 10,     25, 0.25f,  26, 30,     27, 60});
    // clang-format on
    EXPECT_EQ(expected, written(mUid));
}

TEST_F(FullMessageTest, dumpCallsAnOffsetOfZeroEnabledButThePolicyDoesNot) {
    EXPECT_STREQ(
            "{ 60, 40, false, 2.500000, 0.950000, 3, 0.010000, 3, false, true, 0, 1.500000, "
            "true, true, 4, 10, 90, 20, 100, 90, 3, false, (AF), 4294967294, 0.500000, 10, "
            "0.250000, 30, 60 }",
            stored(mUid).dump().c_str());

    String8 text("policy: ");
    ASSERT_TRUE(mController->settingsToPolicy(mUid, text));
    ASSERT_EQ(0, strncmp("policy: {", text.c_str(), 9));  // appended
    Json::Value policy, expected;
    ASSERT_TRUE(Json::Reader().parse(text.c_str() + 8, policy));
    // Parsed back, so that keys, nesting and the kinds of value (int, real, bool) all compare.
    ASSERT_TRUE(Json::Reader().parse(R"({
        "game_fps_limit": 60, "enabled": true, "mode": 3, "smart_delay": false,
        "write_to_frametracker": false, "minimum_regal_stability": 0.5,
        "max_consecutive_gl_compositions": 10, "max_percent_gl_compositions": 0.25,
        "min_acceptable_fps": 30, "max_acceptable_fps": 60,
        "dfs_offset": {"enabled": false, "value": 0, "smoothness": 1.5, "minimum": 20,
                       "maximum": 100},
        "gfps_offset": {"enabled": true, "value": 4, "minimum": 10, "maximum": 90}})",
                                     expected));
    EXPECT_EQ(expected, policy) << text.c_str();
}

TEST_F(SettingsControllerTest, skipsUnknownModesAndParametersWithTheirArgument) {
    LogCapture log(1);
    EXPECT_TRUE(update(mUid, {6, 7, 4, 7, 6, 7, -1, 50, 1234, -3, 0, 0, 42}));
    const Settings settings = stored(mUid);
    EXPECT_EQ(eUnlimitedMode, settings.mode);
    EXPECT_EQ(42, settings.gameFpsLimit);
    EXPECT_THAT(log.texts(),
                ElementsAre("Interpolation: Interpolation mode 6 not recognised. Skipping this "
                            "argument.",
                            "Interpolation: Interpolation mode -1 not recognised. Skipping this "
                            "argument.",
                            "Interpolation: Parameter 50 not recognised. Skipping it and argument.",
                            "Interpolation: Parameter -3 not recognised. Skipping it and "
                            "argument."));
}

TEST_F(SettingsControllerTest, uidZeroTakesOnlyTheProcessWideTunables) {
    const int32_t queue = queueSize.load(), delay = defaultDelay.load();
    const bool keep = keepTwoHwcLayers.load(), apply = applyDelayToFrames.load();
    LogCapture log(0);

    EXPECT_FALSE(update(0, {2, 0, 30, 9, 3}));
    EXPECT_TRUE(update(0, {6, 100, 2, 101, 7, 102, 48, 115, 5, 116, 1, 0, 30}));
    EXPECT_EQ(2, logLevel.load());
    EXPECT_EQ(7, queueSize.load());
    EXPECT_EQ(48, defaultDelay.load());
    EXPECT_TRUE(keepTwoHwcLayers.load());
    EXPECT_TRUE(applyDelayToFrames.load());
    EXPECT_EQ(DEFAULT_WORDS, written(0));  // the entry exists, with nothing of the messages

    // A game's message may carry tunables too.
    EXPECT_TRUE(update(mUid, {1, 116, 0}));
    EXPECT_FALSE(applyDelayToFrames.load());
    queueSize.store(queue);
    defaultDelay.store(delay);
    keepTwoHwcLayers.store(keep);
    applyDelayToFrames.store(apply);
}

TEST_F(SettingsControllerTest, alphaFunctionIsReplacedEvenByAnEmptyOne) {
    LogCapture log(1);
    ASSERT_TRUE(update(mUid, {1, 21, 2, 0.5f, 0.25f, 0.4f, 0.5f}));
    EXPECT_THAT(log.texts(),
                ElementsAre("Reading 2 line points for alpha function",
                            "Line point: (0.500000, 0.250000)", "Line point: (0.400000, 0.500000)",
                            "Warning: alpha function point is out of order! Ignoring (0.400000, "
                            "0.500000)"));
    EXPECT_THAT(stored(mUid).alphaFunction.getPoints(),
                ElementsAre(Point{0, 0}, Point{0.5f, 0.25f}, Point{1, 1}));

    for (int32_t count : {0, -5}) {
        ASSERT_TRUE(update(mUid, {2, 21, count, 0, 20}));
        EXPECT_THAT(stored(mUid).alphaFunction.getPoints(), ElementsAre(Point{0, 0}, Point{1, 1}));
        EXPECT_EQ(20, stored(mUid).gameFpsLimit);
    }
}

// A parcel shorter than its counts reads as zeros past its end; it is read at once whatever it
// claims.
TEST_F(SettingsControllerTest, truncatedParcelReadsAsZerosInTimeBoundedByItsSize) {
    LogCapture log(0);
    ASSERT_TRUE(update(mUid, {3, 0, 60, 9, 2}));
    // Claims 2^31 - 1 entries; the ones past the end read as parameter 0 set to 0.
    ASSERT_TRUE(update(mUid, {CLAIM_ALL, 1, 32, 7}));
    Settings settings = stored(mUid);
    EXPECT_EQ(0, settings.gameFpsLimit);
    EXPECT_EQ(32, settings.delayMs);
    EXPECT_EQ(eRetimeMode, settings.mode);  // its value was past the end: 0
    EXPECT_EQ(2, settings.rfpsOffset);

    ASSERT_TRUE(update(mUid, {-1, 0, 60}));  // a negative count reads nothing
    EXPECT_EQ(0, stored(mUid).gameFpsLimit);

    // Missing pairs read as (0, 0); the first one here is corrected to (0, 5), and its repeats
    // would only repeat that point, so one stands for all.
    log.clear();
    logLevel.store(1);
    ASSERT_TRUE(update(mUid, {1, 21, CLAIM_ALL, -1.0f, 5.0f}));
    EXPECT_THAT(stored(mUid).alphaFunction.getPoints(),
                ElementsAre(Point{0, 0}, Point{-1, 5}, Point{0, 5}));
    EXPECT_TRUE(
            log.contains("Interpolation: alpha function of 2147483647 points ends after 1 in "
                         "the parcel; reading the missing ones as one (0.000000, 0.000000)"));
    EXPECT_LT(log.texts().size(), 10u);

    // Half a pair keeps its x.
    ASSERT_TRUE(update(mUid, {2, 21, 3, 0.5f, 0.5f, 0.7f}));
    EXPECT_THAT(stored(mUid).alphaFunction.getPoints(),
                ElementsAre(Point{0, 0}, Point{0.5f, 0.5f}, Point{0.7f, 0.5f}, Point{1, 1}));
}

TEST_F(SettingsControllerTest, changesWaitForAnObserverOfTheirUidAndAreDeliveredOnce) {
    ASSERT_TRUE(update(mUid, {1, 0, 45}));
    mController->notifyChanges();  // nobody to tell yet: it stays pending

    LogCapture log(2);
    sp<TestObserver> observer = new TestObserver(mUid);
    const uint32_t otherUid = test::nextTestUid();
    sp<TestObserver> other = new TestObserver(otherUid);
    EXPECT_THAT(log.texts(), ElementsAre("Interpolation::SettingsController::Observer [" +
                                                 std::to_string(mUid) + "] onFirstRef",
                                         "Interpolation::SettingsController::Observer [" +
                                                 std::to_string(otherUid) + "] onFirstRef"));
    EXPECT_THAT(observer->mReceived, IsEmpty());  // not during subscribe
    mController->notifyChanges();
    mController->notifyChanges();
    EXPECT_THAT(observer->mReceived, ElementsAre(45));
    EXPECT_THAT(other->mReceived, ElementsAre(0));  // a new subscriber gets the defaults

    Settings settings = stored(mUid);
    settings.gameFpsLimit = 90;
    mController->setSettings(mUid, settings);
    EXPECT_THAT(observer->mReceived, ElementsAre(45));  // setting alone does not notify
    observer.clear();                                   // unsubscribes
    mController->notifyChanges();
    sp<TestObserver> late = new TestObserver(mUid);
    mController->notifyChanges();
    EXPECT_THAT(late->mReceived, ElementsAre(90));
}

// Dies without unsubscribing, as a component that overrides onLastStrongRef may.
class StayingObserver : public TestObserver {
public:
    using TestObserver::TestObserver;
    void onLastStrongRef(const void*) override {}
};

TEST_F(SettingsControllerTest, deadObserversAreDroppedByTheNextNotification) {
    sp<StayingObserver> observer = new StayingObserver(mUid);
    wp<StayingObserver> weak = observer;
    RefBase::weakref_type* refs = weak.get_refs();
    observer.clear();
    EXPECT_EQ(2, refs->getWeakCount());  // ours and the controller's

    mController->notifyChanges();  // its uid is pending since it subscribed
    EXPECT_EQ(1, refs->getWeakCount());
}

TEST_F(SettingsControllerTest, observerReleasedDuringNotificationUnsubscribesAfterIt) {
    sp<TestObserver> observer = new TestObserver(mUid);
    wp<TestObserver> weak = observer;
    observer->mOnChanged = [&observer] { observer.clear(); };  // as if released on another thread

    mController->notifyChanges();  // would deadlock if the last reference went under the mutex

    EXPECT_EQ(nullptr, weak.promote());
}

}  // namespace
}  // namespace android::Interpolation
