#include "sim/CsvWriter.h"

#include <charconv>
#include <cinttypes>
#include <cmath>
#include <cstdio>

#include "sim/TextLine.h"

namespace verolux::sim {

namespace {

// Appends "," and the time from origin, or just "," when the time is absent.
void time(TextLine& line, nsecs_t time, nsecs_t origin) {
    line << ',';
    if (time >= 0) line << time - origin;
}

// Milliseconds with three places, from nanoseconds: "%.3f" of ns / 1e6.
void ms(TextLine& line, nsecs_t ns) {
    line.fixed(static_cast<double>(ns) / 1e6, 3);
}

}  // namespace

FramesCsv::FramesCsv(std::ostream& out, nsecs_t origin) : mOut(out), mOrigin(origin) {
    mOut << "frame,start_ns,queue_ns,render_done_ns,acquire_ns,first_present_ns,last_present_ns,"
            "release_ns,dropped\n";
}

void FramesCsv::onFrame(const FrameRecord& frame) {
    TextLine line;
    line << frame.number;
    for (nsecs_t t : {frame.startTime, frame.queueTime, frame.renderDoneTime, frame.acquireTime,
                      frame.firstPresentTime, frame.lastPresentTime, frame.releaseTime}) {
        time(line, t, mOrigin);
    }
    line << ',' << (frame.dropped() ? 1 : 0) << '\n';
    line.writeTo(mOut);
}

RefreshesCsv::RefreshesCsv(std::ostream& out, nsecs_t origin) : mOut(out), mOrigin(origin) {
    mOut << "refresh,vsync_ns,present_ns,picture,frame0,alpha0,frame1,alpha1,content_ns,delay_ns,"
            "cpu_ns,refused,client,refresh_hz,game_limit_fps\n";
}

void RefreshesCsv::onRefresh(const RefreshRecord& refresh) {
    TextLine line;
    line << refresh.index;
    time(line, refresh.vsyncTime, mOrigin);
    time(line, refresh.presentTime, mOrigin);
    line << ',' << pictureName(refresh.picture);
    for (size_t i = 0; i < RefreshRecord::MAX_ITEMS; i++) {
        line << ',';
        if (i < refresh.itemCount) {
            line << refresh.items[i].frameNumber << ',';
            line.shortest(refresh.items[i].alpha);
        } else {
            line << ',';
        }
    }
    line << ',';
    if (refresh.contentTime >= 0) line << std::llround(refresh.contentTime) - mOrigin;
    line << ',';
    if (refresh.delay >= 0) line << refresh.delay;
    line << ',';
    if (refresh.cpuTime >= 0) line << refresh.cpuTime;
    line << ',' << int{refresh.refused} << ',' << int{refresh.clientComposed} << ','
         << refresh.refreshRate << ',';
    if (refresh.gameRateLimitApplied) line << refresh.gameRateLimit;
    line << '\n';
    line.writeTo(mOut);
}

PresentMonCsv::PresentMonCsv(std::ostream& out, nsecs_t origin, std::string application,
                             uint32_t processId)
    : mOut(out), mOrigin(origin), mApplication(std::move(application)), mProcessId(processId) {
    mOut << "Application,ProcessID,SwapChainAddress,Runtime,SyncInterval,PresentFlags,Dropped,"
            "TimeInSeconds,MsBetweenPresents,MsInPresentAPI,MsUntilRenderComplete,"
            "MsUntilDisplayed,MsBetweenDisplayChange\n";
    char address[32];
    snprintf(address, sizeof(address), "0x%x", mProcessId);
    mSwapChainAddress = address;
}

void PresentMonCsv::onFrame(const FrameRecord& frame) {
    if (frame.queueTime < 0) return;  // never presented
    const bool waited = frame.startTime >= 0 && frame.dequeueTime >= frame.startTime;
    const bool rendered = frame.renderDoneTime >= frame.queueTime;
    // As PresentMon writes them: 0 for the first present and for a frame never displayed.
    nsecs_t displayChange = 0;
    if (!frame.dropped() && mLastDisplayed >= 0)
        displayChange = frame.firstPresentTime - mLastDisplayed;
    TextLine line;
    line << mApplication << ',' << mProcessId << ',' << mSwapChainAddress << ",Other,1,0,"
         << (frame.dropped() ? 1 : 0) << ',';
    line.fixed(static_cast<double>(frame.queueTime - mOrigin) / 1e9, 6);
    line << ',';
    ms(line, mLastQueue >= 0 ? frame.queueTime - mLastQueue : 0);
    line << ',';
    ms(line, waited ? frame.dequeueTime - frame.startTime : 0);
    line << ',';
    ms(line, rendered ? frame.renderDoneTime - frame.queueTime : 0);
    line << ',';
    ms(line, frame.dropped() ? 0 : frame.firstPresentTime - frame.queueTime);
    line << ',';
    ms(line, displayChange);
    line << '\n';
    line.writeTo(mOut);
    mLastQueue = frame.queueTime;
    if (!frame.dropped()) mLastDisplayed = frame.firstPresentTime;
}

}  // namespace verolux::sim
