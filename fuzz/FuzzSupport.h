// What the harnesses share: hard assertions that throw so a harness can catch
// them; for a harness that needs its input on disk (clip XML beside a card's
// other files), a per-process scratch path and the input written to it; files
// held in memory and card folders whose files are such memory files; the
// self-contained clip's header gap, left out of seeds and put back here; and
// the two ways inputs are cut into pieces.
#pragma once

#include "AssertionHandler.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <sys/mman.h>
#include <unistd.h>
#include <vector>

// $TMPDIR (or /tmp) + "/skarn-<tag>-fuzz-<pid>" + suffix.
inline std::string fuzzScratchPath(const std::string& tag, const std::string& suffix = "") {
    const char* tmp = std::getenv("TMPDIR");
    return std::string(tmp && *tmp ? tmp : "/tmp") + "/skarn-" + tag + "-fuzz-" + std::to_string(::getpid()) + suffix;
}

// Replaces the file's contents with the input; false when it cannot be written.
inline bool fuzzWriteInput(const std::string& path, const uint8_t* data, size_t size) {
    FILE* f = std::fopen(path.c_str(), "wb");
    if (!f) return false;
    bool ok = std::fwrite(data, 1, size, f) == size;
    return std::fclose(f) == 0 && ok;
}

// Installs the throwing hard-assertion handler once per process.
inline void fuzzThrowOnHardAssertions() {
    static const bool installed = [] {
        setHardAssertionFailureHandler(throwingHardAssertionFailureHandler);
        return true;
    }();
    (void)installed;
}

// Soft assertions either throw, as the default handler does, but without its
// report on stderr for every input, or return, which the plug-in must survive
// too: hosts may install a handler that does.
class FuzzAssertionHandler : public AssertionHandler {
public:
    explicit FuzzAssertionHandler(bool returns) : _returns(returns) {}
    void handleFailureInMethod(const std::string& method, const std::string& file, int line,
                               const std::string& description) override {
        if (!_returns) throw AssertionFailure(method, file, line, description);
    }
    void handleFailureInFunction(const std::string& function, const std::string& file, int line,
                                 const std::string& description) override {
        if (!_returns) throw AssertionFailure(function, file, line, description);
    }

private:
    bool _returns;
};

// Where harnesses fold the bytes they read, so that no read is optimised away.
inline volatile uint64_t gFuzzSink;

[[noreturn]] inline void fuzzSetupFailed(const std::string& what) {
    std::fprintf(stderr, "fuzz harness set-up: %s: %s\n", what.c_str(), std::strerror(errno));
    std::abort();
}

// A regular file that lives in memory only (memfd), reached by the path
// /proc/self/fd/N; it goes with the process however the process ends.
class FuzzMemoryFile {
public:
    explicit FuzzMemoryFile(const char* name) {
        _fd = ::memfd_create(name, MFD_CLOEXEC);
        if (_fd < 0) fuzzSetupFailed("memfd_create");
        _path = "/proc/self/fd/" + std::to_string(_fd);
    }
    FuzzMemoryFile(const FuzzMemoryFile&) = delete;
    FuzzMemoryFile& operator=(const FuzzMemoryFile&) = delete;
    ~FuzzMemoryFile() { ::close(_fd); }

    const std::string& path() const { return _path; }

    // Replaces the contents. Written over the old bytes and then cut, so that
    // pages stay with the file from one input to the next.
    void write(std::span<const uint8_t> bytes) {
        size_t done = 0;
        while (done < bytes.size()) {
            const ssize_t n = ::pwrite(_fd, bytes.data() + done, bytes.size() - done, off_t(done));
            if (n <= 0) fuzzSetupFailed("memfd write");
            done += size_t(n);
        }
        if (::ftruncate(_fd, off_t(bytes.size())) != 0) fuzzSetupFailed("memfd truncate");
    }

private:
    int _fd = -1;
    std::string _path;
};

// A card folder tree made once per process in /dev/shm (memory-backed), whose
// files are symbolic links to memory files: a clip finds its files by folder
// listing, which a memory file alone cannot give, and every input only
// rewrites the memory files. The tree is removed when the process exits
// normally; trees left by processes that died are removed by the next one.
class FuzzMemoryCard {
public:
    // files: paths relative to the card's root, e.g. "CONTENTS/AVCLIP/A001.MXF".
    FuzzMemoryCard(const std::string& tag, const std::vector<std::string>& files) {
        namespace fs = std::filesystem;
        const std::string prefix = "skarn-" + tag + "-fuzz-";
        removeStaleTrees(prefix);
        _root = "/dev/shm/" + prefix + std::to_string(::getpid());
        std::error_code ec;
        fs::remove_all(_root, ec);
        for (const std::string& relative : files) {
            const fs::path link = fs::path(_root) / relative;
            fs::create_directories(link.parent_path(), ec);
            if (ec) fuzzSetupFailed("mkdir " + link.parent_path().string());
            _files.push_back(std::make_unique<FuzzMemoryFile>(link.filename().c_str()));
            if (::symlink(_files.back()->path().c_str(), link.c_str()) != 0) fuzzSetupFailed("symlink " + link.string());
            _paths.push_back(link.string());
        }
    }
    FuzzMemoryCard(const FuzzMemoryCard&) = delete;
    FuzzMemoryCard& operator=(const FuzzMemoryCard&) = delete;
    ~FuzzMemoryCard() {
        std::error_code ec;
        std::filesystem::remove_all(_root, ec);
    }

