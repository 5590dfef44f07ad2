#include "tools/ringlog/RinglogReader.h"

#include <limits>
#include <memory>

#include <binder/Parcel.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <iterator>

#include "Ringlog.h"

namespace verolux::ringlog {

namespace {

using android::NO_ERROR;
using android::Parcel;
using android::Interpolation::EventType;
using android::Interpolation::Ringlog;
using android::Interpolation::SerializableEvent;

// The format has not changed since the first major version.
constexpr uint32_t KNOWN_MAJOR_VERSIONS[] = {1};
constexpr size_t RECORD_SIZE = sizeof(SerializableEvent);

template <typename T>
T getLittleEndian(const uint8_t* at) {
    uint64_t bits = 0;
    for (size_t i = 0; i < sizeof(T); i++)
        bits |= static_cast<uint64_t>(at[i]) << (8 * i);
    return static_cast<T>(bits);
}

std::string getString(const uint8_t* at, size_t size) {
    const auto* end = std::find(at, at + size, uint8_t{0});
    return std::string(at, end);
}

RinglogHeader decodeHeader(const uint8_t* bytes) {
    using Layout = Ringlog::HeaderLayout;
    RinglogHeader header;
    header.majorVersion = getLittleEndian<uint32_t>(bytes + Layout::MAJOR_VERSION);
    header.minorVersion = getLittleEndian<uint32_t>(bytes + Layout::MINOR_VERSION);
    header.revision = getLittleEndian<uint32_t>(bytes + Layout::REVISION);
    header.mode = getLittleEndian<uint32_t>(bytes + Layout::MODE);
    header.checksum = getString(bytes + Layout::CHECKSUM, Layout::CHECKSUM_SIZE);
    header.creationTime = getLittleEndian<int64_t>(bytes + Layout::CREATION_TIME);
    header.uid = getLittleEndian<uint32_t>(bytes + Layout::UID);
    header.layerName = getString(bytes + Layout::NAME, Layout::NAME_SIZE);
    return header;
}

// Whether a count and newest slot are ones the ring's pushes can leave.
bool fitsRing(uint32_t capacity, uint32_t count, int32_t newest) {
    if (count == 0) return newest == -1;
    if (count > capacity || newest < 0 || static_cast<uint32_t>(newest) >= capacity) return false;
    // A ring that has not wrapped yet holds its records in slots 0..count-1.
    return count == capacity || static_cast<uint32_t>(newest) == count - 1;
}

SerializableEvent decodeRecord(const uint8_t* bytes) {
    return {static_cast<EventType>(getLittleEndian<uint32_t>(bytes)),
            getLittleEndian<int32_t>(bytes + 4), getLittleEndian<int64_t>(bytes + 8)};
}

std::string at(const std::string& message, size_t position) {
    return message + " (at byte " + std::to_string(position) + ")";
}

// Reads one dump at the parcel's position into `dump`; returns what is wrong with it, or nothing.
std::string parseDump(const Parcel& parcel, RinglogDump& dump) {
    const size_t start = parcel.dataPosition();
    int32_t headerSize = 0;
    if (parcel.readInt32(&headerSize) != NO_ERROR) return at("truncated header", start);
    if (headerSize != static_cast<int32_t>(Ringlog::HEADER_SIZE)) {
        return at("header of " + std::to_string(headerSize) + " bytes, expected 184", start);
    }
    const auto* header = static_cast<const uint8_t*>(parcel.readInplace(Ringlog::HEADER_SIZE));
    if (header == nullptr) return at("truncated header", start);
    const auto sizeWord = getLittleEndian<int64_t>(header + Ringlog::HeaderLayout::SIZE);
    if (sizeWord != static_cast<int64_t>(Ringlog::HEADER_SIZE)) {
        return at("header size word " + std::to_string(sizeWord) + ", expected 184", start);
    }
    dump.header = decodeHeader(header);
    if (std::find(std::begin(KNOWN_MAJOR_VERSIONS), std::end(KNOWN_MAJOR_VERSIONS),
                  dump.header.majorVersion) == std::end(KNOWN_MAJOR_VERSIONS)) {
        return at("unknown major version " + std::to_string(dump.header.majorVersion), start);
    }

    const size_t countsStart = parcel.dataPosition();
    uint32_t capacity = 0;
    uint32_t count = 0;
    int32_t newest = 0;
    int32_t ringSize = 0;
    if (parcel.readUint32(&capacity) != NO_ERROR || parcel.readUint32(&count) != NO_ERROR ||
        parcel.readInt32(&newest) != NO_ERROR || parcel.readInt32(&ringSize) != NO_ERROR) {
        return at("truncated before the ring", countsStart);
    }
    if (capacity == 0 || ringSize < 0 || uint64_t{capacity} * RECORD_SIZE != uint64_t(ringSize)) {
        return at("capacity " + std::to_string(capacity) + " does not match a ring of " +
                          std::to_string(ringSize) + " bytes",
                  countsStart);
    }
    if (!fitsRing(capacity, count, newest)) {
        return at("count " + std::to_string(count) + " and newest index " + std::to_string(newest) +
                          " do not fit a ring of " + std::to_string(capacity),
                  countsStart);
    }
    const size_t ringStart = parcel.dataPosition();
    const auto* ring = static_cast<const uint8_t*>(parcel.readInplace(size_t(ringSize)));
    if (ring == nullptr) {
        return at("truncated ring: " + std::to_string(ringSize) + " bytes claimed, " +
                          std::to_string(parcel.dataAvail()) + " present",
                  ringStart);
    }

    dump.capacity = capacity;
    dump.records.reserve(count);
    const uint64_t oldest = (uint64_t{capacity} + uint32_t(newest) + 1 - count) % capacity;
    for (uint64_t i = 0; i < count; i++) {
        dump.records.push_back(decodeRecord(ring + ((oldest + i) % capacity) * RECORD_SIZE));
    }
    return {};
}

}  // namespace

RinglogFile parseRinglog(const uint8_t* data, size_t size) {
    RinglogFile file;
    if (size == 0) {
        file.error = "empty file";
        return file;
    }
    if (size > MAX_FILE_SIZE) {
        file.error = "larger than " + std::to_string(MAX_FILE_SIZE) + " bytes";
        return file;
    }
    Parcel parcel;
    if (parcel.setData(data, size) != NO_ERROR) {
        file.error = "out of memory";
        return file;
    }
    while (parcel.dataAvail() > 0) {
        RinglogDump dump;
        file.error = parseDump(parcel, dump);
        if (!file.ok()) {
            file.dumps.clear();
            return file;
        }
        file.dumps.push_back(std::move(dump));
    }
    return file;
}

RinglogFile readRinglogFile(const std::string& path) {
    RinglogFile file;
    struct stat info {};
    if (stat(path.c_str(), &info) != 0) {
        file.error = strerror(errno);
        return file;
    }
    // A pipe or a device could be endless; a ring log is a file of known size.
    if (!S_ISREG(info.st_mode)) {
        file.error = "not a regular file";
        return file;
    }
    if (static_cast<uint64_t>(info.st_size) > MAX_FILE_SIZE) {
        file.error = std::to_string(info.st_size) + " bytes, more than a ring log reader reads (" +
                     std::to_string(MAX_FILE_SIZE) + ")";
        return file;
    }
    std::ifstream in(path, std::ios::binary);
    std::vector<uint8_t> bytes(static_cast<size_t>(info.st_size));
    if (!in.read(reinterpret_cast<char*>(bytes.data()), std::streamsize(bytes.size()))) {
        file.error = "cannot read: " + std::string(strerror(errno));
        return file;
    }
    return parseRinglog(bytes.data(), bytes.size());
}

}  // namespace verolux::ringlog
