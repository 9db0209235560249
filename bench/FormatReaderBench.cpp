// The format reader on a one-hour self-contained clip (long GOP, 1080/29.97,
// four audio channels, written sparse) against a one-minute one: building the
// reader, and walking every video sample in decode order through sample
// cursors (placement, step, location, dependency flags) against the same
// lookups made directly on the clip's mxfDataObject. The ratios are printed at
// the end of the run, from the times measured in it.
#include "AVClipWriter.h"
#include "CardWriter.h"
#include "SkarnClip.h"
#include "SkarnFormatReader.h"
#include "SkarnSampleCursor.h"
#include "mxfDataObject.h"

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <map>
#include <string>
#include <unistd.h>

namespace {

std::string gRoot;

struct Clip {
    Ref<SkarnClip> clip;
    uint64_t frames = 0;
};

Clip writeClip(const std::string& name, uint64_t frames) {
    std::string folder = gRoot + "/CONTENTS/AVCLIP";
    std::filesystem::create_directories(folder);
    for (const char* f : {"CLIP", "VIDEO", "AUDIO"}) std::filesystem::create_directories(gRoot + "/CONTENTS/" + f);
    ClipSpec clip = defaultClip(*cardFamilyNamed("avclip-intra"), 1);
    clip.name = name;
    clip.frames = frames;
    clip.audioChannels = 4;
    AVClipSpec params;
    params.coding = AVClipSpec::Coding::AVCLongGOP;
    params.frames = frames;
    params.audioChannels = 4;
    params.frameBytes = 60000;  // I pictures; P half, B a quarter (sparse: costs no disk)
    params.sparse = true;
    params.clipXML = avclipHeaderXMLText(clip);
    std::string error;
    std::string path = folder + "/" + name + ".MXF";
    if (!writeAVClip(path, params, &error)) {
        std::fprintf(stderr, "FormatReaderBench: %s\n", error.c_str());
        std::exit(1);
    }
    Clip c;
    c.clip = SkarnClip::initWithSkarnClip(path);
    c.frames = frames;
    if (!c.clip) {
        std::fprintf(stderr, "FormatReaderBench: %s is no clip\n", path.c_str());
        std::exit(1);
    }
    return c;
}

const Clip& hourClip() {
    static const Clip clip = writeClip("HOUR", 107892);  // 60 minutes at 29.97 (drop-frame count)
    return clip;
}

const Clip& minuteClip() {
    static const Clip clip = writeClip("MINUTE", 1798);
    return clip;
}

void buildBench(benchmark::State& state, const Clip& clip) {
    for (auto _ : state) {
        Ref<SkarnFormatReader> reader = SkarnFormatReader::formatReaderWithClip(clip.clip.get(), false, false);
        benchmark::DoNotOptimize(reader.get());
    }
    state.counters["frames"] = double(clip.frames);
}

void BM_BuildReaderMinute(benchmark::State& state) { buildBench(state, minuteClip()); }
void BM_BuildReaderHour(benchmark::State& state) { buildBench(state, hourClip()); }

// Each walk gets a reader (and so an MXF object) of its own, built outside the
// timing, and walks it twice: the first pass pays the index scans, which both
// walks share, the second only the lookups.
uint64_t cursorWalk(SkarnTrackReader* video) {
    uint64_t sum = 0;
    Ref<VestaKilnSampleCursorProtocol> cursor = video->cursorAtFirstSampleInDecodeOrder();
    do {
        int64_t count = 0, offset = 0, length = 0;
        cursor->sampleLocationWithArraySizes(1, &count, &offset, &length, nullptr);
        bool fullSync = false, partialSync = false, droppable = false;
        double threshold = 0;
        cursor->dependencyInfoWithFullSync(&fullSync, &partialSync, &threshold, &droppable);
        sum += uint64_t(offset) + uint64_t(length) + (fullSync ? 1 : 0) + (droppable ? 2 : 0);
    } while (cursor->stepInDecodeOrder(1) == 0);
    return sum;
}

uint64_t directWalk(mxfDataObject* mxf, uint32_t frames) {
    // What a cursor has to find out per sample: the record at the next decode
    // index, and the record presented at that sample's time (its bytes and flags).
    uint64_t sum = 0;
    for (uint32_t dts = 0; dts < frames; ++dts) {
        Ref<mxfEssenseOffsets> byDecode = mxf->getVideoOffsetForDTS(dts);
        Ref<mxfEssenseOffsets> shown = mxf->getVideoOffsetForPTS(byDecode->presentationOrder());
        uint32_t flags = shown->mediaSampleFlags();
        sum += uint64_t(shown->offset()) + shown->size() + ((flags & 1) == 0 ? 1 : 0) + ((flags >> 27) & 1 ? 2 : 0);
    }
    return sum;
}

Ref<SkarnFormatReader> freshReader() {
    return SkarnFormatReader::formatReaderWithClip(hourClip().clip.get(), false, false);
}

// Cold: a fresh reader (and MXF object) each time, so the walk pays the index
// scans, which both ways share. Warm: the tables are read beforehand, and the
// walk pays the lookups alone.
template <bool Warm, bool ThroughCursors>
void walkBench(benchmark::State& state) {
    uint64_t reads = 0;
    for (auto _ : state) {
        state.PauseTiming();
        Ref<SkarnFormatReader> reader = freshReader();
        SkarnTrackReader* video = reader->trackList().front().get();
        mxfDataObject* mxf = video->mxfDataAccess();
        uint32_t frames = 0;
        mxf->getVideoFrameCount(&frames);
        if (Warm) benchmark::DoNotOptimize(directWalk(mxf, frames));
        uint64_t before = mxf->readStatistics().calls;
        state.ResumeTiming();
        benchmark::DoNotOptimize(ThroughCursors ? cursorWalk(video) : directWalk(mxf, frames));
        state.PauseTiming();
        reads = mxf->readStatistics().calls - before;
        state.ResumeTiming();
    }
    state.counters["samples"] = double(hourClip().frames);
    state.counters["reads"] = double(reads);
}

void BM_ColdWalkThroughCursors(benchmark::State& state) { walkBench<false, true>(state); }
void BM_ColdWalkDirectly(benchmark::State& state) { walkBench<false, false>(state); }
void BM_WarmWalkThroughCursors(benchmark::State& state) { walkBench<true, true>(state); }
void BM_WarmWalkDirectly(benchmark::State& state) { walkBench<true, false>(state); }

// Keeps every run's real time per iteration, in nanoseconds, by name.
class RecordingReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run>& runs) override {
        for (const Run& run : runs)
            if (run.run_type == Run::RT_Iteration && run.iterations > 0)
            {
                times[run.benchmark_name()] = run.GetAdjustedRealTime() * multiplier(run.time_unit);
                cpuTimes[run.benchmark_name()] = run.GetAdjustedCPUTime() * multiplier(run.time_unit);
            }
        ConsoleReporter::ReportRuns(runs);
    }
    static double multiplier(benchmark::TimeUnit unit) {
        switch (unit) {
        case benchmark::kSecond: return 1e9;
        case benchmark::kMillisecond: return 1e6;
        case benchmark::kMicrosecond: return 1e3;
        default: return 1;
        }
    }
    std::map<std::string, double> times, cpuTimes;
};

}  // namespace

