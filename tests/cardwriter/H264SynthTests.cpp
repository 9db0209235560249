#include "H264Synth.h"

#include "AVClipWriter.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

namespace {
bool haveFFmpeg() { return runCommand("command -v ffmpeg >/dev/null 2>&1") == 0; }

// Decodes every video frame with errors made fatal; answers what ffmpeg printed
// at error level (empty when clean) and the decoded frame count.
std::string decodeErrors(const std::string& input, int* frames) {
    std::string out;
    int status = runCommand("ffmpeg -nostdin -v error -xerror -i '" + input +
                                "' -map 0:v -f framemd5 - 2>&1",
                            &out);
    *frames = 0;
    std::string errors;
    size_t at = 0;
    while (at < out.size()) {
        size_t end = out.find('\n', at);
        if (end == std::string::npos) end = out.size();
        std::string line = out.substr(at, end - at);
        if (line.rfind("0,", 0) == 0) ++*frames;
        else if (!line.empty() && line[0] != '#') errors += line + "\n";
        at = end + 1;
    }
    if (status != 0) errors += "exit status " + std::to_string(status) + "\n";
    return errors;
}

std::vector<uint8_t> accessUnit(uint32_t width, uint32_t height, H264SynthParams::Picture picture, uint32_t frameNum,
                                uint32_t poc, size_t size) {
    H264SynthParams p;
    p.width = width;
    p.height = height;
    p.picture = picture;
    p.idr = frameNum == 0;
    p.parameterSets = picture == H264SynthParams::Picture::I;
    p.frameNum = frameNum;
    p.pocLsb = poc;
    return makeH264AccessUnit(p, size);
}
}  // namespace

// Card frames are often smaller than a picture coded one byte per block; a
// writer cutting the access unit to the frame size leaves a damaged picture.
TEST(H264Synth, IntraPictureFitsSmallFramesAndIsPaddedExactly) {
    for (auto [w, h] : {std::pair{1920u, 1080u}, {1280u, 720u}, {4096u, 2160u}}) {
        std::vector<uint8_t> natural = accessUnit(w, h, H264SynthParams::Picture::I, 0, 0, 0);
        // A fraction of a bit per block: under a byte for every four.
        EXPECT_LT(natural.size(), (w / 16) * (h / 16) / 4 + 100) << w << "x" << h;
        RecordProperty(std::to_string(w) + "x" + std::to_string(h), std::to_string(natural.size()));
        for (size_t size : {natural.size() + 6, size_t(2048), size_t(100000)}) {
            std::vector<uint8_t> au = accessUnit(w, h, H264SynthParams::Picture::I, 0, 0, size);
            ASSERT_EQ(au.size(), size) << w << "x" << h;
            EXPECT_TRUE(std::equal(natural.begin(), natural.end(), au.begin()));
            // The filler NAL unit: start code, type 12, 0xFF bytes, stop bit.
            EXPECT_EQ(au[natural.size() + 4], 0x0c);
            EXPECT_EQ(au.back(), 0x80);
        }
    }
    // P and B pictures are all skipped blocks: a few bytes whatever the raster.
    EXPECT_LT(accessUnit(4096, 2160, H264SynthParams::Picture::P, 1, 2, 0).size(), 40u);
    EXPECT_LT(accessUnit(4096, 2160, H264SynthParams::Picture::B, 2, 4, 0).size(), 40u);
}

// A raw stream of I P B B P B B pictures, at rasters with and without cropping,
// decoded with errors made fatal.
TEST(H264Synth, RawStreamDecodesWithoutErrors) {
    if (!haveFFmpeg()) GTEST_SKIP() << "ffmpeg is not on PATH";
    TempDir dir;
    using Picture = H264SynthParams::Picture;
    for (auto [w, h] : {std::pair{1920u, 1080u}, {1280u, 720u}, {720u, 486u}}) {
        std::vector<uint8_t> stream;
        auto add = [&](const std::vector<uint8_t>& au) { stream.insert(stream.end(), au.begin(), au.end()); };
        // Decode order I0 P3 B1 B2 P6 B4 B5 with frame_num counting reference pictures.
        add(accessUnit(w, h, Picture::I, 0, 0, 3000));
        add(accessUnit(w, h, Picture::P, 1, 6, 1500));
        add(accessUnit(w, h, Picture::B, 2, 2, 700));
        add(accessUnit(w, h, Picture::B, 2, 4, 0));
        add(accessUnit(w, h, Picture::P, 2, 12, 1500));
        add(accessUnit(w, h, Picture::B, 3, 8, 700));
        add(accessUnit(w, h, Picture::B, 3, 10, 700));
        const std::string path = dir / (std::to_string(w) + "x" + std::to_string(h) + ".264");
        writeBytes(path, stream);
        int frames = 0;
        EXPECT_EQ(decodeErrors(path, &frames), "") << path;
        EXPECT_EQ(frames, 7) << path;
    }
}

// Self-contained clips with frames smaller than an uncompressed-looking intra
// picture (intra only, and long GOP), decoded from the MXF file.
TEST(H264Synth, SmallGeneratedClipsDecodeWithoutErrors) {
    if (!haveFFmpeg()) GTEST_SKIP() << "ffmpeg is not on PATH";
    TempDir dir;
    struct Case {
        AVClipSpec::Coding coding;
        uint64_t frames;
        uint32_t frameBytes;
    } cases[] = {{AVClipSpec::Coding::AVCIntra, 5, 4096}, {AVClipSpec::Coding::AVCLongGOP, 40, 3000}};
    for (const auto& c : cases) {
        AVClipSpec params;
        params.coding = c.coding;
        params.frames = c.frames;
        params.framesPerChunk = 20;
        params.frameBytes = c.frameBytes;
        params.clipXML = "<SkarnClip/>";
        const std::string path = dir / (c.coding == AVClipSpec::Coding::AVCIntra ? "intra.mxf" : "gop.mxf");
        std::string error;
        ASSERT_TRUE(writeAVClip(path, params, &error)) << error;
        int frames = 0;
        EXPECT_EQ(decodeErrors(path, &frames), "") << path;
        EXPECT_EQ(frames, int(c.frames)) << path;
    }
}
