#pragma once
// Message digests by the archive's one-byte hash identifiers (OpenPGP numbers).
#include <cstddef>
#include <cstdint>
#include <vector>

#include "platform/result.h"

namespace vaultora {

inline constexpr uint8_t kHashSha1 = 2;

// Digest of the buffer with hash `id`; 28 for an unknown identifier.
[[nodiscard]] Result HashBuffer(uint8_t id, const uint8_t* data, size_t length, std::vector<uint8_t>& digest);

}  // namespace vaultora
