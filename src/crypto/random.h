#pragma once
// Random bytes for keys, seeds and salts, from the operating system's generator.
#include <cstddef>
#include <cstdint>

#include "platform/result.h"

namespace vaultora {

// Fills `out` with `length` random bytes; 35 when the generator cannot deliver.
[[nodiscard]] Result RandomBytes(uint8_t* out, size_t length);

}  // namespace vaultora
