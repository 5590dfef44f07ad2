#pragma once

#include <ostream>
#include <string>

#include "sim/Recording.h"

namespace verolux::sim {

// The per-frame and per-refresh files, written row by row as records come. Times are integer
// nanoseconds from `origin` (the start of the run); a cell is empty when the value is absent.

// frame,start_ns,queue_ns,render_done_ns,acquire_ns,first_present_ns,last_present_ns,release_ns,
// dropped: one row per game frame, in frame order; dropped is 1 for a frame that never led a
// picture on screen.
class FramesCsv final : public RecordSink {
public:
    FramesCsv(std::ostream& out, nsecs_t origin);
    void onFrame(const FrameRecord& frame) override;

private:
    std::ostream& mOut;
    const nsecs_t mOrigin;
};

// refresh,vsync_ns,present_ns,picture,frame0,alpha0,frame1,alpha1,content_ns,delay_ns,cpu_ns,
// refused,client,refresh_hz,game_limit_fps: one row per refresh; picture is blend, new, repeat or
// held; frame0/alpha0 and frame1/alpha1 are the items of the engine's state (frame 0: the empty
// frame); content_ns is the game time on screen; delay_ns the display delay in force; cpu_ns the
// library's CPU time for the refresh; refused 1 when the render-rate agent refused the
// presentation; client 1 when it fell back to client composition; refresh_hz the detected refresh
// rate; game_limit_fps the game-rate limit the game was held to, empty when none.
class RefreshesCsv final : public RecordSink {
public:
    RefreshesCsv(std::ostream& out, nsecs_t origin);
    void onRefresh(const RefreshRecord& refresh) override;

private:
    std::ostream& mOut;
    const nsecs_t mOrigin;
};

// One row per game frame with PresentMon's columns and meanings, so that frame-analysis tools
// open a simulated run as a captured one: a frame's present is its queueBuffer, the time inside
// the present call is the wait for the buffer it was drawn into, and it was displayed at the
// first present at which it led the picture.
class PresentMonCsv final : public RecordSink {
public:
    PresentMonCsv(std::ostream& out, nsecs_t origin, std::string application, uint32_t processId);
    void onFrame(const FrameRecord& frame) override;

private:
    std::ostream& mOut;
    const nsecs_t mOrigin;
    const std::string mApplication;
    const uint32_t mProcessId;
    nsecs_t mLastQueue = -1;
    nsecs_t mLastDisplayed = -1;
};

}  // namespace verolux::sim
