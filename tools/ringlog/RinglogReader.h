#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "SerializableEvent.h"

namespace verolux::ringlog {

// The ring log's 184-byte header, decoded.
struct RinglogHeader {
    uint32_t majorVersion = 0;
    uint32_t minorVersion = 0;
    uint32_t revision = 0;
    uint32_t mode = 0;
    std::string checksum;      // as stored, cut at the first zero byte
    int64_t creationTime = 0;  // seconds since the epoch
    uint32_t uid = 0;
    std::string layerName;  // as stored, cut at the first zero byte
};

// One layer's ring as the library's writeToParcel wrote it, its records oldest first.
struct RinglogDump {
    RinglogHeader header;
    uint32_t capacity = 0;
    std::vector<android::Interpolation::SerializableEvent> records;
};

struct RinglogFile {
    std::vector<RinglogDump> dumps;
    std::string error;  // empty on success, else one line saying what is wrong and where

    bool ok() const { return error.empty(); }
};

// The largest file read: 64 layers' rings. A larger one is refused before it is read.
constexpr size_t MAX_FILE_SIZE = 64 << 20;

// Parses one or more parcel dumps of a ring log, back to back. Anything else is refused: a header
// whose size is not 184 or whose major version is unknown, a capacity that the ring's bytes do not
// match, a count or newest index outside the ring, missing or trailing bytes. Nothing is allocated
// beyond what the data really holds.
RinglogFile parseRinglog(const uint8_t* data, size_t size);

// Reads a regular file of at most MAX_FILE_SIZE bytes and parses it.
RinglogFile readRinglogFile(const std::string& path);

}  // namespace verolux::ringlog
