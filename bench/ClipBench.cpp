// Constructing every clip of a 220-clip card, against a floor measured in the
// same run: parsing the same clip XML files with pugixml and reading the bytes
// construction reads (the first frame of each DV video file, the first 4 KiB
// of each MXF file). Construction bypasses the page cache for those reads as
// the plug-in must; the floor is measured both ways.
//
// BM_ConstructionOverFloor is the figure to quote: each iteration runs one
// uncached floor pass and one construction pass back to back, so both meet
// the same page-cache state and the same disk load from whatever else runs on
// the machine, and it reports their ratio (wall and CPU) as counters.
#include "CardWriter.h"
#include "FileSystem.h"
#include "SkarnClip.h"

#include <benchmark/benchmark.h>
#include <chrono>
#include <ctime>
#include <thread>
#include <pugixml.hpp>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <map>
#include <memory>
#include <unistd.h>
#include <vector>

namespace {

struct BenchClip {
    std::string xml;
    std::string video;
    std::vector<std::string> audio;
};

struct BenchCard {
    std::string root;
    std::vector<BenchClip> clips;
    BenchCard() {
        char tmpl[] = "/tmp/skarn-clipbench-XXXXXX";
        root = ::mkdtemp(tmpl);
        CardSpec params;
        params.root = root + "/VOL";
        for (unsigned i = 1; i <= 220; ++i) {
            ClipSpec c = defaultClip(*cardFamilyNamed("dvcpro50-ntsc"), i);
            c.frames = 3;
            c.metadata.shooter = "Bench";
            c.metadata.memos = {{"P", "memo"}};
            params.clips.push_back(c);
        }
        std::vector<WrittenClip> written;
        std::string error;
        if (!writeCard(params, &written, &error)) {
            std::fprintf(stderr, "card: %s\n", error.c_str());
            std::exit(1);
        }
        for (const WrittenClip& w : written) {
            BenchClip b;
            b.xml = w.clipPath;
            for (const std::string& f : w.files) {
                if (f.find("/VIDEO/") != std::string::npos) b.video = f;
                if (f.find("/AUDIO/") != std::string::npos) b.audio.push_back(f);
            }
            clips.push_back(std::move(b));
        }
        // Folder listings are kept across clips only for folders that have not
        // changed for two seconds; a card in a camera slot has long settled,
        // so the card is measured settled too, not in the window after writing.
        std::this_thread::sleep_for(std::chrono::milliseconds(2200));
    }
    ~BenchCard() { std::system(("rm -rf '" + root + "'").c_str()); }
};

const BenchCard& benchCard() {
    static BenchCard card;
    return card;
}

size_t readAt(const std::string& path, uint8_t* buf, size_t n, int64_t offset, bool uncached) {
    int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return 0;
    if (uncached) FileSystem::disableCaching(fd);
    int64_t got = FileSystem::preadFully(fd, buf, n, offset);
    ::close(fd);
    return got > 0 ? size_t(got) : 0;
}

size_t floorOnce(const BenchCard& card, bool uncached) {
    static std::unique_ptr<uint8_t[]> frame(new uint8_t[288000]);
    uint8_t head[4096];
    size_t total = 0;
    for (const BenchClip& c : card.clips) {
        pugi::xml_document doc;
        doc.load_file(c.xml.c_str());
        pugi::xml_node index = doc.document_element().first_element_by_path("ClipContent/EssenceList/Video/VideoIndex");
        int64_t offset = index.child("StartByteOffset").text().as_llong();
        total += readAt(c.video, frame.get(), 240000, offset, uncached);
        total += readAt(c.video, head, sizeof head, 0, uncached);
        for (const std::string& a : c.audio) total += readAt(a, head, sizeof head, 0, uncached);
        benchmark::DoNotOptimize(doc);
    }
    return total;
}

// Clips made; every clip of the card must be.
size_t constructOnce(const BenchCard& card) {
    size_t made = 0;
    for (const BenchClip& c : card.clips) {
        Ref<SkarnClip> clip = SkarnClip::initWithSkarnClip(c.xml);
        made += clip ? 1 : 0;
        benchmark::DoNotOptimize(clip.get());
    }
    return made;
}

void floorPass(benchmark::State& state, bool uncached) {
    const BenchCard& card = benchCard();
    for (auto _ : state) benchmark::DoNotOptimize(floorOnce(card, uncached));
    state.SetItemsProcessed(int64_t(state.iterations() * card.clips.size()));
}

void BM_Floor_CachedReads(benchmark::State& state) { floorPass(state, false); }
void BM_Floor_UncachedReads(benchmark::State& state) { floorPass(state, true); }

void BM_SkarnClipConstruction(benchmark::State& state) {
    const BenchCard& card = benchCard();
    for (auto _ : state)
        if (constructOnce(card) != card.clips.size()) state.SkipWithError("a clip was not made");
    state.SetItemsProcessed(int64_t(state.iterations() * card.clips.size()));
}

double processSeconds() {
    timespec t{};
    ::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &t);
    return double(t.tv_sec) + double(t.tv_nsec) * 1e-9;
}

