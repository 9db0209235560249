// skarn: the reference host. Loads the Skarn bundle through the Vesta loader
// and drives the plug-in the way an editing application does.
#include "AssertionHandler.h"
#include "FileSystem.h"
#include "HostSession.h"
#include "IngestCommand.h"
#include "SamplesCommand.h"
#include "ThrowingAssertionHandler.h"
#include "TracksCommand.h"

#include <CLI/CLI.hpp>
#include "ValueJSON.h"

#include <nlohmann/json.hpp>

#include <algorithm>
#include <cstdio>
#include <iostream>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using json = nlohmann::ordered_json;

// Properties every clip listing shows, by the clip's own property names.
const char* const kClipKeys[] = {
    "name", "clipID", "path", "isMXFOp1bFormat", "videoFormat", "format", "sourceFormat", "sourceFormatName",
    "displayFormat", "videoWidth", "videoHeight", "aspectRatio", "anamorphic", "videoBitrate", "frameRate",
    "transportRate", "shootingRate", "pulldown", "timecodeFormat", "isDropFrame", "mediaStart", "mediaDuration",
    "numberOfAudioChannels", "sampleRate", "bitsPerSample", "videoDataSize", "startByteOffset", "spannedClipID",
    "nextClipIDInSpannedClip", "previousClipIDInSpannedClip"};

// The card metadata accessors, in the order the plug-in publishes them.
const char* const kCardMetadataAccessors[] = {
    "corvane_Skarn_startBinaryGroup", "corvane_Skarn_userClipName", "corvane_Skarn_memo_person",
    "corvane_Skarn_memo_text", "corvane_Skarn_dataSource", "corvane_Skarn_shotMark", "corvane_Skarn_lastChangedBy",
    "corvane_Skarn_shooter", "corvane_Skarn_shootingStartDateString", "corvane_Skarn_shootingEndDateString",
    "corvane_Skarn_shootingAltitude", "corvane_Skarn_shootingLongitude", "corvane_Skarn_shootingLatitude",
    "corvane_Skarn_shootingLocationSource", "corvane_Skarn_shootingLocationName", "corvane_Skarn_programName",
    "corvane_Skarn_reporter", "corvane_Skarn_purpose", "corvane_Skarn_object", "scene", "shot", "creator",
    "creationDateString", "lastChangeDateString", "deviceManufacturer", "deviceSerialNumber", "deviceModelName"};

json optionalString(const std::optional<std::string>& s) { return s ? json(*s) : json(nullptr); }

json fourCharCode(const Value& v) {
    int64_t code = v.integerValue();
    if (code == 0) return nullptr;
    std::string s;
    for (int shift = 24; shift >= 0; shift -= 8) s += char((code >> shift) & 0xff);
    return s;
}

json clipProperty(VestaKilnClipDataSourceProtocol& clip, const std::string& key) {
    if (key == "name") return optionalString(clip.name());
    if (key == "clipID") return optionalString(clip.clipID());
    if (key == "transportRate") return clip.transportRate();
    if (key == "isDropFrame") return clip.isDropFrame();
    if (key == "mediaStart") return toJSON(clip.mediaStart());
    if (key == "mediaDuration") return toJSON(clip.mediaDuration());
    if (key == "numberOfAudioChannels") return clip.numberOfAudioChannels();
    if (key == "sourceFormat") return fourCharCode(clip.valueForKey(key));
    return toJSON(clip.valueForKey(key));
}

json clipSummary(VestaKilnClipDataSourceProtocol& clip) {
    json out = json::object();
    for (const char* key : kClipKeys) out[key] = clipProperty(clip, key);
    return out;
}

json clipDetails(VestaKilnClipDataSourceProtocol& clip) {
    json out = clipSummary(clip);
    out["clipURLs"] = clip.clipURLs();
    out["videoFilePath"] = toJSON(clip.valueForKey("videoFilePath"));
    out["audioFilePaths"] = toJSON(clip.valueForKey("audioFilePaths"));
    out["ingestSourceFiles"] = toJSON(clip.ingestSourceFiles());
    out["isDeletable"] = clip.isDeletable();
    out["metadata"] = toJSON(clip.metadata());
    json card = json::object();
    for (const char* key : kCardMetadataAccessors) card[key] = toJSON(clip.valueForKey(key));
    out["cardMetadata"] = card;
    out["extendedProperties"] = toJSON(clip.extendedProperties());
    return out;
}

std::string text(const json& j) {
    if (j.is_null()) return "-";
    if (j.is_string()) return j.get<std::string>();
    if (j.is_number_float()) {
        char buf[32];
        std::snprintf(buf, sizeof buf, "%.2f", j.get<double>());
        return buf;
    }
    return jsonText(j);
}

