#include "TracksCommand.h"

#include "ClipTracks.h"
#include "CMFormatDescription.h"
#include "FileSystem.h"
#include "HostText.h"
#include "ValueJSON.h"

#include <cstring>
#include <iostream>

namespace {

using json = nlohmann::ordered_json;

// Channel labels of a layout, read from its bytes as the description keeps
// them: a 12-byte head, then 20 bytes per channel description.
json channelLabels(std::span<const uint8_t> layout) {
    json labels = json::array();
    constexpr size_t head = offsetof(AudioChannelLayout, mChannelDescriptions);
    if (layout.size() < head) return labels;
    uint32_t count = 0;
    std::memcpy(&count, layout.data() + offsetof(AudioChannelLayout, mNumberChannelDescriptions), sizeof count);
    for (size_t i = 0; i < count && head + (i + 1) * sizeof(AudioChannelDescription) <= layout.size(); ++i) {
        uint32_t label = 0;
        std::memcpy(&label, layout.data() + head + i * sizeof(AudioChannelDescription), sizeof label);
        labels.push_back(label);
    }
    return labels;
}

json formatDescriptionJSON(const CMFormatDescription* desc) {
    if (!desc) return nullptr;
    json out = json::object();
    out["mediaType"] = fourCharText(desc->mediaType());
    switch (desc->mediaType()) {
        case kCMMediaType_Video:
            out["codecType"] = fourCharText(desc->mediaSubType());
            out["width"] = desc->dimensions().width;
            out["height"] = desc->dimensions().height;
            out["extensions"] = toJSON(Value(desc->extensions()));
            break;
        case kCMMediaType_Audio:
            if (const AudioStreamBasicDescription* asbd = desc->streamBasicDescription()) {
                out["formatID"] = fourCharText(asbd->mFormatID);
                out["sampleRate"] = asbd->mSampleRate;
                out["bitsPerChannel"] = asbd->mBitsPerChannel;
                out["channelsPerFrame"] = asbd->mChannelsPerFrame;
                out["formatFlags"] = asbd->mFormatFlags;
                out["bytesPerFrame"] = asbd->mBytesPerFrame;
                out["framesPerPacket"] = asbd->mFramesPerPacket;
            }
            out["channelLabels"] = channelLabels(desc->channelLayoutBytes());
            break;
        case kCMMediaType_TimeCode:
            out["timeCodeType"] = fourCharText(desc->mediaSubType());
            out["frameDuration"] = timeJSON(desc->frameDuration());
            out["frameQuanta"] = desc->frameQuanta();
            out["dropFrame"] = (desc->timeCodeFlags() & kCMTimeCodeFlag_DropFrame) != 0;
            out["flags"] = desc->timeCodeFlags();
            break;
        default:
            out["subType"] = fourCharText(desc->mediaSubType());
            break;
    }
    return out;
}

std::string formatDescriptionText(const json& d) {
    if (d.is_null()) return "none";
    const std::string type = d["mediaType"];
    char line[256];
    if (type == "vide") {
        std::snprintf(line, sizeof line, "%s %dx%d", d["codecType"].get<std::string>().c_str(), d["width"].get<int>(),
                      d["height"].get<int>());
        return std::string(line) + (d["extensions"].empty() ? "" : " " + jsonText(d["extensions"]));
    }
    if (type == "soun" && d.contains("formatID")) {
        std::snprintf(line, sizeof line, "%s %.0f Hz, %u bits, %u channel(s), flags 0x%x",
                      d["formatID"].get<std::string>().c_str(), d["sampleRate"].get<double>(),
                      d["bitsPerChannel"].get<unsigned>(), d["channelsPerFrame"].get<unsigned>(),
                      d["formatFlags"].get<unsigned>());
        return line;
    }
    if (type == "tmcd") {
        std::snprintf(line, sizeof line, "%s frame %s, quanta %u, %s", d["timeCodeType"].get<std::string>().c_str(),
                      d["frameDuration"].is_null() ? "-"
                                                   : (std::to_string(d["frameDuration"][0].get<int64_t>()) + "/" +
                                                      std::to_string(d["frameDuration"][1].get<int64_t>()))
                                                         .c_str(),
                      d["frameQuanta"].get<unsigned>(), d["dropFrame"].get<bool>() ? "drop frame" : "non-drop");
        return line;
    }
    return jsonText(d);
}

// The cadence of a track whose pulldown the reader removes. The protocol has
// no call for it; a track reader that knows may answer these keys.
json cadenceValue(VestaKilnTrackReaderProtocol& track, const char* key) {
    return toJSON(track.valueForKey(key));
}

std::string cadenceText(const json& pattern, const json& length, const json& index) {
    if (pattern.is_null() && length.is_null() && index.is_null()) return "-";
    std::string text = pattern.is_array() ? "" : (pattern.is_null() ? "-" : jsonText(pattern));
    if (pattern.is_array())
        for (const auto& keep : pattern) text += keep.is_number() && keep.get<int64_t>() != 0 ? "1" : "0";
    return text + " (length " + (length.is_null() ? "-" : jsonText(length)) + ", index " +
           (index.is_null() ? "-" : jsonText(index)) + ")";
}

// problem: what stopped the plug-in while the track was read, if anything.
json trackJSON(size_t index, VestaKilnTrackReaderProtocol& track, std::string* problem) {
    json out = json::object();
    CMFormatDescription* desc = track.formatDescription();
    out["index"] = index;
    out["mediaType"] = fourCharText(track.mediaType());
    out["codec"] = desc ? fourCharText(desc->mediaSubType()) : "-";
    out["enabled"] = track.isEnabled();
    out["timescale"] = track.timescale();
    // The protocol tells a track's sample duration through its cursors.
    CMTime frameDuration = kCMTimeInvalid;
    try {
        Ref<VestaKilnSampleCursorProtocol> first = track.cursorAtFirstSampleInDecodeOrder();
        if (first && first->respondsToSelector("duration")) frameDuration = first->duration();
    } catch (const std::exception& e) {
        *problem = failureText(e);
    }
    out["frameDuration"] = timeJSON(frameDuration);
    out["duration"] = timeJSON(track.uneditedDuration());
    out["locationOffset"] = track.locationOffset();
    out["locationSize"] = track.locationSize();
    out["uneditedNumDataBytes"] = track.uneditedNumDataBytes();
    std::optional<std::string> url = track.url();
    out["file"] = url ? json(*url) : json(nullptr);
    out["formatDescription"] = formatDescriptionJSON(desc);
    out["pulldownPattern"] = cadenceValue(track, "pulldownPattern");
    out["patternLength"] = cadenceValue(track, "patternLength");
    out["patternIndex"] = cadenceValue(track, "patternIndex");
    return out;
}

}  // namespace

