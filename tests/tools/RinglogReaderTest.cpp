#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/reader.h>
#include <json/writer.h>

#include <limits>
#include <memory>

#include <binder/Parcel.h>
#include <unistd.h>

#include <cstring>
#include <functional>
#include <sstream>

#include "LogOutput.h"
#include "Ringlog.h"
#include "support/Frames.h"
#include "support/TestClock.h"
#include "tools/ringlog/PerfettoTrace.h"
#include "tools/ringlog/RinglogReader.h"
#include "tools/ringlog/RinglogReport.h"

namespace verolux::ringlog {
namespace {

using namespace android;
using namespace android::Interpolation;
using testing::ElementsAre;
using testing::FieldsAre;
using testing::HasSubstr;

constexpr nsecs_t S = 1'000'000'000;
const std::string HOSTILE_NAME = "full,\"\n";

// A layer "game" (mode 3) with a few records over two seconds, and, when asked, a full ring
// named HOSTILE_NAME wrapped by two records, written back to back as the service would dump them.
std::vector<uint8_t> writeLayers(uint32_t uid, bool withFullRing) {
    test::TestClock clock(5 * S);
    String8 name("game");
    sp<Ringlog> game = new Ringlog(name, eJustInTimeMode, uid);
    EventDispatcher::broadcastEvent(uid, eFrameListSizeChangedEvent, 5 * S + S / 10, 2);
    EventDispatcher::broadcastEvent(uid, eDelayChangedEvent, 5 * S + S / 5, nsecs_t{40'000'000});
    EventDispatcher::broadcastEvent(uid, eRepeatedCompositionEvent, 5 * S + S / 2, 0);
    EventDispatcher::broadcastEvent(uid, eDFSChangedEvent, 6 * S + S / 10, 60);
    game->logFrameRepeated();
    clock.set(6 * S + S / 2);
    game->logBackpressure();
    Parcel parcel;
    game->writeToParcel(parcel);
    if (withFullRing) {
        String8 hostile(HOSTILE_NAME.c_str());
        sp<Ringlog> full = new Ringlog(hostile, eRetimeMode, uid + 1);
        for (int gfps = 0; gfps < static_cast<int>(Ringlog::NUM_EVENTS) + 2; gfps++)
            full->logGFPSChangedEvent(gfps);
        full->writeToParcel(parcel);
    }
    return std::vector<uint8_t>(parcel.data(), parcel.data() + parcel.dataSize());
}

TEST(RinglogReaderTest, readsBackWhatTheLibraryWroteAndShowsIt) {
    const uint32_t uid = test::nextTestUid();
    const std::vector<uint8_t> bytes = writeLayers(uid, true);
    const RinglogFile file = parseRinglog(bytes.data(), bytes.size());
    ASSERT_TRUE(file.ok()) << file.error;
    ASSERT_EQ(2u, file.dumps.size());
    const RinglogDump& game = file.dumps[0];
    const RinglogHeader& h = game.header;
    EXPECT_EQ(std::make_tuple(1u, 5u, 39u, 3u, uid, std::string("game"),
                              std::string(INTERPOLATION_CHECKSUM)),
              std::make_tuple(h.majorVersion, h.minorVersion, h.revision, h.mode, h.uid,
                              h.layerName, h.checksum));
    EXPECT_THAT(game.records,
                ElementsAre(FieldsAre(4u, 2, 5 * S + S / 10), FieldsAre(32u, 40, 5 * S + S / 5),
                            FieldsAre(16u, 0, 5 * S + S / 2), FieldsAre(0x1000u, 60, 6 * S + S / 10),
                            FieldsAre(0x10000u, 0, 5 * S), FieldsAre(0x8000u, 0, 6 * S + S / 2)));
    const RinglogDump& full = file.dumps[1];
    EXPECT_EQ(HOSTILE_NAME, full.header.layerName);
    ASSERT_EQ(Ringlog::NUM_EVENTS, full.records.size());
    EXPECT_EQ(2, full.records.front().value);  // oldest first across the wrap
    EXPECT_EQ(static_cast<int>(Ringlog::NUM_EVENTS) + 1, full.records.back().value);

    std::ostringstream table, summary, csv, trace;
    writeTable(game, table);
    writeSummary(game, summary);
    writeCsv(file.dumps, csv);
    EXPECT_THAT(table.str(), HasSubstr("layer \"game\", uid " + std::to_string(uid) +
                                       ", mode 3 (just-in-time)\n"));
    EXPECT_THAT(table.str(), HasSubstr("            5.200000  eDelayChangedEvent"
                                       "                         40\n"));
    EXPECT_THAT(summary.str(),
                HasSubstr("      second   frames    blend   repeat      new"
                          "  repeated  backpressure  refused  queue max  delay ms\n"
                          "           5        0        0        1        0"
                          "         1             0        0          2        40\n"
                          "           6        0        0        0        0"
                          "         0             1        0          -        40\n"));
    std::vector<std::string> csvLines;
    std::istringstream in(csv.str());
    for (std::string line; csvLines.size() < 8 && std::getline(in, line);)
        csvLines.push_back(line);
    EXPECT_EQ("game,5100000000,4,eFrameListSizeChangedEvent,2", csvLines.at(1));
    EXPECT_EQ("\"full,\"\"\\x0a\",6500000000,16384,GFPSChanged,2", csvLines.at(7));

    // A process name, a thread name per track used, an event per record.
    EXPECT_EQ(1 + 2 + 6u, writePerfettoTrace({game}, trace));
    Json::Value json;
    ASSERT_TRUE(Json::Reader().parse(trace.str(), json));
    Json::StreamWriterBuilder compact;
    compact["indentation"] = "";
    std::vector<std::string> seen;
    for (const Json::Value& e : json["traceEvents"]) {
        seen.push_back(e["ph"].asString() + " " + e["name"].asString() + " " + e["tid"].asString() +
                       " " + std::to_string(e["ts"].asInt64()) + " " +
                       Json::writeString(compact, e["args"]));
    }
    const std::string process = "{\"name\":\"game (uid " + std::to_string(uid) + ")\"}";
    EXPECT_THAT(seen, ElementsAre("M process_name 0 0 " + process,
                                  "M thread_name 1 0 {\"name\":\"composition\"}",
                                  "M thread_name 5 0 {\"name\":\"engine records\"}",
                                  "C queue length 0 5100000 {\"frames\":2}",
                                  "C display delay 0 5200000 {\"ms\":40}",
                                  "i repeat 1 5500000 {\"value\":0}",
                                  "C render rate 0 6100000 {\"fps\":60}",
                                  "i frame repeated 5 5000000 {\"value\":0}",
                                  "i backpressure 5 6500000 {\"value\":0}"));
}

TEST(RinglogReaderTest, refusesAnythingButWholeRings) {
    const std::vector<uint8_t> valid = writeLayers(test::nextTestUid(), false);
    ASSERT_EQ(999'996u, valid.size());
    auto put = [](size_t offset, auto value) {
        return [=](std::vector<uint8_t>& b) { memcpy(b.data() + offset, &value, sizeof(value)); };
    };
    auto cut = [](size_t size) { return [=](std::vector<uint8_t>& b) { b.resize(size); }; };
    constexpr int32_t HUGE_CAPACITY = std::numeric_limits<int32_t>::max() / 16;
    const std::vector<std::pair<std::function<void(std::vector<uint8_t>&)>, std::string>> cases = {
            {cut(0), "empty file"},
            {cut(100), "truncated header (at byte 0)"},
            {put(0, int32_t{12}), "header of 12 bytes, expected 184 (at byte 0)"},
            {put(108, int64_t{183}), "header size word 183, expected 184 (at byte 0)"},
            {put(20, uint32_t{2}), "unknown major version 2 (at byte 0)"},
            {cut(196), "truncated before the ring (at byte 188)"},
            {put(188, uint32_t{62488}),
             "capacity 62488 does not match a ring of 999792 bytes (at byte 188)"},
            {put(192, uint32_t{62488}),
             "count 62488 and newest index 5 do not fit a ring of 62487 (at byte 188)"},
            {put(196, int32_t{3}),
             "count 6 and newest index 3 do not fit a ring of 62487 (at byte 188)"},
            {[&](std::vector<uint8_t>& b) {
                 put(188, HUGE_CAPACITY)(b);
                 put(200, HUGE_CAPACITY * 16)(b);
             },
             "truncated ring: 2147483632 bytes claimed, 999792 present (at byte 204)"},
            {cut(valid.size() - 1),
             "truncated ring: 999792 bytes claimed, 999791 present (at byte 204)"},
            {[](std::vector<uint8_t>& b) { b.resize(b.size() + 3, 0xff); },
             "truncated header (at byte 999996)"},
    };
    for (const auto& [mutate, error] : cases) {
        std::vector<uint8_t> bytes = valid;
        mutate(bytes);
        const RinglogFile file = parseRinglog(bytes.data(), bytes.size());
        EXPECT_EQ(error, file.error);
        EXPECT_TRUE(file.dumps.empty());
    }

    char path[] = "/tmp/ringlogXXXXXX";
    const int fd = mkstemp(path);
    ASSERT_GE(fd, 0);
    ASSERT_EQ(static_cast<ssize_t>(valid.size()), write(fd, valid.data(), valid.size()));
    EXPECT_TRUE(readRinglogFile(path).ok());
    ASSERT_EQ(0, ftruncate(fd, MAX_FILE_SIZE + 1));  // sparse: nothing of it is read
    EXPECT_EQ("67108865 bytes, more than a ring log reader reads (67108864)",
              readRinglogFile(path).error);
    close(fd);
    unlink(path);
    EXPECT_EQ("No such file or directory", readRinglogFile(path).error);
    EXPECT_EQ("not a regular file", readRinglogFile("/dev/zero").error);
}

}  // namespace
}  // namespace verolux::ringlog
