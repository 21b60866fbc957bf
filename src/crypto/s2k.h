#pragma once
// OpenPGP string-to-key: the specifier as stored in a password key packet, the one-byte iteration
// count coding, and the derivation of a key from a password.
//
// Specifier layout (big-endian where it matters):
//   byte 0      type: 0 simple, 1 salted, 3 iterated and salted
//   byte 1      hash identifier
//   bytes 2..9  salt (types 1 and 3)
//   byte 10     coded count (type 3)
#include <array>
#include <cstddef>
#include <cstdint>

#include "platform/result.h"
#include "platform/secure.h"

namespace vaultora {

inline constexpr uint8_t kS2KSimple = 0;
inline constexpr uint8_t kS2KSalted = 1;
inline constexpr uint8_t kS2KIterated = 3;

struct S2K {
    uint8_t type = kS2KSimple;
    uint8_t hash = 1;
    std::array<uint8_t, 8> salt{};
    uint8_t count = 0;        // coded count
    bool hasSymAlg = false;   // when set, the derived key is as long as symAlg's key
    uint8_t symAlg = 0;       // taken from the packet, not stored in the specifier
};

// Reads a specifier from `length` bytes; returns its length (2, 10 or 11), or 0 when the type is
// unknown or the bytes end before the specifier does.
size_t ParseS2K(const uint8_t* bytes, size_t length, S2K& out);
// Writes the specifier; `size` is the room in `out` on entry and the bytes written (or needed,
// with result 1) on return.
[[nodiscard]] Result WriteS2K(const S2K& s2k, uint8_t* out, int32_t& size);
// Length of the written form of the specifier.
size_t S2KLength(const S2K& s2k);

// Count coding: DecodeCount(c) = (16 + (c & 15)) << ((c >> 4) + 6). Encoding rounds down to a
// representable count; every count under 1024 becomes 1024 and -1 or 65536 and more become 65536.
uint32_t DecodeCount(uint8_t code);
uint8_t EncodeCount(int64_t count);

// Derives a key into `out`. With a specifier that names a cipher the key is that cipher's key size
// (48 when the cipher or hash is unknown); if `length` is smaller, it is set to the size needed and
// 1 is returned. Without one, `length` bytes are produced (0 gives 52). A null specifier means
// simple S2K with MD5. `length` holds the bytes produced on success.
[[nodiscard]] Result DeriveKey(uint8_t* out, uint32_t& length, const uint8_t* password, uint32_t passwordLength,
                               const S2K* s2k);
// The same into a secure buffer; `length` is used when the specifier names no cipher.
[[nodiscard]] Result DeriveKey(const S2K* s2k, const uint8_t* password, uint32_t passwordLength, uint32_t length,
                               SecureBytes& out);

// The password bytes key derivation uses: the narrow form up to its first zero byte, at most 256
// bytes (the narrow buffer of the password record holds 256 bytes and a terminator). An empty
// narrow form falls back to the UTF-8 of the wide form, cut the same way.
SecureBytes PasswordBytes(const PasswordRecord& password);

}  // namespace vaultora
