// Feeds arbitrary bytes to the ring log reader, as a file of dumps, and renders whatever it
// accepts in every output, so that hostile names, times and values reach the formatting too.

#include <cstddef>
#include <cstdint>
#include <ostream>
#include <streambuf>

#include "tools/ringlog/PerfettoTrace.h"
#include "tools/ringlog/RinglogReader.h"
#include "tools/ringlog/RinglogReport.h"

namespace {

// Drops everything written to it.
class NullBuffer final : public std::streambuf {
protected:
    int overflow(int c) override { return c; }
    std::streamsize xsputn(const char*, std::streamsize count) override { return count; }
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using namespace verolux::ringlog;
    const RinglogFile file = parseRinglog(data, size);
    if (!file.ok()) return 0;
    NullBuffer buffer;
    std::ostream out(&buffer);
    for (const RinglogDump& dump : file.dumps) {
        writeTable(dump, out);
        writeSummary(dump, out);
    }
    writeCsv(file.dumps, out);
    writePerfettoTrace(file.dumps, out);
    return 0;
}
