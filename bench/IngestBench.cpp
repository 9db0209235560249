// Pulling a whole clip through the ingest object, against reading the same
// bytes with pread in the same run. The clip is a clip-XML DVCPRO HD 1080i60
// recording of 1200 frames (about 580 MB of video) with four audio channels,
// written by the card writer with every byte present (not sparse), and read
// once before timing so the page cache is warm for both.
//
// The host side disposes of every frame and block as soon as it comes, as a
// host that copies out would; nothing is written anywhere.
//
// BM_IngestOverPread is the figure to quote: each iteration runs one pread
// pass and one ingest pass back to back and reports ingest throughput as a
// fraction of pread throughput (counter "ratio"; the goal is at least 0.9).
#include "CardWriter.h"
#include "FileSystem.h"
#include "SkarnBufferManager.h"
#include "SkarnClip.h"
#include "SkarnIngestObject.h"
#include "VestaKilnMediaRecords.h"

#include <benchmark/benchmark.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <string>
#include <unistd.h>
#include <vector>

namespace {

constexpr uint64_t kFrames = 1200;
constexpr uint32_t kChannels = 4;

struct Range {
    std::string path;
    uint64_t offset, length;
};

struct BenchClip {
    std::string root;
    std::string xml;
    std::vector<Range> essence;  // the video essence and each channel's
    uint64_t bytes = 0;
    uint64_t frameBytes = 0;
    // Made once, before the cache is warmed: making a clip reads its first
    // frame with caching disabled, which on Linux drops the whole video
    // file from the page cache.
    Ref<SkarnClip> clip;

    BenchClip() {
        char tmpl[] = "/tmp/skarn-ingestbench-XXXXXX";
        root = ::mkdtemp(tmpl);
        CardSpec card;
        card.root = root + "/VOL";
        ClipSpec c = defaultClip(*cardFamilyNamed("dvcprohd-1080i60"), 1);
        c.frames = kFrames;
        c.audioChannels = kChannels;
        card.clips = {c};
        std::vector<WrittenClip> written;
        std::string error;
        if (!writeCard(card, &written, &error)) {
            std::fprintf(stderr, "card: %s\n", error.c_str());
            std::exit(1);
        }
        xml = written.front().clipPath;
        clip = SkarnClip::initWithSkarnClip(xml);
        frameBytes = uint64_t(clip->videoDataSize()) / kFrames;
        essence.push_back({*clip->videoFilePath(), uint64_t(clip->startByteOffset()), uint64_t(clip->videoDataSize())});
        auto paths = *clip->audioFilePaths();
        for (size_t ch = 0; ch < paths.size(); ++ch) {
            std::string base = "ClipContent/EssenceList/Audio[" + std::to_string(ch + 1) + "]/AudioIndex/";
            essence.push_back({paths[ch], std::stoull(*clip->stringFromClipDescriptionForXPath(base + "StartByteOffset")),
                               std::stoull(*clip->stringFromClipDescriptionForXPath(base + "DataSize"))});
        }
        for (const auto& r : essence) bytes += r.length;
    }
    ~BenchClip() { FileSystem::removeItem(root); }
};

BenchClip& benchClip() {
    static BenchClip clip;
    return clip;
}

// The same bytes, frame by frame for video and in 2 MiB blocks for sound,
// into one reused buffer.
uint64_t preadPass(const BenchClip& c) {
    static std::vector<uint8_t> buffer(4 << 20);
    uint64_t total = 0;
    for (size_t i = 0; i < c.essence.size(); ++i) {
        const Range& r = c.essence[i];
        int fd = ::open(r.path.c_str(), O_RDONLY | O_CLOEXEC);
        uint64_t step = i == 0 ? c.frameBytes : 2097152;
        for (uint64_t at = 0; at < r.length; at += step) {
            uint64_t n = std::min(step, r.length - at);
            ssize_t got = ::pread(fd, buffer.data(), n, off_t(r.offset + at));
            if (got > 0) total += uint64_t(got);
        }
        ::close(fd);
    }
    benchmark::DoNotOptimize(buffer.data());
    return total;
}

uint64_t ingestPass(const BenchClip& c) {
    Ref<SkarnIngestObject> ingest = SkarnIngestObject::initWithClip(c.clip.get());
    ingest->initialize(nullptr);
    ingest->start(nullptr);
    uint64_t total = 0;
    for (uint64_t calls = 0; calls < 4 * kFrames; ++calls) {
        VestaKilnPlugInMediaSpecifier_Deprecated record{};
        int32_t status = ingest->getNextMedia_Deprecated(&record, nullptr);
        if (record.videoData) {
            total += record.videoDataSize;
            record.videoBufferManager->disposeVideoMedia(record.videoData, record.videoDataSize, nullptr);
        }
        if (AudioBufferList* list = record.audioBufferList) {
            std::vector<AudioBuffer> buffers(list->mBuffers, list->mBuffers + list->mNumberBuffers);
            for (const AudioBuffer& b : buffers) {
                total += b.mDataByteSize;
                if (b.mData)
                    record.audioBufferManager->disposeAudioMedia(static_cast<uint8_t*>(b.mData), b.mDataByteSize,
                                                                 nullptr);
            }
        }
        if (record.endOfMedia || status != 0) break;
    }
    ingest->stop(nullptr);
    ingest->cleanup(nullptr);
    ingest->teardown(nullptr);
    return total;
}

void warm(const BenchClip& c) {
    static bool warmed = false;
    if (warmed) return;
    preadPass(c);
    preadPass(c);
    warmed = true;
}

void BM_Pread(benchmark::State& state) {
    const BenchClip& c = benchClip();
    warm(c);
    for (auto _ : state) {
        uint64_t got = preadPass(c);
        if (got != c.bytes) state.SkipWithError("short read");
    }
    state.SetBytesProcessed(int64_t(state.iterations() * c.bytes));
}
BENCHMARK(BM_Pread)->Unit(benchmark::kMillisecond)->UseRealTime();

void BM_Ingest(benchmark::State& state) {
    const BenchClip& c = benchClip();
    warm(c);
    for (auto _ : state) {
        uint64_t got = ingestPass(c);
        if (got != c.bytes) state.SkipWithError("ingest delivered the wrong number of bytes");
    }
    state.SetBytesProcessed(int64_t(state.iterations() * c.bytes));
}
BENCHMARK(BM_Ingest)->Unit(benchmark::kMillisecond)->UseRealTime();

// Both passes back to back in each iteration, so they meet the same cache
// state and the same load from whatever else runs on the machine.
void BM_IngestOverPread(benchmark::State& state) {
    const BenchClip& c = benchClip();
    warm(c);
    double preadSeconds = 0, ingestSeconds = 0;
    for (auto _ : state) {
        auto t0 = std::chrono::steady_clock::now();
        preadPass(c);
        auto t1 = std::chrono::steady_clock::now();
        uint64_t got = ingestPass(c);
        auto t2 = std::chrono::steady_clock::now();
        if (got != c.bytes) state.SkipWithError("ingest delivered the wrong number of bytes");
        preadSeconds += std::chrono::duration<double>(t1 - t0).count();
        ingestSeconds += std::chrono::duration<double>(t2 - t1).count();
    }
    double n = double(state.iterations());
    state.counters["pread_MBps"] = double(c.bytes) * n / preadSeconds / 1e6;
    state.counters["ingest_MBps"] = double(c.bytes) * n / ingestSeconds / 1e6;
    state.counters["ratio"] = preadSeconds / ingestSeconds;
}
BENCHMARK(BM_IngestOverPread)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(5);

}  // namespace

BENCHMARK_MAIN();
