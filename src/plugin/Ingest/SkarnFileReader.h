// A read buffer over one SkarnFileSource. Refills start on page boundaries of
// the range, and a read larger than one refill goes straight from the file into
// the caller's memory in whole pages. Positions are relative to the range.
//
// The buffer holds the source's bytes that end at the source's position, so the
// reader's position is the source's minus bufferData_ plus bufferPos_.
// bufferPos_ may run past bufferData_ after a seek: that many bytes of the next
// refill are skipped.
#pragma once

#include "Object.h"
#include "SkarnFileSource.h"

#include <cstdint>
#include <optional>
#include <string>

class SkarnFileReader : public Object {
public:
    // nil only when the buffer cannot be allocated; a file that cannot be
    // opened gives a reader whose reads answer 0.
    static Ref<SkarnFileReader> initWithURL(const std::optional<std::string>& url, int64_t offset, uint64_t length);
    ~SkarnFileReader() override;

    // n rounded down to whole pages.
    uint64_t alignedBytes(uint64_t n) const;
    uint32_t bufferRemaining() const;
    int64_t position() const;
    // Answers the bytes delivered. A direct read that comes back short counts
    // none of its bytes, though the position has moved past them.
    uint64_t read(uint64_t count, void* dest);
    // Answers the position reached; never beyond the range's end.
    int64_t seek(int64_t position);
    // Answers how far the position moved.
    int64_t skip(int64_t count);
    uint64_t remaining() const;
    void discard();
    // The refill size, at most maxBufferSize(). A change drops what is
    // buffered; the position stays.
    void setBufferSize(uint64_t size);

    uint64_t bufferSize() const { return bufferSize_; }
    uint64_t maxBufferSize() const { return maxBufferSize_; }
    // Read-only views of the buffer state, for tests and diagnostics.
    uint64_t bufferData() const { return bufferData_; }
    uint64_t bufferPos() const { return bufferPos_; }
    const SkarnFileSource* source() const { return source_.get(); }

private:
    SkarnFileReader() = default;

    Ref<SkarnFileSource> source_;
    uint64_t maxBufferSize_ = 0;
    uint64_t bufferSize_ = 0;
    uint8_t* buffer_ = nullptr;  // malloc'd once at maxBufferSize_
    uint64_t bufferData_ = 0;
    uint64_t bufferPos_ = 0;
    // Never used: where the buffer lies in the file follows from the source's
    // position and bufferData_.
    [[maybe_unused]] uint64_t bufferOffset_ = 0;
};
