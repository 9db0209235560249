// The reference host as a user runs it.
#include "CardWriter.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include <algorithm>

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