int runCards(HostSession& host, std::vector<std::string> paths, bool asJSON) {
    if (paths.empty()) paths = HostSession::mountedVolumes();
    json out = json::array();
    int found = 0;
    for (const auto& p : paths) {
        bool valid = host.plugin().pathIsValidVolume(p);
        found += valid;
        if (asJSON) out.push_back({{"path", p}, {"isCard", valid}});
        else std::printf("%-5s %s\n", valid ? "card" : "-", p.c_str());
    }
    if (asJSON) std::cout << jsonText(out, 2) << "\n";
    return found > 0 ? 0 : 1;
}

int runClips(HostSession& host, const std::string& card, bool asJSON) {
    auto clips = host.clipsOfCard(card);
    if (!clips) return 1;
    json out = json::array();
    int problems = 0;
    if (!asJSON)
        std::printf("%-20s %-22s %-9s %7s %-12s %8s %3s\n", "NAME", "FORMAT", "DISPLAY", "RATE", "START", "FRAMES", "CH");
    for (const auto& clip : *clips) {
        try {
            json s = clipSummary(*clip);
            if (asJSON) {
                out.push_back(s);
            } else {
                std::printf("%-20s %-22s %-9s %7s %-12s %8s %3s\n", text(s["name"]).c_str(), text(s["format"]).c_str(),
                            text(s["displayFormat"]).c_str(), text(s["transportRate"]).c_str(),
                            text(s["mediaStart"]).c_str(), text(s["mediaDuration"]).c_str(),
                            text(s["numberOfAudioChannels"]).c_str());
            }
        } catch (const std::exception& e) {
            ++problems;
            hostError(clip->valueForKey("path").string() + ": " + e.what());
        }
    }
    if (asJSON) std::cout << jsonText(out, 2) << "\n";
    return problems == int(clips->size()) ? 1 : 0;
}

int runInfo(HostSession& host, const std::string& params, bool asJSON) {
    Ref<VestaKilnClipDataSourceProtocol> clip = host.findClip(params);
    if (!clip) return 1;
    json d = clipDetails(*clip);
    if (asJSON) {
        std::cout << jsonText(d, 2) << "\n";
        return 0;
    }
    for (auto it = d.begin(); it != d.end(); ++it) {
        const json& v = it.value();
        if (v.is_structured())
            std::printf("%-28s %s\n", it.key().c_str(), jsonText(v).c_str());
        else
            std::printf("%-28s %s\n", it.key().c_str(), text(v).c_str());
    }
    return 0;
}

int runFind(HostSession& host, const std::string& card, const std::vector<std::string>& uids) {
    bool found = host.plugin().doesPath(card, uids);
    std::printf("%s\n", found ? "found" : "not found");
    return found ? 0 : 1;
}

int runDelete(HostSession& host, const std::string& params, bool yes) {
    Ref<VestaKilnClipDataSourceProtocol> clip = host.findClip(params);
    if (!clip) return 1;
    std::string name = clip->name().value_or(params);
    if (!clip->isDeletable()) {
        hostError(name + ": cannot be deleted (a file of it, or of the AUDIO folder, is locked or read-only)");
        return 1;
    }
    // Everything the deletion may take: the clip's files, and the AUDIO
    // folder's items named after the clip (links and stray files among them).
    std::vector<std::string> files = clip->clipURLs();
    for (const char* key : {"path", "videoFilePath", "voiceFilePath", "iconFilePath"}) {
        Value v = clip->valueForKey(key);
        if (v.isString()) files.push_back(v.string());
    }
    Value audioFolder = clip->valueForKey("audioFolderPath");
    Value clipPath = clip->valueForKey("path");
    if (audioFolder.isString() && clipPath.isString()) {
        std::string base = FileSystem::stringByDeletingPathExtension(FileSystem::lastPathComponent(clipPath.string()));
        if (auto entries = FileSystem::contentsOfDirectory(audioFolder.string()))
            for (const std::string& e : *entries)
                if (!base.empty() && e.rfind(base, 0) == 0)
                    files.push_back(FileSystem::stringByAppendingPathComponent(audioFolder.string(), e));
    }
    auto present = [](const std::string& f) {
        struct stat st;
        return ::lstat(f.c_str(), &st) == 0;
    };
    std::sort(files.begin(), files.end());
    files.erase(std::unique(files.begin(), files.end()), files.end());
    files.erase(std::remove_if(files.begin(), files.end(), [&](const std::string& f) { return !present(f); }),
                files.end());
    if (!yes) {
        if (!::isatty(STDIN_FILENO)) {
            hostError("refusing to delete " + name + " without --yes when not asked at a terminal");
            return 1;
        }
        std::printf("Delete clip %s (%zu files)? [y/N] ", name.c_str(), files.size());
        std::fflush(stdout);
        std::string answer;
        std::getline(std::cin, answer);
        if (answer != "y" && answer != "Y" && answer != "yes") {
            std::printf("kept %s\n", name.c_str());
            return 1;
        }
    }
    bool deleted = clip->deleteClip();
    for (const auto& f : files)
        if (!present(f)) std::printf("removed %s\n", f.c_str());
    if (!deleted) {
        hostError(name + ": deletion failed part way");
        return 1;
    }
    return 0;
}

}  // namespace

