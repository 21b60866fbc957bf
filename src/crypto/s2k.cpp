#include "crypto/s2k.h"

#include <algorithm>
#include <cstring>

#include "crypto/hash_alg.h"
#include "crypto/sym_alg_table.h"
#include "platform/text.h"

namespace vaultora {

namespace {
constexpr size_t kNarrowPasswordMax = 256;
}

size_t S2KLength(const S2K& s2k) {
    size_t n = 2;
    if (s2k.type & 1) n += 8;
    if (s2k.type & 2) n += 1;
    return n;
}

size_t ParseS2K(const uint8_t* bytes, size_t length, S2K& out) {
    if (bytes == nullptr || length < 1) return 0;
    S2K s;
    s.type = bytes[0];
    if (s.type != kS2KSimple && s.type != kS2KSalted && s.type != kS2KIterated) return 0;
    size_t n = S2KLength(s);
    if (length < n) return 0;
    s.hash = bytes[1];
    if (s.type & 1) std::memcpy(s.salt.data(), bytes + 2, 8);
    if (s.type & 2) s.count = bytes[10];
    s.hasSymAlg = out.hasSymAlg;
    s.symAlg = out.symAlg;
    out = s;
    return n;
}

Result WriteS2K(const S2K& s2k, uint8_t* out, int32_t& size) {
    int32_t need = static_cast<int32_t>(S2KLength(s2k));
    if (out == nullptr || size < need) {
        size = need;
        return kBufferTooSmallCrypto;
    }
    out[0] = s2k.type;
    out[1] = s2k.hash;
    if (s2k.type & 1) std::memcpy(out + 2, s2k.salt.data(), 8);
    if (s2k.type & 2) out[10] = s2k.count;
    size = need;
    return kOk;
}

uint32_t DecodeCount(uint8_t code) {
    return (16u + (code & 15u)) << ((code >> 4) + 6);
}

uint8_t EncodeCount(int64_t count) {
    if (count == -1 || count >= 65536) return 0x60;
    for (int e = 6; e >= 0; --e) {
        int64_t m = count >> (e + 6);
        if (m >= 16) return static_cast<uint8_t>((e << 4) | (m & 15));
    }
    return 0;
}

Result DeriveKey(uint8_t* out, uint32_t& length, const uint8_t* password, uint32_t passwordLength, const S2K* s2k) {
    S2K simple;  // simple S2K with MD5 and no cipher
    if (s2k == nullptr) s2k = &simple;

    uint32_t total = 0;
    if (s2k->hasSymAlg) {
        if (!SymAlgKnown(s2k->symAlg)) return kUnknownS2KAlg;
        total = SymAlgKeySize(s2k->symAlg);
        if (total == 0) return kUnknownS2KAlg;  // the copy cipher has no key to derive
        if (total > length || out == nullptr) {
            length = total;
            return kBufferTooSmallCrypto;
        }
    } else {
        if (length == 0) return kZeroKeyLength;
        total = length;
    }
    if (out == nullptr) return kMissingOutput;
    if (password == nullptr) passwordLength = 0;

    std::unique_ptr<cHashAlg> hash;
    Result rc = CreateHashAlg(s2k->hash, hash);
    if (rc == kUnknownHash) return kUnknownS2KAlg;
    if (rc != kOk) return rc;
    const uint32_t d = hash->DigestSize();
    SecureBytes digest(d);

    const bool salted = (s2k->type & 1) != 0;
    const uint64_t unit = uint64_t{passwordLength} + (salted ? 8 : 0);
    uint64_t count = (s2k->type & 2) ? DecodeCount(s2k->count) : 0;
    if (count < unit) count = unit;

    // The hashed string is salt+password repeated and cut to `count` bytes. Whole repetitions
    // are fed from a block of several copies to keep the number of hash calls small. An empty
    // unit (no salt, no password) hashes nothing rather than looping forever.
    SecureBytes pattern;
    uint64_t fullUnits = 0;
    if (unit != 0 && count > unit) {
        fullUnits = (count - 1) / unit;  // repetitions while more than one unit remains
        uint64_t copies = std::max<uint64_t>(1, std::min<uint64_t>(fullUnits, 65536 / unit));
        pattern.resize(static_cast<size_t>(copies * unit));
        for (uint64_t c = 0; c < copies; ++c) {
            uint8_t* p = pattern.data() + c * unit;
            if (salted) std::memcpy(p, s2k->salt.data(), 8), p += 8;
            if (passwordLength != 0) std::memcpy(p, password, passwordLength);
        }
    }
    const uint64_t tail = unit == 0 ? 0 : count - fullUnits * unit;  // 1..unit bytes
    const uint8_t zeros[64] = {};

    uint32_t produced = 0;
    for (uint32_t round = 0; produced < total && rc == kOk; ++round) {
        rc = hash->Reset();
        for (uint32_t z = round; rc == kOk && z > 0;) {
            uint32_t n = std::min<uint32_t>(z, sizeof zeros);
            rc = hash->Update(zeros, n);
            z -= n;
        }
        for (uint64_t left = fullUnits * unit; rc == kOk && left > 0;) {
            uint32_t n = static_cast<uint32_t>(std::min<uint64_t>(left, pattern.size()));
            rc = hash->Update(pattern.data(), n);
            left -= n;
        }
        uint64_t remaining = tail;
        if (rc == kOk && salted) {
            uint32_t n = remaining < 9 ? static_cast<uint32_t>(remaining) : 8;
            rc = hash->Update(s2k->salt.data(), n);
            remaining -= n;
        }
        if (rc == kOk && remaining > 0) rc = hash->Update(password, static_cast<uint32_t>(remaining));
        if (rc == kOk) rc = hash->Final(digest.data());
        if (rc == kOk) {
            uint32_t n = std::min(d, total - produced);
            std::memcpy(out + produced, digest.data(), n);
            produced += n;
        }
    }
    if (rc != kOk) {
        secureWipe(out, produced);
        return rc;
    }
    length = total;
    return kOk;
}

Result DeriveKey(const S2K* s2k, const uint8_t* password, uint32_t passwordLength, uint32_t length,
                 SecureBytes& out) {
    uint32_t size = length;
    out.assign(size, 0);
    Result rc = DeriveKey(out.data(), size, password, passwordLength, s2k);
    if (rc == kBufferTooSmallCrypto) {
        out.assign(size, 0);
        rc = DeriveKey(out.data(), size, password, passwordLength, s2k);
    }
    if (rc != kOk) {
        out.clear();
        return rc;
    }
    out.resize(size);
    return kOk;
}

SecureBytes PasswordBytes(const PasswordRecord& password) {
    SecureBytes bytes;
    auto take = [&bytes](const char* p, size_t n) {
        const void* zero = std::memchr(p, 0, n);
        if (zero != nullptr) n = static_cast<size_t>(static_cast<const char*>(zero) - p);
        n = std::min(n, kNarrowPasswordMax);
        bytes.assign(reinterpret_cast<const uint8_t*>(p), reinterpret_cast<const uint8_t*>(p) + n);
    };
    if (!password.narrow.empty()) {
        take(password.narrow.data(), password.narrow.size());
    } else if (!password.wide.empty()) {
        std::string utf8 = toUtf8(std::u16string_view(password.wide.data(), password.wide.size()));
        take(utf8.data(), utf8.size());
        secureWipe(utf8.data(), utf8.size());
    }
    return bytes;
}

}  // namespace vaultora
