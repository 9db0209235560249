#include "SkarnMXFMetadata.h"

#include "ByteReader.h"
#include "FileSystem.h"
#include "MXFFileByteSource.h"
#include "MXFKLVReader.h"
#include "MXFSpanByteSource.h"
#include "SkarnLog.h"

#include <array>
#include <cstdio>
#include <cstring>
#include <string>

namespace {

constexpr size_t kReadSize = 4096;
// A KLV is only started with at least this much of the buffer ahead of it;
// otherwise the buffer is read anew at the KLV.
constexpr size_t kRefillMargin = 64;
// Header and index byte counts beyond this are not believed.
constexpr uint64_t kMaxHeaderScan = 262144;

constexpr std::array<uint8_t, 14> kSetKeyPrefix = {0x06, 0x0e, 0x2b, 0x34, 0x02, 0x53, 0x01,
                                                   0x01, 0x0d, 0x01, 0x01, 0x01, 0x01, 0x01};
constexpr std::array<uint8_t, 14> kHeaderPartitionPrefix = {0x06, 0x0e, 0x2b, 0x34, 0x02, 0x05, 0x01,
                                                            0x01, 0x0d, 0x01, 0x02, 0x01, 0x01, 0x02};
constexpr uint8_t kIdentificationSet = 0x30;
constexpr uint8_t kMaterialPackageSet = 0x36;
constexpr uint8_t kSourcePackageSet = 0x37;

enum class Encoding { UTF16, UUID, UMID, Timestamp };

struct TagInfo {
    uint16_t tag;
    const char* name;
    Encoding encoding;
};

constexpr TagInfo kTags[] = {
    {0x3C01, "applicationsuppliername", Encoding::UTF16},
    {0x3C02, "applicationname", Encoding::UTF16},
    {0x3C04, "applicationversionstring", Encoding::UTF16},
    {0x3C05, "applicationproductid", Encoding::UUID},
    {0x3C06, "filemodificationdate", Encoding::Timestamp},
    {0x3C09, "generationid", Encoding::UUID},
    {0x4401, "packageid", Encoding::UMID},
    {0x4402, "packagename", Encoding::UTF16},
    {0x4404, "packagelastmodified", Encoding::Timestamp},
    {0x4405, "creationtime", Encoding::Timestamp},
};

const TagInfo* tagInfo(uint16_t tag) {
    for (const TagInfo& t : kTags)
        if (t.tag == tag) return &t;
    return nullptr;
}

void appendUTF8(std::string& out, uint32_t cp) {
    if (cp < 0x80) {
        out += char(cp);
    } else if (cp < 0x800) {
        out += char(0xC0 | (cp >> 6));
        out += char(0x80 | (cp & 0x3F));
    } else if (cp < 0x10000) {
        out += char(0xE0 | (cp >> 12));
        out += char(0x80 | ((cp >> 6) & 0x3F));
        out += char(0x80 | (cp & 0x3F));
    } else {
        out += char(0xF0 | (cp >> 18));
        out += char(0x80 | ((cp >> 12) & 0x3F));
        out += char(0x80 | ((cp >> 6) & 0x3F));
        out += char(0x80 | (cp & 0x3F));
    }
}

// Units up to the first zero unit; big-endian unless a byte-order mark says
// otherwise (the mark itself is not text).
std::string decodeUTF16(std::span<const uint8_t> v) {
    const size_t units = v.size() / 2;
    bool little = false;
    size_t i = 0;
    if (units > 0) {
        if (v[0] == 0xFF && v[1] == 0xFE) little = true, i = 1;
        else if (v[0] == 0xFE && v[1] == 0xFF) i = 1;
    }
    auto unit = [&](size_t k) -> uint16_t {
        return little ? uint16_t(v[2 * k] | v[2 * k + 1] << 8) : uint16_t(v[2 * k] << 8 | v[2 * k + 1]);
    };
    std::string out;
    for (; i < units; ++i) {
        uint16_t u = unit(i);
        if (u == 0) break;
        if (u >= 0xD800 && u <= 0xDBFF && i + 1 < units) {
            uint16_t lo = unit(i + 1);
            if (lo >= 0xDC00 && lo <= 0xDFFF) {
                appendUTF8(out, 0x10000 + ((uint32_t(u) - 0xD800) << 10) + (lo - 0xDC00));
                ++i;
                continue;
            }
        }
        appendUTF8(out, (u >= 0xD800 && u <= 0xDFFF) ? 0xFFFD : u);
    }
    return out;
}

std::string hexText(std::span<const uint8_t> v) {
    static const char kHex[] = "0123456789ABCDEF";
    std::string out = "0x";
    for (uint8_t b : v) {
        out += kHex[b >> 4];
        out += kHex[b & 15];
    }
    return out;
}

// Decimal digits, zero-padded to at least width: what "%0*d" prints for a
// non-negative value. Written by hand because a printf per field was the
// largest single cost of reading a clip's metadata.
void appendPadded(std::string& out, unsigned value, unsigned width) {
    char digits[8];
    unsigned n = 0;
    do {
        digits[n++] = char('0' + value % 10);
        value /= 10;
    } while (value != 0);
    for (unsigned k = n; k < width; ++k) out += '0';
    while (n > 0) out += digits[--n];
}

// "%04d-%02d-%02d %02d:%02d:%02d +0000" of year, month, day, hour, minute, second.
std::string timestampText(std::span<const uint8_t> v) {
    std::string out;
    out.reserve(32);
    appendPadded(out, loadBE16(v.data()), 4);
    out += '-';
    appendPadded(out, v[2], 2);
    out += '-';
    appendPadded(out, v[3], 2);
    out += ' ';
    appendPadded(out, v[4], 2);
    out += ':';
    appendPadded(out, v[5], 2);
    out += ':';
    appendPadded(out, v[6], 2);
    out += " +0000";
    return out;
}

// The file is read 4096 bytes at a time from wherever the walk has got to;
// what a KLV's value may use is what the window holds of it.
class FileWindow {
public:
    explicit FileWindow(Ref<MXFByteSource> source) : _source(std::move(source)) {}
    // Reads kReadSize bytes at the offset; false when nothing came.
    bool fill(uint64_t offset) {
        _start = offset;
        _size = 0;
        _bytes = nullptr;
        int64_t got = _source->readAt(offset, _buffer.data(), _buffer.size());
        if (got <= 0) return false;
        _size = size_t(got);
        _bytes = MXFSpanByteSource::initWithBytes(std::span<const uint8_t>(_buffer.data(), _size));
        return true;
    }
    // Bytes of the window from a file offset on (empty when outside it).
    std::span<const uint8_t> from(uint64_t offset) const {
        if (offset < _start || offset - _start >= _size) return {};
        return std::span<const uint8_t>(_buffer.data() + (offset - _start), _size - size_t(offset - _start));
    }
    size_t size() const { return _size; }
    bool startsAt(uint64_t offset) const { return offset == _start; }

