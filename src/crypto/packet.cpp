#include "crypto/packet.h"

namespace vaultora {

Result ReadPacketHeader(const uint8_t* data, size_t length, PacketHeader& out) {
    if (data == nullptr || length < 1 || (data[0] & 0x80) == 0) return kPacketHeader;
    PacketHeader h;
    const uint8_t first = data[0];
    if (first & 0x40) {
        h.newFormat = true;
        h.tag = first & 0x3F;
        if (length < 2) return kPacketLength;
        const uint8_t l0 = data[1];
        if (l0 < 192) {
            h.headerLength = 2;
            h.bodyLength = l0;
        } else if (l0 < 224) {
            if (length < 3) return kPacketLength;
            h.headerLength = 3;
            h.bodyLength = (size_t{l0 - 192u} << 8) + data[2] + 192;
        } else if (l0 < 255) {
            h.headerLength = 2;
            h.bodyLength = size_t{1} << (l0 & 31);
        } else {
            if (length < 6) return kPacketLength;
            h.headerLength = 6;
            h.bodyLength = (size_t{data[2]} << 24) | (size_t{data[3]} << 16) | (size_t{data[4]} << 8) | data[5];
        }
        if (h.bodyLength > length - h.headerLength) return kPacketLength;
    } else {
        h.tag = (first >> 2) & 0x0F;
        const uint8_t type = first & 3;
        if (type == 3) {
            h.headerLength = 1;
            h.bodyLength = length - 1;
        } else {
            const size_t octets = size_t{1} << type;  // 1, 2 or 4
            if (length < 1 + octets) return kPacketHeader;
            h.headerLength = 1 + octets;
            size_t body = 0;
            for (size_t i = 0; i < octets; ++i) body = (body << 8) | data[1 + i];
            h.bodyLength = body;
            if (h.bodyLength > length - h.headerLength) return kPacketHeader;
        }
    }
    out = h;
    return kOk;
}

size_t PacketHeaderSize(size_t bodyLength) {
    if (bodyLength < 192) return 2;
    if (bodyLength < 8383) return 3;
    return 6;
}

void WritePacketHeader(uint8_t tag, size_t bodyLength, SecureBytes& out) {
    out.push_back(static_cast<uint8_t>(0xC0 | (tag & 0x3F)));
    if (bodyLength < 192) {
        out.push_back(static_cast<uint8_t>(bodyLength));
    } else if (bodyLength < 8383) {
        size_t v = bodyLength - 192;
        out.push_back(static_cast<uint8_t>((v >> 8) + 192));
        out.push_back(static_cast<uint8_t>(v & 0xFF));
    } else {
        out.push_back(0xFF);
        for (int shift = 24; shift >= 0; shift -= 8) out.push_back(static_cast<uint8_t>(bodyLength >> shift));
    }
}

}  // namespace vaultora
