#include <gtest/gtest.h>

#include <cstring>

#include "crypto/hash_alg.h"
#include "crypto/key_block.h"
#include "crypto/packet.h"
#include "crypto/password_packet.h"
#include "crypto/s2k.h"
#include "crypto/sym_alg_table.h"
#include "crypto_test_util.h"

using namespace vaultora;
using vaultora::test::hex;

namespace {

KeyBlockParams fastParams(uint8_t archiveAlg = kSymTwofish, uint8_t keyAlg = kSymTwofish) {
    KeyBlockParams p;
    p.archiveAlg = archiveAlg;
    p.keyAlg = keyAlg;
    p.hash = kHashSha256Own;
    p.iterationCount = 1024;
    return p;
}

// A new archive: its key, the header with the check value, and the master key block.
struct Archive {
    ArchiveKey key;
    std::vector<uint8_t> header = std::vector<uint8_t>(68);
    SecureBytes master;

    explicit Archive(const char* password, uint8_t alg = kSymTwofish, uint8_t keyAlg = kSymTwofish) {
        for (size_t i = 0; i < 40; ++i) header[i] = static_cast<uint8_t>(i * 3 + 1);
        EXPECT_EQ(CreateArchiveKey(fastParams(alg, keyAlg), key), kOk);
        EXPECT_EQ(HeaderCheck(key.cipher.get(), header.data(), false), kOk);
        EXPECT_EQ(CreateMasterKeyBlock(fastParams(alg, keyAlg), PasswordRecord::fromUtf8(password), key, master), kOk);
    }
};

Result open(const SecureBytes& blocks, size_t masterLength, const char* password, const std::vector<uint8_t>& header,
            ArchiveKey& out) {
    PasswordRecord pw = PasswordRecord::fromUtf8(password);
    KeyMaterial km{&pw};
    return OpenKeyBlocks(blocks.data(), blocks.size(), masterLength, km, header.data(), false, out);
}

SecureBytes concat(const SecureBytes& a, const SecureBytes& b) {
    SecureBytes r = a;
    r.insert(r.end(), b.begin(), b.end());
    return r;
}

}  // namespace

TEST(Packet, FramingReadsBothFormatsAndRefusesOverruns) {
    PacketHeader h;
    const uint8_t oldOne[] = {0x8C, 0x02, 0xAA, 0xBB};
    ASSERT_EQ(ReadPacketHeader(oldOne, sizeof oldOne, h), kOk);
    EXPECT_EQ(h.tag, 3);
    EXPECT_EQ(h.headerLength, 2u);
    EXPECT_EQ(h.bodyLength, 2u);
    const uint8_t oldFour[] = {0x86, 0, 0, 0, 1, 0xAA};
    ASSERT_EQ(ReadPacketHeader(oldFour, sizeof oldFour, h), kOk);
    EXPECT_EQ(h.tag, 1);
    EXPECT_EQ(h.packetLength(), 6u);
    const uint8_t oldOpen[] = {0x8F, 1, 2, 3};
    ASSERT_EQ(ReadPacketHeader(oldOpen, sizeof oldOpen, h), kOk);
    EXPECT_EQ(h.bodyLength, 3u);
    std::vector<uint8_t> partial(2 + 32, 0);
    partial[0] = 0xC3;
    partial[1] = 224 + 5;  // partial length 32, taken as the whole packet
    ASSERT_EQ(ReadPacketHeader(partial.data(), partial.size(), h), kOk);
    EXPECT_EQ(h.bodyLength, 32u);

    EXPECT_EQ(ReadPacketHeader(oldOne, 3, h), kPacketHeader);       // old body past the end
    EXPECT_EQ(ReadPacketHeader(oldFour, 3, h), kPacketHeader);      // old length octets cut
    const uint8_t noMarker[] = {0x0C, 0};
    EXPECT_EQ(ReadPacketHeader(noMarker, 2, h), kPacketHeader);
    EXPECT_EQ(ReadPacketHeader(partial.data(), 20, h), kPacketLength);
    const uint8_t newFive[] = {0xC3, 0xFF, 0, 0};
    EXPECT_EQ(ReadPacketHeader(newFive, sizeof newFive, h), kPacketLength);
    const uint8_t newOnlyTag[] = {0xC3};
    EXPECT_EQ(ReadPacketHeader(newOnlyTag, 1, h), kPacketLength);

    // Writing picks 1, 2 or 5 length octets; what is written reads back.
    for (size_t body : {size_t{0}, size_t{191}, size_t{192}, size_t{8382}, size_t{8383}, size_t{70000}}) {
        SecureBytes p;
        WritePacketHeader(3, body, p);
        EXPECT_EQ(p.size(), PacketHeaderSize(body));
        EXPECT_EQ(p.size(), body < 192 ? 2u : body < 8383 ? 3u : 6u);
        p.resize(p.size() + body);
        ASSERT_EQ(ReadPacketHeader(p.data(), p.size(), h), kOk);
        EXPECT_EQ(h.bodyLength, body);
        EXPECT_EQ(h.tag, 3);
    }
}

