#include "SkarnStringToBoolValueTransformer.h"

Ref<SkarnStringToBoolValueTransformer> SkarnStringToBoolValueTransformer::transformer() {
    return Ref<SkarnStringToBoolValueTransformer>(new SkarnStringToBoolValueTransformer);
}

Value SkarnStringToBoolValueTransformer::transformedValue(const Value& value) const {
    return Value(value.boolValue().value_or(false));
}
