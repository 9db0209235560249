// One card volume as the host holds it.
#pragma once

#include "Image.h"
#include "VestaKilnProtocols.h"

#include <optional>
#include <string>
#include <vector>

class SkarnVolume : public VestaKilnVolumeDataSourceProtocol {
public:
    // nullptr for a nil path. The path is copied, the icon retained.
    static Ref<SkarnVolume> initWithPath(const std::optional<std::string>& path, Ref<Image> icon);
    Ref<SkarnVolume> copyWithZone() const;

    std::optional<std::string> path() const override { return _path; }
    std::optional<std::string> name() const override;
    Ref<Image> icon() const override { return _icon; }
    std::optional<std::string> CONTENTSPath() const override;
    std::vector<std::string> volumeClipURLs() const override;
    void willUnmount() override {}
    void didUnmount() override {}

    bool respondsToSelector(std::string_view selector) const override;
    std::string description() const override;

private:
    std::string _path;
    Ref<Image> _icon;
};
