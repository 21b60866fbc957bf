#include "platform/file.h"

#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <mutex>

namespace vaultora {

namespace fault {
namespace {
std::atomic<long> g_steps{0};
std::atomic<long> g_killAt{0};
std::atomic<long> g_failAt{0};
std::atomic<long> g_failFrom{0};
std::atomic<int> g_failErr{EIO};
std::once_flag g_envOnce;

void readEnvironment() {
    if (const char* k = std::getenv("VAULTORA_FAULT_KILL_AT")) g_killAt = std::atol(k);
    if (const char* f = std::getenv("VAULTORA_FAULT_FAIL_AT")) {
        g_failAt = std::atol(f);
        if (const char* c = std::strchr(f, ':')) g_failErr = std::atoi(c + 1);
    }
}
}  // namespace

void setKillAt(long step) { std::call_once(g_envOnce, readEnvironment); g_killAt = step; }
void setFailAt(long step, int err) {
    std::call_once(g_envOnce, readEnvironment);
    g_failAt = step;
    g_failErr = err != 0 ? err : EIO;
}
void setFailFrom(long step, int err) {
    std::call_once(g_envOnce, readEnvironment);
    g_failFrom = step;
    g_failErr = err != 0 ? err : EIO;
}
long steps() { return g_steps; }
void reset() {
    std::call_once(g_envOnce, readEnvironment);
    g_steps = 0;
    g_killAt = 0;
    g_failAt = 0;
    g_failFrom = 0;
}
int step() {
    std::call_once(g_envOnce, readEnvironment);
    long n = ++g_steps;
    if (g_killAt != 0 && n >= g_killAt) ::kill(::getpid(), SIGKILL);
    if ((g_failAt != 0 && n == g_failAt) || (g_failFrom != 0 && n >= g_failFrom)) return g_failErr;
    return 0;
}
}  // namespace fault

File::~File() { close(); }

File::File(File&& o) noexcept : m_fd(o.m_fd), m_err(o.m_err) { o.m_fd = -1; }

File& File::operator=(File&& o) noexcept {
    if (this != &o) {
        close();
        m_fd = o.m_fd;
        m_err = o.m_err;
        o.m_fd = -1;
    }
    return *this;
}

int File::open(const std::string& path, OpenMode mode, bool lock) {
    close();
    int flags = O_CLOEXEC;
    switch (mode) {
        case OpenMode::kRead: flags |= O_RDONLY; break;
        case OpenMode::kReadWrite: flags |= O_RDWR; break;
        case OpenMode::kCreateNew: flags |= O_RDWR | O_CREAT | O_EXCL; break;
        case OpenMode::kOpenAlways: flags |= O_RDWR | O_CREAT; break;
        case OpenMode::kCreateAlways: flags |= O_RDWR | O_CREAT | O_TRUNC; break;
    }
    if (mode == OpenMode::kCreateAlways) {
        if (int e = fault::step()) return m_err = e;
    }
    int fd = ::open(path.c_str(), flags, 0600);
    if (fd < 0) return m_err = errno;
    if (lock) {
        struct flock fl {};
        fl.l_type = mode == OpenMode::kRead ? F_RDLCK : F_WRLCK;
        fl.l_whence = SEEK_SET;
        fl.l_start = 0;
        fl.l_len = 0;
        if (::fcntl(fd, F_OFD_SETLK, &fl) != 0) {
            int e = errno;
            ::close(fd);
            return m_err = (e == EAGAIN || e == EACCES) ? kSharingViolation : e;
        }
    }
    m_fd = fd;
    m_err = 0;
    return 0;
}

void File::close() {
    if (m_fd >= 0) {
        ::close(m_fd);
        m_fd = -1;
    }
}

int64_t File::size() const {
    struct stat st {};
    if (m_fd < 0 || ::fstat(m_fd, &st) != 0) {
        m_err = m_fd < 0 ? EBADF : errno;
        return -1;
    }
    return st.st_size;
}

long long File::readAt(uint64_t off, void* buf, size_t n) const {
    if (m_fd < 0) { m_err = EBADF; return -1; }
    size_t done = 0;
    auto* p = static_cast<uint8_t*>(buf);
    while (done < n) {
        ssize_t r = ::pread(m_fd, p + done, n - done, static_cast<off_t>(off + done));
        if (r < 0) {
            if (errno == EINTR) continue;
            m_err = errno;
            return -1;
        }
        if (r == 0) break;
        done += static_cast<size_t>(r);
    }
    return static_cast<long long>(done);
}

bool File::readExact(uint64_t off, void* buf, size_t n) const {
    long long r = readAt(off, buf, n);
    return r >= 0 && static_cast<size_t>(r) == n;
}

bool File::writeAt(uint64_t off, const void* buf, size_t n) {
    if (m_fd < 0) { m_err = EBADF; return false; }
    if (int e = fault::step()) { m_err = e; return false; }
    size_t done = 0;
    auto* p = static_cast<const uint8_t*>(buf);
    while (done < n) {
        ssize_t r = ::pwrite(m_fd, p + done, n - done, static_cast<off_t>(off + done));
        if (r < 0) {
            if (errno == EINTR) continue;
            m_err = errno;
            return false;
        }
        done += static_cast<size_t>(r);
    }
    return true;
}

bool File::truncate(uint64_t length) {
    if (m_fd < 0) { m_err = EBADF; return false; }
    if (int e = fault::step()) { m_err = e; return false; }
    if (::ftruncate(m_fd, static_cast<off_t>(length)) != 0) { m_err = errno; return false; }
    return true;
}

bool File::sync() {
    if (m_fd < 0) { m_err = EBADF; return false; }
    if (int e = fault::step()) { m_err = e; return false; }
    if (::fdatasync(m_fd) != 0) { m_err = errno; return false; }
    return true;
}

namespace fs {

bool exists(const std::string& path) {
    struct stat st {};
    return ::lstat(path.c_str(), &st) == 0;
}

bool isDirectory(const std::string& path) {
    struct stat st {};
    return ::stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

int64_t fileSize(const std::string& path) {
    struct stat st {};
    if (::stat(path.c_str(), &st) != 0) return -1;
    return st.st_size;
}

bool removeFile(const std::string& path) {
    if (!exists(path)) return true;
    if (int e = fault::step()) { errno = e; return false; }
    if (::unlink(path.c_str()) != 0 && errno != ENOENT) return false;
    return true;
}

bool renameFile(const std::string& from, const std::string& to) {
    if (int e = fault::step()) { errno = e; return false; }
    return ::rename(from.c_str(), to.c_str()) == 0;
}

bool createDirectories(const std::string& path, unsigned mode) {
    if (path.empty()) return false;
    if (isDirectory(path)) return true;
    std::string cur;
    size_t pos = 0;
    while (pos != std::string::npos) {
        size_t next = path.find('/', pos + 1);
        cur = path.substr(0, next);
        if (!cur.empty() && !isDirectory(cur)) {
            if (::mkdir(cur.c_str(), mode) != 0 && errno != EEXIST) return false;
        }
        pos = next;
    }
    return isDirectory(path);
}

bool removeTree(const std::string& path) {
    struct stat st {};
    if (::lstat(path.c_str(), &st) != 0) return errno == ENOENT;
    if (S_ISDIR(st.st_mode)) {
        if (DIR* d = ::opendir(path.c_str())) {
            while (dirent* e = ::readdir(d)) {
                std::string n = e->d_name;
                if (n == "." || n == "..") continue;
                removeTree(path + "/" + n);
            }
            ::closedir(d);
        }
        if (int e = fault::step()) { errno = e; return false; }
        return ::rmdir(path.c_str()) == 0 || errno == ENOENT;
    }
    return removeFile(path);
}

std::vector<std::string> listDirectory(const std::string& path) {
    std::vector<std::string> names;
    if (DIR* d = ::opendir(path.c_str())) {
        while (dirent* e = ::readdir(d)) {
            std::string n = e->d_name;
            if (n != "." && n != "..") names.push_back(n);
        }
        ::closedir(d);
    }
    return names;
}

bool copyFile(const std::string& from, const std::string& to) {
    std::vector<uint8_t> data;
    if (!readWholeFile(from, data)) return false;
    return writeWholeFile(to, data.data(), data.size());
}

bool writeWholeFile(const std::string& path, const void* data, size_t n) {
    File f;
    if (f.open(path, OpenMode::kCreateAlways) != 0) return false;
    return f.writeAt(0, data, n) && f.sync();
}

bool readWholeFile(const std::string& path, std::vector<uint8_t>& out) {
    File f;
    if (f.open(path, OpenMode::kRead) != 0) return false;
    int64_t sz = f.size();
    if (sz < 0) return false;
    out.resize(static_cast<size_t>(sz));
    return f.readExact(0, out.data(), out.size());
}

std::string errorText(int err) {
    if (err == kSharingViolation) return "The file is in use by another process";
    return std::strerror(err);
}

}  // namespace fs
}  // namespace vaultora
