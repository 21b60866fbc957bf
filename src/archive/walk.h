#pragma once
// Walks over a folder's directory chain with an actor, the data sinks, and reading a unit's data.
//
// A walk reads each directory cluster of the chain in order and enumerates it in two passes:
// first the ordinary units, then the stream units ("file:stream:$DATA"), so every stream comes
// after the units of its folder. Each unit that matches the pattern (and the selection list, when
// one is given) goes to the actor's actOnUnit; after each cluster the actor's afterCluster may
// write it back.
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "archive/vaultora.h"
#include "platform/file.h"

namespace vaultora {

class cActorBlock {
public:
    virtual ~cActorBlock() = default;
    // 0 continues the walk; anything else stops it. `record` points into the cluster's buffer
    // and may be changed in place (marked deleted).
    virtual Result actOnUnit(uint8_t* /*record*/, std::u16string_view /*folderPath*/) { return kNotInline; }
    virtual Result afterCluster(ChainBuffer& /*buffer*/) { return kOk; }
};

// Unit paths ("folder\name") that a walk is limited to; empty pointer = everything.
using SelectionList = std::vector<std::u16string>;

[[nodiscard]] Result walk(Vaultora& a, std::u16string_view pattern, uint32_t chainStart, std::u16string_view folderPath,
                          cActorBlock& actor, const SelectionList* selection);
// Walks the folder of `path` with its last component as pattern ("" = "*").
[[nodiscard]] Result walkPath(Vaultora& a, std::u16string_view path, cActorBlock& actor);
// Enumerates one directory buffer (two passes).
[[nodiscard]] Result enumerateDirectory(ChainBuffer& buffer, std::u16string_view pattern, std::u16string_view folderPath,
                                        cActorBlock& actor, const SelectionList* selection);

// Data sinks, with the meaning of a plain write call: false on failure, `written` may be short.
class cExtractFile {
public:
    cExtractFile() = default;
    explicit cExtractFile(File* file) : m_file(file) {}
    virtual ~cExtractFile() = default;
    virtual bool write(const uint8_t* bytes, size_t length, size_t& written);

private:
    File* m_file = nullptr;
    uint64_t m_position = 0;
};

class cExtractMemFile : public cExtractFile {
public:
    cExtractMemFile(uint8_t* destination, uint64_t capacity) : m_destination(destination), m_capacity(capacity) {}
    bool write(const uint8_t* bytes, size_t length, size_t& written) override;
    uint64_t count() const { return m_count; }

private:
    uint8_t* m_destination;
    uint64_t m_capacity;
    uint64_t m_count = 0;
};

// A sink that keeps everything in a growing secure buffer (links and streams are small).
class cExtractBuffer : public cExtractFile {
public:
    bool write(const uint8_t* bytes, size_t length, size_t& written) override;
    SecureBytes data;
};

// Whether the add-files window takes the progress events (0xAA01..0xAA04) instead of the
// title/status/percent calls. Set by the operation that runs that window.
struct WalkProgress {
    bool addFilesWindow = false;
};

[[nodiscard]] Result extractUnitData(Vaultora& a, cExtractFile& sink, const uint8_t* record,
                                     const WalkProgress& progress = {});
[[nodiscard]] Result extractToMemory(Vaultora& a, uint8_t* destination, std::u16string_view path, uint64_t capacity);
[[nodiscard]] Result readUnitIntoBuffer(Vaultora& a, std::u16string_view path, SecureBytes& buffer);
// Reads the body of a unit record (inline or chain) into the buffer.
[[nodiscard]] Result readRecordBody(Vaultora& a, const uint8_t* record, SecureBytes& buffer);

using UnitFilter = std::function<bool(std::u16string_view name)>;
[[nodiscard]] Result findAdjacentUnit(Vaultora& a, std::u16string& out, std::u16string_view folderPath,
                                      std::u16string_view reference, const UnitFilter& filter, bool after);
bool searchUnitContent(Vaultora& a, const uint8_t* record, const uint8_t* pattern, size_t patternLength);

struct SizeCount {
    uint64_t realSize = 0;
    uint64_t compressedSize = 0;
    uint32_t files = 0;
    uint32_t folders = 0;
};
// Counts the folder whose chain starts at `chainStart` and everything below it.
[[nodiscard]] Result countSizes(Vaultora& a, uint32_t chainStart, SizeCount& out);
// The text of the archive statistics message (the caller shows it with its caption).
[[nodiscard]] Result showArchiveStatistics(Vaultora& a, std::u16string& text, std::u16string& caption);

// A byte count with one decimal digit and a binary unit: 1536 -> "1.5 KB", 1024 -> "1 KB".
std::u16string sizeText(uint64_t bytes);

}  // namespace vaultora
