#include <gtest/gtest.h>

#include <botan/block_cipher.h>
#include <cstring>
#include <set>
#include <sstream>

#include "crypto/sym_alg.h"
#include "crypto/sym_alg_table.h"
#include "crypto_test_util.h"

using namespace vaultora;
using vaultora::test::hex;
using vaultora::test::unhex;

namespace {

const uint32_t kAllIds[] = {0, 1, 2, 3, 4, 128, 129, 138, 10, 133, 136, 7, 8, 9, 137, 131};

std::unique_ptr<cSymAlg> make(uint32_t id, const std::vector<uint8_t>& key) {
    std::unique_ptr<cSymAlg> alg;
    EXPECT_EQ(CreateSymAlg(id, key.data(), static_cast<int32_t>(key.size()), alg), kOk) << "id " << id;
    return alg;
}

std::vector<uint32_t> parseIds(const std::string& s) {
    std::vector<uint32_t> ids;
    std::stringstream ss(s);
    for (std::string part; std::getline(ss, part, ',');) ids.push_back(static_cast<uint32_t>(std::stoul(part)));
    return ids;
}

std::vector<uint8_t> ecb(uint32_t id, const std::vector<uint8_t>& key, const std::vector<uint8_t>& in) {
    auto alg = make(id, key);
    std::vector<uint8_t> out(in.size());
    EXPECT_EQ(alg->EncryptBlocks(in.data(), out.data(), static_cast<int32_t>(in.size())), kOk);
    return out;
}

}  // namespace

TEST(SymAlg, KnownAnswersForEveryTableIdentifier) {
    auto rows = test::readVectorLines("ciphers.vec");
    ASSERT_GT(rows.size(), 90u);
    std::set<uint32_t> covered;
    for (const auto& r : rows) {
        ASSERT_EQ(r.size(), 7u);
        const std::string& kind = r[0];
        auto key = unhex(r[3]), iv = unhex(r[4]), plain = unhex(r[5]), cipher = unhex(r[6]);
        for (uint32_t id : parseIds(r[2])) {
            SCOPED_TRACE(r[1] + " id " + std::to_string(id));
            auto alg = make(id, key);
            ASSERT_TRUE(alg);
            std::vector<uint8_t> buf = plain;
            const int32_t n = static_cast<int32_t>(buf.size());
            if (kind == "ecb") {
                ASSERT_EQ(alg->EncryptBlocks(buf.data(), buf.data(), n), kOk);
                EXPECT_EQ(hex(buf), r[6]);
                ASSERT_EQ(alg->DecryptBlocks(buf.data(), buf.data(), n), kOk);
            } else if (kind == "cbc") {
                ASSERT_EQ(CbcEncrypt(alg.get(), iv.data(), buf.data(), buf.data(), n), kOk);  // in place
                EXPECT_EQ(hex(buf), r[6]);
                ASSERT_EQ(CbcDecrypt(alg.get(), iv.data(), buf.data(), buf.data(), n), kOk);
            } else {
                ASSERT_EQ(CfbStart(alg.get(), iv.data()), kOk);
                ASSERT_EQ(CfbEncrypt(alg.get(), buf.data(), buf.data(), n), kOk);
                EXPECT_EQ(hex(buf), r[6]);
                ASSERT_EQ(CfbStart(alg.get(), iv.data()), kOk);
                ASSERT_EQ(CfbDecrypt(alg.get(), buf.data(), buf.data(), n), kOk);
            }
            EXPECT_EQ(hex(buf), r[5]) << "decryption does not restore the plaintext";
            covered.insert(id);
        }
    }
    for (uint32_t id : kAllIds) {
        if (id == 0 || id == kSymGost) continue;  // no external vector can exist for these
        EXPECT_TRUE(covered.count(id)) << "no vector for id " << id;
    }
}

TEST(SymAlg, ShortRijndaelKeysRunAs256BitKeys) {
    auto key16 = unhex("000102030405060708090a0b0c0d0e0f");
    auto key24 = unhex("000102030405060708090a0b0c0d0e0f1011121314151617");
    auto padded16 = key16, padded24 = key24;
    padded16.resize(32, 0);
    padded24.resize(32, 0);
    auto block = unhex("00112233445566778899aabbccddeeff");
    EXPECT_EQ(ecb(kSymAes128, key16, block), ecb(kSymRijndael, padded16, block));
    EXPECT_EQ(ecb(kSymAes192, key24, block), ecb(kSymRijndael, padded24, block));
    EXPECT_NE(hex(ecb(kSymAes128, key16, block)), "69c4e0d86a7b0430d8cdb78070b4c55a");  // not FIPS-197 AES-128
}

