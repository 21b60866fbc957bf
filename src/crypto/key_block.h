#pragma once
// The key blocks of an archive: the master key block (exactly one packet: tag 3 for a password
// archive, tag 1 for a public-key archive; never resized after creation) and the extended key block
// (zero or more packets of tags 1 and 3 for further passwords and public-key recipients).
//
// A right key is told from a wrong one by the header check value: the SHA-1 digest of header bytes
// 0..39, CFB-encrypted under the archive cipher with a zero IV, stored at header bytes 40..59 (the
// plain digest for an unencrypted archive).
//
// Everything here works on byte images; reading and writing the blocks in the archive file, the
// crash copies and the questions to the user belong to the archive object.
#include <cstddef>
#include <cstdint>

#include "crypto/archive_key.h"
#include "crypto/key_block_params.h"
#include "crypto/sym_alg.h"
#include "platform/result.h"
#include "platform/secure.h"

namespace vaultora {

inline constexpr size_t kHeaderCheckedBytes = 40;
inline constexpr size_t kHeaderCheckOffset = 40;
inline constexpr size_t kHeaderCheckSize = 20;

// The header check value of `header` (bytes 0..39 are read) under `cipher`, or the plain digest
// when cipher is null or the copy cipher. Restarts the cipher's CFB stream.
[[nodiscard]] Result ComputeHeaderCheck(const uint8_t* header, cSymAlg* cipher, uint8_t out[20]);
// Stores the check value at header bytes 40..59 (verify false), or compares it with them (verify
// true; 51 on mismatch).
[[nodiscard]] Result HeaderCheck(cSymAlg* cipher, uint8_t* header, bool verify);
[[nodiscard]] Result VerifyHeaderCheck(cSymAlg* cipher, const uint8_t* header);

// Opens the key blocks: `blocks` holds the master key block (`masterLength` bytes) followed by the
// extended key block. An empty buffer is an unencrypted archive (success, cipher id 0). Packets are
// tried in order, master first. A password packet counts only when its key passes the header check
// (`header` is required: without it a wrong password could pass by chance); when it does not, the
// key bytes are tried with every listed cipher (recovery of a changed algorithm identifier).
// Results 51, 55 and 39 move on to the next packet; any other result ends the search. Public-key
// packets answer 55 for now. `alternativeMode` is the second attempt of the archive object, in which
// a public-key packet may ask the user for a secret-key file.
// 79: a packet header is unreadable or a packet runs past its block, or a packet has another tag.
// 76: no header given, or masterLength beyond length.
[[nodiscard]] Result OpenKeyBlocks(const uint8_t* blocks, size_t length, size_t masterLength, const KeyMaterial& key,
                                   const uint8_t* header, bool alternativeMode, ArchiveKey& out);

// Structural test of an extended key block: every packet is framed inside the block and has tag 1
// or 3. 0 for a sound (or empty) block, 79 otherwise.
[[nodiscard]] Result CheckExtendedKeyBlock(const uint8_t* block, size_t length);

// Makes a new archive key for the parameters' archive algorithm: `DeriveKey` with a simple S2K and
// the parameters' hash over 3n random bytes from the system generator (n = the key size). Archive
// algorithm 0 gives no key and no cipher. 28: unknown archive algorithm; 48: unknown hash; 35: no
// random bytes.
[[nodiscard]] Result CreateArchiveKey(const KeyBlockParams& params, ArchiveKey& out);

// The master key block of a new archive: empty for algorithm 0, else the password packet for the
// password method. The public-key method answers 55 for now.
[[nodiscard]] Result CreateMasterKeyBlock(const KeyBlockParams& params, const PasswordRecord& password,
                                          const ArchiveKey& key, SecureBytes& block);

// Where a packet lies in a block: byte offset of its header and its whole size.
struct PacketLocation {
    size_t position = 0;
    size_t size = 0;
};

// The first password packet of `block` that `password` opens and whose key passes the header check.
// Public-key packets and packets that do not open are passed over. 0 found; 51 none; 79 a block
// that cannot be walked; 76 no header.
[[nodiscard]] Result FindPasswordPacket(const uint8_t* block, size_t length, const PasswordRecord& password,
                                        const uint8_t* header, PacketLocation& where);

// ---- building blocks of the add / change / remove password operations ----

enum class KeyBlockKind { kNone, kMaster, kExtended };

struct PasswordPacketLocation {
    KeyBlockKind block = KeyBlockKind::kNone;
    PacketLocation packet;
};

// Which packet the password opens: the extended key block is searched first, then the master key
// block. 0 found; 51 in neither ("Session key encrypted by the password was not found."); other
// codes from a block that cannot be walked (the extended block is expected to have passed
// CheckExtendedKeyBlock).
[[nodiscard]] Result LocatePasswordPacket(const uint8_t* master, size_t masterLength, const uint8_t* extended,
                                          size_t extendedLength, const PasswordRecord& password,
                                          const uint8_t* header, PasswordPacketLocation& where);

// Add password: checks that the new password opens neither block (else `alreadyUsed` is set,
// "The same password was already used for the archive.", and nothing is built), then builds the
// password packet for the open archive's key and appends it to a copy of the extended key block in
// `newExtended`.
[[nodiscard]] Result AddPasswordPacket(const uint8_t* master, size_t masterLength, const uint8_t* extended,
                                       size_t extendedLength, const uint8_t* header, const ArchiveKey& key,
                                       const KeyBlockParams& params, const PasswordRecord& newPassword,
                                       bool& alreadyUsed, SecureBytes& newExtended);

// Change password: builds the replacement packet for the archive key under the new password and
// writes it over the old packet at `where` in `block` (the master or the extended key block image).
// 76 when the new packet's size differs from the old one (nothing is changed then).
[[nodiscard]] Result ReplacePasswordPacket(uint8_t* block, size_t blockLength, const PacketLocation& where,
                                           const ArchiveKey& key, const KeyBlockParams& params,
                                           const PasswordRecord& newPassword);

// Remove password: removes the packet at `where` from the extended key block image, moving the
// following bytes down. 76 when `where` does not lie inside the block.
[[nodiscard]] Result RemoveKeyPacket(SecureBytes& extended, const PacketLocation& where);

}  // namespace vaultora
