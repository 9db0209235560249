// The in-place start-code conversion against a byte-by-byte rendering of the
// same rules: any difference, or any stray access, is a finding.
#include "H264Reference.h"
#include "SkarnH264.h"

#include <cstdlib>
#include <cstring>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    std::vector<uint8_t> actual(data, data + size), expected(data, data + size);
    const uint8_t* ap[8] = {};
    const uint8_t* ep[8] = {};
    uint64_t as[8] = {}, es[8] = {};
    uint32_t ac = 0, ec = 0;
    SkarnH264ReplaceStartCodesWithLengthCodes(actual.data(), int64_t(actual.size()), ap, as, &ac);
    referenceReplaceStartCodes(expected, ep, es, &ec);
    if (actual != expected || ac != ec) std::abort();
    for (int i = 0; i < 8; ++i) {
        if ((ap[i] ? ap[i] - actual.data() : -1) != (ep[i] ? ep[i] - expected.data() : -1)) std::abort();
        if (as[i] != es[i]) std::abort();
    }
    return 0;
}
