#pragma once

#include <sys/prctl.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <future>
#include <string>
#include <thread>

namespace android::test {

// Runs `section` and returns how long it took. Should it run past `limit`, a watchdog thread
// prints every thread's stack (through gdb) and aborts: a hang fails at once and shows where each
// thread waits, instead of running into the suite's timeout.
template <typename Section>
std::chrono::nanoseconds runWithin(std::chrono::milliseconds limit, Section&& section) {
    std::promise<void> done;
    std::thread watchdog([&, finished = done.get_future()] {
        if (finished.wait_for(limit) == std::future_status::ready) return;
        // A restricted ptrace scope lets gdb attach from a child only with this permission.
        prctl(PR_SET_PTRACER, PR_SET_PTRACER_ANY, 0, 0, 0);
        const std::string gdb = "gdb -batch -nx -ex 'thread apply all bt' -p ";
        std::system(
                ("echo Hung, the threads: >&2; " + gdb + std::to_string(getpid()) + " >&2").c_str());
        std::abort();
    });
    const auto start = std::chrono::steady_clock::now();
    section();
    const auto elapsed = std::chrono::steady_clock::now() - start;
    done.set_value();
    watchdog.join();
    return elapsed;
}

}  // namespace android::test
