// The host framework's side of the Kiln plug-in boundary: the protocols a Kiln
// camera-format plug-in answers, as abstract classes.
//
// Methods the host "calls when present" are optional: they have default
// implementations, and respondsToSelector() tells a host whether an object
// really answers them (selectors are named as the host names them, for example
// "doesPath:containSomeOfClipsWithUIDs:").
#pragma once

#include "Image.h"
#include "NotificationCenter.h"
#include "Object.h"
#include "Value.h"

#include <optional>
#include <string>
#include <string_view>
#include <vector>

class VestaKilnPlugin;
class VestaKilnVolumeDataSourceProtocol;
class VestaKilnClipDataSourceProtocol;
class VestaKilnFormatReaderProtocol;
class VestaKilnIngestObject;

// Every protocol object can say which optional selectors it answers, and, like
// any object of the platform, answer a property by name (key-value coding):
// hosts read the properties beyond the protocol this way, and the plug-in drives
// its own data-driven tables with it.
class VestaKilnProtocolObject : public Object {
public:
    virtual bool respondsToSelector(std::string_view selector) const { return false; }
    // The property's value as a property-list value; Null when the object has no
    // such property or its value is nil.
    virtual Value valueForKey(const std::string& key) { return Value(); }
};

// The principal class of a plug-in bundle.
class VestaKilnPluginRegisterBundle : public VestaKilnProtocolObject {
public:
    virtual Ref<VestaKilnPlugin> pluginForID(const Value& identifier) = 0;
};

class VestaKilnPlugin : public VestaKilnProtocolObject {
public:
    virtual std::optional<std::string> uuid() = 0;
    virtual std::optional<std::string> name() = 0;
    virtual std::optional<std::string> formatName() = 0;
    virtual std::optional<std::string> version() = 0;

    virtual bool initialize() = 0;
    virtual void setNotificationCenter(Ref<NotificationCenter> center) = 0;
    virtual bool activate() = 0;
    virtual bool deactivate() = 0;
    virtual bool shutdown() = 0;

    virtual bool pathIsValidVolume(const std::optional<std::string>& path) = 0;
    // error: an out error object the plug-in may fill (Null when untouched).
    virtual Ref<VestaKilnVolumeDataSourceProtocol> volumeWithPath(const std::optional<std::string>& path,
                                                                  Value* error) = 0;
    virtual Ref<Image> iconForVolumeWithPath(const std::optional<std::string>& path) = 0;
    // nullopt stands for nil.
    virtual std::optional<std::vector<Ref<VestaKilnClipDataSourceProtocol>>> clipsForVolume(
        VestaKilnVolumeDataSourceProtocol* volume) = 0;
    virtual Value additionalVolumes() = 0;
    virtual Value invalidVolumesWithErrors(Value* error) = 0;

    // Optional: "doesPath:containSomeOfClipsWithUIDs:", "targetFormats", "extendedMetadataDefinitions".
    virtual bool doesPath(const std::optional<std::string>& path, const std::optional<std::vector<std::string>>& uids) {
        return false;
    }
    virtual Value targetFormats() { return Value(); }
    virtual Value extendedMetadataDefinitions() { return Value(); }
};

class VestaKilnVolumeDataSourceProtocol : public VestaKilnProtocolObject {
public:
    virtual std::optional<std::string> path() const = 0;
    virtual std::optional<std::string> name() const = 0;

    // Optional: "icon", "CONTENTSPath", "volumeClipURLs", "willUnmount", "didUnmount".
    virtual Ref<Image> icon() const { return nullptr; }
    virtual std::optional<std::string> CONTENTSPath() const { return std::nullopt; }
    // File URLs, given as paths.
    virtual std::vector<std::string> volumeClipURLs() const { return {}; }
    virtual void willUnmount() {}
    virtual void didUnmount() {}
};

class VestaKilnClipDataSourceProtocol : public VestaKilnProtocolObject {
public:
    virtual std::optional<std::string> clipID() = 0;
    virtual std::optional<std::string> name() = 0;
    virtual double transportRate() = 0;
    virtual bool isDropFrame() = 0;
    // The start timecode, as the clip gives it (its text form).
    virtual Value mediaStart() = 0;
    // A number object (frames), Null for nil.
    virtual Value mediaDuration() = 0;
    virtual uint32_t numberOfAudioChannels() = 0;
    virtual Ref<VestaKilnIngestObject> ingestObject() = 0;
    virtual void* ingestObjectRefCon() = 0;
    virtual Value ingestSourceFiles() = 0;

    // Optional: "formatReader", "useBuiltInFormatReader", "clipURLs", "posterFrame",
    // "previewMovie", "metadata", "extendedProperties", "isDeletable", "deleteClip".
    virtual Ref<VestaKilnFormatReaderProtocol> formatReader() { return nullptr; }
    virtual bool useBuiltInFormatReader() { return false; }
    virtual std::vector<std::string> clipURLs() { return {}; }
    virtual Ref<Image> posterFrame() { return nullptr; }
    virtual Ref<Object> previewMovie() { return nullptr; }
    virtual Value metadata() { return Value(); }
    virtual Value extendedProperties() { return Value(); }
    virtual bool isDeletable() { return false; }
    virtual bool deleteClip() { return false; }
};

// Notification names the plug-in posts through the host's centre.
inline constexpr const char* VestaKilnPluginNewVolumeNotification = "VestaKilnPluginNewVolumeNotification";
inline constexpr const char* VestaKilnPluginVolumesInvalid = "VestaKilnPluginVolumesInvalid";

// The C entry a bundle's library exports for its principal class NAME:
//   extern "C" VestaKilnPluginRegisterBundle* VestaKilnPrincipalClass_NAME(void);
// It answers a new object carrying one reference, which the loader takes over.
using VestaKilnPrincipalClassEntry = VestaKilnPluginRegisterBundle* (*)();
#define VESTA_KILN_PRINCIPAL_CLASS_PREFIX "VestaKilnPrincipalClass_"

// The media-delivery protocols (format readers, sample cursors, ingest).
#include "VestaKilnMediaProtocols.h"
