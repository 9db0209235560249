#include "SkarnH264.h"

#include "ByteReader.h"

#include <cstring>

int32_t SkarnH264ReplaceStartCodesWithLengthCodes(uint8_t* data, int64_t length,
                                                  std::span<const uint8_t*, kSkarnH264MaxParameterSets> parameterSets,
                                                  std::span<uint64_t, kSkarnH264MaxParameterSets> parameterSetSizes,
                                                  uint32_t* parameterSetCount) {
    if (!data || length < 4) return 0;
    if (length == 4) {
        storeBE32(data, 0);
        return 0;
    }
    uint32_t count = parameterSetCount ? *parameterSetCount : 0;
    int64_t previous = 0;  // where the unit being measured began
    bool pending = false;  // that unit is a noted parameter set awaiting its size

    // A start code begins at i with 0 <= i <= L - 5, so its 0x01 lies at
    // j = i + 3 in [3, L - 2]. Searching for the 0x01 with memchr and then
    // checking the three zeros before it is the fast way through slice data,
    // where 0x01 is rare and long zero runs are broken by emulation prevention.
    const uint8_t* const end = data + (length - 1);  // one past the last possible 0x01
    const uint8_t* p = data + 3;
    while (p < end) {
        const uint8_t* one = static_cast<const uint8_t*>(std::memchr(p, 0x01, size_t(end - p)));
        if (!one) break;
        p = one + 1;
        if (one[-1] != 0 || one[-2] != 0 || one[-3] != 0) continue;
        const int64_t i = (one - 3) - data;
        if (i != 0) {
            const int64_t unitLength = i - previous - 4;
            if (pending) {
                parameterSetSizes[count] = uint32_t(unitLength);
                ++count;
            }
            storeBE32(data + previous, uint32_t(unitLength));
            pending = false;
        }
        const uint8_t nalType = data[i + 4] & 0x1F;
        if ((nalType == 7 || nalType == 8) && count < kSkarnH264MaxParameterSets) {
            parameterSets[count] = data + i + 4;
            pending = true;
        }
        previous = i;
        // The next start code cannot begin before i + 4: its 0x01 is at i + 7 or later.
        p = one + 4 < end ? one + 4 : end;
    }
    storeBE32(data + previous, uint32_t(length - 4 - previous));
    if (parameterSetCount) *parameterSetCount = count;
    return 0;
}
