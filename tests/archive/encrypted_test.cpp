// Password-protected archives end to end: every cipher of the table, the open loop, the records
// checked with an independent CBC (Botan's own mode), and the password operations.
#include <botan/cipher_mode.h>
#include <gtest/gtest.h>
#include <zlib.h>

#include <cstring>

#include "archive/password_ops.h"
#include "archive/vaultora.h"
#include "archive_fixture.h"
#include "crypto/key_block_params.h"

namespace vaultora {
namespace {

using test::payloadFor;
using test::readChain;
using test::ScriptedInteraction;
using test::TempDir;
using test::writeChain;

KeyBlockParams paramsFor(uint8_t cipher, uint8_t hash = 8) {
    KeyBlockParams p = DefaultKeyBlockParams();
    p.archiveAlg = cipher;
    p.keyAlg = cipher == 0 ? 10 : cipher;
    p.hash = hash;
    return p;
}

const PasswordRecord kPassword = PasswordRecord::fromUtf8("correct horse");

Result openWith(Vaultora& a, const PasswordRecord& password) {
    OpenKey key;
    key.password = &password;
    return a.open(key);
}

// Creates an archive with a two-cluster chain and commits it; returns the chain start.
uint32_t makeArchive(const std::string& path, const KeyBlockParams& params, const std::vector<uint8_t>& data) {
    Vaultora a(path);
    EXPECT_EQ(createWithPassword(a, params, kPassword), kOk);
    uint32_t s = writeChain(a, data);
    EXPECT_EQ(a.close(), kOk);
    return s;
}

class EveryCipher : public ::testing::TestWithParam<int> {};

TEST_P(EveryCipher, ArchiveRoundTripsAndOnlyItsPasswordOpensIt) {
    const uint8_t id = static_cast<uint8_t>(GetParam());
    TempDir dir;
    const std::string path = dir / "a.vra";
    auto data = payloadFor(id, 600000);
    uint32_t s = makeArchive(path, paramsFor(id), data);

    ScriptedInteraction ui;
    Vaultora a(path, &ui);
    ASSERT_EQ(openWith(a, kPassword), kOk);
    EXPECT_EQ(a.cipherId(), id);
    EXPECT_EQ(readChain(a, s), data);
    a.close();
    EXPECT_TRUE(a.archiveKey().empty()) << "the key is released at close";
    EXPECT_FALSE(a.recordCipher().hasCipher());

    if (id != 0) {
        const PasswordRecord wrong = PasswordRecord::fromUtf8("correct horsf");
        EXPECT_EQ(openWith(a, wrong), kWrongPassword);
    }
}

INSTANTIATE_TEST_SUITE_P(Ids, EveryCipher,
                         ::testing::Values(0, 1, 2, 3, 4, 128, 129, 138, 10, 133, 136, 7, 8, 9, 137, 131));

TEST(EncryptedArchive, EveryHashMakesAnOpenableArchive) {
    for (uint8_t hash : {1, 2, 3, 8, 10}) {
        TempDir dir;
        auto data = payloadFor(hash, 1000);
        uint32_t s = makeArchive(dir / "a.vra", paramsFor(9, hash), data);
        Vaultora a(dir / "a.vra");
        ASSERT_EQ(openWith(a, kPassword), kOk) << "hash " << int(hash);
        EXPECT_EQ(readChain(a, s), data);
    }
}

TEST(EncryptedArchive, PasswordLoopAsksAgainAfterAWrongPasswordAndCancelGives83) {
    TempDir dir;
    makeArchive(dir / "a.vra", paramsFor(138), payloadFor(1, 10));
    ScriptedInteraction ui;
    ui.expectPassword("nope nope").expect("The password you entered is invalid", kAnswerOk)
        .expectPassword("correct horse");
    Vaultora a(dir / "a.vra", &ui);
    EXPECT_EQ(a.openWithPassword(), kOk);
    EXPECT_EQ(ui.captions[0], "Vaultora Error");
    a.close();
    ui.expectPasswordCancel();
    EXPECT_EQ(a.openWithPassword(), kCancelled);
}

std::vector<uint8_t> botanCbcDecrypt(const char* algo, const SecureBytes& key, const uint8_t* data, size_t n) {
    auto mode = Botan::Cipher_Mode::create_or_throw(std::string(algo) + "/CBC/NoPadding", Botan::DECRYPTION);
    mode->set_key(key.data(), key.size());
    std::vector<uint8_t> iv(mode->default_nonce_length(), 0);
    mode->start(iv);
    Botan::secure_vector<uint8_t> buf(data, data + n);
    mode->finish(buf);
    return std::vector<uint8_t>(buf.begin(), buf.end());
}

// The table and a data record, decrypted with Botan's CBC and the all-zero IV and inflated with
// zlib directly: the stored bytes follow the format without going through our decoder.
TEST(EncryptedArchive, RecordsAndTableDecryptWithPlainCbcAndTheZeroIv) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    auto data = payloadFor(77, 5000);
    uint32_t s = makeArchive(path, paramsFor(9), data);
    SecureBytes key;
    uint64_t recordOffset = 0;
    uint32_t recordSize = 0;
    {
        Vaultora a(path);
        ASSERT_EQ(openWith(a, kPassword), kOk);
        key = a.archiveKey();
        recordOffset = a.cot()[s].offset;
        recordSize = a.cot()[s].size;
    }
    std::vector<uint8_t> f;
    ASSERT_TRUE(fs::readWholeFile(path, f));
    const uint32_t dataOffset = getU32(&f[24]);
    const uint64_t cotOffset = getU64(&f[28]);
    const uint32_t cotLength = getU32(&f[36]);
    EXPECT_EQ(f[19], 16);  // block size of AES
    auto cot = botanCbcDecrypt("AES-256", key, &f[dataOffset + cotOffset], cotLength);
    const uint32_t r = getU32(cot.data());
    EXPECT_EQ(getU32(cot.data() + 4), cotLength);
    std::vector<uint8_t> table(r);
    uLongf tl = r;
    ASSERT_EQ(uncompress(table.data(), &tl, cot.data() + cot[8], cotLength - cot[8]), Z_OK);
    EXPECT_EQ(getU64(&table[s * 16 + 4]), recordOffset);

