#include "SkarnFactory.h"
#include "SkarnPlugin.h"
#include "SkarnVolume.h"

#include "FileSystem.h"
#include "CardWriter.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <algorithm>

namespace {
Ref<SkarnPlugin> pluginWithBuiltBundle() {
    Ref<SkarnPlugin> p = SkarnPlugin::init();
    p->setBundle(Bundle::bundleWithPath(buildDir() + "/Skarn.kilnplugin"));
    return p;
}

void makeCard(const TempDir& dir, std::initializer_list<const char*> entries, const std::string& contents = "CONTENTS") {
    makeDirs(dir / contents);
    for (const char* e : entries) makeDirs(dir / (contents + "/" + e));
}
}  // namespace

TEST(SkarnPlugin, CardDetection) {
    Ref<SkarnPlugin> plugin = pluginWithBuiltBundle();
    {
        TempDir dir;
        makeCard(dir, {"VIDEO", "AUDIO", "CLIP"});
        EXPECT_FALSE(plugin->pathIsValidVolume(dir.path()));
        makeDirs(dir / "CONTENTS/ICON");
        EXPECT_TRUE(plugin->pathIsValidVolume(dir.path()));
    }
    {
        TempDir dir;
        makeCard(dir, {"avclip"}, "contents");
        EXPECT_TRUE(plugin->pathIsValidVolume(dir.path()));
    }
    {
        // Entries may be files as well as folders.
        TempDir dir;
        makeDirs(dir / "Contents");
        for (const char* n : {"video", "Audio", "clip", "ICON"}) writeTextFile(dir / (std::string("Contents/") + n), "");
        EXPECT_TRUE(plugin->pathIsValidVolume(dir.path()));
    }
    TempDir empty;
    EXPECT_FALSE(plugin->pathIsValidVolume(empty.path()));
    EXPECT_FALSE(plugin->pathIsValidVolume(std::nullopt));
    EXPECT_FALSE(plugin->pathIsValidVolume(empty / "missing"));
}

TEST(SkarnPlugin, IdentityComesFromTheBundle) {
    Ref<SkarnPlugin> plugin = pluginWithBuiltBundle();
    ASSERT_TRUE(plugin->uuid());
    EXPECT_EQ(*plugin->name(), "Skarn");
    EXPECT_TRUE(plugin->version());

    TempDir dir;
    writeTextFile(dir / "E.kilnplugin/Info.json", R"({"KilnPlugins":[]})");
    plugin->setBundle(Bundle::bundleWithPath(dir / "E.kilnplugin"));
    EXPECT_FALSE(plugin->uuid());
    EXPECT_FALSE(plugin->name());
    EXPECT_FALSE(plugin->formatName());
    EXPECT_FALSE(plugin->version());
}

TEST(SkarnPlugin, TargetFormatsListTheSixCodes) {
    Value formats = pluginWithBuiltBundle()->targetFormats();
    ASSERT_EQ(formats.count(), 1u);
    const Value& d = formats[size_t(0)];
    EXPECT_EQ(d.dictionary().keys(),
              (std::vector<std::string>{"supportedTargetFormats", "preferredTargetFormatIndex", "name"}));
    const Value& codes = d["supportedTargetFormats"];
    ASSERT_EQ(codes.count(), 6u);
    EXPECT_EQ(codes[size_t(0)].integerValue(), 0x61706368);  // 'apch'
    EXPECT_EQ(codes[size_t(4)].integerValue(), -2);
    EXPECT_EQ(codes[size_t(5)].integerValue(), -1);
    EXPECT_EQ(d["preferredTargetFormatIndex"].integerValue(), 5);
}

TEST(SkarnPlugin, NotificationsCarryThePluginIdentifier) {
    Ref<SkarnPlugin> plugin = pluginWithBuiltBundle();
    Ref<NotificationCenter> center = NotificationCenter::notificationCenter();
    std::vector<std::string> seen;
    center->addObserver("", [&](const Notification& n) { seen.push_back(n.name + "|" + n.object.string()); });
    plugin->postVolumeFoundNotification();  // no centre yet: nothing
    plugin->setNotificationCenter(center);
    plugin->postVolumeFoundNotification();
    plugin->postInvalidNotification();
    plugin->shutdown();
    plugin->postInvalidNotification();
    ASSERT_EQ(seen.size(), 2u);
    EXPECT_EQ(seen[0], "VestaKilnPluginNewVolumeNotification|" + *plugin->uuid());
    EXPECT_EQ(seen[1], "VestaKilnPluginVolumesInvalid|" + *plugin->uuid());
}

