// The in-place start-code conversion against a byte-by-byte rendering of the
// same rules: any difference, or any stray access, is a finding.
#include "SkarnH264.h"

#include <cstdlib>
#include <cstring>
#include <vector>

namespace {

void reference(std::vector<uint8_t>& b, const uint8_t** pointers, uint64_t* sizes, uint32_t* count) {
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

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    std::vector<uint8_t> actual(data, data + size), expected(data, data + size);
    const uint8_t* ap[8] = {};
    const uint8_t* ep[8] = {};
    uint64_t as[8] = {}, es[8] = {};
    uint32_t ac = 0, ec = 0;
    SkarnH264ReplaceStartCodesWithLengthCodes(actual.data(), int64_t(actual.size()), ap, as, &ac);
    reference(expected, ep, es, &ec);
    if (actual != expected || ac != ec) std::abort();
    for (int i = 0; i < 8; ++i) {
        if ((ap[i] ? ap[i] - actual.data() : -1) != (ep[i] ? ep[i] - expected.data() : -1)) std::abort();
        if (as[i] != es[i]) std::abort();
    }
    return 0;
}
