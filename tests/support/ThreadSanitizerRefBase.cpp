// Built into the tests only under the thread sanitizer. RefBase's strong count lives in the
// platform's uninstrumented libutils, so the sanitizer cannot see the release that each holder's
// decStrong performs nor the acquire of the holder that drops the last reference and destroys the
// object: it would report every destructor as racing with the other holders' last use. This
// definition of RefBase::decStrong, which the test binary exports over libutils', tells the
// sanitizer about that ordering and then calls the real one. Nothing is suppressed: a race with
// anything other than the reference count's holders is still reported.
//
// Every decrement is treated as acquire and release, which the real count only guarantees to the
// last one: two holders that both drop a reference are ordered after each other here. That can
// hide a race between them, but never reports one that does not exist.

#include <dlfcn.h>
#include <utils/RefBase.h>

extern "C" void __tsan_acquire(void* address);
extern "C" void __tsan_release(void* address);

namespace android {

void RefBase::decStrong(const void* id) const {
    using DecStrong = void (*)(const RefBase*, const void*);
    static const auto platformDecStrong =
            reinterpret_cast<DecStrong>(dlsym(RTLD_NEXT, "_ZNK7android7RefBase9decStrongEPKv"));
    void* const count = const_cast<RefBase*>(this);
    __tsan_release(count);
    __tsan_acquire(count);
    platformDecStrong(this, id);
}

}  // namespace android
