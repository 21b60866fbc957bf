#pragma once
// A password for scripts that is neither typed nor written on the command line: when the
// environment variable VAULTORA_PASSWORD_FILE names a file, the first line of that file (without
// its line end) is the password of every password question of the run.
#include <optional>
#include <string>

#include "platform/result.h"
#include "platform/secure.h"

namespace vaultora {

inline constexpr const char* kPasswordFileVariable = "VAULTORA_PASSWORD_FILE";

// The file named by VAULTORA_PASSWORD_FILE; nullopt when the variable is unset or empty.
std::optional<std::string> passwordFileFromEnvironment();

// Reads the first line of `path` (up to "\n"; a "\r" before it is dropped) into `out`. Everything
// read is wiped. kCannotOpen when the file cannot be read, with the system's reason in `reason`.
[[nodiscard]] Result readPasswordFile(const std::string& path, PasswordRecord& out, std::string& reason);

}  // namespace vaultora