TEST(PasswordPacket, LayoutAndRoundTripForEveryArchiveCipher) {
    for (uint8_t alg : {1, 2, 3, 4, 128, 129, 138, 10, 133, 136, 7, 8, 9, 137, 131}) {
        SCOPED_TRACE(int(alg));
        KeyBlockParams params = fastParams(alg, alg);
        params.salt = std::array<uint8_t, 8>{8, 7, 6, 5, 4, 3, 2, 1};
        ArchiveKey key;
        ASSERT_EQ(CreateArchiveKey(params, key), kOk);
        EXPECT_EQ(key.key.size(), SymAlgKeySize(alg));
        PasswordRecord pw = PasswordRecord::fromUtf8("correct horse");
        SecureBytes packet;
        ASSERT_EQ(MakePasswordPacket(params, pw, key, packet), kOk);
        ASSERT_EQ(packet.size(), 2 + 14 + key.key.size());
        EXPECT_EQ(packet[0], 0xC3);
        EXPECT_EQ(packet[2], 4);
        EXPECT_EQ(packet[3], alg);
        EXPECT_EQ(hex(std::vector<uint8_t>(packet.begin() + 4, packet.begin() + 15)), "03800807060504030201" "00");
        ArchiveKey back;
        ASSERT_EQ(OpenPasswordPacket(packet.data() + 2, packet.size() - 2, pw, back), kOk);
        EXPECT_EQ(back.cipherId, alg);
        EXPECT_EQ(back.key, key.key);
    }
}

TEST(PasswordPacket, BodyEndingAfterTheSpecifierYieldsTheDerivedKey) {
    const uint8_t salt[8] = {1, 1, 2, 3, 5, 8, 13, 21};
    uint8_t body[13];
    int32_t size = sizeof body;
    ASSERT_EQ(WritePasswordPacketBody(body, size, 0, nullptr, 0, kSymCast5, reinterpret_cast<const uint8_t*>("pw"), 2,
                                      kHashSha1, salt, 1024),
              kOk);
    ASSERT_EQ(size, 13);
    ArchiveKey key;
    ASSERT_EQ(OpenPasswordPacket(body, 13, PasswordRecord::fromUtf8("pw"), key), kOk);
    EXPECT_EQ(key.cipherId, kSymCast5);
    S2K s;
    s.type = kS2KIterated;
    s.hash = kHashSha1;
    std::memcpy(s.salt.data(), salt, 8);
    SecureBytes derived;
    ASSERT_EQ(DeriveKey(&s, reinterpret_cast<const uint8_t*>("pw"), 2, 16, derived), kOk);
    EXPECT_EQ(key.key, derived);
}

TEST(KeyBlocks, EmptyBlocksOpenAnUnencryptedArchiveWithoutPassword) {
    KeyBlockParams params = fastParams(kSymNone);
    ArchiveKey key;
    ASSERT_EQ(CreateArchiveKey(params, key), kOk);
    EXPECT_EQ(key.cipherId, 0);
    EXPECT_TRUE(key.key.empty());
    SecureBytes master;
    ASSERT_EQ(CreateMasterKeyBlock(params, PasswordRecord{}, key, master), kOk);
    EXPECT_TRUE(master.empty());
    ArchiveKey out;
    KeyMaterial none;
    std::vector<uint8_t> header(68);
    ASSERT_EQ(OpenKeyBlocks(nullptr, 0, 0, none, header.data(), false, out), kOk);
    EXPECT_EQ(out.cipherId, 0);
    EXPECT_FALSE(out.cipher);
    // The unencrypted header check is the plain SHA-1 of bytes 0..39.
    uint8_t check[20];
    ASSERT_EQ(ComputeHeaderCheck(header.data(), nullptr, check), kOk);
    EXPECT_EQ(hex(std::vector<uint8_t>(check, check + 20)), "b80de5d138758541c5f05265ad144ab9fa86d1db");
}

