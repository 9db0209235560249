// Scoped captures for tests: the diagnostic log lines and the assertion
// reports the code under test makes while a capture lives.
#pragma once

#include "AssertionHandler.h"
#include "LogSink.h"

#include <algorithm>
#include <mutex>
#include <string>
#include <vector>

// Collects every diagnostic line written while it lives.
class LogCapture {
public:
    LogCapture() {
        _previous = setLogSink([this](const std::string& line) {
            std::lock_guard<std::mutex> lock(_lock);
            _lines.push_back(line);
        });
    }
    ~LogCapture() { setLogSink(_previous); }
    std::vector<std::string> lines() const {
        std::lock_guard<std::mutex> lock(_lock);
        return _lines;
    }
    bool has(const std::string& text) const {
        for (const auto& l : lines())
            if (l.find(text) != std::string::npos) return true;
        return false;
    }
    // Index of the first line holding text at or after `from`, or -1.
    long find(const std::string& text, long from = 0) const {
        auto all = lines();
        for (size_t i = size_t(std::max(from, 0L)); i < all.size(); ++i)
            if (all[i].find(text) != std::string::npos) return long(i);
        return -1;
    }

private:
    mutable std::mutex _lock;
    std::vector<std::string> _lines;
    LogSinkFunction _previous;
};

// Hard assertions throw HardAssertionFailure, soft ones are recorded.
struct AssertionCapture {
    AssertionCapture() : scoped(&recorder) { previous = setHardAssertionFailureHandler(throwingHardAssertionFailureHandler); }
    ~AssertionCapture() { setHardAssertionFailureHandler(previous); }
    bool reported(const std::string& description) const {
        for (const auto& f : recorder.failures)
            if (f.description == description) return true;
        return false;
    }
    RecordingAssertionHandler recorder;
    ScopedAssertionHandler scoped;
    HardAssertionFailureHandler previous;
};
