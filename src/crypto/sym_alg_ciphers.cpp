#include "crypto/sym_alg_ciphers.h"

#include <algorithm>
#include <cstring>

#include <botan/block_cipher.h>

namespace vaultora {

namespace {

// The working key: the given key cut to `working` bytes, or copied into `working` zero bytes.
SecureBytes workingKey(const uint8_t* key, int32_t keyLength, size_t working) {
    SecureBytes k(working, 0);
    size_t n = keyLength > 0 && key != nullptr ? std::min(working, static_cast<size_t>(keyLength)) : 0;
    if (n != 0) std::memcpy(k.data(), key, n);
    return k;
}

// GOST 28147-89 parameters. These values are part of the archive format: changing either one makes
// every archive encrypted with GOST unreadable.
//
// S-boxes: the CryptoPro parameter set of GOST R 34.11-94 (Botan's "R3411_CryptoPro"), row 0
// substituting the least significant nibble:
//   row 0: A 4 5 6 8 1 3 7 D C E 0 9 2 B F
//   row 1: 5 F 4 0 2 D B 9 1 7 6 3 C E A 8
//   row 2: 7 F C E 9 4 1 0 3 B 5 2 6 A 8 D
//   row 3: 4 A 7 C 0 F 2 8 E 1 6 5 D B 9 3
//   row 4: 7 6 4 B 9 C 2 A 1 8 0 E F D 3 5
//   row 5: 7 6 2 4 D 9 F 0 A 1 5 B 8 E C 3
//   row 6: D E 4 1 7 0 5 A 3 C 8 F 6 2 9 B
//   row 7: 1 3 A 9 5 B 4 F 8 6 7 E D 0 2 C
constexpr const char* kGostCipherName = "GOST-28147-89(R3411_CryptoPro)";

// Constant key Z0..Z7 of the key transformation: the first 256 bits of the fractional part of pi.
constexpr uint32_t kGostTransformKey[8] = {0x243F6A88, 0x85A308D3, 0x13198A2E, 0x03707344,
                                           0xA4093822, 0x299F31D0, 0x082EFA98, 0xEC4E6C89};

}  // namespace

// ---- cAlgDummy ----

bool cAlgDummy::GetSizes(uint32_t& blockSize, uint32_t& keySize) const {
    blockSize = 0;
    keySize = 0;
    return true;
}

Result cAlgDummy::EncryptBlocks(const uint8_t* in, uint8_t* out, int32_t length) {
    if (length < 0) return kNotBlockMultiple;
    if (length != 0 && in != out) std::memmove(out, in, static_cast<size_t>(length));
    return kOk;
}

Result cAlgDummy::DecryptBlocks(const uint8_t* in, uint8_t* out, int32_t length) {
    return EncryptBlocks(in, out, length);
}

// ---- cAlgBotanBlock ----

cAlgBotanBlock::~cAlgBotanBlock() {
    if (m_cipher) m_cipher->clear();
}

bool cAlgBotanBlock::init(const char* name, const uint8_t* key, size_t length, uint32_t reportedKeySize) {
    try {
        std::unique_ptr<Botan::BlockCipher> c = Botan::BlockCipher::create(name);
        if (!c || !c->valid_keylength(length)) return false;
        c->set_key(key, length);
        m_blockSize = static_cast<uint32_t>(c->block_size());
        m_keySize = reportedKeySize;
        m_cipher = std::move(c);
        return true;
    } catch (...) {
        return false;
    }
}

bool cAlgBotanBlock::GetSizes(uint32_t& blockSize, uint32_t& keySize) const {
    if (!m_cipher) return false;
    blockSize = m_blockSize;
    keySize = m_keySize;
    return true;
}

Result cAlgBotanBlock::EncryptBlocks(const uint8_t* in, uint8_t* out, int32_t length) {
    if (!m_cipher) return kCipherSizes;
    if (length < 0 || length % static_cast<int32_t>(m_blockSize) != 0) return kNotBlockMultiple;
    try {
        m_cipher->encrypt_n(in, out, static_cast<size_t>(length) / m_blockSize);
    } catch (...) {
        return kEncryptFailed;
    }
    return kOk;
}

Result cAlgBotanBlock::DecryptBlocks(const uint8_t* in, uint8_t* out, int32_t length) {
    if (!m_cipher) return kCipherSizes;
    if (length < 0 || length % static_cast<int32_t>(m_blockSize) != 0) return kNotBlockMultiple;
    try {
        m_cipher->decrypt_n(in, out, static_cast<size_t>(length) / m_blockSize);
    } catch (...) {
        return kDecryptFailed;
    }
    return kOk;
}

// ---- the algorithms ----

bool cAlgIdea::create(const uint8_t* key, int32_t keyLength) {
    SecureBytes k = workingKey(key, keyLength, 16);
    return init("IDEA", k.data(), k.size(), 16);
}

// Three independent DES keys, encrypt-decrypt-encrypt.
bool cAlg3des::create(const uint8_t* key, int32_t keyLength) {
    SecureBytes k = workingKey(key, keyLength, 24);
    return init("TripleDES", k.data(), k.size(), 24);
}

// CAST5 always runs with a 128-bit key (16 rounds), also for shorter keys.
bool cAlgCast::create(const uint8_t* key, int32_t keyLength) {
    SecureBytes k = workingKey(key, keyLength, 16);
    return init("CAST-128", k.data(), k.size(), 16);
}

// Blowfish keys its schedule with the key as given, limited to 56 bytes; keys under 5 bytes are
// zero-padded to 5.
bool cAlgBfish::create(const uint8_t* key, int32_t keyLength) {
    size_t effective = std::clamp<int32_t>(keyLength, 5, 56);
    SecureBytes k = workingKey(key, keyLength, effective);
    return init("Blowfish", k.data(), k.size(), static_cast<uint32_t>(effective));
}

bool cAlgDes::create(const uint8_t* key, int32_t keyLength) {
    SecureBytes k = workingKey(key, keyLength, 8);
    return init("DES", k.data(), k.size(), 8);
}

bool cAlgTFish::create(const uint8_t* key, int32_t keyLength) {
    SecureBytes k = workingKey(key, keyLength, 32);
    return init("Twofish", k.data(), k.size(), 32);
}

bool cAlgSerpent::create(const uint8_t* key, int32_t keyLength) {
    SecureBytes k = workingKey(key, keyLength, 32);
    return init("Serpent", k.data(), k.size(), 32);
}

// Rijndael always runs with a 256-bit key (14 rounds): a 16- or 24-byte key is followed by zero
// bytes, so identifiers 7 and 8 are not the 10- and 12-round AES-128 and AES-192.
bool cAlgRIJN::create(const uint8_t* key, int32_t keyLength) {
    SecureBytes k = workingKey(key, keyLength, 32);
    return init("AES-256", k.data(), k.size(), 32);
}

// GOST key transformation: the 32-byte key, read as eight little-endian words K0..K7, is run pair
// by pair ((K0,K1), (K2,K3), ...) through the 32-round GOST cycle in decryption order under the
// constant key Z0..Z7; the eight resulting words are the working key, used in the standard order.
bool cAlgGOST::create(const uint8_t* key, int32_t keyLength) {
    SecureBytes k = workingKey(key, keyLength, 32);
    try {
        std::unique_ptr<Botan::BlockCipher> z = Botan::BlockCipher::create(kGostCipherName);
        if (!z) return false;
        uint8_t zKey[32];
        for (size_t i = 0; i < 8; ++i)
            for (size_t j = 0; j < 4; ++j) zKey[4 * i + j] = static_cast<uint8_t>(kGostTransformKey[i] >> (8 * j));
        z->set_key(zKey, sizeof zKey);
        z->decrypt_n(k.data(), k.data(), 4);
        z->clear();
    } catch (...) {
        return false;
    }
    return init(kGostCipherName, k.data(), k.size(), 32);
}

}  // namespace vaultora
