// The codecs are checked against independent decoding: zlib and byte offsets read directly here,
// not through the engine's own inverse functions.
#include <gtest/gtest.h>
#include <zlib.h>

#include <cstring>
#include <random>

#include "archive/compress.h"
#include "archive/format.h"

namespace vaultora {
namespace {

std::vector<uint8_t> headerImage(uint8_t major, uint8_t minor) {
    Header h;
    h.versionMajor = major;
    h.versionMinor = minor;
    auto img = h.encode();
    return std::vector<uint8_t>(img.begin(), img.begin() + h.size());
}

struct MemoryFile {
    std::vector<uint8_t> bytes;
    long long operator()(uint64_t off, uint8_t* buf, size_t n) const {
        if (off >= bytes.size()) return 0;
        size_t k = std::min(n, bytes.size() - static_cast<size_t>(off));
        std::memcpy(buf, bytes.data() + off, k);
        return static_cast<long long>(k);
    }
};

std::vector<uint8_t> zlibInflate(const uint8_t* p, size_t n, size_t expect) {
    std::vector<uint8_t> out(expect);
    uLongf len = expect;
    EXPECT_EQ(uncompress(out.data(), &len, p, n), Z_OK);
    out.resize(len);
    return out;
}

TEST(HeaderFormat, SizeFollowsVersionAndOldHeadersLeaveBytes64To67Alone) {
    EXPECT_EQ(headerImage(2, 1).size(), 68u);
    EXPECT_EQ(headerImage(2, 0).size(), 64u);
    EXPECT_EQ(headerImage(1, 0).size(), 64u);
    std::vector<uint8_t> raw(68, 0xEE);
    auto v20 = headerImage(2, 0);
    std::copy(v20.begin(), v20.end(), raw.begin());
    Header h = Header::decode(raw.data());
    EXPECT_EQ(h.size(), 64u);
    EXPECT_EQ(h.headerSize, 64u);  // not taken from the 0xEE bytes
    auto v21 = headerImage(2, 1);
    EXPECT_EQ(getU32(&v21[64]), 68u);
    EXPECT_EQ(getU32(&v21[20]), 68u);  // masterKeyOffset
}

TEST(HeaderFormat, OnlyVersionsUpTo21AreSupported) {
    for (auto [maj, min, ok] : {std::tuple{1, 0, true}, {2, 0, true}, {2, 1, true}, {2, 2, false}, {3, 0, false}}) {
        Header h;
        h.versionMajor = static_cast<uint8_t>(maj);
        h.versionMinor = static_cast<uint8_t>(min);
        EXPECT_EQ(h.versionSupported(), ok) << maj << "." << min;
    }
}

TEST(HeaderSearch, FindsHeaderBehindStubAndRecordsItsOffset) {
    MemoryFile f;
    f.bytes.assign(204800, 0x90);
    auto img = headerImage(2, 1);
    f.bytes.insert(f.bytes.end(), img.begin(), img.end());
    Header h;
    std::array<uint8_t, 68> image{};
    ASSERT_TRUE(findHeader(std::ref(f), 0, h, image));
    EXPECT_EQ(h.embeddedOffset, 204800u);
    EXPECT_EQ(getU32(&image[60]), 204800u);
}

TEST(HeaderSearch, SkipsMagicWithZeroVersionInsideStub) {
    MemoryFile f;
    f.bytes.assign(1000, 'x');
    f.bytes.insert(f.bytes.end(), kMagic, kMagic + 16);  // a copy of the magic in the stub
    f.bytes.push_back(0);                                 // ... with version 0
    f.bytes.resize(5000, 'y');
    auto img = headerImage(2, 1);
    f.bytes.insert(f.bytes.end(), img.begin(), img.end());
    Header h;
    std::array<uint8_t, 68> image{};
    ASSERT_TRUE(findHeader(std::ref(f), 0, h, image));
    EXPECT_EQ(h.embeddedOffset, 5000u);
}

TEST(HeaderSearch, GivesUpPastTheFirstMebibyte) {
    auto img = headerImage(2, 1);
    for (size_t at : {size_t{1048576}, size_t{1100000}}) {
        MemoryFile f;
        f.bytes.assign(at, 0);
        f.bytes.insert(f.bytes.end(), img.begin(), img.end());
        Header h;
        std::array<uint8_t, 68> image{};
        EXPECT_FALSE(findHeader(std::ref(f), 0, h, image)) << at;
    }
    MemoryFile f;
    f.bytes.assign(1048576 - 100, 0);
    f.bytes.insert(f.bytes.end(), img.begin(), img.end());
    Header h;
    std::array<uint8_t, 68> image{};
    EXPECT_TRUE(findHeader(std::ref(f), 0, h, image));
}

TEST(HeaderSearch, TruncatedHeaderIsNotFound) {
    MemoryFile f;
    auto img = headerImage(2, 1);
    f.bytes.assign(img.begin(), img.begin() + 40);
    Header h;
    std::array<uint8_t, 68> image{};
    EXPECT_FALSE(findHeader(std::ref(f), 0, h, image));
}

TEST(CotRecord, NormalisesFreeEntriesAndCutsBehindHighestUsed) {
    std::vector<CotEntry> cot(100);
    cot[0] = {kEndOfChain, 0, 0};
    cot[3] = {kEndOfChain, 128, 64};
    cot[5] = {0, 999, 77};  // free, with leftovers that must not be stored
    ClusterCipher none;
    std::vector<uint8_t> rec;
    ASSERT_EQ(encodeCotRecord(cot, 8, none, rec), kOk);
    ASSERT_EQ(rec.size() % 8, 0u);
    const uint32_t r = getU32(rec.data()), t = getU32(rec.data() + 4), p = rec[8];
    EXPECT_EQ(r, 4u * 16);
    EXPECT_EQ(t, rec.size());
    EXPECT_GE(p, 12u);
    for (uint32_t i = 9; i < p; ++i) EXPECT_EQ(rec[i], 0) << i;
    auto raw = zlibInflate(rec.data() + p, t - p, r);
    ASSERT_EQ(raw.size(), 64u);
    EXPECT_EQ(getU32(&raw[0]), kEndOfChain);
    EXPECT_EQ(getU64(&raw[3 * 16 + 4]), 128u);
    EXPECT_EQ(getU32(&raw[3 * 16 + 12]), 64u);
    for (int i = 16; i < 48; ++i) EXPECT_EQ(raw[i], 0) << i;
}

TEST(CotRecord, TableWithOnlyTheRootHasOneEntry) {
    std::vector<CotEntry> cot(65);
    cot[0] = {kEndOfChain, 0, 0};
    ClusterCipher none;
    std::vector<uint8_t> rec;
    ASSERT_EQ(encodeCotRecord(cot, 8, none, rec), kOk);
    EXPECT_EQ(getU32(rec.data()), 16u);
    auto raw = zlibInflate(rec.data() + rec[8], rec.size() - rec[8], 16);
    EXPECT_EQ(getU32(raw.data()), kEndOfChain);
    std::vector<CotEntry> back;
    ASSERT_EQ(decodeCotRecord(rec.data(), rec.size(), 8, none, back), kOk);
    EXPECT_GE(back.size(), 1u);
    EXPECT_EQ(back[0].next, kEndOfChain);
}

TEST(CotRecord, DamagedRecordsAreRefusedWithoutCrashing) {
    std::vector<CotEntry> cot(3);
    cot[0] = {kEndOfChain, 0, 0};
    cot[2] = {kEndOfChain, 8, 16};
    ClusterCipher none;
    std::vector<uint8_t> rec;
    ASSERT_EQ(encodeCotRecord(cot, 8, none, rec), kOk);
    std::vector<CotEntry> back;
    auto bad = rec;
    putU32(bad.data(), 17);  // raw length not a multiple of 16
    EXPECT_EQ(decodeCotRecord(bad.data(), bad.size(), 8, none, back), kInconsistent);
    bad = rec;
    putU32(bad.data(), 0x7FFFFFF0);  // claims far more than the stream can hold
    EXPECT_EQ(decodeCotRecord(bad.data(), bad.size(), 8, none, back), kInconsistent);
    EXPECT_NE(decodeCotRecord(rec.data(), rec.size() - 8, 8, none, back), kOk);  // truncated
    bad = rec;
    bad[bad.size() - 3] ^= 0x55;  // corrupt stream
    EXPECT_NE(decodeCotRecord(bad.data(), bad.size(), 8, none, back), kOk);
}

TEST(ClusterRecord, Format2FramingMatchesTheLayout) {
    std::vector<uint8_t> payload(3000);
    for (size_t i = 0; i < payload.size(); ++i) payload[i] = static_cast<uint8_t>(i * 7);
    ClusterCipher none;
    std::vector<uint8_t> rec;
    ASSERT_EQ(encodeClusterRecord(true, payload.data(), 3000, 42, 43, 16, none, rec), kOk);
    ASSERT_EQ(rec.size() % 16, 0u);
    const uint8_t l = rec[0];
    ASSERT_LE(l, 28);
    auto desc = zlibInflate(rec.data() + 1, l, 17);
    ASSERT_EQ(desc.size(), 17u);
    EXPECT_EQ(getU32(&desc[0]), 3000u);
    EXPECT_EQ(getU32(&desc[8]), 42u);
    EXPECT_EQ(getU32(&desc[12]), 43u);
    EXPECT_EQ(desc[16], 0);
    const uint8_t h = rec[l + 1];
    EXPECT_GE(h, l + 2);
    for (uint32_t i = l + 2; i < h; ++i) EXPECT_EQ(rec[i], h);
    EXPECT_EQ(getU32(&desc[4]), rec.size() - h);
    EXPECT_EQ(zlibInflate(rec.data() + h, rec.size() - h, 3000), payload);
}

// Finds a payload whose compressed length is a multiple of the block size, so the padding rule's
// "already aligned" case is exercised: H must still be a whole block, rounded up past L + 2.
TEST(ClusterRecord, PaddingIsAWholeBlockWhenCompressedLengthIsAlreadyAligned) {
    std::mt19937 rng(7);
    for (int attempt = 0; attempt < 200; ++attempt) {
        std::vector<uint8_t> payload(100 + attempt);
        for (auto& b : payload) b = static_cast<uint8_t>(rng());
        std::vector<uint8_t> z(maxCompressedSize(payload.size()));
        size_t zl = z.size();
        ASSERT_EQ(compressBuffer(z.data(), zl, payload.data(), payload.size()), kOk);
        if (zl % 8 != 0) continue;
        ClusterCipher none;
        std::vector<uint8_t> rec;
        ASSERT_EQ(encodeClusterRecord(true, payload.data(), static_cast<uint32_t>(payload.size()), 1, kEndOfChain, 8,
                                      none, rec),
                  kOk);
        const uint8_t l = rec[0], h = rec[l + 1];
        EXPECT_EQ(h % 8, 0);
        EXPECT_GE(h, l + 2);
        EXPECT_LT(h, l + 2 + 8);
        EXPECT_EQ(rec.size(), h + zl);
        std::vector<uint8_t> rec1;
        ASSERT_EQ(encodeClusterRecord(false, payload.data(), static_cast<uint32_t>(payload.size()), 1, 0, 8, none,
                                      rec1),
                  kOk);
        EXPECT_EQ(rec1[4], 8);  // format 1: a full block, not 0
        return;
    }
    GTEST_SKIP() << "no aligned payload found";
}

TEST(ClusterRecord, DecodeChecksClusterNumberAndSize) {
    std::vector<uint8_t> payload(600, 'a');
    ClusterCipher none;
    std::vector<uint8_t> rec;
    ASSERT_EQ(encodeClusterRecord(true, payload.data(), 600, 9, kEndOfChain, 8, none, rec), kOk);
    SecureBytes out;
    EXPECT_EQ(decodeClusterRecord(true, rec.data(), rec.size(), 9, static_cast<uint32_t>(rec.size()), 8, none, out), kOk);
    EXPECT_EQ(std::vector<uint8_t>(out.begin(), out.end()), payload);
    EXPECT_EQ(decodeClusterRecord(true, rec.data(), rec.size(), 10, 0, 8, none, out), kBadRecord);
    EXPECT_EQ(decodeClusterRecord(true, rec.data(), rec.size(), 9, static_cast<uint32_t>(rec.size()) + 8, 8, none, out),
              kBadRecord);
    ClusterDescriptor d;
    ASSERT_EQ(readClusterDescriptor(rec.data(), rec.size(), 8, none, d), kOk);
    EXPECT_EQ(d.cluster, 9u);
    EXPECT_EQ(d.next, kEndOfChain);
    EXPECT_EQ(d.recordLength, rec.size());
}

TEST(ClusterRecord, GarbageAndTruncationNeverCrash) {
    std::mt19937 rng(1);
    ClusterCipher none;
    SecureBytes out;
    for (int i = 0; i < 2000; ++i) {
        std::vector<uint8_t> junk(8 * (1 + rng() % 16));
        for (auto& b : junk) b = static_cast<uint8_t>(rng());
        if (i % 3 == 0) junk[0] = static_cast<uint8_t>(rng() % 32);
        (void)decodeClusterRecord(true, junk.data(), junk.size(), kNoCluster, 0, 8, none, out);
        (void)decodeClusterRecord(false, junk.data(), junk.size(), 1, 0, 8, none, out);
        std::vector<CotEntry> cot;
        (void)decodeCotRecord(junk.data(), junk.size(), 8, none, cot);
    }
    std::vector<uint8_t> payload(5000, 'q');
    std::vector<uint8_t> rec;
    ASSERT_EQ(encodeClusterRecord(true, payload.data(), 5000, 1, kEndOfChain, 8, none, rec), kOk);
    for (size_t cut = 8; cut < rec.size(); cut += 8)
        EXPECT_NE(decodeClusterRecord(true, rec.data(), cut, 1, 0, 8, none, out), kOk) << cut;
}

TEST(ClusterRecord, Format1HeaderLongerThanABlockIsRefused) {
    std::vector<uint8_t> payload(100, 'z');
    ClusterCipher none;
    std::vector<uint8_t> rec;
    ASSERT_EQ(encodeClusterRecord(false, payload.data(), 100, 3, 0, 8, none, rec), kOk);
    rec[4] = 14;  // > blockSize + 5
    SecureBytes out;
    EXPECT_EQ(decodeClusterRecord(false, rec.data(), rec.size(), 3, 0, 8, none, out), kFormat1HeaderTooLong);
}

TEST(Compression, ResultCodesFollowZlibOutcomes) {
    std::mt19937 rng(3);
    for (size_t n : {size_t{1}, size_t{511}, size_t{4096}, size_t{524288}}) {
        std::vector<uint8_t> src(n);
        for (auto& b : src) b = static_cast<uint8_t>(rng());  // incompressible: the worst case
        std::vector<uint8_t> dst(maxCompressedSize(n));
        size_t len = dst.size();
        ASSERT_EQ(compressBuffer(dst.data(), len, src.data(), n), kOk) << n;
        std::vector<uint8_t> back(n - (n > 1 ? 1 : 0));
        size_t blen = back.size();
        if (n > 1) {
            EXPECT_EQ(decompressBuffer(back.data(), blen, dst.data(), len), kBufferTooSmall);
        }
        back.resize(n);
        blen = n;
        EXPECT_EQ(decompressBuffer(back.data(), blen, dst.data(), len - 1), kInconsistent) << "truncated " << n;
    }
    std::vector<uint8_t> junk(100);
    for (auto& b : junk) b = static_cast<uint8_t>(rng());
    std::vector<uint8_t> out(1000);
    size_t olen = out.size();
    EXPECT_EQ(decompressBuffer(out.data(), olen, junk.data(), junk.size()), kInconsistent);
}

}  // namespace
}  // namespace vaultora
