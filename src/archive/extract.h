#pragma once
// Extracting and exporting units onto the disk.
//
// Unit names are turned back into Linux names (private-use characters and surrogate escapes
// undone). Files get their data, then their access and modification times, then their
// permissions (from the POSIX mode when the attributes carry one, else from the read-only bit).
// Link units become symbolic links. Stream units ("file:stream:$DATA") become "user." extended
// attributes of their file; where the file system refuses them the user may take the stream as
// a separate file whose name has the stream's colons replaced by underscores.
#include <array>
#include <cstdint>
#include <string>

#include "archive/walk.h"
#include "platform/messages.h"

namespace vaultora {

class cExtractFileActorBlock : public cActorBlock {
public:
    // `mode` is the walk mode: 0 extract, 2 export, 4 the import pass (units missing on disk are
    // offered for removal), 6 synchronize.
    cExtractFileActorBlock(Vaultora& a, std::string targetBase, int mode = 0);
    Result actOnUnit(uint8_t* record, std::u16string_view folderPath) override;
    Result afterCluster(ChainBuffer& buffer) override;

    // Extracts one unit to `target` (a disk path).
    [[nodiscard]] Result extractToFile(const std::string& target, const uint8_t* record);

    // Flags 1..6 of the export/import questions (index 0..5): 1/2 yes/no to all for overwriting a
    // later disk file, 3/4 for removing files, 5/6 for removing folders.
    std::array<bool, 6> toAll{};
    bool readOnlyYesAll = false;
    int streamAnswer = 0;  // the remembered answer about streams the target cannot hold
    WalkProgress progress;
    uint32_t filesVisited = 0;
    uint32_t foldersVisited = 0;
    uint32_t filesExtracted = 0;
    std::string lastExtractedPath;

private:
    Result extractFolder(uint8_t* record, std::u16string_view folderPath, const std::string& target);
    Result extractStream(const std::string& target, const uint8_t* record, const std::u16string& fileName,
                         const std::u16string& streamName);
    Result askRemoval(Msg text, std::initializer_list<FormatArg> args, int yesFlag, uint8_t* record,
                      std::u16string_view folderPath);
    Result writeDataFile(const std::string& target, const uint8_t* record);

    Vaultora& m_archive;
    std::string m_base;
    int m_mode;
};

// The disk path of a unit below `base`: each component of the folder path and the name mapped
// back to a Linux name.
std::string diskPathOfUnit(const std::string& base, std::u16string_view folderPath, std::u16string_view name);

}  // namespace vaultora
