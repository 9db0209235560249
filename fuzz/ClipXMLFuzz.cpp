// SkarnClip over arbitrary clip XML: construction and every property the clip
// answers by name must end in a value, nil or one of the plug-in's assertions
// (installed here to throw or be recorded), never in a stray access, a hang or
// a huge allocation.
//
// The input is taken as the whole CONTENTS/CLIP XML file of one clip on a card
// written once per process, so the XML meets real DV essence, audio MXF files,
// an icon and folder listings. Seeds: fuzz/corpus/ClipXMLFuzz (clip XML of
// several card families).
#include "FuzzSupport.h"
#include "CardWriter.h"
#include "SkarnClip.h"

#include <cstdio>
#include <cstdlib>
#include <string>
#include <unistd.h>

namespace {

// Every key SkarnClip answers through valueForKey (deleteClip and the other
// operations are left out: they change the card or need arguments).
const char* const kKeys[] = {
    "videoFormat", "isMXFOp1bFormat", "isAVCI", "sourceFormat", "sourceFormatName", "decodePixelFormat", "format",
    "displayFormat", "videoHeight", "videoWidth", "aspectRatio", "anamorphic", "videoBitrate", "clipID", "path",
    "name", "videoDataSize", "dataSize", "startByteOffset", "sampleRate", "bitsPerSample", "numberOfAudioChannels",
    "shouldRemoveDuplicateFramesAndPulldown", "frameRate", "transportRate", "shootingRate", "pulldown",
    "timecodeFormat", "isDropFrame", "__mediaStart", "mediaStart", "mediaDuration",
    "corvane_Skarn_startBinaryGroup", "corvane_Skarn_userClipName", "corvane_Skarn_dataSource",
    "corvane_Skarn_lastChangedBy", "corvane_Skarn_shooter", "corvane_Skarn_shootingAltitude",
    "corvane_Skarn_shootingLongitude", "corvane_Skarn_shootingLatitude", "corvane_Skarn_shootingLocationSource",
    "corvane_Skarn_shootingLocationName", "corvane_Skarn_programName", "corvane_Skarn_reporter",
    "corvane_Skarn_purpose", "corvane_Skarn_object", "scene", "shot", "creator", "deviceManufacturer",
    "deviceSerialNumber", "deviceModelName", "corvane_Skarn_shotMark", "isGood", "corvane_Skarn_memo_text",
    "corvane_Skarn_memo_person", "creationDate", "creationDateTimeZone", "creationDateString", "lastChangeDate",
    "lastChangeDateTimeZone", "lastChangeDateString", "corvane_Skarn_shootingStartDate",
    "corvane_Skarn_shootingStartDateString", "corvane_Skarn_shootingEndDate", "corvane_Skarn_shootingEndDateString",
    "reelName", "logNote", "clipDescription", "angle", "metadata", "extendedProperties", "videoFilePath",
    "audioFolderPath", "audioFilePaths", "iconFilePath", "proxyFilePath", "proxyBinFilePath", "voiceFilePath",
    "spannedClipID", "nextClipIDInSpannedClip", "previousClipIDInSpannedClip", "clipURLs", "ingestSourceFiles",
    "isDeletable", "useBuiltInFormatReader", "posterFrame", "previewMovie",
};

// The CLIP XML path of a one-clip DVCPRO50 card under a scratch folder.
std::string scratchClip() {
    std::string root = fuzzScratchPath("clipxml");
    std::system(("rm -rf '" + root + "'").c_str());
    CardSpec params;
    params.root = root;
    ClipSpec clip = defaultClip(*cardFamilyNamed("dvcpro50-ntsc"), 1);
    clip.frames = 2;
    clip.voice = true;
    params.clips.push_back(clip);
    std::vector<WrittenClip> written;
    std::string error;
    if (!writeCard(params, &written, &error) || written.empty()) {
        std::fprintf(stderr, "card: %s\n", error.c_str());
        std::abort();
    }
    return written.front().clipPath;
}

// Reads every leaf of a value. Value::description is not used on containers:
// its JSON form throws on text that is not UTF-8, which clip XML may carry
// (the parser does not check), and that is the describer's limit, not the clip's.
size_t touch(const Value& v) {
    if (v.isArray()) {
        size_t n = 0;
        for (const Value& e : v.arrayValue()) n += touch(e);
        return n;
    }
    if (v.isDictionary()) {
        size_t n = 0;
        for (const auto& [key, value] : v.dictionary()) n += key.size() + touch(value);
        return n;
    }
    return v.description().size();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzzThrowOnHardAssertions();
    static const std::string path = scratchClip();

    if (!fuzzWriteInput(path, data, size)) return 0;

    RecordingAssertionHandler recorder;
    ScopedAssertionHandler scoped(&recorder);
    try {
        Ref<SkarnClip> clip = SkarnClip::initWithSkarnClip(path);
        if (!clip) return 0;
        for (const char* key : kKeys)
            if (clip->respondsToSelector(key)) (void)touch(clip->valueForKey(key));
        for (uint32_t channel : {0u, 1u, 7u, 0xFFFFFFFFu}) (void)clip->dataSizeForAudioChannelIndex(channel);
        (void)clip->description();
    } catch (const HardAssertionFailure&) {
    }
    return 0;
}
