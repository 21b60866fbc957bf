#include "app/archive_probe.h"

#include "platform/file.h"

namespace vaultora {

bool probeArchiveHeader(const std::string& path, Header& out) {
    if (fs::isDirectory(path)) return false;
    File f;
    if (f.open(path, OpenMode::kRead) != 0) return false;
    std::array<uint8_t, 68> image{};
    auto reader = [&f](uint64_t off, uint8_t* buf, size_t n) { return f.readAt(off, buf, n); };
    return findHeader(reader, 0, out, image);
}

bool headerHasNoKeyBlocks(const Header& h) { return h.masterKeyOffset == h.dataOffset && !h.hasExtendedBlock(); }

}  // namespace vaultora
