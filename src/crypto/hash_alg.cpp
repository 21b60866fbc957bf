#include "crypto/hash_alg.h"

#include <iterator>
#include <new>

#include <botan/hash.h>

#include "platform/secure.h"

namespace vaultora {

namespace {

std::unique_ptr<Botan::HashFunction> botanHash(const char* name) {
    try {
        return Botan::HashFunction::create(name);
    } catch (...) {
        return nullptr;
    }
}

using Factory = cHashAlg* (*)();

template <class T>
cHashAlg* make() {
    return new (std::nothrow) T();
}

struct Row {
    uint32_t id;
    Factory factory;
    uint32_t digestBytes;
};

const Row kHashAlgTable[] = {
    {kHashMd5, make<cHashMD5>, 16},         {kHashSha1, make<cHashSHA1>, 20},
    {kHashRipemd160, make<cHashRipemd>, 20}, {kHashSha256Own, make<cHashSHA256>, 32},
    {kHashSha256, make<cHashSHA256>, 32},   {kHashSha512, make<cHashSHA512>, 64},
};

const uint32_t kHashAlgUserList[] = {kHashMd5, kHashSha1, kHashRipemd160, kHashSha256Own, kHashSha512};

const Row* findRow(uint32_t id) {
    for (const Row& r : kHashAlgTable)
        if (r.id == id) return &r;
    return nullptr;
}

}  // namespace

cHashAlg::~cHashAlg() = default;

cHashBotan::cHashBotan(std::unique_ptr<Botan::HashFunction> h) : m_hash(std::move(h)) {}

cHashBotan::~cHashBotan() {
    if (m_hash) m_hash->clear();
}

uint32_t cHashBotan::DigestSize() const {
    return m_hash ? static_cast<uint32_t>(m_hash->output_length()) : cHashAlg::DigestSize();
}

Result cHashBotan::Update(const uint8_t* data, uint32_t length) {
    if (!m_hash) return kHashUnavailable;
    if (length == 0) return kOk;
    try {
        m_hash->update(data, length);
    } catch (...) {
        return kHashUnavailable;
    }
    return kOk;
}

Result cHashBotan::Final(uint8_t* digest) {
    if (!m_hash) return kHashUnavailable;
    if (digest == nullptr) return kMissingOutput;
    try {
        m_hash->final(digest);
    } catch (...) {
        return kHashUnavailable;
    }
    return kOk;
}

Result cHashBotan::Reset() {
    if (!m_hash) return kHashUnavailable;
    m_hash->clear();
    return kOk;
}

cHashMD5::cHashMD5() : cHashBotan(botanHash("MD5")) {}
cHashSHA1::cHashSHA1() : cHashBotan(botanHash("SHA-1")) {}
cHashRipemd::cHashRipemd() : cHashBotan(botanHash("RIPEMD-160")) {}
cHashSHA256::cHashSHA256() : cHashBotan(botanHash("SHA-256")) {}
cHashSHA512::cHashSHA512() : cHashBotan(botanHash("SHA-512")) {}

Result CreateHashAlg(uint32_t id, std::unique_ptr<cHashAlg>& out) {
    out.reset();
    const Row* row = findRow(id);
    if (row == nullptr) return kUnknownHash;
    out.reset(row->factory());
    if (!out) return kCipherNoMemory;
    Result rc = out->Reset();
    if (rc != kOk) out.reset();
    return rc;
}

Result HashAlgDigestSize(uint32_t id, uint32_t& size) {
    const Row* row = findRow(id);
    if (row == nullptr) return kUnknownHash;
    size = row->digestBytes;
    return kOk;
}

void ListHashAlgs(uint32_t& count, const uint32_t*& ids) {
    count = static_cast<uint32_t>(std::size(kHashAlgUserList));
    ids = kHashAlgUserList;
}

const char* HashAlgName(uint8_t id) {
    if (id >= 128) return id == kHashSha256Own ? "SHA-256" : nullptr;
    switch (id) {
        case 1: return "MD5";
        case 2: return "SHA1";
        case 3: return "RIPEMD160";
        case 5: return "MD2";
        case 8: return "SHA-256";
        case 9: return "SHA-384";
        case 10: return "SHA-512";
        case 11: return "SHA-224";
        default: return nullptr;
    }
}

Result HashBuffer(uint32_t id, uint8_t* digest, const uint8_t* data, uint32_t length) {
    if (digest == nullptr) return kMissingOutput;
    std::unique_ptr<cHashAlg> h;
    Result rc = CreateHashAlg(id, h);
    if (rc == kOk) rc = h->Update(data, length);
    if (rc == kOk) rc = h->Final(digest);
    return rc;
}

Result HashBuffer(uint8_t id, const uint8_t* data, size_t length, std::vector<uint8_t>& digest) {
    std::unique_ptr<cHashAlg> h;
    Result rc = CreateHashAlg(id, h);
    if (rc != kOk) return rc;
    digest.assign(h->DigestSize(), 0);
    // Feed in pieces so that buffers over 4 GiB are hashed whole.
    while (rc == kOk && length > 0) {
        uint32_t piece = length > 0x40000000u ? 0x40000000u : static_cast<uint32_t>(length);
        rc = h->Update(data, piece);
        data += piece;
        length -= piece;
    }
    if (rc == kOk) rc = h->Final(digest.data());
    return rc;
}

}  // namespace vaultora
