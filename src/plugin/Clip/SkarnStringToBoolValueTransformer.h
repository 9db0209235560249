// Turns the card's shot-mark text into the boolean the host's "Good" column
// shows.
#pragma once

#include "Object.h"
#include "Value.h"

#include <string>

class SkarnStringToBoolValueTransformer : public Object {
public:
    static Ref<SkarnStringToBoolValueTransformer> transformer();
    // The class of the transformed values: the platform's number class.
    static std::string transformedValueClass() { return "NSNumber"; }
    static bool allowsReverseTransformation() { return false; }
    // A boolean: the value's own boolean value ("1", "YES", "true", non-zero
    // numbers), false for values that have none (nil, arrays, objects).
    Value transformedValue(const Value& value) const;
};
