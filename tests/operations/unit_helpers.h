#pragma once
// Unit-level helpers for operation tests: files put into, read from, removed from and renamed in
// an archive's root folder through the real adding, walking and directory code.
#include <string>
#include <vector>

#include "archive/directory.h"
#include "archive/remove.h"
#include "archive/walk.h"
#include "operations/add.h"

namespace vaultora::test {

inline Result putFile(Vaultora& a, std::u16string_view name, const std::vector<uint8_t>& data) {
    Adder adder(a);
    ToAllFlags flags;
    flags.overwriteAll = true;
    Result rc = adder.AddMemoryFile(0, name, data.data(), data.size(), kAttrArchive, &flags);
    if (rc == kOk) rc = adder.flush();
    return rc;
}

inline Result getFile(Vaultora& a, std::u16string_view name, std::vector<uint8_t>& out) {
    SecureBytes buffer;
    Result rc = readUnitIntoBuffer(a, name, buffer);
    out.assign(buffer.begin(), buffer.end());
    return rc;
}

inline Result removeFile(Vaultora& a, std::u16string_view name) {
    cRemoveFileActorBlock actor(a, true);
    return walkPath(a, name, actor);
}

inline Result renameFile(Vaultora& a, std::u16string_view name, std::u16string_view newName) {
    std::u16string n(newName);
    return moveUnit(a, u"", u"", name, &n);
}

}  // namespace vaultora::test
