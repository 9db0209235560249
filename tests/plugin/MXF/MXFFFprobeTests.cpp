// Cross-check with an independent MXF demuxer: ffprobe must open the card
// writer's self-contained clips and find the same video packets, at the same
// places, in the same presentation order as mxfDataObject, and must tie every
// audio and ancillary element to a stream of its own.
#include "mxfDataObject.h"

#include "AVClipWriter.h"
#include "MXFFileByteSource.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <fcntl.h>
#include <sstream>

namespace {
bool haveFFprobe() { return runCommand("command -v ffprobe >/dev/null 2>&1") == 0; }

struct Packet {
    int64_t pts, pos;
    uint32_t size;
};

// Packets of `stream` (v:0, a:1, ...) in file order: pts (video only), size
// and position.
std::vector<Packet> ffprobePackets(const std::string& path, const std::string& stream = "v:0") {
    const bool video = stream[0] == 'v';
    std::string out;
    int status = runCommand("ffprobe -v fatal -select_streams " + stream + " -show_entries packet=" +
                                (video ? "pts," : "") + "pos,size -of csv=p=0 '" + path + "'",
                            &out);
    EXPECT_EQ(status, 0);
    std::vector<Packet> packets;
    std::istringstream lines(out);
    std::string line;
    while (std::getline(lines, line)) {
        Packet p{};
        char c1, c2;
        std::istringstream fields(line);
        if (video) fields >> p.pts >> c1;
        fields >> p.size >> c2 >> p.pos;
        if (fields) packets.push_back(p);
    }
    return packets;
}

// The file's KLVs as the plug-in reads them.
MXFKLVReader klvReader(const std::string& path) {
    Ref<MXFFileByteSource> file = MXFFileByteSource::initWithDescriptor(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    EXPECT_TRUE(file) << path;
    return MXFKLVReader(file);
}

AVClipSpec clipSpec(AVClipSpec::Coding coding, uint32_t channels) {
    AVClipSpec params;
    params.coding = coding;
    params.frames = 95;
    params.framesPerChunk = 20;
    params.audioChannels = channels;
    params.frameBytes = 3000;
    params.clipXML = "<SkarnClip/>";
    return params;
}

struct Stream {
    std::string type;
    int64_t packets = 0;
};

// Every stream with its packet count; `diagnostics` gets what ffprobe printed
// at error level (an element the demuxer cannot tie to a stream is reported
// there, and so are pictures the decoder finds damaged while probing).
std::vector<Stream> ffprobeStreams(const std::string& path, std::string* diagnostics) {
    std::string out;
    int status = runCommand("ffprobe -v error -count_packets -show_entries stream=codec_type,nb_read_packets "
                            "-of csv=p=0 '" + path + "' 2>&1",
                            &out);
    EXPECT_EQ(status, 0);
    std::vector<Stream> streams;
    std::istringstream lines(out);
    std::string line;
    while (std::getline(lines, line)) {
        const size_t comma = line.find(',');
        const std::string type = line.substr(0, comma);
        if (comma != std::string::npos && (type == "video" || type == "audio" || type == "data")) {
            streams.push_back({type, std::atoll(line.c_str() + comma + 1)});
        } else {
            *diagnostics += line + "\n";
        }
    }
    return streams;
}

}  // namespace

TEST(MXFAgainstFFprobe, VideoPacketsMatchTheIndexRecords) {
    if (!haveFFprobe()) GTEST_SKIP() << "ffprobe is not on PATH";
    TempDir dir;
    for (auto coding : {AVClipSpec::Coding::AVCIntra, AVClipSpec::Coding::AVCLongGOP}) {
        AVClipSpec params = clipSpec(coding, 4);
        const std::string path = dir / (coding == AVClipSpec::Coding::AVCIntra ? "intra.mxf" : "gop.mxf");
        std::string error;
        ASSERT_TRUE(writeAVClip(path, params, &error)) << error;

        std::vector<Packet> packets = ffprobePackets(path);
        Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(path);
        MXFKLVReader klvs = klvReader(path);
        uint32_t frames = 0;
        mxf->getVideoFrameCount(&frames);
        ASSERT_EQ(packets.size(), frames) << path;
        for (size_t k = 0; k < packets.size(); ++k) {
            Ref<mxfEssenseOffsets> r = mxf->getVideoOffsetForDTS(int64_t(k));
            ASSERT_TRUE(r);
            // ffprobe places a packet at its element's key; the record at its value.
            EXPECT_EQ(klvs.readKLV(uint64_t(packets[k].pos)).valueOffset(), uint64_t(r->offset()))
                << path << " frame " << k;
            EXPECT_EQ(packets[k].size, r->size()) << path << " frame " << k;
            EXPECT_EQ(packets[k].pts, int64_t(r->presentationOrder())) << path << " frame " << k;
        }
    }
}

// Each audio channel and the ancillary data lie in body partitions of their
// own BodySID; the header must tie each to a track for a demuxer to find them.
// Presentation times of the audio are not compared: the card's audio index
// counts samples only, without the element's key and length, so a demuxer
// placing samples by that index lands a few samples off in each chunk.
TEST(MXFAgainstFFprobe, AudioAndAncillaryElementsMapToStreams) {
    if (!haveFFprobe()) GTEST_SKIP() << "ffprobe is not on PATH";
    TempDir dir;
    struct Case {
        AVClipSpec::Coding coding;
        uint32_t channels, bits;
    } cases[] = {{AVClipSpec::Coding::AVCIntra, 4, 24}, {AVClipSpec::Coding::AVCLongGOP, 2, 16},
                 {AVClipSpec::Coding::AVCLongGOP, 8, 24}};
    for (const auto& c : cases) {
        AVClipSpec params = clipSpec(c.coding, c.channels);
        params.bitsPerSample = c.bits;
        const std::string path = dir / ("clip" + std::to_string(c.channels) + ".mxf");
        std::string error;
        AVClipLayout layout;
        ASSERT_TRUE(writeAVClip(path, params, &error, &layout)) << error;

        std::string diagnostics;
        std::vector<Stream> streams = ffprobeStreams(path, &diagnostics);
        EXPECT_EQ(diagnostics, "") << path;
        ASSERT_EQ(streams.size(), 2u + c.channels) << path;
        EXPECT_EQ(streams[0].type, "video");
        EXPECT_EQ(streams[0].packets, 95);
        EXPECT_EQ(streams[1].type, "data");
        EXPECT_EQ(streams[1].packets, 95);
        for (uint32_t ch = 0; ch < c.channels; ++ch) {
            EXPECT_EQ(streams[2 + ch].type, "audio") << path << " channel " << ch;
            // One element per chunk.
            EXPECT_EQ(streams[2 + ch].packets, int64_t(layout.chunks.size())) << path << " channel " << ch;
        }

        // The packets are the chunks' sound elements, as the plug-in's reader finds them.
        Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(path);
        MXFKLVReader klvs = klvReader(path);
        EXPECT_EQ(mxf->getAudioChannelCount(), c.channels);
        for (uint32_t ch : {0u, c.channels - 1}) {
            std::vector<Packet> packets = ffprobePackets(path, "a:" + std::to_string(ch));
            ASSERT_EQ(packets.size(), layout.chunks.size()) << path << " channel " << ch;
            uint64_t samples = 0;
            for (size_t k = 0; k < packets.size(); ++k) {
                const auto& chunk = layout.chunks[k];
                Ref<mxfEssenseOffsets> a = mxf->getAudioOffsetForChannel(ch, chunk.firstSample);
                ASSERT_TRUE(a) << path << " chunk " << k;
                EXPECT_EQ(klvs.readKLV(uint64_t(packets[k].pos)).valueOffset(), uint64_t(a->offset()))
                    << path << " chunk " << k;
                EXPECT_EQ(packets[k].size, chunk.sampleCount * (c.bits / 8)) << path << " chunk " << k;
                samples += packets[k].size / (c.bits / 8);
            }
            EXPECT_EQ(samples, layout.audioSamples) << path << " channel " << ch;
        }
    }
}
