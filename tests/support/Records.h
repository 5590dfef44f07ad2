#pragma once

#include "sim/Recording.h"

namespace verolux::sim::test {

// Refresh `index` of a display with `period`: composed at its vsync, on screen one period later.
inline RefreshRecord refreshAt(uint64_t index, nsecs_t period, Picture picture, double content) {
    RefreshRecord r;
    r.index = index;
    r.vsyncTime = static_cast<nsecs_t>(index) * period;
    r.presentTime = r.vsyncTime + period;
    r.picture = picture;
    r.contentTime = content;
    return r;
}

}  // namespace verolux::sim::test
