// Cards, clips and captures shared by the format reader tests.
#pragma once

#include "AVClipWriter.h"
#include "AssertionHandler.h"
#include "CardWriter.h"
#include "LogSink.h"
#include "SkarnClip.h"
#include "SkarnFormatReader.h"
#include "SkarnSampleCursor.h"
#include "SkarnTrackReader.h"
#include "TestCaptures.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <mutex>
#include <string>
#include <vector>

namespace frtest {

#if defined(SKARN_DIAGNOSTIC_LOG) && SKARN_DIAGNOSTIC_LOG
inline constexpr bool kLogging = true;
#else
inline constexpr bool kLogging = false;
#endif

// Log lines only exist in the diagnostic build; tests of their texts skip elsewhere.
#define FR_REQUIRE_LOG()                                                             \
    do {                                                                             \
        if (!::frtest::kLogging) GTEST_SKIP() << "needs -DSKARN_DIAGNOSTIC_LOG=ON";  \
    } while (0)

// Checks on log lines, made only where there are log lines.
#define LOG_EXPECT_TRUE(cond)                        \
    do {                                             \
        if (::frtest::kLogging) { EXPECT_TRUE(cond); } \
    } while (0)
#define LOG_EXPECT_FALSE(cond)                        \
    do {                                              \
        if (::frtest::kLogging) { EXPECT_FALSE(cond); } \
    } while (0)

// The expression text a hard assertion reports, or "" when none fired.
template <class F>
std::string hardAssertionText(F&& f) {
    AssertionCapture capture;
    try {
        f();
    } catch (const HardAssertionFailure& failure) {
        return failure.expression;
    }
    return "";
}

inline std::string readText(const std::string& path) {
    std::ifstream f(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(f), {});
}

inline void replaceInFile(const std::string& path, const std::string& from, const std::string& to) {
    std::string text = readText(path);
    auto at = text.find(from);
    ASSERT_NE(at, std::string::npos) << from << " not in " << path;
    text.replace(at, from.size(), to);
    writeTextFile(path, text);
}

// Bytes [offset, offset + length) of a file.
inline std::vector<uint8_t> readRange(const std::string& path, int64_t offset, int64_t length) {
    std::ifstream f(path, std::ios::binary);
    f.seekg(offset);
    std::vector<uint8_t> bytes(static_cast<size_t>(length), 0);
    f.read(reinterpret_cast<char*>(bytes.data()), length);
    bytes.resize(size_t(f.gcount()));
    return bytes;
}

class CardTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { SkarnClip::setDefaultBundle(Bundle::bundleWithPath(buildDir() + "/Skarn.kilnplugin")); }

    static ClipSpec clipOf(const char* family, uint64_t frames = 12, uint32_t channels = 2) {
        ClipSpec c = defaultClip(*cardFamilyNamed(family), 1);
        c.frames = frames;
        c.audioChannels = channels;
        c.icon = false;
        c.metadata = {};
        return c;
    }
    // Writes one clip on a card of its own; answers what was written.
    WrittenClip write(const ClipSpec& clip, std::string root = "") {
        if (root.empty()) root = "CARD" + std::to_string(++_cards);
        CardSpec card;
        card.root = dir / root;
        card.clips = {clip};
        std::vector<WrittenClip> written;
        std::string error;
        EXPECT_TRUE(writeCard(card, &written, &error)) << error;
        return written.empty() ? WrittenClip{} : written.front();
    }
    // A self-contained clip written directly, with its chunking and GOP chosen.
    std::string writeAVClipFile(AVClipSpec shape, const std::string& name = "A001", AVClipLayout* layout = nullptr,
                                const char* family = "avclip-intra") {
        ClipSpec clip = clipOf(family, shape.frames, shape.audioChannels);
        clip.name = name;
        clip.bitsPerSample = shape.bitsPerSample;
        clip.startTimecode = "00:00:00:00";
        if (shape.clipXML.empty()) shape.clipXML = avclipHeaderXMLText(clip);
        std::string folder = dir / "AVCARD/CONTENTS/AVCLIP";
        makeDirs(folder);
        for (const char* f : {"CLIP", "VIDEO", "AUDIO"}) makeDirs(dir / (std::string("AVCARD/CONTENTS/") + f));
        std::string path = folder + "/" + name + ".MXF";
        std::string error;
        EXPECT_TRUE(writeAVClip(path, shape, &error, layout)) << error;
        return path;
    }
    static Ref<SkarnClip> load(const std::string& path) { return SkarnClip::initWithSkarnClip(path); }
    static Ref<SkarnFormatReader> readerFor(const Ref<SkarnClip>& clip, bool feed = false, bool keep = false) {
        return clip ? SkarnFormatReader::formatReaderWithClip(clip.get(), feed, keep) : nullptr;
    }
    Ref<SkarnFormatReader> readerFor(const ClipSpec& shape, bool feed = false, bool keep = false) {
        _clip = load(write(shape).clipPath);
        return readerFor(_clip, feed, keep);
    }

    TempDir dir;
    Ref<SkarnClip> _clip;
    unsigned _cards = 0;
};

inline SkarnTrackReader* track(const Ref<SkarnFormatReader>& reader, size_t index) {
    auto tracks = reader->trackList();
    return index < tracks.size() ? tracks[index].get() : nullptr;
}

inline Ref<SkarnSampleCursor> cursorAt(SkarnTrackReader* track, CMTime pts, bool* before = nullptr,
                                       bool* after = nullptr) {
    return SkarnSampleCursor::sampleCursorWithTrackReader(track, pts, before, after);
}

struct Location {
    int64_t count = -7, offset = -7, length = -7;
};
inline Location locate(SkarnSampleCursor* cursor) {
    Location l;
    cursor->sampleLocationWithArraySizes(1, &l.count, &l.offset, &l.length, nullptr);
    return l;
}

struct Chunk {
    int64_t offset = -7, size = -7, count = -7, index = -7;
    bool sameSize = false, sameDuration = false, sameFormat = false;
};
inline Chunk chunkOf(SkarnSampleCursor* cursor) {
    Chunk c;
    cursor->chunkDetails(nullptr, &c.offset, &c.size, &c.count, &c.index, &c.sameSize, &c.sameDuration, &c.sameFormat);
    return c;
}

}  // namespace frtest
