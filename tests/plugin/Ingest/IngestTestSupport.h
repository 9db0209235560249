// Helpers the ingest tests share: cards written by the card writer, the
// essence bytes a clip's files hold, and a host loop that pulls every
// delivery out of an ingest object the way a host does (copying what it needs
// out of the record before giving the memory back).
#pragma once

#include "AVClipWriter.h"
#include "CardWriter.h"
#include "CoreAudioTypes.h"
#include "FileSystem.h"
#include "LogSink.h"
#include "SkarnBufferManager.h"
#include "SkarnClip.h"
#include "SkarnIngestObject.h"
#include "TestCaptures.h"
#include "TestSupport.h"
#include "VestaKilnMediaRecords.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <fstream>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace ingest_test {

inline ClipSpec clipOf(const std::string& family, uint64_t frames, unsigned index = 1) {
    const CardFamily* f = cardFamilyNamed(family);
    EXPECT_NE(f, nullptr) << family;
    ClipSpec c = defaultClip(*f, index);
    c.frames = frames;
    c.icon = false;
    return c;
}

// A DV clip carrying a pulldown cadence from the given phase.
inline ClipSpec cadenceClip(const std::string& family, DVCadence cadence, unsigned phase, uint64_t frames,
                            int shootingRate = 0) {
    ClipSpec c = clipOf(family, frames);
    DVStreamSpec dv;
    dv.cadence = cadence;
    dv.cadencePhase = phase;
    dv.shootingRate = shootingRate;
    c.dv = dv;
    return c;
}

inline WrittenClip writeOne(const TempDir& dir, const ClipSpec& clip, const std::string& root = "CARD") {
    CardSpec card;
    card.root = dir / root;
    card.clips = {clip};
    std::vector<WrittenClip> written;
    std::string error;
    EXPECT_TRUE(writeCard(card, &written, &error)) << error;
    return written.empty() ? WrittenClip{} : written.front();
}

inline std::vector<uint8_t> readRange(const std::string& path, uint64_t offset, uint64_t length) {
    std::ifstream in(path, std::ios::binary);
    std::vector<uint8_t> bytes(length);
    in.seekg(std::streamoff(offset));
    in.read(reinterpret_cast<char*>(bytes.data()), std::streamsize(length));
    bytes.resize(size_t(in.gcount()));
    return bytes;
}

// Replaces the first (or the last) occurrence of from.
inline void replaceInFile(const std::string& path, const std::string& from, const std::string& to,
                          bool last = false) {
    auto bytes = FileSystem::readFile(path, 1 << 24);
    ASSERT_TRUE(bytes);
    std::string text(bytes->begin(), bytes->end());
    size_t at = last ? text.rfind(from) : text.find(from);
    ASSERT_NE(at, std::string::npos) << from;
    text.replace(at, from.size(), to);
    writeTextFile(path, text);
}

// What a clip-XML clip's files hold: each frame's bytes and each channel's
// essence, at the offsets and sizes its XML names.
struct ClipEssence {
    std::vector<std::vector<uint8_t>> frames;
    std::vector<std::vector<uint8_t>> channels;
};

inline uint64_t xmlNumber(SkarnClip* clip, const std::string& xpath) {
    auto text = clip->stringFromClipDescriptionForXPath(xpath);
    return text ? std::stoull(*text) : 0;
}

// Frames where the clip places them (AVC-Intra essence starts with a 512-byte
// header that is not picture data), channels at their XML offsets and sizes.
inline ClipEssence clipXMLEssence(SkarnClip* clip, uint64_t frames) {
    ClipEssence e;
    std::string video = clip->videoFilePath().value_or("");
    uint64_t start = uint64_t(clip->startByteOffset());
    uint64_t frameBytes = frames ? uint64_t(clip->videoDataSize()) / frames : 0;
    for (uint64_t i = 0; i < frames; ++i) e.frames.push_back(readRange(video, start + i * frameBytes, frameBytes));
    auto paths = clip->audioFilePaths().value_or(std::vector<std::string>{});
    for (size_t ch = 0; ch < paths.size(); ++ch) {
        std::string base = "ClipContent/EssenceList/Audio[" + std::to_string(ch + 1) + "]/AudioIndex/";
        e.channels.push_back(
            readRange(paths[ch], xmlNumber(clip, base + "StartByteOffset"), xmlNumber(clip, base + "DataSize")));
    }
    return e;
}

