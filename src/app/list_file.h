#pragma once
// The items of "Add", "Encrypt" and "Send": single paths, or list files named with "@" (the list
// file is kept) or "@*" (the list file is wiped and deleted when the run ends).
//
// A list file holds one path per line, as 8-bit text (taken as the bytes of Linux paths), or as
// UTF-16 text that starts with the byte-order mark FF FE (little-endian) or FE FF (big-endian).
// Lines end with LF or CR LF; a line that begins with "#" is a comment; empty lines are skipped.
#include <cstdint>
#include <string>
#include <vector>

namespace vaultora {

// The paths of a list file's text.
std::vector<std::string> decodeListText(const std::vector<uint8_t>& bytes);

struct ItemList {
    std::vector<std::string> paths;      // in the order given
    std::vector<std::string> wipeAtEnd;  // "@*" list files
};
// Expands the items of the command line. False when a list file cannot be read; `failed` names it.
bool expandItems(const std::vector<std::string>& items, ItemList& out, std::string& failed);

// Overwrites the file's bytes with zeros, syncs it, then deletes it. True when it is gone.
bool wipeAndDelete(const std::string& path);

// The archive that archive name "*" stands for: beside the item, named after it; a file's
// extension (a dot within the last four characters of the name) is replaced by ".vra", a folder
// gets ".vra" appended.
std::string archiveNameForItem(const std::string& item, bool isFolder);

}  // namespace vaultora
