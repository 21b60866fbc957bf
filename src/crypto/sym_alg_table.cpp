#include "crypto/sym_alg_table.h"

#include <new>

#include "crypto/sym_alg.h"
#include "crypto/sym_alg_ciphers.h"

namespace vaultora {

namespace {

using Factory = std::unique_ptr<cSymAlg> (*)(const uint8_t* key, int32_t keyLength);

template <class T>
std::unique_ptr<cSymAlg> make(const uint8_t* key, int32_t keyLength) {
    auto alg = std::unique_ptr<T>(new (std::nothrow) T());
    if (!alg || !alg->create(key, keyLength)) return nullptr;
    return alg;
}

template <>
std::unique_ptr<cSymAlg> make<cAlgDummy>(const uint8_t*, int32_t) {
    return std::unique_ptr<cSymAlg>(new (std::nothrow) cAlgDummy());
}

struct Row {
    uint32_t id;
    Factory factory;
    uint32_t keyBytes;     // key bytes used
    uint32_t maxKeyBytes;  // largest key the class takes
    uint32_t blockBytes;
};

// Rows in table order; the order only matters for lookups by identifier, which are unique.
const Row kSymAlgTable[] = {
    {kSymNone, make<cAlgDummy>, 0, 0, 0},
    {kSymIdea, make<cAlgIdea>, 16, 16, 8},
    {kSym3des, make<cAlg3des>, 24, 24, 8},
    {kSymCast5, make<cAlgCast>, 16, 16, 8},
    {kSymBlowfish, make<cAlgBfish>, 16, 56, 8},
    {kSymBlowfish256, make<cAlgBfish>, 32, 56, 8},
    {kSymBlowfish448, make<cAlgBfish>, 56, 56, 8},
    {kSymTwofish2, make<cAlgTFish>, 32, 32, 16},
    {kSymTwofish, make<cAlgTFish>, 32, 32, 16},
    {kSymGost, make<cAlgGOST>, 32, 32, 8},
    {kSymRijndael, make<cAlgRIJN>, 32, 32, 16},
    {kSymAes128, make<cAlgRIJN>, 16, 32, 16},
    {kSymAes192, make<cAlgRIJN>, 24, 32, 16},
    {kSymAes256, make<cAlgRIJN>, 32, 32, 16},
    {kSymSerpent, make<cAlgSerpent>, 32, 32, 16},
    {kSymDes, make<cAlgDes>, 8, 8, 8},
};

const uint32_t kSymAlgUserList[] = {kSymIdea,        kSym3des,        kSymCast5,   kSymBlowfish,
                                    kSymBlowfish256, kSymBlowfish448, kSymTwofish2, kSymGost,
                                    kSymRijndael,    kSymSerpent,     kSymNone};

const Row* findRow(uint32_t id) {
    for (const Row& r : kSymAlgTable)
        if (r.id == id) return &r;
    return nullptr;
}

}  // namespace

Result CreateSymAlg(uint32_t id, const uint8_t* key, int32_t keyLength, std::unique_ptr<cSymAlg>& out) {
    out.reset();
    const Row* row = findRow(id);
    if (row == nullptr) return kUnknownCipher;
    out = row->factory(key, keyLength);
    return out ? kOk : kCipherNoMemory;
}

uint32_t SymAlgKeySize(uint32_t id, uint32_t& maximumKeySize) {
    const Row* row = findRow(id);
    if (row == nullptr) return 0;
    maximumKeySize = row->maxKeyBytes;
    return row->keyBytes;
}

uint32_t SymAlgKeySize(uint32_t id) {
    const Row* row = findRow(id);
    return row ? row->keyBytes : 0;
}

uint32_t SymAlgBlockSize(uint32_t id) {
    const Row* row = findRow(id);
    return row ? row->blockBytes : 0;
}

bool SymAlgKnown(uint32_t id) { return findRow(id) != nullptr; }

void ListSymAlgs(uint32_t& count, const uint32_t*& ids) {
    count = static_cast<uint32_t>(std::size(kSymAlgUserList));
    ids = kSymAlgUserList;
}

const char* SymAlgName(uint8_t id) {
    if (id >= 128) {
        switch (id) {
            case kSymBlowfish256: return "Blowfish 256";
            case kSymBlowfish448: return "Blowfish 448";
            case kSymDes: return "DES";
            case kSymGost: return "GOST";
            case kSymRijndael: return "RIJNDAEL";
            case kSymSerpent: return "SERPENT";
            case kSymTwofish2: return "TWOFISH";
            default: return nullptr;
        }
    }
    switch (id) {
        case 0: return "Plaintext or unencrypted data";
        case 1: return "IDEA";
        case 2: return "Triple-DES";
        case 3: return "CAST5";
        case 4: return "Blowfish";
        case 5: return "SAFER-SK128";
        case 6: return "2-Key Triple-DES";
        case 7: return "AES-128";
        case 8: return "AES-192";
        case 9: return "AES-256";
        case 10: return "TWOFISH";
        case 100: return "40BitRC2";
        case 101: return "128BitRC2";
        default: return nullptr;
    }
}

}  // namespace vaultora
