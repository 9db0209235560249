#include "OutputBuffer.h"

#include <charconv>

OutputBuffer& OutputBuffer::operator<<(int64_t n) {
    char digits[24];
    auto result = std::to_chars(digits, digits + sizeof digits, n);
    return *this << std::string_view(digits, size_t(result.ptr - digits));
}

OutputBuffer& OutputBuffer::padded(std::string_view text, size_t width) {
    if (text.size() < width) _text.append(width - text.size(), ' ');
    return *this << text;
}

OutputBuffer& OutputBuffer::padded(int64_t n, size_t width) {
    char digits[24];
    auto result = std::to_chars(digits, digits + sizeof digits, n);
    return padded(std::string_view(digits, size_t(result.ptr - digits)), width);
}

void OutputBuffer::flush() {
    if (_text.empty()) return;
    std::fwrite(_text.data(), 1, _text.size(), _stream);
    _text.clear();
    std::fflush(_stream);
}
