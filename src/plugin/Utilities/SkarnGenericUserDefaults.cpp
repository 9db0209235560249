#include "SkarnGenericUserDefaults.h"

#include "AssertionHandler.h"
#include "Preferences.h"

#include <cstdio>

Ref<SkarnGenericUserDefaults> SkarnGenericUserDefaults::genericUserDefaultsForApplicationId(
    const std::optional<std::string>& appId) {
    return initWithApplicationId(appId);
}

Ref<SkarnGenericUserDefaults> SkarnGenericUserDefaults::initWithApplicationId(const std::optional<std::string>& appId) {
    Ref<SkarnGenericUserDefaults> self(new SkarnGenericUserDefaults);
    if (!appId) {
        char description[128];
        std::snprintf(description, sizeof description, "Invalid parameter not satisfying: %s", "nil != anApplicationId");
        AssertionHandler::currentHandler().handleFailureInMethod("initWithApplicationId:",
                                                                "Utilities/VestaGenericUserDefaults", 16, description);
    }
    self->_myApplicationIdentifier = appId;
    return self;
}

Value SkarnGenericUserDefaults::objectForKey(const std::string& key) const {
    if (!_myApplicationIdentifier) return Value();
    return CFPreferencesCopyAppValue(key, *_myApplicationIdentifier);
}

void SkarnGenericUserDefaults::setObject(const Value& value, const std::string& key) {
    if (!_myApplicationIdentifier) return;
    CFPreferencesSetAppValue(key, value, *_myApplicationIdentifier);
}

void SkarnGenericUserDefaults::removeObjectForKey(const std::string& key) { setObject(Value(), key); }

bool SkarnGenericUserDefaults::hasKey(const std::string& key) const { return !objectForKey(key).isNull(); }

bool SkarnGenericUserDefaults::boolForKey(const std::string& key) const {
    return objectForKey(key).boolValue().value_or(false);
}

void SkarnGenericUserDefaults::setBool(bool value, const std::string& key) { setObject(Value(value), key); }

bool SkarnGenericUserDefaults::synchronize() {
    if (!_myApplicationIdentifier) return false;
    return CFPreferencesAppSynchronize(*_myApplicationIdentifier);
}
