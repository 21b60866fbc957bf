#pragma once
// AutoRun.inf: a small text file in an archive's root folder that names a file inside the archive
// to open when the archive is opened, whether to exit when it is closed, and up to three disk
// folders remembered for synchronization, export and import.
//
// File format: UTF-16LE with the byte-order mark FF FE, lines ending in CR LF, written exactly as
//
//   [AutoRun]
//   Open = "program" "folder\file"        (the program and its space only when there is one)
//   ExitOnClose = true                    (or false)
//                                         (this empty line and the rest only when a folder is set)
//   [Synchronize]
//   SynchronizePath = "..."               (each only when set, in this order)
//   ExportPath = "..."
//   ImportPath = "..."
//
// Reading is lenient: section names and keys compare without regard to case, spaces around "="
// are optional, values are one token (quoted up to the next quote, else up to the next space), and
// unknown lines are ignored. A file without an [AutoRun] section, or with another section after
// it and no [Synchronize] section further on, is malformed (76); what was read up to there is kept.
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/result.h"

namespace vaultora {

class Vaultora;

inline constexpr char16_t kAutoRunName[] = u"AutoRun.inf";
inline constexpr uint32_t kAutoRunAttributes = 34;  // hidden + archive

struct AutoRunSettings {
    std::u16string program;         // optional program to open the file with
    std::u16string openFile;        // path inside the archive ("folder\name")
    std::u16string synchronizePath; // disk folder for synchronization (mode 6)
    std::u16string exportPath;      // disk folder for export (mode 2)
    std::u16string importPath;      // disk folder for import (mode 4)
    bool exitOnClose = false;

    // The export folder: the export path, else the synchronize path, else "".
    std::u16string exportFolder() const { return exportPath.empty() ? synchronizePath : exportPath; }
    // The import folder: the import path, else the synchronize path, else "".
    std::u16string importFolder() const { return importPath.empty() ? synchronizePath : importPath; }
    // Stores `path` for mode 6, 2 or 4; another mode is 76.
    [[nodiscard]] Result setRememberedFolder(int mode, std::u16string_view path);
};

// The file's bytes (byte-order mark included).
std::vector<uint8_t> encodeAutoRun(const AutoRunSettings& settings);
// Reads the file's bytes into `settings` (fields not in the file keep their values).
[[nodiscard]] Result parseAutoRun(const uint8_t* data, size_t size, AutoRunSettings& settings);

// Reads AutoRun.inf from the archive's root folder: 0, 76 malformed, or the extraction's error.
[[nodiscard]] Result readAutoRun(AutoRunSettings& settings, Vaultora& archive);
// Stores AutoRun.inf in the archive's root folder (hidden + archive), replacing an existing one.
[[nodiscard]] Result writeAutoRun(const AutoRunSettings& settings, Vaultora& archive);

}  // namespace vaultora
