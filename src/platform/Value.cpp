#include "Value.h"

#include "ValueJSON.h"

#include <cctype>
#include <cmath>
#include <cstdio>
#include <cstdlib>

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
    for (const auto& e : entries) set(e.first, e.second);
}

const Value* Dictionary::find(const std::string& key) const {
    for (const auto& e : _entries)
        if (e.first == key) return &e.second;
    return nullptr;
}

Value* Dictionary::find(const std::string& key) {
    for (auto& e : _entries)
        if (e.first == key) return &e.second;
    return nullptr;
}

void Dictionary::set(const std::string& key, Value v) {
    if (Value* existing = find(key)) {
        *existing = std::move(v);
        return;
    }
    _entries.push_back(Entry{key, std::move(v)});
}

bool Dictionary::remove(const std::string& key) {
    for (auto it = _entries.begin(); it != _entries.end(); ++it) {
        if (it->first == key) {
            _entries.erase(it);
            return true;
        }
    }
    return false;
}

std::vector<std::string> Dictionary::keys() const {
    std::vector<std::string> k;
    k.reserve(_entries.size());
    for (const auto& e : _entries) k.push_back(e.first);
    return k;
}

bool Dictionary::operator==(const Dictionary& o) const { return _entries == o._entries; }

namespace {
const std::string kEmptyString;
const Value::ArrayType kEmptyArray;
const Dictionary kEmptyDictionary;
const Value::DataType kEmptyData;
const Value kNull;
}

const std::string& Value::string() const {
    auto* p = std::get_if<std::string>(&_v);
    return p ? *p : kEmptyString;
}

const Value::ArrayType& Value::arrayValue() const {
    auto* p = std::get_if<ArrayType>(&_v);
    return p ? *p : kEmptyArray;
}

Value::ArrayType& Value::arrayValue() {
    if (!isArray()) _v = ArrayType{};
    return std::get<ArrayType>(_v);
}

const Dictionary& Value::dictionary() const {
    auto* p = std::get_if<Dictionary>(&_v);
    return p ? *p : kEmptyDictionary;
}

Dictionary& Value::dictionary() {
    if (!isDictionary()) _v = Dictionary{};
    return std::get<Dictionary>(_v);
}

const Value::DataType& Value::data() const {
    auto* p = std::get_if<DataType>(&_v);
    return p ? *p : kEmptyData;
}

Ref<Object> Value::object() const {
    auto* p = std::get_if<Ref<Object>>(&_v);
    return p ? *p : Ref<Object>();
}

int64_t stringIntegerValue(std::string_view s) {
    size_t i = 0;
    while (i < s.size() && std::isspace(static_cast<unsigned char>(s[i]))) ++i;
    bool neg = false;
    if (i < s.size() && (s[i] == '+' || s[i] == '-')) neg = s[i++] == '-';
    uint64_t v = 0;
    bool overflow = false;
    for (; i < s.size() && std::isdigit(static_cast<unsigned char>(s[i])); ++i) {
        if (v > (UINT64_MAX - 9) / 10) overflow = true;
        if (!overflow) v = v * 10 + uint64_t(s[i] - '0');
    }
    // Out-of-range values clamp, as the platform's readers do.
    if (overflow || v > uint64_t(INT64_MAX)) return neg ? INT64_MIN : INT64_MAX;
    return neg ? -int64_t(v) : int64_t(v);
}

double stringDoubleValue(std::string_view s) {
    std::string copy(s);
    const char* begin = copy.c_str();
    char* end = nullptr;
    double d = std::strtod(begin, &end);
    if (end == begin) return 0.0;
    return d;
}

int64_t Value::integerValue() const {
    switch (type()) {
    case Type::Boolean: return std::get<bool>(_v) ? 1 : 0;
    case Type::Integer: return std::get<int64_t>(_v);
    case Type::Real: {
        double d = std::get<double>(_v);
        if (std::isnan(d)) return 0;
        if (d >= 9.2233720368547758e18) return INT64_MAX;
        if (d <= -9.2233720368547758e18) return INT64_MIN;
        return static_cast<int64_t>(d);
    }
    case Type::String: return stringIntegerValue(std::get<std::string>(_v));
    default: return 0;
    }
}

double Value::doubleValue() const {
    switch (type()) {
    case Type::Boolean: return std::get<bool>(_v) ? 1.0 : 0.0;
    case Type::Integer: return static_cast<double>(std::get<int64_t>(_v));
    case Type::Real: return std::get<double>(_v);
    case Type::String: return stringDoubleValue(std::get<std::string>(_v));
    default: return 0.0;
    }
}