    auto rec = botanCbcDecrypt("AES-256", key, &f[dataOffset + recordOffset], recordSize);
    const uint8_t l = rec[0], h = rec[l + 1];
    std::vector<uint8_t> plain(data.size());
    uLongf pl = plain.size();
    ASSERT_EQ(uncompress(plain.data(), &pl, rec.data() + h, recordSize - h), Z_OK);
    EXPECT_EQ(plain, data);
}

TEST(PasswordOperations, AddedPasswordOpensAndRemovingItShrinksTheBlock) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    auto data = payloadFor(5, 3000);
    uint32_t s = makeArchive(path, paramsFor(3), data);
    const int64_t sizeBefore = fs::fileSize(path);
    {
        ScriptedInteraction ui;
        ui.expectPassword("correct horse").expect("The same password was already used", kAnswerOk)
            .expectPassword("second password");
        Vaultora a(path, &ui);
        ASSERT_EQ(openWith(a, kPassword), kOk);
        ASSERT_EQ(addPassword(a, paramsFor(3)), kOk);
        ASSERT_EQ(a.close(), kOk);
    }
    EXPECT_GT(fs::fileSize(path), sizeBefore);
    const PasswordRecord second = PasswordRecord::fromUtf8("second password");
    {
        ScriptedInteraction ui;
        ui.expectPassword("correct horse")
            .expect("The password you entered is compatible with Master Key", kAnswerOk)
            .expectPassword("second password");
        Vaultora a(path, &ui);
        ASSERT_EQ(openWith(a, second), kOk);
        EXPECT_EQ(readChain(a, s), data);
        ASSERT_EQ(removePassword(a), kOk);
        ASSERT_EQ(a.close(), kOk);
    }
    EXPECT_EQ(fs::fileSize(path), sizeBefore);
    Vaultora a(path);
    EXPECT_EQ(openWith(a, second), kWrongPassword);
    EXPECT_EQ(openWith(a, kPassword), kOk);
}

