#pragma once

#include <mutex>

namespace android::Interpolation {

// The library's lock guard: a std::unique_lock (so it can be handed to the operations that wait on
// a condition variable) that subclasses may extend.
template <typename Mutex>
class UniqueLock : public std::unique_lock<Mutex> {
public:
    explicit UniqueLock(Mutex& mutex) : std::unique_lock<Mutex>(mutex) {}
    virtual ~UniqueLock() = default;
};

}  // namespace android::Interpolation
