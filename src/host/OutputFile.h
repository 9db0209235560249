// A movie file being written: NAME.partial beside its destination, written
// through a libavformat I/O context with a large write buffer, renamed onto
// the destination when complete and removed otherwise.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

struct AVIOContext;

class OutputFile {
public:
    // nullptr with the reason in error.
    static std::unique_ptr<OutputFile> create(const std::string& destination, std::string* error);
    // Removes the partial file unless it was committed.
    ~OutputFile();
    OutputFile(const OutputFile&) = delete;
    OutputFile& operator=(const OutputFile&) = delete;

    AVIOContext* io() const { return _io; }
    const std::string& destination() const { return _destination; }
    const std::string& partialPath() const { return _partial; }
    // Bytes handed to the file so far (buffered ones included).
    uint64_t bytesWritten() const { return _bytesWritten.load(std::memory_order_relaxed); }
    // The first write or seek failure ("PATH: reason"), empty while there is none.
    const std::string& failure() const { return _failure; }

    // Writes what is buffered, closes the file and renames it onto the
    // destination. false with the reason in error.
    bool commit(std::string* error);
    // Closes and removes the partial file.
    void discard();

private:
    OutputFile() = default;
    static int writePacket(void* opaque, uint8_t* data, int size);
    static int64_t seekPacket(void* opaque, int64_t offset, int whence);
    bool flushStaging();
    bool writeOut(const uint8_t* first, size_t firstSize, const uint8_t* second, size_t secondSize);
    void fail(const char* what, int error);
    void closeFile();

    std::string _destination;
    std::string _partial;
    int _fd = -1;
    AVIOContext* _io = nullptr;
    // Small writes (atoms, audio packets) gather here; frames go straight out.
    std::vector<uint8_t> _staging;
    size_t _staged = 0;
    std::atomic<uint64_t> _bytesWritten{0};
    std::string _failure;
    bool _committed = false;
};
