#pragma once
// The password key packet (OpenPGP symmetric-key encrypted session key, tag 3).
//
// Body layout:
//   0    u8      version, 4
//   1    u8      key algorithm: the cipher whose key the S2K derives
//   2    11      S2K specifier: type 3, hash, 8-byte salt, count code
//   13   u8      archive algorithm identifier  } one CFB stream under the key algorithm keyed
//   14   n       archive key                   } with the derived key, IV all zeros
// With a 32-byte archive key the packet is 48 bytes (2 header bytes, 46 body bytes). When reading,
// any S2K type is accepted, and a body that ends right after the specifier means the derived key
// itself is the archive key, for the packet's key algorithm.
#include <cstddef>
#include <cstdint>

#include "crypto/archive_key.h"
#include "crypto/key_block_params.h"
#include "platform/result.h"
#include "platform/secure.h"

namespace vaultora {

inline constexpr uint8_t kPasswordPacketVersion = 4;

// Writes a body into `out`; `size` is the room on entry and the bytes written (or needed, with
// result 1) on return. Without a salt, 8 random bytes are drawn. `keyLength` 0 writes a body that
// ends after the specifier. 28: unknown or keyless key algorithm.
[[nodiscard]] Result WritePasswordPacketBody(uint8_t* out, int32_t& size, uint8_t archiveAlg, const uint8_t* key,
                                             uint32_t keyLength, uint8_t keyAlg, const uint8_t* password,
                                             uint32_t passwordLength, uint8_t hash, const uint8_t* salt,
                                             int64_t iterationCount);

// The whole packet (header and body) holding `key` under `password` with the parameters' key
// algorithm, hash, salt and iteration count. 77 when the key is empty (unencrypted archive).
[[nodiscard]] Result MakePasswordPacket(const KeyBlockParams& params, const PasswordRecord& password,
                                        const ArchiveKey& key, SecureBytes& packet);

// Opens a packet body with the password: derives the key-encryption key, decrypts the algorithm
// byte and the key, and builds the cipher. 51 when the algorithm byte is 0 or unknown (the key
// bytes are left in `out.key` for the recovery search), 40 for an unreadable S2K specifier, 48 for
// an unknown hash or key algorithm in it, 79 for a body of another version or shape.
// No header check is made here.
[[nodiscard]] Result OpenPasswordPacket(const uint8_t* body, size_t length, const PasswordRecord& password,
                                        ArchiveKey& out);

}  // namespace vaultora
