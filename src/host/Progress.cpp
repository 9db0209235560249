#include "Progress.h"

#include <algorithm>
#include <cstdio>

void Progress::begin(const std::string& label) {
    _label = label;
    _began = std::chrono::steady_clock::now();
    _lastDrawn = {};
}

void Progress::update(int64_t done, int64_t total, uint64_t bytes) {
    if (!_enabled || total <= 0) return;
    const auto now = std::chrono::steady_clock::now();
    if (now - _lastDrawn < std::chrono::milliseconds(100) && done < total) return;
    _lastDrawn = now;
    const double elapsed = std::chrono::duration<double>(now - _began).count();
    const double fraction = double(std::max<int64_t>(0, std::min(done, total))) / double(total);
    constexpr int kWidth = 24;
    const int filled = int(fraction * kWidth);
    char bar[kWidth + 1];
    for (int i = 0; i < kWidth; ++i) bar[i] = i < filled ? '#' : '-';
    bar[kWidth] = 0;
    const double rate = elapsed > 0 ? double(bytes) / 1e6 / elapsed : 0;
    char left[32] = "--:--";
    if (fraction > 0.01 && elapsed > 0.2) {
        const long seconds = long(elapsed * (1 - fraction) / fraction + 0.5);
        std::snprintf(left, sizeof left, "%ld:%02ld", seconds / 60, seconds % 60);
    }
    std::fprintf(stderr, "\r%-12s [%s] %lld/%lld frames  %7.1f MB/s  %s left\x1b[K", _label.c_str(), bar,
                 (long long)done, (long long)total, rate, left);
    std::fflush(stderr);
    _drawn = true;
}

void Progress::end() {
    if (!_drawn) return;
    std::fprintf(stderr, "\r\x1b[K");
    std::fflush(stderr);
    _drawn = false;
}
