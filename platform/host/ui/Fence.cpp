#include <ui/Fence.h>

#include <log/log.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>

#ifdef VEROLUX_THREAD_SANITIZER
extern "C" void __tsan_acquire(void* address);
#endif

namespace android {

const sp<Fence> Fence::NO_FENCE = new Fence();

Fence::Fence(base::unique_fd fenceFd) : mValid(fenceFd.ok()), mFenceFd(std::move(fenceFd)) {}

Fence::Fence(Pending) : mValid(true) {}

Fence::~Fence() {
#ifdef VEROLUX_THREAD_SANITIZER
    // The last reference's acquire fence, which the thread sanitizer does not model, orders every
    // other holder's use of the fence before this destructor. The count that the holders release
    // is the reference base's only member, so its address is the base's.
    __tsan_acquire(const_cast<LightRefBase<Fence>*>(static_cast<const LightRefBase<Fence>*>(this)));
#endif
}

int Fence::get() const {
    if (!mValid) return -1;
    std::lock_guard lock(mMutex);
    return descriptorLocked();
}

int Fence::descriptorLocked() const {
    if (!mFenceFd.ok()) {
        mFenceFd.reset(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
        if (!mFenceFd.ok()) {
            ALOGE("Fence: eventfd failed (errno %d)", errno);
            return -1;
        }
        mMadeFd.store(mFenceFd.get(), std::memory_order_release);
        // Signalled before anyone asked for the descriptor: readable from the start.
        if (mSignalTime.load(std::memory_order_acquire) != SIGNAL_TIME_PENDING) {
            const uint64_t one = 1;
            if (::write(mFenceFd.get(), &one, sizeof(one)) != sizeof(one)) {
                ALOGE("Fence: signalling fd %d failed (errno %d)", mFenceFd.get(), errno);
            }
        }
    }
    return mFenceFd.get();
}

status_t Fence::wait(int timeout) const {
    if (!mValid) return NO_ERROR;
    int fd = mMadeFd.load(std::memory_order_acquire);
    if (fd < 0) {
        if (mSignalTime.load(std::memory_order_acquire) != SIGNAL_TIME_PENDING) return NO_ERROR;
        if (timeout == 0) return TIMED_OUT;
        fd = get();
    }
    if (fd < 0) return TIMED_OUT;
    pollfd pfd{fd, POLLIN, 0};
    int ret;
    do {
        ret = poll(&pfd, 1, timeout);
    } while (ret < 0 && errno == EINTR);
    return ret > 0 && (pfd.revents & POLLIN) ? NO_ERROR : TIMED_OUT;
}

nsecs_t Fence::getSignalTime() const {
    if (!mValid) return SIGNAL_TIME_INVALID;
    return mSignalTime.load(std::memory_order_acquire);
}

sp<Fence> Fence::createPending() {
    return new Fence(Pending{});
}

sp<Fence> Fence::createSignalled(nsecs_t signalTime) {
    sp<Fence> fence = createPending();
    fence->signal(signalTime);
    return fence;
}

void Fence::signal(nsecs_t signalTime) {
    if (!mValid) return;
    // The time is published before the fd becomes readable, so a waiter that sees the fence
    // signalled also sees its signal time.
    nsecs_t pending = SIGNAL_TIME_PENDING;
    if (!mSignalTime.compare_exchange_strong(pending, signalTime, std::memory_order_release)) {
        return;
    }
    // A descriptor made from here on is made readable by whoever makes it.
    std::lock_guard lock(mMutex);
    if (!mFenceFd.ok()) return;
    const uint64_t one = 1;
    if (::write(mFenceFd.get(), &one, sizeof(one)) != sizeof(one)) {
        ALOGE("Fence: signalling fd %d failed (errno %d)", mFenceFd.get(), errno);
    }
}

}  // namespace android
