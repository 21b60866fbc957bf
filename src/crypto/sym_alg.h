#pragma once
// The symmetric cipher interface of the archive: one object per archive key, ECB over whole
// blocks underneath, CBC for bulk data, OpenPGP-style CFB for short values, and the per-cluster IV.
#include <cstdint>
#include <memory>

#include "platform/result.h"
#include "platform/secure.h"

namespace vaultora {

class cSymAlg {
public:
    cSymAlg() = default;
    cSymAlg(const cSymAlg&) = delete;
    cSymAlg& operator=(const cSymAlg&) = delete;
    // Wipes the CFB register and scratch block (SecureBytes) and, in the derived classes, the
    // key schedule.
    virtual ~cSymAlg();
    // False when the object cannot be used. blockSize 0 means "no cipher" (the copy cipher).
    virtual bool GetSizes(uint32_t& blockSize, uint32_t& keySize) const = 0;
    // ECB over whole blocks; in and out may be the same buffer. 26 when length is not a multiple
    // of the block size.
    virtual Result EncryptBlocks(const uint8_t* in, uint8_t* out, int32_t length) = 0;
    virtual Result DecryptBlocks(const uint8_t* in, uint8_t* out, int32_t length) = 0;

    uint32_t blockSize() const;

    // CFB state (the feedback register and position carry over between calls).
    SecureBytes m_feedback;
    SecureBytes m_scratch;
    int32_t m_cfbPosition = 0;
};

// Creates the cipher of table row `id` over the key (cut or zero-padded as that row says).
// 28 when no row has the identifier.
[[nodiscard]] Result CreateSymAlg(uint32_t id, const uint8_t* key, int32_t keyLength, std::unique_ptr<cSymAlg>& out);

// CBC without padding over whole blocks; in and out may be the same buffer.
[[nodiscard]] Result CbcEncrypt(cSymAlg* alg, const uint8_t* iv, const uint8_t* in, uint8_t* out, int32_t length);
[[nodiscard]] Result CbcDecrypt(cSymAlg* alg, const uint8_t* iv, const uint8_t* in, uint8_t* out, int32_t length);

// Full-block CFB as OpenPGP uses it; iv may be null (zero block).
[[nodiscard]] Result CfbStart(cSymAlg* alg, const uint8_t* iv);
[[nodiscard]] Result CfbEncrypt(cSymAlg* alg, const uint8_t* in, uint8_t* out, int32_t length);
[[nodiscard]] Result CfbDecrypt(cSymAlg* alg, const uint8_t* in, uint8_t* out, int32_t length);
// OpenPGP resynchronisation: the register is realigned so that it holds the last block of
// ciphertext and the next byte starts a new block. Does nothing at a block boundary.
[[nodiscard]] Result CfbResync(cSymAlg* alg);

// The archive's record cipher: the cipher of the open archive (absent for an unencrypted one) and
// the per-cluster IV (the cluster number, little-endian, in the first four bytes of a zero block).
class ClusterCipher {
public:
    ClusterCipher() = default;
    explicit ClusterCipher(std::unique_ptr<cSymAlg> alg) : m_alg(std::move(alg)) {}
    bool hasCipher() const { return m_alg != nullptr && m_alg->blockSize() != 0; }
    uint32_t blockSize() const { return m_alg ? m_alg->blockSize() : 0; }
    cSymAlg* alg() const { return m_alg.get(); }
    // CBC over the whole buffer with the IV of cluster n; without a cipher a plain copy.
    bool Encrypt(uint32_t n, uint8_t* out, const uint8_t* in, uint32_t length);
    bool Decrypt(uint32_t n, uint8_t* out, const uint8_t* in, uint32_t length);
    // Starts CFB on the cipher with the IV of cluster n.
    [[nodiscard]] Result CfbStartForCluster(uint32_t n);
    // The IV of cluster n; 76 when the block is shorter than 4 bytes.
    [[nodiscard]] Result clusterIv(uint32_t n, SecureBytes& iv) const;

private:
    std::unique_ptr<cSymAlg> m_alg;
    SecureBytes m_ivTable;  // never filled: the IV is the cluster number alone
};

}  // namespace vaultora