TEST(SkarnPlugin, ClipSearchStopsLoadingAfterTheFirstBadDocument) {
    Ref<SkarnPlugin> plugin = pluginWithBuiltBundle();
    TempDir dir;
    auto clip = [](const std::string& gid) {
        return "<R xmlns=\"urn:x\"><ClipContent><GlobalClipID>" + gid + "</GlobalClipID></ClipContent></R>";
    };
    writeTextFile(dir / "CONTENTS/CLIP/A001.XML", clip("AAAA"));
    writeTextFile(dir / "CONTENTS/CLIP/A002.XML", "<broken");
    writeTextFile(dir / "CONTENTS/CLIP/A003.XML", clip("CCCC"));
    writeTextFile(dir / "CONTENTS/CLIP/._A004.XML", clip("DDDD"));
    EXPECT_TRUE(plugin->doesPath(dir.path(), std::vector<std::string>{"AAAA"}));
    // A003 lies after the unloadable A002, so it is never read.
    EXPECT_FALSE(plugin->doesPath(dir.path(), std::vector<std::string>{"CCCC"}));
    EXPECT_FALSE(plugin->doesPath(dir.path(), std::vector<std::string>{"DDDD"}));
    // A path ending in /CONTENTS is taken as the CONTENTS folder itself.
    EXPECT_TRUE(plugin->doesPath(dir / "CONTENTS", std::vector<std::string>{"AAAA"}));
    EXPECT_FALSE(plugin->doesPath(dir.path(), std::vector<std::string>{}));
    EXPECT_FALSE(plugin->doesPath(std::nullopt, std::vector<std::string>{"AAAA"}));
}

TEST(SkarnFactory, HandsOutThePluginOnlyForItsIdentifier) {
    Ref<SkarnFactory> factory = SkarnFactory::factory();
    factory->plugin()->setBundle(Bundle::bundleWithPath(buildDir() + "/Skarn.kilnplugin"));
    auto uuid = factory->plugin()->uuid();
    ASSERT_TRUE(uuid);
    EXPECT_EQ(factory->pluginForID(Value(*uuid)).get(), factory->plugin().get());
    EXPECT_FALSE(factory->pluginForID(Value("something-else")));
    EXPECT_FALSE(factory->pluginForID(Value()));
}

TEST(SkarnVolume, PathsNameAndClipURLs) {
    TempDir dir;
    writeTextFile(dir / "lastclip.txt", "A001");
    writeTextFile(dir / "contents/video/A001.MXF", "");
    writeTextFile(dir / "contents/audio/A00100.mxf", "");
    writeTextFile(dir / "contents/icon/A001.bmp", "");
    writeTextFile(dir / "contents/clip/A001.XML", "");
    writeTextFile(dir / "contents/voice/A001.WAV", "");
    writeTextFile(dir / "contents/video/._A001.MXF", "");
    Ref<SkarnVolume> v = SkarnVolume::initWithPath(dir.path(), nullptr);
    EXPECT_EQ(*v->name(), FileSystem::lastPathComponent(dir.path()));
    EXPECT_EQ(*v->CONTENTSPath(), dir / "contents");
    std::vector<std::string> urls = v->volumeClipURLs();
    ASSERT_FALSE(urls.empty());
    EXPECT_EQ(urls[0], dir / "lastclip.txt");
    std::vector<std::string> rest(urls.begin() + 1, urls.end());
    std::sort(rest.begin(), rest.end());
    EXPECT_EQ(rest, (std::vector<std::string>{dir / "contents/audio/A00100.mxf", dir / "contents/icon/A001.bmp",
                                              dir / "contents/video/A001.MXF"}));
    EXPECT_FALSE(SkarnVolume::initWithPath(std::nullopt, nullptr));
    Ref<SkarnVolume> copy = v->copyWithZone();
    EXPECT_EQ(copy->path(), v->path());
    EXPECT_NE(copy.get(), v.get());
}

TEST(SkarnVolume, WithoutContentsThereAreNoClipURLsButLastClip) {
    TempDir dir;
    Ref<SkarnVolume> v = SkarnVolume::initWithPath(dir.path(), nullptr);
    EXPECT_FALSE(v->CONTENTSPath());
    EXPECT_TRUE(v->volumeClipURLs().empty());
}

namespace {
std::vector<std::string> clipFileNames(const std::optional<std::vector<Ref<VestaKilnClipDataSourceProtocol>>>& clips) {
    std::vector<std::string> names;
    if (clips)
        for (const auto& c : *clips) names.push_back(FileSystem::lastPathComponent(c->valueForKey("path").string()));
    return names;
}

ClipSpec shortClip(const char* family, const char* name) {
    ClipSpec c = defaultClip(*cardFamilyNamed(family), 1);
    c.name = name;
    c.frames = 2;
    c.audioChannels = 1;
    return c;
}
}  // namespace

