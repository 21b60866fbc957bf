#pragma once
// Consistency check and recovery of an archive.
//
// The check walks the directory tree and the cluster table together and gives every cluster to
// the one unit whose chain runs through it (the owner map). What does not fit is put to the user:
// a chain that starts or continues outside the table, two units sharing clusters (crosslinks), a
// unit whose body is gone, and chains that no unit owns (lost chains). Repairs go to the
// directories at once and to the table in memory; compaction, which runs the check first, stores
// the table afterwards.
//
// Recovery (recover.h) rebuilds a table that cannot be loaded from the self-describing cluster
// records and reattaches the tree; OfferRecovery asks the user first.
#include <cstdint>
#include <string_view>

#include "archive/vaultora.h"

namespace vaultora {

// Checks the tree against the cluster table and repairs what it can (asking where the user must
// choose). 0 when the check ran to its end; 83 when the user cancelled (repairs made so far stay).
[[nodiscard]] Result CheckArchive(Vaultora& archive);

// Called when an archive's table cannot be loaded: asks whether to rebuild it from the clusters
// and does so on Yes. No keeps the load failure (the archive stays unopened); Cancel is 83.
[[nodiscard]] Result OfferRecovery(Vaultora& archive, Result loadResult);

// The "body was not found" question about the unit record `unit` in `folderPath` ("" for the
// root). Yes marks the record deleted, No keeps it without a body (start 0xFFFFFFFF); both return
// 0 and the caller writes the directory cluster back. Cancel is 83.
[[nodiscard]] Result AskBodyMissing(Vaultora& archive, uint8_t* unit, std::u16string_view folderPath);

}  // namespace vaultora
