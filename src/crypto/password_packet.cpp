#include "crypto/password_packet.h"

#include <cstring>

#include "crypto/packet.h"
#include "crypto/random.h"
#include "crypto/s2k.h"
#include "crypto/sym_alg_table.h"

namespace vaultora {

namespace {
constexpr size_t kBodyFixed = 2;  // version and key algorithm, before the specifier
}

Result WritePasswordPacketBody(uint8_t* out, int32_t& size, uint8_t archiveAlg, const uint8_t* key,
                               uint32_t keyLength, uint8_t keyAlg, const uint8_t* password, uint32_t passwordLength,
                               uint8_t hash, const uint8_t* salt, int64_t iterationCount) {
    if (SymAlgKeySize(keyAlg) == 0) return kUnknownCipher;
    S2K s2k;
    s2k.type = kS2KIterated;
    s2k.hash = hash;
    s2k.count = EncodeCount(iterationCount);
    s2k.hasSymAlg = true;
    s2k.symAlg = keyAlg;
    const size_t specLength = S2KLength(s2k);
    const size_t need = kBodyFixed + specLength + (keyLength != 0 ? 1 + size_t{keyLength} : 0);
    if (out == nullptr || size < 0 || static_cast<size_t>(size) < need) {
        size = static_cast<int32_t>(need);
        return kBufferTooSmallCrypto;
    }
    if (keyLength != 0 && key == nullptr) return kMissingOutput;

    Result rc = kOk;
    if (salt != nullptr)
        std::memcpy(s2k.salt.data(), salt, s2k.salt.size());
    else
        rc = RandomBytes(s2k.salt.data(), s2k.salt.size());
    SecureBytes kek;
    if (rc == kOk) rc = DeriveKey(&s2k, password, passwordLength, 0, kek);

    std::unique_ptr<cSymAlg> cipher;
    if (rc == kOk && keyLength != 0) rc = CreateSymAlg(keyAlg, kek.data(), static_cast<int32_t>(kek.size()), cipher);
    if (rc == kOk && keyLength != 0) rc = CfbStart(cipher.get(), nullptr);
    if (rc != kOk) return rc;

    out[0] = kPasswordPacketVersion;
    out[1] = keyAlg;
    int32_t specSize = static_cast<int32_t>(specLength);
    rc = WriteS2K(s2k, out + kBodyFixed, specSize);
    uint8_t* tail = out + kBodyFixed + specLength;
    if (rc == kOk && keyLength != 0) rc = CfbEncrypt(cipher.get(), &archiveAlg, tail, 1);
    if (rc == kOk && keyLength != 0) rc = CfbEncrypt(cipher.get(), key, tail + 1, static_cast<int32_t>(keyLength));
    if (rc != kOk) {
        secureWipe(out, need);
        return rc;
    }
    size = static_cast<int32_t>(need);
    return kOk;
}

Result MakePasswordPacket(const KeyBlockParams& params, const PasswordRecord& password, const ArchiveKey& key,
                          SecureBytes& packet) {
    packet.clear();
    if (key.cipherId == 0 || key.key.empty()) return kSizeAlignment;
    SecureBytes pw = PasswordBytes(password);
    int32_t size = 0;
    Result rc = WritePasswordPacketBody(nullptr, size, key.cipherId, key.key.data(),
                                        static_cast<uint32_t>(key.key.size()), params.keyAlg, pw.data(),
                                        static_cast<uint32_t>(pw.size()), params.hash, nullptr, params.iterationCount);
    if (rc != kBufferTooSmallCrypto) return rc;
    SecureBytes body(static_cast<size_t>(size));
    rc = WritePasswordPacketBody(body.data(), size, key.cipherId, key.key.data(), static_cast<uint32_t>(key.key.size()),
                                 params.keyAlg, pw.data(), static_cast<uint32_t>(pw.size()), params.hash,
                                 params.salt ? params.salt->data() : nullptr, params.iterationCount);
    if (rc != kOk) return rc;
    packet.reserve(PacketHeaderSize(body.size()) + body.size());
    WritePacketHeader(kTagPasswordSessionKey, body.size(), packet);
    packet.insert(packet.end(), body.begin(), body.end());
    return kOk;
}

Result OpenPasswordPacket(const uint8_t* body, size_t length, const PasswordRecord& password, ArchiveKey& out) {
    out.clear();
    if (body == nullptr || length < kBodyFixed + 2) return kKeyBlockCorrupt;
    if (body[0] != kPasswordPacketVersion) return kKeyBlockCorrupt;
    S2K s2k;
    s2k.hasSymAlg = true;
    s2k.symAlg = body[1];
    const size_t specLength = ParseS2K(body + kBodyFixed, length - kBodyFixed, s2k);
    if (specLength == 0) return kBadS2K;
    const size_t rest = length - kBodyFixed - specLength;
    if (rest == 1) return kKeyBlockCorrupt;  // an algorithm byte without a key

    SecureBytes pw = PasswordBytes(password);
    SecureBytes kek;
    Result rc = DeriveKey(&s2k, pw.data(), static_cast<uint32_t>(pw.size()), 0, kek);
    if (rc != kOk) return rc;

    uint8_t archiveAlg = s2k.symAlg;
    if (rest == 0) {
        out.key.swap(kek);  // the derived key is itself the archive key
    } else {
        std::unique_ptr<cSymAlg> kekCipher;
        rc = CreateSymAlg(s2k.symAlg, kek.data(), static_cast<int32_t>(kek.size()), kekCipher);
        if (rc == kOk) rc = CfbStart(kekCipher.get(), nullptr);
        const uint8_t* enc = body + kBodyFixed + specLength;
        if (rc == kOk) rc = CfbDecrypt(kekCipher.get(), enc, &archiveAlg, 1);
        if (rc == kOk) {
            out.key.assign(rest - 1, 0);
            rc = CfbDecrypt(kekCipher.get(), enc + 1, out.key.data(), static_cast<int32_t>(rest - 1));
        }
        if (rc != kOk) {
            out.clear();
            return rc;
        }
    }
    if (archiveAlg == 0) return kWrongPassword;
    rc = CreateSymAlg(archiveAlg, out.key.data(), static_cast<int32_t>(out.key.size()), out.cipher);
    if (rc == kUnknownCipher) return kWrongPassword;
    if (rc != kOk) {
        out.clear();
        return rc;
    }
    out.cipherId = archiveAlg;
    return kOk;
}

}  // namespace vaultora
