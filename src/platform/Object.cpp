#include "Object.h"

#include <cstdio>
#include <cxxabi.h>
#include <cstdlib>
#include <memory>
#include <typeinfo>

Object::~Object() = default;

void Object::retain() const { incrementRetainCount(); }

void Object::release() const {
    if (decrementRetainCount() == 0) delete this;
}

int32_t Object::incrementRetainCount() const {
    return _retainCount.fetch_add(1, std::memory_order_relaxed) + 1;
}

int32_t Object::decrementRetainCount() const {
    return _retainCount.fetch_sub(1, std::memory_order_acq_rel) - 1;
}

std::string Object::className() const {
    const char* mangled = typeid(*this).name();
    int status = 0;
    std::unique_ptr<char, void (*)(void*)> demangled(abi::__cxa_demangle(mangled, nullptr, nullptr, &status),
                                                     std::free);
    return status == 0 && demangled ? std::string(demangled.get()) : std::string(mangled);
}

std::string Object::description() const {
    char buf[64];
    std::snprintf(buf, sizeof buf, ": %p>", static_cast<const void*>(this));
    return "<" + className() + buf;
}

std::string describe(const Object* o) { return o ? o->description() : std::string("(null)"); }
