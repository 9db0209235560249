// skarn-mkcard: writes Skarn cards for tests, benchmarks and demonstrations.
#include "CardWriter.h"
#include "HostileCards.h"

#include "Value.h"

#include <CLI/CLI.hpp>
#include "ValueJSON.h"

#include <nlohmann/json.hpp>

#include <cstdio>
#include <iostream>
#include <sstream>
#include <unistd.h>

namespace {

// "family[,key=value...]" -> a clip; answers an error text or "".
std::string parseClip(const std::string& text, unsigned index, ClipSpec& clip) {
    std::stringstream ss(text);
    std::string item;
    std::getline(ss, item, ',');
    const CardFamily* family = cardFamilyNamed(item);
    if (!family) return "unknown clip family \"" + item + "\" (see --list-families)";
    clip = defaultClip(*family, index);
    while (std::getline(ss, item, ',')) {
        size_t eq = item.find('=');
        std::string key = item.substr(0, eq);
        std::string value = eq == std::string::npos ? "" : item.substr(eq + 1);
        try {
            if (key == "frames") clip.frames = std::stoull(value);
            else if (key == "name") clip.name = value;
            else if (key == "channels") clip.audioChannels = unsigned(std::stoul(value));
            else if (key == "bits") clip.bitsPerSample = unsigned(std::stoul(value));
            else if (key == "start") clip.startTimecode = value;
            else if (key == "drop") clip.dropFrame = true;
            else if (key == "nondrop") clip.dropFrame = false;
            else if (key == "pulldown") clip.pulldown = value;
            else if (key == "vfr") clip.vfrRatio = value;
            else if (key == "vfrstate") clip.vfrState = value;
            else if (key == "gid") clip.globalClipID = value;
            else if (key == "user") clip.metadata.userClipName = value;
            else if (key == "shotmark") clip.metadata.shotMark = value;
            else if (key == "top") clip.spanTop = value;
            else if (key == "next") clip.spanNext = value;
            else if (key == "previous") clip.spanPrevious = value;
            else if (key == "voice") clip.voice = true;
            else if (key == "proxy") clip.proxy = true;
            else if (key == "noicon") clip.icon = false;
            else if (key == "sparse") clip.sparse = true;
            else if (key == "essence") clip.essenceFile = value;
            else if (key == "cadence") {
                DVStreamSpec dv = clip.dv.value_or(DVStreamSpec{});
                if (value == "24in30") dv.cadence = DVCadence::TwentyFourInThirty;
                else if (value == "24in60") dv.cadence = DVCadence::TwentyFourInSixty;
                else if (value == "half") dv.cadence = DVCadence::HalfRate;
                else if (value == "none") dv.cadence = DVCadence::None;
                else return "unknown cadence \"" + value + "\" (24in30, 24in60, half, none)";
                clip.dv = dv;
            } else if (key == "phase") {
                DVStreamSpec dv = clip.dv.value_or(DVStreamSpec{});
                dv.cadencePhase = unsigned(std::stoul(value));
                clip.dv = dv;
            } else if (key == "shoot") {
                DVStreamSpec dv = clip.dv.value_or(DVStreamSpec{});
                dv.shootingRate = std::stoi(value);
                clip.dv = dv;
            }
            else return "unknown clip option \"" + key + "\"";
        } catch (const std::exception&) {
            return "bad value for clip option \"" + key + "\": \"" + value + "\"";
        }
    }
    return "";
}

}  // namespace

