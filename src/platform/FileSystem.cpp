#include "FileSystem.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <dirent.h>
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>

namespace FileSystem {

bool fileExists(const std::string& path) {
    struct stat st;
    return !path.empty() && ::stat(path.c_str(), &st) == 0;
}

bool fileExists(const std::string& path, bool& isDir) {
    struct stat st;
    isDir = false;
    if (path.empty() || ::stat(path.c_str(), &st) != 0) return false;
    isDir = S_ISDIR(st.st_mode);
    return true;
}

bool isDirectory(const std::string& path) {
    bool dir = false;
    return fileExists(path, dir) && dir;
}

std::optional<std::vector<std::string>> contentsOfDirectory(const std::string& path, int* errorCode) {
    DIR* d = ::opendir(path.c_str());
    if (!d) {
        if (errorCode) *errorCode = errno ? errno : EIO;
        return std::nullopt;
    }
    std::vector<std::string> names;
    for (;;) {
        errno = 0;
        struct dirent* e = ::readdir(d);
        if (!e) {
            if (errno != 0) {
                if (errorCode) *errorCode = errno;
                ::closedir(d);
                return std::nullopt;
            }
            break;
        }
        if (std::strcmp(e->d_name, ".") == 0 || std::strcmp(e->d_name, "..") == 0) continue;
        names.emplace_back(e->d_name);
    }
    ::closedir(d);
    if (errorCode) *errorCode = 0;
    return names;
}

static void enumerateInto(const std::string& root, const std::string& rel, bool skipHidden,
                          const std::function<bool(const std::string&, const std::string&, bool)>& fn, int depth) {
    if (depth > 256) return;  // a bound against pathological trees
    std::string full = rel.empty() ? root : root + "/" + rel;
    auto names = contentsOfDirectory(full);
    if (!names) return;
    for (const std::string& name : *names) {
        if (skipHidden && !name.empty() && name[0] == '.') continue;
        std::string childRel = rel.empty() ? name : rel + "/" + name;
        std::string childFull = full + "/" + name;
        struct stat st;
        if (::lstat(childFull.c_str(), &st) != 0) continue;
        bool dir = S_ISDIR(st.st_mode);
        bool descend = fn(childRel, childFull, dir);
        if (dir && descend) enumerateInto(root, childRel, skipHidden, fn, depth + 1);
    }
}

void enumerate(const std::string& root, bool skipHidden,
               const std::function<bool(const std::string&, const std::string&, bool)>& fn) {
    enumerateInto(root, "", skipHidden, fn, 0);
}

static bool removeTree(const std::string& path, int depth) {
    struct stat st;
    if (::lstat(path.c_str(), &st) != 0) return errno == ENOENT;
    if (S_ISDIR(st.st_mode)) {
        if (depth > 256) return false;
        auto names = contentsOfDirectory(path);
        if (!names) return false;
        bool ok = true;
        for (const auto& n : *names) ok = removeTree(path + "/" + n, depth + 1) && ok;
        if (!ok) return false;
        return ::rmdir(path.c_str()) == 0;
    }
    return ::unlink(path.c_str()) == 0;
}

bool removeItem(const std::string& path) {
    if (path.empty()) return false;
    return removeTree(path, 0);
}

// The flag ioctls need a descriptor. Only files and folders carry the flag, so
// nothing else is opened: opening a FIFO releases a writer waiting on it, and
// opening a device can act on it. O_NONBLOCK and O_NOFOLLOW cover an item
// swapped in after the check: no wait, and never a link's target.
static int openForFlags(const std::string& path) {
    struct stat st;
    if (::lstat(path.c_str(), &st) != 0 || !(S_ISREG(st.st_mode) || S_ISDIR(st.st_mode))) return -1;
    return ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_NOFOLLOW | O_CLOEXEC);
}

