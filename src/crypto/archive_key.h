#pragma once
// The archive key as the key blocks hand it to the archive object, and what a user offers to
// obtain it.
#include <cstdint>
#include <memory>

#include "crypto/sym_alg.h"
#include "platform/secure.h"

namespace vaultora {

// What the user offers to open the key blocks. Public-key material (a secret-key file) comes with
// the public-key packets.
struct KeyMaterial {
    const PasswordRecord* password = nullptr;
};

// The archive key: its cipher identifier (0 = unencrypted archive: no key, no cipher), the key
// bytes (wiped on release) and the cipher built from them.
struct ArchiveKey {
    uint8_t cipherId = 0;
    SecureBytes key;
    std::unique_ptr<cSymAlg> cipher;

    void clear() {
        cipherId = 0;
        key.clear();
        key.shrink_to_fit();  // releases (and so wipes) the key bytes now
        cipher.reset();
    }
};

}  // namespace vaultora
