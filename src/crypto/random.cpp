#include "crypto/random.h"

#include <botan/system_rng.h>

namespace vaultora {

Result RandomBytes(uint8_t* out, size_t length) {
    if (length == 0) return kOk;
    if (out == nullptr) return kMissingOutput;
    try {
        Botan::system_rng().randomize(out, length);
    } catch (...) {
        return kRandomPoolEmpty;
    }
    return kOk;
}

}  // namespace vaultora
