#include "sim/CsvWriter.h"

#include <charconv>
#include <cinttypes>
#include <cmath>
#include <cstdio>

namespace verolux::sim {

namespace {

// Appends "," and the time from origin, or just "," when the time is absent.
void time(std::ostream& out, nsecs_t time, nsecs_t origin) {
    out << ',';
    if (time >= 0) out << time - origin;
}

// The shortest text that reads back as the same float: alphas stay exact.
void shortest(std::ostream& out, float value) {
    char text[32];
    const auto [end, ec] = std::to_chars(text, text + sizeof(text), value);
    if (ec == std::errc()) out.write(text, end - text);
}

std::string ms(nsecs_t ns) {
    char text[32];
    snprintf(text, sizeof(text), "%.3f", static_cast<double>(ns) / 1e6);
    return text;
}

}  // namespace

FramesCsv::FramesCsv(std::ostream& out, nsecs_t origin) : mOut(out), mOrigin(origin) {
    mOut << "frame,start_ns,queue_ns,render_done_ns,acquire_ns,first_present_ns,last_present_ns,"
            "release_ns,dropped\n";
}

void FramesCsv::onFrame(const FrameRecord& frame) {
    mOut << frame.number;
    for (nsecs_t t : {frame.startTime, frame.queueTime, frame.renderDoneTime, frame.acquireTime,
                      frame.firstPresentTime, frame.lastPresentTime, frame.releaseTime}) {
        time(mOut, t, mOrigin);
    }
    mOut << ',' << (frame.dropped() ? 1 : 0) << '\n';
}

RefreshesCsv::RefreshesCsv(std::ostream& out, nsecs_t origin) : mOut(out), mOrigin(origin) {
    mOut << "refresh,vsync_ns,present_ns,picture,frame0,alpha0,frame1,alpha1,content_ns,delay_ns,"
            "cpu_ns,refused,client,refresh_hz,game_limit_fps\n";
}

void RefreshesCsv::onRefresh(const RefreshRecord& refresh) {
    mOut << refresh.index;
    time(mOut, refresh.vsyncTime, mOrigin);
    time(mOut, refresh.presentTime, mOrigin);
    mOut << ',' << pictureName(refresh.picture);
    for (size_t i = 0; i < RefreshRecord::MAX_ITEMS; i++) {
        mOut << ',';
        if (i < refresh.itemCount) {
            mOut << refresh.items[i].frameNumber << ',';
            shortest(mOut, refresh.items[i].alpha);
        } else {
            mOut << ',';
        }
    }
    mOut << ',';
    if (refresh.contentTime >= 0) mOut << std::llround(refresh.contentTime) - mOrigin;
    mOut << ',';
    if (refresh.delay >= 0) mOut << refresh.delay;
    mOut << ',' << refresh.cpuTime << ',' << int{refresh.refused} << ','
         << int{refresh.clientComposed} << ',' << refresh.refreshRate << ',';
    if (refresh.gameRateLimitApplied) mOut << refresh.gameRateLimit;
    mOut << '\n';
}

PresentMonCsv::PresentMonCsv(std::ostream& out, nsecs_t origin, std::string application,
                             uint32_t processId)
    : mOut(out), mOrigin(origin), mApplication(std::move(application)), mProcessId(processId) {
    mOut << "Application,ProcessID,SwapChainAddress,Runtime,SyncInterval,PresentFlags,Dropped,"
            "TimeInSeconds,MsBetweenPresents,MsInPresentAPI,MsUntilRenderComplete,"
            "MsUntilDisplayed,MsBetweenDisplayChange\n";
}

void PresentMonCsv::onFrame(const FrameRecord& frame) {
    if (frame.queueTime < 0) return;  // never presented
    char seconds[32];
    snprintf(seconds, sizeof(seconds), "%.6f", static_cast<double>(frame.queueTime - mOrigin) / 1e9);
    const bool waited = frame.startTime >= 0 && frame.dequeueTime >= frame.startTime;
    const bool rendered = frame.renderDoneTime >= frame.queueTime;
    // As PresentMon writes them: 0 for the first present and for a frame never displayed.
    nsecs_t displayChange = 0;
    if (!frame.dropped() && mLastDisplayed >= 0)
        displayChange = frame.firstPresentTime - mLastDisplayed;
    mOut << mApplication << ',' << mProcessId << ",0x" << std::hex << mProcessId << std::dec
         << ",Other,1,0," << (frame.dropped() ? 1 : 0) << ',' << seconds << ','
         << ms(mLastQueue >= 0 ? frame.queueTime - mLastQueue : 0) << ','
         << ms(waited ? frame.dequeueTime - frame.startTime : 0) << ','
         << ms(rendered ? frame.renderDoneTime - frame.queueTime : 0) << ','
         << ms(frame.dropped() ? 0 : frame.firstPresentTime - frame.queueTime) << ','
         << ms(displayChange) << '\n';
    mLastQueue = frame.queueTime;
    if (!frame.dropped()) mLastDisplayed = frame.firstPresentTime;
}

}  // namespace verolux::sim
