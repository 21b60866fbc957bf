#include "app/password_file.h"

#include <cerrno>
#include <cstdlib>

#include "platform/file.h"

namespace vaultora {

std::optional<std::string> passwordFileFromEnvironment() {
    const char* v = std::getenv(kPasswordFileVariable);
    if (v == nullptr || *v == '\0') return std::nullopt;
    return std::string(v);
}

Result readPasswordFile(const std::string& path, PasswordRecord& out, std::string& reason) {
    if (fs::isDirectory(path)) {
        reason = fs::errorText(EISDIR);
        return kCannotOpen;
    }
    File f;
    if (int err = f.open(path, OpenMode::kRead); err != 0) {
        reason = fs::errorText(err > 0 ? err : EACCES);
        return kCannotOpen;
    }
    SecureString text;
    SecureBytes chunk(4096);
    uint64_t at = 0;
    for (;;) {
        long long n = f.readAt(at, chunk.data(), chunk.size());
        if (n < 0) {
            reason = fs::errorText(errno);
            return kCannotOpen;
        }
        if (n == 0) break;
        bool ended = false;
        for (long long i = 0; i < n; ++i) {
            if (chunk[static_cast<size_t>(i)] == '\n') {
                ended = true;
                break;
            }
            text.push_back(static_cast<char>(chunk[static_cast<size_t>(i)]));
        }
        at += static_cast<uint64_t>(n);
        if (ended) break;
    }
    if (!text.empty() && text.back() == '\r') text.pop_back();
    out = PasswordRecord::fromUtf8(std::string_view(text.data(), text.size()));
    return kOk;
}

}  // namespace vaultora
