#pragma once
// Compacting: brings a modified archive back into its compact, self-contained form, and is the
// archive's commit. It checks the archive, slides the stored records of every 32 MiB space unit
// down so the gaps close, moves records from the end of the data area into gaps further forward,
// appends the records still in cluster files, writes the table behind the last record (the file is
// cut there) and rewrites the extended key block behind the table.
#include "archive/vaultora.h"

namespace vaultora {

// With force false nothing happens unless the archive's compact-when-updated flag is set.
[[nodiscard]] Result Compact(Vaultora& archive, bool force);

// Moves the stored record of `cluster` to `destination` (relative to the data area), behind the
// crash copies: a record that overlaps its own old bytes passes through ~Cluster.dat. On success
// `destination` is advanced by the record length.
[[nodiscard]] Result MoveClusterRecord(Vaultora& archive, uint32_t cluster, uint64_t& destination);

// True when compacting would change the file: records not packed from the start of their space
// units, the table not stored in the archive, or records still in cluster files.
bool hasSpaceToReclaim(const Vaultora& archive);

// Makes every archive object commit through Compact and offer recovery when its table is lost.
void installOperationHooks();

}  // namespace vaultora
