#include "SkarnFileReader.h"

#include "FileSystem.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>

namespace {

constexpr uint64_t kMaxBufferSize = 4194304;
constexpr uint64_t kDefaultBufferSize = 32768;

// Positions are added and subtracted in unsigned arithmetic: a hostile offset
// may wrap, which must give a wrong position, never undefined behaviour.
int64_t addWrapping(int64_t a, int64_t b) { return int64_t(uint64_t(a) + uint64_t(b)); }
int64_t subWrapping(int64_t a, uint64_t b) { return int64_t(uint64_t(a) - b); }

}  // namespace

Ref<SkarnFileReader> SkarnFileReader::initWithURL(const std::optional<std::string>& url, int64_t offset,
                                                  uint64_t length) {
    Ref<SkarnFileReader> reader(new SkarnFileReader());
    reader->source_ = SkarnFileSource::initWithURL(url, offset, length);
    reader->maxBufferSize_ = kMaxBufferSize;
    reader->bufferSize_ = kDefaultBufferSize;
    reader->buffer_ = static_cast<uint8_t*>(std::malloc(reader->maxBufferSize_));
    if (!reader->buffer_) return nullptr;
    return reader;
}

SkarnFileReader::~SkarnFileReader() { std::free(buffer_); }

uint64_t SkarnFileReader::alignedBytes(uint64_t n) const { return n - n % FileSystem::pageSize(); }

// Truncated to 32 bits like its callers expect; the buffer never holds more
// than 4 MiB, so nothing is lost.
uint32_t SkarnFileReader::bufferRemaining() const {
    return bufferData_ > bufferPos_ ? uint32_t(bufferData_ - bufferPos_) : 0;
}

int64_t SkarnFileReader::position() const {
    return int64_t(uint64_t(source_->absoluteOffset()) - bufferData_ + bufferPos_);
}

uint64_t SkarnFileReader::remaining() const { return source_->remaining() + bufferData_ - bufferPos_; }

uint64_t SkarnFileReader::read(uint64_t count, void* dest) {
    auto* out = static_cast<uint8_t*>(dest);
    uint64_t total = 0;
    while (total < count) {
        const uint64_t want = count - total;

        if (const uint64_t buffered = bufferRemaining()) {
            const uint64_t n = std::min(want, buffered);
            std::memcpy(out + total, buffer_ + bufferPos_, n);
            total += n;
            bufferPos_ += n;
            if (bufferPos_ == bufferData_) bufferData_ = bufferPos_ = 0;
            continue;
        }

        if (source_->endOfStream()) return total;

        // Straight into the caller's memory in whole pages. Below one page
        // there is nothing to read directly (a refill size under a page would
        // otherwise read 0 bytes here for ever), so that goes through the buffer.
        if (bufferSize_ < want && bufferPos_ == 0) {
            const uint64_t direct = alignedBytes(want);
            if (direct > 0) {
                const int64_t got = source_->read(out + total, int64_t(std::min<uint64_t>(direct, INT64_MAX)));
                // The bytes of a short direct read are not counted: callers
                // treat any short read of a sample as a failed one.
                if (got < 0 || uint64_t(got) < direct) return total;
                bufferData_ = 0;
                total += direct;
                continue;
            }
        }

        // Bytes still buffered all lie behind the read index (only after a
        // short refill); drop them so that the index counts from the source's
        // position, where the refill lands.
        if (bufferData_ != 0) {
            bufferPos_ -= bufferData_;
            bufferData_ = 0;
        }
        // At least one page per refill, so that the part of the first page a
        // seek skips is always inside it.
        const uint64_t refill = std::min(std::max<uint64_t>(bufferSize_, FileSystem::pageSize()), maxBufferSize_);
        const uint64_t n = std::min(refill, source_->remaining());
        if (n == 0) return total;
        const int64_t got = source_->read(buffer_, int64_t(n));
        bufferData_ = uint64_t(std::max<int64_t>(got, 0));
        if (bufferData_ != n) return total;
    }
    return total;
}

int64_t SkarnFileReader::seek(int64_t target) {
    if (position() == target) return target;

    // The buffer holds the range positions [first, sourceAt). Its very first
    // byte is served by a new aligned seek and refill, not from the buffer.
    const int64_t sourceAt = source_->absoluteOffset();
    const int64_t first = subWrapping(sourceAt, bufferData_);
    if (first < target && sourceAt >= target) {
        bufferPos_ = uint64_t(target) - uint64_t(first);
        if (bufferPos_ == bufferData_) bufferData_ = bufferPos_ = 0;
        return target;
    }

    // The source only ever stands on page multiples of the range; the rest of
    // the first page is skipped from the next refill.
    const int64_t end = addWrapping(sourceAt, int64_t(source_->remaining()));
    const uint64_t clamped = uint64_t(std::min(target, end));
    const uint64_t aligned = alignedBytes(clamped);
    bufferPos_ = clamped - aligned;
    bufferData_ = 0;
    return addWrapping(source_->seek(int64_t(aligned)), int64_t(bufferPos_));
}

int64_t SkarnFileReader::skip(int64_t count) {
    // Within the buffer only the index moves. A backward skip further than the
    // index would wrap it, so that goes through seek.
    const bool staysInBuffer = count >= 0 || uint64_t(0) - uint64_t(count) <= bufferPos_;
    if (int64_t(bufferRemaining()) > count && staysInBuffer) {
        bufferPos_ += uint64_t(count);
        return count;
    }
    const int64_t from = position();
    return subWrapping(seek(addWrapping(from, count)), uint64_t(from));
}

void SkarnFileReader::discard() { skip(int64_t(remaining())); }

void SkarnFileReader::setBufferSize(uint64_t size) {
    if (size == bufferSize_) return;
    bufferSize_ = std::min(size, maxBufferSize_);
    // Going to the end and back drops the buffered bytes, so that the next
    // read refills at the new size.
    const int64_t here = position();
    discard();
    seek(here);
}
