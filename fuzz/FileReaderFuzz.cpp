// SkarnFileReader against the plain model of it (FileReaderModel.h) over one
// pattern file written once per process. The input's first bytes choose the
// range (anywhere in the file, possibly running past its end), the rest a
// sequence of seeks, reads, skips, refill-size changes and discards. Any
// difference in the bytes delivered, an answer, the position or the buffer's
// bookkeeping aborts.
//
// Readers are kept across inputs, one per range, and put back to the state of
// a new reader before each use: every reader allocates a 4 MiB buffer, and its
// allocation and release under the address sanitizer cost far more than the
// rest of an input.
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

constexpr uint64_t kDefaultRefill = 32768;

// A reader as it comes from initWithURL: at the range's start, nothing
// buffered, the default refill size.
bool likeNew(SkarnFileReader& reader, int64_t length) {
    return reader.position() == 0 && reader.source()->absoluteOffset() == 0 && reader.bufferData() == 0 &&
           reader.bufferPos() == 0 && reader.bufferSize() == kDefaultRefill && reader.remaining() == uint64_t(length);
}

// Readers by range: one for each preset range, kept for good, and the few
// most recently used others. A reader that cannot be put back to the new
// state through its own operations is replaced by a new one.
class ReaderCache {
public:
    Ref<SkarnFileReader> reader(const std::string& path, int64_t start, int64_t length, bool preset) {
        ++_clock;
        Entry* slot = nullptr;
        for (Entry& e : _entries)
            if (e.start == start && e.length == length) slot = &e;
        if (slot) {
            SkarnFileReader& r = *slot->reader;
            r.setBufferSize(kDefaultRefill);
            r.discard();
            r.seek(0);
            if (!likeNew(r, length)) slot->reader = nullptr;
        } else if (preset || _others < kOthers) {
            slot = &_entries.emplace_back();
            slot->pinned = preset;
            _others += preset ? 0 : 1;
        } else {
            for (Entry& e : _entries)
                if (!e.pinned && (!slot || e.lastUse < slot->lastUse)) slot = &e;
            slot->reader = nullptr;  // its buffer goes before the next one comes
        }
        if (!slot->reader) {
            slot->reader = SkarnFileReader::initWithURL(path, start, uint64_t(length));
            if (!slot->reader || !likeNew(*slot->reader, length)) std::abort();
        }
        slot->start = start;
        slot->length = length;
        slot->lastUse = _clock;
        return slot->reader;
    }

private:
    static constexpr size_t kOthers = 4;
    struct Entry {
        int64_t start = 0, length = 0;
        uint64_t lastUse = 0;
        bool pinned = false;
        Ref<SkarnFileReader> reader;
    };
    std::vector<Entry> _entries;
    size_t _others = 0;
    uint64_t _clock = 0;
};

// Ranges that stand for the cases a range can present: the whole file, ending
// at, just before or past its end, empty, within one page or just over,
// starting in the first page (where a backward seek meets the file's start)
// or further in, at or past the file's end.
struct Range {
    int64_t start, length;
};
Range presetRange(size_t i, int64_t p) {
    const int64_t f = kFileSize;
    const Range presets[] = {
        {0, f},           {0, f + 2 * p},    {0, 0},           {0, 1},          {0, p},
        {0, p + 1},       {0, 9 * p - 3},    {1, f - 1},       {1, f},          {5, 40 * p + 17},
        {p - 1, 2 * p},   {p, f - p},        {p, f - p - 1},   {p, f - p + 1},  {3 * p + 5, 9 * p - 3},
        {8 * p, 40 * p},  {8 * p, f},        {f - 2 * p - 7, 2 * p + 7},        {f - 2 * p - 7, 3 * p},
        {f - p, p},       {f - 1, 1},        {f - 1, p},       {f, 0},          {f, p},
        {f + 1, 10},      {f + p, 2 * p},    {123, 64},        {2 * p + 1, 1},
    };
    return presets[i % std::size(presets)];
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
    static ReaderCache readers;
    const int64_t page = int64_t(FileSystem::pageSize());
    FuzzedDataProvider in(data, size);

    // Mostly one of the preset ranges, whose readers are kept; any other range
    // now and then.
    const uint8_t choice = in.ConsumeIntegral<uint8_t>();
    const bool preset = choice < 224;
    int64_t start = 0, length = 0;
    if (preset) {
        const Range r = presetRange(choice, page);
        start = r.start;
        length = r.length;
    } else {
        start = in.ConsumeBool() ? in.ConsumeIntegralInRange<int64_t>(0, 8) * page
                                 : in.ConsumeIntegralInRange<int64_t>(0, kFileSize + page);
        length = in.ConsumeIntegralInRange<int64_t>(0, kFileSize + 2 * page);
    }
    Ref<SkarnFileReader> reader = readers.reader(file.path, start, length, preset);
    FileReaderModel model(file.bytes, start, length, page);

    // Kept across inputs for the same reason as the readers: reads run to
    // hundreds of kilobytes.
    static std::vector<uint8_t> got, want;
    for (int step = 0; step < 200 && in.remaining_bytes() > 0; ++step) {
        switch (in.ConsumeIntegralInRange<int>(0, 4)) {
        case 0: {
            const uint64_t count = uint64_t(consumeSize(in, page));
            if (got.size() < count) got.resize(count);
            std::fill_n(got.begin(), count, uint8_t(0));
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
