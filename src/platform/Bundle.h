// A plug-in bundle: a folder NAME.kilnplugin holding
//   Info.json                      the information dictionary
//   <executable>.so                the plug-in's shared library
//   Resources/<lang>.lproj/<table>.strings   localised strings, "key = value" lines
//   Resources/<name>.png|.tiff|.icns|.bmp     image resources
#pragma once

#include "Image.h"
#include "Object.h"
#include "Value.h"

#include <mutex>
#include <optional>
#include <string>
#include <unordered_map>

class Bundle : public Object {
public:
    // nullptr when the folder does not exist.
    static Ref<Bundle> bundleWithPath(const std::string& path);
    // The bundle holding the shared object that contains address (found with
    // dladdr): the library's folder when that folder has an Info.json, else nullptr.
    static Ref<Bundle> bundleForAddress(const void* address);

    const std::string& bundlePath() const { return _path; }
    std::string resourcePath() const;
    // The information dictionary (Null when Info.json is missing or unreadable).
    const Value& infoDictionary() const { return _info; }
    std::optional<std::string> executablePath() const;
    std::optional<std::string> principalClassName() const;

    // Localised lookup: the string for key in table (default "Localizable") of the
    // preferred language, else English, else defaultValue when given and not
    // empty, else the key itself.
    std::string localizedString(const std::string& key, const std::optional<std::string>& defaultValue,
                                const std::string& table = "Localizable") const;

    // An image resource by base name (extensions png, tiff, icns, bmp tried in order).
    Ref<Image> imageForResource(const std::string& name) const;
    std::optional<std::string> pathForResource(const std::string& name, const std::string& extension) const;

    // Language codes in preference order, from LC_ALL / LC_MESSAGES / LANG, then "en".
    static std::vector<std::string> preferredLanguages();

    std::string description() const override;

    // Parses a strings table ("key = value" lines, "#" comments, "\n" and "\\" escapes).
    static std::unordered_map<std::string, std::string> parseStringsTable(const std::string& text);

private:
    explicit Bundle(std::string path);
    const std::unordered_map<std::string, std::string>* table(const std::string& lang, const std::string& name) const;

    std::string _path;
    Value _info;
    mutable std::mutex _tablesMutex;
    mutable std::unordered_map<std::string, std::optional<std::unordered_map<std::string, std::string>>> _tables;
};
