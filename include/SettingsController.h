#pragma once

#include <utils/RefBase.h>
#include <utils/String8.h>

#include <cstdint>
#include <map>
#include <mutex>
#include <set>

#include "Settings.h"

namespace android {

class Parcel;

namespace Interpolation {

// The process-wide store of every game's Settings. The controlling service writes a uid's settings
// with updateSettings and then pushes them to that uid's observers with notifyChanges.
class SettingsController {
public:
    // A component tuned by one uid's settings. It subscribes when the host takes its first strong
    // reference and unsubscribes when the last one goes.
    class Observer : public virtual RefBase {
    public:
        void onFirstRef() override;
        void onLastStrongRef(const void* id) override;
        // Called with the controller's mutex held: it must not call back into the controller, and
        // it takes its own mutex only after the controller's.
        virtual void onSettingsChanged(const Settings& settings) = 0;
        virtual uint32_t getUID() const = 0;

    protected:
        ~Observer() override = default;
    };

    virtual ~SettingsController() = default;

    // Created on first use and never destroyed.
    static SettingsController* getInstance();

    // Reads a settings message: int32 count, then count (int32 id, value) entries. Returns true
    // when something was stored: always for a non-zero uid; for uid 0, which has no settings of
    // its own, only when a process-wide tunable was set.
    bool updateSettings(unsigned int uid, const Parcel& parcel);
    // Writes (int32 id, value) for every parameter 0 to 27. False for a null parcel or an unknown
    // uid.
    bool writeSettings(const unsigned int& uid, Parcel* out);
    // Appends the uid's policy as styled JSON. False for an unknown uid.
    bool settingsToPolicy(const unsigned int& uid, String8& out);

    // The mutex that getSettingsLocked expects its caller to hold.
    std::mutex& getMutex() { return mMutex; }
    // A copy of the uid's settings; an unknown uid gets an entry with the defaults first.
    Settings getSettingsLocked(const unsigned int& uid);
    // Stores the uid's settings for the next notifyChanges.
    void setSettings(const unsigned int& uid, const Settings& s);
    // Delivers every changed uid's settings to its observers. A uid without a live observer stays
    // pending until one subscribes.
    void notifyChanges();

    void subscribe(wp<Observer> o);
    void unsubscribe(wp<Observer> o);

private:
    SettingsController() = default;

    Settings& settingsForLocked(uint32_t uid);

    std::mutex mMutex;
    std::map<uint32_t, Settings> mSettings;  // guarded by mMutex
    // Uids whose settings no observer has received yet.
    std::set<uint32_t> mChangedUids;    // guarded by mMutex
    std::set<wp<Observer>> mObservers;  // guarded by mMutex

    static SettingsController* mInstance;  // guarded by mInstanceMutex
    static std::mutex mInstanceMutex;
};

}  // namespace Interpolation
}  // namespace android
