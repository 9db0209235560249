// The plug-in object the host talks to: identity, card detection, volumes and
// clip listing.
#pragma once

#include "Bundle.h"
#include "NotificationCenter.h"
#include "ThreadSafeFileManager.h"
#include "VestaKilnProtocols.h"

class SkarnPlugin : public VestaKilnPlugin {
public:
    static Ref<SkarnPlugin> init();

    std::optional<std::string> uuid() override;
    std::optional<std::string> name() override;
    std::optional<std::string> formatName() override;
    std::optional<std::string> version() override;

    bool initialize() override { return true; }
    void setNotificationCenter(Ref<NotificationCenter> center) override;
    bool activate() override { return true; }
    bool deactivate() override { return true; }
    bool shutdown() override;

    bool pathIsValidVolume(const std::optional<std::string>& path) override;
    Ref<VestaKilnVolumeDataSourceProtocol> volumeWithPath(const std::optional<std::string>& path,
                                                          Value* error) override;
    Ref<Image> iconForVolumeWithPath(const std::optional<std::string>& path) override;
    std::optional<std::vector<Ref<VestaKilnClipDataSourceProtocol>>> clipsForVolume(
        VestaKilnVolumeDataSourceProtocol* volume) override;
    Value additionalVolumes() override { return Value(); }
    Value invalidVolumesWithErrors(Value* error) override { return Value(); }

    bool doesPath(const std::optional<std::string>& path, const std::optional<std::vector<std::string>>& uids) override;
    Value targetFormats() override;
    Value extendedMetadataDefinitions() override;

    // One metadata definition; a nil transformer leaves its key out.
    Value metadataDictionaryWithKey(const std::string& key, const std::string& description, const std::string& type,
                                    Ref<Object> valueTransformer);

    void postVolumeFoundNotification();
    void postInvalidNotification();

    bool respondsToSelector(std::string_view selector) const override;

    Ref<Bundle> bundle() const { return _bundle; }
    // For hosts and tests that load the plug-in's code without its library.
    void setBundle(Ref<Bundle> bundle);

protected:
    std::optional<std::string> identityString(const char* key) const;

    Ref<Bundle> _bundle;
    Ref<NotificationCenter> _pluginNotificationCenter;
    Ref<ThreadSafeFileManager> _threadSafeFileManager;
    Ref<Object> _mxfMetadata;
    bool _avciCodecFound = false;
};