static std::optional<int> inodeFlags(const std::string& path) {
    int fd = openForFlags(path);
    if (fd < 0) return std::nullopt;
    int flags = 0;
    int rc = ::ioctl(fd, FS_IOC_GETFLAGS, &flags);
    ::close(fd);
    if (rc != 0) return std::nullopt;
    return flags;
}

std::optional<bool> isImmutable(const std::string& path) {
    auto flags = inodeFlags(path);
    if (!flags) return std::nullopt;
    return (*flags & FS_IMMUTABLE_FL) != 0;
}

bool setImmutable(const std::string& path, bool immutable) {
    int fd = openForFlags(path);
    if (fd < 0) return false;
    int flags = 0;
    bool ok = ::ioctl(fd, FS_IOC_GETFLAGS, &flags) == 0;
    if (ok) {
        int wanted = immutable ? (flags | FS_IMMUTABLE_FL) : (flags & ~FS_IMMUTABLE_FL);
        ok = wanted == flags || ::ioctl(fd, FS_IOC_SETFLAGS, &wanted) == 0;
    }
    ::close(fd);
    return ok;
}

bool isDeletableFile(const std::string& path) {
    struct stat st;
    if (path.empty() || ::lstat(path.c_str(), &st) != 0) return false;
    if (isImmutable(path).value_or(false)) return false;
    std::string parent = stringByDeletingLastPathComponent(path);
    if (parent.empty()) parent.push_back('.');
    if (::access(parent.c_str(), W_OK | X_OK) != 0) return false;
    return !isImmutable(parent).value_or(false);
}

int openReadOnly(const std::string& path) { return ::open(path.c_str(), O_RDONLY | O_CLOEXEC); }

int openRegularFileReadOnly(const std::string& path) {
    // Non-blocking so that opening a FIFO cannot wait for a writer; the type
    // is then checked on the descriptor itself, so nothing can swap the file
    // between the check and the open.
    int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    if (fd < 0) return -1;
    struct stat st;
    if (::fstat(fd, &st) != 0 || !S_ISREG(st.st_mode)) {
        ::close(fd);
        errno = EINVAL;
        return -1;
    }
    int flags = ::fcntl(fd, F_GETFL);
    if (flags >= 0) ::fcntl(fd, F_SETFL, flags & ~O_NONBLOCK);
    return fd;
}

bool disableCaching(int fd) {
    if (fd < 0) return false;
    // A no-cache descriptor only keeps its own reads out of the cache; it
    // never throws out what is cached already. DONTNEED would evict every
    // cached page of the file (an hour-long clip's index tables included)
    // for everyone; NOREUSE is the hint that matches.
    return ::posix_fadvise(fd, 0, 0, POSIX_FADV_NOREUSE) == 0;
}

namespace {
// Repeats a read call until n bytes arrived, the file ended or a real error came.
template <class Read>
int64_t readLoop(void* buf, size_t n, Read read) {
    size_t done = 0;
    auto* p = static_cast<uint8_t*>(buf);
    while (done < n) {
        ssize_t r = read(p + done, n - done, done);
        if (r < 0) {
            if (errno == EINTR) continue;
            return -1;
        }
        if (r == 0) break;
        done += size_t(r);
    }
    return int64_t(done);
}
}  // namespace

int64_t readFully(int fd, void* buf, size_t n) {
    return readLoop(buf, n, [fd](uint8_t* p, size_t want, size_t) { return ::read(fd, p, want); });
}

int64_t preadFully(int fd, void* buf, size_t n, int64_t offset) {
    return readLoop(buf, n, [fd, offset](uint8_t* p, size_t want, size_t done) {
        return ::pread(fd, p, want, offset + int64_t(done));
    });
}

