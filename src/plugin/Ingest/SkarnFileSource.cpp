#include "SkarnFileSource.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <fcntl.h>
#include <limits>
#include <string_view>
#include <sys/stat.h>
#include <sys/types.h>
#include <unistd.h>
#include <vector>

static_assert(sizeof(off_t) == 8, "file offsets must be 64-bit");

namespace {

// One read(2) call moves at most about 2 GiB on Linux; larger requests are
// split so that only the end of the file or an error makes a read short.
constexpr uint64_t kMaxReadChunk = uint64_t(1) << 30;

// The platform's path standardisation: an initial "~" becomes the home folder,
// empty and "." components and a trailing slash go, and ".." takes away the
// component before it in absolute paths (without asking the file system);
// relative paths keep their "..".
std::string standardizedPath(const std::string& input) {
    std::string path = input;
    if (!path.empty() && path[0] == '~' && (path.size() == 1 || path[1] == '/'))
        if (const char* home = std::getenv("HOME"); home && *home) path = home + path.substr(1);
    if (path.empty()) return path;

    const bool absolute = path[0] == '/';
    std::vector<std::string_view> parts;
    std::string_view rest(path);
    while (!rest.empty()) {
        const size_t slash = rest.find('/');
        const std::string_view part = rest.substr(0, slash);
        rest = slash == std::string_view::npos ? std::string_view() : rest.substr(slash + 1);
        if (part.empty() || part == ".") continue;
        if (part == ".." && absolute) {
            if (!parts.empty()) parts.pop_back();
            continue;
        }
        parts.push_back(part);
    }

    std::string out;
    for (const std::string_view part : parts) {
        if (absolute || !out.empty()) out += '/';
        out += part;
    }
    if (out.empty()) return absolute ? "/" : ".";
    return out;
}

// Opened without blocking and checked before anything is read: a FIFO would
// block the open (or, with a writer, feed bytes forever) and a device such as
// /dev/zero never ends, so only a regular file is kept.
int openRegularFile(const std::string& path) {
    int fd;
    do {
        fd = ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC | O_NOCTTY);
    } while (fd < 0 && errno == EINTR);
    if (fd < 0) return -1;
    struct stat st;
    const int flags = ::fcntl(fd, F_GETFL);
    if (::fstat(fd, &st) != 0 || !S_ISREG(st.st_mode) || flags < 0 ||
        ::fcntl(fd, F_SETFL, flags & ~O_NONBLOCK) != 0) {
        ::close(fd);
        return -1;
    }
    return fd;
}

}  // namespace

Ref<SkarnFileSource> SkarnFileSource::initWithURL(const std::optional<std::string>& url, int64_t offset,
                                                  uint64_t length) {
    Ref<SkarnFileSource> source(new SkarnFileSource());
    if (!url) return source;
    if (offset < 0) return source;

    source->startOffset_ = uint64_t(offset);
    source->currentPosition_ = uint64_t(offset);
    const int fd = openRegularFile(standardizedPath(*url));
    if (fd < 0) return source;

    // The page cache stays in use for these reads (cadence analysis reads the
    // same frames again right away). Linux reads through the cache already, so
    // there is no per-descriptor cache switch to clear here.
    source->file_ = fd;
    source->dataLength_ = std::min<uint64_t>(length, uint64_t(std::numeric_limits<int64_t>::max() - offset));
    if (::lseek(fd, off_t(offset), SEEK_SET) < 0) {
        // Only a position beyond what the file system allows gets here;
        // nothing can be read from the range then.
        ::close(fd);
        source->file_ = -1;
        source->dataLength_ = 0;
    }
    return source;
}

SkarnFileSource::~SkarnFileSource() {
    if (file_ >= 0) ::close(int(file_));
}

int64_t SkarnFileSource::absoluteOffset() const { return int64_t(currentPosition_ - startOffset_); }

uint64_t SkarnFileSource::remaining() const { return dataLength_ - uint64_t(absoluteOffset()); }

bool SkarnFileSource::endOfStream() const { return remaining() == 0; }

int64_t SkarnFileSource::read(void* buffer, int64_t length) {
    if (length <= 0) return 0;
    uint64_t count = uint64_t(length);
    if (remaining() <= count) count = remaining();
    if (file_ < 0 || count == 0) return 0;

    auto* out = static_cast<uint8_t*>(buffer);
    uint64_t done = 0;
    while (done < count) {
        const size_t chunk = size_t(std::min(count - done, kMaxReadChunk));
        ssize_t got;
        do {
            ++readCalls_;
            got = ::read(int(file_), out + done, chunk);
        } while (got < 0 && errno == EINTR);
        if (got <= 0) break;  // a failing call counts as no bytes
        done += uint64_t(got);
        if (size_t(got) < chunk) break;
    }
    currentPosition_ += done;
    return int64_t(done);
}

int64_t SkarnFileSource::seek(int64_t position) {
    const uint64_t end = uint64_t(absoluteOffset()) + remaining();  // dataLength_, at most INT64_MAX
    if (position >= int64_t(end)) position = int64_t(end);
    const uint64_t target = startOffset_ + uint64_t(position);
    if (file_ < 0) {
        currentPosition_ = target;
    } else if (target <= uint64_t(std::numeric_limits<int64_t>::max())) {
        const off_t reached = ::lseek(int(file_), off_t(target), SEEK_SET);
        if (reached >= 0) currentPosition_ = uint64_t(reached);
    }
    return absoluteOffset();
}