TEST(SymAlg, BlowfishPadsShortKeysToFiveBytesAndCutsLongKeysAt56) {
    auto block = unhex("fedcba9876543210");
    auto key3 = unhex("f0e1d2");
    auto key5 = unhex("f0e1d20000");
    EXPECT_EQ(ecb(kSymBlowfish, key3, block), ecb(kSymBlowfish, key5, block));
    std::vector<uint8_t> key60(60), key56;
    for (size_t i = 0; i < key60.size(); ++i) key60[i] = static_cast<uint8_t>(i * 7 + 1);
    key56.assign(key60.begin(), key60.begin() + 56);
    EXPECT_EQ(ecb(kSymBlowfish448, key60, block), ecb(kSymBlowfish448, key56, block));
    // The effective length is the key's own: an 8-byte key is not padded to the row's 16 bytes.
    auto key8 = unhex("f0e1d2c3b4a59687"), key8padded = key8;
    key8padded.resize(16, 0);
    EXPECT_NE(ecb(kSymBlowfish, key8, block), ecb(kSymBlowfish, key8padded, block));
}

TEST(SymAlg, GostUsesTheTransformedKeyAndStaysFixed) {
    std::vector<uint8_t> key(32);
    for (size_t i = 0; i < key.size(); ++i) key[i] = static_cast<uint8_t>(i);
    auto block = unhex("0001020304050607");
    std::vector<uint8_t> out = ecb(kSymGost, key, block);
    // The plain cipher over the untransformed key must differ: the transformation is applied.
    auto plain = Botan::BlockCipher::create_or_throw("GOST-28147-89(R3411_CryptoPro)");
    plain->set_key(key.data(), key.size());
    std::vector<uint8_t> direct(8);
    plain->encrypt(block.data(), direct.data());
    EXPECT_NE(out, direct);
    // The value is part of the archive format: an archive written today must open tomorrow.
    EXPECT_EQ(hex(out), "348c365b2256affc");
}

TEST(SymAlg, EveryIdentifierRoundTripsInCbcAndCfb) {
    for (uint32_t id : kAllIds) {
        SCOPED_TRACE(id);
        std::vector<uint8_t> key(SymAlgKeySize(id) + 3, 0x5A);
        auto alg = make(id, key);
        ASSERT_TRUE(alg);
        uint32_t b = 0, k = 0;
        ASSERT_TRUE(alg->GetSizes(b, k));
        EXPECT_EQ(b, SymAlgBlockSize(id));
        if (b == 0) continue;  // the copy cipher has no modes
        std::vector<uint8_t> data(b * 5);
        for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<uint8_t>(i * 13);
        std::vector<uint8_t> enc(data.size()), dec(data.size());
        ASSERT_EQ(CbcEncrypt(alg.get(), nullptr, data.data(), enc.data(), static_cast<int32_t>(data.size())), kOk);
        EXPECT_NE(enc, data);
        ASSERT_EQ(CbcDecrypt(alg.get(), nullptr, enc.data(), dec.data(), static_cast<int32_t>(dec.size())), kOk);
        EXPECT_EQ(dec, data);
        ASSERT_EQ(CfbStart(alg.get(), nullptr), kOk);
        ASSERT_EQ(CfbEncrypt(alg.get(), data.data(), enc.data(), 7), kOk);
        ASSERT_EQ(CfbEncrypt(alg.get(), data.data() + 7, enc.data() + 7, static_cast<int32_t>(data.size() - 7)), kOk);
        ASSERT_EQ(CfbStart(alg.get(), nullptr), kOk);
        ASSERT_EQ(CfbDecrypt(alg.get(), enc.data(), dec.data(), static_cast<int32_t>(dec.size())), kOk);
        EXPECT_EQ(dec, data);
    }
}

