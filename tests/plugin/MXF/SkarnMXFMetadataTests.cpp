#include "SkarnMXFMetadata.h"

#include "CardWriter.h"
#include "MXFWriter.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <random>

namespace {

const std::string kIdent = "org.smpte.mxf.identification.";
const std::string kMaterial = "org.smpte.mxf.package.material.";

// A raw local item: tag, 16-bit length, the bytes.
void item(ByteWriter& w, uint16_t tag, const std::vector<uint8_t>& v) {
    w.u16(tag);
    w.u16(uint16_t(v.size()));
    w.bytes(v);
}

std::vector<uint8_t> utf16BE(const std::string& ascii) {
    std::vector<uint8_t> out;
    for (char c : ascii) out.insert(out.end(), {0, uint8_t(c)});
    return out;
}

// A header partition pack declaring header and index byte counts.
void headerPartition(ByteWriter& w, uint64_t headerBytes, uint64_t indexBytes = 0) {
    PartitionPack p;
    p.headerByteCount = headerBytes;
    p.indexByteCount = indexBytes;
    writePartitionPack(w, MXFKeys::headerPartitionClosedComplete, p);
}

Value decode(const std::vector<uint8_t>& bytes) { return Value(SkarnMXFMetadataForBytes(bytes)); }

// The same bytes read as a file answer the same.
Value decodeFile(TempDir& dir, const std::vector<uint8_t>& bytes) {
    writeBytes(dir / "f.mxf", bytes);
    Value fromFile(SkarnMXFMetadataForFile(dir / "f.mxf"));
    EXPECT_EQ(fromFile, decode(bytes));
    return fromFile;
}

}  // namespace

TEST(SkarnMXFMetadata, DecodesEveryTagOfTheTable) {
    LocalSet ident;
    MXFUID product{};
    for (int i = 0; i < 16; ++i) product[i] = uint8_t(0xA0 + i);
    ident.utf16(0x3C01, "corvane").utf16(0x3C02, "Kiln", 3).uid(0x3C05, product)
        .timestamp(0x3C06, 2026, 2, 3, 4, 5, 6).uid(0x3C0A, product);
    Dictionary d = SkarnMXFDecodeLocalSet(ident.value(), "identification");
    EXPECT_EQ(d.keys(), (std::vector<std::string>{kIdent + "applicationsuppliername", kIdent + "applicationname",
                                                  kIdent + "applicationproductid", kIdent + "filemodificationdate"}));
    EXPECT_EQ(*d.find(kIdent + "applicationname"), Value("Kiln"));  // up to the first zero unit
    EXPECT_EQ(*d.find(kIdent + "applicationproductid"), Value("0xA0A1A2A3A4A5A6A7A8A9AAABACADAEAF"));
    EXPECT_EQ(*d.find(kIdent + "filemodificationdate"), Value("2026-02-03 04:05:06 +0000"));

    LocalSet pkg;
    MXFUMID umid{};
    umid[31] = 0x7F;
    pkg.umid(0x4401, umid).utf16(0x4402, "A001").timestamp(0x4405, 1999, 12, 31, 23, 59, 58);
    Dictionary m = SkarnMXFDecodeLocalSet(pkg.value(), "package.material");
    EXPECT_EQ(*m.find(kMaterial + "packageid"), Value("0x" + std::string(62, '0') + "7F"));
    EXPECT_EQ(*m.find(kMaterial + "packagename"), Value("A001"));
    EXPECT_EQ(*m.find(kMaterial + "creationtime"), Value("1999-12-31 23:59:58 +0000"));
}

