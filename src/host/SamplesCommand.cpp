#include "SamplesCommand.h"

#include "CMSampleBuffer.h"
#include "ClipTracks.h"
#include "FileSystem.h"
#include "HostText.h"
#include "OutputBuffer.h"

#include <cinttypes>
#include <climits>
#include <regex>

namespace {

// What a cursor left untouched.
constexpr int64_t kUnset = INT64_MIN;

// Non-negative decimal seconds, exactly: "1.5" is 15/10.
bool parseSeconds(const std::string& text, CMTime* out) {
    static const std::regex pattern(R"(([0-9]{1,9})(?:\.([0-9]{1,9}))?)");
    std::smatch m;
    if (!std::regex_match(text, m, pattern)) return false;
    int64_t value = std::stoll(m[1].str());
    int32_t timescale = 1;
    for (char digit : m[2].str()) {
        value = value * 10 + (digit - '0');
        timescale *= 10;
    }
    *out = CMTimeMake(value, timescale);
    return true;
}

// A timecode as a time from the track's first frame, counted at the rate whose
// frame lasts frameDuration. ";" (or ".") before the frames counts drop
// frame: two frame numbers (four at 59.94) skipped each minute but every tenth.
bool parseTimecode(const std::string& text, CMTime frameDuration, CMTime* out, std::string* problem) {
    static const std::regex pattern(R"(([0-9]{1,2}):([0-9]{2}):([0-9]{2})([:;.])([0-9]{2,3}))");
    std::smatch m;
    if (!std::regex_match(text, m, pattern)) return false;
    if (!CMTIME_IS_NUMERIC(frameDuration) || frameDuration.value <= 0) {
        *problem = "the track has no frame rate to count a timecode at";
        return true;
    }
    const int64_t hours = std::stoll(m[1].str()), minutes = std::stoll(m[2].str()), seconds = std::stoll(m[3].str()),
                  frame = std::stoll(m[5].str());
    const bool drop = m[4].str() != ":";
    // The nominal rate timecode counts in: 30 for 29.97, 24 for 23.98.
    const int64_t rate = (int64_t(frameDuration.timescale) + frameDuration.value / 2) / frameDuration.value;
    if (minutes > 59 || seconds > 59 || frame >= rate) {
        *problem = "the timecode " + text + " is not valid at " + std::to_string(rate) + " frames per second";
        return true;
    }
    int64_t frames = ((hours * 60 + minutes) * 60 + seconds) * rate + frame;
    if (drop) {
        const bool dropRate = frameDuration.value % 1001 == 0 && (rate == 30 || rate == 60);
        if (!dropRate) {
            *problem = "drop-frame timecode " + text + " needs a 29.97 or 59.94 track";
            return true;
        }
        const int64_t dropped = rate / 15;
        if (minutes % 10 != 0 && seconds == 0 && frame < dropped) {
            *problem = "the drop-frame timecode " + text + " names a frame number that is skipped";
            return true;
        }
        const int64_t totalMinutes = hours * 60 + minutes;
        frames -= dropped * (totalMinutes - totalMinutes / 10);
    }
    *out = CMTimeMake(frames * frameDuration.value, frameDuration.timescale);
    return true;
}

CMTime firstSampleDuration(VestaKilnTrackReaderProtocol& track) {
    Ref<VestaKilnSampleCursorProtocol> cursor = track.cursorAtFirstSampleInDecodeOrder();
    if (!cursor || !cursor->respondsToSelector("duration")) return kCMTimeInvalid;
    return cursor->duration();
}

// An integer attachment as a flag: -1 when absent.
int flagOf(const Value& attributes, const char* key) {
    if (!attributes.isDictionary()) return -1;
    const Value* v = attributes.dictionary().find(key);
    if (!v || !v->isNumber()) return -1;
    return v->integerValue() != 0 ? 1 : 0;
}

std::string jsonString(const std::string& s) {
    return nlohmann::ordered_json(s).dump(-1, ' ', false, nlohmann::ordered_json::error_handler_t::replace);
}

}  // namespace

