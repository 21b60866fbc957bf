#pragma once
// The file layer: every read, write, rename, truncate and sync of the engine goes through here, so
// that locking has one home and tests can inject faults at any mutating step.
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace vaultora {

// Fault injection for crash and failure tests. Every mutating file operation (write, truncate,
// sync, rename, unlink) counts one step. When the step count reaches the kill point the process is
// killed with SIGKILL before the step is carried out; when it reaches the fail point the step
// fails with the chosen errno instead. Both can also be set from the environment variables
// VAULTORA_FAULT_KILL_AT=N and VAULTORA_FAULT_FAIL_AT=N[:errno] (read once at first use).
namespace fault {
void setKillAt(long step);           // 0 disables
void setFailAt(long step, int err);  // 0 disables; err defaults to EIO when 0
void setFailFrom(long step, int err);  // every step from `step` on fails (a full disk)
long steps();                        // steps counted so far
void reset();                        // zero the counter and disable both points
// Counts one step; returns 0 to go ahead or the errno the step must fail with.
int step();
}  // namespace fault

enum class OpenMode {
    kRead,          // existing file, read only
    kReadWrite,     // existing file, read and write
    kCreateNew,     // must not exist, read and write
    kOpenAlways,    // create when missing, read and write
    kCreateAlways,  // create or truncate, read and write
};

// Errno value that open() returns when the whole-file lock is held by another open file
// description (the "sharing violation").
inline constexpr int kSharingViolation = -1;

class File {
public:
    File() = default;
    ~File();
    File(const File&) = delete;
    File& operator=(const File&) = delete;
    File(File&& o) noexcept;
    File& operator=(File&& o) noexcept;

    // Opens the file. With `lock`, a read-write open takes a whole-file write lock and a read-only
    // open a read lock (open-file-description locks); a conflicting lock closes the file again and
    // returns kSharingViolation. Returns 0 or an errno value.
    int open(const std::string& path, OpenMode mode, bool lock = false);
    void close();
    bool isOpen() const { return m_fd >= 0; }
    int fd() const { return m_fd; }

    // Size of the file, or -1.
    int64_t size() const;
    // Reads up to n bytes at off; returns the number read (short at end of file) or -1.
    long long readAt(uint64_t off, void* buf, size_t n) const;
    // Reads exactly n bytes; false on error or short read.
    bool readExact(uint64_t off, void* buf, size_t n) const;
    // Writes all n bytes at off; false on failure (errno in lastError()).
    bool writeAt(uint64_t off, const void* buf, size_t n);
    bool truncate(uint64_t length);
    bool sync();
    int lastError() const { return m_err; }

private:
    int m_fd = -1;
    mutable int m_err = 0;
};

// Whole-path helpers, all counted as fault steps where they change something.
namespace fs {
bool exists(const std::string& path);
bool isDirectory(const std::string& path);
int64_t fileSize(const std::string& path);  // -1 when missing
bool removeFile(const std::string& path);   // true when the path is gone afterwards
bool renameFile(const std::string& from, const std::string& to);
bool createDirectories(const std::string& path, unsigned mode = 0700);
// Removes a folder and everything in it; true when it is gone.
bool removeTree(const std::string& path);
bool copyFile(const std::string& from, const std::string& to);
// Names in a folder (without "." and ".."); empty when it cannot be read.
std::vector<std::string> listDirectory(const std::string& path);
// Creates or truncates the file, writes the bytes and syncs them.
bool writeWholeFile(const std::string& path, const void* data, size_t n);
bool readWholeFile(const std::string& path, std::vector<uint8_t>& out);
// Text of an errno value.
std::string errorText(int err);
}  // namespace fs

}  // namespace vaultora
