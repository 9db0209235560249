// The progress line on a terminal: frames done, megabytes a second and the
// time left, redrawn a few times a second on stderr.
#pragma once

#include <chrono>
#include <cstdint>
#include <string>

class Progress {
public:
    // Draws nothing unless enabled (stderr is a terminal).
    explicit Progress(bool enabled) : _enabled(enabled) {}
    void begin(const std::string& label);
    void update(int64_t done, int64_t total, uint64_t bytes);
    // Clears the line, so that what follows starts clean.
    void end();

private:
    bool _enabled;
    bool _drawn = false;
    std::string _label;
    std::chrono::steady_clock::time_point _began, _lastDrawn;
};
