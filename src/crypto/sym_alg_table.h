#pragma once
// The symmetric algorithm table: one-byte identifiers (OpenPGP numbers below 128, the archive's own
// from 128) mapped to cipher class, key size and block size; the list offered to the user; names.
// CreateSymAlg itself is declared in sym_alg.h.
#include <cstdint>

namespace vaultora {

inline constexpr uint8_t kSymNone = 0;
inline constexpr uint8_t kSymIdea = 1;
inline constexpr uint8_t kSym3des = 2;
inline constexpr uint8_t kSymCast5 = 3;
inline constexpr uint8_t kSymBlowfish = 4;
inline constexpr uint8_t kSymAes128 = 7;   // Rijndael-256 over the key zero-padded to 32 bytes
inline constexpr uint8_t kSymAes192 = 8;   // likewise
inline constexpr uint8_t kSymAes256 = 9;
inline constexpr uint8_t kSymTwofish = 10;
inline constexpr uint8_t kSymBlowfish256 = 128;
inline constexpr uint8_t kSymBlowfish448 = 129;
inline constexpr uint8_t kSymDes = 131;
inline constexpr uint8_t kSymGost = 133;
inline constexpr uint8_t kSymRijndael = 136;
inline constexpr uint8_t kSymSerpent = 137;
inline constexpr uint8_t kSymTwofish2 = 138;

// Key bytes used by identifier `id` (the length of a new archive key and of a derived key); 0 for
// an unknown identifier, in which case `maximumKeySize` is left alone.
uint32_t SymAlgKeySize(uint32_t id, uint32_t& maximumKeySize);
uint32_t SymAlgKeySize(uint32_t id);
// Block bytes, 0 if unknown.
uint32_t SymAlgBlockSize(uint32_t id);
// True when the table has a row for `id`.
bool SymAlgKnown(uint32_t id);
// The identifiers offered to the user and tried by the recovery search, in order (11 entries).
void ListSymAlgs(uint32_t& count, const uint32_t*& ids);
// The display name, or nullptr when the identifier has none.
const char* SymAlgName(uint8_t id);

}  // namespace vaultora
