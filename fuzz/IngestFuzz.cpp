// The ingest object pulling all media of a fuzzed clip, as a host does:
// initialise, start, ask for media until the end-of-media flag, giving the
// memory back, then stop, clean up and tear down. Every answer must be a
// status or one of the plug-in's assertions; a stray access, undefined
// behaviour, a leak, an unbounded allocation, delivered memory that cannot be
// read in full, or media that does not end within a number of calls
// proportional to the clip's bytes is a finding.
//
// Input: parts separated by kFuzzPartMark (FuzzSupport.h):
//   [control][clip XML][video MXF][audio MXF of channel 0]...[channel 3]
// The files lie in a card tree in /dev/shm made once per process, as links to
// memory files rewritten per input (a part that is not there leaves its file
// empty). With an empty clip XML part the video part is a self-contained clip
// (its header gap left out as seeds have it), read from a card of its own.
// The control part picks what the host does besides: keep the media rate,
// timing offsets off, a returning soft-assertion handler, an in point, a reset
// after some calls, and when it gives memory back (at once, twice, or some of
// it only at clean-up).
//
// Seeds: fuzz/corpus/IngestFuzz (small clips of every family the card writer
// makes, written by skarn-fuzz-seeds).
#include "CoreAudioTypes.h"
#include "FuzzSupport.h"
#include "SkarnClip.h"
#include "SkarnIngestObject.h"
#include "VestaKilnMediaRecords.h"

#include <fuzzer/FuzzedDataProvider.h>

#include <cstdint>
#include <cstdio>
#include <vector>

namespace {

constexpr size_t kAudioFiles = 4;

struct Cards {
    FuzzMemoryCard xml{"ingest-xml",
                       {"CONTENTS/CLIP/A001.XML", "CONTENTS/VIDEO/A001.MXF", "CONTENTS/AUDIO/A00100.MXF",
                        "CONTENTS/AUDIO/A00101.MXF", "CONTENTS/AUDIO/A00102.MXF", "CONTENTS/AUDIO/A00103.MXF"}};
    FuzzMemoryCard avclip{"ingest-avclip", {"CONTENTS/AVCLIP/A001.MXF"}};
};

enum class Disposal { AtOnce, Twice, SomeAtCleanup };

// Reads every byte handed out, so that the sanitizer sees a pointer or a size
// that does not hold.
uint64_t touch(const void* p, uint64_t n) {
    if (!p) return 0;
    const auto* b = static_cast<const volatile uint8_t*>(p);
    uint64_t sum = 0;
    for (uint64_t i = 0; i < n; ++i) sum += b[i];
    return sum;
}

struct Host {
    Disposal disposal = Disposal::AtOnce;
    std::vector<std::pair<VestaKilnVideoBufferManager*, uint8_t*>> heldVideo;
    std::vector<std::pair<VestaKilnAudioBufferManager*, uint8_t*>> heldAudio;
    uint64_t sum = 0;
    uint64_t calls = 0;

    // One delivery: read it, then give it back (or hold it).
    void take(const VestaKilnPlugInMediaSpecifier_Deprecated& r) {
        ++calls;
        if (r.videoData) {
            sum += touch(r.videoData, r.videoDataSize);
            sum += touch(r.videoImageDescription, r.videoImageDescription ? r.videoImageDescriptionSize : 0);
            giveVideo(r.videoBufferManager, r.videoData, r.videoDataSize);
        }
        if (const AudioBufferList* list = r.audioBufferList) {
            sum += touch(r.audioStreamDescription, r.audioStreamDescription ? r.audioStreamDescriptionSize : 0);
            sum += touch(r.audioChannelLayout, r.audioChannelLayout ? r.audioChannelLayoutSize : 0);
            // The list goes with the last keeper: its buffers are taken first.
            std::vector<AudioBuffer> buffers(list->mBuffers, list->mBuffers + list->mNumberBuffers);
            for (const AudioBuffer& b : buffers) sum += touch(b.mData, b.mDataByteSize);
            for (const AudioBuffer& b : buffers)
                if (b.mData) giveAudio(r.audioBufferManager, static_cast<uint8_t*>(b.mData), b.mDataByteSize);
        }
    }

    void giveVideo(VestaKilnVideoBufferManager* manager, uint8_t* data, uint64_t size) {
        if (!manager) return;
        if (disposal == Disposal::SomeAtCleanup && calls % 2 == 0) {
            heldVideo.emplace_back(manager, data);
            return;
        }
        manager->disposeVideoMedia(data, size, nullptr);
        if (disposal == Disposal::Twice) manager->disposeVideoMedia(data, size, nullptr);
    }