// A self-contained clip's frames (in stored order) and channels, from where
// the writer put them.
inline ClipEssence avclipEssence(const WrittenClip& written) {
    const std::string& path = written.clipPath;
    const AVClipLayout& layout = written.avclipLayout;
    ClipEssence e;
    for (const auto& f : layout.frames) e.frames.push_back(readRange(path, f.offset, f.size));
    e.channels.resize(layout.chunks.empty() ? 0 : layout.chunks.front().audioBlock.size());
    for (const auto& chunk : layout.chunks) {
        for (size_t ch = 0; ch < chunk.audioBlock.size(); ++ch) {
            auto block = readRange(path, chunk.audioBlock[ch], uint64_t(chunk.sampleCount) * layout.blockAlign);
            e.channels[ch].insert(e.channels[ch].end(), block.begin(), block.end());
        }
    }
    return e;
}

// What a host got out of an ingest object.
struct Delivery {
    std::vector<std::vector<uint8_t>> frames;
    std::vector<int64_t> presentation;  // field 24 of each delivered frame
    std::vector<int32_t> timescale;     // field 48
    std::vector<std::vector<uint8_t>> channels;
    size_t calls = 0;
    int32_t status = 0;  // the first non-zero status
    std::vector<int32_t> statuses;  // every non-zero status, in order
    bool ended = false;  // the end-of-media flag came
};

// Calls for media until the end flag, a failure (unless the host goes on
// past failures) or maxCalls, copying the frame and every channel's bytes out
// and disposing of them at once.
inline Delivery ingestAll(SkarnIngestObject& ingest, size_t maxCalls = 100000, bool stopOnError = true) {
    Delivery d;
    while (d.calls < maxCalls) {
        VestaKilnPlugInMediaSpecifier_Deprecated record{};
        int32_t status = ingest.getNextMedia_Deprecated(&record, nullptr);
        ++d.calls;
        if (record.videoData) {
            d.frames.emplace_back(record.videoData, record.videoData + record.videoDataSize);
            d.presentation.push_back(record.videoPresentationTime);
            d.timescale.push_back(record.videoTimescale);
            record.videoBufferManager->disposeVideoMedia(record.videoData, record.videoDataSize,
                                                         record.videoMediaDisposeRefCon2);
        }
        if (AudioBufferList* list = record.audioBufferList) {
            // The list goes with the last keeper: take the pointers first.
            std::vector<AudioBuffer> buffers(list->mBuffers, list->mBuffers + list->mNumberBuffers);
            if (d.channels.size() < buffers.size()) d.channels.resize(buffers.size());
            for (size_t i = 0; i < buffers.size(); ++i) {
                auto* p = static_cast<uint8_t*>(buffers[i].mData);
                if (p) d.channels[i].insert(d.channels[i].end(), p, p + buffers[i].mDataByteSize);
            }
            for (const AudioBuffer& b : buffers)
                if (b.mData)
                    record.audioBufferManager->disposeAudioMedia(static_cast<uint8_t*>(b.mData), b.mDataByteSize,
                                                                 nullptr);
        }
        if (status != 0 && d.status == 0) d.status = status;
        if (status != 0) d.statuses.push_back(status);
        if (record.endOfMedia) {
            d.ended = true;
            break;
        }
        if (status != 0 && stopOnError) break;
    }
    return d;
}

inline ClipEssence essenceOf(const WrittenClip& written, SkarnClip* clip, uint64_t frames) {
    const CardFamily* family = cardFamilyNamed(written.family);
    return family && family->avclip ? avclipEssence(written) : clipXMLEssence(clip, frames);
}

inline Ref<SkarnIngestObject> initializedIngest(SkarnClip* clip, bool keepMediaRate = false) {
    Ref<SkarnIngestObject> ingest = SkarnIngestObject::initWithClip(clip);
    if (keepMediaRate) ingest->setKeepMediaVideoRate(true, nullptr);
    EXPECT_EQ(ingest->initialize(nullptr), 0);
    EXPECT_EQ(ingest->start(nullptr), 0);
    return ingest;
}

constexpr bool kDiagnosticLog =
#if defined(SKARN_DIAGNOSTIC_LOG) && SKARN_DIAGNOSTIC_LOG
    true;
#else
    false;
#endif

}  // namespace ingest_test
