#pragma once
// The archive file format: header, cluster table (COT) record, cluster records and directory unit
// records. Everything here is pure encoding and decoding over byte buffers; the archive object
// decides where the bytes go.
//
// File layout (E = offset of the header, usually 0; D = E + dataOffset):
//   [stub of E bytes][header 64/68][master key block][data area: cluster records][COT record]
//   [extended key block, present when flags bit 0 is set, up to the end of the file]
//
// Header, little-endian:
//    0 magic "KorvelEncryptArc" (16)   16 versionMajor   17 versionMinor   18 flags   19 blockSize
//   20 masterKeyOffset u32   24 dataOffset u32   28 cotOffset u64 (all ones: COT not in the file)
//   36 cotLength u32   40 headerCheck (20)   60 embeddedOffset u32   64 headerSize u32 (2.1 and later)
//
// COT entry (16 bytes): next u32 (0 free, 0xFFFFFFFF end of chain), offset u64 (relative to D;
// all ones: the record is in a cluster file of the temporary folder), size u32 (stored length).
//
// COT record: R u32 (entries x 16), T u32 (total), P u8 (>= 12), zeros up to P, zlib stream of the
// table; T a multiple of blockSize; encrypted as one CBC message with the zero IV.
//
// Cluster record, format 2: L u8 (<= 31), L bytes zlib of the 17-byte descriptor {uncompressed
// length, compressed length, own cluster number, next, 0}, H u8, filler bytes equal to H up to H,
// then the zlib stream of the payload. Encrypted with the zero IV.
// Cluster record, format 1: uncompressed length u32, H u8 (5..blockSize+5), zeros up to H, zlib
// stream. Encrypted with the cluster number as IV.
//
// Directory unit record: length u32, kind u8 (0 chain, 1 inline, 2 volume, 3 deleted), signature
// 0x42, start u32, attributes u32, created/modified/accessed u64 FILETIME, sizeHigh u32, sizeLow u32,
// UTF-16LE name with one terminating zero, then inline data for kind 1.
#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "crypto/sym_alg.h"
#include "platform/result.h"
#include "platform/secure.h"

namespace vaultora {

inline constexpr char kMagic[16] = {'K', 'o', 'r', 'v', 'e', 'l', 'E', 'n', 'c', 'r', 'y', 'p', 't', 'A', 'r', 'c'};
inline constexpr uint32_t kHeaderSize20 = 64;
inline constexpr uint32_t kHeaderSize21 = 68;
inline constexpr uint32_t kMaxPayload = 524288;           // cluster payload limit (512 KiB)
inline constexpr uint64_t kSpaceUnit = 33554432;          // 32 MiB placement unit
inline constexpr uint64_t kHeaderSearchLimit = 1048576;   // header must start within the first MiB
inline constexpr uint32_t kEndOfChain = 0xFFFFFFFF;
inline constexpr uint32_t kNoCluster = 0xFFFFFFFF;
inline constexpr uint64_t kInClusterFile = 0xFFFFFFFFFFFFFFFFull;
inline constexpr uint64_t kCotNotStored = 0xFFFFFFFFFFFFFFFFull;
inline constexpr uint32_t kInlineThreshold = 512;         // files of 1..511 bytes are stored inline

struct Header {
    uint8_t versionMajor = 2;
    uint8_t versionMinor = 1;
    uint8_t flags = 0;
    uint8_t blockSize = 8;
    uint32_t masterKeyOffset = kHeaderSize21;
    uint32_t dataOffset = kHeaderSize21;
    uint64_t cotOffset = kCotNotStored;
    uint32_t cotLength = 0;
    std::array<uint8_t, 20> headerCheck{};
    uint32_t embeddedOffset = 0;
    uint32_t headerSize = kHeaderSize21;  // the stored field (2.1 and later)

