// Cross-check with an independent MXF demuxer: ffprobe must open the card
// writer's self-contained clips and find the same video packets, at the same
// places, in the same presentation order as mxfDataObject.
#include "mxfDataObject.h"

#include "AVClipWriter.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <sstream>

namespace {
bool haveFFprobe() { return runCommand("command -v ffprobe >/dev/null 2>&1") == 0; }

struct Packet {
    int64_t pts, pos;
    uint32_t size;
};

// Video packets in file (decode) order.
std::vector<Packet> ffprobePackets(const std::string& path) {
    std::string out;
    int status = runCommand("ffprobe -v fatal -select_streams v:0 -show_entries packet=pts,pos,size -of csv=p=0 '" +
                                path + "'",
                            &out);
    EXPECT_EQ(status, 0);
    std::vector<Packet> packets;
    std::istringstream lines(out);
    std::string line;
    while (std::getline(lines, line)) {
        Packet p{};
        char c1, c2;
        std::istringstream fields(line);
        fields >> p.pts >> c1 >> p.size >> c2 >> p.pos;
        if (fields) packets.push_back(p);
    }
    return packets;
}
}  // namespace

TEST(MXFAgainstFFprobe, VideoPacketsMatchTheIndexRecords) {
    if (!haveFFprobe()) GTEST_SKIP() << "ffprobe is not on PATH";
    TempDir dir;
    for (auto coding : {AVClipSpec::Coding::AVCIntra, AVClipSpec::Coding::AVCLongGOP}) {
        AVClipSpec spec;
        spec.coding = coding;
        spec.frames = 95;
        spec.framesPerChunk = 20;
        spec.audioChannels = 4;
        spec.frameBytes = 3000;
        spec.clipXML = "<SkarnClip/>";
        const std::string path = dir / (coding == AVClipSpec::Coding::AVCIntra ? "intra.mxf" : "gop.mxf");
        std::string error;
        ASSERT_TRUE(writeAVClip(path, spec, &error)) << error;

        std::vector<Packet> packets = ffprobePackets(path);
        Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(path);
        uint32_t frames = 0;
        mxf->getVideoFrameCount(&frames);
        ASSERT_EQ(packets.size(), frames) << path;
        for (size_t k = 0; k < packets.size(); ++k) {
            Ref<mxfEssenseOffsets> r = mxf->getVideoOffsetForDTS(int64_t(k));
            ASSERT_TRUE(r);
            // ffprobe places a packet at its element's key; the record at its value.
            EXPECT_EQ(packets[k].pos + 20, r->offset()) << path << " frame " << k;
            EXPECT_EQ(packets[k].size, r->size()) << path << " frame " << k;
            EXPECT_EQ(packets[k].pts, int64_t(r->presentationOrder())) << path << " frame " << k;
        }
    }
}
