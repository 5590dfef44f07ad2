#pragma once

#include <ostream>
#include <string>

#include "sim/Recording.h"
#include "sim/Result.h"

namespace verolux::sim {

// One line per refresh under the header
//   index,vsync_ns,display_time_ns,kind,frame0,alpha0,frame1,alpha1,content_ms,delay_ms,cpu_us
// Times count from the start of the run; frame0/alpha0 is the first item of the composed state
// and frame1/alpha1 the second. A cell is empty when the value is absent: no item, no kind
// announced (0), nothing shown, no delay yet.
void writeRefreshCsv(const Recording& recording, std::ostream& out);
Status writeRefreshCsvFile(const Recording& recording, const std::string& path);

}  // namespace verolux::sim
