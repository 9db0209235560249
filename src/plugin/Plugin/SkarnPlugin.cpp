#include "SkarnPlugin.h"

#include "FileSystem.h"
#include "SkarnClip.h"
#include "SkarnFileUtilities.h"
#include "SkarnStringToBoolValueTransformer.h"
#include "SkarnLog.h"
#include "SkarnVolume.h"
#include "XMLDocument.h"

#include <algorithm>

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

void SkarnPlugin::setBundle(Ref<Bundle> bundle) {
    _bundle = bundle;
    SkarnClip::setDefaultBundle(std::move(bundle));
}

namespace {
bool hasXMLSuffix(const std::string& name) {
    return FileSystem::hasSuffix(name, "xml") || FileSystem::hasSuffix(name, "XML");
}
bool hasMXFSuffix(const std::string& name) {
    return FileSystem::hasSuffix(name, "mxf") || FileSystem::hasSuffix(name, "MXF");
}
}  // namespace

std::optional<std::vector<Ref<VestaKilnClipDataSourceProtocol>>> SkarnPlugin::clipsForVolume(
    VestaKilnVolumeDataSourceProtocol* volume) {
    if (!volume) return std::nullopt;
    auto contents = volume->CONTENTSPath();
    if (!contents) return std::nullopt;
    auto avclipFolder = SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("AVCLIP", contents);
    auto clipFolder = SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath("CLIP", contents);
    auto avclipNames = _threadSafeFileManager->directoryContentsAtPath(avclipFolder);
    auto clipNames = _threadSafeFileManager->directoryContentsAtPath(clipFolder);
    // Without a CLIP listing there are no clips, even when AVCLIP holds some.
    if (!clipNames) return std::nullopt;

    std::vector<std::string> names;
    if (avclipNames)
        for (const std::string& n : *avclipNames)
            if (n != "." && n != "..") names.push_back(n);
    const size_t avclipCount = names.size();
    // A self-contained clip hides a clip XML of the same base name, and only
    // when both are spelled the way the camera writes them: "NAME.MXF" hides
    // "NAME.XML". A name ending in "xml" (a copy made by a tool that lower-cased
    // some names) is never hidden, so no clip silently drops out of the listing.
    for (const std::string& n : *clipNames) {
        if (!hasXMLSuffix(n)) continue;
        if (FileSystem::hasSuffix(n, "XML")) {
            std::string asMXF =
                FileSystem::stringByAppendingPathExtension(FileSystem::stringByDeletingPathExtension(n), "MXF");
            if (std::find(names.begin(), names.begin() + long(avclipCount), asMXF) != names.begin() + long(avclipCount))
                continue;
        }
        names.push_back(n);
    }

    std::vector<Ref<VestaKilnClipDataSourceProtocol>> clips;
    for (const std::string& n : names) {
        if (FileSystem::hasPrefix(n, ".")) continue;
        std::optional<std::string> path;
        if (hasMXFSuffix(n))
            path = SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath(n, avclipFolder);
        else if (hasXMLSuffix(n))
            path = SkarnUtilities_PathByAppendingExistingCaseInsensitiveFileNameToPath(n, clipFolder);
        if (!path) continue;
        if (Ref<SkarnClip> clip = SkarnClip::initWithSkarnClip(path)) clips.push_back(clip);
    }
    if (clips.empty()) return std::nullopt;
    return clips;
}

Value SkarnPlugin::metadataDictionaryWithKey(const std::string& key, const std::string& description,
                                             const std::string& type, Ref<Object> valueTransformer) {
    Dictionary d;
    d.set("VestaKilnMetadataReverseDNSKey", key);
    d.set("VestaKilnMetadataDescriptionKey",
          _bundle ? _bundle->localizedString(description, std::string(""), "Skarn") : description);
    d.set("VestaKilnMetadataTypeKey", type);
    if (valueTransformer) d.set("VestaKilnMetadataValueTransformerKey", Value(valueTransformer));
    return Value(std::move(d));
}

Value SkarnPlugin::extendedMetadataDefinitions() {
    static const char* const kString = "VestaKilnMetadataTypeString";
    static const std::pair<const char*, const char*> kDefinitions[] = {
        {"com.corvane.professionalplugin.skarn.clipmetadata.datasource", "Data Source"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.shoot.location.longitude", "Longitude"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.shoot.location.latitude", "Latitude"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.shoot.location.altitude", "Altitude"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.shoot.shooter", "Shot By"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.shoot.startdate", "Shooting Start Date"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.shoot.enddate", "Shooting End Date"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.shoot.location.source", "Location Source"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.shoot.location.placename", "Location Name"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.scenario.programname", "Program Name"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.news.reporter", "Reporter"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.news.purpose", "Purpose"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.news.object", "Object"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.access.lastupdateperson", "Modified By"},
        {"com.corvane.professionalplugin.skarn.essencelist.video.startbinarygroup", "User Information"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.memo.text", "Memo"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.memo.person", "Memo Created By"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.userclipname", "User Clip Name"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.scenario.sceneno", "Scene (Original)"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.scenario.takeno", "Shot/Take (Original)"},
        {"com.corvane.professionalplugin.skarn.clipmetadata.shotmark", "Good (Original)"},
        {"org.smpte.mxf.identification.applicationsuppliername", "MXF Application Supplier Name"},
        {"org.smpte.mxf.identification.applicationname", "MXF Application Name"},
        {"org.smpte.mxf.identification.applicationversionstring", "MXF Application Version String"},
        {"org.smpte.mxf.identification.applicationproductid", "MXF Application Product ID"},
        {"org.smpte.mxf.identification.filemodificationdate", "MXF File Modification Date"},
        {"org.smpte.mxf.identification.generationid", "MXF Generation ID"},
        {"org.smpte.mxf.package.material.creationtime", "MXF Creation Time"},
        {"org.smpte.mxf.package.material.packagelastmodified", "MXF Package Last Modified"},
        {"org.smpte.mxf.package.material.packagename", "MXF Package Name"},
        {"org.smpte.mxf.package.material.packageid", "MXF Package ID"},
    };
    Array definitions;
    for (const auto& [key, description] : kDefinitions) {
        // The shot mark is the one boolean, shown through a string-to-boolean transformer.
        bool shotMark = std::string_view(key).ends_with(".shotmark");
        definitions.push_back(metadataDictionaryWithKey(
            key, description, shotMark ? "VestaKilnMetadataTypeBoolean" : kString,
            shotMark ? Ref<Object>(SkarnStringToBoolValueTransformer::transformer()) : Ref<Object>()));
    }
    return Value(std::move(definitions));
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
    return s == "doesPath:containSomeOfClipsWithUIDs:" || s == "targetFormats" || s == "extendedMetadataDefinitions";
}
