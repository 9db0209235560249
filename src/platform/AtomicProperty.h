// Storage for an atomic property of a trivially copyable type (a CMTime, a
// CMTimeMapping, a pointer, a number): a reader always gets a value that was
// written whole, never half of one write and half of another.
//
// Properties of this kind are written rarely (while an object is built) and
// read very often (by every cursor step), so reads must not take a lock: this
// is a sequence lock. A write bumps the sequence to odd, stores the words and
// bumps it to even again; a read copies the words between two loads of the
// sequence and retries when they differ or were odd. Writers are serialised
// by a small spin lock. All words are atomics, so the scheme has no data race
// in the language's sense either.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <cstring>
#include <type_traits>

template <class T>
class AtomicProperty {
    static_assert(std::is_trivially_copyable_v<T>, "atomic properties hold plain values");

public:
    AtomicProperty() { store(T{}); }
    explicit AtomicProperty(const T& value) { store(value); }
    AtomicProperty(const AtomicProperty&) = delete;
    AtomicProperty& operator=(const AtomicProperty&) = delete;

    T load() const {
        Words copy;
        for (;;) {
            uint32_t before = _sequence.load(std::memory_order_acquire);
            if (before & 1u) continue;
            for (size_t i = 0; i < kWords; ++i) copy[i] = _words[i].load(std::memory_order_acquire);
            if (_sequence.load(std::memory_order_relaxed) == before) break;
        }
        T value;
        std::memcpy(&value, copy.data(), sizeof(T));
        return value;
    }

    void store(const T& value) {
        Words copy{};
        std::memcpy(copy.data(), &value, sizeof(T));
        while (_writing.test_and_set(std::memory_order_acquire)) {
        }
        uint32_t sequence = _sequence.load(std::memory_order_relaxed);
        _sequence.store(sequence + 1, std::memory_order_relaxed);
        for (size_t i = 0; i < kWords; ++i) _words[i].store(copy[i], std::memory_order_release);
        _sequence.store(sequence + 2, std::memory_order_release);
        _writing.clear(std::memory_order_release);
    }

private:
    static constexpr size_t kWords = (sizeof(T) + sizeof(uint64_t) - 1) / sizeof(uint64_t);
    using Words = std::array<uint64_t, kWords>;

    mutable std::atomic<uint32_t> _sequence{0};
    std::atomic_flag _writing = ATOMIC_FLAG_INIT;
    std::array<std::atomic<uint64_t>, kWords> _words{};
};