TEST(SkarnMXFMetadata, UTF16ByteOrderMarksAndSurrogates) {
    ByteWriter w;
    item(w, 0x3C01, {0xFF, 0xFE, 'H', 0, 'i', 0});               // little-endian by its mark
    item(w, 0x3C02, {0xFE, 0xFF, 0, 'O', 0, 'k'});               // big-endian mark
    item(w, 0x3C04, {0xD8, 0x3D, 0xDE, 0x00, 0x00, 0xE9, 0xD8});  // pair, é, odd trailing byte
    Dictionary d = SkarnMXFDecodeLocalSet(w.bytes(), "identification");
    EXPECT_EQ(*d.find(kIdent + "applicationsuppliername"), Value("Hi"));
    EXPECT_EQ(*d.find(kIdent + "applicationname"), Value("Ok"));
    EXPECT_EQ(*d.find(kIdent + "applicationversionstring"), Value("\xF0\x9F\x98\x80\xC3\xA9"));
}

TEST(SkarnMXFMetadata, WrongLengthsAreSkipped) {
    ByteWriter w;
    item(w, 0x3C01, {0x41});                         // UTF-16 needs two bytes
    item(w, 0x3C05, std::vector<uint8_t>(15, 1));    // UUID needs sixteen
    item(w, 0x3C06, std::vector<uint8_t>(9, 1));     // timestamp needs eight
    item(w, 0x4401, std::vector<uint8_t>(31, 1));    // UMID needs thirty-two
    item(w, 0x3C03, utf16BE("not read"));            // inside the range, not in the table
    item(w, 0x3C09, std::vector<uint8_t>(16, 0xEE));
    EXPECT_EQ(SkarnMXFDecodeLocalSet(w.bytes(), "identification").keys(),
              std::vector<std::string>{kIdent + "generationid"});
    // An item claiming more than the set holds ends the walk.
    ByteWriter lying;
    item(lying, 0x3C09, std::vector<uint8_t>(16, 0xEE));
    lying.u16(0x3C02);
    lying.u16(0xFFFF);
    lying.bytes(utf16BE("abc"));
    EXPECT_EQ(SkarnMXFDecodeLocalSet(lying.bytes(), "identification").size(), 1u);
    EXPECT_TRUE(SkarnMXFDecodeLocalSet({}, "identification").empty());
}

TEST(SkarnMXFMetadata, ReadsTheCardWritersFiles) {
    TempDir dir;
    CardSpec params;
    params.root = dir / "VOL";
    params.clips = {defaultClip(*cardFamilyNamed("dvcpro50-ntsc"), 1)};
    params.clips[0].frames = 3;
    std::vector<WrittenClip> written;
    ASSERT_TRUE(writeCard(params, &written));
    Array files;
    for (const char* f : {"VIDEO/A001.MXF", "AUDIO/A00100.MXF", "MISSING.MXF"})
        files.push_back(Value(Dictionary{{"MediaSetPath", Value(dir / "VOL/CONTENTS/" + f)}}));
    Value m = SkarnMXFMetadataForSourceFiles(Value(Array{Value(files)}));
    ASSERT_EQ(m.count(), 3u);
    const Value& video = m[size_t(0)];
    EXPECT_EQ(video.dictionary().keys(),
              (std::vector<std::string>{"identifications", "materialPackages", "sourcePackages"}));
    EXPECT_EQ(video["identifications"][size_t(0)][kIdent + "applicationname"], Value("Skarn Card Writer"));
    EXPECT_EQ(video["materialPackages"][size_t(0)][kMaterial + "packagename"], Value("A001"));
    EXPECT_TRUE(video["sourcePackages"][size_t(0)]["org.smpte.mxf.package.source.packageid"].isString());
    EXPECT_TRUE(m[size_t(1)].dictionary().contains("sourcePackages"));
    EXPECT_TRUE(m[size_t(2)].dictionary().empty());  // unreadable: an empty dictionary
    EXPECT_TRUE(SkarnMXFMetadataForSourceFiles(Value()).isNull());
    EXPECT_EQ(SkarnMXFMetadataForSourceFiles(Value(Array{Value(Array{})})).count(), 0u);
}