TEST(SkarnPlugin, ClipEnumerationRules) {
    Ref<SkarnPlugin> plugin = pluginWithBuiltBundle();
    TempDir dir;
    CardSpec card;
    card.root = dir / "card";
    card.clips = {shortClip("dv-ntsc", "B001"), shortClip("dvcpro50-ntsc", "A002"), shortClip("avclip-intra", "A001")};
    ASSERT_TRUE(writeCard(card));
    // An XML beside the self-contained clip of the same name is hidden by it...
    std::string xml = clipXMLText(shortClip("dv-ntsc", "A001"), 0, {});
    writeTextFile(card.root + "/CONTENTS/CLIP/A001.XML", xml);
    // ...but only when spelled the same way; hidden files are never clips.
    writeTextFile(card.root + "/CONTENTS/CLIP/._B002.XML", xml);
    writeTextFile(card.root + "/CONTENTS/CLIP/notes.txt", "x");
    Ref<VestaKilnVolumeDataSourceProtocol> volume = plugin->volumeWithPath(card.root, nullptr);
    auto clips = plugin->clipsForVolume(volume.get());
    EXPECT_EQ(clipFileNames(clips), (std::vector<std::string>{"A001.MXF", "A002.XML", "B001.XML"}));

    writeTextFile(card.root + "/CONTENTS/CLIP/a001.xml", xml);
    EXPECT_EQ(clipFileNames(plugin->clipsForVolume(volume.get())),
              (std::vector<std::string>{"A001.MXF", "a001.xml", "A002.XML", "B001.XML"}));
}

// Only an upper-case "XML" name is compared with the self-contained clips, and
// the comparison is exact: a copy that lower-cased a name must not lose a clip.
TEST(SkarnPlugin, OnlyUpperCaseXMLNamesAreHiddenBySelfContainedClips) {
    Ref<SkarnPlugin> plugin = pluginWithBuiltBundle();
    std::string xml = clipXMLText(shortClip("dv-ntsc", "A001"), 0, {});
    struct Case {
        std::vector<std::string> clipXMLNames;
        std::vector<std::string> listed;
    };
    const Case cases[] = {
        {{"A001.XML"}, {"A001.MXF"}},
        {{"A001.xml"}, {"A001.MXF", "A001.xml"}},
        {{"a001.XML"}, {"A001.MXF", "a001.XML"}},
        {{"A001.Xml"}, {"A001.MXF"}},  // not a clip XML at all
        // The listed "A001.xml" is then opened through the case-insensitive
        // lookup, where the first of the case twins wins.
        {{"A001.XML", "A001.xml"}, {"A001.MXF", "A001.XML"}},
    };
    for (const Case& c : cases) {
        TempDir dir;
        CardSpec card;
        card.root = dir / "card";
        card.clips = {shortClip("avclip-intra", "A001")};
        ASSERT_TRUE(writeCard(card));
        for (const std::string& name : c.clipXMLNames) writeTextFile(card.root + "/CONTENTS/CLIP/" + name, xml);
        Ref<VestaKilnVolumeDataSourceProtocol> volume = plugin->volumeWithPath(card.root, nullptr);
        EXPECT_EQ(clipFileNames(plugin->clipsForVolume(volume.get())), c.listed) << c.clipXMLNames.front();
    }
}

TEST(SkarnPlugin, NoClipFolderMeansNoClipsEvenWithSelfContainedOnes) {
    Ref<SkarnPlugin> plugin = pluginWithBuiltBundle();
    TempDir dir;
    CardSpec card;
    card.root = dir / "card";
    card.clips = {shortClip("avclip-intra", "A001")};
    ASSERT_TRUE(writeCard(card));
    Ref<VestaKilnVolumeDataSourceProtocol> volume = plugin->volumeWithPath(card.root, nullptr);
    EXPECT_TRUE(plugin->clipsForVolume(volume.get()));
    FileSystem::removeItem(card.root + "/CONTENTS/CLIP");
    EXPECT_FALSE(plugin->clipsForVolume(volume.get()));
    // A card whose clips all fail to load answers nil, not an empty list.
    TempDir empty;
    makeDirs(empty / "CONTENTS/CLIP");
    writeTextFile(empty / "CONTENTS/CLIP/A001.XML", "<broken");
    EXPECT_FALSE(plugin->clipsForVolume(plugin->volumeWithPath(empty.path(), nullptr).get()));
}

TEST(SkarnPlugin, ExtendedMetadataDefinitions) {
    Value defs = pluginWithBuiltBundle()->extendedMetadataDefinitions();
    ASSERT_EQ(defs.count(), 31u);
    for (size_t i = 0; i < defs.count(); ++i) {
        const Dictionary& d = defs[i].dictionary();
        if (i == 20) {
            EXPECT_EQ(defs[i]["VestaKilnMetadataTypeKey"].string(), "VestaKilnMetadataTypeBoolean");
            EXPECT_TRUE(defs[i]["VestaKilnMetadataValueTransformerKey"].isObject());
        } else {
            EXPECT_EQ(defs[i]["VestaKilnMetadataTypeKey"].string(), "VestaKilnMetadataTypeString");
            EXPECT_FALSE(d.contains("VestaKilnMetadataValueTransformerKey")) << i;
        }
    }
    EXPECT_EQ(defs[size_t(0)]["VestaKilnMetadataReverseDNSKey"].string(),
              "com.corvane.professionalplugin.skarn.clipmetadata.datasource");
    EXPECT_EQ(defs[size_t(30)]["VestaKilnMetadataDescriptionKey"].string(), "MXF Package ID");
}
