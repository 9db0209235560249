// Text written to a stream in large blocks. A sample listing of an hour-long
// clip runs to a hundred thousand rows: building them as one JSON document, or
// as a std::string each, would cost more than reading the index tables does.
#pragma once

#include <cstdint>
#include <cstdio>
#include <string>
#include <string_view>

class OutputBuffer {
public:
    explicit OutputBuffer(std::FILE* stream) : _stream(stream) { _text.reserve(kBlock + 256); }
    ~OutputBuffer() { flush(); }
    OutputBuffer(const OutputBuffer&) = delete;
    OutputBuffer& operator=(const OutputBuffer&) = delete;

    OutputBuffer& operator<<(std::string_view text) {
        _text.append(text);
        spill();
        return *this;
    }
    OutputBuffer& operator<<(const char* text) { return *this << std::string_view(text); }
    OutputBuffer& operator<<(const std::string& text) { return *this << std::string_view(text); }
    OutputBuffer& operator<<(char c) {
        _text.push_back(c);
        return *this;
    }
    OutputBuffer& operator<<(int64_t n);
    OutputBuffer& operator<<(int32_t n) { return *this << int64_t(n); }
    OutputBuffer& operator<<(bool b) { return *this << std::string_view(b ? "true" : "false"); }
    // Right-aligned in a field of `width` characters (wider values are kept whole).
    OutputBuffer& padded(std::string_view text, size_t width);
    OutputBuffer& padded(int64_t n, size_t width);

    void flush();

private:
    static constexpr size_t kBlock = 1 << 16;
    void spill() {
        if (_text.size() >= kBlock) flush();
    }

    std::FILE* _stream;
    std::string _text;
};