    // 68 for 2.1 and later (and any major above 2), 64 before.
    uint32_t size() const;
    bool isFormat2() const { return versionMajor == 2; }
    bool hasExtendedBlock() const { return (flags & 1) != 0; }
    // True when this program can open the version (1.x, 2.0, 2.1).
    bool versionSupported() const;
    // Writes the image: size() bytes are meaningful, the array always has 68.
    std::array<uint8_t, 68> encode() const;
    static Header decode(const uint8_t* image);
};

// Header search from `start`: byte-at-a-time magic scan that gives up past the first MiB, skips
// matches whose major version is 0, and fills embeddedOffset from the position found. Reads the
// file through `read(offset, buffer, length) -> bytes read`. False when no header is found.
template <class ReadFn>
bool findHeader(ReadFn read, uint64_t start, Header& out, std::array<uint8_t, 68>& image);

struct CotEntry {
    uint32_t next = 0;
    uint64_t offset = 0;
    uint32_t size = 0;
    bool used() const { return next != 0; }
    bool inClusterFile() const { return offset == kInClusterFile; }
    bool operator==(const CotEntry&) const = default;
};

// Grows the table so that entry n exists: to n + 64 entries, capped below 0xFFFFFFFF.
void growTable(std::vector<CotEntry>& cot, uint32_t n);
// Resets free entries to zeros and cuts the table behind the highest used entry (entry 0 stays).
void normalizeTable(std::vector<CotEntry>& cot);

// Encodes (normalises a copy, compresses, frames, encrypts) the COT record.
[[nodiscard]] Result encodeCotRecord(const std::vector<CotEntry>& cot, uint32_t blockSize, ClusterCipher& cipher,
                                     std::vector<uint8_t>& record);
// The smallest multiple of the block size that is at least 12: what must be read first.
uint32_t cotPrefixLength(uint32_t blockSize);
// Decrypts the prefix in place and returns the total record length T it announces.
[[nodiscard]] Result cotRecordLength(uint8_t* prefix, uint32_t prefixLength, uint32_t blockSize,
                                     ClusterCipher& cipher, uint32_t& total);
// Decodes a whole (still encrypted) COT record into the table.
[[nodiscard]] Result decodeCotRecord(const uint8_t* record, size_t length, uint32_t blockSize, ClusterCipher& cipher,
                                     std::vector<CotEntry>& cot);

// What a format-2 record says about itself.
struct ClusterDescriptor {
    uint32_t uncompressedLength = 0;
    uint32_t compressedLength = 0;
    uint32_t cluster = 0;
    uint32_t next = 0;
    uint32_t recordLength = 0;  // H + compressed length
};

// Encodes a cluster record. format2 selects the framing; `next` is the COT next of the cluster.
[[nodiscard]] Result encodeClusterRecord(bool format2, const uint8_t* payload, uint32_t n, uint32_t cluster,
                                         uint32_t next, uint32_t blockSize, ClusterCipher& cipher,
                                         std::vector<uint8_t>& record);
// How many bytes of a format-2 record must be decrypted to read its descriptor.
uint32_t descriptorPrefixLength(uint32_t blockSize);
// Reads the descriptor of a format-2 record from its first bytes (still encrypted; `available` is
// how many bytes of the record exist). 101 when the bytes are not a valid record start.
[[nodiscard]] Result readClusterDescriptor(const uint8_t* record, size_t available, uint32_t blockSize,
                                           ClusterCipher& cipher, ClusterDescriptor& out);
// Decodes a whole record into the payload. For format 2, `expectCluster` (kNoCluster to skip the
// test) must match the descriptor and `expectSize` (0 to skip) must equal the record length.
[[nodiscard]] Result decodeClusterRecord(bool format2, const uint8_t* record, size_t length, uint32_t cluster,
                                         uint32_t expectSize, uint32_t blockSize, ClusterCipher& cipher,
                                         SecureBytes& payload);

// Directory unit record.
inline constexpr uint8_t kUnitChain = 0;
inline constexpr uint8_t kUnitInline = 1;
inline constexpr uint8_t kUnitVolume = 2;
inline constexpr uint8_t kUnitDeleted = 3;
inline constexpr uint8_t kUnitSignature = 0x42;
inline constexpr uint32_t kUnitFixedSize = 48;  // 46 bytes of fields + the terminating zero
inline constexpr uint32_t kAttrReadOnly = 0x01;
inline constexpr uint32_t kAttrHidden = 0x02;
inline constexpr uint32_t kAttrVolume = 0x08;
inline constexpr uint32_t kAttrFolder = 0x10;
inline constexpr uint32_t kAttrArchive = 0x20;
inline constexpr uint32_t kAttrPosixMode = 0x8000;  // high 16 bits hold st_mode

namespace unit {
// Field access on a record at p (at least 48 bytes).
uint32_t length(const uint8_t* p);
uint8_t kind(const uint8_t* p);
uint32_t start(const uint8_t* p);
uint32_t attributes(const uint8_t* p);
uint64_t created(const uint8_t* p);
uint64_t modified(const uint8_t* p);
uint64_t accessed(const uint8_t* p);
uint64_t size(const uint8_t* p);
std::u16string name(const uint8_t* p);  // up to the terminating zero, within the record
void setLength(uint8_t* p, uint32_t v);
void setKind(uint8_t* p, uint8_t v);
void setStart(uint8_t* p, uint32_t v);
void setAttributes(uint8_t* p, uint32_t v);
void setTimes(uint8_t* p, uint64_t created, uint64_t modified, uint64_t accessed);
void setSize(uint8_t* p, uint64_t v);
// A record is valid when its signature is 0x42 and 48 <= length <= 524,288 (and it fits in
// `available` bytes).
bool valid(const uint8_t* p, size_t available);
// A fresh record: zeros, signature, length 48 + 2 x name length, the name.
std::vector<uint8_t> make(std::u16string_view name);
// The root folder's fixed record and the volume record of a new archive.
std::vector<uint8_t> rootFolder();
std::vector<uint8_t> volumeRecord();
}  // namespace unit

// Little-endian helpers.
inline uint16_t getU16(const uint8_t* p) { return static_cast<uint16_t>(p[0] | (p[1] << 8)); }
inline uint32_t getU32(const uint8_t* p) {
    return static_cast<uint32_t>(p[0]) | (static_cast<uint32_t>(p[1]) << 8) | (static_cast<uint32_t>(p[2]) << 16) |
           (static_cast<uint32_t>(p[3]) << 24);
}
inline uint64_t getU64(const uint8_t* p) { return getU32(p) | (static_cast<uint64_t>(getU32(p + 4)) << 32); }
inline void putU16(uint8_t* p, uint16_t v) { p[0] = static_cast<uint8_t>(v); p[1] = static_cast<uint8_t>(v >> 8); }
inline void putU32(uint8_t* p, uint32_t v) {
    for (int i = 0; i < 4; ++i) p[i] = static_cast<uint8_t>(v >> (8 * i));
}
inline void putU64(uint8_t* p, uint64_t v) {
    for (int i = 0; i < 8; ++i) p[i] = static_cast<uint8_t>(v >> (8 * i));
}

template <class ReadFn>
bool findHeader(ReadFn read, uint64_t start, Header& out, std::array<uint8_t, 68>& image) {
    // Reads go through a small window so the byte-at-a-time scan does not cost a call per byte.
    std::vector<uint8_t> window;
    uint64_t windowStart = 0;
    auto byteAt = [&](uint64_t pos, uint8_t& b) -> bool {
        if (pos < windowStart || pos >= windowStart + window.size()) {
            window.resize(65536);
            long long got = read(pos, window.data(), window.size());
            if (got <= 0) { window.clear(); return false; }
            window.resize(static_cast<size_t>(got));
            windowStart = pos;
        }
        b = window[pos - windowStart];
        return true;
    };
    uint64_t pos = start;
    size_t matched = 0;
    for (;;) {
        if (pos > kHeaderSearchLimit) return false;
        uint8_t b = 0;
        if (!byteAt(pos, b)) return false;
        ++pos;
        if (b == static_cast<uint8_t>(kMagic[matched])) {
            if (++matched < 16) continue;
        } else {
            matched = 0;
            continue;
        }
        uint64_t headerPos = pos - 16;
        std::copy(kMagic, kMagic + 16, image.begin());
        long long got = read(pos, image.data() + 16, 52);
        if (got != 52) return false;
        if (image[16] == 0) {
            // A copy of the magic inside a stub: continue from the last byte of the rejected magic.
            matched = 0;
            pos = pos - 1;
            continue;
        }
        out = Header::decode(image.data());
        out.embeddedOffset = static_cast<uint32_t>(headerPos);
        putU32(image.data() + 60, out.embeddedOffset);
        return true;
    }
}

}  // namespace vaultora
