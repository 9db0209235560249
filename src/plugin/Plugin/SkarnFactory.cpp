#include "SkarnFactory.h"

#include "SkarnLog.h"

Ref<SkarnFactory> SkarnFactory::factory() {
    SkarnStartLogging();
    Ref<SkarnFactory> f(new SkarnFactory);
    f->_mySkarnPlugin = SkarnPlugin::init();
    return f;
}

Ref<VestaKilnPlugin> SkarnFactory::pluginForID(const Value& identifier) {
    if (identifier.isNull() || !_mySkarnPlugin) return nullptr;
    auto uuid = _mySkarnPlugin->uuid();
    if (!uuid || !(identifier == Value(*uuid))) return nullptr;
    return _mySkarnPlugin;
}
