#include "VestaBundleLoader.h"

#include "FileSystem.h"

#include <dlfcn.h>

VestaBundleLoader::~VestaBundleLoader() {
    // Objects the plug-in made must be gone before its code is unmapped; the
    // library stays loaded for the life of the process, as hosts keep bundles.
    _principal = nullptr;
}

Ref<VestaBundleLoader> VestaBundleLoader::loadBundle(const std::string& bundlePath, std::string* error) {
    auto fail = [&](const std::string& why) -> Ref<VestaBundleLoader> {
        if (error) *error = why;
        return nullptr;
    };
    if (!FileSystem::isDirectory(bundlePath)) return fail(bundlePath + ": no such bundle folder");
    std::string infoPath = FileSystem::stringByAppendingPathComponent(bundlePath, "Info.json");
    if (!FileSystem::fileExists(infoPath)) return fail(infoPath + ": missing information dictionary");
    Ref<Bundle> bundle = Bundle::bundleWithPath(bundlePath);
    if (!bundle || !bundle->infoDictionary().isDictionary())
        return fail(infoPath + ": not a JSON object");
    auto exe = bundle->executablePath();
    if (!exe) return fail(infoPath + ": no \"BundleExecutable\" string");
    auto cls = bundle->principalClassName();
    if (!cls) return fail(infoPath + ": no \"PrincipalClass\" string");
    if (!FileSystem::fileExists(*exe)) return fail(*exe + ": plug-in library missing");

    void* handle = ::dlopen(exe->c_str(), RTLD_NOW | RTLD_LOCAL);
    if (!handle) {
        const char* why = ::dlerror();
        return fail(*exe + ": cannot load: " + (why ? why : "unknown error"));
    }
    std::string symbol = VESTA_KILN_PRINCIPAL_CLASS_PREFIX + *cls;
    auto entry = reinterpret_cast<VestaKilnPrincipalClassEntry>(::dlsym(handle, symbol.c_str()));
    if (!entry) return fail(*exe + ": no entry " + symbol + " for principal class " + *cls);
    Ref<VestaKilnPluginRegisterBundle> principal = Ref<VestaKilnPluginRegisterBundle>::adopt(entry());
    if (!principal) return fail(*exe + ": principal class " + *cls + " could not be made");

    Ref<VestaBundleLoader> loader(new VestaBundleLoader);
    loader->_bundle = bundle;
    loader->_handle = handle;
    loader->_principal = principal;
    return loader;
}

std::vector<std::string> VestaBundleLoader::pluginIDs() const {
    std::vector<std::string> ids;
    for (const Value& p : _bundle->infoDictionary()["KilnPlugins"].arrayValue())
        if (p["PluginID"].isString()) ids.push_back(p["PluginID"].string());
    return ids;
}

Ref<VestaKilnPlugin> VestaBundleLoader::firstPlugin() const {
    auto ids = pluginIDs();
    if (ids.empty() || !_principal) return nullptr;
    return _principal->pluginForID(Value(ids.front()));
}
