#include "SettingsController.h"

#include <limits>
#include <memory>

#include <binder/Parcel.h>
#include <gui/InterpolationGui.h>
#include <json/json.h>

#include <algorithm>
#include <iterator>
#include <type_traits>
#include <variant>
#include <vector>

#include "DeferredRelease.h"
#include "Log.h"
#include "Tunables.h"

namespace android::Interpolation {

SettingsController* SettingsController::mInstance = nullptr;
std::mutex SettingsController::mInstanceMutex;

namespace {

constexpr size_t WORD = sizeof(int32_t);

// Parameter 21: int32 n, then n pairs of float x, float y.
Function readAlphaFunction(const Parcel& parcel) {
    const int32_t count = parcel.readInt32();
    ILOG(1, "Reading %d line points for alpha function", count);
    std::vector<float> values;
    if (count >= 1) {
        // Reads past the end of the parcel give 0, so a parcel shorter than its count reads as
        // the values it holds followed by zeros, each logged and judged by the curve as it would
        // be. That work is bounded by the parcel's own size: past as many zeros as the parcel
        // has words, the rest stand as one more (0, 0), which changes the curve only by repeating
        // a corrected point, and so its values not at all.
        const size_t claimed = 2 * static_cast<size_t>(count);
        const size_t held = std::min(claimed, parcel.dataAvail() / WORD);
        size_t read = held + std::min(claimed - held, parcel.dataSize() / WORD);
        read += read % 2;  // whole pairs
        values.reserve(read + 2);
        for (size_t i = 0; i < held; i++)
            values.push_back(parcel.readFloat());
        values.resize(read, 0.0f);
        if (values.size() < claimed) {
            ILOG(1,
                 "Interpolation: alpha function of %d points ends after %d in the parcel; "
                 "reading the missing ones as one (0.000000, 0.000000)",
                 count, static_cast<int>(held / 2));
            values.push_back(0.0f);
            values.push_back(0.0f);
        }
        for (size_t i = 0; i + 1 < values.size(); i += 2)
            ILOG(1, "Line point: (%f, %f)", values[i], values[i + 1]);
    }
    return Function(std::move(values), true);
}

// The fields of parameters 0 to 27, indexed by id. How a value is carried follows from the
// field's type: int32 as is, bool as an int32 (non-zero is true), float as a float.
using Field =
        std::variant<int32_t Settings::*, bool Settings::*, float Settings::*,
                     InterpolationMode Settings::*, uint32_t Settings::*, Function Settings::*>;
constexpr Field FIELDS[] = {
        &Settings::gameFpsLimit,
        &Settings::delayMs,
        &Settings::smartDelay,
        &Settings::delayUpdatePeriodSec,
        &Settings::hitTarget,
        &Settings::delayChangeRateMs,
        &Settings::hitThreshold,
        &Settings::mode,
        &Settings::writeToFrametracker,
        &Settings::rfpsOffset,
        &Settings::rfpsSmoothness,
        &Settings::spareFlag,
        &Settings::gfpsOffsetEnabled,
        &Settings::gfpsOffset,
        &Settings::gfpsMinimum,
        &Settings::gfpsMaximum,
        &Settings::rfpsMinimum,
        &Settings::rfpsMaximum,
        &Settings::rfps,
        &Settings::rfpsMaxSkippedFrames,
        &Settings::detectRefreshRate,
        &Settings::alphaFunction,
        &Settings::justInTimeMarginMs,
        &Settings::minimumRegalStability,
        &Settings::maxConsecutiveGlCompositions,
        &Settings::maxPercentGlCompositions,
        &Settings::minAcceptableFps,
        &Settings::maxAcceptableFps,
};
constexpr uint32_t FIELD_COUNT = std::size(FIELDS);
static_assert(FIELD_COUNT == 28);

template <typename T>
void readField(const Parcel& parcel, T& field) {
    if constexpr (std::is_same_v<T, float>) {
        field = parcel.readFloat();
    } else if constexpr (std::is_same_v<T, bool>) {
        field = parcel.readInt32() != 0;
    } else if constexpr (std::is_same_v<T, InterpolationMode>) {
        const int32_t mode = parcel.readInt32();
        // Compared as unsigned, so that negative modes are refused too.
        if (static_cast<uint32_t>(mode) <= eLatencyReductionMode) {
            field = static_cast<InterpolationMode>(mode);
        } else {
            ILOG(1, "Interpolation: Interpolation mode %d not recognised. Skipping this argument.",
                 mode);
        }
    } else if constexpr (std::is_same_v<T, Function>) {
        field = readAlphaFunction(parcel);
    } else {
        field = static_cast<T>(parcel.readInt32());
    }
}

template <typename T>
void writeField(const T& field, Parcel& out) {
    if constexpr (std::is_same_v<T, float>) {
        out.writeFloat(field);
    } else if constexpr (std::is_same_v<T, Function>) {
        const std::vector<Point>& points = field.getPoints();
        out.writeInt32(static_cast<int32_t>(points.size()));
        for (const Point& point : points) {
            out.writeFloat(point.x);
            out.writeFloat(point.y);
        }
    } else {
        out.writeInt32(static_cast<int32_t>(field));
    }
}

// Reads one (id, value) entry into `settings` or a tunable. Returns whether a tunable was set.
bool readParameter(const Parcel& parcel, Settings& settings) {
    const int32_t id = parcel.readInt32();
    // Compared as unsigned, so that negative ids are unknown ones.
    const auto unsignedId = static_cast<uint32_t>(id);
    if (unsignedId < FIELD_COUNT) {
        std::visit([&](auto field) { readField(parcel, settings.*field); }, FIELDS[unsignedId]);
        return false;
    }
    switch (unsignedId) {
        case 100:
            logLevel.store(parcel.readInt32());
            return true;
        case 101:
            queueSize.store(parcel.readInt32());
            return true;
        case 102:
            defaultDelay.store(parcel.readInt32());
            return true;
        case 115:
            keepTwoHwcLayers.store(parcel.readInt32() != 0);
            return true;
        case 116:
            applyDelayToFrames.store(parcel.readInt32() != 0);
            return true;
        default:
            ILOG(1, "Interpolation: Parameter %d not recognised. Skipping it and argument.", id);
            parcel.readInt32();
            return false;
    }
}

void writeParameters(const Settings& settings, Parcel& out) {
    for (uint32_t id = 0; id < FIELD_COUNT; id++) {
        out.writeInt32(static_cast<int32_t>(id));
        std::visit([&](auto field) { writeField(settings.*field, out); }, FIELDS[id]);
    }
}

Json::Value toPolicy(const Settings& s) {
    Json::Value policy;
    policy["game_fps_limit"] = Json::Value(s.gameFpsLimit);
    policy["enabled"] = Json::Value(s.gameFpsLimit >= 1);
    policy["mode"] = Json::Value(static_cast<int>(s.mode));
    policy["smart_delay"] = Json::Value(s.smartDelay);
    policy["write_to_frametracker"] = Json::Value(s.writeToFrametracker);
    policy["minimum_regal_stability"] = Json::Value(static_cast<double>(s.minimumRegalStability));
    policy["max_consecutive_gl_compositions"] = Json::Value(s.maxConsecutiveGlCompositions);
    policy["max_percent_gl_compositions"] =
            Json::Value(static_cast<double>(s.maxPercentGlCompositions));
    policy["min_acceptable_fps"] = Json::Value(s.minAcceptableFps);
    policy["max_acceptable_fps"] = Json::Value(s.maxAcceptableFps);

    Json::Value& dfs = policy["dfs_offset"];
    dfs["enabled"] = Json::Value(s.rfpsOffset >= 1);
    dfs["value"] = Json::Value(s.rfpsOffset);
    dfs["smoothness"] = Json::Value(static_cast<double>(s.rfpsSmoothness));
    dfs["minimum"] = Json::Value(s.rfpsMinimum);
    dfs["maximum"] = Json::Value(s.rfpsMaximum);

    Json::Value& gfps = policy["gfps_offset"];
    gfps["enabled"] = Json::Value(s.gfpsOffsetEnabled);
    gfps["value"] = Json::Value(s.gfpsOffset);
    gfps["minimum"] = Json::Value(s.gfpsMinimum);
    gfps["maximum"] = Json::Value(s.gfpsMaximum);
    return policy;
}

}  // namespace

SettingsController* SettingsController::getInstance() {
    std::lock_guard lock(mInstanceMutex);
    if (mInstance == nullptr) {
        mInstance = new SettingsController();
        InterpolationGui& gui = InterpolationGui::getInstance();
        std::lock_guard guiLock(gui.mMutex);
        gui.mSettingsControllerCreated = true;
    }
    return mInstance;
}

bool SettingsController::updateSettings(unsigned int uid, const Parcel& parcel) {
    const int32_t count = parcel.readInt32();
    ILOG(2, "Interpolation: parse settings for %d with %d arguments", static_cast<int>(uid), count);
    // Parsed without the lock: two updates of one uid at once keep the last writer's values.
    Settings settings = [&] {
        std::lock_guard lock(mMutex);
        return getSettingsLocked(uid);
    }();

    bool tunableSet = false;
    for (int32_t i = 0; i < count; i++) {
        if (parcel.dataAvail() < WORD) {
            // Every read from here on gives 0, so each remaining entry would set parameter 0 to 0,
            // silently; doing it once costs nothing proportional to the count the parcel claims.
            // A count beyond the parcel's size is worth a line.
            if (static_cast<size_t>(count - i) > parcel.dataSize() / WORD) {
                ILOG(1, "Interpolation: settings parcel for %d ends after %d of %d arguments",
                     static_cast<int>(uid), i, count);
            }
            settings.gameFpsLimit = 0;
            break;
        }
        tunableSet |= readParameter(parcel, settings);
    }

    // Uid 0 is no game: only the process-wide tunables of its message take effect.
    if (uid == 0) return tunableSet;
    setSettings(uid, settings);
    return true;
}

bool SettingsController::writeSettings(const unsigned int& uid, Parcel* out) {
    if (out == nullptr) return false;
    std::lock_guard lock(mMutex);
    auto found = mSettings.find(uid);
    if (found == mSettings.end()) return false;
    writeParameters(found->second, *out);
    return true;
}

bool SettingsController::settingsToPolicy(const unsigned int& uid, String8& out) {
    Json::Value policy;
    {
        std::lock_guard lock(mMutex);
        auto found = mSettings.find(uid);
        if (found == mSettings.end()) return false;
        policy = toPolicy(found->second);
    }
    out.appendFormat("%s", policy.toStyledString().c_str());
    return true;
}

Settings& SettingsController::settingsForLocked(uint32_t uid) {
    return mSettings.try_emplace(uid, defaultSettings).first->second;
}

Settings SettingsController::getSettingsLocked(const unsigned int& uid) {
    return settingsForLocked(uid);
}

void SettingsController::setSettings(const unsigned int& uid, const Settings& s) {
    std::lock_guard lock(mMutex);
    mSettings.insert_or_assign(uid, s);
    mChangedUids.insert(uid);
}

void SettingsController::notifyChanges() {
    {
        std::lock_guard lock(mMutex);
        if (mChangedUids.empty()) return;

        // One promotion per observer for all uids; dead observers leave the set here.
        std::vector<sp<Observer>>& promoted = DeferredRelease<Observer>::held();
        for (auto it = mObservers.begin(); it != mObservers.end();) {
            sp<Observer> observer = it->promote();
            if (observer == nullptr) {
                it = mObservers.erase(it);
                continue;
            }
            promoted.push_back(std::move(observer));
            ++it;
        }

        for (auto uid = mChangedUids.begin(); uid != mChangedUids.end();) {
            // Observers receive the stored record itself: they may not call back into the
            // controller, so it cannot change under them, and no copy is made per delivery.
            const Settings& settings = settingsForLocked(*uid);
            bool notified = false;
            for (const sp<Observer>& observer : promoted) {
                if (observer->getUID() != *uid) continue;
                observer->onSettingsChanged(settings);
                notified = true;
            }
            uid = notified ? mChangedUids.erase(uid) : std::next(uid);
        }
    }
    DeferredRelease<Observer>::releaseAll();
}

void SettingsController::subscribe(wp<Observer> o) {
    if (o == nullptr) return;
    // Promoted outside the mutex: should this be the observer's last reference when it is
    // dropped, its onLastStrongRef unsubscribes, which takes the mutex.
    sp<Observer> observer = o.promote();
    if (observer == nullptr) return;
    const uint32_t uid = observer->getUID();
    std::lock_guard lock(mMutex);
    mObservers.insert(std::move(o));
    mChangedUids.insert(uid);
}

void SettingsController::unsubscribe(wp<Observer> o) {
    std::lock_guard lock(mMutex);
    mObservers.erase(o);
}

void SettingsController::Observer::onFirstRef() {
    ILOG(2, "Interpolation::SettingsController::Observer [%u] onFirstRef", getUID());
    getInstance()->subscribe(wp<Observer>(this));
}

void SettingsController::Observer::onLastStrongRef(const void* /*id*/) {
    getInstance()->unsubscribe(wp<Observer>(this));
}

}  // namespace android::Interpolation
