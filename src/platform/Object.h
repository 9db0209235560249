// Reference-counted base object and its strong pointer.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <string>
#include <utility>

// Every plug-in and platform class derives from Object. Objects start with a
// count of zero and live while at least one Ref holds them; raw pointers are
// weak (non-retaining) references. retain()/release() are virtual so that a
// class can trace them.
class Object {
public:
    Object() = default;
    Object(const Object&) = delete;
    Object& operator=(const Object&) = delete;
    virtual ~Object();

    virtual void retain() const;
    virtual void release() const;
    int32_t retainCount() const { return _retainCount.load(std::memory_order_relaxed); }

    // "<ClassName: 0x...>" unless a class says more about itself.
    virtual std::string description() const;
    // The dynamic class name, demangled.
    std::string className() const;

protected:
    // For retain/release overrides: adjust the count without the tracing.
    int32_t incrementRetainCount() const;
    int32_t decrementRetainCount() const;

private:
    mutable std::atomic<int32_t> _retainCount{0};
};

// Strong reference. A null Ref stands for nil.
template <class T>
class Ref {
public:
    Ref() noexcept = default;
    Ref(std::nullptr_t) noexcept {}
    Ref(T* p) noexcept : _p(p) { if (_p) _p->retain(); }
    Ref(const Ref& o) noexcept : _p(o._p) { if (_p) _p->retain(); }
    Ref(Ref&& o) noexcept : _p(std::exchange(o._p, nullptr)) {}
    template <class U>
    Ref(const Ref<U>& o) noexcept : _p(o.get()) { if (_p) _p->retain(); }
    template <class U>
    Ref(Ref<U>&& o) noexcept : _p(o.detach()) {}
    ~Ref() { if (_p) _p->release(); }

    // Takes over a reference the caller already owns (one handed across a C
    // boundary with detach()), without retaining again.
    static Ref adopt(T* p) noexcept {
        Ref r;
        r._p = p;
        return r;
    }

    Ref& operator=(const Ref& o) noexcept { Ref(o).swap(*this); return *this; }
    Ref& operator=(Ref&& o) noexcept { Ref(std::move(o)).swap(*this); return *this; }
    Ref& operator=(std::nullptr_t) noexcept { Ref().swap(*this); return *this; }

    T* get() const noexcept { return _p; }
    T* operator->() const noexcept { return _p; }
    T& operator*() const noexcept { return *_p; }
    explicit operator bool() const noexcept { return _p != nullptr; }
    void swap(Ref& o) noexcept { std::swap(_p, o._p); }
    // Gives up ownership without releasing; for converting moves.
    T* detach() noexcept { return std::exchange(_p, nullptr); }

    friend bool operator==(const Ref& a, const Ref& b) noexcept { return a._p == b._p; }
    friend bool operator==(const Ref& a, std::nullptr_t) noexcept { return a._p == nullptr; }

private:
    T* _p = nullptr;
};

template <class T, class... A>
Ref<T> makeRef(A&&... args) {
    return Ref<T>(new T(std::forward<A>(args)...));
}

template <class T, class U>
Ref<T> dynamicRefCast(const Ref<U>& r) {
    return Ref<T>(dynamic_cast<T*>(r.get()));
}

// Description of a possibly-null object, "(null)" for nil as the platform prints it.
std::string describe(const Object* o);
template <class T>
std::string describe(const Ref<T>& r) { return describe(static_cast<const Object*>(r.get())); }