    // The KLV whose key is at `offset`, which must lie in the window.
    MXFKLVReader::KLV readKLV(uint64_t offset) const {
        MXFKLVReader::KLV klv = reader().readKLV(offset - _start);
        klv.keyOffset = offset;
        return klv;
    }
    // As much of klv's value as the window holds.
    std::span<const uint8_t> valueThere(const MXFKLVReader::KLV& klv) const {
        if (klv.keyOffset < _start) return {};
        MXFKLVReader::KLV inWindow = klv;
        inWindow.keyOffset -= _start;
        return from(klv.valueOffset()).first(size_t(reader().valueBytesThere(inWindow)));
    }

private:
    // Lengths in any other form than the two long ones are taken as one byte.
    MXFKLVReader reader() const { return MXFKLVReader(_bytes, MXFKLVReader::RefusedLengthForm::OneByte); }

    Ref<MXFByteSource> _source;
    std::array<uint8_t, kReadSize> _buffer{};
    Ref<MXFSpanByteSource> _bytes;
    uint64_t _start = 0;
    size_t _size = 0;
};

// The identification, material package and source package sets of one file.
Dictionary metadataFromSource(Ref<MXFByteSource> source) {
    Dictionary result;
    FileWindow window(std::move(source));
    if (!window.fill(0)) return result;
    uint64_t limit = window.size();
    uint64_t pos = 0;
    bool identification = false, material = false, sourcePackage = false;

    while (!(identification && material && sourcePackage) && pos <= limit) {
        if (window.from(pos).size() < kRefillMargin && !window.fill(pos)) break;
        const MXFKLVReader::KLV klv = window.readKLV(pos);
        if (!klv.complete) break;  // the key and its length are not all in the file
        const std::optional<uint64_t> next = MXFKLVReader::nextKeyOffset(klv);
        if (!next) break;
        const uint64_t headerSize = klv.valueOffset() - pos;
        const auto& key = klv.key;

        const bool isSet = std::memcmp(key.data(), kSetKeyPrefix.data(), 14) == 0 &&
                           (key[14] == kIdentificationSet || key[14] == kMaterialPackageSet ||
                            key[14] == kSourcePackageSet);
        const bool isHeaderPartition = std::memcmp(key.data(), kHeaderPartitionPrefix.data(), 14) == 0;
        // A set or pack that the window cuts off is read again from its key when
        // it fits in one read, so it is decoded whole; larger ones are decoded as
        // far as the window goes.
        uint64_t needed = isSet ? headerSize + klv.length : isHeaderPartition ? headerSize + 48 : 0;
        if (needed > window.from(pos).size() && needed <= kReadSize && !window.startsAt(pos)) {
            if (!window.fill(pos)) break;
        }
        if (window.from(pos).size() < headerSize) break;

        if (isHeaderPartition) {
            // The pack's fields are taken from the window whatever its length says.
            ByteReader p(window.from(klv.valueOffset()));
            p.skip(8);
            const uint64_t thisPartition = p.u64();
            p.skip(16);
            const uint64_t headerBytes = p.u64();
            const uint64_t indexBytes = p.u64();
            if (p.ok()) {
                // Summed with overflow in mind: a lying pack must not wrap to a small limit.
                const uint64_t sum = thisPartition + headerBytes;
                if (sum >= thisPartition && sum + indexBytes >= sum && sum + indexBytes <= kMaxHeaderScan)
                    limit = sum + indexBytes;
            }
        } else if (isSet && klv.longForm && klv.length != 0) {
            const char* prefix = key[14] == kIdentificationSet ? "identification"
                                 : key[14] == kMaterialPackageSet ? "package.material"
                                                                  : "package.source";
            const char* slot = key[14] == kIdentificationSet ? "identifications"
                               : key[14] == kMaterialPackageSet ? "materialPackages"
                                                                : "sourcePackages";
            Dictionary set = SkarnMXFDecodeLocalSet(window.valueThere(klv), prefix);
            // Moved in, not listed in an initialiser, which would copy the set.
            Array one;
            one.push_back(Value(std::move(set)));
            result.set(slot, Value(std::move(one)));
            if (key[14] == kIdentificationSet) identification = true;
            else if (key[14] == kMaterialPackageSet) material = true;
            else sourcePackage = true;
        }
        pos = *next;
    }
    return result;
}

}  // namespace

