// One byte range of one file (a start offset and a length) with its own
// position, read with plain POSIX calls. Every position it answers is relative
// to the start of the range.
#pragma once

#include "Object.h"

#include <cstdint>
#include <optional>
#include <string>

class SkarnFileSource : public Object {
public:
    // Never nil. A nil path opens nothing. A path that cannot be opened, or
    // that names anything but a regular file (a FIFO, socket, device or folder
    // would block or never end), gives a source with nothing open and an empty
    // range at `offset`: every read answers 0. So does a negative offset. The
    // length is cut so that the range ends within the largest file offset.
    static Ref<SkarnFileSource> initWithURL(const std::optional<std::string>& url, int64_t offset, uint64_t length);
    ~SkarnFileSource() override;

    // At most `length` bytes, never past the range's end; 0 for a negative
    // length. A short read is not retried: callers compare the count.
    int64_t read(void* buffer, int64_t length);
    uint64_t remaining() const;
    // Clamped to the range's end but not to its start: a negative position
    // reaches the bytes before the range. A position the descriptor cannot
    // take (before the file's start) leaves it where it stood. Answers the
    // position reached.
    int64_t seek(int64_t position);
    // Relative to the range's start, whatever the name says.
    int64_t absoluteOffset() const;
    bool endOfStream() const;
    uint64_t startOffset() const { return startOffset_; }

    // read(2) calls made so far, for tests and diagnostics that check how a
    // reader split its requests.
    uint64_t readCalls() const { return readCalls_; }

private:
    SkarnFileSource() = default;

    int64_t file_ = -1;  // -1 until a regular file is open; 0 is a valid descriptor
    uint64_t currentPosition_ = 0;
    uint64_t startOffset_ = 0;
    uint64_t dataLength_ = 0;
    uint64_t readCalls_ = 0;
};