TEST(PasswordOperations, ChangingTheMasterPasswordKeepsTheDataAndDropsTheOldPassword) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    auto data = payloadFor(6, 3000);
    uint32_t s = makeArchive(path, paramsFor(136), data);
    {
        ScriptedInteraction ui;
        ui.expectPassword("not it at all").expect("Session key encrypted by the password was not found.", kAnswerOk)
            .expectPassword("correct horse").expectPassword("brand new password");
        Vaultora a(path, &ui);
        ASSERT_EQ(openWith(a, kPassword), kOk);
        ASSERT_EQ(changePassword(a, paramsFor(136)), kOk);
        EXPECT_FALSE(fs::exists(path + ".vrt/~MasterKeyPkt.dat"));
        ASSERT_EQ(a.close(), kOk);
    }
    Vaultora a(path);
    EXPECT_EQ(openWith(a, kPassword), kWrongPassword);
    const PasswordRecord fresh = PasswordRecord::fromUtf8("brand new password");
    ASSERT_EQ(openWith(a, fresh), kOk);
    EXPECT_EQ(readChain(a, s), data);
}

TEST(PasswordOperations, DamagedExtendedBlockIsReportedAndTheMasterPasswordStillOpens) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    auto data = payloadFor(9, 2000);
    uint32_t s = makeArchive(path, paramsFor(9), data);
    {
        ScriptedInteraction ui;
        ui.expectPassword("second password");
        Vaultora a(path, &ui);
        ASSERT_EQ(openWith(a, kPassword), kOk);
        ASSERT_EQ(addPassword(a, paramsFor(9)), kOk);
        ASSERT_EQ(a.close(), kOk);
    }
    // Cut the last bytes: the extended block's packet now runs past the end of the file.
    std::vector<uint8_t> f;
    ASSERT_TRUE(fs::readWholeFile(path, f));
    f.resize(f.size() - 3);
    ASSERT_TRUE(fs::writeWholeFile(path, f.data(), f.size()));
    ScriptedInteraction ui;
    ui.expect("Extended key block is corrupted\nArchive name '" + path + "'", kAnswerOk);
    Vaultora a(path, &ui);
    ASSERT_EQ(openWith(a, kPassword), kOk);
    EXPECT_EQ(readChain(a, s), data);
}

// The key packet names Rijndael, but the header and every record were written under Serpent with
// the same key bytes: the open tries the listed ciphers until the header check passes.
TEST(PasswordOperations, CipherThatNoLongerMatchesTheKeyPacketIsFoundByTheRecoverySearch) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    auto data = payloadFor(8, 2000);
    uint32_t s = 0;
    {
        Vaultora a(path);
        ASSERT_EQ(createWithPassword(a, paramsFor(136), kPassword), kOk);
        SecureBytes key = a.archiveKey();
        std::unique_ptr<cSymAlg> serpent;
        ASSERT_EQ(CreateSymAlg(137, key.data(), static_cast<int32_t>(key.size()), serpent), kOk);
        a.setRecordCipher(137, key, ClusterCipher(std::move(serpent)));
        s = writeChain(a, data);
        ASSERT_EQ(a.close(), kOk);
    }
    Vaultora a(path);
    ASSERT_EQ(openWith(a, kPassword), kOk);
    EXPECT_EQ(a.cipherId(), 137);
    EXPECT_EQ(readChain(a, s), data);
}

}  // namespace
}  // namespace vaultora
