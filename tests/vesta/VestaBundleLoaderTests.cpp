#include "VestaBundleLoader.h"

#include "FileSystem.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <unistd.h>

namespace {
std::string builtBundle() { return buildDir() + "/Skarn.kilnplugin"; }
}

TEST(VestaBundleLoader, LoadsTheBuiltPluginAndHandsOutItsPlugin) {
    std::string error;
    Ref<VestaBundleLoader> loader = VestaBundleLoader::loadBundle(builtBundle(), &error);
    ASSERT_TRUE(loader) << error;
    auto ids = loader->pluginIDs();
    ASSERT_EQ(ids.size(), 1u);
    Ref<VestaKilnPlugin> plugin = loader->firstPlugin();
    ASSERT_TRUE(plugin);
    EXPECT_EQ(plugin->uuid(), ids[0]);
    EXPECT_TRUE(plugin->initialize());
    EXPECT_TRUE(plugin->respondsToSelector("doesPath:containSomeOfClipsWithUIDs:"));
    EXPECT_FALSE(plugin->respondsToSelector("noSuchSelector"));
    EXPECT_FALSE(loader->principal()->pluginForID(Value("not-the-id")));
    // The plug-in found its bundle from its own library's location.
    Ref<Image> icon = plugin->iconForVolumeWithPath("/anywhere");
    ASSERT_TRUE(icon);
    EXPECT_NE(icon->path().find("VolumeIcon_SkarnCard"), std::string::npos);
}

TEST(VestaBundleLoader, BrokenBundlesAnswerOneClearLine) {
    TempDir dir;
    std::string error;
    EXPECT_FALSE(VestaBundleLoader::loadBundle(dir / "Missing.kilnplugin", &error));
    EXPECT_NE(error.find("no such bundle folder"), std::string::npos);

    makeDirs(dir / "NoInfo.kilnplugin");
    EXPECT_FALSE(VestaBundleLoader::loadBundle(dir / "NoInfo.kilnplugin", &error));
    EXPECT_NE(error.find("Info.json"), std::string::npos);

    writeTextFile(dir / "BadJSON.kilnplugin/Info.json", "{");
    EXPECT_FALSE(VestaBundleLoader::loadBundle(dir / "BadJSON.kilnplugin", &error));
    EXPECT_NE(error.find("not a JSON object"), std::string::npos);

    writeTextFile(dir / "NoLib.kilnplugin/Info.json", R"({"BundleExecutable":"X.so","PrincipalClass":"SkarnFactory"})");
    EXPECT_FALSE(VestaBundleLoader::loadBundle(dir / "NoLib.kilnplugin", &error));
    EXPECT_NE(error.find("plug-in library missing"), std::string::npos);

    writeTextFile(dir / "Junk.kilnplugin/Info.json", R"({"BundleExecutable":"X.so","PrincipalClass":"SkarnFactory"})");
    writeTextFile(dir / "Junk.kilnplugin/X.so", "not an ELF file");
    EXPECT_FALSE(VestaBundleLoader::loadBundle(dir / "Junk.kilnplugin", &error));
    EXPECT_NE(error.find("cannot load"), std::string::npos);

    // A real library without the principal class entry.
    writeTextFile(dir / "NoEntry.kilnplugin/Info.json", R"({"BundleExecutable":"X.so","PrincipalClass":"Other"})");
    ASSERT_EQ(::symlink((builtBundle() + "/Skarn.so").c_str(), (dir / "NoEntry.kilnplugin/X.so").c_str()), 0);
    EXPECT_FALSE(VestaBundleLoader::loadBundle(dir / "NoEntry.kilnplugin", &error));
    EXPECT_NE(error.find("VestaKilnPrincipalClass_Other"), std::string::npos) << error;
    EXPECT_EQ(error.find('\n'), std::string::npos);
}

TEST(VestaBundleLoader, TheLibraryExportsOnlyItsEntry) {
    std::string out;
    if (runCommand("command -v nm >/dev/null") != 0) GTEST_SKIP() << "nm not installed";
    ASSERT_EQ(runCommand("nm -D --defined-only '" + builtBundle() + "/Skarn.so' | awk '{print $3}'", &out), 0);
    EXPECT_EQ(out, "VestaKilnPrincipalClass_SkarnFactory\n");
}
