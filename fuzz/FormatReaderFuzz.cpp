// The format reader of a fuzzed clip, with sample cursors placed, stepped and
// asked about their samples at fuzzed times: every answer must be a value or
// one of the plug-in's assertions (hard ones throw here; soft ones throw or
// return as the input chooses), never a stray access, undefined behaviour, a
// hang or a huge allocation.
//
// Input: [clip file][operations][operation byte count, 2 bytes little-endian]
// (FuzzSupport.h). The clip file is a self-contained clip's MXF file, its header
// gap left out as seeds have it, or, when it starts with '<', a clip XML
// (whose tracks are laid out by byte offsets; its essence files are empty, which
// only the cadence probe reads). Either lies in a card tree in /dev/shm made
// once per process, as a link to a memory file rewritten per input. The
// operations are read one after another: the first byte picks the reader's
// two wishes (original frames, media rate) and how soft assertions behave;
// then each operation makes a cursor on a track (at a time, near it, at the
// first or last sample in decode order), copies or compares cursors, steps one
// (each kind of step, with counts and times from the input), or asks it, its
// track or the reader a question (location, chunk details, dependencies,
// stamps, horizon, timecode, edits). A hard assertion ends the input's
// operations: the process would have ended there.
//
// Seeds: fuzz/corpus/FormatReaderFuzz (small clips of each kind the card writer
// makes, written by skarn-fuzz-seeds).
#include "FuzzSupport.h"
#include "SkarnClip.h"
#include "SkarnFormatReader.h"
#include "SkarnSampleCursor.h"
#include "SkarnTrackReader.h"

#include <fuzzer/FuzzedDataProvider.h>

#include <cstdint>
#include <vector>

namespace {

constexpr size_t kMaxCursors = 4;
constexpr int kMaxOperations = 96;

// One card per kind of clip: a card with a CLIP folder would give the
// self-contained clip a companion XML.
struct Cards {
    FuzzMemoryCard avclip{"formatreader-avclip", {"CONTENTS/AVCLIP/A001.MXF"}};
    FuzzMemoryCard xml{"formatreader-xml",
                       {"CONTENTS/CLIP/A001.XML", "CONTENTS/VIDEO/A001.MXF", "CONTENTS/AUDIO/A00100.MXF",
                        "CONTENTS/AUDIO/A00101.MXF"}};
};

// Times a host might give: near the track's samples in its own timescale
// mostly, sometimes in another timescale, at the extremes of the value, or
// not numeric at all.
CMTime consumeTime(FuzzedDataProvider& in, SkarnTrackReader* track) {
    const CMTime frame = track->frameDuration();
    const int32_t timescale = frame.timescale > 0 ? frame.timescale : 1;
    const int64_t unit = frame.value > 0 ? frame.value : 1;
    const int64_t last = track->maxpts().value / unit;
    switch (in.ConsumeIntegralInRange<int>(0, 9)) {
    case 0:
    case 1:
    case 2:
    case 3:
        return CMTimeMake(in.ConsumeIntegralInRange<int64_t>(-3, last + 3) * unit +
                              (in.ConsumeBool() ? 0 : in.ConsumeIntegralInRange<int64_t>(-unit, unit)),
                          timescale);
    case 4: {
        static const int32_t kTimescales[] = {1, 600, 1000, 2400, 24000, 25, 30000, 48000, 60000, 90000};
        return CMTimeMake(in.ConsumeIntegralInRange<int64_t>(-100000, 1000000),
                          in.PickValueInArray(kTimescales));
    }
    case 5:
        return CMTimeMake(in.ConsumeIntegral<int64_t>(), in.ConsumeIntegralInRange<int32_t>(1, INT32_MAX));
    case 6:
        return CMTimeMake(in.ConsumeBool() ? INT64_MAX : INT64_MIN, timescale);
    case 7:
        return CMTimeMake(in.ConsumeIntegral<int64_t>(), timescale);
    case 8: {
        static const CMTime kOdd[] = {kCMTimeInvalid, kCMTimePositiveInfinity, kCMTimeNegativeInfinity,
                                      kCMTimeIndefinite, kCMTimeZero};
        return in.PickValueInArray(kOdd);
    }
    default:
        return track->trackDuration();
    }
}

int64_t consumeCount(FuzzedDataProvider& in, SkarnTrackReader* track) {
    switch (in.ConsumeIntegralInRange<int>(0, 5)) {
    case 0:
    case 1:
    case 2:
        return in.ConsumeIntegralInRange<int64_t>(-4, 4);
    case 3: {
        const int64_t unit = track->frameDuration().value > 0 ? track->frameDuration().value : 1;
        const int64_t frames = track->trackDuration().value / unit;
        return in.ConsumeIntegralInRange<int64_t>(-frames - 2, frames + 2);
    }
    case 4:
        return in.ConsumeBool() ? INT64_MAX : INT64_MIN;
    default:
        return in.ConsumeIntegral<int64_t>();
    }
}

struct Run {
    Ref<SkarnFormatReader> reader;
    std::vector<Ref<SkarnTrackReader>> tracks;
    std::vector<Ref<SkarnSampleCursor>> cursors;
    uint64_t sink = 0;  // answers are folded in, so nothing is optimised away

