// SkarnClip's properties by name, for valueForKey and respondsToSelector: one
// table from selector name to accessor, which also drives the card metadata map
// (SkarnClipMetadata.cpp) and hosts that ask a clip for a property by its name.
#include "SkarnClip.h"

#include <unordered_map>
#include <unordered_set>

namespace {

using Getter = Value (*)(SkarnClip&);

Value strings(const std::optional<std::vector<std::string>>& v) {
    if (!v) return Value();
    Array a;
    for (const std::string& s : *v) a.push_back(Value(s));
    return Value(std::move(a));
}

const std::unordered_map<std::string_view, Getter>& propertyTable() {
    static const std::unordered_map<std::string_view, Getter> table = {
        // Format
        {"videoFormat", [](SkarnClip& c) { return Value(c.videoFormat()); }},
        {"isMXFOp1bFormat", [](SkarnClip& c) { return Value(c.isMXFOp1bFormat()); }},
        {"isAVCI", [](SkarnClip& c) { return Value(c.isAVCI()); }},
        {"sourceFormat", [](SkarnClip& c) { return Value(c.sourceFormat()); }},
        {"sourceFormatName", [](SkarnClip& c) { return Value(c.sourceFormatName()); }},
        {"decodePixelFormat", [](SkarnClip& c) { return Value(c.decodePixelFormat()); }},
        {"format", [](SkarnClip& c) { return Value(c.format()); }},
        {"displayFormat", [](SkarnClip& c) { return Value(c.displayFormat()); }},
        {"videoHeight", [](SkarnClip& c) { return Value(c.videoHeight()); }},
        {"videoWidth", [](SkarnClip& c) { return Value(c.videoWidth()); }},
        {"aspectRatio", [](SkarnClip& c) { return Value(c.aspectRatio()); }},
        {"anamorphic", [](SkarnClip& c) { return Value(c.anamorphic()); }},
        {"videoBitrate", [](SkarnClip& c) { return Value(c.videoBitrate()); }},
        {"clipID", [](SkarnClip& c) { return Value(c.clipID()); }},
        {"path", [](SkarnClip& c) { return Value(c.clipXMLPath()); }},
        {"name", [](SkarnClip& c) { return Value(c.name()); }},
        {"videoDataSize", [](SkarnClip& c) { return Value(c.videoDataSize()); }},
        {"dataSize", [](SkarnClip& c) { return Value(c.dataSize()); }},
        {"startByteOffset", [](SkarnClip& c) { return Value(c.startByteOffset()); }},
        {"sampleRate", [](SkarnClip& c) { return Value(c.sampleRate()); }},
        {"bitsPerSample", [](SkarnClip& c) { return Value(c.bitsPerSample()); }},
        {"numberOfAudioChannels", [](SkarnClip& c) { return Value(c.numberOfAudioChannels()); }},
        {"shouldRemoveDuplicateFramesAndPulldown",
         [](SkarnClip& c) { return Value(c.shouldRemoveDuplicateFramesAndPulldown()); }},
        // Timing
        {"frameRate", [](SkarnClip& c) { return Value(c.frameRate()); }},
        {"transportRate", [](SkarnClip& c) { return Value(c.transportRate()); }},
        {"shootingRate", [](SkarnClip& c) { return Value(c.shootingRate()); }},
        {"pulldown", [](SkarnClip& c) { return Value(c.pulldown()); }},
        {"timecodeFormat", [](SkarnClip& c) { return Value(c.timecodeFormat()); }},
        {"isDropFrame", [](SkarnClip& c) { return Value(c.isDropFrame()); }},
        {"__mediaStart", [](SkarnClip& c) { return Value(c.__mediaStart()); }},
        {"mediaStart", [](SkarnClip& c) { return c.mediaStart(); }},
        {"mediaDuration", [](SkarnClip& c) { return c.mediaDuration(); }},
        // Card metadata
        {"corvane_Skarn_startBinaryGroup", [](SkarnClip& c) { return Value(c.corvane_Skarn_startBinaryGroup()); }},
        {"corvane_Skarn_userClipName", [](SkarnClip& c) { return Value(c.corvane_Skarn_userClipName()); }},
        {"corvane_Skarn_dataSource", [](SkarnClip& c) { return Value(c.corvane_Skarn_dataSource()); }},
        {"corvane_Skarn_lastChangedBy", [](SkarnClip& c) { return Value(c.corvane_Skarn_lastChangedBy()); }},
        {"corvane_Skarn_shooter", [](SkarnClip& c) { return Value(c.corvane_Skarn_shooter()); }},
        {"corvane_Skarn_shootingAltitude", [](SkarnClip& c) { return Value(c.corvane_Skarn_shootingAltitude()); }},
        {"corvane_Skarn_shootingLongitude", [](SkarnClip& c) { return Value(c.corvane_Skarn_shootingLongitude()); }},
        {"corvane_Skarn_shootingLatitude", [](SkarnClip& c) { return Value(c.corvane_Skarn_shootingLatitude()); }},
        {"corvane_Skarn_shootingLocationSource",
         [](SkarnClip& c) { return Value(c.corvane_Skarn_shootingLocationSource()); }},
        {"corvane_Skarn_shootingLocationName",
         [](SkarnClip& c) { return Value(c.corvane_Skarn_shootingLocationName()); }},
        {"corvane_Skarn_programName", [](SkarnClip& c) { return Value(c.corvane_Skarn_programName()); }},
        {"corvane_Skarn_reporter", [](SkarnClip& c) { return Value(c.corvane_Skarn_reporter()); }},
        {"corvane_Skarn_purpose", [](SkarnClip& c) { return Value(c.corvane_Skarn_purpose()); }},
        {"corvane_Skarn_object", [](SkarnClip& c) { return Value(c.corvane_Skarn_object()); }},
        {"scene", [](SkarnClip& c) { return Value(c.scene()); }},
        {"shot", [](SkarnClip& c) { return Value(c.shot()); }},
        {"creator", [](SkarnClip& c) { return Value(c.creator()); }},
        {"deviceManufacturer", [](SkarnClip& c) { return Value(c.deviceManufacturer()); }},
        {"deviceSerialNumber", [](SkarnClip& c) { return Value(c.deviceSerialNumber()); }},
        {"deviceModelName", [](SkarnClip& c) { return Value(c.deviceModelName()); }},
        {"corvane_Skarn_shotMark", [](SkarnClip& c) { return Value(c.corvane_Skarn_shotMark()); }},
        {"isGood", [](SkarnClip& c) { return Value(c.isGood()); }},
        {"corvane_Skarn_memo_text", [](SkarnClip& c) { return Value(c.corvane_Skarn_memo_text()); }},
        {"corvane_Skarn_memo_person", [](SkarnClip& c) { return Value(c.corvane_Skarn_memo_person()); }},
        {"creationDate", [](SkarnClip& c) { return Value(c.creationDate()); }},
        {"creationDateTimeZone", [](SkarnClip& c) { return Value(c.creationDateTimeZone()); }},
        {"creationDateString", [](SkarnClip& c) { return Value(c.creationDateString()); }},
        {"lastChangeDate", [](SkarnClip& c) { return Value(c.lastChangeDate()); }},
        {"lastChangeDateTimeZone", [](SkarnClip& c) { return Value(c.lastChangeDateTimeZone()); }},
        {"lastChangeDateString", [](SkarnClip& c) { return Value(c.lastChangeDateString()); }},
        {"corvane_Skarn_shootingStartDate", [](SkarnClip& c) { return Value(c.corvane_Skarn_shootingStartDate()); }},
        {"corvane_Skarn_shootingStartDateString",
         [](SkarnClip& c) { return Value(c.corvane_Skarn_shootingStartDateString()); }},
        {"corvane_Skarn_shootingEndDate", [](SkarnClip& c) { return Value(c.corvane_Skarn_shootingEndDate()); }},
        {"corvane_Skarn_shootingEndDateString",
         [](SkarnClip& c) { return Value(c.corvane_Skarn_shootingEndDateString()); }},
        {"reelName", [](SkarnClip& c) { return Value(c.reelName()); }},
        {"logNote", [](SkarnClip& c) { return Value(c.logNote()); }},
        {"clipDescription", [](SkarnClip& c) { return Value(c.clipDescription()); }},
        {"angle", [](SkarnClip& c) { return Value(c.angle()); }},
        {"metadata", [](SkarnClip& c) { return c.metadata(); }},
        {"extendedProperties", [](SkarnClip& c) { return c.extendedProperties(); }},
        // Files
        {"videoFilePath", [](SkarnClip& c) { return Value(c.videoFilePath()); }},
        {"audioFolderPath", [](SkarnClip& c) { return Value(c.audioFolderPath()); }},
        {"audioFilePaths", [](SkarnClip& c) { return strings(c.audioFilePaths()); }},
        {"iconFilePath", [](SkarnClip& c) { return Value(c.iconFilePath()); }},
        {"proxyFilePath", [](SkarnClip& c) { return Value(c.proxyFilePath()); }},
        {"proxyBinFilePath", [](SkarnClip& c) { return Value(c.proxyBinFilePath()); }},
        {"voiceFilePath", [](SkarnClip& c) { return Value(c.voiceFilePath()); }},
        {"spannedClipID", [](SkarnClip& c) { return Value(c.spannedClipID()); }},
        {"nextClipIDInSpannedClip", [](SkarnClip& c) { return Value(c.nextClipIDInSpannedClip()); }},
        {"previousClipIDInSpannedClip", [](SkarnClip& c) { return Value(c.previousClipIDInSpannedClip()); }},
        {"clipURLs", [](SkarnClip& c) { return strings(c.clipURLs()); }},
        {"ingestSourceFiles", [](SkarnClip& c) { return c.ingestSourceFiles(); }},
        {"isDeletable", [](SkarnClip& c) { return Value(c.isDeletable()); }},
        {"useBuiltInFormatReader", [](SkarnClip& c) { return Value(c.useBuiltInFormatReader()); }},
        {"posterFrame", [](SkarnClip& c) { return Value(c.posterFrame()); }},
        {"previewMovie", [](SkarnClip& c) { return Value(c.previewMovie()); }},
    };
    return table;
}

// Operations the clip answers that are not properties (they take arguments,
// change the card or hand out objects).
const std::unordered_set<std::string_view>& operations() {
    static const std::unordered_set<std::string_view> ops = {
        "initWithSkarnClip:",
        "rootNode",
        "stringFromClipDescriptionForXPath:",
        "recognizedVideoSampleSize:",
        "dataSizeForAudioChannelIndex:",
        "dateFromDateString:outDate:outTimeZone:",
        "formatReader",
        "ingestObject",
        "ingestObjectRefCon",
        "createPreviewMovie",
        "deleteClip",
    };
    return ops;
}

}  // namespace

bool SkarnClip::respondsToSelector(std::string_view selector) const {
    return propertyTable().count(selector) != 0 || operations().count(selector) != 0;
}

Value SkarnClip::valueForKey(const std::string& key) {
    auto it = propertyTable().find(key);
    if (it == propertyTable().end()) return Value();
    return it->second(*this);
}
