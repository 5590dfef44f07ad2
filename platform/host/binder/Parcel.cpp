// The data-only part of libbinder's Parcel, for host builds: flat little-endian values, each
// padded to 4 bytes. Objects, file descriptors and binders are not supported here.

#include <limits>
#include <memory>

#include <binder/Parcel.h>

#include <cstdlib>
#include <cstring>

namespace android {

namespace {

constexpr size_t padded(size_t size) {
    return (size + 3) & ~size_t{3};
}

}  // namespace

Parcel::Parcel() {
    initState();
}

Parcel::~Parcel() {
    freeDataNoInit();
}

void Parcel::initState() {
    mError = NO_ERROR;
    mData = nullptr;
    mDataSize = 0;
    mDataCapacity = 0;
    mDataPos = 0;
    mObjects = nullptr;
    mObjectsSize = 0;
    mObjectsCapacity = 0;
    mNextObjectHint = 0;
    mObjectsSorted = false;
    mRequestHeaderPresent = false;
    mWorkSourceRequestHeaderPosition = 0;
    mFdsKnown = true;
    mHasFds = false;
    mAllowFds = true;
    mOwner = nullptr;
    mOwnerCookie = nullptr;
    mOpenAshmemSize = 0;
}

void Parcel::freeDataNoInit() {
    free(mData);
    mData = nullptr;
}

void Parcel::freeData() {
    freeDataNoInit();
    initState();
}

const uint8_t* Parcel::data() const {
    return mData;
}

size_t Parcel::dataSize() const {
    return mDataSize > mDataPos ? mDataSize : mDataPos;
}

size_t Parcel::dataAvail() const {
    return mDataSize > mDataPos ? mDataSize - mDataPos : 0;
}

size_t Parcel::dataPosition() const {
    return mDataPos;
}

size_t Parcel::dataCapacity() const {
    return mDataCapacity;
}

status_t Parcel::setDataCapacity(size_t size) {
    if (size > std::numeric_limits<int32_t>::max()) return BAD_VALUE;
    if (size <= mDataCapacity) return NO_ERROR;
    auto* data = static_cast<uint8_t*>(realloc(mData, size));
    if (data == nullptr) {
        mError = NO_MEMORY;
        return NO_MEMORY;
    }
    mData = data;
    mDataCapacity = size;
    return NO_ERROR;
}

status_t Parcel::setDataSize(size_t size) {
    if (status_t err = setDataCapacity(size); err != NO_ERROR) return err;
    if (size > mDataSize) memset(mData + mDataSize, 0, size - mDataSize);
    mDataSize = size;
    if (mDataPos > size) mDataPos = size;
    return NO_ERROR;
}

void Parcel::setDataPosition(size_t pos) const {
    // Positions past the data are clamped there, so later reads see the end of the data.
    mDataPos = pos > mDataSize ? mDataSize : pos;
}

status_t Parcel::setData(const uint8_t* buffer, size_t len) {
    if (len > std::numeric_limits<int32_t>::max()) return BAD_VALUE;
    freeData();
    if (len == 0) return NO_ERROR;
    if (status_t err = setDataCapacity(len); err != NO_ERROR) return err;
    memcpy(mData, buffer, len);
    mDataSize = len;
    return NO_ERROR;
}

status_t Parcel::errorCheck() const {
    return mError;
}

void Parcel::setError(status_t err) {
    mError = err;
}

status_t Parcel::growData(size_t len) {
    if (len > std::numeric_limits<int32_t>::max()) return BAD_VALUE;
    const size_t needed = mDataPos + len;
    if (needed <= mDataCapacity) return NO_ERROR;
    return setDataCapacity(needed > SIZE_MAX / 3 ? needed : (needed * 3) / 2);
}

status_t Parcel::finishWrite(size_t len) {
    mDataPos += len;
    if (mDataPos > mDataSize) mDataSize = mDataPos;
    return NO_ERROR;
}

void* Parcel::writeInplace(size_t len) {
    if (len > std::numeric_limits<int32_t>::max()) return nullptr;
    const size_t paddedLen = padded(len);
    if (growData(paddedLen) != NO_ERROR) return nullptr;
    uint8_t* out = mData + mDataPos;
    memset(out + len, 0, paddedLen - len);
    finishWrite(paddedLen);
    return out;
}

status_t Parcel::write(const void* data, size_t len) {
    void* out = writeInplace(len);
    if (out == nullptr) return BAD_VALUE;
    if (len > 0) memcpy(out, data, len);
    return NO_ERROR;
}

template <class T>
status_t Parcel::writeAligned(T val) {
    static_assert(padded(sizeof(T)) == sizeof(T));
    return write(&val, sizeof(T));
}

status_t Parcel::writeInt32(int32_t val) {
    return writeAligned(val);
}

status_t Parcel::writeUint32(uint32_t val) {
    return writeAligned(val);
}

status_t Parcel::writeInt64(int64_t val) {
    return writeAligned(val);
}

status_t Parcel::writeUint64(uint64_t val) {
    return writeAligned(val);
}

status_t Parcel::writeFloat(float val) {
    return writeAligned(val);
}

status_t Parcel::writeDouble(double val) {
    return writeAligned(val);
}

status_t Parcel::writeBool(bool val) {
    return writeInt32(val ? 1 : 0);
}

status_t Parcel::writeByteArray(size_t len, const uint8_t* val) {
    if (len > std::numeric_limits<int32_t>::max()) return BAD_VALUE;
    if (val == nullptr) return writeInt32(-1);
    if (status_t err = writeInt32(static_cast<int32_t>(len)); err != NO_ERROR) return err;
    return write(val, len);
}

const void* Parcel::readInplace(size_t len) const {
    if (len > std::numeric_limits<int32_t>::max()) return nullptr;
    const size_t paddedLen = padded(len);
    if (mDataPos > mDataSize || paddedLen > mDataSize - mDataPos) return nullptr;
    const void* data = mData + mDataPos;
    mDataPos += paddedLen;
    return data;
}

status_t Parcel::read(void* outData, size_t len) const {
    const void* data = readInplace(len);
    if (data == nullptr) return NOT_ENOUGH_DATA;
    if (len > 0) memcpy(outData, data, len);
    return NO_ERROR;
}

template <class T>
status_t Parcel::readAligned(T* pArg) const {
    // Past the end the value is 0 and the position stays where it is.
    if (read(pArg, sizeof(T)) == NO_ERROR) return NO_ERROR;
    *pArg = T{};
    return NOT_ENOUGH_DATA;
}

template <class T>
T Parcel::readAligned() const {
    T value;
    readAligned(&value);
    return value;
}

int32_t Parcel::readInt32() const {
    return readAligned<int32_t>();
}

status_t Parcel::readInt32(int32_t* pArg) const {
    return readAligned(pArg);
}

uint32_t Parcel::readUint32() const {
    return readAligned<uint32_t>();
}

status_t Parcel::readUint32(uint32_t* pArg) const {
    return readAligned(pArg);
}

int64_t Parcel::readInt64() const {
    return readAligned<int64_t>();
}

status_t Parcel::readInt64(int64_t* pArg) const {
    return readAligned(pArg);
}

uint64_t Parcel::readUint64() const {
    return readAligned<uint64_t>();
}

status_t Parcel::readUint64(uint64_t* pArg) const {
    return readAligned(pArg);
}

float Parcel::readFloat() const {
    return readAligned<float>();
}

status_t Parcel::readFloat(float* pArg) const {
    return readAligned(pArg);
}

double Parcel::readDouble() const {
    return readAligned<double>();
}

status_t Parcel::readDouble(double* pArg) const {
    return readAligned(pArg);
}

bool Parcel::readBool() const {
    return readInt32() != 0;
}

status_t Parcel::readBool(bool* pArg) const {
    int32_t value;
    status_t err = readInt32(&value);
    *pArg = value != 0;
    return err;
}

status_t Parcel::readByteVector(std::vector<uint8_t>* val) const {
    const size_t start = mDataPos;
    int32_t len;
    if (status_t err = readInt32(&len); err != NO_ERROR) return err;
    if (len < 0) {
        setDataPosition(start);
        return UNEXPECTED_NULL;
    }
    // The claimed length is checked against the data before anything is allocated for it.
    const void* data = readInplace(static_cast<size_t>(len));
    if (data == nullptr) {
        setDataPosition(start);
        return NOT_ENOUGH_DATA;
    }
    const auto* bytes = static_cast<const uint8_t*>(data);
    val->assign(bytes, bytes + len);
    return NO_ERROR;
}

}  // namespace android
