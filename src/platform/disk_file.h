#pragma once
// The disk side of adding and extracting: what a file on a Linux disk looks like in archive terms
// (attributes, FILETIME times, size), extended attributes as named streams, symbolic links, times
// and permissions, and the "held open for writing" test.
//
// Attributes: the low 16 bits carry the archive's attribute bits (0x10 folder, 0x20 archive for
// regular files and links, 0x01 read-only when the owner may not write, 0x02 hidden for names
// starting with '.'); bit 0x8000 says the high 16 bits hold the POSIX st_mode (type and
// permission bits).
#include <cstdint>
#include <string>
#include <vector>

#include "platform/secure.h"

namespace vaultora {

enum class DiskKind { kMissing, kFile, kFolder, kSymlink, kOther };

struct DiskInfo {
    DiskKind kind = DiskKind::kMissing;
    uint32_t attributes = 0;
    uint64_t created = 0;   // FILETIME: birth time when the file system has one, else modification
    uint64_t modified = 0;
    uint64_t accessed = 0;
    uint64_t size = 0;      // a link's size is the length of its target
    uint32_t mode = 0;      // st_mode
    bool isFolder() const { return kind == DiskKind::kFolder; }
};

inline constexpr uint64_t kUnixEpochFileTime = 116444736000000000ull;
inline constexpr uint32_t kModeLink = 0120000;     // S_IFLNK
inline constexpr uint32_t kModeTypeMask = 0170000; // S_IFMT

// Information of the path itself (links are not followed). False when it does not exist or
// cannot be read.
bool diskInfo(const std::string& path, DiskInfo& out);
// The current time as FILETIME.
uint64_t currentFileTime();

// Names in `folder` that match the wildcard `pattern` ('*' and '?'), sorted by name bytes.
std::vector<std::string> listMatching(const std::string& folder, const std::string& pattern);
bool hasWildcard(const std::string& name);
// The absolute path with "." / ".." and links of the folder part resolved; the last component
// is kept as it is. Empty when the folder cannot be resolved.
std::string fullPath(const std::string& path);

// Named streams: extended attributes of the "user." namespace, listed without the prefix.
bool listStreams(const std::string& path, std::vector<std::string>& names);
bool readStream(const std::string& path, const std::string& name, SecureBytes& out);
// Returns 0 or the errno value of the refusal.
int writeStream(const std::string& path, const std::string& name, const uint8_t* data, size_t n);
// True when a refusal means that the file system cannot hold the stream at all.
bool streamsUnsupported(int err);

bool readLink(const std::string& path, std::string& target);
// Replaces whatever is at `path` by a link to `target`; 0 or errno.
int makeSymlink(const std::string& target, const std::string& path);

// Sets access and modification times (FILETIME) of the path itself; 0 or errno.
int setFileTimes(const std::string& path, uint64_t accessed, uint64_t modified);
// Applies the attributes after the data is written: the permission bits of st_mode when
// attribute bit 0x8000 is set, else clears or restores the write bits by the read-only bit. Links
// keep their own permissions. 0 or errno.
int applyAttributes(const std::string& path, uint32_t attributes);
// True when the owner may not write the file.
bool isReadOnly(const std::string& path);
// Gives the owner write permission; 0 or errno.
int makeWritable(const std::string& path);
// Creates the folder and its missing parents; 0 or errno.
int makeFolders(const std::string& path);

// Whether another program holds the file open for writing: a read lease cannot be taken then.
// Files that we may not lease (not our own) count as not held.
bool heldOpenForWriting(int fd);

}  // namespace vaultora
