// Property-list values: what dictionaries and arrays handed to the host hold.
#pragma once

#include "Object.h"

#include <cstdint>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

class Value;

// A dictionary that keeps its keys in insertion order, as the host shows them.
class Dictionary {
public:
    // A key and its value; an aggregate so `auto& [key, value]` works. Defined
    // after Value, which it holds.
    struct Entry;

    // Special members are defined once Entry is complete (below Value).
    Dictionary();
    ~Dictionary();
    Dictionary(const Dictionary&);
    Dictionary(Dictionary&&) noexcept;
    Dictionary& operator=(const Dictionary&);
    Dictionary& operator=(Dictionary&&) noexcept;
    Dictionary(std::initializer_list<Entry> entries);

    // nullptr when absent.
    const Value* find(const std::string& key) const;
    Value* find(const std::string& key);
    bool contains(const std::string& key) const { return find(key) != nullptr; }
    // Replaces an existing value in place, else appends.
    void set(const std::string& key, Value v);
    bool remove(const std::string& key);
    std::vector<std::string> keys() const;

    size_t size() const;
    bool empty() const;
    std::vector<Entry>::const_iterator begin() const;
    std::vector<Entry>::const_iterator end() const;

    bool operator==(const Dictionary& o) const;

private:
    std::vector<Entry> _entries;
};

class Value {
public:
    enum class Type { Null, Boolean, Integer, Real, String, Data, Array, Dictionary, Object };
    using ArrayType = std::vector<Value>;
    using DataType = std::vector<uint8_t>;

    Value() = default;
    Value(std::nullptr_t) {}
    Value(bool b) : _v(b) {}
    Value(int v) : _v(int64_t(v)) {}
    Value(unsigned v) : _v(int64_t(v)) {}
    Value(long v) : _v(int64_t(v)) {}
    Value(long long v) : _v(int64_t(v)) {}
    Value(unsigned long v) : _v(int64_t(v)) {}
    Value(unsigned long long v) : _v(int64_t(v)) {}
    Value(double d) : _v(d) {}
    Value(const char* s) : _v(std::string(s)) {}
    Value(std::string s) : _v(std::move(s)) {}
    Value(std::string_view s) : _v(std::string(s)) {}
    Value(DataType d) : _v(std::move(d)) {}
    Value(ArrayType a) : _v(std::move(a)) {}
    Value(Dictionary d) : _v(std::move(d)) {}
    Value(Ref<Object> o) : _v(std::move(o)) { if (!std::get<Ref<Object>>(_v)) _v = std::monostate{}; }
    template <class T, class = std::enable_if_t<std::is_base_of_v<Object, T> && !std::is_same_v<Object, T>>>
    Value(const Ref<T>& o) : Value(Ref<Object>(o)) {}
    // A nil optional string becomes Null.
    Value(const std::optional<std::string>& s) { if (s) _v = *s; }

    static Value array(std::initializer_list<Value> items = {}) { return Value(ArrayType(items)); }

    Type type() const { return static_cast<Type>(_v.index()); }
    bool isNull() const { return type() == Type::Null; }
    bool isBoolean() const { return type() == Type::Boolean; }
    bool isInteger() const { return type() == Type::Integer; }
    bool isReal() const { return type() == Type::Real; }
    bool isNumber() const { return isBoolean() || isInteger() || isReal(); }
    bool isString() const { return type() == Type::String; }
    bool isData() const { return type() == Type::Data; }
    bool isArray() const { return type() == Type::Array; }
    bool isDictionary() const { return type() == Type::Dictionary; }
    bool isObject() const { return type() == Type::Object; }

    // Typed access; a mismatch answers the empty/zero value rather than throwing.
    const std::string& string() const;
    const ArrayType& arrayValue() const;
    ArrayType& arrayValue();
    const Dictionary& dictionary() const;
    Dictionary& dictionary();
    const DataType& data() const;
    Ref<Object> object() const;

    // Numeric views; strings are read the way the platform's intValue/doubleValue
    // do (leading number, 0 when none).
    int64_t integerValue() const;
    double doubleValue() const;
    // The platform's boolValue: numbers are true when non-zero; strings when,
    // after whitespace and an optional sign and zeros, they start with Y, y, T, t
    // or a digit 1-9. Other types have no boolean value (nullopt).
    std::optional<bool> boolValue() const;

    // Dictionary convenience: Null when this is no dictionary or has no such key.
    const Value& operator[](const std::string& key) const;
    // Array convenience: Null when out of range.
    const Value& operator[](size_t index) const;
    size_t count() const;

    // The platform's -description of the value (strings as they are).
    std::string description() const;

    // The value as JSON text (data as hex, objects by description, non-finite
    // reals as null); bytes that are not UTF-8 (card XML may carry them) become
    // U+FFFD instead of failing. indent < 0 gives one line. Programs that build
    // JSON documents of their own use ValueJSON.h.
    std::string jsonText(int indent = -1) const;
    // Null for text that is not JSON.
    static Value fromJSONText(std::string_view text);

    bool operator==(const Value& o) const;

private:
    std::variant<std::monostate, bool, int64_t, double, std::string, DataType, ArrayType, Dictionary, Ref<Object>> _v;
};

using Array = Value::ArrayType;

struct Dictionary::Entry {
    std::string first;
    Value second;
    bool operator==(const Entry& o) const { return first == o.first && second == o.second; }
};

inline Dictionary::Dictionary() = default;
inline Dictionary::~Dictionary() = default;
inline Dictionary::Dictionary(const Dictionary&) = default;
inline Dictionary::Dictionary(Dictionary&&) noexcept = default;
inline Dictionary& Dictionary::operator=(const Dictionary&) = default;
inline Dictionary& Dictionary::operator=(Dictionary&&) noexcept = default;
inline size_t Dictionary::size() const { return _entries.size(); }
inline bool Dictionary::empty() const { return _entries.empty(); }
inline std::vector<Dictionary::Entry>::const_iterator Dictionary::begin() const { return _entries.begin(); }
inline std::vector<Dictionary::Entry>::const_iterator Dictionary::end() const { return _entries.end(); }

// Helpers matching the platform's string-to-number readers: leading whitespace,
// optional sign, digits; anything unreadable gives 0.
int64_t stringIntegerValue(std::string_view s);
double stringDoubleValue(std::string_view s);
