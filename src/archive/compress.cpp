#include "archive/compress.h"

#include <zlib.h>

#include <new>

namespace vaultora {

Result compressBuffer(uint8_t* dest, size_t& destLen, const uint8_t* src, size_t srcLen) {
    uLongf out = destLen;
    int z = ::compress2(dest, &out, src, srcLen, Z_DEFAULT_COMPRESSION);
    switch (z) {
        case Z_OK: destLen = out; return kOk;
        case Z_BUF_ERROR: return kBufferTooSmall;
        case Z_MEM_ERROR: return kNoMemory;
        default: return kCompression;
    }
}

Result decompressBuffer(uint8_t* dest, size_t& destLen, const uint8_t* src, size_t srcLen) {
    uLongf out = destLen;
    uLong in = srcLen;
    // A buffer error with all input consumed is a truncated stream (corrupt input); with input
    // left over, the destination was too small.
    int z = ::uncompress2(dest, &out, src, &in);
    switch (z) {
        case Z_OK: destLen = out; return kOk;
        case Z_BUF_ERROR: return in >= srcLen ? kInconsistent : kBufferTooSmall;
        case Z_MEM_ERROR: return kNoMemory;
        case Z_DATA_ERROR: case Z_NEED_DICT: return kInconsistent;
        default: return kCompression;
    }
}

uint32_t cCompressZLIB::compress(uint8_t* dest, size_t* destLen, const uint8_t* src, size_t srcLen) {
    if (destLen == nullptr) return kCorrupt;
    uLongf out = *destLen;
    int z = ::compress2(dest, &out, src, srcLen, Z_DEFAULT_COMPRESSION);
    if (z == Z_OK) { *destLen = out; return kOk; }
    if (z == Z_BUF_ERROR) return kTooSmall;
    if (z == Z_MEM_ERROR) return kNoMemory;
    if (z == Z_STREAM_ERROR || z == Z_DATA_ERROR) return kCorrupt;
    return kOther;
}

uint32_t cCompressZLIB::decompress(uint8_t* dest, size_t* destLen, const uint8_t* src, size_t srcLen) {
    if (destLen == nullptr) return kCorrupt;
    uLongf out = *destLen;
    int z = ::uncompress(dest, &out, src, srcLen);
    if (z == Z_OK) { *destLen = out; return kOk; }
    if (z == Z_BUF_ERROR) return kTooSmall;
    if (z == Z_MEM_ERROR) return kNoMemory;
    if (z == Z_DATA_ERROR) return kCorrupt;
    return kOther;
}

std::unique_ptr<cCompressAlg> createZlibCompressor() {
    return std::unique_ptr<cCompressAlg>(new (std::nothrow) cCompressZLIB);
}

}  // namespace vaultora
