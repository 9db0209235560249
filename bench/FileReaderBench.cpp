// SkarnFileReader reading a 256 MiB file (page cache warm) in media-sized
// pieces the way the media reader does, a seek to each sample's offset and a
// read of its size, against plain pread of the same bytes in the same run.
// Arguments: piece size, refill size (4 MiB for bulk ingest, 32768 during
// cadence analysis). The reported time is the reader's; "ratio" is the
// reader's time over pread's (1.0 = as fast as pread).
#include "SkarnFileReader.h"

#include <benchmark/benchmark.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <string>
#include <unistd.h>
#include <vector>

namespace {

constexpr int64_t kFileSize = int64_t(256) << 20;
std::string gPath;

bool writeFile() {
    const char* tmp = std::getenv("TMPDIR");
    gPath = std::string(tmp && *tmp ? tmp : "/tmp") + "/skarn-filereaderbench-" + std::to_string(::getpid()) + ".mxf";
    const int fd = ::open(gPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (fd < 0) return false;
    std::vector<uint8_t> block(1 << 20);
    bool ok = true;
    for (int64_t at = 0; ok && at < kFileSize; at += int64_t(block.size())) {
        for (size_t i = 0; i < block.size(); i += 8) block[i] = uint8_t((at >> 20) + i);
        ok = ::write(fd, block.data(), block.size()) == ssize_t(block.size());
    }
    ok = ::close(fd) == 0 && ok;
    // Read it once so that both sides start from a warm page cache.
    const int in = ::open(gPath.c_str(), O_RDONLY | O_CLOEXEC);
    while (ok && in >= 0 && ::read(in, block.data(), block.size()) > 0) {
    }
    if (in >= 0) ::close(in);
    return ok && in >= 0;
}

double seconds(std::chrono::steady_clock::duration d) { return std::chrono::duration<double>(d).count(); }

void BM_MediaPieces(benchmark::State& state) {
    const int64_t piece = state.range(0);
    const uint64_t refill = uint64_t(state.range(1));
    std::vector<uint8_t> dest(static_cast<size_t>(piece));
    const int fd = ::open(gPath.c_str(), O_RDONLY | O_CLOEXEC);
    double readerTime = 0, preadTime = 0;
    int64_t bytes = 0;

    for (auto _ : state) {
        auto t0 = std::chrono::steady_clock::now();
        Ref<SkarnFileReader> reader = SkarnFileReader::initWithURL(gPath, 0, uint64_t(kFileSize));
        reader->setBufferSize(refill);
        for (int64_t at = 0; at + piece <= kFileSize; at += piece) {
            reader->seek(at);
            if (reader->read(uint64_t(piece), dest.data()) != uint64_t(piece)) state.SkipWithError("short read");
            benchmark::DoNotOptimize(dest.data());
        }
        reader = nullptr;
        auto t1 = std::chrono::steady_clock::now();
        for (int64_t at = 0; at + piece <= kFileSize; at += piece) {
            if (::pread(fd, dest.data(), size_t(piece), at) != ssize_t(piece)) state.SkipWithError("short pread");
            benchmark::DoNotOptimize(dest.data());
        }
        auto t2 = std::chrono::steady_clock::now();
        state.SetIterationTime(seconds(t1 - t0));
        readerTime += seconds(t1 - t0);
        preadTime += seconds(t2 - t1);
        bytes += kFileSize / piece * piece;
    }
    ::close(fd);
    state.SetBytesProcessed(bytes);
    state.counters["reader_GiBps"] = double(bytes) / readerTime / double(1 << 30);
    state.counters["pread_GiBps"] = double(bytes) / preadTime / double(1 << 30);
    state.counters["ratio"] = readerTime / preadTime;
}

BENCHMARK(BM_MediaPieces)
    ->ArgNames({"piece", "refill"})
    ->Args({576000, 4194304})
    ->Args({576000, 32768})
    ->Args({2097152, 4194304})
    ->Args({2097152, 32768})
    ->Args({144000, 4194304})
    ->Args({144000, 32768})
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond)
    ->MinTime(2.0);

}  // namespace

int main(int argc, char** argv) {
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
    if (!writeFile()) {
        std::fprintf(stderr, "cannot write %s\n", gPath.c_str());
        std::remove(gPath.c_str());
        return 1;
    }
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    std::remove(gPath.c_str());
    return 0;
}
