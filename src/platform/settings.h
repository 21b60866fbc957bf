#pragma once
// The settings store. All persistent settings live in two text files in the registry-export format:
//
//   $XDG_CONFIG_HOME/vaultora/user.reg   (default ~/.config/vaultora/user.reg)  the current user's
//                                         values, keys under [HKEY_CURRENT_USER\...], read-write
//   /etc/vaultora/system.reg             machine-wide values, keys under [HKEY_LOCAL_MACHINE\...],
//                                         read only
//
// File layout (UTF-8, "\n" or "\r\n" line ends):
//
//   Windows Registry Editor Version 5.00
//
//   [HKEY_CURRENT_USER\Software\Korvel\Vaultora]
//   "AppFlags"=hex:ff,ff,ff,ff            binary (an empty value is "hex:")
//   "SingleModeReopenDelay"=dword:000003e8 32-bit value, 8 hex digits
//   "TempFolder"="/home/u/tmp"            string; backslash and quote escaped as \\ and \"
//   "Other"=hex(2):41,00,00,00            any other type, kept as read
//
// Key and value names compare case-insensitively (ASCII). A string that cannot be written between
// quotes on one line (line breaks, control characters, bytes that are not UTF-8) is written in the
// hex(1) form (UTF-16LE with a terminating zero) and read back unchanged. Long hex lists may be
// continued on the next line after a trailing backslash.
//
// Every read re-reads the file, so a value written by another process is seen at once. Every write
// is a read-change-write of the whole user file under an exclusive lock on "user.reg.lock" beside
// it: the new text goes to "user.reg.tmp", is synced and renamed over the old file, so a crash
// leaves either the old or the new file and two processes never lose each other's values. A user
// file that does not parse is renamed to "user.reg.bad" (under the lock) and reads fall back to the
// caller's defaults. Read failures give "absent"; write failures return false and change nothing.
#include <atomic>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vaultora {

// The program's own key under either root.
inline constexpr std::string_view kSettingsKey = "Software\\Korvel\\Vaultora";

enum class SettingsRoot { kCurrentUser, kLocalMachine };

// Where a value of the program key is looked up: the user file only, or the user file and, when
// the value is absent there, the system file. Writes always go to the user file.
enum class SettingsScope { kUserOnly, kUserThenMachine };

class Settings {
public:
    // A store over the two files; the system file may be missing. Nothing is read here.
    Settings(std::string userFile, std::string systemFile);

    // The process-wide store over the default files (or the one installed by setInstance).
    static Settings& instance();
    // Installs a store for instance() to return (tests); nullptr restores the default store.
    static void setInstance(Settings* store);
    static std::string defaultUserFile();    // $XDG_CONFIG_HOME/vaultora/user.reg
    static std::string defaultSystemFile();  // /etc/vaultora/system.reg

    const std::string& userFile() const { return m_userFile; }
    const std::string& systemFile() const { return m_systemFile; }

    // Any key under one root. A value of another type (or a DWORD not of 4 bytes) is absent.
    // Writes to kLocalMachine always fail: the system file is read only.
    std::optional<uint32_t> readDword(SettingsRoot root, std::string_view key, std::string_view name) const;
    std::optional<std::vector<uint8_t>> readBinary(SettingsRoot root, std::string_view key,
                                                   std::string_view name) const;
    std::optional<std::string> readString(SettingsRoot root, std::string_view key, std::string_view name) const;
    bool writeDword(SettingsRoot root, std::string_view key, std::string_view name, uint32_t value);
    // An empty byte string deletes the value.
    bool writeBinary(SettingsRoot root, std::string_view key, std::string_view name,
                     const std::vector<uint8_t>& bytes);
    bool writeString(SettingsRoot root, std::string_view key, std::string_view name, std::string_view text);
    // True also when the value was not there.
    bool deleteValue(SettingsRoot root, std::string_view key, std::string_view name);

    // Values of the program key (kSettingsKey). Binary values are read from the user file and then
    // the system file unless told otherwise.
    std::optional<uint32_t> readDword(std::string_view name, SettingsScope scope) const;
    std::optional<std::vector<uint8_t>> readBinary(std::string_view name,
                                                   SettingsScope scope = SettingsScope::kUserThenMachine) const;
    std::optional<std::string> readString(std::string_view name, SettingsScope scope) const;
    bool writeDword(std::string_view name, uint32_t value);
    bool writeBinary(std::string_view name, const std::vector<uint8_t>& bytes);  // empty deletes
    bool writeString(std::string_view name, std::string_view text);
    bool deleteValue(std::string_view name);

