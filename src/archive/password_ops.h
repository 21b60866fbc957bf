#pragma once
// Creating a password-protected archive, and adding, changing and removing passwords of an open
// archive. The archive key never changes, so no data is re-encrypted: only key packets are
// written.
#include "archive/vaultora.h"
#include "crypto/key_block_params.h"

namespace vaultora {

// Creates the archive protected by `password` with the parameters' cipher, hash and count
// (archive algorithm 0 makes an unencrypted archive).
[[nodiscard]] Result createWithPassword(Vaultora& archive, const KeyBlockParams& params, const PasswordRecord& password);

// Asks for a new password (entered twice) and stores a packet for it in the extended key block.
[[nodiscard]] Result addPassword(Vaultora& archive, const KeyBlockParams& params);
// Asks for a current password and a new one, and rewrites that password's packet in place.
[[nodiscard]] Result changePassword(Vaultora& archive, const KeyBlockParams& params);
// Asks for a password of the extended key block and removes its packet.
[[nodiscard]] Result removePassword(Vaultora& archive);

}  // namespace vaultora
