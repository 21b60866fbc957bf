#pragma once
// Lost cluster chains: allocated clusters that no unit of the directory tree owns.
//
// The check (check.h) hands over its owner map when the tree walk is done; every unowned chain is
// cut where it runs into an owned one, traced back to its head and put to the user: free it, save
// it into the crash folder, or leave it. Recovery (recover.h) instead attaches unnamed chains to
// the root folder as "LostCluster %08X" units.
#include <cstdint>
#include <string>
#include <vector>

#include "archive/vaultora.h"

namespace vaultora {

// Owner map entry of a cluster that no chain has claimed.
inline constexpr uint32_t kUnclaimed = 0xFFFFFFFF;

// Asks about every chain of allocated clusters whose owner is kUnclaimed. `owner` has one entry
// per table entry; chains that are kept are marked in it so they are asked about only once.
// 0 when done (also after No All), 83 on Cancel, 76 when the prompt answers nothing it offers.
[[nodiscard]] Result HandleLostChains(Vaultora& archive, std::vector<uint32_t>& owner);

// Writes the payloads of the chain starting at `head`, in chain order, to the file
// "Cluster_0x%X" (the head's number) in the crash folder. 75 when the folder cannot be created,
// 69 on a failed write, the read result when a cluster cannot be read.
[[nodiscard]] Result SaveChainToCrashFolder(Vaultora& archive, uint32_t head, std::string* savedPath = nullptr);

// Puts the chain starting at `cluster` into the root folder as "LostCluster %08X" (with "_1",
// "_2", ... when that name is taken): a file whose size is the sum of the chain's payload lengths,
// or, with asFile false, a folder whose directory is that chain. 74 when the root cannot be read.
[[nodiscard]] Result AddLostChain(Vaultora& archive, uint32_t cluster, bool asFile);

}  // namespace vaultora
