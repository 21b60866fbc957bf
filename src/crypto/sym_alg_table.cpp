#include "crypto/sym_alg.h"

namespace vaultora {

// Placeholder until the cipher table is built: no identifier is known yet.
Result CreateSymAlg(uint32_t, const uint8_t*, int32_t, std::unique_ptr<cSymAlg>& out) {
    out.reset();
    return kUnknownCipher;
}

}  // namespace vaultora
