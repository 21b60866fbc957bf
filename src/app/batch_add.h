#pragma once
// The verbs "Add" and "Encrypt": add files and folders to an archive from the command line,
// creating a password archive when it does not exist.
//
//   vaultora Add <archive|*> <item|@list|@*list>... [-PKID id] [-LF log]
//
// "Encrypt" then stores an AutoRun.inf that opens the first item and exits when it is closed, and
// turns on the use of AutoRun files. Exit codes: 0, 104 (too few arguments, or the first item
// cannot be read), 88 (-PKID with an existing archive), or the first failing result of the open,
// the creation, an item's add or the commit.
#include <string>
#include <vector>

#include "app/cmdline.h"
#include "app/verb_session.h"

namespace vaultora {

// `args` as the verb gets them: args[1] the verb, args[2] the archive, args[3...] the items.
int batchAdd(const std::vector<std::string>& args, bool encrypt, VerbSession& session);
// The command-table handler of "Add" and "Encrypt".
int runAdd(const Invocation& call);
// "Invalid argument" through the batch-aware message (the handler of too few arguments).
void reportInvalidArgument(const Invocation& call);

}  // namespace vaultora
