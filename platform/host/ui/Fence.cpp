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

Fence::Fence(base::unique_fd fenceFd) : mFenceFd(std::move(fenceFd)) {}

Fence::~Fence() {
#ifdef VEROLUX_THREAD_SANITIZER
    // The last reference's acquire fence, which the thread sanitizer does not model, orders every
    // other holder's use of the fence before this destructor. The count that the holders release
    // is the reference base's only member, so its address is the base's.
    __tsan_acquire(const_cast<LightRefBase<Fence>*>(static_cast<const LightRefBase<Fence>*>(this)));
#endif
}

status_t Fence::wait(int timeout) const {
    if (!mFenceFd.ok()) return NO_ERROR;
    pollfd pfd{mFenceFd.get(), POLLIN, 0};
    int ret;
    do {
        ret = poll(&pfd, 1, timeout);
    } while (ret < 0 && errno == EINTR);
    return ret > 0 && (pfd.revents & POLLIN) ? NO_ERROR : TIMED_OUT;
}

nsecs_t Fence::getSignalTime() const {
    if (!mFenceFd.ok()) return SIGNAL_TIME_INVALID;
    return mSignalTime.load(std::memory_order_acquire);
}

sp<Fence> Fence::createPending() {
    base::unique_fd fd(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    if (!fd.ok()) {
        ALOGE("Fence: eventfd failed (errno %d)", errno);
        return NO_FENCE;
    }
    return new Fence(std::move(fd));
}

sp<Fence> Fence::createSignalled(nsecs_t signalTime) {
    sp<Fence> fence = createPending();
    fence->signal(signalTime);
    return fence;
}

void Fence::signal(nsecs_t signalTime) {
    if (!mFenceFd.ok()) return;
    // The time is published before the fd becomes readable, so a waiter that sees the fence
    // signalled also sees its signal time.
    nsecs_t pending = SIGNAL_TIME_PENDING;
    if (!mSignalTime.compare_exchange_strong(pending, signalTime, std::memory_order_release)) {
        return;
    }
    const uint64_t one = 1;
    if (::write(mFenceFd.get(), &one, sizeof(one)) != sizeof(one)) {
        ALOGE("Fence: signalling fd %d failed (errno %d)", mFenceFd.get(), errno);
    }
}

}  // namespace android
