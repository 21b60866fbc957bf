#pragma once
// The cipher classes behind the algorithm table. Each one turns a key of any length into its
// working key once (cut to the working length, or copied into a zero-filled buffer of that length)
// and keeps the expanded schedule for every later call. The block ciphers themselves are Botan's.
#include <cstdint>
#include <memory>
#include <string>

#include <botan/block_cipher.h>

#include "crypto/sym_alg.h"

namespace vaultora {

// No cipher: copies input to output; both sizes 0.
class cAlgDummy final : public cSymAlg {
public:
    bool GetSizes(uint32_t& blockSize, uint32_t& keySize) const override;
    Result EncryptBlocks(const uint8_t* in, uint8_t* out, int32_t length) override;
    Result DecryptBlocks(const uint8_t* in, uint8_t* out, int32_t length) override;
};

// A block cipher from Botan with its expanded schedule (Botan keeps the schedule in wiped memory
// and clears it when the object goes).
class cAlgBotanBlock : public cSymAlg {
public:
    ~cAlgBotanBlock() override;
    bool GetSizes(uint32_t& blockSize, uint32_t& keySize) const override;
    Result EncryptBlocks(const uint8_t* in, uint8_t* out, int32_t length) override;
    Result DecryptBlocks(const uint8_t* in, uint8_t* out, int32_t length) override;

protected:
    // Creates the Botan cipher `name` and keys it with `workingKey`; false on any failure.
    bool init(const char* name, const uint8_t* workingKey, size_t workingLength, uint32_t reportedKeySize);

private:
    std::unique_ptr<Botan::BlockCipher> m_cipher;
    uint32_t m_blockSize = 0;
    uint32_t m_keySize = 0;
};

class cAlgIdea final : public cAlgBotanBlock {
public:
    bool create(const uint8_t* key, int32_t keyLength);
};
class cAlg3des final : public cAlgBotanBlock {
public:
    bool create(const uint8_t* key, int32_t keyLength);
};
class cAlgCast final : public cAlgBotanBlock {
public:
    bool create(const uint8_t* key, int32_t keyLength);
};
class cAlgBfish final : public cAlgBotanBlock {
public:
    bool create(const uint8_t* key, int32_t keyLength);
};
class cAlgDes final : public cAlgBotanBlock {
public:
    bool create(const uint8_t* key, int32_t keyLength);
};
class cAlgTFish final : public cAlgBotanBlock {
public:
    bool create(const uint8_t* key, int32_t keyLength);
};
class cAlgSerpent final : public cAlgBotanBlock {
public:
    bool create(const uint8_t* key, int32_t keyLength);
};
class cAlgRIJN final : public cAlgBotanBlock {
public:
    bool create(const uint8_t* key, int32_t keyLength);
};
class cAlgGOST final : public cAlgBotanBlock {
public:
    bool create(const uint8_t* key, int32_t keyLength);
};

}  // namespace vaultora
