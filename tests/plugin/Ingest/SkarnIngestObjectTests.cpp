#include "H264Reference.h"
#include "IngestTestSupport.h"

#include <gtest/gtest.h>

using namespace ingest_test;

namespace {

void expectSameBytes(const std::vector<std::vector<uint8_t>>& got, const std::vector<std::vector<uint8_t>>& want,
                     const char* what) {
    ASSERT_EQ(got.size(), want.size()) << what;
    for (size_t i = 0; i < got.size(); ++i) {
        ASSERT_EQ(got[i].size(), want[i].size()) << what << " " << i;
        EXPECT_TRUE(got[i] == want[i]) << what << " " << i;
    }
}

// ---------------------------------------------------------------------------
// End to end: every family the card writer makes

class IngestEveryFamily : public ::testing::TestWithParam<std::string> {};

TEST_P(IngestEveryFamily, DeliversEveryFrameAndEveryChannelAsTheEssenceHoldsIt) {
    TempDir dir;
    ClipSpec spec = clipOf(GetParam(), 30);
    WrittenClip written = writeOne(dir, spec);
    Ref<SkarnClip> clip = SkarnClip::initWithSkarnClip(written.clipPath);
    ASSERT_TRUE(clip);
    ClipEssence expected = essenceOf(written, clip.get(), spec.frames);
    ASSERT_EQ(expected.frames.size(), spec.frames);
    ASSERT_EQ(expected.channels.size(), spec.audioChannels);

    Ref<SkarnIngestObject> ingest = initializedIngest(clip.get());
    Delivery d = ingestAll(*ingest);
    EXPECT_EQ(d.status, 0);
    EXPECT_TRUE(d.ended);
    if (clip->videoFormat() == 4) {
        // AVC-Strand 4:2:0 goes out with length prefixes instead of start codes.
        for (auto& frame : expected.frames) {
            const uint8_t* sets[8] = {};
            uint64_t sizes[8] = {};
            uint32_t count = 0;
            referenceReplaceStartCodes(frame, sets, sizes, &count);
        }
    }
    expectSameBytes(d.frames, expected.frames, "frame");
    expectSameBytes(d.channels, expected.channels, "channel");
    // Everything handed out was given back.
    EXPECT_EQ(ingest->bufferManager()->videoBufferCount(), 0u);
    EXPECT_EQ(ingest->bufferManager()->audioBufferCount(), 0u);
}

std::vector<std::string> familyNames() {
    std::vector<std::string> names;
    for (const auto& f : cardFamilies()) names.push_back(f.name);
    return names;
}

INSTANTIATE_TEST_SUITE_P(Cards, IngestEveryFamily, ::testing::ValuesIn(familyNames()), [](const auto& info) {
    std::string n = info.param;
    for (char& c : n)
        if (c == '-') c = '_';
    return n;
});

}  // namespace
