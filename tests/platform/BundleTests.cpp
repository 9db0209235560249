#include "Bundle.h"
#include "NotificationCenter.h"
#include "Preferences.h"
#include "FileSystem.h"

#include "TestSupport.h"

#include <gtest/gtest.h>

#include <cstdlib>

namespace {
void makeBundle(const TempDir& dir) {
    writeTextFile(dir / "B.kilnplugin/Info.json",
                  R"({"BundleExecutable":"B.so","PrincipalClass":"F","KilnPlugins":[{"PluginID":"X"}]})");
    writeTextFile(dir / "B.kilnplugin/Resources/en.lproj/Skarn.strings",
                  "# comment\nDV - PAL = DV - PAL\nSkarn AVC-Intra = AVC-Intra (Skarn)\nmulti = a\\nb\n");
    writeTextFile(dir / "B.kilnplugin/Resources/fr.lproj/Skarn.strings", "DV - PAL = DV - PAL (fr)\n");
    writeTextFile(dir / "B.kilnplugin/Resources/VolumeIcon_SkarnCard.png", "png");
}

struct EnvGuard {
    explicit EnvGuard(const char* name) : name(name) {
        if (const char* v = std::getenv(name)) old = v;
    }
    ~EnvGuard() {
        if (old) ::setenv(name, old->c_str(), 1);
        else ::unsetenv(name);
    }
    const char* name;
    std::optional<std::string> old;
};
}  // namespace

TEST(Bundle, LocalisedLookupFallsBackToEnglishThenDefaultThenKey) {
    TempDir dir;
    makeBundle(dir);
    EnvGuard all("LC_ALL"), lang("LANG");
    ::unsetenv("LC_ALL");
    ::setenv("LANG", "fr_FR.UTF-8", 1);
    Ref<Bundle> b = Bundle::bundleWithPath(dir / "B.kilnplugin");
    ASSERT_TRUE(b);
    EXPECT_EQ(b->localizedString("DV - PAL", std::string(""), "Skarn"), "DV - PAL (fr)");
    EXPECT_EQ(b->localizedString("Skarn AVC-Intra", std::string(""), "Skarn"), "AVC-Intra (Skarn)");
    EXPECT_EQ(b->localizedString("multi", std::nullopt, "Skarn"), "a\nb");
    EXPECT_EQ(b->localizedString("absent", std::string("fallback"), "Skarn"), "fallback");
    EXPECT_EQ(b->localizedString("absent", std::string(""), "Skarn"), "absent");
    EXPECT_EQ(b->localizedString("DV - PAL", std::string(""), "NoSuchTable"), "DV - PAL");
}

TEST(Bundle, InformationDictionaryAndResources) {
    TempDir dir;
    makeBundle(dir);
    Ref<Bundle> b = Bundle::bundleWithPath(dir / "B.kilnplugin");
    EXPECT_EQ(b->infoDictionary()["KilnPlugins"][size_t(0)]["PluginID"].string(), "X");
    EXPECT_EQ(*b->principalClassName(), "F");
    EXPECT_EQ(*b->executablePath(), dir / "B.kilnplugin/B.so");
    Ref<Image> icon = b->imageForResource("VolumeIcon_SkarnCard");
    ASSERT_TRUE(icon);
    EXPECT_EQ(icon->bytes().size(), 3u);
    EXPECT_FALSE(b->imageForResource("Nothing"));
    EXPECT_FALSE(Bundle::bundleWithPath(dir / "missing"));
}

TEST(Bundle, BrokenInfoDictionaryIsNullNotACrash) {
    TempDir dir;
    writeTextFile(dir / "C.kilnplugin/Info.json", "{not json");
    Ref<Bundle> b = Bundle::bundleWithPath(dir / "C.kilnplugin");
    ASSERT_TRUE(b);
    EXPECT_TRUE(b->infoDictionary().isNull());
    EXPECT_FALSE(b->principalClassName());
}

TEST(Preferences, RoundTripThroughTheDomainFile) {
    TempDir dir;
    EnvGuard xdg("XDG_CONFIG_HOME");
    ::setenv("XDG_CONFIG_HOME", dir.path().c_str(), 1);
    CFPreferencesResetCache();
    const std::string app = "com.example.editor";
    EXPECT_TRUE(CFPreferencesCopyAppValue("k", app).isNull());
    CFPreferencesSetAppValue("k", Value(Dictionary{{"n", 3}}), app);
    CFPreferencesSetAppValue("flag", Value(true), app);
    EXPECT_TRUE(CFPreferencesAppSynchronize(app));
    CFPreferencesResetCache();
    EXPECT_EQ(CFPreferencesCopyAppValue("k", app)["n"].integerValue(), 3);
    EXPECT_EQ(CFPreferencesCopyAppValue("flag", app).boolValue(), true);
    CFPreferencesSetAppValue("k", Value(), app);
    EXPECT_TRUE(CFPreferencesAppSynchronize(app));
    CFPreferencesResetCache();
    EXPECT_TRUE(CFPreferencesCopyAppValue("k", app).isNull());
    EXPECT_TRUE(FileSystem::fileExists(CFPreferencesPathForApplication(app)));
    // Domains are separate files.
    EXPECT_TRUE(CFPreferencesCopyAppValue("flag", "com.example.other").isNull());
    CFPreferencesResetCache();
}

TEST(NotificationCenter, PostsToObserversOfTheNameAndToCatchAllObservers) {
    Ref<NotificationCenter> center = NotificationCenter::notificationCenter();
    std::vector<std::string> seen;
    uint64_t a = center->addObserver("A", [&](const Notification& n) { seen.push_back("A:" + n.object.string()); });
    center->addObserver("", [&](const Notification& n) { seen.push_back("*:" + n.name); });
    center->postNotificationName("A", Value("x"));
    center->postNotificationName("B", Value());
    center->removeObserver(a);
    center->postNotificationName("A", Value("y"));
    EXPECT_EQ(seen, (std::vector<std::string>{"A:x", "*:A", "*:B", "*:A"}));
}