BENCHMARK(BM_BuildReaderMinute)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_BuildReaderHour)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_ColdWalkThroughCursors)->Unit(benchmark::kMillisecond)->Iterations(5);
BENCHMARK(BM_ColdWalkDirectly)->Unit(benchmark::kMillisecond)->Iterations(5);
BENCHMARK(BM_WarmWalkThroughCursors)->Unit(benchmark::kMillisecond)->Iterations(5);
BENCHMARK(BM_WarmWalkDirectly)->Unit(benchmark::kMillisecond)->Iterations(5);

int main(int argc, char** argv) {
    const char* tmp = std::getenv("TMPDIR");
    gRoot = std::string(tmp && *tmp ? tmp : "/tmp") + "/skarn-frbench-" + std::to_string(::getpid());
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
    // Written (and flushed) before anything is timed, so that no walk runs
    // while the kernel writes the hour back.
    (void)minuteClip();
    (void)hourClip();
    ::sync();
    // One untimed walk brings the index partitions into the page cache: the
    // first reader of a freshly written file pays for that, whichever it is.
    {
        Ref<SkarnFormatReader> reader = freshReader();
        mxfDataObject* mxf = reader->trackList().front()->mxfDataAccess();
        uint32_t frames = 0;
        mxf->getVideoFrameCount(&frames);
        benchmark::DoNotOptimize(directWalk(mxf, frames));
    }
    RecordingReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();
    auto& t = reporter.times;
    if (t.count("BM_BuildReaderHour") && t.count("BM_BuildReaderMinute"))
        std::printf("build: hour %.1f us, minute %.1f us, hour/minute %.2f (CPU time %.2f; goal: under 1 ms, flat in length)\n",
                    t["BM_BuildReaderHour"] / 1e3, t["BM_BuildReaderMinute"] / 1e3,
                    t["BM_BuildReaderHour"] / t["BM_BuildReaderMinute"],
                    reporter.cpuTimes["BM_BuildReaderHour"] / reporter.cpuTimes["BM_BuildReaderMinute"]);
    for (const char* kind : {"Cold", "Warm"}) {
        std::string cursors = std::string("BM_") + kind + "WalkThroughCursors/iterations:5";
        std::string direct = std::string("BM_") + kind + "WalkDirectly/iterations:5";
        if (t.count(cursors) && t.count(direct))
            std::printf("%s walk: cursors %.1f ms, direct %.1f ms, cursors/direct %.2f (CPU time %.2f; goal: at most 1.5)\n",
                        kind, t[cursors] / 1e6, t[direct] / 1e6, t[cursors] / t[direct],
                        reporter.cpuTimes[cursors] / reporter.cpuTimes[direct]);
    }
    std::filesystem::remove_all(gRoot);
    return 0;
}