int main(int argc, char** argv) {
    // A corrupt clip must not end the host: hard assertions throw instead.
    setHardAssertionFailureHandler(throwingHardAssertionFailureHandler);
    ThrowingAssertionHandler softAssertions;
    ScopedAssertionHandler scopedSoftAssertions(&softAssertions);

    CLI::App app{"skarn: read Skarn camera cards through the Skarn Kiln plug-in"};
    app.set_version_flag("--version", std::string("skarn ") + SKARN_VERSION);
    std::string bundleOption;
    app.add_option("--bundle", bundleOption,
                   "The Skarn.kilnplugin bundle (default: $SKARN_BUNDLE, else the one beside this program)");
    app.require_subcommand(1);
    bool asJSON = false;

    std::vector<std::string> cardPaths;
    auto* cards = app.add_subcommand("cards", "Tell which folders are Skarn cards (default: the mounted volumes)");
    cards->add_option("PATH", cardPaths, "Folders to check");
    cards->add_flag("--json", asJSON, "Print JSON");

    std::string card;
    auto* clips = app.add_subcommand("clips", "List the clips of a card");
    clips->add_option("CARD", card, "The card's root folder")->required();
    clips->add_flag("--json", asJSON, "Print a JSON array of clips");

    std::string clipArg;
    auto* info = app.add_subcommand("info", "Show one clip in full");
    info->add_option("CLIP", clipArg, "CONTENTS/CLIP/NAME.XML, CONTENTS/AVCLIP/NAME.MXF or CARD:NAME")->required();
    info->add_flag("--json", asJSON, "Print JSON");

    std::vector<std::string> uids;
    auto* find = app.add_subcommand("find", "Does a card hold any of these global clip identifiers? (exit 0 if so)");
    find->add_option("CARD", card, "The card's root folder")->required();
    find->add_option("UID", uids, "Global clip identifiers")->required();

    bool yes = false;
    auto* del = app.add_subcommand("delete", "Delete a clip's files from the card");
    del->add_option("CLIP", clipArg, "CONTENTS/CLIP/NAME.XML, CONTENTS/AVCLIP/NAME.MXF or CARD:NAME")->required();
    del->add_flag("-y,--yes", yes, "Do not ask for confirmation");

    TracksCommand tracksCommand;
    auto* tracks = tracksCommand.addTo(app);
    SamplesCommand samplesCommand;
    auto* samples = samplesCommand.addTo(app);

    auto* plugin = app.add_subcommand("plugin", "Show the plug-in's identity and what it offers");
    plugin->add_flag("--json", asJSON, "Print JSON");

    IngestCommand ingest(app);

    // A word where the command belongs that names no command (a typo such as
    // "clip" for "clips") is named in the error, not only "a subcommand is
    // required".
    for (int i = 1; i < argc; ++i) {
        std::string word = argv[i];
        if (word == "--bundle") {
            ++i;
            continue;
        }
        if (word.rfind("-", 0) == 0) continue;
        bool known = false;
        for (const CLI::App* sub : app.get_subcommands({}))
            if (sub->check_name(word)) known = true;
        if (!known) {
            hostError("unknown command \"" + word + "\" (see skarn --help)");
            return 109;
        }
        break;
    }
    CLI11_PARSE(app, argc, argv);

    HostSession host;
    if (!host.open(bundleOption)) return 2;
    try {
        if (*cards) return runCards(host, cardPaths, asJSON);
        if (*clips) return runClips(host, card, asJSON);
        if (*info) return runInfo(host, clipArg, asJSON);
        if (*find) return runFind(host, card, uids);
        if (*del) return runDelete(host, clipArg, yes);
        if (*tracks) return tracksCommand.run(host);
        if (*samples) return samplesCommand.run(host);
        if (ingest.chosen()) return ingest.run(host);
        if (*plugin) {
            VestaKilnPlugin& p = host.plugin();
            json out;
            out["uuid"] = optionalString(p.uuid());
            out["name"] = optionalString(p.name());
            out["formatName"] = optionalString(p.formatName());
            out["version"] = optionalString(p.version());
            out["targetFormats"] = toJSON(p.targetFormats());
            out["extendedMetadataDefinitions"] = toJSON(p.extendedMetadataDefinitions());
            if (asJSON) {
                std::cout << jsonText(out, 2) << "\n";
            } else {
                for (const char* k : {"uuid", "name", "formatName", "version"})
                    std::printf("%-12s %s\n", k, text(out[k]).c_str());
                std::printf("%-12s %zu\n", "metadata", out["extendedMetadataDefinitions"].size());
            }
            return 0;
        }
    } catch (const std::exception& e) {
        hostError(e.what());
        return 1;
    }
    return 0;
}