CLI::App* TracksCommand::addTo(CLI::App& app) {
    auto* cmd = app.add_subcommand("tracks",
                                   "List a clip's tracks as its format reader presents them (video, timecode, then "
                                   "one per audio channel)");
    cmd->add_option("CLIP", _clip, "CONTENTS/CLIP/NAME.XML, CONTENTS/AVCLIP/NAME.MXF or CARD:NAME")->required();
    cmd->add_flag("--json", _asJSON, "Print a JSON array of tracks");
    cmd->footer("Example:\n  skarn tracks CARD:A001\n  skarn tracks --json CARD/CONTENTS/AVCLIP/A002.MXF");
    return cmd;
}

int TracksCommand::run(HostSession& host) {
    ClipTracks clip;
    try {
        if (!clip.open(host, _clip)) return 1;
    } catch (const std::exception& e) {
        clip.error(failureText(e));
        return 1;
    }
    json out = json::array();
    // One line per problem, naming every track it struck: a damaged index
    // table stops the cursors of all tracks that share it.
    std::vector<std::pair<std::string, std::vector<size_t>>> problems;
    auto note = [&](const std::string& problem, size_t track) {
        for (auto& p : problems)
            if (p.first == problem) {
                p.second.push_back(track);
                return;
            }
        problems.push_back({problem, {track}});
    };
    if (!_asJSON)
        std::printf("%5s %-4s %-5s %9s %-12s %-16s %12s %12s %12s\n", "TRACK", "TYPE", "CODEC", "TIMESCALE", "FRAME",
                    "DURATION", "LOC.OFFSET", "LOC.SIZE", "FILE BYTES");
    const auto& tracks = clip.tracks();
    size_t audioTracks = 0;
    for (size_t i = 0; i < tracks.size(); ++i) {
        json t;
        try {
            std::string problem;
            t = trackJSON(i, *tracks[i], &problem);
            if (!problem.empty()) note(problem, i);
        } catch (const std::exception& e) {
            note(failureText(e), i);
            continue;
        }
        if (t["mediaType"] == "soun") ++audioTracks;
        if (t["file"].is_string() && !FileSystem::fileExists(t["file"].get<std::string>()))
            note("its file " + t["file"].get<std::string>() + " is missing", i);
        if (_asJSON) {
            out.push_back(std::move(t));
            continue;
        }
        auto time = [](const json& j) {
            return j.is_null() ? std::string("-")
                               : std::to_string(j[0].get<int64_t>()) + "/" + std::to_string(j[1].get<int64_t>());
        };
        std::printf("%5zu %-4s %-5s %9lld %-12s %-16s %12lld %12lld %12lld\n", i,
                    t["mediaType"].get<std::string>().c_str(), t["codec"].get<std::string>().c_str(),
                    (long long)t["timescale"].get<int64_t>(), time(t["frameDuration"]).c_str(),
                    time(t["duration"]).c_str(), (long long)t["locationOffset"].get<int64_t>(),
                    (long long)t["locationSize"].get<int64_t>(), (long long)t["uneditedNumDataBytes"].get<int64_t>());
        std::printf("      format   %s\n", formatDescriptionText(t["formatDescription"]).c_str());
        std::printf("      cadence  %s\n",
                    cadenceText(t["pulldownPattern"], t["patternLength"], t["patternIndex"]).c_str());
        std::printf("      file     %s\n", t["file"].is_null() ? "-" : t["file"].get<std::string>().c_str());
    }
    if (_asJSON) std::cout << jsonText(out, 2) << "\n";
    std::fflush(stdout);
    // A channel whose file is gone is left out of the reader, not shown as offline.
    const uint32_t channels = clip.clip().numberOfAudioChannels();
    if (audioTracks < channels) {
        clip.error("the clip has " + std::to_string(channels) + " audio channels but its format reader has " +
                   std::to_string(audioTracks) + " audio track(s) (is a channel's file missing?)");
    }
    for (const auto& [problem, indexes] : problems) {
        std::string which = indexes.size() == 1 ? "track " : "tracks ";
        for (size_t k = 0; k < indexes.size(); ++k) which += (k ? ", " : "") + std::to_string(indexes[k]);
        clip.error(which + ": " + problem);
    }
    return problems.empty() && audioTracks >= channels ? 0 : 1;
}
