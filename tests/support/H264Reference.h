// The start-code conversion written byte by byte, as first written: the slow,
// obvious rendering of the rules that the fast scan in the plug-in is held to
// by the essence tests and the H.264 fuzz harness.
#pragma once

#include <cstdint>
#include <vector>

inline void referenceReplaceStartCodes(std::vector<uint8_t>& b, const uint8_t** pointers, uint64_t* sizes, uint32_t* count) {
    const int64_t L = int64_t(b.size());
    if (L < 4) return;
    auto put = [&](int64_t at, uint32_t v) {
        b[at] = uint8_t(v >> 24); b[at + 1] = uint8_t(v >> 16); b[at + 2] = uint8_t(v >> 8); b[at + 3] = uint8_t(v);
    };
    if (L == 4) {
        put(0, 0);
        return;
    }
    int64_t P = 0;
    bool pending = false;
    for (int64_t i = 0; i <= L - 5; ++i) {
        if (b[i] || b[i + 1] || b[i + 2] || b[i + 3] != 1) continue;
        if (i != 0) {
            if (pending) sizes[(*count)++] = uint32_t(i - P - 4);
            put(P, uint32_t(i - P - 4));
            pending = false;
        }
        const uint8_t type = b[i + 4] & 0x1F;
        if ((type == 7 || type == 8) && *count < 8) {
            pointers[*count] = b.data() + i + 4;
            pending = true;
        }
        P = i;
    }
    put(P, uint32_t(L - 4 - P));
}