TEST(KeyBlocks, RightPasswordOpensAndWrongIsRefused) {
    Archive a("right password");
    ArchiveKey out;
    ASSERT_EQ(open(a.master, a.master.size(), "right password", a.header, out), kOk);
    EXPECT_EQ(out.cipherId, kSymTwofish);
    EXPECT_EQ(out.key, a.key.key);
    ASSERT_TRUE(out.cipher);
    EXPECT_EQ(open(a.master, a.master.size(), "wrong password", a.header, out), kWrongPassword);
    EXPECT_FALSE(out.cipher);
    EXPECT_TRUE(out.key.empty());
    KeyMaterial none;
    EXPECT_EQ(OpenKeyBlocks(a.master.data(), a.master.size(), a.master.size(), none, a.header.data(), false, out),
              kWrongPassword);
    // Without the header nothing could tell a wrong key from a right one: refused outright.
    PasswordRecord pw = PasswordRecord::fromUtf8("right password");
    KeyMaterial km{&pw};
    EXPECT_EQ(OpenKeyBlocks(a.master.data(), a.master.size(), a.master.size(), km, nullptr, false, out), kInconsistent);
}

TEST(KeyBlocks, WrongPasswordWithAPlausibleAlgorithmByteFailsOnTheHeaderCheck) {
    Archive a("the real one", kSymTwofish, kSymCast5);
    // Find a wrong password whose decrypted algorithm byte happens to name a cipher of the table.
    bool found = false;
    for (int i = 0; i < 4000 && !found; ++i) {
        std::string guess = "guess " + std::to_string(i);
        ArchiveKey k;
        if (OpenPasswordPacket(a.master.data() + 2, a.master.size() - 2, PasswordRecord::fromUtf8(guess), k) != kOk)
            continue;
        found = true;
        ArchiveKey out;
        EXPECT_EQ(open(a.master, a.master.size(), guess.c_str(), a.header, out), kWrongPassword) << guess;
    }
    EXPECT_TRUE(found);
}

TEST(KeyBlocks, AlgorithmByteZeroIsAWrongPassword) {
    Archive a("pw pw pw pw");
    ArchiveKey other;  // key bytes that cannot pass the header check under any cipher
    ASSERT_EQ(CreateArchiveKey(fastParams(), other), kOk);
    const uint8_t salt[8] = {};
    SecureBytes body(14 + 32);
    int32_t size = static_cast<int32_t>(body.size());
    ASSERT_EQ(WritePasswordPacketBody(body.data(), size, 0, other.key.data(), 32, kSymTwofish,
                                      reinterpret_cast<const uint8_t*>("pw pw pw pw"), 11, kHashSha1, salt, 1024),
              kOk);
    SecureBytes packet;
    WritePacketHeader(3, body.size(), packet);
    packet.insert(packet.end(), body.begin(), body.end());
    ArchiveKey out;
    EXPECT_EQ(open(packet, packet.size(), "pw pw pw pw", a.header, out), kWrongPassword);
}

TEST(KeyBlocks, SecondPasswordInTheExtendedBlockOpens) {
    Archive a("master password");
    SecureBytes ext;
    bool used = true;
    ASSERT_EQ(AddPasswordPacket(a.master.data(), a.master.size(), nullptr, 0, a.header.data(), a.key, fastParams(),
                                PasswordRecord::fromUtf8("second password"), used, ext),
              kOk);
    EXPECT_FALSE(used);
    // A public-key packet in front is passed over (not applicable yet).
    SecureBytes pk;
    WritePacketHeader(1, 3, pk);
    pk.insert(pk.end(), {3, 0, 0});
    SecureBytes extended = concat(pk, ext);
    ASSERT_EQ(CheckExtendedKeyBlock(extended.data(), extended.size()), kOk);
    SecureBytes blocks = concat(a.master, extended);
    ArchiveKey out;
    ASSERT_EQ(open(blocks, a.master.size(), "second password", a.header, out), kOk);
    EXPECT_EQ(out.key, a.key.key);
    ASSERT_EQ(open(blocks, a.master.size(), "master password", a.header, out), kOk);
    EXPECT_EQ(open(blocks, a.master.size(), "third password", a.header, out), kWrongPassword);
    // Only a public-key packet: 55 comes back.
    SecureBytes onlyPk = concat(a.master, pk);
    EXPECT_EQ(open(onlyPk, a.master.size(), "nope", a.header, out), kNotApplicable);
}

