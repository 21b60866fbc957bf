#include "crypto/hash_alg.h"

#include <botan/hash.h>

namespace vaultora {

Result HashBuffer(uint8_t id, const uint8_t* data, size_t length, std::vector<uint8_t>& digest) {
    const char* name = nullptr;
    switch (id) {
        case 1: name = "MD5"; break;
        case 2: name = "SHA-1"; break;
        case 3: name = "RIPEMD-160"; break;
        case 8: name = "SHA-256"; break;
        case 10: name = "SHA-512"; break;
        default: return kUnknownCipher;
    }
    try {
        auto h = Botan::HashFunction::create_or_throw(name);
        h->update(data, length);
        auto out = h->final();
        digest.assign(out.begin(), out.end());
        return kOk;
    } catch (...) {
        return kNoMemory;
    }
}

}  // namespace vaultora
