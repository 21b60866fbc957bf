#pragma once
// The verb "Extract": extracts the units that match each pattern from an archive's root folder
// into a disk folder.
//
//   vaultora Extract <archive> <destination> [pattern...]       ("*" when no pattern is given)
//
// Patterns use "*" for any run of characters and "%" for exactly one; a pattern may name a folder
// inside the archive first ("docs/*.txt" or "docs\*.txt"). Every pattern is tried whatever the
// outcome of the one before; the exit code is the outcome of the last one. Opening: 83 when the
// password question is cancelled, else the open's error.
#include <string>
#include <vector>

#include "app/cmdline.h"
#include "app/verb_session.h"

namespace vaultora {

int batchExtract(const std::vector<std::string>& args, VerbSession& session);
int runExtract(const Invocation& call);

}  // namespace vaultora
