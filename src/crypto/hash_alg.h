#pragma once
// Message digests by the archive's one-byte hash identifiers (OpenPGP numbers below 128, the
// archive's own from 128): the hash interface, its table, the list offered to the user and names.
#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include <botan/hash.h>

#include "platform/result.h"

namespace vaultora {

inline constexpr uint8_t kHashMd5 = 1;
inline constexpr uint8_t kHashSha1 = 2;
inline constexpr uint8_t kHashRipemd160 = 3;
inline constexpr uint8_t kHashSha256 = 8;
inline constexpr uint8_t kHashSha512 = 10;
inline constexpr uint8_t kHashSha256Own = 128;  // the archive's own number for SHA-256

// A hash computation. The base class answers 23 ("not available") to everything.
class cHashAlg {
public:
    cHashAlg() = default;
    cHashAlg(const cHashAlg&) = delete;
    cHashAlg& operator=(const cHashAlg&) = delete;
    virtual ~cHashAlg();
    virtual uint32_t DigestSize() const { return kHashUnavailable; }
    [[nodiscard]] virtual Result Update(const uint8_t*, uint32_t) { return kHashUnavailable; }
    // Writes DigestSize() bytes and leaves the object ready for a new message.
    [[nodiscard]] virtual Result Final(uint8_t*) { return kHashUnavailable; }
    [[nodiscard]] virtual Result Reset() { return kHashUnavailable; }
};

// A hash from Botan; the state is cleared on reset and release.
class cHashBotan : public cHashAlg {
public:
    explicit cHashBotan(std::unique_ptr<Botan::HashFunction> h);
    ~cHashBotan() override;
    uint32_t DigestSize() const override;
    [[nodiscard]] Result Update(const uint8_t* data, uint32_t length) override;
    [[nodiscard]] Result Final(uint8_t* digest) override;
    [[nodiscard]] Result Reset() override;

private:
    std::unique_ptr<Botan::HashFunction> m_hash;
};

// The table rows' classes (names kept for the identifiers they serve).
class cHashMD5 final : public cHashBotan { public: cHashMD5(); };
class cHashSHA1 final : public cHashBotan { public: cHashSHA1(); };
class cHashRipemd final : public cHashBotan { public: cHashRipemd(); };
class cHashSHA256 final : public cHashBotan { public: cHashSHA256(); };
class cHashSHA512 final : public cHashBotan { public: cHashSHA512(); };

// Creates and resets the hash of row `id`; 22 when no row has the identifier, 53 when the object
// cannot be built.
[[nodiscard]] Result CreateHashAlg(uint32_t id, std::unique_ptr<cHashAlg>& out);
// Digest bytes of row `id`; 22 when unknown.
[[nodiscard]] Result HashAlgDigestSize(uint32_t id, uint32_t& size);
// The identifiers offered to the user, in order (5 entries).
void ListHashAlgs(uint32_t& count, const uint32_t*& ids);
// The display name, or nullptr (names without a table row cannot be computed).
const char* HashAlgName(uint8_t id);

// Digest of the buffer with hash `id` into `digest` (DigestSize bytes); 29 when digest is null,
// 22 for an unknown identifier, else the first failing step's code.
[[nodiscard]] Result HashBuffer(uint32_t id, uint8_t* digest, const uint8_t* data, uint32_t length);
// The same, resizing `digest` to the digest size.
[[nodiscard]] Result HashBuffer(uint8_t id, const uint8_t* data, size_t length, std::vector<uint8_t>& digest);

}  // namespace vaultora
