// The reference host as a user runs it.
#include "CardWriter.h"
#include "FileSystem.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include <algorithm>
#include <unistd.h>

namespace {
std::string skarn() { return buildDir() + "/src/host/skarn"; }
std::string mkcard() { return buildDir() + "/src/cardwriter/skarn-mkcard"; }
}  // namespace

TEST(SkarnHost, HelpAndVersion) {
    std::string out;
    EXPECT_EQ(runCommand(skarn() + " --help", &out), 0);
    EXPECT_NE(out.find("cards"), std::string::npos);
    out.clear();
    EXPECT_EQ(runCommand(skarn() + " cards --help", &out), 0);
    out.clear();
    EXPECT_EQ(runCommand(skarn() + " --version", &out), 0);
    EXPECT_NE(out.find("skarn "), std::string::npos);
    EXPECT_NE(runCommand(skarn() + " nosuchcommand 2>/dev/null"), 0);
}

TEST(SkarnHost, CardsTellsCardsFromOtherFolders) {
    TempDir dir;
    ASSERT_EQ(runCommand(mkcard() + " " + (dir / "card") + " --clip dv-ntsc,frames=2 -q"), 0);
    makeDirs(dir / "other");
    std::string out;
    EXPECT_EQ(runCommand(skarn() + " cards --json " + (dir / "card") + " " + (dir / "other"), &out), 0);
    auto j = nlohmann::json::parse(out);
    ASSERT_EQ(j.size(), 2u);
    EXPECT_TRUE(j[0]["isCard"].get<bool>());
    EXPECT_FALSE(j[1]["isCard"].get<bool>());
    // Nothing recognised: non-zero exit.
    EXPECT_EQ(runCommand(skarn() + " cards " + (dir / "other") + " >/dev/null"), 1);
}

TEST(SkarnHost, ABrokenBundleIsOneLineAndAFailure) {
    TempDir dir;
    std::string out;
    int rc = runCommand(skarn() + " --bundle " + (dir / "none.kilnplugin") + " plugin 2>&1", &out);
    EXPECT_NE(rc, 0);
    EXPECT_NE(out.find("none.kilnplugin"), std::string::npos);
    EXPECT_EQ(std::count(out.begin(), out.end(), '\n'), 1);
}

TEST(SkarnHost, PluginIdentityAsJSON) {
    std::string out;
    ASSERT_EQ(runCommand(skarn() + " plugin --json", &out), 0);
    auto j = nlohmann::json::parse(out);
    EXPECT_EQ(j["name"], "Skarn");
    EXPECT_EQ(j["targetFormats"][0]["preferredTargetFormatIndex"], 5);
}

namespace {
nlohmann::json runJSON(const std::string& args, int expectedExit = 0) {
    std::string out;
    int rc = runCommand(skarn() + " " + args, &out);
    EXPECT_EQ(rc, expectedExit) << args;
    auto j = nlohmann::json::parse(out, nullptr, false);
    EXPECT_FALSE(j.is_discarded()) << out;
    return j;
}
}  // namespace

TEST(SkarnHost, ClipsOfEveryFamilyFieldByField) {
    TempDir dir;
    CardSpec card;
    card.root = dir / "card";
    unsigned index = 1;
    for (const auto& f : cardFamilies()) {
        ClipSpec c = defaultClip(f, index++);
        c.frames = f.avclip ? 6 : 3;
        c.audioChannels = f.dv ? 2 : 4;
        c.metadata.userClipName.reset();
        card.clips.push_back(c);
    }
    std::vector<WrittenClip> written;
    std::string error;
    ASSERT_TRUE(writeCard(card, &written, &error)) << error;

    nlohmann::json clips = runJSON("clips --json " + card.root);
    ASSERT_EQ(clips.size(), card.clips.size());
    for (const auto& clip : clips) {
        std::string name = clip["name"];
        const ClipSpec* params = nullptr;
        for (const auto& c : card.clips)
            if (c.name == name) params = &c;
        ASSERT_NE(params, nullptr) << name;
        const CardFamily& f = *params->family;
        SCOPED_TRACE(f.name);
        EXPECT_EQ(clip["videoFormat"], f.videoFormat);
        EXPECT_EQ(clip["isMXFOp1bFormat"], f.avclip);
        EXPECT_EQ(clip["clipID"], globalClipIDFor(params->name));
        EXPECT_EQ(clip["mediaDuration"], params->frames);
        EXPECT_EQ(clip["numberOfAudioChannels"], params->audioChannels);
        EXPECT_EQ(clip["mediaStart"].get<std::string>().substr(0, 8), "01:00:00");
        // The transport rate is the stream's frame rate (a field rate is halved).
        double rate = double(f.editRateNum) / f.editRateDen;
        EXPECT_NEAR(clip["transportRate"].get<double>(), rate, 0.01);
        EXPECT_EQ(clip["isDropFrame"], f.editRateDen == 1001 && f.frameRate.rfind("23.98", 0) != 0);
        EXPECT_EQ(clip["path"], written[size_t(&*params - &card.clips[0])].clipPath);
        if (f.dv) {
            EXPECT_EQ(clip["videoDataSize"], uint64_t(f.frameBytes) * params->frames);
            EXPECT_EQ(clip["sourceFormat"].get<std::string>().substr(0, 2), "dv");
        } else if (f.videoFormat >= 15) {
            // AVC-Intra 100: the class 100 codes.
            EXPECT_EQ(clip["sourceFormat"].get<std::string>().substr(0, 3), "ai1");
        }
        EXPECT_TRUE(clip["format"].is_string());
        EXPECT_NE(clip["format"], "Unknown");
    }
}

