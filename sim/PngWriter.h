#pragma once

#include <string>

#include "sim/Recording.h"
#include "sim/Result.h"

namespace verolux::sim {

// The space-time picture of a run: one row per refresh, top to bottom, each row the scanline of
// the picture composed at that refresh. A row reads, left to right:
//   4 px of the refresh's kind (green new picture, blue blend, red repeat, black no state),
//   the run's scanline,
//   and with a reference: 4 px of white, 4 px of its kind, the reference's scanline.
// Rows go on to the longer recording; the shorter one, and any scanline shorter than the
// recording's width, is padded with grey.
Status writeSpaceTimePng(const std::string& path, const Recording& run,
                         const Recording* reference = nullptr);

}  // namespace verolux::sim
