#pragma once
// The verb "Delete": deletes an archive file once its password has been given.
//
//   vaultora Delete <archive>
//
// A file that does not exist gives 0 at once. Otherwise the archive is opened with its password
// (asked again after a wrong one; with VAULTORA_PASSWORD_FILE tried once) and only then deleted,
// together with its temporary folder. Exit code 0 when the file is gone, -1 otherwise (cancelled,
// wrong password from the file, not an archive, not deletable).
#include <string>
#include <vector>

#include "app/cmdline.h"
#include "app/verb_session.h"

namespace vaultora {

int batchDelete(const std::vector<std::string>& args, VerbSession& session);
int runDelete(const Invocation& call);

}  // namespace vaultora
