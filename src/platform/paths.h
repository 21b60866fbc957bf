#pragma once
// Where the program keeps its per-user folders on Linux.
#include <string>

namespace vaultora::paths {

// $XDG_RUNTIME_DIR/vaultora, else ${TMPDIR:-/tmp}/vaultora-<uid>; created with mode 0700. Empty
// when it cannot be created or someone else owns it.
std::string runtimeFolder();
// $XDG_STATE_HOME/vaultora/~VRACrash (default ~/.local/state/vaultora/~VRACrash); not created here.
std::string crashFolder();
// $XDG_CONFIG_HOME/vaultora (default ~/.config/vaultora); not created here.
std::string configFolder();
// $XDG_DATA_HOME/vaultora (default ~/.local/share/vaultora); not created here.
std::string dataFolder();
// The folder holding the running executable.
std::string executableFolder();

}  // namespace vaultora::paths
