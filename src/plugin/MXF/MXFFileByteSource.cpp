#include "MXFFileByteSource.h"

#include <cerrno>
#include <limits>
#include <sys/stat.h>
#include <unistd.h>

Ref<MXFFileByteSource> MXFFileByteSource::initWithDescriptor(int fd) {
    if (fd < 0) return nullptr;
    struct stat st {};
    if (::fstat(fd, &st) != 0) {
        ::close(fd);
        return nullptr;
    }
    return Ref<MXFFileByteSource>(new MXFFileByteSource(fd, uint64_t(st.st_size)));
}

MXFFileByteSource::~MXFFileByteSource() { ::close(_fd); }

int64_t MXFFileByteSource::read(uint64_t offset, void* data, size_t count) {
    // An offset no file can have fails like the read there would.
    if (offset > uint64_t(std::numeric_limits<off_t>::max())) return -1;
    ssize_t n;
    do {
        n = ::pread(_fd, data, count, off_t(offset));
    } while (n < 0 && errno == EINTR);
    return int64_t(n);
}