Dictionary SkarnMXFDecodeLocalSet(std::span<const uint8_t> setValue, const std::string& prefix) {
    Dictionary out;
    const std::string keyStart = "org.smpte.mxf." + prefix + ".";
    std::string key;
    MXFKLVReader::forEachLocalTag(setValue, [&](uint16_t tag, uint16_t length, std::span<const uint8_t> v) {
        const TagInfo* info = tagInfo(tag);
        if (!info) return;
        std::string text;
        switch (info->encoding) {
        case Encoding::UTF16:
            if (length < 2) {
                SkarnLog(1, "WRONG Length for mxfKeyUTF16StringType");
                return;
            }
            text = decodeUTF16(v);
            break;
        case Encoding::UUID:
            if (length != 16) {
                SkarnLog(1, "WRONG Length for UUIDType");
                return;
            }
            text = hexText(v);
            break;
        case Encoding::UMID:
            if (length != 32) {
                SkarnLog(1, "WRONG Length for mxfKeyUMIDType");
                return;
            }
            text = hexText(v);
            break;
        case Encoding::Timestamp:
            if (length != 8) {
                SkarnLog(1, "WRONG Length for TimestampType");
                return;
            }
            text = timestampText(v);
            break;
        }
        key.assign(keyStart).append(info->name);
        out.set(key, Value(std::move(text)));
    });
    return out;
}

Dictionary SkarnMXFMetadataForFile(const std::string& path) {
    int fd = FileSystem::openRegularFileReadOnly(path);
    if (fd < 0) return Dictionary();
    FileSystem::disableCaching(fd);
    Ref<MXFFileByteSource> file = MXFFileByteSource::initWithDescriptor(fd);
    if (!file) return Dictionary();
    return metadataFromSource(std::move(file));
}

Dictionary SkarnMXFMetadataForBytes(std::span<const uint8_t> fileBytes) {
    return metadataFromSource(MXFSpanByteSource::initWithBytes(fileBytes));
}

Value SkarnMXFMetadataForSourceFiles(const Value& ingestSourceFiles) {
    const Value& mediaSet = ingestSourceFiles[size_t(0)];
    if (!mediaSet.isArray()) return Value();
    Array out;
    for (const Value& file : mediaSet.arrayValue()) {
        const Value& path = file["MediaSetPath"];
        out.push_back(Value(path.isString() ? SkarnMXFMetadataForFile(path.string()) : Dictionary()));
    }
    return Value(std::move(out));
}

Value SkarnMXFMetadataForClip(VestaKilnClipDataSourceProtocol* clip) {
    if (!clip) return Value();
    return SkarnMXFMetadataForSourceFiles(clip->ingestSourceFiles());
}
