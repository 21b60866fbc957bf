#pragma once
// The directory tree: units (directory unit records) in the directory chains of their folders.
//
// A folder path is a backslash-separated list of unit names relative to the root; "" and "\" are
// the root, a leading backslash is ignored. The root's chain starts at cluster 0; a folder unit's
// chain starts at its `start` field. Names are compared by wildcard match, case-sensitive, where
// the pattern may hold '*' (any run, also empty) and '%' (exactly one character).
//
// Every directory cluster is read with Vaultora::readCluster and written with
// Vaultora::writeDirectoryCluster through the directory cache. A directory cluster never holds
// more than 524,288 bytes; a folder whose records do not fit grows its chain by one cluster.
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "archive/vaultora.h"

namespace vaultora {

bool wildcardMatch(std::u16string_view pattern, std::u16string_view name);
// Name of the record at p without allocating: code units are read straight from the record.
bool recordNameMatches(const uint8_t* record, std::u16string_view pattern);
bool recordNameEquals(const uint8_t* record, std::u16string_view name);
// Number of UTF-16 code units of the record's name.
size_t recordNameLength(const uint8_t* record);

// "a\b\c" -> folder "a\b", name "c"; a leading backslash is dropped.
void splitUnitPath(std::u16string_view path, std::u16string& folder, std::u16string& name);
// folder + "\" + name, or just name when the folder is the root.
std::u16string joinUnitPath(std::u16string_view folder, std::u16string_view name);

[[nodiscard]] Result resolveFolder(Vaultora& a, std::u16string_view path, uint32_t& cluster);
// Looks the pattern up in the chain starting at `cluster`. Found: `cluster` is the cluster that
// holds the record and `copy` (when given) receives the record. Not found: 61 and `cluster` is
// the chain's last cluster.
[[nodiscard]] Result findUnit(Vaultora& a, std::u16string_view pattern, uint32_t& cluster, SecureBytes* copy);
[[nodiscard]] Result findUnitByPath(Vaultora& a, std::u16string_view path, SecureBytes& copy);
[[nodiscard]] Result unitAttributes(Vaultora& a, std::u16string_view path, uint32_t& attributes);
[[nodiscard]] Result pathChain(Vaultora& a, std::u16string_view folder, std::vector<uint32_t>& chain);
// Appends the inline data of a kind-1 unit; nothing for an empty unit; 57 for any other unit.
[[nodiscard]] Result readInlineUnit(Vaultora& a, std::u16string_view path, SecureBytes& buffer);
// Makes `name` unique in the folder by appending 1, 2, ... to the given text.
[[nodiscard]] Result uniqueName(Vaultora& a, uint32_t folderChain, std::u16string& name);

// A new record for `name`. With a source path the attributes, times and size come from the disk
// (62 when they cannot be read); without one a folder (0x10) or file (0) with the current time.
// Files of 1..511 bytes get kind 1 and room for their inline data behind the name.
[[nodiscard]] Result makeUnitRecord(std::u16string_view name, const std::string* sourcePath, bool isFile,
                                    SecureBytes& record);
SecureBytes makeRecordWithAttributes(std::u16string_view name, uint32_t size, uint32_t attributes);
// A record with `name` in place of its own (inline data moved behind the new name).
SecureBytes renamedRecord(const uint8_t* record, std::u16string_view name);

// Finds a cluster of the chain with room for the record (58 when the name is met on the way);
// appends a cluster to the chain when none has room. A dirty buffer is written first.
[[nodiscard]] Result findRoom(Vaultora& a, uint32_t chainStart, ChainBuffer& buffer, const SecureBytes& record,
                              const std::u16string* newName);
// Appends the record (58 on a duplicate name in this buffer, 63 when it does not fit).
[[nodiscard]] Result addRecord(ChainBuffer& buffer, const SecureBytes& record, const std::u16string* newName);
// Marks a record deleted; returns whether it already was.
bool markDeleted(uint8_t* record);
// Removes deleted records; false at the first invalid record.
bool squeeze(ChainBuffer& buffer);
// Offset of the first record of the buffer whose name matches the pattern, or npos.
size_t findInBuffer(const ChainBuffer& buffer, std::u16string_view pattern);

// Renames (same folder, new name) or moves (other folder) a unit.
[[nodiscard]] Result moveUnit(Vaultora& a, std::u16string_view destination, std::u16string_view source,
                              std::u16string_view name, const std::u16string* newName);
[[nodiscard]] Result setUnitAttributes(Vaultora& a, std::u16string_view folder, std::u16string_view name,
                                       uint32_t attributes);
// The unit whose chain holds `cluster`, with the directory cluster that holds its record.
[[nodiscard]] Result findOwnerOfCluster(Vaultora& a, uint32_t cluster, ChainBuffer& buffer, SecureBytes& unit);

}  // namespace vaultora