    void giveAudio(VestaKilnAudioBufferManager* manager, uint8_t* data, uint64_t size) {
        if (!manager) return;
        if (disposal == Disposal::SomeAtCleanup && calls % 3 == 0) {
            heldAudio.emplace_back(manager, data);
            return;
        }
        manager->disposeAudioMedia(data, size, nullptr);
        if (disposal == Disposal::Twice) manager->disposeAudioMedia(data, size, nullptr);
    }

    // Half of what is held goes back now; the rest is released by clean-up.
    void giveBackHalf() {
        for (size_t i = 0; i < heldVideo.size(); i += 2)
            heldVideo[i].first->disposeVideoMedia(heldVideo[i].second, 0, nullptr);
        for (size_t i = 0; i < heldAudio.size(); i += 2)
            heldAudio[i].first->disposeAudioMedia(heldAudio[i].second, 0, nullptr);
        heldVideo.clear();
        heldAudio.clear();
    }
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzzThrowOnHardAssertions();
    static Cards cards;

    const auto parts = fuzzSplitParts({data, size}, 3 + kAudioFiles);
    auto part = [&](size_t i) { return i < parts.size() ? parts[i] : std::span<const uint8_t>(); };
    FuzzedDataProvider control(part(0).data(), part(0).size());
    const uint8_t flags = control.ConsumeIntegral<uint8_t>();
    const bool keepMediaRate = flags & 1, timingOffsetOff = flags & 2, softReturns = flags & 4;
    const bool resetOnce = flags & 8, inPoint = flags & 16;
    const int resetAfter = control.ConsumeIntegralInRange<int>(0, 6);
    const int64_t inPointValue = control.ConsumeIntegralInRange<int64_t>(-2, 40);
    const int32_t inPointScale = control.ConsumeBool() ? 30000 : control.ConsumeIntegralInRange<int32_t>(1, 96000);

    // Proportional to what the clip's files hold: no sample is smaller than a
    // byte, and every call delivers a sample or ends a track.
    uint64_t bytes = 0;
    std::string path;
    if (part(1).empty()) {
        const std::vector<uint8_t> file = fuzzExpandAVClip(part(2));
        bytes = file.size();
        cards.avclip.write(0, file);
        path = cards.avclip.path(0);
    } else {
        for (size_t i = 0; i < 2 + kAudioFiles; ++i) {
            cards.xml.write(i, part(1 + i));
            if (i > 0) bytes += part(1 + i).size();
        }
        path = cards.xml.path(0);
    }
    const uint64_t maxCalls = 64 + 2 * bytes;

    FuzzAssertionHandler handler(softReturns);
    ScopedAssertionHandler scoped(&handler);
    Host host;
    host.disposal = Disposal((flags >> 5) % 3);
    try {
        Ref<SkarnClip> clip = SkarnClip::initWithSkarnClip(path);
        if (!clip) return 0;
        Ref<SkarnIngestObject> ingest = SkarnIngestObject::initWithClip(clip.get());
        if (!ingest) return 0;
        if (keepMediaRate) ingest->setKeepMediaVideoRate(true, nullptr);
        if (timingOffsetOff) ingest->setUseTimingOffset(false);
        if (inPoint) ingest->setInPoint(CMTimeMake(inPointValue * (inPointScale / 30 + 1), inPointScale), nullptr);
        ingest->initialize(nullptr);
        ingest->start(nullptr);
        bool ended = false, didReset = !resetOnce;
        for (uint64_t calls = 0; calls < maxCalls; ++calls) {
            VestaKilnPlugInMediaSpecifier_Deprecated record{};
            const int32_t status = ingest->getNextMedia_Deprecated(&record, nullptr);
            host.take(record);
            if (record.endOfMedia) {
                ended = true;
                break;
            }
            if (!didReset && host.calls == uint64_t(resetAfter)) {
                didReset = true;
                ingest->reset(nullptr);
                calls = 0;
                continue;
            }
            // A host stops at a failure; the media reader has marked its
            // track's end by then.
            if (status != 0) {
                ended = true;
                break;
            }
        }
        if (!ended) {
            std::fprintf(stderr, "IngestFuzz: media did not end within %llu calls\n",
                         static_cast<unsigned long long>(maxCalls));
            std::abort();
        }
        host.giveBackHalf();
        ingest->stop(nullptr);
        ingest->cleanup(nullptr);
        ingest->teardown(nullptr);
    } catch (const HardAssertionFailure&) {
    } catch (const AssertionFailure&) {
    }
    gFuzzSink = host.sum;
    return 0;
}