std::optional<uint64_t> fileSize(const std::string& path) {
    struct stat st;
    if (::stat(path.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) return std::nullopt;
    return uint64_t(st.st_size);
}

std::optional<std::vector<uint8_t>> readFile(const std::string& path, size_t maxBytes) {
    int fd = openRegularFileReadOnly(path);
    if (fd < 0) return std::nullopt;
    struct stat st;
    if (::fstat(fd, &st) != 0 || !S_ISREG(st.st_mode)) {
        ::close(fd);
        return std::nullopt;
    }
    size_t n = std::min<uint64_t>(uint64_t(st.st_size), maxBytes);
    std::vector<uint8_t> bytes(n);
    int64_t r = readFully(fd, bytes.data(), n);
    ::close(fd);
    if (r < 0) return std::nullopt;
    bytes.resize(size_t(r));
    return bytes;
}

bool writeFileAtomically(const std::string& path, const void* data, size_t size) {
    std::string tmp = path + ".tmp." + std::to_string(::getpid());
    int fd = ::open(tmp.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (fd < 0) return false;
    const auto* p = static_cast<const uint8_t*>(data);
    size_t done = 0;
    bool ok = true;
    while (done < size) {
        ssize_t w = ::write(fd, p + done, size - done);
        if (w < 0) {
            if (errno == EINTR) continue;
            ok = false;
            break;
        }
        done += size_t(w);
    }
    ok = ok && ::fsync(fd) == 0;
    ok = (::close(fd) == 0) && ok;
    if (ok) ok = ::rename(tmp.c_str(), path.c_str()) == 0;
    if (!ok) ::unlink(tmp.c_str());
    return ok;
}

size_t pageSize() {
    static const size_t size = size_t(::sysconf(_SC_PAGESIZE));
    return size;
}

std::string lastPathComponent(const std::string& path) {
    std::string p = path;
    while (p.size() > 1 && p.back() == '/') p.pop_back();
    if (p == "/") return p;
    size_t slash = p.rfind('/');
    return slash == std::string::npos ? p : p.substr(slash + 1);
}

std::string stringByDeletingLastPathComponent(const std::string& path) {
    std::string p = path;
    while (p.size() > 1 && p.back() == '/') p.pop_back();
    size_t slash = p.rfind('/');
    if (slash == std::string::npos) return "";
    if (slash == 0) return "/";
    return p.substr(0, slash);
}

std::string stringByAppendingPathComponent(const std::string& path, const std::string& component) {
    if (path.empty()) return component;
    if (path.back() == '/') return path + component;
    return path + "/" + component;
}

std::string pathExtension(const std::string& path) {
    std::string last = lastPathComponent(path);
    size_t dot = last.rfind('.');
    if (dot == std::string::npos || dot == 0) return "";
    return last.substr(dot + 1);
}

std::string stringByDeletingPathExtension(const std::string& path) {
    std::string ext = pathExtension(path);
    if (ext.empty()) return path;
    std::string p = path;
    while (p.size() > 1 && p.back() == '/') p.pop_back();
    return p.substr(0, p.size() - ext.size() - 1);
}

std::string stringByAppendingPathExtension(const std::string& path, const std::string& ext) {
    return path + "." + ext;
}

int caseInsensitiveCompare(const std::string& a, const std::string& b) {
    size_t n = std::min(a.size(), b.size());
    for (size_t i = 0; i < n; ++i) {
        int ca = std::tolower(static_cast<unsigned char>(a[i]));
        int cb = std::tolower(static_cast<unsigned char>(b[i]));
        if (ca != cb) return ca < cb ? -1 : 1;
    }
    if (a.size() == b.size()) return 0;
    return a.size() < b.size() ? -1 : 1;
}

bool caseInsensitiveEqual(const std::string& a, const std::string& b) {
    return a.size() == b.size() && caseInsensitiveCompare(a, b) == 0;
}

bool hasSuffix(const std::string& s, const std::string& suffix) {
    return s.size() >= suffix.size() && s.compare(s.size() - suffix.size(), suffix.size(), suffix) == 0;
}

bool hasPrefix(const std::string& s, const std::string& prefix) {
    return s.size() >= prefix.size() && s.compare(0, prefix.size(), prefix) == 0;
}

}  // namespace FileSystem