TEST(KeyBlocks, RecoverySearchFindsTheCipherThatPassesTheHeaderCheck) {
    // The packet names Rijndael but the header was checked under Serpent with the same key bytes.
    Archive a("recover me", kSymRijndael);
    std::unique_ptr<cSymAlg> serpent;
    ASSERT_EQ(CreateSymAlg(kSymSerpent, a.key.key.data(), 32, serpent), kOk);
    ASSERT_EQ(HeaderCheck(serpent.get(), a.header.data(), false), kOk);
    ArchiveKey out;
    ASSERT_EQ(open(a.master, a.master.size(), "recover me", a.header, out), kOk);
    EXPECT_EQ(out.cipherId, kSymSerpent);
    EXPECT_EQ(out.key, a.key.key);
}

TEST(KeyBlocks, DamagedBlocksGiveTheirCodesNeverACrash) {
    Archive a("damage");
    ArchiveKey out;
    // Truncated packet and a length running past the master block.
    SecureBytes cut(a.master.begin(), a.master.end() - 5);
    EXPECT_EQ(open(cut, cut.size(), "damage", a.header, out), kKeyBlockCorrupt);
    SecureBytes longer = a.master;
    longer[1] += 1;
    SecureBytes withExt = concat(longer, SecureBytes{0xC3, 0x00});
    EXPECT_EQ(open(withExt, a.master.size(), "damage", a.header, out), kKeyBlockCorrupt)
        << "a packet may not run from the master into the extended block";
    // Unknown tag.
    SecureBytes tag5 = a.master;
    tag5[0] = 0xC5;
    EXPECT_EQ(open(tag5, tag5.size(), "damage", a.header, out), kKeyBlockCorrupt);
    // S2K of unknown type.
    SecureBytes s2k = a.master;
    s2k[4] = 2;
    EXPECT_EQ(open(s2k, s2k.size(), "damage", a.header, out), kBadS2K);
    // Unknown cipher id and unknown hash inside the packet.
    SecureBytes cipherId = a.master;
    cipherId[3] = 200;
    EXPECT_EQ(open(cipherId, cipherId.size(), "damage", a.header, out), kUnknownS2KAlg);
    SecureBytes hashId = a.master;
    hashId[5] = 77;
    EXPECT_EQ(open(hashId, hashId.size(), "damage", a.header, out), kUnknownS2KAlg);
    SecureBytes version = a.master;
    version[2] = 3;
    EXPECT_EQ(open(version, version.size(), "damage", a.header, out), kKeyBlockCorrupt);
    // Every truncation and every single-byte corruption of a two-packet block answers with a code.
    SecureBytes ext;
    bool used = false;
    ASSERT_EQ(AddPasswordPacket(a.master.data(), a.master.size(), nullptr, 0, a.header.data(), a.key, fastParams(),
                                PasswordRecord::fromUtf8("other one"), used, ext),
              kOk);
    SecureBytes blocks = concat(a.master, ext);
    for (size_t n = 1; n < blocks.size(); ++n) {
        SecureBytes part(blocks.begin(), blocks.begin() + n);
        Result rc = open(part, std::min(n, a.master.size()), "other one", a.header, out);
        EXPECT_NE(rc, kOk) << n;
        SecureBytes flipped = blocks;
        flipped[n] ^= 0x41;
        (void)open(flipped, a.master.size(), "other one", a.header, out);
        (void)CheckExtendedKeyBlock(flipped.data() + a.master.size(), flipped.size() - a.master.size());
    }
}

TEST(KeyBlocks, ExtendedBlockStructuralTest) {
    EXPECT_EQ(CheckExtendedKeyBlock(nullptr, 0), kOk);
    Archive a("struct");
    EXPECT_EQ(CheckExtendedKeyBlock(a.master.data(), a.master.size()), kOk);
    SecureBytes bad = a.master;
    bad.push_back(0xC5);
    bad.push_back(0);
    EXPECT_EQ(CheckExtendedKeyBlock(bad.data(), bad.size()), kKeyBlockCorrupt);
    SecureBytes trailing = a.master;
    trailing.push_back(0x00);
    EXPECT_EQ(CheckExtendedKeyBlock(trailing.data(), trailing.size()), kKeyBlockCorrupt);
}

TEST(PasswordEdits, AddRefusesAPasswordAlreadyInUse) {
    Archive a("in use already");
    SecureBytes ext;
    bool used = false;
    ASSERT_EQ(AddPasswordPacket(a.master.data(), a.master.size(), nullptr, 0, a.header.data(), a.key, fastParams(),
                                PasswordRecord::fromUtf8("in use already"), used, ext),
              kOk);
    EXPECT_TRUE(used);
    EXPECT_TRUE(ext.empty());
    EXPECT_EQ(msgText(Msg::kPasswordAlreadyUsed), u"The same password was already used for the archive.");
}

