#pragma once

#include <sys/prctl.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <future>
#include <string>
#include <thread>

namespace android::test {

// Runs `section` and returns how long it took. Should it run past `limit`, a watchdog thread
// prints every thread's stack (through gdb) and aborts: a hang fails at once and shows where each
// thread waits, instead of running into the suite's timeout.
template <typename Section>
std::chrono::nanoseconds runWithin(std::chrono::milliseconds limit, const char* what,
                                   Section&& section) {
    std::promise<void> done;
    std::thread watchdog([&, finished = done.get_future()] {
        if (finished.wait_for(limit) == std::future_status::ready) return;
        fprintf(stderr, "%s took longer than %lld ms; the threads' stacks:\n", what,
                static_cast<long long>(limit.count()));
        // A restricted ptrace scope lets gdb attach from a child only with this permission.
        prctl(PR_SET_PTRACER, PR_SET_PTRACER_ANY, 0, 0, 0);
        const std::string gdb =
                "gdb -p " + std::to_string(getpid()) + " -batch -nx -ex 'thread apply all bt' 1>&2";
        if (std::system(gdb.c_str()) != 0) fprintf(stderr, "(gdb failed)\n");
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