int main(int argc, char** argv) {
    CLI::App app{"skarn-mkcard: write a Skarn card folder tree with clips of the given families.\n"
                 "A clip is FAMILY[,OPTION...]; options: frames=N name=ID channels=N bits=16|24\n"
                 "start=HH:MM:SS:FF drop nondrop pulldown=2:3|2:3:3:2|2:2|OTHER vfr=60/24 vfrstate=S\n"
                 "gid=HEX user=NAME shotmark=true top=GID next=GID previous=GID voice proxy noicon\n"
                 "sparse essence=FILE (raw DV or H.264 frames)\n"
                 "DV only: cadence=24in30|24in60|half phase=N shoot=RATE (shooting-rate pack)"};
    app.set_version_flag("--version", std::string("skarn-mkcard ") + SKARN_VERSION);
    std::string root;
    std::vector<std::string> clipTexts;
    bool demo = false, lower = false, json = false, listFamilies = false, quiet = false;
    unsigned count = 0;
    std::string countFamily = "dvcpro50-ntsc";
    app.add_option("CARD", root, "Folder to write the card into (created)");
    app.add_option("-c,--clip", clipTexts, "Add a clip: FAMILY[,OPTION...]");
    app.add_flag("--demo", demo, "One short clip of every family");
    app.add_option("--count", count, "Add N short clips (of --count-family)");
    app.add_option("--count-family", countFamily, "Family of the --count clips")->capture_default_str();
    app.add_flag("--lowercase", lower, "Spell the card's folders in lower case");
    app.add_flag("--list-families", listFamilies, "List the clip families and exit");
    app.add_flag("--json", json, "Print what was written as JSON");
    app.add_flag("-q,--quiet", quiet, "Print nothing on success");
    std::string hostileDir, hostileOnly;
    app.add_option("--hostile", hostileDir, "Write damaged cards for robustness tests into DIR, one folder per fault");
    app.add_option("--hostile-only", hostileOnly, "With --hostile: only the faults whose names begin with TEXT");
    CLI11_PARSE(app, argc, argv);

    if (!hostileDir.empty()) {
        std::vector<HostileCard> cards;
        std::string error;
        if (!writeHostileCards(hostileDir, &cards, &error, hostileOnly)) {
            std::fprintf(stderr, "skarn-mkcard: %s\n", error.c_str());
            return 1;
        }
        if (json) {
            nlohmann::ordered_json out = nlohmann::ordered_json::array();
            for (const auto& c : cards) {
                nlohmann::ordered_json clips = nlohmann::ordered_json::array();
                for (const auto& clip : c.clips) clips.push_back({{"name", clip.name}, {"clipPath", clip.clipPath}});
                out.push_back({{"fault", c.fault}, {"description", c.description}, {"root", c.root},
                               {"clips", clips}, {"damaged", c.damaged}});
            }
            std::cout << jsonText(out, 2) << "\n";
        } else if (!quiet) {
            for (const auto& c : cards) std::printf("%-52s %s\n", c.fault.c_str(), c.description.c_str());
            std::printf("wrote %zu hostile card%s to %s\n", cards.size(), cards.size() == 1 ? "" : "s",
                        hostileDir.c_str());
        }
        return 0;
    }

    if (listFamilies) {
        for (const auto& f : cardFamilies())
            std::printf("%-18s %-20s %s%s\n", f.name.c_str(), f.codec.c_str(), f.frameRate.c_str(),
                        f.avclip ? "  (self-contained)" : "");
        return 0;
    }
    if (root.empty()) {
        std::fprintf(stderr, "skarn-mkcard: no CARD folder given (see --help)\n");
        return 2;
    }

    CardSpec card;
    card.root = root;
    card.lowerCaseFolders = lower;
    unsigned index = 1;
    if (demo) {
        for (const auto& f : cardFamilies()) {
            ClipSpec c = defaultClip(f, index++);
            c.frames = f.avclip ? 24 : 12;
            c.voice = index % 3 == 0;
            card.clips.push_back(c);
        }
    }
    if (count > 0) {
        const CardFamily* f = cardFamilyNamed(countFamily);
        if (!f) {
            std::fprintf(stderr, "skarn-mkcard: unknown family \"%s\"\n", countFamily.c_str());
            return 2;
        }
        for (unsigned i = 0; i < count; ++i) {
            ClipSpec c = defaultClip(*f, index++);
            char name[16];
            std::snprintf(name, sizeof name, "C%04u", i + 1);
            c.name = name;
            c.frames = 4;
            card.clips.push_back(c);
        }
    }
    for (const auto& text : clipTexts) {
        ClipSpec c;
        std::string err = parseClip(text, index++, c);
        if (!err.empty()) {
            std::fprintf(stderr, "skarn-mkcard: --clip %s: %s\n", text.c_str(), err.c_str());
            return 2;
        }
        card.clips.push_back(c);
    }
    if (card.clips.empty()) {
        std::fprintf(stderr, "skarn-mkcard: no clips asked for (use --clip, --demo or --count)\n");
        return 2;
    }
    // Clip names must be unique on a card.
    for (size_t i = 0; i < card.clips.size(); ++i)
        for (size_t j = i + 1; j < card.clips.size(); ++j)
            if (card.clips[i].name == card.clips[j].name) {
                std::fprintf(stderr, "skarn-mkcard: two clips named %s\n", card.clips[i].name.c_str());
                return 2;
            }

    std::vector<WrittenClip> written;
    std::string error;
    bool progress = !quiet && !json && ::isatty(STDERR_FILENO) && card.clips.size() > 20;
    // Clips are written one by one so the progress bar can move.
    CardSpec one = card;
    for (size_t i = 0; i < card.clips.size(); ++i) {
        one.clips = {card.clips[i]};
        one.lastClipFile = i + 1 == card.clips.size();
        if (!writeCard(one, &written, &error)) {
            if (progress) std::fputc('\n', stderr);
            std::fprintf(stderr, "skarn-mkcard: %s\n", error.c_str());
            return 1;
        }
        if (progress) {
            int width = 40, filled = int(width * (i + 1) / card.clips.size());
            std::fprintf(stderr, "\r[%s%s] %zu/%zu clips", std::string(size_t(filled), '#').c_str(),
                         std::string(size_t(width - filled), ' ').c_str(), i + 1, card.clips.size());
        }
    }
    if (progress) std::fputc('\n', stderr);

    if (json) {
        nlohmann::ordered_json out = nlohmann::ordered_json::array();
        for (const auto& w : written)
            out.push_back({{"name", w.name}, {"family", w.family}, {"clipPath", w.clipPath}, {"files", w.files}});
        std::cout << jsonText(out, 2) << "\n";
    } else if (!quiet) {
        for (const auto& w : written) std::printf("%-8s %-18s %s\n", w.name.c_str(), w.family.c_str(), w.clipPath.c_str());
        std::printf("wrote %zu clip%s to %s\n", written.size(), written.size() == 1 ? "" : "s", root.c_str());
    }
    return 0;
}
