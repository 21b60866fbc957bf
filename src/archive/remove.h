#pragma once
// Removing units: the remove actor asks once per selected unit and removes folders with their
// whole subtree; records are marked deleted during the walk and squeezed out of each directory
// cluster when the walk has finished with it.
#include "archive/walk.h"

namespace vaultora {

// Removes one unit whose record lies in a buffer being walked: a folder's subtree first, then its
// chain is freed and the record marked deleted (the caller squeezes and writes the cluster).
[[nodiscard]] Result removeUnitRecord(Vaultora& a, uint8_t* record, std::u16string_view folderPath);

class cRemoveFileActorBlock : public cActorBlock {
public:
    // `callerYesToAll`, when given, is cleared when the user answers Yes All.
    explicit cRemoveFileActorBlock(Vaultora& a, bool yesToAll = false, bool* callerYesToAll = nullptr)
        : m_archive(a), m_yesToAll(yesToAll), m_callerFlag(callerYesToAll) {}
    Result actOnUnit(uint8_t* record, std::u16string_view folderPath) override;
    Result afterCluster(ChainBuffer& buffer) override;
    bool yesToAll() const { return m_yesToAll; }

private:
    Vaultora& m_archive;
    bool m_yesToAll;
    bool* m_callerFlag;
};

// Writes a walked cluster back when records were removed from it.
[[nodiscard]] Result squeezeAndWrite(Vaultora& a, ChainBuffer& buffer);

}  // namespace vaultora
