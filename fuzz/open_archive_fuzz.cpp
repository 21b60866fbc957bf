// Fuzz target: the input bytes are an archive file. It is opened with the fuzz password (a
// damaged table leads to recovery, which is accepted), its whole tree and every body are read,
// the consistency check runs with every repair accepted, and the archive is closed (committed).
// Nothing may crash, hang or leak, whatever the bytes.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>

#include "fuzz_session.h"
#include "operations/check.h"
#include "platform/file.h"

namespace {

std::string g_folder;

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    const char* tmp = std::getenv("TMPDIR");
    std::string base = std::string(tmp != nullptr && *tmp != 0 ? tmp : "/tmp") + "/vaultora-fuzz-XXXXXX";
    if (mkdtemp(base.data()) == nullptr) std::abort();
    g_folder = base;
    vaultora::fuzz::isolateEnvironment(g_folder);
    vaultora::ArchiveHooks hooks;
    hooks.offerRecovery = vaultora::OfferRecovery;
    vaultora::setArchiveHooks(hooks);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const std::string path = g_folder + "/input.vra";
    vaultora::fs::removeTree(path + ".vrt");
    if (!vaultora::fs::writeWholeFile(path, data, size)) std::abort();
    (void)vaultora::fuzz::openAndReadTree(path, true);
    vaultora::fs::removeTree(path + ".vrt");
    vaultora::fs::removeFile(path);
    return 0;
}
