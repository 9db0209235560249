#include "SkarnMXFHeaderXML.h"

#include "FileSystem.h"
#include "MXFKLVReader.h"
#include "MXFSpanByteSource.h"

#include <algorithm>
#include <array>
#include <memory>
#include <unistd.h>

namespace {
// The carrier is a privately registered KLV; the card puts it after the
// header metadata, from 32768 on, and it is looked for only in the window
// read from there.
constexpr std::array<uint8_t, 16> kXMLCarrierKey = {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x01, 0x01, 0x09,
                                                    0x0e, 0x0e, 0x01, 0x01, 0x11, 0x01, 0x01, 0x00};
constexpr off_t kWindowStart = 32768;
constexpr size_t kWindowSize = 81920;
// Text starts 49 bytes after the key: 16 key + 4 length + a 29-byte private
// prefix. With an 8-byte length field the prefix is taken as 25 bytes.
constexpr size_t kTextOffset = 49;

// Walks the window's KLVs for the carrier; offsets are the window's own.
std::optional<std::string> xmlInWindow(std::span<const uint8_t> window) {
    if (window.empty()) return std::nullopt;
    MXFKLVReader reader(MXFSpanByteSource::initWithBytes(window));
    uint64_t keyOffset = 0;
    while (keyOffset + 20 < window.size()) {
        const MXFKLVReader::KLV klv = reader.readKLV(keyOffset);
        if (!klv.complete) break;
        if (klv.key == kXMLCarrierKey) {
            // Never past what was read.
            const uint64_t valueEnd = klv.valueOffset() + reader.valueBytesThere(klv);
            const uint64_t textStart = keyOffset + kTextOffset;
            if (textStart >= valueEnd) return std::string();
            return std::string(reinterpret_cast<const char*>(window.data() + textStart), size_t(valueEnd - textStart));
        }
        const std::optional<uint64_t> next = MXFKLVReader::nextKeyOffset(klv);
        if (!next) break;
        keyOffset = *next;
    }
    return std::nullopt;
}

}  // namespace

std::optional<std::string> SkarnMXF_XMLStringForClip(const std::optional<std::string>& path) {
    if (!path) return std::nullopt;
    int fd = FileSystem::openRegularFileReadOnly(*path);
    if (fd < 0) return std::nullopt;
    FileSystem::disableCaching(fd);
    if (::lseek(fd, kWindowStart, SEEK_SET) != kWindowStart) {
        // Left open on this path, as the card reader always has; lseek on a
        // regular file cannot fail here.
        return std::nullopt;
    }
    std::unique_ptr<uint8_t[]> buffer(new uint8_t[kWindowSize]);
    int64_t got = FileSystem::readFully(fd, buffer.get(), kWindowSize);
    ::close(fd);
    if (got <= 0) return std::nullopt;
    return xmlInWindow(std::span<const uint8_t>(buffer.get(), size_t(got)));
}

std::optional<std::string> SkarnMXF_XMLStringForBytes(std::span<const uint8_t> fileBytes) {
    if (fileBytes.size() <= size_t(kWindowStart)) return std::nullopt;
    const std::span<const uint8_t> afterHeader = fileBytes.subspan(size_t(kWindowStart));
    return xmlInWindow(afterHeader.first(std::min(kWindowSize, afterHeader.size())));
}