CLI::App* SamplesCommand::addTo(CLI::App& app) {
    auto* cmd = app.add_subcommand(
        "samples", "Walk a track's sample cursor in decode order: times, file offset and length of every sample");
    cmd->add_option("CLIP", _clip, "CONTENTS/CLIP/NAME.XML, CONTENTS/AVCLIP/NAME.MXF or CARD:NAME")->required();
    cmd->add_option("--track", _track, "Track index, as `skarn tracks` lists them (0 video, 1 timecode, 2... audio)")
        ->check(CLI::Range(int64_t(0), int64_t(1) << 20))
        ->capture_default_str();
    cmd->add_option("--from", _from,
                    "Start at the sample presented at this time from the clip's first frame: seconds (1.5) or a "
                    "timecode at the track's frame rate (00:00:01:00, or 00:00:01;00 for drop frame; audio tracks "
                    "count video frames)");
    cmd->add_option("--count", _count, "List at most N samples")
        ->check(CLI::Validator(
            [](std::string& text) {
                return !text.empty() && text.find_first_not_of("0123456789") == std::string::npos &&
                               text.find_first_not_of('0') != std::string::npos
                           ? std::string()
                           : "--count takes a whole number of at least 1, not \"" + text + "\"";
            },
            "N>0"));
    cmd->add_flag("--json", _asJSON, "Print one JSON object, written row by row");
    cmd->footer(
        "Offsets are positions in the sample's file. Examples:\n"
        "  skarn samples CARD:A001 --count 5\n"
        "  skarn samples --json --track 2 --from 00:00:01:00 CARD/CONTENTS/AVCLIP/A002.MXF");
    return cmd;
}

bool SamplesCommand::startTime(ClipTracks& clip, CMTime* pts) {
    VestaKilnTrackReaderProtocol& track = *clip.tracks()[size_t(_track)];
    // An audio sample is far finer than a timecode frame: audio tracks count
    // the video track's frames.
    VestaKilnTrackReaderProtocol& rateTrack = track.mediaType() == kCMMediaType_Audio ? *clip.tracks()[0] : track;
    std::string problem;
    if (parseSeconds(_from, pts)) return true;
    if (parseTimecode(_from, firstSampleDuration(rateTrack), pts, &problem)) {
        if (problem.empty()) return true;
        clip.error("--from " + _from + ": " + problem);
        return false;
    }
    clip.error("--from " + _from + ": give seconds (1.5) or a timecode (00:00:01:00)");
    return false;
}

int SamplesCommand::run(HostSession& host) {
    ClipTracks clip;
    OutputBuffer out(stdout);
    try {
        if (!clip.open(host, _clip)) return 1;
        if (_track >= int64_t(clip.tracks().size())) {
            clip.error("no track " + std::to_string(_track) + " (the clip has tracks 0 to " +
                       std::to_string(clip.tracks().size() - 1) + ")");
            return 1;
        }
        return walk(clip, out);
    } catch (const std::exception& e) {
        // Thrown before the listing began (the listing catches its own).
        clip.error(failureText(e));
        return 1;
    }
}

