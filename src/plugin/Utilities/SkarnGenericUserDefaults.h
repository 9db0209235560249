// Settings in the preference domain of a named application.
#pragma once

#include "Object.h"
#include "Value.h"

#include <optional>
#include <string>

class SkarnGenericUserDefaults : public Object {
public:
    static Ref<SkarnGenericUserDefaults> genericUserDefaultsForApplicationId(const std::optional<std::string>& appId);
    // A nil identifier is reported through the assertion handler; if the handler
    // returns, the object is made with a nil domain (whose reads answer nil).
    static Ref<SkarnGenericUserDefaults> initWithApplicationId(const std::optional<std::string>& appId);

    Value objectForKey(const std::string& key) const;
    void setObject(const Value& value, const std::string& key);
    void removeObjectForKey(const std::string& key);
    bool hasKey(const std::string& key) const;
    bool boolForKey(const std::string& key) const;
    void setBool(bool value, const std::string& key);
    bool synchronize();

    const std::optional<std::string>& myApplicationIdentifier() const { return _myApplicationIdentifier; }

private:
    std::optional<std::string> _myApplicationIdentifier;
};
