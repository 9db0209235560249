// skarn: the reference host. Loads the Skarn bundle through the Vesta loader
// and drives the plug-in the way an editing application does.
#include "AssertionHandler.h"
#include "FileSystem.h"
#include "VestaBundleLoader.h"

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include <cstdio>
#include <cstdlib>
#include <iostream>
#include <unistd.h>

namespace {

std::string programFolder() {
    char buf[4096];
    ssize_t n = ::readlink("/proc/self/exe", buf, sizeof buf - 1);
    if (n <= 0) return ".";
    buf[n] = 0;
    return FileSystem::stringByDeletingLastPathComponent(buf);
}

// --bundle, else $SKARN_BUNDLE, else beside the program, else the build tree's.
std::string findBundle(const std::string& option) {
    if (!option.empty()) return option;
    if (const char* env = std::getenv("SKARN_BUNDLE"); env && *env) return env;
    std::string beside = programFolder() + "/Skarn.kilnplugin";
    if (FileSystem::isDirectory(beside)) return beside;
    std::string installed = programFolder() + "/../lib/skarn/Skarn.kilnplugin";
    if (FileSystem::isDirectory(installed)) return installed;
    return SKARN_BUILD_BUNDLE_DIR;
}

struct Host {
    Ref<VestaBundleLoader> loader;
    Ref<VestaKilnPlugin> plugin;
};

bool loadPlugin(const std::string& bundleOption, Host& host) {
    std::string path = findBundle(bundleOption);
    std::string error;
    host.loader = VestaBundleLoader::loadBundle(path, &error);
    if (!host.loader) {
        std::fprintf(stderr, "skarn: %s\n", error.c_str());
        return false;
    }
    host.plugin = host.loader->firstPlugin();
    if (!host.plugin) {
        std::fprintf(stderr, "skarn: %s: the bundle declares no plug-in it will hand out\n", path.c_str());
        return false;
    }
    host.plugin->initialize();
    host.plugin->setNotificationCenter(NotificationCenter::notificationCenter());
    host.plugin->activate();
    return true;
}

std::vector<std::string> mountedVolumes() {
    std::vector<std::string> roots;
    for (const char* base : {"/media", "/run/media", "/mnt"}) {
        FileSystem::enumerate(base, true, [&](const std::string& rel, const std::string& full, bool isDir) {
            if (isDir) roots.push_back(full);
            // Look two levels deep: /media/CARD and /media/USER/CARD.
            return rel.find('/') == std::string::npos;
        });
    }
    return roots;
}

}  // namespace

int main(int argc, char** argv) {
    // A corrupt clip must not end the host: hard assertions throw instead.
    setHardAssertionFailureHandler(throwingHardAssertionFailureHandler);

    CLI::App app{"skarn: read Skarn camera cards through the Skarn Kiln plug-in"};
    app.set_version_flag("--version", std::string("skarn ") + SKARN_VERSION);
    std::string bundleOption;
    app.add_option("--bundle", bundleOption, "Path of the Skarn.kilnplugin bundle (default: $SKARN_BUNDLE, "
                                             "else the one installed beside this program)");
    app.require_subcommand(1);

    bool json = false;
    auto* cards = app.add_subcommand("cards", "Tell which paths are Skarn cards (default: mounted volumes)");
    std::vector<std::string> cardPaths;
    cards->add_option("PATH", cardPaths, "Folders to check");
    cards->add_flag("--json", json, "Print JSON");

    auto* plugin = app.add_subcommand("plugin", "Show the plug-in's identity and what it offers");
    plugin->add_flag("--json", json, "Print JSON");

    CLI11_PARSE(app, argc, argv);

    Host host;
    if (!loadPlugin(bundleOption, host)) return 2;

    try {
        if (*cards) {
            if (cardPaths.empty()) cardPaths = mountedVolumes();
            nlohmann::ordered_json out = nlohmann::ordered_json::array();
            int found = 0;
            for (const auto& p : cardPaths) {
                bool valid = host.plugin->pathIsValidVolume(p);
                found += valid;
                if (json)
                    out.push_back({{"path", p}, {"isCard", valid}});
                else
                    std::printf("%s\t%s\n", valid ? "card" : "no", p.c_str());
            }
            if (json) std::cout << out.dump(2) << "\n";
            return found > 0 ? 0 : 1;
        }
        if (*plugin) {
            nlohmann::ordered_json out;
            auto str = [](const std::optional<std::string>& s) { return s ? nlohmann::ordered_json(*s) : nullptr; };
            out["uuid"] = str(host.plugin->uuid());
            out["name"] = str(host.plugin->name());
            out["formatName"] = str(host.plugin->formatName());
            out["version"] = str(host.plugin->version());
            out["targetFormats"] = host.plugin->targetFormats().toJSON();
            out["extendedMetadataDefinitions"] = host.plugin->extendedMetadataDefinitions().toJSON();
            if (json)
                std::cout << out.dump(2) << "\n";
            else
                for (auto it = out.begin(); it != out.end(); ++it)
                    if (it.value().is_string()) std::printf("%-12s %s\n", it.key().c_str(), it.value().get<std::string>().c_str());
            return 0;
        }
    } catch (const std::exception& e) {
        std::fprintf(stderr, "skarn: %s\n", e.what());
        return 1;
    }
    return 0;
}