TEST(SymAlg, CfbCarriesPositionAcrossCalls) {
    auto key = unhex("603deb1015ca71be2b73aef0857d77811f352c073b6108d72d9810a30914dff4");
    auto plain = unhex("09a0a1a2a3a4a5a6a7a8a9aaabacadaeafb0b1b2b3");
    auto alg = make(kSymAes256, key);
    std::vector<uint8_t> out(21);
    ASSERT_EQ(CfbStart(alg.get(), nullptr), kOk);
    ASSERT_EQ(CfbEncrypt(alg.get(), plain.data(), out.data(), 1), kOk);
    ASSERT_EQ(CfbEncrypt(alg.get(), plain.data() + 1, out.data() + 1, 20), kOk);
    EXPECT_EQ(hex(out), "ecc85723376bd370b0e5e56ae8bc05fa9aaf78f8e2");
}

TEST(SymAlg, CfbResyncRealignsToTheLastCiphertextBlock) {
    auto key = unhex("00112233445566778899aabbccddeeff");
    auto alg = make(kSymCast5, key);
    const uint8_t plain[13] = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13};
    uint8_t out[13];
    ASSERT_EQ(CfbStart(alg.get(), nullptr), kOk);
    ASSERT_EQ(CfbEncrypt(alg.get(), plain, out, 10), kOk);  // 10 bytes: position 2 in the 2nd block
    ASSERT_EQ(CfbResync(alg.get()), kOk);
    ASSERT_EQ(CfbEncrypt(alg.get(), plain + 10, out + 10, 3), kOk);
    // After resync the next byte starts a block whose register is the last 8 ciphertext bytes.
    uint8_t reg[8], ks[8];
    std::memcpy(reg, out + 2, 8);
    ASSERT_EQ(make(kSymCast5, key)->EncryptBlocks(reg, ks, 8), kOk);
    for (int i = 0; i < 3; ++i) EXPECT_EQ(out[10 + i], plain[10 + i] ^ ks[i]);
    // Decryption with the same resync point restores the plaintext.
    uint8_t back[13];
    ASSERT_EQ(CfbStart(alg.get(), nullptr), kOk);
    ASSERT_EQ(CfbDecrypt(alg.get(), out, back, 10), kOk);
    ASSERT_EQ(CfbResync(alg.get()), kOk);
    ASSERT_EQ(CfbDecrypt(alg.get(), out + 10, back + 10, 3), kOk);
    EXPECT_EQ(0, std::memcmp(back, plain, 13));
    // At a block boundary resync changes nothing.
    uint8_t a[16], b[16];
    ASSERT_EQ(CfbStart(alg.get(), nullptr), kOk);
    ASSERT_EQ(CfbEncrypt(alg.get(), plain, a, 8), kOk);
    ASSERT_EQ(CfbResync(alg.get()), kOk);
    ASSERT_EQ(CfbEncrypt(alg.get(), plain, a + 8, 8), kOk);
    ASSERT_EQ(CfbStart(alg.get(), nullptr), kOk);
    ASSERT_EQ(CfbEncrypt(alg.get(), plain, b, 8), kOk);
    ASSERT_EQ(CfbEncrypt(alg.get(), plain, b + 8, 8), kOk);
    EXPECT_EQ(0, std::memcmp(a, b, 16));
}

TEST(SymAlg, CbcRefusesPartialBlocksWithoutWriting) {
    auto alg = make(kSymRijndael, std::vector<uint8_t>(32, 1));
    std::vector<uint8_t> in(24, 7), out(24, 0xEE);
    EXPECT_EQ(CbcEncrypt(alg.get(), nullptr, in.data(), out.data(), 24), kNotBlockMultiple);
    EXPECT_EQ(CbcDecrypt(alg.get(), nullptr, in.data(), out.data(), 24), kNotBlockMultiple);
    EXPECT_EQ(out, std::vector<uint8_t>(24, 0xEE));
    EXPECT_EQ(alg->EncryptBlocks(in.data(), out.data(), 24), kNotBlockMultiple);
    auto dummy = make(kSymNone, {});
    EXPECT_EQ(CbcEncrypt(dummy.get(), nullptr, in.data(), out.data(), 16), kNotBlockMultiple);
}

