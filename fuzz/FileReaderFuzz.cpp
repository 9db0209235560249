// SkarnFileReader against the plain model of it (FileReaderModel.h) over one
// pattern file written once per process. The input's first bytes choose the
// range (anywhere in the file, possibly running past its end), the rest a
// sequence of seeks, reads, skips, refill-size changes and discards. Any
// difference in the bytes delivered, an answer, the position or the buffer's
// bookkeeping aborts.
#include "FileReaderModel.h"
#include "FileSystem.h"
#include "FuzzSupport.h"
#include "SkarnFileReader.h"

#include <fuzzer/FuzzedDataProvider.h>

#include <algorithm>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <string>
#include <vector>

namespace {

constexpr int64_t kFileSize = 300 * 1024 + 123;

// Written once, kept open and unlinked at once: readers reach it through
// /proc/self/fd, and nothing is left behind however the process ends.
struct PatternFile {
    std::string path;
    std::vector<uint8_t> bytes;

    PatternFile() : bytes(size_t(kFileSize)) {
        uint32_t x = 0x2545f491;
        for (auto& b : bytes) {
            x ^= x << 13;
            x ^= x >> 17;
            x ^= x << 5;
            b = uint8_t(x);
        }
        const std::string scratch = fuzzScratchPath("filereader", ".mxf");
        const int fd = fuzzWriteInput(scratch, bytes.data(), bytes.size()) ? ::open(scratch.c_str(), O_RDONLY) : -1;
        std::remove(scratch.c_str());
        if (fd < 0) {
            std::fprintf(stderr, "cannot write %s\n", scratch.c_str());
            std::abort();
        }
        path = "/proc/self/fd/" + std::to_string(fd);
    }
};

[[noreturn]] void finding(const char* what, int step, int64_t got, int64_t want) {
    std::fprintf(stderr, "FileReaderFuzz: %s differs at step %d: reader %" PRId64 ", model %" PRId64 "\n", what,
                 step, got, want);
    std::abort();
}

void same(const char* what, int step, int64_t got, int64_t want) {
    if (got != want) finding(what, step, got, want);
}

// Sizes that matter to the reader: small ones, ones next to a page multiple,
// and large ones that go direct.
int64_t consumeSize(FuzzedDataProvider& in, int64_t page) {
    switch (in.ConsumeIntegralInRange<int>(0, 3)) {
    case 0:
        return in.ConsumeIntegralInRange<int64_t>(0, 64);
    case 1:
        return in.ConsumeIntegralInRange<int64_t>(0, 9000);
    case 2:
        return std::max<int64_t>(0, in.ConsumeIntegralInRange<int64_t>(0, 80) * page +
                                        in.ConsumeIntegralInRange<int64_t>(-2, 2));
    default:
        return in.ConsumeIntegralInRange<int64_t>(0, 600000);
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const PatternFile file;
    const int64_t page = int64_t(FileSystem::pageSize());
    FuzzedDataProvider in(data, size);

    const int64_t start = in.ConsumeBool() ? in.ConsumeIntegralInRange<int64_t>(0, 8) * page
                                           : in.ConsumeIntegralInRange<int64_t>(0, kFileSize + page);
    const int64_t length = in.ConsumeIntegralInRange<int64_t>(0, kFileSize + 2 * page);
    Ref<SkarnFileReader> reader = SkarnFileReader::initWithURL(file.path, start, uint64_t(length));
    if (!reader) std::abort();
    FileReaderModel model(file.bytes, start, length, page);

    std::vector<uint8_t> got, want;
    for (int step = 0; step < 200 && in.remaining_bytes() > 0; ++step) {
        switch (in.ConsumeIntegralInRange<int>(0, 4)) {
        case 0: {
            const uint64_t count = uint64_t(consumeSize(in, page));
            got.assign(count, 0);
            want.clear();
            const uint64_t n = reader->read(count, got.data());
            same("read count", step, int64_t(n), int64_t(model.read(count, want)));
            if (!std::equal(want.begin(), want.end(), got.begin())) finding("read bytes", step, 0, 0);
            break;
        }
        case 1: {
            int64_t target = in.ConsumeIntegralInRange<int64_t>(-start - 3 * page, length + 3 * page);
            // Next to either end of what is buffered, where off-by-ones live.
            const int64_t bufferEnd = model.sourcePosition();
            const int64_t bufferStart = bufferEnd - int64_t(model.bufferedBytes());
            switch (in.ConsumeIntegralInRange<int>(0, 15)) {
            case 0: target = INT64_MAX; break;
            case 1: target = bufferStart + in.ConsumeIntegralInRange<int64_t>(-2, 2); break;
            case 2: target = bufferEnd + in.ConsumeIntegralInRange<int64_t>(-2, 2); break;
            default: break;
            }
            same("seek", step, reader->seek(target), model.seek(target));
            break;
        }
        case 2: {
            const int64_t by = in.ConsumeBool() ? consumeSize(in, page) : -consumeSize(in, page);
            same("skip", step, reader->skip(by), model.skip(by));
            break;
        }
        case 3: {
            uint64_t refill = uint64_t(consumeSize(in, page));
            if (in.ConsumeIntegralInRange<int>(0, 7) == 0) refill = in.ConsumeBool() ? 4194304 : 5u << 20;
            reader->setBufferSize(refill);
            model.setBufferSize(refill);
            same("buffer size", step, int64_t(reader->bufferSize()), int64_t(model.bufferSize()));
            break;
        }
        default:
            reader->discard();
            model.discard();
            break;
        }
        same("position", step, reader->position(), model.position());
        same("remaining", step, int64_t(reader->remaining()), int64_t(model.remaining()));
        same("source position", step, reader->source()->absoluteOffset(), model.sourcePosition());
        same("buffered bytes", step, int64_t(reader->bufferData()), int64_t(model.bufferedBytes()));
    }
    return 0;
}
