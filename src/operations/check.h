#pragma once
// Consistency check and recovery of an archive.
#include "archive/vaultora.h"

namespace vaultora {

// Checks the tree against the cluster table and repairs what it can (asking where the user must
// choose). 0 when the archive is consistent afterwards.
[[nodiscard]] Result CheckArchive(Vaultora& archive);
// Called when an archive's table cannot be loaded: offers to rebuild it from the clusters.
[[nodiscard]] Result OfferRecovery(Vaultora& archive, Result loadResult);

}  // namespace vaultora