    const std::string& root() const { return _root; }
    // The path of the i-th file in the card's tree.
    const std::string& path(size_t i) const { return _paths[i]; }
    void write(size_t i, std::span<const uint8_t> bytes) { _files[i]->write(bytes); }

private:
    static void removeStaleTrees(const std::string& prefix) {
        namespace fs = std::filesystem;
        std::error_code ec;
        for (const auto& entry : fs::directory_iterator("/dev/shm", ec)) {
            const std::string name = entry.path().filename().string();
            if (name.rfind(prefix, 0) != 0) continue;
            const std::string pid = name.substr(prefix.size());
            if (pid.empty() || pid.find_first_not_of("0123456789") != std::string::npos) continue;
            if (!fs::exists("/proc/" + pid, ec)) fs::remove_all(entry.path(), ec);
        }
    }

    std::string _root;
    std::vector<std::unique_ptr<FuzzMemoryFile>> _files;
    std::vector<std::string> _paths;
};

// A self-contained clip carries its clip XML in a KLV at 32768, after header
// metadata of a few kilobytes and a fill of zeros up to there. Seeds leave the
// tail of zeros out, so that mutations do not spend themselves on it: when the
// carrier's key comes before 32768 in an input, zeros are put back ahead of it.
inline constexpr std::array<uint8_t, 16> kFuzzAVClipXMLCarrierKey = {
    0x06, 0x0e, 0x2b, 0x34, 0x01, 0x01, 0x01, 0x09, 0x0e, 0x0e, 0x01, 0x01, 0x11, 0x01, 0x01, 0x00};
inline constexpr size_t kFuzzAVClipXMLCarrierOffset = 32768;

inline std::vector<uint8_t> fuzzExpandAVClip(std::span<const uint8_t> input) {
    const auto window = input.first(std::min(input.size(), kFuzzAVClipXMLCarrierOffset));
    const auto at = std::search(window.begin(), window.end(), kFuzzAVClipXMLCarrierKey.begin(),
                                kFuzzAVClipXMLCarrierKey.end());
    std::vector<uint8_t> file;
    if (at == window.end()) {
        file.assign(input.begin(), input.end());
        return file;
    }
    const size_t keyAt = size_t(at - window.begin());
    file.reserve(input.size() + kFuzzAVClipXMLCarrierOffset - keyAt);
    file.insert(file.end(), input.begin(), input.begin() + ptrdiff_t(keyAt));
    file.resize(kFuzzAVClipXMLCarrierOffset, 0);
    file.insert(file.end(), input.begin() + ptrdiff_t(keyAt), input.end());
    return file;
}

// The inverse, for making seeds: the zeros just ahead of the carrier go.
inline std::vector<uint8_t> fuzzElideAVClip(std::span<const uint8_t> file) {
    if (file.size() < kFuzzAVClipXMLCarrierOffset + kFuzzAVClipXMLCarrierKey.size() ||
        !std::equal(kFuzzAVClipXMLCarrierKey.begin(), kFuzzAVClipXMLCarrierKey.end(),
                    file.begin() + ptrdiff_t(kFuzzAVClipXMLCarrierOffset)))
        return std::vector<uint8_t>(file.begin(), file.end());
    size_t keep = kFuzzAVClipXMLCarrierOffset;
    while (keep > 0 && file[keep - 1] == 0) --keep;
    std::vector<uint8_t> out(file.begin(), file.begin() + ptrdiff_t(keep));
    out.insert(out.end(), file.begin() + ptrdiff_t(kFuzzAVClipXMLCarrierOffset), file.end());
    return out;
}

// An input that is a file followed by the bytes that drive the operations on
// it: [file][operations][operation byte count, 2 bytes little-endian]. A
// count larger than what is there takes everything before it.
struct FuzzFileAndOperations {
    std::span<const uint8_t> file, operations;
};

inline FuzzFileAndOperations fuzzSplitOperations(std::span<const uint8_t> input) {
    if (input.size() < 2) return {input, {}};
    const size_t body = input.size() - 2;
    const size_t count = std::min<size_t>(body, size_t(input[body]) | size_t(input[body + 1]) << 8);
    return {input.first(body - count), input.subspan(body - count, count)};
}

inline std::vector<uint8_t> fuzzJoinOperations(std::span<const uint8_t> file, std::span<const uint8_t> operations) {
    std::vector<uint8_t> out(file.begin(), file.end());
    const size_t count = std::min<size_t>(operations.size(), 0xffff);
    out.insert(out.end(), operations.begin(), operations.begin() + ptrdiff_t(count));
    out.push_back(uint8_t(count));
    out.push_back(uint8_t(count >> 8));
    return out;
}

// An input made of several files one after another, each ended by this mark
// (the last one by the input's end).
inline constexpr std::string_view kFuzzPartMark = "\n--SKARN-FUZZ-PART--\n";

inline std::vector<std::span<const uint8_t>> fuzzSplitParts(std::span<const uint8_t> input, size_t maxParts) {
    std::vector<std::span<const uint8_t>> parts;
    while (parts.size() + 1 < maxParts) {
        const auto at = std::search(input.begin(), input.end(), kFuzzPartMark.begin(), kFuzzPartMark.end());
        if (at == input.end()) break;
        const size_t n = size_t(at - input.begin());
        parts.push_back(input.first(n));
        input = input.subspan(n + kFuzzPartMark.size());
    }
    parts.push_back(input);
    return parts;
}

inline std::vector<uint8_t> fuzzJoinParts(const std::vector<std::vector<uint8_t>>& parts) {
    std::vector<uint8_t> out;
    for (size_t i = 0; i < parts.size(); ++i) {
        if (i) out.insert(out.end(), kFuzzPartMark.begin(), kFuzzPartMark.end());
        out.insert(out.end(), parts[i].begin(), parts[i].end());
    }
    return out;
}
