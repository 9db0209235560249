// Where the MXF readers' bytes come from: a file, or bytes already in memory (a
// fuzzer's input, a test's array). Every reader asks for bytes at an offset and
// is told how many were there, so a parser answers the same over a card's file
// and over the same bytes in memory.
#pragma once

#include "Object.h"

#include <atomic>
#include <cstddef>
#include <cstdint>

class MXFByteSource : public Object {
public:
    // Reads made through this source: calls, and bytes delivered.
    struct ReadStatistics {
        uint64_t calls = 0;
        uint64_t bytes = 0;
    };

    // Bytes in the source (a file's size when it was opened).
    virtual uint64_t size() const = 0;
    // Copies up to `count` bytes at `offset` into `data`, as one positioned
    // read: answers the bytes delivered (fewer at the end, 0 past it), or -1
    // when the read failed.
    int64_t readAt(uint64_t offset, void* data, size_t count);
    ReadStatistics readStatistics() const { return {_readCalls.load(), _readBytes.load()}; }

protected:
    MXFByteSource() = default;
    virtual int64_t read(uint64_t offset, void* data, size_t count) = 0;

private:
    std::atomic<uint64_t> _readCalls{0};
    std::atomic<uint64_t> _readBytes{0};
};
