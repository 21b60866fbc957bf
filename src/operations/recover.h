#pragma once
// Recovery of an archive whose cluster table (or root directory) can no longer be read.
//
// The table is thrown away and rebuilt from the cluster records themselves: every format-2 record
// carries its own cluster number and successor. The data area is read in 32 MiB windows (no
// record crosses a window boundary) and every block-aligned position is tried. Then the links are
// checked (cut at loops and at clusters that do not exist), the chains that read as directories
// are found, the tree is reconnected from the root, and every chain that no directory names is
// added to the root folder as "LostCluster %08X": a folder when it reads as a directory, else a
// file. The archive is left modified; the file on disk keeps its old table until the commit.
#include "archive/vaultora.h"

namespace vaultora {

// 109 for a 1.x archive (its records do not describe themselves), 101 when the scan fails or is
// cancelled or no root can be written, else the first failure of the rebuild.
[[nodiscard]] Result Recover(Vaultora& archive);

}  // namespace vaultora
