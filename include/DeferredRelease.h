#pragma once

#include <utils/StrongPointer.h>

#include <vector>

namespace android::Interpolation {

// Strong references promoted while a lock is held, dropped only once it is released: dropping the
// last reference to a component runs its onLastStrongRef, which unsubscribes and so takes that
// very lock. They are kept per thread, in storage that is reused, so steady use allocates nothing.
template <typename T>
class DeferredRelease {
public:
    // This thread's references, in the order they were held.
    static std::vector<sp<T>>& held() {
        thread_local std::vector<sp<T>> references;
        return references;
    }

    static void hold(sp<T> reference) { held().push_back(std::move(reference)); }

    // Drops this thread's references; call it with the lock released.
    static void releaseAll() {
        std::vector<sp<T>>& references = held();
        if (references.empty()) return;
        std::vector<sp<T>> dropping;
        dropping.swap(references);
        dropping.clear();  // may run destructors that hold and release again on this thread
        if (references.capacity() < dropping.capacity()) references.swap(dropping);
    }
};

}  // namespace android::Interpolation
