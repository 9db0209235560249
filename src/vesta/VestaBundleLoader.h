// Loads a Kiln plug-in bundle: reads Info.json, dlopens the library and makes
// the principal class.
#pragma once

#include "Bundle.h"
#include "VestaKilnProtocols.h"

#include <string>

class VestaBundleLoader : public Object {
public:
    // nullptr with a one-line reason in error (naming the file and the problem).
    static Ref<VestaBundleLoader> loadBundle(const std::string& bundlePath, std::string* error);
    ~VestaBundleLoader() override;

    Ref<Bundle> bundle() const { return _bundle; }
    Ref<VestaKilnPluginRegisterBundle> principal() const { return _principal; }
    // The plug-ins the bundle declares ("KilnPlugins" entries' "PluginID"), first one first.
    std::vector<std::string> pluginIDs() const;
    // principal()->pluginForID() for the first declared plug-in.
    Ref<VestaKilnPlugin> firstPlugin() const;

private:
    VestaBundleLoader() = default;
    Ref<Bundle> _bundle;
    void* _handle = nullptr;
    Ref<VestaKilnPluginRegisterBundle> _principal;
};
