#include "fuzz_session.h"

#include <cstdlib>
#include <vector>

#include "archive/directory.h"
#include "archive/walk.h"
#include "operations/check.h"

namespace vaultora::fuzz {

int AcceptingInteraction::message(std::u16string_view, std::u16string_view, uint32_t style) {
    switch (style & 7) {
        case mb::kYesNoCancel:
        case mb::kYesNo: return kAnswerYes;
        case mb::kOk:
        case mb::kOkCancel: return kAnswerOk;
        default: return defaultAnswer(style);
    }
}

bool AcceptingInteraction::password(std::u16string_view, PasswordRecord& out, bool) {
    out = PasswordRecord::fromUtf8(kPassword);
    return true;
}

namespace {

// Enters every folder once (a hostile tree may name a folder inside itself) and reads every body.
class TreeReader : public cActorBlock {
public:
    TreeReader(Vaultora& a, size_t& units) : m_archive(a), m_units(units), m_seen(a.cot().size(), 0) {}
    Result actOnUnit(uint8_t* record, std::u16string_view folderPath) override {
        ++m_units;
        const uint32_t start = unit::start(record);
        if ((unit::attributes(record) & kAttrFolder) != 0 && unit::kind(record) == kUnitChain) {
            if (start < m_seen.size() && m_seen[start] == 0 && m_depth < 64) {
                m_seen[start] = 1;
                ++m_depth;
                (void)walk(m_archive, u"*", start, joinUnitPath(folderPath, unit::name(record)), *this, nullptr);
                --m_depth;
            }
            return kOk;
        }
        SecureBytes body;
        (void)readRecordBody(m_archive, record, body);
        return kOk;
    }

private:
    Vaultora& m_archive;
    size_t& m_units;
    std::vector<uint8_t> m_seen;
    size_t m_depth = 0;
};

}  // namespace

SessionResult openAndReadTree(const std::string& path, bool check) {
    SessionResult out;
    AcceptingInteraction ui;
    const PasswordRecord password = PasswordRecord::fromUtf8(kPassword);
    Vaultora archive(path, &ui);
    OpenKey key;
    key.password = &password;
    out.open = archive.open(key);
    if (out.open == kOk) {
        TreeReader reader(archive, out.units);
        (void)walk(archive, u"*", 0, u"", reader, nullptr);
        if (check && !archive.isReadOnly()) out.check = CheckArchive(archive);
    }
    (void)archive.close();
    return out;
}

void isolateEnvironment(const std::string& folder) {
    setenv("XDG_CONFIG_HOME", (folder + "/config").c_str(), 1);
    setenv("XDG_STATE_HOME", (folder + "/state").c_str(), 1);
    setenv("XDG_DATA_HOME", (folder + "/data").c_str(), 1);
    setenv("XDG_RUNTIME_DIR", (folder + "/runtime").c_str(), 1);
    setenv("HOME", folder.c_str(), 1);
}

}  // namespace vaultora::fuzz
