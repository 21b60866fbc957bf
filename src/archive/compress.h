#pragma once
// zlib behind the engine's result codes: every cluster payload, cluster descriptor and the
// cluster table go through these two functions.
#include <cstddef>
#include <cstdint>
#include <memory>

#include "platform/result.h"

namespace vaultora {

// The capacity every caller allocates before compressing n bytes.
inline constexpr size_t maxCompressedSize(size_t n) { return n + n / 1000 + 12; }

// zlib compress at the default level. On entry destLen is the capacity, on success the length.
// 65 destination too small, 64 out of memory, 66 any other error.
[[nodiscard]] Result compressBuffer(uint8_t* dest, size_t& destLen, const uint8_t* src, size_t srcLen);
// zlib uncompress. 65 destination too small, 64 out of memory, 76 corrupt or truncated input,
// 66 any other error.
[[nodiscard]] Result decompressBuffer(uint8_t* dest, size_t& destLen, const uint8_t* src, size_t srcLen);

// The pluggable compression class family. Its own result numbers differ from the engine's.
class cCompressAlg {
public:
    static constexpr uint32_t kOk = 0;
    static constexpr uint32_t kTooSmall = 1;
    static constexpr uint32_t kNoMemory = 0x10000;
    static constexpr uint32_t kCorrupt = 0x10001;
    static constexpr uint32_t kOther = 0x10002;
    static constexpr uint32_t kNotSupported = 0x10003;
    virtual ~cCompressAlg() = default;
    virtual uint32_t compress(uint8_t*, size_t*, const uint8_t*, size_t) { return kNotSupported; }
    virtual uint32_t decompress(uint8_t*, size_t*, const uint8_t*, size_t) { return kNotSupported; }
};

class cCompressZLIB : public cCompressAlg {
public:
    uint32_t compress(uint8_t* dest, size_t* destLen, const uint8_t* src, size_t srcLen) override;
    uint32_t decompress(uint8_t* dest, size_t* destLen, const uint8_t* src, size_t srcLen) override;
    static size_t worstCase(size_t n) { return n * 1001 / 1000 + 12; }
};

std::unique_ptr<cCompressAlg> createZlibCompressor();

}  // namespace vaultora