TEST(PasswordEdits, RemoveTakesOutExactlyTheExtendedPacket) {
    Archive a("master pw");
    SecureBytes ext1, ext2;
    bool used = false;
    ASSERT_EQ(AddPasswordPacket(a.master.data(), a.master.size(), nullptr, 0, a.header.data(), a.key, fastParams(),
                                PasswordRecord::fromUtf8("first extra"), used, ext1),
              kOk);
    ASSERT_EQ(AddPasswordPacket(a.master.data(), a.master.size(), ext1.data(), ext1.size(), a.header.data(), a.key,
                                fastParams(), PasswordRecord::fromUtf8("second extra"), used, ext2),
              kOk);
    PasswordPacketLocation where;
    ASSERT_EQ(LocatePasswordPacket(a.master.data(), a.master.size(), ext2.data(), ext2.size(),
                                   PasswordRecord::fromUtf8("first extra"), a.header.data(), where),
              kOk);
    EXPECT_EQ(where.block, KeyBlockKind::kExtended);
    EXPECT_EQ(where.packet.position, 0u);
    SecureBytes second(ext2.begin() + static_cast<std::ptrdiff_t>(ext1.size()), ext2.end());
    ASSERT_EQ(RemoveKeyPacket(ext2, where.packet), kOk);
    EXPECT_EQ(ext2, second);
    // The master key block's password is found there, and the caller refuses to remove it.
    ASSERT_EQ(LocatePasswordPacket(a.master.data(), a.master.size(), ext2.data(), ext2.size(),
                                   PasswordRecord::fromUtf8("master pw"), a.header.data(), where),
              kOk);
    EXPECT_EQ(where.block, KeyBlockKind::kMaster);
    EXPECT_EQ(LocatePasswordPacket(a.master.data(), a.master.size(), ext2.data(), ext2.size(),
                                   PasswordRecord::fromUtf8("unknown"), a.header.data(), where),
              kWrongPassword);
    EXPECT_EQ(where.block, KeyBlockKind::kNone);
}

TEST(PasswordEdits, ChangeOverwritesThePacketInPlace) {
    Archive a("old master pw");
    PasswordPacketLocation where;
    ASSERT_EQ(LocatePasswordPacket(a.master.data(), a.master.size(), nullptr, 0, PasswordRecord::fromUtf8("old master pw"),
                                   a.header.data(), where),
              kOk);
    ASSERT_EQ(where.block, KeyBlockKind::kMaster);
    SecureBytes master = a.master;
    ASSERT_EQ(ReplacePasswordPacket(master.data(), master.size(), where.packet, a.key, fastParams(kSymTwofish, kSymSerpent),
                                    PasswordRecord::fromUtf8("new master pw")),
              kOk);
    EXPECT_EQ(master.size(), a.master.size());
    ArchiveKey out;
    EXPECT_EQ(open(master, master.size(), "old master pw", a.header, out), kWrongPassword);
    ASSERT_EQ(open(master, master.size(), "new master pw", a.header, out), kOk);
    EXPECT_EQ(out.key, a.key.key);
    // A replacement of another size is refused and nothing is written.
    PacketLocation odd{0, master.size() - 1};
    SecureBytes before = master;
    EXPECT_EQ(ReplacePasswordPacket(master.data(), master.size(), odd, a.key, fastParams(), PasswordRecord::fromUtf8("x")),
              kInconsistent);
    EXPECT_EQ(master, before);
}

TEST(ArchiveKeys, NewKeysAreRandomAndSizedByTheAlgorithm) {
    ArchiveKey a, b;
    ASSERT_EQ(CreateArchiveKey(fastParams(kSymBlowfish448), a), kOk);
    ASSERT_EQ(CreateArchiveKey(fastParams(kSymBlowfish448), b), kOk);
    EXPECT_EQ(a.key.size(), 56u);
    EXPECT_NE(a.key, b.key);
    EXPECT_EQ(CreateArchiveKey(fastParams(5), a), kUnknownCipher);
    KeyBlockParams badHash = fastParams();
    badHash.hash = 99;
    EXPECT_EQ(CreateArchiveKey(badHash, a), kUnknownS2KAlg);
    KeyBlockParams pk = fastParams();
    pk.method = kMethodPublicKey;
    ASSERT_EQ(CreateArchiveKey(pk, a), kOk);
    SecureBytes block;
    EXPECT_EQ(CreateMasterKeyBlock(pk, PasswordRecord{}, a, block), kNotApplicable);
    a.clear();
    EXPECT_TRUE(a.key.empty());
    EXPECT_FALSE(a.cipher);
}
