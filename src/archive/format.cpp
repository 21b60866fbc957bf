#include "archive/format.h"

#include <algorithm>
#include <cstring>

#include "archive/compress.h"

namespace vaultora {

uint32_t Header::size() const {
    return (versionMajor > 2 || (versionMajor == 2 && versionMinor >= 1)) ? kHeaderSize21 : kHeaderSize20;
}

bool Header::versionSupported() const {
    if (versionMajor == 1) return true;
    return versionMajor == 2 && versionMinor <= 1;
}

std::array<uint8_t, 68> Header::encode() const {
    std::array<uint8_t, 68> b{};
    std::memcpy(b.data(), kMagic, 16);
    b[16] = versionMajor;
    b[17] = versionMinor;
    b[18] = flags;
    b[19] = blockSize;
    putU32(&b[20], masterKeyOffset);
    putU32(&b[24], dataOffset);
    putU64(&b[28], cotOffset);
    putU32(&b[36], cotLength);
    std::memcpy(&b[40], headerCheck.data(), 20);
    putU32(&b[60], embeddedOffset);
    if (size() == kHeaderSize21) putU32(&b[64], headerSize);
    return b;
}

Header Header::decode(const uint8_t* p) {
    Header h;
    h.versionMajor = p[16];
    h.versionMinor = p[17];
    h.flags = p[18];
    h.blockSize = p[19];
    h.masterKeyOffset = getU32(p + 20);
    h.dataOffset = getU32(p + 24);
    h.cotOffset = getU64(p + 28);
    h.cotLength = getU32(p + 36);
    std::memcpy(h.headerCheck.data(), p + 40, 20);
    h.embeddedOffset = getU32(p + 60);
    h.headerSize = h.size() == kHeaderSize21 ? getU32(p + 64) : kHeaderSize20;
    return h;
}

void growTable(std::vector<CotEntry>& cot, uint32_t n) {
    if (n < cot.size()) return;
    uint64_t want = static_cast<uint64_t>(n) + 64;
    if (want >= 0xFFFFFFFFull) want = 0xFFFFFFFEull;
    cot.resize(static_cast<size_t>(want));
}

void normalizeTable(std::vector<CotEntry>& cot) {
    size_t highest = 0;
    for (size_t i = 1; i < cot.size(); ++i) {
        if (!cot[i].used()) cot[i] = CotEntry{};
        else highest = i;
    }
    if (cot.empty()) cot.resize(1);
    cot.resize(highest + 1);
}

namespace {

uint32_t roundedPad(uint32_t compressedLength, uint32_t blockSize, uint32_t minimum) {
    uint32_t pad = blockSize - (compressedLength % blockSize);
    while (pad < minimum) pad += blockSize;
    return pad;
}

uint32_t smallestMultipleAtLeast(uint32_t blockSize, uint32_t minimum) {
    return (minimum + blockSize - 1) / blockSize * blockSize;
}

}  // namespace

Result encodeCotRecord(const std::vector<CotEntry>& table, uint32_t blockSize, ClusterCipher& cipher,
                       std::vector<uint8_t>& record) {
    if (blockSize == 0) return kSizeAlignment;
    std::vector<CotEntry> cot = table;
    normalizeTable(cot);
    std::vector<uint8_t> raw(cot.size() * 16);
    for (size_t i = 0; i < cot.size(); ++i) {
        putU32(&raw[i * 16], cot[i].next);
        putU64(&raw[i * 16 + 4], cot[i].offset);
        putU32(&raw[i * 16 + 12], cot[i].size);
    }
    size_t room = blockSize + 12;
    size_t clen = maxCompressedSize(raw.size());
    record.assign(room + clen, 0);
    if (Result rc = compressBuffer(record.data() + room, clen, raw.data(), raw.size()); rc != kOk) return rc;
    uint32_t p = roundedPad(static_cast<uint32_t>(clen), blockSize, 12);
    if (p > 255) return kSizeAlignment;
    std::memmove(record.data() + p, record.data() + room, clen);
    uint32_t total = p + static_cast<uint32_t>(clen);
    record.resize(total);
    std::memset(record.data(), 0, p);
    putU32(record.data(), static_cast<uint32_t>(raw.size()));
    putU32(record.data() + 4, total);
    record[8] = static_cast<uint8_t>(p);
    if (!cipher.Encrypt(0, record.data(), record.data(), total)) return kEncryptFailed;
    return kOk;
}

uint32_t cotPrefixLength(uint32_t blockSize) { return smallestMultipleAtLeast(blockSize, 12); }

Result cotRecordLength(uint8_t* prefix, uint32_t prefixLength, uint32_t blockSize, ClusterCipher& cipher,
                       uint32_t& total) {
    if (blockSize == 0 || prefixLength < cotPrefixLength(blockSize)) return kInconsistent;
    if (!cipher.Decrypt(0, prefix, prefix, cotPrefixLength(blockSize))) return kDecryptFailed;
    uint32_t r = getU32(prefix);
    total = getU32(prefix + 4);
    if (r % 16 != 0) return kInconsistent;
    if (total < 12 || total % blockSize != 0) return kInconsistent;
    return kOk;
}

Result decodeCotRecord(const uint8_t* record, size_t length, uint32_t blockSize, ClusterCipher& cipher,
                       std::vector<CotEntry>& cot) {
    if (blockSize == 0 || length < cotPrefixLength(blockSize) || length % blockSize != 0) return kInconsistent;
    SecureBytes plain(record, record + length);
    if (!cipher.Decrypt(0, plain.data(), plain.data(), static_cast<uint32_t>(length))) return kDecryptFailed;
    uint32_t r = getU32(plain.data());
    uint32_t total = getU32(plain.data() + 4);
    uint32_t p = plain[8];
    if (r % 16 != 0 || r == 0) return kInconsistent;
    if (total != length || p < 12 || p >= total) return kInconsistent;
    // zlib cannot expand more than about 1032:1; a larger claim is a damaged or hostile record,
    // refused before anything that large is allocated.
    if (static_cast<uint64_t>(r) > static_cast<uint64_t>(total - p) * 1032 + 64) return kInconsistent;
    std::vector<uint8_t> raw(r);
    size_t outLen = r;
    if (Result rc = decompressBuffer(raw.data(), outLen, plain.data() + p, total - p); rc != kOk) return rc;
    if (outLen != r) return kInconsistent;
    std::vector<CotEntry> table(r / 16);
    for (size_t i = 0; i < table.size(); ++i) {
        table[i].next = getU32(&raw[i * 16]);
        table[i].offset = getU64(&raw[i * 16 + 4]);
        table[i].size = getU32(&raw[i * 16 + 12]);
    }
    cot.clear();
    growTable(cot, static_cast<uint32_t>(table.size() - 1));
    std::copy(table.begin(), table.end(), cot.begin());
    return kOk;
}

Result encodeClusterRecord(bool format2, const uint8_t* payload, uint32_t n, uint32_t cluster, uint32_t next,
                           uint32_t blockSize, ClusterCipher& cipher, std::vector<uint8_t>& record) {
    if (n == 0) return kBufferTooSmall;
    if (blockSize == 0) return kSizeAlignment;
    const uint32_t room = format2 ? blockSize + 31 : blockSize + 5;
    size_t clen = maxCompressedSize(n);
    record.assign(room + clen, 0);
    if (Result rc = compressBuffer(record.data() + room, clen, payload, n); rc != kOk) return rc;
    uint32_t h = 0;
    if (format2) {
        uint8_t desc[17] = {};
        putU32(desc, n);
        putU32(desc + 4, static_cast<uint32_t>(clen));
        putU32(desc + 8, cluster);
        putU32(desc + 12, next);
        uint8_t cdesc[64];
        size_t dlen = sizeof cdesc;
        if (Result rc = compressBuffer(cdesc, dlen, desc, sizeof desc); rc != kOk) return rc;
        if (dlen + 1 > 29) return kSizeAlignment;
        const uint32_t l = static_cast<uint32_t>(dlen);
        h = roundedPad(static_cast<uint32_t>(clen), blockSize, l + 2);
        if (h > blockSize + 31 || h > 255) return kSizeAlignment;
        std::memmove(record.data() + h, record.data() + room, clen);
        record[0] = static_cast<uint8_t>(l);
        std::memcpy(record.data() + 1, cdesc, l);
        for (uint32_t i = l + 1; i < h; ++i) record[i] = static_cast<uint8_t>(h);
    } else {
        h = roundedPad(static_cast<uint32_t>(clen), blockSize, 5);
        std::memmove(record.data() + h, record.data() + room, clen);
        putU32(record.data(), n);
        record[4] = static_cast<uint8_t>(h);
        std::memset(record.data() + 5, 0, h - 5);
    }
    const size_t total = h + clen;
    if (total % blockSize != 0) return kBufferTooSmall;
    record.resize(total);
    if (!cipher.Encrypt(format2 ? 0 : cluster, record.data(), record.data(), static_cast<uint32_t>(total)))
        return kEncryptFailed;
    return kOk;
}

uint32_t descriptorPrefixLength(uint32_t blockSize) { return smallestMultipleAtLeast(blockSize, 31); }

namespace {

// Parses the descriptor from decrypted bytes.
Result parseDescriptor(const uint8_t* plain, size_t have, size_t available, uint32_t blockSize,
                       ClusterDescriptor& out) {
    if (have < 2) return kBadRecord;
    uint32_t l = plain[0];
    if (l > 31 || l + 2 > have) return kBadRecord;
    uint8_t desc[17];
    size_t dlen = sizeof desc;
    if (decompressBuffer(desc, dlen, plain + 1, l) != kOk || dlen != 17) return kBadRecord;
    uint32_t h = plain[l + 1];
    out.uncompressedLength = getU32(desc);
    out.compressedLength = getU32(desc + 4);
    out.cluster = getU32(desc + 8);
    out.next = getU32(desc + 12);
    uint64_t total = static_cast<uint64_t>(h) + out.compressedLength;
    if (h < l + 2 || total % blockSize != 0 || total > available) return kBadRecord;
    if (out.uncompressedLength == 0 || out.uncompressedLength > kMaxPayload) return kBadRecord;
    out.recordLength = static_cast<uint32_t>(total);
    return kOk;
}

}  // namespace

Result readClusterDescriptor(const uint8_t* record, size_t available, uint32_t blockSize, ClusterCipher& cipher,
                             ClusterDescriptor& out) {
    if (blockSize == 0) return kBadRecord;
    size_t k = std::min<size_t>(available, descriptorPrefixLength(blockSize));
    k -= k % blockSize;
    if (k == 0) return kBadRecord;
    SecureBytes plain(record, record + k);
    if (!cipher.Decrypt(0, plain.data(), plain.data(), static_cast<uint32_t>(k))) return kDecryptFailed;
    return parseDescriptor(plain.data(), k, available, blockSize, out);
}

Result decodeClusterRecord(bool format2, const uint8_t* record, size_t length, uint32_t cluster,
                           uint32_t expectSize, uint32_t blockSize, ClusterCipher& cipher, SecureBytes& payload) {
    payload.clear();
    if (blockSize == 0 || length == 0 || length % blockSize != 0) return format2 ? kBadRecord : kInconsistent;
    SecureBytes plain(record, record + length);
    uint32_t h = 0;
    size_t clen = 0;
    uint32_t n = 0;
    if (format2) {
        if (!cipher.Decrypt(0, plain.data(), plain.data(), static_cast<uint32_t>(length))) return kDecryptFailed;
        ClusterDescriptor d;
        if (Result rc = parseDescriptor(plain.data(), length, length, blockSize, d); rc != kOk) return rc;
        if (cluster != kNoCluster && d.cluster != cluster) return kBadRecord;
        if (expectSize != 0 && d.recordLength != expectSize) return kBadRecord;
        h = plain[plain[0] + 1];
        clen = d.compressedLength;
        n = d.uncompressedLength;
    } else {
        if (!cipher.Decrypt(cluster, plain.data(), plain.data(), static_cast<uint32_t>(length))) return kDecryptFailed;
        if (length < 5) return kInconsistent;
        h = plain[4];
        if (h > blockSize + 5) return kFormat1HeaderTooLong;
        if (h < 5 || h > length) return kInconsistent;
        n = getU32(plain.data());
        if (n == 0 || n > kMaxPayload) return kInconsistent;
        clen = length - h;
    }
    payload.resize(n);
    size_t outLen = n;
    Result rc = decompressBuffer(payload.data(), outLen, plain.data() + h, clen);
    if (rc == kOk && outLen != n) rc = kInconsistent;
    if (rc != kOk) payload.clear();
    return rc;
}

namespace unit {

uint32_t length(const uint8_t* p) { return getU32(p); }
uint8_t kind(const uint8_t* p) { return p[4]; }
uint32_t start(const uint8_t* p) { return getU32(p + 6); }
uint32_t attributes(const uint8_t* p) { return getU32(p + 10); }
uint64_t created(const uint8_t* p) { return getU64(p + 14); }
uint64_t modified(const uint8_t* p) { return getU64(p + 22); }
uint64_t accessed(const uint8_t* p) { return getU64(p + 30); }
uint64_t size(const uint8_t* p) { return (static_cast<uint64_t>(getU32(p + 38)) << 32) | getU32(p + 42); }

std::u16string name(const uint8_t* p) {
    uint32_t len = length(p);
    std::u16string out;
    for (uint32_t off = 46; off + 1 < len; off += 2) {
        char16_t c = static_cast<char16_t>(getU16(p + off));
        if (c == 0) break;
        out += c;
    }
    return out;
}

void setLength(uint8_t* p, uint32_t v) { putU32(p, v); }
void setKind(uint8_t* p, uint8_t v) { p[4] = v; }
void setStart(uint8_t* p, uint32_t v) { putU32(p + 6, v); }
void setAttributes(uint8_t* p, uint32_t v) { putU32(p + 10, v); }
void setTimes(uint8_t* p, uint64_t c, uint64_t m, uint64_t a) {
    putU64(p + 14, c);
    putU64(p + 22, m);
    putU64(p + 30, a);
}
void setSize(uint8_t* p, uint64_t v) {
    putU32(p + 38, static_cast<uint32_t>(v >> 32));
    putU32(p + 42, static_cast<uint32_t>(v));
}

bool valid(const uint8_t* p, size_t available) {
    if (available < kUnitFixedSize) return false;
    uint32_t len = length(p);
    return p[5] == kUnitSignature && len >= kUnitFixedSize && len <= kMaxPayload && len <= available;
}

std::vector<uint8_t> make(std::u16string_view nm) {
    std::vector<uint8_t> r(kUnitFixedSize + 2 * nm.size(), 0);
    setLength(r.data(), static_cast<uint32_t>(r.size()));
    r[5] = kUnitSignature;
    for (size_t i = 0; i < nm.size(); ++i) putU16(&r[46 + 2 * i], nm[i]);
    return r;
}

std::vector<uint8_t> rootFolder() {
    std::vector<uint8_t> r = make(u"");
    setKind(r.data(), kUnitChain);
    setStart(r.data(), 0);
    setAttributes(r.data(), kAttrFolder);
    return r;
}

std::vector<uint8_t> volumeRecord() {
    std::vector<uint8_t> r = make(u"");
    setKind(r.data(), kUnitVolume);
    setStart(r.data(), 0xFFFFFFFF);
    setAttributes(r.data(), kAttrVolume);
    setTimes(r.data(), 0x0000000800001999ull, 0x13, 0);
    return r;
}

}  // namespace unit
}  // namespace vaultora
