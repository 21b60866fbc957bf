#pragma once
// A look at an archive file's header without opening the archive: for the version query and for
// knowing whether opening it needs a password.
#include <string>

#include "archive/format.h"

namespace vaultora {

// Finds the header (also behind a self-extractor stub). False when the file cannot be read or
// holds no archive header.
bool probeArchiveHeader(const std::string& path, Header& out);
// True when the header announces no key blocks: the archive is not encrypted.
bool headerHasNoKeyBlocks(const Header& h);

}  // namespace vaultora
