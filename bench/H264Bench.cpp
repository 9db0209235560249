// Start codes to length prefixes on an AVC-Intra-sized access unit, against a
// plain memcpy of the same bytes in the same run.
#include "SkarnH264.h"

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <random>
#include <string>
#include <unistd.h>
#include <vector>

namespace {

// One 1080-line AVC-Intra 100 frame made by ffmpeg, or, without it, a synthetic
// access unit of the same shape (parameter sets, SEI, eight large slices with
// emulation prevention applied).
std::vector<uint8_t> makeAccessUnit() {
    char dir[] = "/tmp/skarn-h264bench-XXXXXX";
    if (mkdtemp(dir)) {
        std::string path = std::string(dir) + "/au.264";
        std::string cmd = "ffmpeg -nostdin -v error -y -f lavfi -i testsrc2=size=1920x1080:rate=30000/1001 "
                          "-frames:v 1 -c:v libx264 -avcintra-class 100 -pix_fmt yuv422p10le -f h264 '" +
                          path + "' >/dev/null 2>&1";
        std::vector<uint8_t> au;
        if (std::system(cmd.c_str()) == 0) {
            std::ifstream in(path, std::ios::binary);
            au.assign(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
        }
        std::remove(path.c_str());
        rmdir(dir);
        if (au.size() > 100000) return au;
    }
    std::mt19937 rng(7);
    std::vector<uint8_t> au;
    auto nal = [&](uint8_t header, size_t size) {
        au.insert(au.end(), {0, 0, 0, 1, header});
        int zeros = 0;
        for (size_t i = 0; i < size; ++i) {
            uint8_t b = uint8_t(rng());
            if (zeros >= 2 && b <= 3) {
                au.push_back(3);
                zeros = 0;
            }
            au.push_back(b);
            zeros = b == 0 ? zeros + 1 : 0;
        }
    };
    nal(0x09, 2);
    nal(0x67, 40);
    nal(0x68, 8);
    nal(0x06, 600);
    for (int i = 0; i < 8; ++i) nal(0x65, 60000);
    return au;
}

struct Fixture {
    std::vector<uint8_t> original = makeAccessUnit();
    std::vector<size_t> startCodes;
    Fixture() {
        for (size_t i = 0; i + 4 <= original.size(); ++i)
            if (!original[i] && !original[i + 1] && !original[i + 2] && original[i + 3] == 1) startCodes.push_back(i);
    }
};
const Fixture& fixture() {
    static Fixture f;
    return f;
}

void BM_H264ReplaceStartCodes(benchmark::State& state) {
    const Fixture& f = fixture();
    std::vector<uint8_t> buffer = f.original;
    for (auto _ : state) {
        // Put the start codes back: a few dozen stores, not a copy of the unit.
        for (size_t at : f.startCodes) std::memcpy(buffer.data() + at, "\0\0\0\1", 4);
        const uint8_t* sets[8] = {};
        uint64_t sizes[8] = {};
        uint32_t count = 0;
        SkarnH264ReplaceStartCodesWithLengthCodes(buffer.data(), int64_t(buffer.size()), sets, sizes, &count);
        benchmark::DoNotOptimize(count);
        benchmark::ClobberMemory();
    }
    state.SetBytesProcessed(int64_t(state.iterations()) * int64_t(buffer.size()));
    state.counters["bytes"] = double(buffer.size());
    state.counters["nal_units"] = double(f.startCodes.size());
}

void BM_MemcpyBaseline(benchmark::State& state) {
    const Fixture& f = fixture();
    std::vector<uint8_t> out(f.original.size());
    for (auto _ : state) {
        std::memcpy(out.data(), f.original.data(), f.original.size());
        benchmark::DoNotOptimize(out.data());
        benchmark::ClobberMemory();
    }
    state.SetBytesProcessed(int64_t(state.iterations()) * int64_t(f.original.size()));
}

}  // namespace

BENCHMARK(BM_MemcpyBaseline);
BENCHMARK(BM_H264ReplaceStartCodes);
BENCHMARK_MAIN();
