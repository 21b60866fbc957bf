#include "crypto/key_block.h"

#include <cstring>

#include "crypto/hash_alg.h"
#include "crypto/packet.h"
#include "crypto/password_packet.h"
#include "crypto/random.h"
#include "crypto/s2k.h"
#include "crypto/sym_alg_table.h"

namespace vaultora {

namespace {

bool movesOn(Result rc) { return rc == kWrongPassword || rc == kNotApplicable || rc == kKeyBlock39; }

// Tries the password on one packet body and verifies the header check. When the key bytes do not
// pass under the decrypted algorithm (or that algorithm is unknown), every listed cipher is tried
// with the same bytes; the first that passes the check is taken.
Result openPasswordBody(const uint8_t* body, size_t length, const PasswordRecord& password, const uint8_t* header,
                        ArchiveKey& out) {
    Result rc = OpenPasswordPacket(body, length, password, out);
    if (rc == kOk) rc = VerifyHeaderCheck(out.cipher.get(), header);
    if ((rc == kCipherSizes || rc == kWrongPassword) && !out.key.empty()) {
        uint32_t count = 0;
        const uint32_t* ids = nullptr;
        ListSymAlgs(count, ids);
        for (uint32_t i = 0; i < count; ++i) {
            if (ids[i] == kSymNone) continue;
            std::unique_ptr<cSymAlg> alt;
            if (CreateSymAlg(ids[i], out.key.data(), static_cast<int32_t>(out.key.size()), alt) != kOk) continue;
            if (VerifyHeaderCheck(alt.get(), header) == kOk) {
                out.cipher = std::move(alt);
                out.cipherId = static_cast<uint8_t>(ids[i]);
                return kOk;
            }
        }
    }
    if (rc != kOk) out.clear();
    return rc;
}

// Walks the packets of one block, calling visit(header, body) for each; stops when visit returns
// true. 79 when a packet cannot be framed inside the block.
template <class Visit>
Result walkPackets(const uint8_t* block, size_t length, Visit visit) {
    size_t pos = 0;
    while (pos < length) {
        PacketHeader h;
        if (ReadPacketHeader(block + pos, length - pos, h) != kOk) return kKeyBlockCorrupt;
        if (h.packetLength() == 0) return kKeyBlockCorrupt;
        if (visit(pos, h, block + pos + h.headerLength)) return kOk;
        pos += h.packetLength();
    }
    return kOk;
}

}  // namespace

Result ComputeHeaderCheck(const uint8_t* header, cSymAlg* cipher, uint8_t out[20]) {
    if (header == nullptr || out == nullptr) return kMissingOutput;
    uint8_t digest[kHeaderCheckSize];
    Result rc = HashBuffer(kHashSha1, digest, header, kHeaderCheckedBytes);
    if (rc == kOk && cipher != nullptr && cipher->blockSize() != 0) {
        rc = CfbStart(cipher, nullptr);
        if (rc == kOk) rc = CfbEncrypt(cipher, digest, out, kHeaderCheckSize);
    } else if (rc == kOk) {
        std::memcpy(out, digest, kHeaderCheckSize);
    }
    secureWipe(digest, sizeof digest);
    return rc;
}

Result VerifyHeaderCheck(cSymAlg* cipher, const uint8_t* header) {
    uint8_t value[kHeaderCheckSize];
    Result rc = ComputeHeaderCheck(header, cipher, value);
    if (rc != kOk) return rc;
    uint8_t diff = 0;
    for (size_t i = 0; i < kHeaderCheckSize; ++i) diff |= static_cast<uint8_t>(value[i] ^ header[kHeaderCheckOffset + i]);
    return diff == 0 ? kOk : kWrongPassword;
}

Result HeaderCheck(cSymAlg* cipher, uint8_t* header, bool verify) {
    if (verify) return VerifyHeaderCheck(cipher, header);
    uint8_t value[kHeaderCheckSize];
    Result rc = ComputeHeaderCheck(header, cipher, value);
    if (rc == kOk) std::memcpy(header + kHeaderCheckOffset, value, kHeaderCheckSize);
    return rc;
}

Result OpenKeyBlocks(const uint8_t* blocks, size_t length, size_t masterLength, const KeyMaterial& key,
                     const uint8_t* header, bool alternativeMode, ArchiveKey& out) {
    (void)alternativeMode;  // only public-key packets behave differently in the second attempt
    out.clear();
    if (length == 0) return kOk;
    if (blocks == nullptr || header == nullptr || masterLength > length) return kInconsistent;

    Result last = kWrongPassword;
    // The master key block and the extended key block are walked separately, so that no packet is
    // read across the boundary between them.
    const size_t starts[2] = {0, masterLength};
    const size_t ends[2] = {masterLength, length};
    for (int part = 0; part < 2; ++part) {
        Result ended = kOk;
        bool done = false;
        Result walk = walkPackets(blocks + starts[part], ends[part] - starts[part],
                                  [&](size_t, const PacketHeader& h, const uint8_t* body) {
                                      Result rc;
                                      ArchiveKey candidate;
                                      if (h.tag == kTagPasswordSessionKey) {
                                          rc = key.password != nullptr
                                                   ? openPasswordBody(body, h.bodyLength, *key.password, header,
                                                                      candidate)
                                                   : kWrongPassword;
                                      } else if (h.tag == kTagPublicKeySessionKey) {
                                          rc = kNotApplicable;
                                      } else {
                                          rc = kKeyBlockCorrupt;
                                      }
                                      if (rc == kOk) out = std::move(candidate);
                                      if (movesOn(rc)) {
                                          last = rc;
                                          return false;
                                      }
                                      ended = rc;
                                      done = true;
                                      return true;
                                  });
        if (walk != kOk) return walk;
        if (done) return ended;
    }
    return last;
}

Result CheckExtendedKeyBlock(const uint8_t* block, size_t length) {
    if (length == 0) return kOk;
    if (block == nullptr) return kKeyBlockCorrupt;
    bool bad = false;
    Result rc = walkPackets(block, length, [&](size_t, const PacketHeader& h, const uint8_t*) {
        bad = h.tag != kTagPasswordSessionKey && h.tag != kTagPublicKeySessionKey;
        return bad;
    });
    if (rc == kOk && bad) rc = kKeyBlockCorrupt;
    return rc;
}

Result CreateArchiveKey(const KeyBlockParams& params, ArchiveKey& out) {
    out.clear();
    if (params.archiveAlg == kSymNone) return kOk;
    const uint32_t n = SymAlgKeySize(params.archiveAlg);
    if (n == 0) return kUnknownCipher;

    SecureBytes seed(3 * size_t{n});
    Result rc = RandomBytes(seed.data(), seed.size());
    S2K simple;
    simple.type = kS2KSimple;
    simple.hash = params.hash;
    SecureBytes key;
    if (rc == kOk) rc = DeriveKey(&simple, seed.data(), static_cast<uint32_t>(seed.size()), n, key);
    std::unique_ptr<cSymAlg> cipher;
    if (rc == kOk) rc = CreateSymAlg(params.archiveAlg, key.data(), static_cast<int32_t>(key.size()), cipher);
    if (rc != kOk) return rc;
    out.cipherId = params.archiveAlg;
    out.key.swap(key);
    out.cipher = std::move(cipher);
    return kOk;
}

Result CreateMasterKeyBlock(const KeyBlockParams& params, const PasswordRecord& password, const ArchiveKey& key,
                            SecureBytes& block) {
    block.clear();
    if (key.cipherId == kSymNone) return kOk;
    if (params.method != kMethodPassword) return kNotApplicable;
    return MakePasswordPacket(params, password, key, block);
}

Result FindPasswordPacket(const uint8_t* block, size_t length, const PasswordRecord& password, const uint8_t* header,
                          PacketLocation& where) {
    if (header == nullptr) return kInconsistent;
    if (length == 0) return kWrongPassword;
    if (block == nullptr) return kKeyBlockCorrupt;
    bool found = false;
    Result rc = walkPackets(block, length, [&](size_t pos, const PacketHeader& h, const uint8_t* body) {
        if (h.tag != kTagPasswordSessionKey) return false;
        ArchiveKey candidate;
        if (openPasswordBody(body, h.bodyLength, password, header, candidate) != kOk) return false;
        where.position = pos;
        where.size = h.packetLength();
        found = true;
        return true;
    });
    if (rc != kOk) return rc;
    return found ? kOk : kWrongPassword;
}

Result LocatePasswordPacket(const uint8_t* master, size_t masterLength, const uint8_t* extended,
                            size_t extendedLength, const PasswordRecord& password, const uint8_t* header,
                            PasswordPacketLocation& where) {
    where = PasswordPacketLocation{};
    Result rc = FindPasswordPacket(extended, extendedLength, password, header, where.packet);
    if (rc == kOk) {
        where.block = KeyBlockKind::kExtended;
        return kOk;
    }
    if (rc != kWrongPassword) return rc;
    rc = FindPasswordPacket(master, masterLength, password, header, where.packet);
    if (rc == kOk) where.block = KeyBlockKind::kMaster;
    return rc;
}

Result AddPasswordPacket(const uint8_t* master, size_t masterLength, const uint8_t* extended, size_t extendedLength,
                         const uint8_t* header, const ArchiveKey& key, const KeyBlockParams& params,
                         const PasswordRecord& newPassword, bool& alreadyUsed, SecureBytes& newExtended) {
    alreadyUsed = false;
    newExtended.clear();
    PasswordPacketLocation found;
    Result rc = LocatePasswordPacket(master, masterLength, extended, extendedLength, newPassword, header, found);
    if (rc == kOk) {
        alreadyUsed = true;
        return kOk;
    }
    if (rc != kWrongPassword) return rc;
    SecureBytes packet;
    rc = MakePasswordPacket(params, newPassword, key, packet);
    if (rc != kOk) return rc;
    newExtended.reserve(extendedLength + packet.size());
    if (extendedLength != 0) newExtended.assign(extended, extended + extendedLength);
    newExtended.insert(newExtended.end(), packet.begin(), packet.end());
    return kOk;
}

Result ReplacePasswordPacket(uint8_t* block, size_t blockLength, const PacketLocation& where, const ArchiveKey& key,
                             const KeyBlockParams& params, const PasswordRecord& newPassword) {
    if (block == nullptr || where.position > blockLength || where.size > blockLength - where.position)
        return kInconsistent;
    SecureBytes packet;
    Result rc = MakePasswordPacket(params, newPassword, key, packet);
    if (rc != kOk) return rc;
    if (packet.size() != where.size) return kInconsistent;
    std::memcpy(block + where.position, packet.data(), packet.size());
    return kOk;
}

Result RemoveKeyPacket(SecureBytes& extended, const PacketLocation& where) {
    if (where.size == 0 || where.position > extended.size() || where.size > extended.size() - where.position)
        return kInconsistent;
    auto first = extended.begin() + static_cast<std::ptrdiff_t>(where.position);
    std::move(first + static_cast<std::ptrdiff_t>(where.size), extended.end(), first);
    secureWipe(extended.data() + extended.size() - where.size, where.size);
    extended.resize(extended.size() - where.size);
    return kOk;
}

}  // namespace vaultora