void BM_ConstructionOverFloor(benchmark::State& state) {
    using Clock = std::chrono::steady_clock;
    const BenchCard& card = benchCard();
    double floorWall = 0, floorCPU = 0, clipWall = 0, clipCPU = 0;
    std::vector<double> ratios;
    for (auto _ : state) {
        // Alternating which pass goes first keeps any advantage of running
        // second (warmer caches, a quieter disk) from favouring one side.
        const bool floorFirst = ratios.size() % 2 == 0;
        double fw = 0, fc = 0, cw = 0, cc = 0;
        for (int pass = 0; pass < 2; ++pass) {
            const bool floor = (pass == 0) == floorFirst;
            const auto w0 = Clock::now();
            const double c0 = processSeconds();
            if (floor) {
                benchmark::DoNotOptimize(floorOnce(card, true));
            } else if (constructOnce(card) != card.clips.size()) {
                state.SkipWithError("a clip was not made");
            }
            const double wall = std::chrono::duration<double>(Clock::now() - w0).count();
            const double cpu = processSeconds() - c0;
            (floor ? fw : cw) = wall;
            (floor ? fc : cc) = cpu;
        }
        floorWall += fw, floorCPU += fc, clipWall += cw, clipCPU += cc;
        if (fw > 0) ratios.push_back(cw / fw);
    }
    if (floorWall > 0) state.counters["ratio"] = clipWall / floorWall;
    if (floorCPU > 0) state.counters["cpu_ratio"] = clipCPU / floorCPU;
    if (!ratios.empty()) {
        std::sort(ratios.begin(), ratios.end());
        state.counters["ratio_median"] = ratios[ratios.size() / 2];
        state.counters["ratio_max"] = ratios.back();
    }
    const double n = double(std::max<int64_t>(state.iterations(), 1));
    state.counters["floor_ms"] = floorWall / n * 1e3;
    state.counters["clip_ms"] = clipWall / n * 1e3;
}

BENCHMARK(BM_Floor_CachedReads)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Floor_UncachedReads)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_SkarnClipConstruction)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ConstructionOverFloor)->Unit(benchmark::kMillisecond)->Iterations(30);

// Prints the construction time over each floor after the table.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run>& runs) override {
        for (const Run& r : runs)
            if (r.run_type == Run::RT_Iteration && !r.error_occurred) _times[r.benchmark_name()] = r.GetAdjustedRealTime();
        ConsoleReporter::ReportRuns(runs);
    }
    void Finalize() override {
        ConsoleReporter::Finalize();
        auto find = [&](const char* prefix) -> double {
            for (const auto& [name, t] : _times)
                if (name.rfind(prefix, 0) == 0) return t;
            return 0;
        };
        const double clip = find("BM_SkarnClipConstruction");
        for (const char* floor : {"BM_Floor_CachedReads", "BM_Floor_UncachedReads"}) {
            const double f = find(floor);
            if (clip > 0 && f > 0) std::printf("construction / %s = %.2f\n", floor, clip / f);
        }
    }

private:
    std::map<std::string, double> _times;
};

}  // namespace

int main(int argc, char** argv) {
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
    benchCard();
    RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();
    return 0;
}
