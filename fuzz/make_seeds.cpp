// Writes the seed corpus of the fuzz target into the folder given as the argument: small valid
// archives (empty, with a tree, encrypted with the fuzz password) and one whose table is damaged.
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "archive/directory.h"
#include "archive/password_ops.h"
#include "crypto/key_block_params.h"
#include "fuzz_session.h"
#include "operations/check.h"
#include "platform/file.h"

using namespace vaultora;

namespace {

bool ok(Result rc, const char* what) {
    if (rc != kOk) std::fprintf(stderr, "seed: %s failed with %u\n", what, static_cast<unsigned>(rc));
    return rc == kOk;
}

bool addUnit(Vaultora& a, uint32_t folder, std::u16string_view name, uint32_t start, uint64_t size, uint32_t attributes,
             const std::vector<uint8_t>* inlineData = nullptr) {
    SecureBytes record = makeRecordWithAttributes(name, inlineData != nullptr ? static_cast<uint32_t>(inlineData->size()) : 0,
                                                  attributes);
    if (inlineData != nullptr) {
        std::memcpy(record.data() + unit::start(record.data()), inlineData->data(), inlineData->size());
    } else {
        unit::setStart(record.data(), start);
        unit::setSize(record.data(), size);
    }
    ChainBuffer room;
    return ok(findRoom(a, folder, room, record, nullptr), "findRoom") && ok(addRecord(room, record, nullptr), "addRecord") &&
           ok(a.writeDirectoryCluster(room, true), "writeDirectoryCluster");
}

// A small tree: a two-cluster file, a folder holding an inline file and an empty file.
bool fillTree(Vaultora& a) {
    uint32_t first = a.allocateCluster(kNoCluster);
    uint32_t second = a.allocateCluster(first);
    a.mutableCot()[first].next = second;
    std::string text;
    for (int i = 0; i < 40; ++i) text += "line " + std::to_string(i) + " of the archived file\n";
    const std::vector<uint8_t> part(text.begin(), text.end());
    if (!ok(a.writeDataCluster(first, part.data(), static_cast<uint32_t>(part.size()), false), "data") ||
        !ok(a.writeDataCluster(second, part.data(), static_cast<uint32_t>(part.size()), true), "data"))
        return false;
    if (!addUnit(a, 0, u"notes.txt", first, 2 * part.size(), kAttrArchive)) return false;
    uint32_t folder = a.allocateCluster(kNoCluster);
    if (!addUnit(a, 0, u"docs", folder, 0, kAttrFolder)) return false;
    const std::vector<uint8_t> small = {'h', 'e', 'l', 'l', 'o'};
    return addUnit(a, folder, u"tiny.txt", 0, 0, kAttrArchive, &small) && addUnit(a, folder, u"empty", 0, 0, kAttrArchive) &&
           addUnit(a, 0, u"notes.txt:info:$DATA", 0, 0, kAttrArchive, &small);
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: %s SEED_FOLDER\n", argv[0]);
        return 2;
    }
    const std::string folder = argv[1];
    fuzz::isolateEnvironment(folder + "/.env");
    fs::createDirectories(folder + "/.env", 0700);
    ArchiveHooks hooks;
    hooks.offerRecovery = OfferRecovery;
    setArchiveHooks(hooks);
    bool good = true;
    {
        Vaultora a(folder + "/empty.vra");
        good &= ok(a.create(nullptr, 0), "create") && ok(a.close(), "close");
    }
    {
        Vaultora a(folder + "/tree.vra");
        good &= ok(a.create(nullptr, 0), "create") && fillTree(a) && ok(a.close(), "close");
    }
    {
        Vaultora a(folder + "/encrypted.vra");
        KeyBlockParams params = DefaultKeyBlockParams();
        params.archiveAlg = 7;
        params.keyAlg = 7;
        params.iterationCount = 1;
        good &= ok(createWithPassword(a, params, PasswordRecord::fromUtf8(fuzz::kPassword)), "createWithPassword") &&
                fillTree(a) && ok(a.close(), "close");
    }
    // The tree archive with its table overwritten: opening it goes through recovery.
    std::vector<uint8_t> bytes;
    if (fs::readWholeFile(folder + "/tree.vra", bytes) && bytes.size() >= 68) {
        const uint64_t at = getU32(&bytes[24]) + getU64(&bytes[28]);
        for (uint64_t i = at; i < bytes.size(); ++i) bytes[i] = 0x5A;
        good &= fs::writeWholeFile(folder + "/damaged.vra", bytes.data(), bytes.size());
    }
    // Every seed must open and read (on a copy: closing commits).
    for (const char* name : {"empty.vra", "tree.vra", "encrypted.vra", "damaged.vra"}) {
        const std::string copy = folder + "/.env/check.vra";
        fs::copyFile(folder + "/" + name, copy);
        fuzz::SessionResult r = fuzz::openAndReadTree(copy, true);
        std::printf("seed %-14s open %u, check %u, units %zu\n", name, static_cast<unsigned>(r.open),
                    static_cast<unsigned>(r.check), r.units);
        good &= r.open == kOk && r.check == kOk;
        fs::removeTree(copy + ".vrt");
        fs::removeFile(copy);
    }
    fs::removeTree(folder + "/.env");
    return good ? 0 : 1;
}