std::optional<bool> Value::boolValue() const {
    switch (type()) {
    case Type::Boolean: return std::get<bool>(_v);
    case Type::Integer: return std::get<int64_t>(_v) != 0;
    case Type::Real: return std::get<double>(_v) != 0.0;
    case Type::String: {
        const std::string& s = std::get<std::string>(_v);
        size_t i = 0;
        while (i < s.size() && std::isspace(static_cast<unsigned char>(s[i]))) ++i;
        if (i < s.size() && (s[i] == '+' || s[i] == '-')) ++i;
        while (i < s.size() && s[i] == '0') ++i;
        if (i >= s.size()) return false;
        char c = s[i];
        return c == 'Y' || c == 'y' || c == 'T' || c == 't' || (c >= '1' && c <= '9');
    }
    default: return std::nullopt;
    }
}

const Value& Value::operator[](const std::string& key) const {
    if (!isDictionary()) return kNull;
    const Value* v = std::get<Dictionary>(_v).find(key);
    return v ? *v : kNull;
}

const Value& Value::operator[](size_t index) const {
    if (!isArray()) return kNull;
    const auto& a = std::get<ArrayType>(_v);
    return index < a.size() ? a[index] : kNull;
}

size_t Value::count() const {
    if (isArray()) return std::get<ArrayType>(_v).size();
    if (isDictionary()) return std::get<Dictionary>(_v).size();
    return 0;
}

static std::string formatReal(double d) {
    // Shortest text that reads back the same, as the platform prints numbers.
    char buf[40];
    for (int prec = 1; prec <= 17; ++prec) {
        std::snprintf(buf, sizeof buf, "%.*g", prec, d);
        if (std::strtod(buf, nullptr) == d) break;
    }
    return buf;
}

std::string Value::description() const {
    switch (type()) {
    case Type::Null: return "(null)";
    case Type::Boolean: return std::get<bool>(_v) ? "1" : "0";
    case Type::Integer: return std::to_string(std::get<int64_t>(_v));
    case Type::Real: return formatReal(std::get<double>(_v));
    case Type::String: return std::get<std::string>(_v);
    case Type::Object: return describe(std::get<Ref<Object>>(_v));
    default: return jsonText();
    }
}

std::string jsonText(const nlohmann::ordered_json& j, int indent) {
    return j.dump(indent, ' ', false, nlohmann::ordered_json::error_handler_t::replace);
}

std::string Value::jsonText(int indent) const { return ::jsonText(toJSON(*this), indent); }

Value Value::fromJSONText(std::string_view text) {
    auto j = nlohmann::ordered_json::parse(text.begin(), text.end(), nullptr, false);
    return j.is_discarded() ? Value() : valueFromJSON(j);
}

nlohmann::ordered_json toJSON(const Value& value) {
    using J = nlohmann::ordered_json;
    using Type = Value::Type;
    switch (value.type()) {
    case Type::Null: return nullptr;
    case Type::Boolean: return *value.boolValue();
    case Type::Integer: return value.integerValue();
    case Type::Real: {
        double d = value.doubleValue();
        return std::isfinite(d) ? J(d) : J(nullptr);
    }
    case Type::String: return value.string();
    case Type::Data: {
        static const char* hex = "0123456789abcdef";
        std::string s;
        for (uint8_t b : value.data()) {
            s += hex[b >> 4];
            s += hex[b & 15];
        }
        return s;
    }
    case Type::Array: {
        J a = J::array();
        for (const auto& v : value.arrayValue()) a.push_back(toJSON(v));
        return a;
    }
    case Type::Dictionary: {
        J o = J::object();
        for (const auto& [k, v] : value.dictionary()) o[k] = toJSON(v);
        return o;
    }
    case Type::Object: return describe(value.object());
    }
    return nullptr;
}

Value valueFromJSON(const nlohmann::ordered_json& j) {
    switch (j.type()) {
    case nlohmann::json::value_t::boolean: return Value(j.get<bool>());
    case nlohmann::json::value_t::number_integer: return Value(j.get<int64_t>());
    case nlohmann::json::value_t::number_unsigned: {
        uint64_t u = j.get<uint64_t>();
        return u > uint64_t(INT64_MAX) ? Value(double(u)) : Value(int64_t(u));
    }
    case nlohmann::json::value_t::number_float: return Value(j.get<double>());
    case nlohmann::json::value_t::string: return Value(j.get<std::string>());
    case nlohmann::json::value_t::array: {
        Value::ArrayType a;
        a.reserve(j.size());
        for (const auto& e : j) a.push_back(valueFromJSON(e));
        return Value(std::move(a));
    }
    case nlohmann::json::value_t::object: {
        Dictionary d;
        for (auto it = j.begin(); it != j.end(); ++it) d.set(it.key(), valueFromJSON(it.value()));
        return Value(std::move(d));
    }
    default: return Value();
    }
}

bool Value::operator==(const Value& o) const {
    if (isNumber() && o.isNumber() && !isBoolean() && !o.isBoolean()) {
        if (isInteger() && o.isInteger()) return std::get<int64_t>(_v) == std::get<int64_t>(o._v);
        return doubleValue() == o.doubleValue();
    }
    if (type() != o.type()) return false;
    if (isObject()) return std::get<Ref<Object>>(_v).get() == std::get<Ref<Object>>(o._v).get();
    return _v == o._v;
}