    // Folded as unsigned: the answers may be anywhere in their range, and
    // their sum is not the plug-in's.
    template <typename... T>
    void mix(T... values) {
        ((sink = sink * 31 + uint64_t(values)), ...);
    }

    SkarnTrackReader* track(FuzzedDataProvider& in) {
        return tracks.empty() ? nullptr : tracks[in.ConsumeIntegralInRange<size_t>(0, tracks.size() - 1)].get();
    }
    SkarnSampleCursor* cursor(FuzzedDataProvider& in) {
        return cursors.empty() ? nullptr : cursors[in.ConsumeIntegralInRange<size_t>(0, cursors.size() - 1)].get();
    }
    void keep(Ref<VestaKilnSampleCursorProtocol> made, FuzzedDataProvider& in) {
        auto* c = dynamic_cast<SkarnSampleCursor*>(made.get());
        if (!c) return;
        if (cursors.size() < kMaxCursors)
            cursors.emplace_back(c);
        else
            cursors[in.ConsumeIntegralInRange<size_t>(0, kMaxCursors - 1)] = Ref<SkarnSampleCursor>(c);
    }
    void fold(CMTime t) { mix(t.value, t.timescale, t.flags); }

    void operate(FuzzedDataProvider& in);
};

void Run::operate(FuzzedDataProvider& in) {
    const int op = in.ConsumeIntegralInRange<int>(0, 19);
    if (op <= 3) {
        SkarnTrackReader* t = track(in);
        if (!t) return;
        bool before = false, after = false;
        const bool flags = in.ConsumeBool();
        switch (op) {
        case 0:
            keep(t->cursorAtPresentationTimeStamp(consumeTime(in, t), flags ? &before : nullptr,
                                                  flags ? &after : nullptr),
                 in);
            break;
        case 1:
            keep(t->cursorNearPresentationTimeStamp(consumeTime(in, t), in.ConsumeBool(), flags ? &before : nullptr,
                                                    flags ? &after : nullptr),
                 in);
            break;
        case 2:
            keep(t->cursorAtFirstSampleInDecodeOrder(), in);
            break;
        default:
            keep(t->cursorAtLastSampleInDecodeOrder(), in);
            break;
        }
        mix(before, after);
        return;
    }
    if (op == 4) {
        // Questions about a track.
        SkarnTrackReader* t = track(in);
        if (!t) return;
        mix(t->isEnabled(), t->mediaType(), t->timescale(), t->uneditedNumDataBytes(), t->locationOffset(),
            t->locationSize(), t->trackEditCount(), t->trackEditIndexWithTrackTime(consumeTime(in, t)));
        fold(t->uneditedDuration());
        fold(t->trackEditWithIndex(in.ConsumeIntegral<int64_t>()).target.duration);
        mix(t->description().size(), t->formatDescription() != nullptr);
        return;
    }
    if (op == 5) {
        // Questions about the reader, and a copy of it that shares its tracks.
        fold(reader->duration());
        fold(reader->estimatedDuration());
        mix(reader->timescale(), reader->locationOffset(), reader->locationSize(), reader->trackReaders().size());
        if (in.ConsumeIntegralInRange<int>(0, 7) == 0) {
            Ref<VestaKilnFormatReaderProtocol> copy = reader->copy();
            mix(copy->trackReaders().size());
        }
        return;
    }
    SkarnSampleCursor* c = cursor(in);
    if (!c) return;
    SkarnTrackReader* t = c->trackReader();
    switch (op) {
    case 6:
        mix(c->stepInDecodeOrder(consumeCount(in, t)));
        break;
    case 7:
        mix(c->stepInPresentationOrder(consumeCount(in, t)));
        break;
    case 8:
        mix(c->stepByPresentationTime(consumeTime(in, t)));
        break;
    case 9:
        mix(c->stepByDecodeTime(consumeTime(in, t)));
        break;
    case 10: {
        SkarnSampleCursor* other = cursor(in);
        mix(c->compareInDecodeOrder(other));
        break;
    }
    case 11:
        keep(c->copy(), in);
        break;
    case 12: {
        // Every combination of the out arrays a host may pass, with room for
        // none, one or more sections.
        int64_t count = -1, offsets[2] = {-1, -1}, lengths[2] = {-1, -1};
        Ref<Object> source;
        const int64_t capacity = in.ConsumeIntegralInRange<int64_t>(-1, 2);
        const int which = in.ConsumeIntegralInRange<int>(0, 7);
        c->sampleLocationWithArraySizes(capacity, (which & 1) ? &count : nullptr, (which & 2) ? offsets : nullptr,
                                        (which & 4) ? lengths : nullptr, in.ConsumeBool() ? &source : nullptr);
        mix(count, offsets[0], lengths[0]);
        break;
    }
    case 13: {
        Ref<Object> storage;
        int64_t offset = -1, size = -1, samples = -1, index = -1;
        bool sameSize = false, sameDuration = false, sameFormat = false;
        if (in.ConsumeBool())
            c->chunkDetails(&storage, &offset, &size, &samples, &index, &sameSize, &sameDuration, &sameFormat);
        else
            c->chunkDetails(nullptr, nullptr, &size, nullptr, &index, nullptr, nullptr, nullptr);
        mix(offset, size, samples, index, sameSize, sameDuration, sameFormat);
        break;
    }
    case 14:
        mix(c->sampleDependencyAttributes().description().size());
        break;
    case 15: {
        bool full = false, partial = false, droppable = false;
        double threshold = 0;
        if (in.ConsumeBool())
            c->dependencyInfoWithFullSync(&full, &partial, &threshold, &droppable);
        else
            c->dependencyInfoWithFullSync(nullptr, &partial, nullptr, nullptr);
        mix(full, partial, droppable, threshold > 0.5);
        break;
    }
    case 16:
        fold(c->presentationTimeStamp());
        fold(c->decodeTimeStamp());
        break;
    case 17:
        fold(c->duration());
        fold(c->playableHorizon());
        mix(c->formatDescription() != nullptr, c->respondsToSelector("decodeTimeStamp"));
        break;
    case 18:
        mix(c->followonDropCount(), c->timecodeCounter());
        break;
    default:
        // A cursor let go.
        std::erase_if(cursors, [c](const Ref<SkarnSampleCursor>& r) { return r.get() == c; });
        break;
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzzThrowOnHardAssertions();
    static Cards cards;

    const FuzzFileAndOperations input = fuzzSplitOperations({data, size});
    FuzzedDataProvider in(input.operations.data(), input.operations.size());
    const uint8_t wishes = in.ConsumeIntegral<uint8_t>();
    FuzzAssertionHandler handler((wishes & 4) != 0);
    ScopedAssertionHandler scoped(&handler);

    std::string path;
    if (!input.file.empty() && input.file[0] == '<') {
        cards.xml.write(0, input.file);
        path = cards.xml.path(0);
    } else {
        cards.avclip.write(0, fuzzExpandAVClip(input.file));
        path = cards.avclip.path(0);
    }

    Run run;
    try {
        Ref<SkarnClip> clip = SkarnClip::initWithSkarnClip(path);
        if (!clip) return 0;
        run.reader = SkarnFormatReader::formatReaderWithClip(clip.get(), (wishes & 1) != 0, (wishes & 2) != 0);
        if (!run.reader) return 0;
        run.tracks = run.reader->trackList();
        for (int i = 0; i < kMaxOperations && in.remaining_bytes() > 0; ++i) {
            try {
                run.operate(in);
            } catch (const AssertionFailure&) {
                // The default handler throws too; a host that lets the exception
                // pass goes on with its other cursors.
            }
        }
    } catch (const HardAssertionFailure&) {
    } catch (const AssertionFailure&) {
    }
    // Cursors go before the reader that keeps their tracks alive.
    run.cursors.clear();
    gFuzzSink = uint64_t(run.sink);
    return 0;
}
