#include "platform/paths.h"

#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <cstdlib>

#include "platform/file.h"

namespace vaultora::paths {

namespace {

std::string env(const char* name) {
    const char* v = std::getenv(name);
    return v != nullptr ? std::string(v) : std::string();
}

std::string home() {
    std::string h = env("HOME");
    return h.empty() ? std::string("/tmp") : h;
}

std::string xdg(const char* var, const char* fallback) {
    std::string v = env(var);
    if (!v.empty() && v[0] == '/') return v;
    return home() + fallback;
}

// Creates a private folder, refusing one that another user owns or others can enter.
bool makePrivateFolder(const std::string& path) {
    ::mkdir(path.c_str(), 0700);
    struct stat st {};
    if (::lstat(path.c_str(), &st) != 0 || !S_ISDIR(st.st_mode)) return false;
    if (st.st_uid != ::getuid()) return false;
    if ((st.st_mode & 0077) != 0 && ::chmod(path.c_str(), 0700) != 0) return false;
    return true;
}

}  // namespace

std::string runtimeFolder() {
    std::string base = env("XDG_RUNTIME_DIR");
    std::string path;
    if (!base.empty() && fs::isDirectory(base)) {
        path = base + "/vaultora";
    } else {
        std::string tmp = env("TMPDIR");
        if (tmp.empty()) tmp = "/tmp";
        path = tmp + "/vaultora-" + std::to_string(::getuid());
    }
    return makePrivateFolder(path) ? path : std::string();
}

std::string crashFolder() { return xdg("XDG_STATE_HOME", "/.local/state") + "/vaultora/~VRACrash"; }
std::string configFolder() { return xdg("XDG_CONFIG_HOME", "/.config") + "/vaultora"; }
std::string dataFolder() { return xdg("XDG_DATA_HOME", "/.local/share") + "/vaultora"; }

std::string executableFolder() {
    char buf[PATH_MAX];
    ssize_t n = ::readlink("/proc/self/exe", buf, sizeof buf - 1);
    if (n <= 0) return ".";
    std::string p(buf, static_cast<size_t>(n));
    size_t slash = p.rfind('/');
    return slash == std::string::npos ? std::string(".") : p.substr(0, slash);
}

}  // namespace vaultora::paths