TEST(SkarnHost, InfoFindAndDelete) {
    TempDir dir;
    CardSpec card;
    card.root = dir / "card";
    ClipSpec a = defaultClip(*cardFamilyNamed("dvcpro50-ntsc"), 1);
    a.frames = 2;
    a.voice = true;
    ClipSpec b = defaultClip(*cardFamilyNamed("dvcpro50-ntsc"), 2);
    b.frames = 2;
    card.clips = {a, b};
    ASSERT_TRUE(writeCard(card));

    nlohmann::json info = runJSON("info --json " + card.root + ":A001");
    EXPECT_EQ(info["videoFilePath"], card.root + "/CONTENTS/VIDEO/A001.MXF");
    EXPECT_EQ(info["audioFilePaths"].size(), 2u);
    EXPECT_TRUE(info["isDeletable"].get<bool>());
    EXPECT_EQ(info["cardMetadata"]["corvane_Skarn_memo_text"], "slate 1");
    EXPECT_EQ(info["cardMetadata"]["scene"], nullptr);
    EXPECT_EQ(info["metadata"]["movie"].size() > 0, true);
    // The same clip by its file path.
    EXPECT_EQ(runJSON("info --json " + card.root + "/CONTENTS/CLIP/A001.XML")["clipID"], info["clipID"]);

    std::string out;
    EXPECT_EQ(runCommand(skarn() + " find " + card.root + " " + globalClipIDFor("A002"), &out), 0);
    EXPECT_EQ(runCommand(skarn() + " find " + card.root + " NOPE", &out), 1);

    // Not at a terminal and without --yes: nothing is deleted.
    EXPECT_NE(runCommand(skarn() + " delete " + card.root + ":A001 </dev/null 2>/dev/null"), 0);
    EXPECT_TRUE(FileSystem::fileExists(card.root + "/CONTENTS/VIDEO/A001.MXF"));
    // An item of the AUDIO folder named after the clip goes with it, and is
    // listed: here a link to a file outside the card, which must stay.
    writeTextFile(dir / "outside.MXF", "not the card's");
    ASSERT_EQ(::symlink((dir / "outside.MXF").c_str(), (card.root + "/CONTENTS/AUDIO/A001_link.MXF").c_str()), 0);
    out.clear();
    EXPECT_EQ(runCommand(skarn() + " delete --yes " + card.root + ":A001", &out), 0);
    EXPECT_NE(out.find("removed " + card.root + "/CONTENTS/VIDEO/A001.MXF"), std::string::npos);
    EXPECT_NE(out.find("removed " + card.root + "/CONTENTS/AUDIO/A001_link.MXF"), std::string::npos) << out;
    EXPECT_TRUE(FileSystem::fileExists(dir / "outside.MXF"));
    EXPECT_FALSE(FileSystem::fileExists(card.root + "/CONTENTS/VOICE/A001.WAV"));
    EXPECT_TRUE(FileSystem::fileExists(card.root + "/CONTENTS/VIDEO/A002.MXF"));
    EXPECT_TRUE(FileSystem::fileExists(card.root + "/CONTENTS/AUDIO/A00200.MXF"));
    EXPECT_EQ(runJSON("clips --json " + card.root).size(), 1u);
}

TEST(SkarnHost, BadCardsAndClipsAreOneLineErrors) {
    TempDir dir;
    std::string out;
    EXPECT_EQ(runCommand(skarn() + " clips " + (dir / "nowhere") + " 2>&1", &out), 1);
    EXPECT_NE(out.find("nowhere: no such folder"), std::string::npos);
    makeDirs(dir / "card/CONTENTS/CLIP");
    makeDirs(dir / "card/CONTENTS/AVCLIP");
    writeTextFile(dir / "card/CONTENTS/CLIP/A001.XML", "<broken");
    out.clear();
    EXPECT_EQ(runCommand(skarn() + " clips " + (dir / "card") + " 2>&1", &out), 1);
    EXPECT_NE(out.find("no clip could be read"), std::string::npos);
    out.clear();
    EXPECT_EQ(runCommand(skarn() + " info " + (dir / "card") + ":A009 2>&1", &out), 1);
    EXPECT_EQ(std::count(out.begin(), out.end(), '\n'), 1) << out;
    // A typo where the command belongs is named.
    out.clear();
    EXPECT_NE(runCommand(skarn() + " clip " + (dir / "card") + " 2>&1", &out), 0);
    EXPECT_NE(out.find("unknown command \"clip\""), std::string::npos) << out;
}
