#include "SkarnPlugin.h"

#include "FileSystem.h"
#include "SkarnFileUtilities.h"
#include "SkarnLog.h"
#include "SkarnVolume.h"
#include "XMLDocument.h"

namespace {
// Any symbol of this library locates the bundle around it.
void bundleAnchor() {}

constexpr int32_t fourCC(const char (&s)[5]) {
    return int32_t(uint32_t(uint8_t(s[0])) << 24 | uint32_t(uint8_t(s[1])) << 16 | uint32_t(uint8_t(s[2])) << 8 |
                   uint32_t(uint8_t(s[3])));
}
}  // namespace

Ref<SkarnPlugin> SkarnPlugin::init() {
    Ref<SkarnPlugin> p(new SkarnPlugin);
    p->_bundle = Bundle::bundleForAddress(reinterpret_cast<const void*>(&bundleAnchor));
    p->_avciCodecFound = false;
    p->_threadSafeFileManager = ThreadSafeFileManager::fileManager();
    return p;
}

std::optional<std::string> SkarnPlugin::identityString(const char* key) const {
    if (!_bundle) return std::nullopt;
    const Value& plugins = _bundle->infoDictionary()["KilnPlugins"];
    if (!plugins.isArray() || plugins.count() == 0) return std::nullopt;
    const Value& v = plugins[size_t(0)][key];
    if (!v.isString()) return std::nullopt;
    return v.string();
}

std::optional<std::string> SkarnPlugin::uuid() { return identityString("PluginID"); }
std::optional<std::string> SkarnPlugin::name() { return identityString("PluginName"); }
std::optional<std::string> SkarnPlugin::formatName() { return identityString("PluginFormatName"); }
std::optional<std::string> SkarnPlugin::version() { return identityString("PluginVersion"); }

void SkarnPlugin::setNotificationCenter(Ref<NotificationCenter> center) { _pluginNotificationCenter = std::move(center); }

bool SkarnPlugin::shutdown() {
    _pluginNotificationCenter = nullptr;
    return true;
}

bool SkarnPlugin::pathIsValidVolume(const std::optional<std::string>& path) {
    if (!path) return false;
    auto contents = SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("CONTENTS", *path);
    if (!contents) return false;
    auto entries = _threadSafeFileManager->directoryContentsAtPath(contents);
    if (!entries) return false;
    bool video = false, audio = false, clip = false, icon = false;
    for (const std::string& e : *entries) {
        video = video || FileSystem::caseInsensitiveEqual(e, "VIDEO");
        audio = audio || FileSystem::caseInsensitiveEqual(e, "AUDIO");
        clip = clip || FileSystem::caseInsensitiveEqual(e, "CLIP");
        icon = icon || FileSystem::caseInsensitiveEqual(e, "ICON");
        if ((video && audio && clip && icon) || FileSystem::caseInsensitiveEqual(e, "AVCLIP")) return true;
    }
    return false;
}

Ref<VestaKilnVolumeDataSourceProtocol> SkarnPlugin::volumeWithPath(const std::optional<std::string>& path, Value*) {
    if (!path) return nullptr;
    return SkarnVolume::initWithPath(path, iconForVolumeWithPath(path));
}

Ref<Image> SkarnPlugin::iconForVolumeWithPath(const std::optional<std::string>&) {
    return _bundle ? _bundle->imageForResource("VolumeIcon_SkarnCard") : nullptr;
}

std::optional<std::vector<Ref<VestaKilnClipDataSourceProtocol>>> SkarnPlugin::clipsForVolume(
    VestaKilnVolumeDataSourceProtocol*) {
    // Clip construction arrives with the clip document.
    return std::nullopt;
}

bool SkarnPlugin::doesPath(const std::optional<std::string>& path,
                           const std::optional<std::vector<std::string>>& uids) {
    if (!path || !uids || uids->empty()) return false;
    std::optional<std::string> contents;
    if (FileSystem::hasSuffix(*path, "/CONTENTS"))
        contents = *path;
    else
        contents = SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("CONTENTS", *path);
    if (!contents) return false;
    auto clipFolder = SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("CLIP", contents);
    if (!clipFolder) return false;
    auto entries = _threadSafeFileManager->directoryContentsAtPath(clipFolder);
    if (!entries) return false;
    // Deliberately, the first document that fails to load stops all further
    // loading: later files are passed over unread.
    bool loadingStopped = false;
    for (const std::string& name : *entries) {
        if (!(FileSystem::hasSuffix(name, "XML") || FileSystem::hasSuffix(name, "xml"))) continue;
        if (FileSystem::hasPrefix(name, ".")) continue;
        auto file = SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath(name, clipFolder);
        if (!file || loadingStopped) continue;
        Ref<XMLDocument> doc = XMLDocument::documentWithContentsOfFile(*file);
        if (!doc) {
            loadingStopped = true;
            continue;
        }
        XMLNode gid = doc->rootElement().firstNodeForXPath("ClipContent/GlobalClipID");
        if (gid) {
            std::string text = gid.stringValue();
            for (const std::string& uid : *uids)
                if (uid == text) return true;
        }
    }
    return false;
}

Value SkarnPlugin::targetFormats() {
    Array codes{Value(fourCC("apch")), Value(fourCC("apcn")), Value(fourCC("apcs")), Value(fourCC("apco")),
                Value(-2), Value(-1)};
    Dictionary d;
    d.set("supportedTargetFormats", Value(std::move(codes)));
    d.set("preferredTargetFormatIndex", Value(5));
    d.set("name", Value(_bundle ? _bundle->localizedString("Skarn AVC-Intra", std::string(""), "Skarn")
                                : std::string("Skarn AVC-Intra")));
    return Value(Array{Value(std::move(d))});
}

void SkarnPlugin::postVolumeFoundNotification() {
    if (_pluginNotificationCenter)
        _pluginNotificationCenter->postNotificationName(VestaKilnPluginNewVolumeNotification, Value(uuid()));
}

void SkarnPlugin::postInvalidNotification() {
    if (_pluginNotificationCenter)
        _pluginNotificationCenter->postNotificationName(VestaKilnPluginVolumesInvalid, Value(uuid()));
}

bool SkarnPlugin::respondsToSelector(std::string_view s) const {
    return s == "doesPath:containSomeOfClipsWithUIDs:" || s == "targetFormats";
}