int SamplesCommand::walk(ClipTracks& clip, OutputBuffer& out) {
    VestaKilnTrackReaderProtocol& track = *clip.tracks()[size_t(_track)];
    const FourCharCode mediaType = track.mediaType();
    const std::string trackName = "track " + std::to_string(_track);
    const std::optional<std::string> url = track.url();
    if (!url || !FileSystem::fileExists(*url)) {
        clip.error(trackName + ": its file " + url.value_or("(none named)") + " is missing");
        return 1;
    }

    Ref<VestaKilnSampleCursorProtocol> cursor;
    // The text table shows dependency columns when the first sample has them.
    Value firstAttributes;
    try {
        if (_from.empty()) {
            cursor = track.cursorAtFirstSampleInDecodeOrder();
        } else {
            CMTime from;
            if (!startTime(clip, &from)) return 1;
            bool beforeStart = false, afterEnd = false;
            cursor = track.cursorAtPresentationTimeStamp(from, &beforeStart, &afterEnd);
            if (afterEnd) {
                clip.error("--from " + _from + " lies past the end of " + trackName + " (its duration is " +
                           timeText(track.uneditedDuration()) + ")");
                return 1;
            }
        }
        if (cursor && cursor->respondsToSelector("sampleDependencyAttributes"))
            firstAttributes = cursor->sampleDependencyAttributes();
    } catch (const std::exception& e) {
        clip.error(trackName + ": " + failureText(e));
        return 1;
    }
    if (!cursor) {
        clip.error(trackName + ": the track hands out no sample cursor");
        return 1;
    }

    // The bytes a sample may occupy: the track's data in a clip-XML clip, the
    // whole file in a self-contained one.
    const CMTime trackDuration = track.uneditedDuration();
    const int64_t fileSize = int64_t(std::min<uint64_t>(FileSystem::fileSize(*url).value_or(0), INT64_MAX));
    const int64_t dataStart = clip.selfContained() ? 0 : track.locationOffset();
    const int64_t dataEnd =
        clip.selfContained()
            ? fileSize
            : std::min(fileSize, ClipTracks::saturatingAdd(track.locationOffset(), track.locationSize()));

    const bool answersDTS = cursor->respondsToSelector("decodeTimeStamp");
    const bool answersDuration = cursor->respondsToSelector("duration");
    const bool answersDependencies = cursor->respondsToSelector("sampleDependencyAttributes");
    const bool answersChunks =
        mediaType == kCMMediaType_Audio &&
        cursor->respondsToSelector(
            "chunkDetails:chunkOffset:chunkSize:sampleCount:sampleIndex:allSameSize:allSameDuration:"
            "allSameFormatDescription:");
    const std::string file = *url;
    const std::string fileJSON = jsonString(file);
    const bool dependencyColumns = flagOf(firstAttributes, kCMSampleAttachmentKey_DependsOnOthers) >= 0 ||
                                   flagOf(firstAttributes, kCMSampleAttachmentKey_IsDependedOnByOthers) >= 0;

    if (_asJSON) {
        out << "{\"track\": " << _track << ", \"mediaType\": " << jsonString(fourCharText(mediaType))
            << ", \"samples\": [";
    } else {
        out << "track " << _track << " (" << fourCharText(mediaType) << ") of " << clip.clipName() << ": " << file
            << '\n';
        out.padded("DECODE", 8)
            .padded("PTS", 18)
            .padded("DTS", 18)
            .padded("DURATION", 14)
            .padded("OFFSET", 14)
            .padded("LENGTH", 10)
            .padded("SYNC", 5);
        if (dependencyColumns) out.padded("DEPENDS", 8).padded("DEPENDED", 9);
        if (answersChunks) out.padded("CHUNK.OFFSET", 14).padded("CHUNK.SIZE", 11).padded("SAMPLES", 8);
        out << '\n';
    }

    int64_t rows = 0;
    CMTime previousDTS = kCMTimeInvalid, previousPTS = kCMTimeInvalid;
    std::string problem;
    char text[48];
    auto timeCell = [&](CMTime t, size_t width) {
        if (!CMTIME_IS_NUMERIC(t)) {
            out.padded("-", width);
            return;
        }
        std::snprintf(text, sizeof text, "%" PRId64 "/%" PRId32, t.value, t.timescale);
        out.padded(text, width);
    };
    auto flagCell = [&](int flag, size_t width) { out.padded(flag < 0 ? "-" : flag ? "yes" : "no", width); };

    try {
        for (;;) {
            const CMTime pts = cursor->presentationTimeStamp();
            // A track without samples gives its cursors no time to stand on.
            if (!CMTIME_IS_NUMERIC(pts)) break;
            const CMTime dts = answersDTS ? cursor->decodeTimeStamp() : pts;
            if (rows > 0 && CMTimeCompare(dts, previousDTS) == 0 && CMTimeCompare(pts, previousPTS) == 0) {
                problem = trackName + ": the cursor answered a step in decode order without moving; stopped after " +
                          std::to_string(rows) + " sample(s)";
                break;
            }
            previousDTS = dts;
            previousPTS = pts;
            const CMTime duration = answersDuration ? cursor->duration() : kCMTimeInvalid;

            int64_t sections = 0, location = 0, length = 0;
            Ref<Object> otherFile;
            cursor->sampleLocationWithArraySizes(1, &sections, &location, &length, &otherFile);
            if (otherFile) {
                problem = trackName + ": a sample lies in another file (" + otherFile->description() +
                          "), which this host does not follow";
                break;
            }
            const Value attributes = answersDependencies ? cursor->sampleDependencyAttributes() : Value();
            // Without attributes a sample depends on nothing: every sample is a sync sample.
            const int notSync = flagOf(attributes, kCMSampleAttachmentKey_NotSync);
            const bool sync = notSync != 1;
            const int depends = flagOf(attributes, kCMSampleAttachmentKey_DependsOnOthers);
            const int dependedOn = flagOf(attributes, kCMSampleAttachmentKey_IsDependedOnByOthers);
            int64_t chunkOffset = kUnset, chunkSize = kUnset, chunkSamples = kUnset;
            if (answersChunks)
                cursor->chunkDetails(nullptr, &chunkOffset, &chunkSize, &chunkSamples, nullptr, nullptr, nullptr,
                                     nullptr);

            // What a host checks before it reads a sample's bytes: that the
            // sample belongs to the track and lies in its data.
            if (CMTIME_IS_NUMERIC(trackDuration) && CMTimeCompare(pts, trackDuration) >= 0) {
                problem = trackName + ": the cursor stepped to " + timeText(pts) +
                          ", at or past the track's duration " + timeText(trackDuration) +
                          ", without answering the end of the track; stopped after " + std::to_string(rows) +
                          " sample(s)";
                break;
            }
            if (sections <= 0) {
                problem = trackName + ": the sample at " + timeText(pts) +
                          " has no place in the track's data (the track's duration " + timeText(trackDuration) +
                          " counts more samples than its data holds); stopped after " + std::to_string(rows) +
                          " sample(s)";
                break;
            }
            if (chunkSamples == 0) {
                problem = trackName + ": the sample at " + timeText(pts) +
                          " lies in a chunk the cursor says holds no samples (the track's duration " +
                          timeText(trackDuration) + " counts more samples than its data holds); stopped after " +
                          std::to_string(rows) + " sample(s)";
                break;
            }
            const int64_t offset = sections > 0 ? clip.filePosition(track, location) : kUnset;
            if (sections > 0 && (offset < dataStart || length < 0 || offset > dataEnd - length)) {
                problem = trackName + ": the sample at " + timeText(pts) + " lies at " + std::to_string(offset) + " (" +
                          std::to_string(length) + " bytes), outside the track's data (" + std::to_string(dataStart) +
                          " to " + std::to_string(dataEnd) + "); stopped after " + std::to_string(rows) + " sample(s)";
                break;
            }

            const bool ordered = CMTIME_IS_NUMERIC(duration) && duration.value > 0 && CMTIME_IS_NUMERIC(dts) &&
                                 dts.timescale == duration.timescale;
            const int64_t decodeIndex = ordered ? dts.value / duration.value : rows;
            if (_asJSON) {
                out << (rows ? ",\n" : "\n") << "{\"decodeIndex\":" << decodeIndex << ",\"pts\":";
                writeTimeJSON(out, pts);
                out << ",\"dts\":";
                writeTimeJSON(out, dts);
                out << ",\"duration\":";
                writeTimeJSON(out, duration);
                if (sections > 0)
                    out << ",\"offset\":" << offset << ",\"length\":" << length;
                else
                    out << ",\"offset\":null,\"length\":null";
                out << ",\"file\":" << fileJSON << ",\"sync\":" << sync;
                if (depends >= 0) out << ",\"dependsOnOthers\":" << (depends == 1);
                if (dependedOn >= 0) out << ",\"isDependedOnByOthers\":" << (dependedOn == 1);
                if (chunkOffset != kUnset) out << ",\"chunkOffset\":" << clip.filePosition(track, chunkOffset);
                if (chunkSize != kUnset) out << ",\"chunkSize\":" << chunkSize;
                if (chunkSamples != kUnset) out << ",\"sampleCount\":" << chunkSamples;
                out << '}';
            } else {
                out.padded(decodeIndex, 8);
                timeCell(pts, 18);
                timeCell(dts, 18);
                timeCell(duration, 14);
                if (sections > 0)
                    out.padded(offset, 14).padded(length, 10);
                else
                    out.padded("-", 14).padded("-", 10);
                flagCell(sync, 5);
                if (dependencyColumns) {
                    flagCell(depends, 8);
                    flagCell(dependedOn, 9);
                }
                if (answersChunks) {
                    if (chunkOffset != kUnset)
                        out.padded(clip.filePosition(track, chunkOffset), 14);
                    else
                        out.padded("-", 14);
                    out.padded(chunkSize == kUnset ? "-" : std::to_string(chunkSize), 11);
                    out.padded(chunkSamples == kUnset ? "-" : std::to_string(chunkSamples), 8);
                }
                out << '\n';
            }
            if (++rows == _count) break;
            const int32_t status = cursor->stepInDecodeOrder(1);
            if (status == kVestaKilnSampleCursorNoMoreSamples) break;
            if (status != 0) {
                problem = trackName + ": stepping in decode order failed with status " + std::to_string(status);
                break;
            }
        }
    } catch (const std::exception& e) {
        problem = trackName + ", after " + std::to_string(rows) + " sample(s): " + failureText(e);
    }

    if (_asJSON) {
        out << (rows ? "\n]" : "]");
        if (!problem.empty()) out << ", \"error\": " << jsonString(problem);
        out << "}\n";
    }
    out.flush();
    if (!problem.empty()) {
        clip.error(problem);
        return 1;
    }
    return 0;
}
