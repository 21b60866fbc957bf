#include "crypto/sym_alg.h"

#include <algorithm>
#include <cstring>

namespace vaultora {

cSymAlg::~cSymAlg() = default;

uint32_t cSymAlg::blockSize() const {
    uint32_t b = 0, k = 0;
    return GetSizes(b, k) ? b : 0;
}

Result CbcEncrypt(cSymAlg* alg, const uint8_t* iv, const uint8_t* in, uint8_t* out, int32_t length) {
    uint32_t b = 0, k = 0;
    if (alg == nullptr || !alg->GetSizes(b, k)) return kCipherSizes;
    if (b == 0 || length < 0 || length % static_cast<int32_t>(b) != 0) return kNotBlockMultiple;
    SecureBytes chain(b);
    if (iv != nullptr) std::memcpy(chain.data(), iv, b);
    for (int32_t off = 0; off < length; off += static_cast<int32_t>(b)) {
        for (uint32_t i = 0; i < b; ++i) chain[i] ^= in[off + i];
        if (Result rc = alg->EncryptBlocks(chain.data(), chain.data(), static_cast<int32_t>(b)); rc != kOk) return rc;
        std::memcpy(out + off, chain.data(), b);
    }
    return kOk;
}

// Decrypts in pieces of several blocks, so that the cipher can work on many blocks per call; the
// ciphertext of each piece is kept aside first, since in and out may be the same buffer.
Result CbcDecrypt(cSymAlg* alg, const uint8_t* iv, const uint8_t* in, uint8_t* out, int32_t length) {
    uint32_t b = 0, k = 0;
    if (alg == nullptr || !alg->GetSizes(b, k)) return kCipherSizes;
    if (b == 0 || length < 0 || length % static_cast<int32_t>(b) != 0) return kNotBlockMultiple;
    const size_t piece = std::max<size_t>(b, (4096 / b) * b);
    SecureBytes prev(b), cipher(std::min<size_t>(piece, static_cast<size_t>(length)));
    if (iv != nullptr) std::memcpy(prev.data(), iv, b);
    for (size_t off = 0; off < static_cast<size_t>(length);) {
        const size_t n = std::min(piece, static_cast<size_t>(length) - off);
        std::memcpy(cipher.data(), in + off, n);
        if (Result rc = alg->DecryptBlocks(cipher.data(), out + off, static_cast<int32_t>(n)); rc != kOk) return rc;
        for (uint32_t i = 0; i < b; ++i) out[off + i] ^= prev[i];
        for (size_t i = b; i < n; ++i) out[off + i] ^= cipher[i - b];
        std::memcpy(prev.data(), cipher.data() + n - b, b);
        off += n;
    }
    return kOk;
}

Result CfbStart(cSymAlg* alg, const uint8_t* iv) {
    uint32_t b = 0, k = 0;
    if (alg == nullptr || !alg->GetSizes(b, k)) return kCipherSizes;
    if (b == 0) return kNotBlockMultiple;
    alg->m_feedback.assign(b, 0);
    alg->m_scratch.assign(b, 0);
    if (iv != nullptr) std::memcpy(alg->m_feedback.data(), iv, b);
    alg->m_cfbPosition = 0;
    return kOk;
}

namespace {
Result cfbRun(cSymAlg* alg, const uint8_t* in, uint8_t* out, int32_t length, bool decrypt) {
    uint32_t b = 0, k = 0;
    if (alg == nullptr || !alg->GetSizes(b, k)) return kCipherSizes;
    if (b == 0) return kNotBlockMultiple;
    if (alg->m_feedback.size() != b) return kCipherBuffers;
    for (int32_t i = 0; i < length; ++i) {
        uint32_t pos = static_cast<uint32_t>(alg->m_cfbPosition) % b;
        if (pos == 0) {
            std::memcpy(alg->m_scratch.data(), alg->m_feedback.data(), b);
            if (Result rc = alg->EncryptBlocks(alg->m_scratch.data(), alg->m_feedback.data(), static_cast<int32_t>(b));
                rc != kOk)
                return rc;
        }
        uint8_t c = in[i];
        uint8_t o = static_cast<uint8_t>(c ^ alg->m_feedback[pos]);
        alg->m_feedback[pos] = decrypt ? c : o;
        out[i] = o;
        alg->m_cfbPosition = static_cast<int32_t>(pos + 1);
    }
    return kOk;
}
}  // namespace

Result CfbEncrypt(cSymAlg* alg, const uint8_t* in, uint8_t* out, int32_t length) {
    return cfbRun(alg, in, out, length, false);
}

Result CfbDecrypt(cSymAlg* alg, const uint8_t* in, uint8_t* out, int32_t length) {
    return cfbRun(alg, in, out, length, true);
}

Result CfbResync(cSymAlg* alg) {
    uint32_t b = 0, k = 0;
    if (alg == nullptr || !alg->GetSizes(b, k)) return kCipherSizes;
    if (b == 0) return kNotBlockMultiple;
    if (alg->m_feedback.size() != b || alg->m_scratch.size() != b) return kCipherBuffers;
    uint32_t pos = static_cast<uint32_t>(alg->m_cfbPosition) % b;
    if (pos == 0) return kOk;
    // The scratch block still holds the previous ciphertext block (the register before it was
    // encrypted); the register holds the current block's ciphertext in [0, pos). The last b bytes
    // of ciphertext are therefore scratch[pos..b) followed by register[0..pos).
    SecureBytes last(b);
    std::memcpy(last.data(), alg->m_scratch.data() + pos, b - pos);
    std::memcpy(last.data() + (b - pos), alg->m_feedback.data(), pos);
    alg->m_feedback.swap(last);
    alg->m_cfbPosition = 0;
    return kOk;
}

Result ClusterCipher::clusterIv(uint32_t n, SecureBytes& iv) const {
    uint32_t b = blockSize();
    iv.assign(b, 0);
    if (b >= 1 && m_ivTable.size() >= b) {
        size_t blocks = m_ivTable.size() / b;
        std::memcpy(iv.data(), m_ivTable.data() + (n % blocks) * b, b);
    }
    if (b < 4) return kInconsistent;
    for (int i = 0; i < 4; ++i) iv[i] ^= static_cast<uint8_t>(n >> (8 * i));
    return kOk;
}

bool ClusterCipher::Encrypt(uint32_t n, uint8_t* out, const uint8_t* in, uint32_t length) {
    if (!hasCipher()) {
        if (out != in) std::memmove(out, in, length);
        return true;
    }
    SecureBytes iv;
    if (clusterIv(n, iv) != kOk) return false;
    return CbcEncrypt(m_alg.get(), iv.data(), in, out, static_cast<int32_t>(length)) == kOk;
}

bool ClusterCipher::Decrypt(uint32_t n, uint8_t* out, const uint8_t* in, uint32_t length) {
    if (!hasCipher()) {
        if (out != in) std::memmove(out, in, length);
        return true;
    }
    SecureBytes iv;
    if (clusterIv(n, iv) != kOk) return false;
    return CbcDecrypt(m_alg.get(), iv.data(), in, out, static_cast<int32_t>(length)) == kOk;
}

Result ClusterCipher::CfbStartForCluster(uint32_t n) {
    SecureBytes iv;
    if (Result rc = clusterIv(n, iv); rc != kOk) return rc;
    return CfbStart(m_alg.get(), iv.data());
}

}  // namespace vaultora
