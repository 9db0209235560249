// skarn-mxfdump: shows what the plug-in's MXF reader learns from a
// self-contained clip file: header facts, the chunk list from the random index
// pack, and per chunk every video frame and audio block the index tables give.
#include "AssertionHandler.h"
#include "mxfDataObject.h"

#include "Value.h"

#include <CLI/CLI.hpp>
#include "ValueJSON.h"

#include <nlohmann/json.hpp>

#include <cstdio>
#include <fcntl.h>
#include <iostream>
#include <unistd.h>

namespace {

// Soft reports are findings about the file, not reasons to stop.
class WarningHandler : public AssertionHandler {
public:
    void handleFailureInMethod(const std::string& method, const std::string&, int,
                               const std::string& description) override {
        std::string text = description;
        while (!text.empty() && text.back() == '\n') text.pop_back();
        warnings.push_back(method + ": " + text);
    }
    void handleFailureInFunction(const std::string& function, const std::string& file, int line,
                                 const std::string& description) override {
        handleFailureInMethod(function, file, line, description);
    }
    std::vector<std::string> warnings;
};

const char* pictureLabel(uint8_t type) {
    static const char* labels[8] = {"I", "BAD", "BAD", "B", "IDR", "BAD", "P", "Br"};
    return labels[type & 7];
}

nlohmann::ordered_json frameJSON(const mxfEssenseOffsets& f) {
    nlohmann::ordered_json j;
    j["dts"] = f.decodeOrder();
    j["pts"] = f.presentationOrder();
    j["offset"] = f.offset();
    j["size"] = f.size();
    j["type"] = pictureLabel(f.avcPictureType());
    j["flags"] = f.mediaSampleFlags();
    j["temporalOffsetIndexed"] = f.temporalOffsetIndexed();
    return j;
}

}  // namespace

int main(int argc, char** argv) {
    CLI::App app{"Shows the header facts, chunks and per-frame index records of a Skarn self-contained MXF clip."};
    std::string path;
    bool json = false;
    app.add_option("FILE", path, "the clip's MXF file")->required();
    app.add_flag("--json", json, "print one JSON document instead of text");
    CLI11_PARSE(app, argc, argv);

    int probe = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (probe < 0) {
        std::fprintf(stderr, "skarn-mxfdump: %s: cannot open: %s\n", path.c_str(), std::strerror(errno));
        return 1;
    }
    ::close(probe);

    WarningHandler warnings;
    ScopedAssertionHandler scoped(&warnings);
    setHardAssertionFailureHandler(throwingHardAssertionFailureHandler);

    nlohmann::ordered_json doc;
    try {
        Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(path);
        uint64_t chunkSize = 0, dataLength = 0;
        mxf->getAudioChunkSize(&chunkSize, &dataLength);
        uint32_t frameCount = 0;
        mxf->getVideoFrameCount(&frameCount);
        doc["file"] = path;
        doc["footerPartition"] = mxf->footerPartitionOffset();
        doc["videoFrames"] = frameCount;
        doc["audioChannels"] = mxf->getAudioChannelCount();
        doc["audioSamplingRate"] = mxf->audioSamplingRate();
        doc["audioBytesPerSample"] = mxf->audioBytesPerSample();
        doc["audioSamples"] = mxf->expectedAudioSampleArraySize();
        doc["audioChunkSize"] = chunkSize;
        doc["audioDataLength"] = dataLength;
        doc["chunks"] = nlohmann::ordered_json::array();

        if (!json) {
            std::printf("%s\n", path.c_str());
            std::printf("  footer partition   0x%llx\n", (unsigned long long)mxf->footerPartitionOffset());
            std::printf("  video frames       %u\n", frameCount);
            std::printf("  audio              %u channel(s), %u Hz, %u bytes per sample, %llu samples\n",
                        mxf->getAudioChannelCount(), mxf->audioSamplingRate(), mxf->audioBytesPerSample(),
                        (unsigned long long)mxf->expectedAudioSampleArraySize());
            std::printf("  audio chunk size   %llu bytes, data length %llu bytes\n", (unsigned long long)chunkSize,
                        (unsigned long long)dataLength);
            std::printf("  chunks             %zu\n", mxf->chunkCount());
        }
        // The first chunk first: it fixes the frames per chunk for all others.
        for (size_t i = 0; i < mxf->chunkCount(); ++i) {
            mxf->scanMXFForRIPIndex(0);
            mxf->scanMXFForRIPIndex(i);
            Ref<mxfRIPPacketOffsets> chunk = mxf->chunkAtIndex(i);
            nlohmann::ordered_json jc;
            jc["index"] = chunk->ripChunkIndex();
            jc["videoPartition"] = chunk->getVideoIndexTableOffset()->EssenseBPPOffset();
            jc["videoIndexPartition"] = chunk->getVideoIndexTableOffset()->IndexTableBPPOffset();
            jc["frames"] = nlohmann::ordered_json::array();
            if (!json) std::printf("\n%s\n", chunk->description().c_str());
            for (const auto& f : chunk->getVideoOffsets()) {
                if (json)
                    jc["frames"].push_back(frameJSON(*f));
                else
                    std::printf("  V %s\n", f->description().c_str());
            }
            jc["audio"] = nlohmann::ordered_json::array();
            for (size_t c = 0; c < chunk->getAudioIndexTableOffsets().size(); ++c) {
                Ref<mxfEssenseOffsets> a = chunk->getAudioOffsetsForChannel(c);
                if (!a) continue;
                if (json) {
                    nlohmann::ordered_json ja;
                    ja["channel"] = c;
                    ja["offset"] = a->offset();
                    ja["size"] = a->size();
                    ja["firstSample"] = a->presentationOrder();
                    jc["audio"].push_back(ja);
                } else {
                    std::printf("  A%zu offset:%llx size:%u first sample:%u\n", c, (unsigned long long)a->offset(),
                                a->size(), a->presentationOrder());
                }
            }
            if (json) doc["chunks"].push_back(jc);
        }
        for (const auto& w : warnings.warnings) std::fprintf(stderr, "skarn-mxfdump: %s: warning: %s\n", path.c_str(), w.c_str());
        if (json) std::cout << jsonText(doc, 2) << "\n";
        if (mxf->chunkCount() == 0) {
            std::fprintf(stderr, "skarn-mxfdump: %s: no chunks (no random index pack after the footer partition)\n",
                         path.c_str());
            return 1;
        }
    } catch (const HardAssertionFailure& failure) {
        std::fflush(stdout);
        std::fprintf(stderr, "skarn-mxfdump: %s: malformed: check (%s) failed\n", path.c_str(),
                     failure.expression.c_str());
        return 2;
    } catch (const std::exception& e) {
        std::fflush(stdout);
        std::fprintf(stderr, "skarn-mxfdump: %s: %s\n", path.c_str(), e.what());
        return 2;
    }
    return 0;
}