TEST(SymAlg, TableLookupsAndNames) {
    std::unique_ptr<cSymAlg> alg;
    EXPECT_EQ(CreateSymAlg(5, nullptr, 0, alg), kUnknownCipher);  // SAFER-SK128: a name, no row
    EXPECT_FALSE(alg);
    EXPECT_STREQ(SymAlgName(5), "SAFER-SK128");
    EXPECT_EQ(CreateSymAlg(200, nullptr, 0, alg), kUnknownCipher);
    EXPECT_EQ(SymAlgName(200), nullptr);
    EXPECT_STREQ(SymAlgName(138), "TWOFISH");
    EXPECT_STREQ(SymAlgName(0), "Plaintext or unencrypted data");
    uint32_t max = 99;
    EXPECT_EQ(SymAlgKeySize(7, max), 16u);
    EXPECT_EQ(max, 32u);
    max = 99;
    EXPECT_EQ(SymAlgKeySize(5, max), 0u);
    EXPECT_EQ(max, 99u);
    EXPECT_EQ(SymAlgKeySize(4, max), 16u);
    EXPECT_EQ(max, 56u);
    uint32_t count = 0;
    const uint32_t* ids = nullptr;
    ListSymAlgs(count, ids);
    EXPECT_EQ(std::vector<uint32_t>(ids, ids + count),
              (std::vector<uint32_t>{1, 2, 3, 4, 128, 129, 138, 133, 136, 137, 0}));
    for (uint32_t i = 0; i < count; ++i) EXPECT_NE(SymAlgName(static_cast<uint8_t>(ids[i])), nullptr);
}

TEST(ClusterCipher, IvIsTheClusterNumberLittleEndian) {
    ClusterCipher cc(make(kSymAes256, std::vector<uint8_t>(32, 3)));
    SecureBytes iv;
    ASSERT_EQ(cc.clusterIv(0x01020304, iv), kOk);
    EXPECT_EQ(hex(iv), "04030201000000000000000000000000");
    // The per-cluster IV drives CBC: cluster 0x01020304's record equals CBC under that IV.
    auto key = unhex("603deb1015ca71be2b73aef0857d77811f352c073b6108d72d9810a30914dff4");
    ClusterCipher real(make(kSymAes256, key));
    std::vector<uint8_t> data(64), enc(64), expect(64);
    for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<uint8_t>(i);
    ASSERT_TRUE(real.Encrypt(0x01020304, enc.data(), data.data(), 64));
    auto ref = make(kSymAes256, key);
    auto ivBytes = unhex("04030201000000000000000000000000");
    ASSERT_EQ(CbcEncrypt(ref.get(), ivBytes.data(), data.data(), expect.data(), 64), kOk);
    EXPECT_EQ(enc, expect);
    ASSERT_TRUE(real.Decrypt(0x01020304, enc.data(), enc.data(), 64));
    EXPECT_EQ(enc, data);
    // Without a cipher the data is copied.
    ClusterCipher none;
    std::vector<uint8_t> copy(64);
    EXPECT_TRUE(none.Encrypt(5, copy.data(), data.data(), 64));
    EXPECT_EQ(copy, data);
}

TEST(SymAlg, CbcDecryptInPlaceAcrossLongBuffers) {
    // Long enough to be decrypted in several pieces; compared with block-by-block chaining.
    auto alg = make(kSymBlowfish, std::vector<uint8_t>(16, 9));
    std::vector<uint8_t> data(8 * 1024 + 40);
    for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<uint8_t>(i * 5 + (i >> 8));
    const uint8_t iv[8] = {1, 2, 3, 4, 5, 6, 7, 8};
    std::vector<uint8_t> enc(data.size());
    ASSERT_EQ(CbcEncrypt(alg.get(), iv, data.data(), enc.data(), static_cast<int32_t>(data.size())), kOk);
    std::vector<uint8_t> prev(iv, iv + 8), block(8);
    for (size_t off = 0; off < enc.size(); off += 8) {
        for (size_t i = 0; i < 8; ++i) block[i] = data[off + i] ^ prev[i];
        ASSERT_EQ(alg->EncryptBlocks(block.data(), block.data(), 8), kOk);
        ASSERT_EQ(0, std::memcmp(block.data(), enc.data() + off, 8)) << off;
        prev = block;
    }
    ASSERT_EQ(CbcDecrypt(alg.get(), iv, enc.data(), enc.data(), static_cast<int32_t>(enc.size())), kOk);
    EXPECT_EQ(enc, data);
}
