// An open MXF file as a byte source: one pread per read, nothing cached here
// (MXFCachedByteSource adds the block cache where a reader wants one).
#pragma once

#include "MXFByteSource.h"

class MXFFileByteSource : public MXFByteSource {
public:
    // Takes over `fd`, which is closed with the source. Nil (fd closed) when fd
    // is negative or cannot be examined. How the file was opened (flags, cache
    // hints) is the caller's choice.
    static Ref<MXFFileByteSource> initWithDescriptor(int fd);
    ~MXFFileByteSource() override;

    uint64_t size() const override { return _size; }
    int fd() const { return _fd; }

protected:
    int64_t read(uint64_t offset, void* data, size_t count) override;

private:
    MXFFileByteSource(int fd, uint64_t size) : _fd(fd), _size(size) {}

    int _fd;
    uint64_t _size;
};
