// The thread sanitizer build tells the sanitizer how the platform's reference counts order their
// holders instead of suppressing reports. This checks that a race which merely happens inside a
// destructor run by the last reference's drop is still reported.

#include <gtest/gtest.h>
#include <utils/RefBase.h>

#include <thread>

#ifdef VEROLUX_THREAD_SANITIZER

namespace {

int gPlanted = 0;  // deliberately unguarded

struct Planted : public android::RefBase {
    ~Planted() override { gPlanted = 1; }
};

void raceInADestructor() {
    android::sp<Planted> planted = new Planted();
    std::thread dropper([object = std::move(planted)]() mutable { object.clear(); });
    gPlanted = 2;
    dropper.join();
    // Read, so that neither write is optimised away; a run with reports exits with code 66.
    exit(gPlanted > 2 ? 1 : 0);
}

TEST(ThreadSanitizerTest, reportsARaceInADestructorRunByTheLastReference) {
    EXPECT_EXIT(raceInADestructor(), testing::ExitedWithCode(66),
                "data race(.|\n)*~Planted(.|\n)*RefBase::decStrong");
}

}  // namespace

#endif
