// Timecode text: parsing and formatting, against a plain sscanf/snprintf
// baseline of the same text measured in the same run.
#include "SkarnVestaTimecode.h"
#include "Timecode.h"

#include <benchmark/benchmark.h>

#include <cstdio>
#include <string>
#include <vector>

namespace {

std::vector<std::string> dropLabels() {
    std::vector<std::string> labels;
    for (int m = 0; m < 60; ++m) {
        char buf[16];
        std::snprintf(buf, sizeof buf, "%02d:%02d:%02d;%02d", m % 24, m, (m * 7) % 60, m % 10 == 0 ? 0 : 2 + m % 28);
        labels.push_back(buf);
    }
    return labels;
}

void BM_Baseline_ScanAndPrint(benchmark::State& state) {
    const auto labels = dropLabels();
    size_t i = 0;
    char out[32];
    for (auto _ : state) {
        int h = 0, m = 0, s = 0, f = 0;
        std::sscanf(labels[i++ % labels.size()].c_str(), "%d:%d:%d;%d", &h, &m, &s, &f);
        std::snprintf(out, sizeof out, "%02d:%02d:%02d;%02d", h, m, s, f);
        benchmark::DoNotOptimize(out);
    }
}
BENCHMARK(BM_Baseline_ScanAndPrint);

void BM_StringToFramecount_Drop(benchmark::State& state) {
    const auto labels = dropLabels();
    size_t i = 0;
    for (auto _ : state) {
        long count = 0;
        Tolvo::TimecodeFormat format = Tolvo::kTimecodeFormatNonDrop;
        Tolvo::Timecode::stringToFramecount(labels[i++ % labels.size()].c_str(), count, 30.0, format, nullptr);
        benchmark::DoNotOptimize(count);
    }
}
BENCHMARK(BM_StringToFramecount_Drop);

void BM_CreateWithString_NonDrop(benchmark::State& state) {
    for (auto _ : state) {
        auto tc = Tolvo::Timecode::TimecodeCreateWithString("10:59:59:24", Tolvo::kTimecodeFormatNonDrop, 25.0, 0.0,
                                                            nullptr);
        benchmark::DoNotOptimize(tc.get());
    }
}
BENCHMARK(BM_CreateWithString_NonDrop);

void BM_ToString_Drop(benchmark::State& state) {
    Tolvo::Timecode tc(0, 30.0, 30.0, 0, Tolvo::kTimecodeFormatDrop);
    for (auto _ : state) {
        tc.framecount = (tc.framecount + 1799) % 2589408;
        auto text = tc.toCFString(Tolvo::kInterpStyleFloor);
        benchmark::DoNotOptimize(text);
    }
}
BENCHMARK(BM_ToString_Drop);

void BM_ToString_Interpolated(benchmark::State& state) {
    Tolvo::Timecode tc(0, 24.0, 60.0, 0, Tolvo::kTimecodeFormatNonDrop);
    tc.setUseInterpRate(true);
    for (auto _ : state) {
        tc.iOffset = (tc.iOffset + 7) % 100000;
        auto text = tc.toCFString(Tolvo::kInterpStyleWholeDown);
        benchmark::DoNotOptimize(text);
    }
}
BENCHMARK(BM_ToString_Interpolated);

// The clip's path: a start timecode object from XML text, shown back.
void BM_TimecodeObject_RoundTrip(benchmark::State& state) {
    const auto labels = dropLabels();
    size_t i = 0;
    for (auto _ : state) {
        auto tc = SkarnVestaTimecode::timecodeWithString(labels[i++ % labels.size()], 30.0, 30.0, 1);
        auto text = tc->stringValue();
        benchmark::DoNotOptimize(text);
    }
}
BENCHMARK(BM_TimecodeObject_RoundTrip);

}  // namespace

BENCHMARK_MAIN();
