// Proof that no crash loses data: each operation runs in a child process that is killed with
// SIGKILL before its N-th mutating file operation (write, truncate, sync, rename, unlink), for
// N = 1, 2, ... until the operation completes. After every kill a fresh object opens the archive
// and checks: it opens (resuming from the crash copies where needed), every file committed before
// the operation reads back byte for byte, the touched file is either in its old or its new state,
// and the next commit leaves a clean archive without a temporary folder.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <functional>
#include <map>
#include <random>

#include "archive/password_ops.h"
#include "archive/vaultora.h"
#include "operations/compact.h"
#include "platform/file.h"
#include "platform/text.h"
#include "support/temp_dir.h"
#include "unit_helpers.h"

namespace vaultora {
namespace {

using test::getFile;
using test::putFile;
using test::TempDir;

std::vector<uint8_t> bytesOf(uint32_t seed, size_t n) {
    std::mt19937 rng(seed);
    std::vector<uint8_t> v(n);
    for (auto& b : v) b = static_cast<uint8_t>(rng() % 97);  // compresses a little
    return v;
}

const PasswordRecord& masterPassword() {
    static const PasswordRecord p = PasswordRecord::fromUtf8("master password");
    return p;
}
const PasswordRecord& extraPassword() {
    static const PasswordRecord p = PasswordRecord::fromUtf8("extra password");
    return p;
}

// Answers what a run may ask: passwords from a fixed list, and lost cluster chains (data an
// interrupted run wrote before any unit named it) are freed. Anything else is recorded.
class HarnessInteraction : public Interaction {
public:
    int message(std::u16string_view text, std::u16string_view, uint32_t style) override {
        unexpected.push_back(toUtf8(text));
        return defaultAnswer(style);
    }
    int askFiveWay(std::u16string_view text, std::u16string_view) override {
        if (toUtf8(text).find("Press YES button to free the cluster chain") != std::string::npos) {
            ++lostChains;
            return kAnswerYes;
        }
        unexpected.push_back(toUtf8(text));
        return kAnswerCancel;
    }
    bool password(std::u16string_view, PasswordRecord& out, bool) override {
        out = extraPassword();
        return true;
    }
    std::vector<std::string> unexpected;
    int lostChains = 0;
};

using Files = std::map<std::u16string, std::vector<uint8_t>>;

struct Scenario {
    const char* name;
    bool encrypted = false;
    // Prepares the archive (committed, or left modified for the resume case).
    std::function<void(const std::string& path, Files& committed)> prepare;
    // The interrupted work.
    std::function<Result(Vaultora& a)> operation;
    // The touched unit: its state before and after (empty = absent).
    std::u16string touched;
    std::vector<uint8_t> before, after;
    // A second touched unit (a rename names two), with its states.
    std::u16string touched2;
    std::vector<uint8_t> before2, after2;
};

Result openArchive(Vaultora& a, bool encrypted, const PasswordRecord* pw = nullptr) {
    OpenKey key;
    if (encrypted) key.password = pw != nullptr ? pw : &masterPassword();
    return a.open(key);
}

void makeBase(const std::string& path, bool encrypted, Files& files) {
    Vaultora a(path);
    KeyBlockParams params = DefaultKeyBlockParams();
    params.archiveAlg = encrypted ? 9 : 0;
    params.keyAlg = 9;
    ASSERT_EQ(createWithPassword(a, params, masterPassword()), kOk);
    files[u"one"] = bytesOf(1, 600000);
    files[u"two"] = bytesOf(2, 100);
    files[u"three"] = bytesOf(3, 3000);
    files[u"four"] = bytesOf(4, 1200000);
    for (auto& [n, d] : files) ASSERT_EQ(putFile(a, n, d), kOk);
    ASSERT_EQ(a.close(), kOk);
}

std::vector<uint8_t> stateOf(Vaultora& a, const std::u16string& name, bool& present) {
    std::vector<uint8_t> data;
    present = getFile(a, name, data) == kOk;
    return data;
}

// Checks the archive after a run; returns 1 when the touched unit is in its new state, 0 old.
int verify(const std::string& path, const Scenario& s, const Files& committed, const std::string& where) {
    HarnessInteraction ui;
    int isNew = -1;
    for (int pass = 0; pass < 2; ++pass) {
        Vaultora a(path, &ui);
        Result rc = openArchive(a, s.encrypted);
        EXPECT_EQ(rc, kOk) << where << " pass " << pass;
        if (rc != kOk) return -1;
        for (const auto& [n, d] : committed) {
            if (n == s.touched || n == s.touched2) continue;
            std::vector<uint8_t> back;
            EXPECT_EQ(getFile(a, n, back), kOk) << where << " " << toUtf8(n);
            EXPECT_TRUE(back == d) << where << " " << toUtf8(n) << " differs";
        }
        bool present = false;
        auto data = stateOf(a, s.touched, present);
        const bool old1 = present ? data == s.before : s.before.empty();
        const bool new1 = present ? data == s.after : s.after.empty();
        EXPECT_TRUE(old1 || new1) << where << " " << toUtf8(s.touched) << " is neither old nor new (" << data.size()
                                  << " bytes, present " << present << ")";
        int state = new1 && !old1 ? 1 : old1 && !new1 ? 0 : -2;
        if (!s.touched2.empty()) {
            auto data2 = stateOf(a, s.touched2, present);
            const bool old2 = present ? data2 == s.before2 : s.before2.empty();
            const bool new2 = present ? data2 == s.after2 : s.after2.empty();
            EXPECT_TRUE((old1 && old2) || (new1 && new2)) << where << " the two names disagree";
        }
        if (pass == 0) isNew = state;
        else EXPECT_EQ(state, isNew) << where << " changed by the commit";
        EXPECT_EQ(a.close(), kOk) << where;
        EXPECT_FALSE(fs::exists(path + ".vrt")) << where << " temporary folder left after commit";
    }
    EXPECT_TRUE(ui.unexpected.empty()) << where << ": " << (ui.unexpected.empty() ? "" : ui.unexpected[0]);
    return isNew;
}

// The archive and its temporary folder as files, to restore before every run.
struct Snapshot {
    std::map<std::string, std::vector<uint8_t>> files;
    void take(const std::string& path) {
        files.clear();
        fs::readWholeFile(path, files[""]);
        for (const auto& n : fs::listDirectory(path + ".vrt")) fs::readWholeFile(path + ".vrt/" + n, files[n]);
    }
    void restore(const std::string& path) const {
        fs::removeTree(path + ".vrt");
        for (const auto& [n, d] : files) {
            if (n.empty()) {
                fs::writeWholeFile(path, d.data(), d.size());
            } else {
                fs::createDirectories(path + ".vrt");
                fs::writeWholeFile(path + ".vrt/" + n, d.data(), d.size());
            }
        }
    }
};

class CrashHarness : public ::testing::TestWithParam<int> {
protected:
    void SetUp() override { installOperationHooks(); }
    void TearDown() override { setArchiveHooks({}); }
};

Scenario scenario(int which) {
    Scenario s;
    auto base = [](bool enc) {
        return [enc](const std::string& path, Files& f) { makeBase(path, enc, f); };
    };
    switch (which) {
        case 0:
            s.name = "add";
            s.prepare = base(false);
            s.touched = u"new";
            s.after = bytesOf(10, 800000);
            s.operation = [after = s.after](Vaultora& a) { return putFile(a, u"new", after); };
            break;
        case 1:
            s.name = "replace";
            s.prepare = base(false);
            s.touched = u"three";
            s.before = bytesOf(3, 3000);
            s.after = bytesOf(11, 700000);
            s.operation = [after = s.after](Vaultora& a) { return putFile(a, u"three", after); };
            break;
        case 2:
            s.name = "delete";
            s.prepare = base(false);
            s.touched = u"one";
            s.before = bytesOf(1, 600000);
            s.operation = [](Vaultora& a) { return test::removeFile(a, u"one"); };
            break;
        case 3:
            s.name = "rename";
            s.prepare = base(false);
            s.touched = u"four";
            s.before = bytesOf(4, 1200000);
            s.touched2 = u"renamed";
            s.after2 = s.before;
            s.operation = [](Vaultora& a) { return test::renameFile(a, u"four", u"renamed"); };
            break;
        case 4:
            // An uncommitted delete of the first file leaves a gap at the start of the data area;
            // the run resumes it and compacts, moving every record behind the gap.
            s.name = "resume-and-compact";
            s.prepare = [](const std::string& path, Files& f) {
                makeBase(path, false, f);
                Vaultora a(path);
                ASSERT_EQ(a.open(OpenKey{}), kOk);
                ASSERT_EQ(test::removeFile(a, u"one"), kOk);
                ASSERT_EQ(a.saveClusterTable(), kOk);
                a.file().close();  // the process ends here: no commit
                f.erase(u"one");
            };
            s.touched = u"two";
            s.before = s.after = bytesOf(2, 100);
            s.operation = [](Vaultora& a) { return Compact(a, true); };
            break;
        case 5:
            s.name = "add-password";
            s.encrypted = true;
            s.prepare = base(true);
            s.touched = u"two";
            s.before = s.after = bytesOf(2, 100);
            s.operation = [](Vaultora& a) { return addPassword(a, DefaultKeyBlockParams()); };
            break;
    }
    return s;
}

TEST_P(CrashHarness, KillAtEveryStepLeavesOldOrNewStateAndLosesNothing) {
    Scenario s = scenario(GetParam());
    TempDir dir;
    const std::string path = dir / "a.vra";
    Files committed;
    s.prepare(path, committed);
    if (HasFatalFailure()) return;
    Snapshot base;
    base.take(path);

    int kills = 0, oldStates = 0, newStates = 0;
    bool completed = false;
    for (long n = 1; n < 3000 && !completed; ++n) {
        base.restore(path);
        pid_t pid = fork();
        ASSERT_GE(pid, 0);
        if (pid == 0) {
            HarnessInteraction ui;
            Vaultora a(path, &ui);
            fault::reset();
            fault::setKillAt(n);
            Result rc = openArchive(a, s.encrypted);
            if (rc == kOk) rc = s.operation(a);
            if (rc == kOk) rc = a.close();
            _exit(rc == kOk ? 0 : 1);
        }
        int status = 0;
        waitpid(pid, &status, 0);
        const std::string where = std::string(s.name) + ", killed before step " + std::to_string(n);
        if (WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL) {
            ++kills;
            int state = verify(path, s, committed, where);
            (state == 1 ? newStates : oldStates)++;
        } else {
            ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << s.name << ": the run failed on its own";
            completed = true;
            const int state = verify(path, s, committed, std::string(s.name) + ", completed");
            if (s.after != s.before) {
                EXPECT_EQ(state, 1) << s.name << ": the completed run's change is not there";
            }
        }
        if (HasFailure()) break;
    }
    EXPECT_TRUE(completed);
    if (s.encrypted && completed) {
        Vaultora a(path);
        EXPECT_EQ(openArchive(a, true, &extraPassword()), kOk) << "the added password opens the archive";
    }
    std::printf("%s: %d kill points, old state %d, new state %d\n", s.name, kills, oldStates, newStates);
    EXPECT_GT(kills, 5);
}

std::string operationName(const ::testing::TestParamInfo<int>& info) {
    static const char* const kNames[] = {"Add", "Replace", "Delete", "Rename", "ResumeAndCompact", "AddPassword"};
    return kNames[info.param];
}

INSTANTIATE_TEST_SUITE_P(Operations, CrashHarness, ::testing::Range(0, 6), operationName);

// A full disk: every write from the N-th on fails with ENOSPC. The operation fails with a code and
// the archive stays consistent, with nothing committed lost.
TEST_F(CrashHarness, FullDiskFailsTheOperationAndKeepsTheArchive) {
    for (int which : {0, 1, 2}) {
        Scenario s = scenario(which);
        TempDir dir;
        const std::string path = dir / "a.vra";
        Files committed;
        s.prepare(path, committed);
        Snapshot base;
        base.take(path);
        int failures = 0;
        for (long n = 1; n < 3000; ++n) {
            base.restore(path);
            Result rc;
            {
                HarnessInteraction ui;
                Vaultora a(path, &ui);
                fault::reset();
                fault::setFailFrom(n, ENOSPC);
                rc = openArchive(a, s.encrypted);
                if (rc == kOk) rc = s.operation(a);
                if (rc == kOk) rc = a.close();
                fault::reset();
            }
            if (rc == kOk) break;
            ++failures;
            verify(path, s, committed, std::string(s.name) + ", disk full from step " + std::to_string(n));
            if (HasFailure()) return;
        }
        EXPECT_GT(failures, 5) << s.name;
    }
}

}  // namespace
}  // namespace vaultora
