#include "SkarnMXFHeaderXML.h"

#include "ByteReader.h"
#include "FileSystem.h"

#include <array>
#include <cstring>
#include <memory>
#include <unistd.h>

namespace {
// The carrier is a privately registered KLV; the card puts it after the
// header metadata, from 32768 on.
constexpr std::array<uint8_t, 16> kXMLCarrierKey = {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x01, 0x01, 0x09,
                                                    0x0e, 0x0e, 0x01, 0x01, 0x11, 0x01, 0x01, 0x00};
constexpr off_t kWindowStart = 32768;
constexpr size_t kWindowSize = 81920;
// Text starts 49 bytes after the key: 16 key + 4 length + a 29-byte private
// prefix. With an 8-byte length field the prefix is taken as 25 bytes.
constexpr size_t kTextOffset = 49;
}  // namespace

std::optional<std::string> SkarnMXF_XMLStringForClip(const std::optional<std::string>& path) {
    if (!path) return std::nullopt;
    int fd = FileSystem::openReadOnly(*path);
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
    const size_t bytesRead = size_t(got);
    ByteReader reader(buffer.get(), bytesRead);

    size_t keyOffset = 0;
    size_t lengthFieldSize = 4;
    while (keyOffset + 20 < bytesRead) {
        reader.seek(keyOffset + 16);
        uint8_t form = reader.u8();
        uint64_t length = 0;
        if (form == 0x83) {
            length = reader.uN(3);
            lengthFieldSize = 4;
        } else if (form == 0x87) {
            length = reader.uN(7);
            lengthFieldSize = 8;
        }
        // Other forms never occur on the card: the length reads as 0 and the
        // previous length-field size stays.
        if (!reader.ok()) break;
        const size_t valueStart = keyOffset + 16 + lengthFieldSize;
        if (std::memcmp(buffer.get() + keyOffset, kXMLCarrierKey.data(), 16) == 0) {
            uint64_t valueEnd = uint64_t(valueStart) + length;
            if (valueEnd > bytesRead) valueEnd = bytesRead;  // never past what was read
            size_t textStart = keyOffset + kTextOffset;
            if (textStart >= valueEnd) return std::string();
            return std::string(reinterpret_cast<const char*>(buffer.get() + textStart), size_t(valueEnd - textStart));
        }
        if (length > bytesRead) break;  // the next key would lie outside the window
        keyOffset = valueStart + size_t(length);
    }
    return std::nullopt;
}