TEST(SkarnMXFMetadata, ScanLimitsAndTheLastSetOfAKindWins) {
    TempDir dir;
    LocalSet first, second, source;
    first.utf16(0x4402, "first");
    second.utf16(0x4402, "second");
    source.bytes(0x4403, std::vector<uint8_t>(100, 0x55)).utf16(0x4402, "src");
    auto file = [&](uint64_t headerBytes, size_t padTo) {
        ByteWriter w;
        headerPartition(w, headerBytes);
        writeKLV(w, MXFKeys::materialPackage, first.value());
        writeKLV(w, MXFKeys::materialPackage, second.value());
        writeFill(w, padTo - w.size());
        writeKLV(w, MXFKeys::sourcePackage, source.value());
        writeFill(w, 5000);
        return w.bytes();
    };
    // Within the declared header, past the first read: found by reading on.
    Value d = decodeFile(dir, file(20000, 6000));
    EXPECT_EQ(d["materialPackages"][size_t(0)][kMaterial + "packagename"], Value("second"));
    EXPECT_EQ(d.dictionary().keys(), (std::vector<std::string>{"materialPackages", "sourcePackages"}));
    // A header declaring more than 262144 bytes is not believed: only the
    // first 4096 bytes are scanned.
    Value big = decodeFile(dir, file(262145, 6000));
    EXPECT_EQ(big.dictionary().keys(), std::vector<std::string>{"materialPackages"});
    // A set that the 4096-byte window cuts in two is read whole.
    Value straddling = decodeFile(dir, file(20000, 4096 - 100));
    EXPECT_EQ(straddling["sourcePackages"][size_t(0)]["org.smpte.mxf.package.source.packagename"], Value("src"));
}

TEST(SkarnMXFMetadata, OnlyLongFormSetLengthsAreDecoded) {
    LocalSet s;
    s.utf16(0x4402, "x");
    ByteWriter w;
    w.bytes(std::span<const uint8_t>(MXFKeys::sourcePackage));
    w.u8(uint8_t(s.value().size()));  // short form: read as length 0, nothing decoded
    w.bytes(s.value());
    writeKL(w, MXFKeys::identification, 0);  // long form but empty
    writeFill(w, 100);
    EXPECT_TRUE(decode(w.bytes()).dictionary().empty());
}

TEST(SkarnMXFMetadata, LyingLengthsNeverReadPastTheFile) {
    LocalSet s;
    s.utf16(0x3C02, "app");
    // A set claiming far more than the file holds: decoded as far as it goes.
    ByteWriter w;
    w.bytes(std::span<const uint8_t>(MXFKeys::identification));
    w.u8(0x87);
    for (int i = 0; i < 7; ++i) w.u8(0x7F);
    w.bytes(s.value());
    Value d = decode(w.bytes());
    EXPECT_EQ(d["identifications"][size_t(0)][kIdent + "applicationname"], Value("app"));

    // A partition pack whose counts wrap around, and files cut anywhere.
    ByteWriter p;
    PartitionPack pack;
    pack.thisPartition = ~uint64_t(0) - 10;
    pack.headerByteCount = 100;
    writePartitionPack(p, MXFKeys::headerPartitionClosedComplete, pack);
    writeKLV(p, MXFKeys::identification, s.value());
    EXPECT_TRUE(decode(p.bytes()).dictionary().contains("identifications"));
    for (size_t cut = 0; cut < p.size(); cut += 7) {
        std::vector<uint8_t> shorter(p.bytes().begin(), p.bytes().begin() + long(cut));
        decode(shorter);
    }

    // Random corruption of a real header: answers whatever it answers, safely.
    ByteWriter real;
    headerPartition(real, 3000);
    MXFHeaderMetadataSpec meta;
    meta.packageName = "A001";
    real.bytes(buildHeaderMetadata(meta));
    std::mt19937 rng(7);
    for (int round = 0; round < 200; ++round) {
        std::vector<uint8_t> b = real.bytes();
        for (int k = 0; k < 8; ++k) b[rng() % b.size()] = uint8_t(rng());
        decode(b);
    }
}
