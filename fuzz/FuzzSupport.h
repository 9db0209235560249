// What the harnesses share: hard assertions that throw so a harness can catch
// them, and for a harness that needs its input on disk (clip XML beside a
// card's other files), a per-process scratch path and the input written to it.
#pragma once

#include "AssertionHandler.h"

#include <cstdio>
#include <cstdlib>
#include <string>
#include <unistd.h>

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