    // Read-change-write of one binary value of the program key as a single step under the lock.
    // `change` gets the current value as looked up by `scope` (nullopt when absent or not binary)
    // and returns the bytes to store (empty deletes), or nullopt to leave the file as it is.
    // Returns false when the file could not be read or written.
    using BinaryChange = std::function<std::optional<std::vector<uint8_t>>(
        const std::optional<std::vector<uint8_t>>& current)>;
    bool updateBinary(std::string_view name, SettingsScope scope, const BinaryChange& change);

private:
    std::string m_userFile;
    std::string m_systemFile;
    static std::atomic<Settings*> s_override;
};

// ---- Typed settings -------------------------------------------------------------------------
// Each takes the store to use, the process-wide one by default.

// "AppFlags": 4-byte binary bit set, user then system file. Bit n is 1 << n.
namespace appflag {
inline constexpr uint32_t kDynamicCompact = 1u << 0;    // compact as soon as the archive is updated
inline constexpr uint32_t kOldVersionWarning = 1u << 1; // warn about archives of an older version
inline constexpr uint32_t kKeyboardFilterA = 1u << 2;   // keyboard filter menu options
inline constexpr uint32_t kKeyboardFilterB = 1u << 3;
inline constexpr uint32_t kOneAtATime = 1u << 4;        // open-file mode one at a time
inline constexpr uint32_t kRecentList = 1u << 5;        // recent list enabled
inline constexpr uint32_t kImageViewer = 1u << 6;       // image viewer library for pictures
}  // namespace appflag
// The value when it is absent (or not a 4-byte binary value): every bit set.
inline constexpr uint32_t kAppFlagsAbsent = 0xFFFFFFFFu;
uint32_t readAppFlags(const Settings& store = Settings::instance());
// True when every bit of `mask` is set.
bool appFlag(uint32_t mask, const Settings& store = Settings::instance());
// Reads the whole value (every bit set when absent), sets or clears the bits of `mask` and writes
// the four bytes back, under the store's lock.
bool setAppFlag(uint32_t mask, bool on, Settings& store = Settings::instance());

// "sendMailDelayBeforeDeleteTempFile": DWORD in milliseconds, user then system file, default 0.
uint32_t sendMailDelayBeforeDeleteTempFile(const Settings& store = Settings::instance());

// "FramePos": the main window's placement and view flags, 56 bytes of little-endian 32-bit
// fields, user file only.
struct FramePos {
    static constexpr size_t kSize = 56;
    static constexpr uint32_t kShowHidden = 1u << 0;
    static constexpr uint32_t kShowTree = 1u << 1;
    static constexpr uint32_t kUseAutoRun = 1u << 2;
    static constexpr uint32_t kTempFolderNoticeDeclined = 1u << 5;
    static constexpr uint32_t kSortAscending = 1u << 6;

    int32_t left = 0, top = 0, right = 0, bottom = 0;  // window rectangle
    uint32_t listViewMode = 1;  // 0 large icons, 1 details, 2 small icons, 3 list
    int32_t columnWidths[6] = {100, 100, 100, 100, 100, 100};
    uint32_t flags = kShowTree | kUseAutoRun;  // bits 3 and 4 are reserved and kept as read
    int32_t recipientMode = 1;  // how a public-key recipient was last chosen for sending
    int32_t sortColumn = -1;    // -1 for none

    // A stored bottom edge of 0 means the record carries no window rectangle.
    bool hasRect() const { return bottom != 0; }
    std::vector<uint8_t> encode() const;
    // Fields not covered by a shorter record keep their defaults. nullopt when larger than 56.
    static std::optional<FramePos> decode(const std::vector<uint8_t>& bytes);
};
// nullopt when absent, empty, not binary or larger than 56 bytes.
std::optional<FramePos> readFramePos(const Settings& store = Settings::instance());
bool writeFramePos(const FramePos& pos, Settings& store = Settings::instance());
// Reads the record (defaults when there is none), sets or clears flag bits and writes the 56
// bytes back, under the store's lock (the batch verb "Encrypt" uses it for kUseAutoRun).
bool setFramePosFlag(uint32_t mask, bool on, Settings& store = Settings::instance());

// The folder for temporarily extracted files, with a trailing '/': the "TempFolder" string of the
// user file when there is one, else the private runtime folder. It is created (mode 0700) when
// missing; "" when it cannot be created.
std::string tempFolder(const Settings& store = Settings::instance());
bool writeTempFolder(std::string_view path, Settings& store = Settings::instance());

}  // namespace vaultora
