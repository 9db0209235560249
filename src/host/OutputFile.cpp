#include "OutputFile.h"

extern "C" {
#include <libavformat/avio.h>
#include <libavutil/error.h>
#include <libavutil/mem.h>
}

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/uio.h>
#include <unistd.h>

namespace {

// Writes at least this large go to the file without passing the staging
// buffer: one video frame is one write.
constexpr size_t kDirectWrite = 128 * 1024;
constexpr size_t kStagingSize = 1024 * 1024;
constexpr int kIOBufferSize = 64 * 1024;

}  // namespace

std::unique_ptr<OutputFile> OutputFile::create(const std::string& destination, std::string* error) {
    std::unique_ptr<OutputFile> file(new OutputFile);
    file->_destination = destination;
    file->_partial = destination + ".partial";
    file->_fd = ::open(file->_partial.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (file->_fd < 0) {
        if (error) *error = "cannot create " + file->_partial + ": " + std::strerror(errno);
        return nullptr;
    }
    file->_staging.resize(kStagingSize);
    auto* buffer = static_cast<unsigned char*>(av_malloc(kIOBufferSize));
    if (buffer)
        file->_io = avio_alloc_context(buffer, kIOBufferSize, 1, file.get(), nullptr, writePacket, seekPacket);
    if (!file->_io) {
        av_free(buffer);
        if (error) *error = "out of memory";
        return nullptr;
    }
    // Packet data goes to writePacket as it is, not copied through the
    // context's own buffer first.
    file->_io->direct = 1;
    return file;
}

OutputFile::~OutputFile() {
    if (!_committed) discard();
    if (_io) {
        av_freep(&_io->buffer);
        avio_context_free(&_io);
    }
}

void OutputFile::fail(const char* what, int error) {
    if (_failure.empty()) _failure = std::string(what) + " " + _partial + ": " + std::strerror(error);
}

bool OutputFile::writeOut(const uint8_t* first, size_t firstSize, const uint8_t* second, size_t secondSize) {
    iovec parts[2] = {{const_cast<uint8_t*>(first), firstSize}, {const_cast<uint8_t*>(second), secondSize}};
    int index = firstSize ? 0 : 1;
    while (index < 2) {
        ssize_t n = ::writev(_fd, parts + index, 2 - index);
        if (n < 0) {
            if (errno == EINTR) continue;
            fail("cannot write", errno);
            return false;
        }
        if (n == 0) {
            fail("cannot write", ENOSPC);
            return false;
        }
        size_t done = size_t(n);
        while (index < 2 && done >= parts[index].iov_len) done -= parts[index++].iov_len;
        if (index < 2) {
            parts[index].iov_base = static_cast<uint8_t*>(parts[index].iov_base) + done;
            parts[index].iov_len -= done;
        }
    }
    return true;
}

bool OutputFile::flushStaging() {
    if (_staged == 0) return true;
    bool ok = writeOut(_staging.data(), _staged, nullptr, 0);
    _staged = 0;
    return ok;
}

int OutputFile::writePacket(void* opaque, uint8_t* data, int size) {
    auto* file = static_cast<OutputFile*>(opaque);
    if (!file->_failure.empty()) return AVERROR(EIO);
    if (size <= 0) return 0;
    size_t n = size_t(size);
    file->_bytesWritten += n;
    if (n >= kDirectWrite) {
        // What is staged and this write leave in one call.
        bool ok = file->writeOut(file->_staging.data(), file->_staged, data, n);
        file->_staged = 0;
        return ok ? size : AVERROR(EIO);
    }
    if (file->_staged + n > file->_staging.size() && !file->flushStaging()) return AVERROR(EIO);
    std::memcpy(file->_staging.data() + file->_staged, data, n);
    file->_staged += n;
    return size;
}

int64_t OutputFile::seekPacket(void* opaque, int64_t offset, int whence) {
    auto* file = static_cast<OutputFile*>(opaque);
    if (!file->flushStaging()) return AVERROR(EIO);
    if (whence & AVSEEK_SIZE) {
        struct stat st;
        if (::fstat(file->_fd, &st) != 0) return AVERROR(errno);
        return st.st_size;
    }
    off_t at = ::lseek(file->_fd, off_t(offset), whence & ~AVSEEK_FORCE);
    if (at < 0) {
        file->fail("cannot seek in", errno);
        return AVERROR(errno);
    }
    return at;
}

void OutputFile::closeFile() {
    if (_fd >= 0) ::close(_fd);
    _fd = -1;
}

bool OutputFile::commit(std::string* error) {
    avio_flush(_io);
    flushStaging();
    if (_failure.empty() && ::close(_fd) != 0) fail("cannot close", errno);
    _fd = -1;
    if (_failure.empty() && ::rename(_partial.c_str(), _destination.c_str()) != 0)
        _failure = "cannot rename " + _partial + " to " + _destination + ": " + std::strerror(errno);
    if (!_failure.empty()) {
        if (error) *error = _failure;
        discard();
        return false;
    }
    _committed = true;
    return true;
}

void OutputFile::discard() {
    closeFile();
    if (!_committed) ::unlink(_partial.c_str());
    _staged = 0;
}
