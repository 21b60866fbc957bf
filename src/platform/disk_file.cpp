#include "platform/disk_file.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <fnmatch.h>
#include <limits.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

#include "platform/file.h"

namespace vaultora {

namespace {

constexpr char kUserPrefix[] = "user.";
constexpr size_t kUserPrefixLength = sizeof kUserPrefix - 1;

uint64_t toFileTime(int64_t sec, long nsec) {
    const int64_t t = sec * 10000000ll + nsec / 100 + static_cast<int64_t>(kUnixEpochFileTime);
    return t < 0 ? 0 : static_cast<uint64_t>(t);
}

struct timespec toTimespec(uint64_t filetime) {
    struct timespec ts {};
    const int64_t rel = static_cast<int64_t>(filetime) - static_cast<int64_t>(kUnixEpochFileTime);
    int64_t sec = rel / 10000000ll;
    int64_t rest = rel % 10000000ll;
    if (rest < 0) { rest += 10000000ll; --sec; }
    ts.tv_sec = static_cast<time_t>(sec);
    ts.tv_nsec = static_cast<long>(rest * 100);
    return ts;
}

std::string baseName(const std::string& path) {
    const size_t slash = path.find_last_of('/');
    return slash == std::string::npos ? path : path.substr(slash + 1);
}

}  // namespace

bool diskInfo(const std::string& path, DiskInfo& out) {
    out = DiskInfo{};
    struct statx sx {};
    if (::statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS | STATX_BTIME, &sx) != 0) return false;
    const uint32_t mode = sx.stx_mode;
    if (S_ISREG(mode)) out.kind = DiskKind::kFile;
    else if (S_ISDIR(mode)) out.kind = DiskKind::kFolder;
    else if (S_ISLNK(mode)) out.kind = DiskKind::kSymlink;
    else out.kind = DiskKind::kOther;
    out.mode = mode;
    out.modified = toFileTime(sx.stx_mtime.tv_sec, sx.stx_mtime.tv_nsec);
    out.accessed = toFileTime(sx.stx_atime.tv_sec, sx.stx_atime.tv_nsec);
    out.created = (sx.stx_mask & STATX_BTIME) != 0 ? toFileTime(sx.stx_btime.tv_sec, sx.stx_btime.tv_nsec)
                                                   : out.modified;
    out.size = out.kind == DiskKind::kFolder ? 0 : sx.stx_size;
    uint32_t attributes = 0x8000u | (mode << 16);
    if (out.kind == DiskKind::kFolder) attributes |= 0x10;
    else attributes |= 0x20;
    if ((mode & S_IWUSR) == 0 && out.kind != DiskKind::kSymlink) attributes |= 0x01;
    const std::string name = baseName(path);
    if (!name.empty() && name[0] == '.' && name != "." && name != "..") attributes |= 0x02;
    out.attributes = attributes;
    return true;
}

uint64_t currentFileTime() {
    struct timespec ts {};
    ::clock_gettime(CLOCK_REALTIME, &ts);
    return toFileTime(ts.tv_sec, ts.tv_nsec);
}

std::vector<std::string> listMatching(const std::string& folder, const std::string& pattern) {
    std::vector<std::string> names;
    if (!hasWildcard(pattern)) {
        struct stat st {};
        if (::lstat((folder + "/" + pattern).c_str(), &st) == 0) names.push_back(pattern);
        return names;
    }
    if (DIR* d = ::opendir(folder.empty() ? "/" : folder.c_str())) {
        while (dirent* e = ::readdir(d)) {
            const char* n = e->d_name;
            if (std::strcmp(n, ".") == 0 || std::strcmp(n, "..") == 0) continue;
            if (::fnmatch(pattern.c_str(), n, 0) == 0) names.emplace_back(n);
        }
        ::closedir(d);
    }
    std::sort(names.begin(), names.end());
    return names;
}

bool hasWildcard(const std::string& name) { return name.find_first_of("*?") != std::string::npos; }

std::string fullPath(const std::string& path) {
    std::string folder = ".";
    std::string name = path;
    const size_t slash = path.find_last_of('/');
    if (slash != std::string::npos) {
        folder = slash == 0 ? "/" : path.substr(0, slash);
        name = path.substr(slash + 1);
    }
    char buf[PATH_MAX];
    if (::realpath(folder.c_str(), buf) == nullptr) return {};
    std::string out = buf;
    if (name.empty() || name == ".") return out;
    if (out != "/") out += '/';
    return out + name;
}

