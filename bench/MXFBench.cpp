// mxfDataObject on a one-hour self-contained clip (1080/29.97, 12-frame GOP,
// four audio channels, written sparse): opening, first and warm lookups, and a
// walk over every frame in presentation order, against ffprobe listing the
// same file's packets in the same run.
//
//   MXFBench [benchmark flags]      runs the benchmarks
//   MXFBench --walk FILE            one whole-process walk (used by BM_WalkProcess)
#include "AVClipWriter.h"
#include "mxfDataObject.h"

#include <benchmark/benchmark.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>
#include <unistd.h>
#include <vector>

namespace {

std::string gSelf;
std::vector<std::string> gWritten;  // removed when the run ends

struct Clip {
    std::string path;
    uint64_t frames = 0;
    AVClipLayout layout;
};

Clip writeClip(const std::string& name, uint64_t frames) {
    const char* tmp = std::getenv("TMPDIR");
    Clip c;
    c.path = std::string(tmp && *tmp ? tmp : "/tmp") + "/skarn-mxfbench-" + std::to_string(::getpid()) + "-" + name;
    c.frames = frames;
    AVClipSpec params;
    params.coding = AVClipSpec::Coding::AVCLongGOP;
    params.frames = frames;
    params.audioChannels = 4;
    params.frameBytes = 60000;  // I pictures; P half, B a quarter (sparse: costs no disk)
    params.sparse = true;
    params.clipXML = "<SkarnClip/>";
    std::string error;
    gWritten.push_back(c.path);
    if (!writeAVClip(c.path, params, &error, &c.layout)) {
        std::fprintf(stderr, "MXFBench: %s\n", error.c_str());
        std::exit(1);
    }
    return c;
}

const Clip& hourClip() {
    static const Clip clip = writeClip("hour.mxf", 107892);  // 60 minutes at 29.97 (drop-frame count)
    return clip;
}

const Clip& minuteClip() {
    static const Clip clip = writeClip("minute.mxf", 1798);
    return clip;
}

void openBench(benchmark::State& state, const Clip& clip) {
    mxfDataObject::ReadStatistics stats;
    for (auto _ : state) {
        Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(clip.path);
        stats = mxf->readStatistics();
        benchmark::DoNotOptimize(mxf.get());
    }
    state.counters["reads"] = double(stats.calls);
    state.counters["readBytes"] = double(stats.bytes);
    state.counters["frames"] = double(clip.frames);
}

// Baseline: the same open on a one-minute clip; the hour should cost the same
// reads and little more time (its RIP is 60 times longer).
void BM_OpenMinuteClip(benchmark::State& state) { openBench(state, minuteClip()); }
void BM_OpenHourClip(benchmark::State& state) { openBench(state, hourClip()); }

// A lookup in a chunk none of whose neighbours has been read: reads of the
// chunk and of its two neighbours.
void BM_FirstLookupInUnscannedChunk(benchmark::State& state) {
    const Clip& clip = hourClip();
    uint64_t reads = 0, lookups = 0;
    int64_t pts = 30 * 1000 + 7;
    for (auto _ : state) {
        state.PauseTiming();
        Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(clip.path);
        mxf->getVideoOffsetForPTS(0);  // the first chunk fixes the frames per chunk
        const uint64_t before = mxf->readStatistics().calls;
        state.ResumeTiming();
        benchmark::DoNotOptimize(mxf->getVideoOffsetForPTS(pts));
        state.PauseTiming();
        reads += mxf->readStatistics().calls - before;
        ++lookups;
        pts = (pts + 30 * 97) % int64_t(clip.frames);
        state.ResumeTiming();
    }
    state.counters["readsPerLookup"] = double(reads) / double(lookups);
}

void BM_WarmPTSLookup(benchmark::State& state) {
    Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(hourClip().path);
    const int64_t base = 30 * 2000;
    for (int64_t p = base - 40; p < base + 70; ++p) mxf->getVideoOffsetForPTS(p);
    int64_t i = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(mxf->getVideoOffsetForPTS(base + i));
        i = (i + 7) % 30;
    }
}

void BM_WarmDTSLookup(benchmark::State& state) {
    Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(hourClip().path);
    const int64_t base = 30 * 2000;
    mxf->getVideoOffsetForDTS(base);
    int64_t i = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(mxf->getVideoOffsetForDTS(base + i));
        i = (i + 7) % 30;
    }
}

// Every frame of the hour in presentation order, from a fresh open.
uint64_t walk(const std::string& path) {
    Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(path);
    uint32_t frames = 0;
    mxf->getVideoFrameCount(&frames);
    uint64_t sum = 0;
    for (int64_t p = 0; p < int64_t(frames); ++p) {
        Ref<mxfEssenseOffsets> r = mxf->getVideoOffsetForPTS(p);
        if (!r) {
            std::fprintf(stderr, "MXFBench: no frame at %lld\n", (long long)p);
            std::exit(1);
        }
        sum += uint64_t(r->offset());
    }
    return sum;
}

void BM_WalkAllFramesInPresentationOrder(benchmark::State& state) {
    for (auto _ : state) benchmark::DoNotOptimize(walk(hourClip().path));
    state.counters["frames"] = double(hourClip().frames);
}

double runProcess(const std::string& command) {
    auto start = std::chrono::steady_clock::now();
    int status = std::system(command.c_str());
    double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    if (status != 0) std::fprintf(stderr, "MXFBench: \"%s\" failed (%d)\n", command.c_str(), status);
    return seconds;
}

// Whole processes on the same file: our walk, and ffprobe listing every video
// packet (its time is the ratio's baseline).
void BM_WalkProcess(benchmark::State& state) {
    const std::string command = "'" + gSelf + "' --walk '" + hourClip().path + "' > /dev/null";
    for (auto _ : state) state.SetIterationTime(runProcess(command));
}

void BM_FFprobeShowPackets(benchmark::State& state) {
    if (std::system("command -v ffprobe > /dev/null 2>&1") != 0) {
        state.SkipWithError("ffprobe is not on PATH");
        return;
    }
    const std::string command =
        "ffprobe -v fatal -select_streams v:0 -show_packets -of compact '" + hourClip().path + "' > /dev/null";
    for (auto _ : state) state.SetIterationTime(runProcess(command));
}

}  // namespace

BENCHMARK(BM_OpenMinuteClip)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_OpenHourClip)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_FirstLookupInUnscannedChunk)->Unit(benchmark::kMicrosecond)->Iterations(200);
BENCHMARK(BM_WarmPTSLookup);
BENCHMARK(BM_WarmDTSLookup);
BENCHMARK(BM_WalkAllFramesInPresentationOrder)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_WalkProcess)->Unit(benchmark::kMillisecond)->UseManualTime()->Iterations(3);
BENCHMARK(BM_FFprobeShowPackets)->Unit(benchmark::kMillisecond)->UseManualTime()->Iterations(1);

int main(int argc, char** argv) {
    gSelf = std::filesystem::canonical("/proc/self/exe").string();
    if (argc == 3 && std::strcmp(argv[1], "--walk") == 0) {
        std::printf("%llu\n", (unsigned long long)walk(argv[2]));
        return 0;
    }
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    for (const auto& path : gWritten) std::filesystem::remove(path);
    return 0;
}
