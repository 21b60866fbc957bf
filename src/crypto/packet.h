#pragma once
// OpenPGP packet framing as the key blocks use it.
//
// Reading accepts both header formats:
//   new format  tag byte 0xC0 | tag; length: one octet < 192; two octets 192..223
//               ((first - 192) << 8) + second + 192; one octet 224..254 = partial length
//               1 << (first & 31), taken here as the packet's whole length; 0xFF + 4 octets
//               big-endian.
//   old format  tag byte 0x80 | tag << 2 | length type; length type 0/1/2 = 1, 2 or 4 octets
//               big-endian; 3 = indeterminate (the rest of the buffer).
// Writing always uses the new format with 1, 2 or 5 length octets.
#include <cstddef>
#include <cstdint>

#include "platform/result.h"
#include "platform/secure.h"

namespace vaultora {

inline constexpr uint8_t kTagPublicKeySessionKey = 1;
inline constexpr uint8_t kTagPasswordSessionKey = 3;

struct PacketHeader {
    uint8_t tag = 0;
    size_t headerLength = 0;  // bytes before the body
    size_t bodyLength = 0;
    bool newFormat = false;
    size_t packetLength() const { return headerLength + bodyLength; }
};

// Reads the packet header at `data` (`length` bytes available, the body included). 36: the first
// byte has no packet marker, or an old-format header or body runs past the buffer; 38: a
// new-format header or body runs past the buffer.
[[nodiscard]] Result ReadPacketHeader(const uint8_t* data, size_t length, PacketHeader& out);

// Appends a new-format header for `tag` and a body of `bodyLength` bytes to `out`.
void WritePacketHeader(uint8_t tag, size_t bodyLength, SecureBytes& out);
// Size of that header: 2, 3 or 6 bytes.
size_t PacketHeaderSize(size_t bodyLength);

}  // namespace vaultora