bool listStreams(const std::string& path, std::vector<std::string>& names) {
    names.clear();
    ssize_t n = ::llistxattr(path.c_str(), nullptr, 0);
    if (n <= 0) return n == 0;
    std::vector<char> buf(static_cast<size_t>(n));
    n = ::llistxattr(path.c_str(), buf.data(), buf.size());
    if (n < 0) return false;
    for (size_t i = 0; i < static_cast<size_t>(n);) {
        const char* entry = buf.data() + i;
        const size_t len = ::strnlen(entry, static_cast<size_t>(n) - i);
        if (len > kUserPrefixLength && std::strncmp(entry, kUserPrefix, kUserPrefixLength) == 0)
            names.emplace_back(entry + kUserPrefixLength, len - kUserPrefixLength);
        i += len + 1;
    }
    return true;
}

bool readStream(const std::string& path, const std::string& name, SecureBytes& out) {
    const std::string full = kUserPrefix + name;
    for (int attempt = 0; attempt < 4; ++attempt) {
        ssize_t n = ::lgetxattr(path.c_str(), full.c_str(), nullptr, 0);
        if (n < 0) return false;
        out.assign(static_cast<size_t>(n), 0);
        if (n == 0) return true;
        ssize_t got = ::lgetxattr(path.c_str(), full.c_str(), out.data(), out.size());
        if (got >= 0) {
            out.resize(static_cast<size_t>(got));
            return true;
        }
        if (errno != ERANGE) return false;  // grew meanwhile: ask again
    }
    return false;
}

int writeStream(const std::string& path, const std::string& name, const uint8_t* data, size_t n) {
    if (int e = fault::step()) return e;
    const std::string full = kUserPrefix + name;
    static const uint8_t kEmpty = 0;
    if (::lsetxattr(path.c_str(), full.c_str(), n == 0 ? &kEmpty : data, n, 0) != 0) return errno;
    return 0;
}

bool streamsUnsupported(int err) { return err == ENOTSUP || err == E2BIG || err == ENOSPC || err == ERANGE; }

bool readLink(const std::string& path, std::string& target) {
    std::vector<char> buf(256);
    for (;;) {
        ssize_t n = ::readlink(path.c_str(), buf.data(), buf.size());
        if (n < 0) return false;
        if (static_cast<size_t>(n) < buf.size()) {
            target.assign(buf.data(), static_cast<size_t>(n));
            return true;
        }
        buf.resize(buf.size() * 2);
    }
}

int makeSymlink(const std::string& target, const std::string& path) {
    if (int e = fault::step()) return e;
    struct stat st {};
    if (::lstat(path.c_str(), &st) == 0 && !S_ISDIR(st.st_mode)) ::unlink(path.c_str());
    if (::symlink(target.c_str(), path.c_str()) != 0) return errno;
    return 0;
}

int setFileTimes(const std::string& path, uint64_t accessed, uint64_t modified) {
    struct timespec ts[2] = {toTimespec(accessed), toTimespec(modified)};
    if (::utimensat(AT_FDCWD, path.c_str(), ts, AT_SYMLINK_NOFOLLOW) != 0) return errno;
    return 0;
}

int applyAttributes(const std::string& path, uint32_t attributes) {
    struct stat st {};
    if (::lstat(path.c_str(), &st) != 0) return errno;
    if (S_ISLNK(st.st_mode)) return 0;
    mode_t mode = st.st_mode & 07777;
    if ((attributes & 0x8000) != 0) {
        mode = static_cast<mode_t>((attributes >> 16) & 07777);
    } else if ((attributes & 0x01) != 0) {
        mode &= static_cast<mode_t>(~(S_IWUSR | S_IWGRP | S_IWOTH));
    } else {
        mode |= S_IWUSR;
    }
    if (::chmod(path.c_str(), mode) != 0) return errno;
    return 0;
}

bool isReadOnly(const std::string& path) {
    struct stat st {};
    return ::lstat(path.c_str(), &st) == 0 && !S_ISLNK(st.st_mode) && (st.st_mode & S_IWUSR) == 0;
}

int makeWritable(const std::string& path) {
    struct stat st {};
    if (::lstat(path.c_str(), &st) != 0) return errno;
    if (::chmod(path.c_str(), (st.st_mode & 07777) | S_IWUSR) != 0) return errno;
    return 0;
}

int makeFolders(const std::string& path) {
    if (fs::createDirectories(path, 0777)) return 0;
    return errno != 0 ? errno : EIO;
}

bool heldOpenForWriting(int fd) {
    if (fd < 0) return false;
    if (::fcntl(fd, F_SETLEASE, F_RDLCK) == 0) {
        ::fcntl(fd, F_SETLEASE, F_UNLCK);
        return false;
    }
    return errno == EAGAIN;
}

}  // namespace vaultora
