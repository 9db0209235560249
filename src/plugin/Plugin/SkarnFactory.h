// The bundle's principal class: hands out the one plug-in object.
#pragma once

#include "SkarnPlugin.h"
#include "VestaKilnProtocols.h"

class SkarnFactory : public VestaKilnPluginRegisterBundle {
public:
    // Starts logging, then makes the plug-in.
    static Ref<SkarnFactory> factory();

    // The plug-in when identifier equals its uuid; else nullptr.
    Ref<VestaKilnPlugin> pluginForID(const Value& identifier) override;

    Ref<SkarnPlugin> plugin() const { return _mySkarnPlugin; }

private:
    Ref<SkarnPlugin> _mySkarnPlugin;
};
