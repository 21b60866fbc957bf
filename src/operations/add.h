#pragma once
// Adding files and folders from the disk into an open archive.
//
// One recursive walk (AddTree) takes a disk source (a file, a folder, or a wildcard pattern) and
// a folder inside the archive, creates folder units for the folders it meets, writes each file's
// body into a new cluster chain (or inline into its record when it has 1..511 bytes), takes each
// "user." extended attribute as a stream unit "file:NAME:$DATA", and decides per file whether an
// existing unit of the same name is kept, replaced or asked about, by the walk mode:
//   0 plain add, 2 export (disk side), 4 import (disk side), 6 synchronize (disk side).
//
// Replacing is safe against failure: the new body is written first, then the directory record is
// swapped, and only then is the old body's chain freed. A failed or cancelled write leaves the
// old version in place and no half-written unit behind.
//
// The adder runs the archive in batch mode for its lifetime and keeps a name index of the folders
// it touches; nothing else may change those folders while the adder lives.
#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <string_view>
#include <unordered_map>

#include "archive/vaultora.h"

namespace vaultora {

enum SyncMode : int { kModePlain = 0, kModeExport = 2, kModeImport = 4, kModeSynchronize = 6 };

// Answers remembered for one walk.
struct ToAllFlags {
    bool overwriteAll = false;  // yes to all to a replace question
    bool skipAll = false;       // no to all to a replace question
    bool deleteAll = false;     // yes to all to the export deletion question
    bool keepAll = false;       // no to all to the export deletion question
};

// The last answer to the stream question; lives for the whole process (initially Yes).
extern int streamAnswer;

// A thing on the disk to add: a file, folder or link, or one named stream (extended attribute
// "user.<stream>") of it.
struct DiskItem {
    std::string path;
    std::string stream;
    bool isStream() const { return !stream.empty(); }
};

struct AddOptions {
    // The operation's stop flag; the adder points the archive at it and may clear it when the
    // user declines to stop.
    uint32_t* cancelFlag = nullptr;
    // The add-files window takes progress as events (0xAA01..0xAA04) and stops at once on cancel.
    bool addFilesWindow = false;
    // The batch log; when set, questions that the batch log answers by itself are logged instead.
    std::function<void(std::u16string_view)> batchLog;
    bool verboseLog = false;
    // Wipes a disk file (export deletion). Default: one pass of zeros, then the file is removed.
    std::function<Result(const std::string&)> wipe;
};

class BodySource;

class Adder {
public:
    explicit Adder(Vaultora& archive, AddOptions options = {});
    ~Adder();
    Adder(const Adder&) = delete;
    Adder& operator=(const Adder&) = delete;

    [[nodiscard]] Result AddTree(std::u16string_view archiveFolder, const std::string& sourcePath, ToAllFlags& flags,
                                 int mode);
    [[nodiscard]] Result AddEntry(uint32_t folderUnit, const DiskItem& item, ToAllFlags& flags, int mode);
    [[nodiscard]] Result AddFileChecked(uint32_t folderUnit, const DiskItem& item, ToAllFlags& flags, int mode);
    // `item` null: a record without a body (folder or empty file with the current time).
    // `adoptChain` kNoCluster: the body comes from the disk; otherwise that chain becomes the body.
    [[nodiscard]] Result AddUnit(uint32_t folderUnit, std::u16string_view name, const DiskItem* item, ToAllFlags& flags,
                                 int mode, bool nameExists, uint32_t adoptChain = kNoCluster, bool isFolder = false);
    [[nodiscard]] Result AddMemoryFile(uint32_t folderUnit, std::u16string_view name, const uint8_t* data, uint64_t size,
                                       uint32_t attributes, ToAllFlags* flags);
    bool IsSameBody(const uint8_t* unit, const DiskItem& item, bool sizeOnly);
    // 1 the unit is later, -1 earlier, 0 equal, 2 the disk times cannot be read.
    int CompareFileDate(const uint8_t* unit, const DiskItem& item);
    [[nodiscard]] Result WriteFileBody(const DiskItem& item, SecureBytes& record);
    [[nodiscard]] Result WriteEmbeddedBody(const DiskItem& item, SecureBytes& record);

    // Writes the directory clusters held for change back to the archive (through the cache).
    [[nodiscard]] Result flush();

    uint32_t filesSeen = 0;
    uint32_t foldersSeen = 0;
    uint32_t filesAdded = 0;

private:
    struct FolderIndex {
        std::unordered_map<std::u16string, uint32_t> names;  // unit name -> directory cluster
    };
    Result folderIndex(uint32_t folder, FolderIndex*& out);
    Result clusterBuffer(uint32_t cluster, ChainBuffer*& out);
    Result lookup(uint32_t folder, std::u16string_view name, uint32_t& cluster, SecureBytes* copy);
    Result insertRecord(uint32_t folder, const SecureBytes& record);
    Result removeRecord(uint32_t folder, std::u16string_view name, uint32_t cluster);
    Result replaceRecord(uint32_t folder, std::u16string_view name, uint32_t oldCluster, const SecureBytes& record);
    Result writeChainFromSource(BodySource& source, SecureBytes& record, bool alwaysAskOnCancel);
    Result askTermination(bool alwaysAsk);
    void status(const DiskItem& item, std::u16string_view text);
    std::u16string itemText(const DiskItem& item) const;
    std::u16string unitNameOf(const DiskItem& item) const;
    bool collecting() const { return m_archive.collectedMessages != nullptr; }

    Vaultora& m_archive;
    AddOptions m_options;
    bool m_previousBatch = false;
    std::u16string m_currentArchiveFolder;
    std::map<uint32_t, FolderIndex> m_folders;
    ChainBuffer m_room;  // the directory cluster held for change
    bool m_skipHeld = false;
};

}  // namespace vaultora
