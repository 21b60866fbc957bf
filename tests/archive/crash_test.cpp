// Crash safety of the archive object, tested for real: a child process runs a sequence of changes
// and is killed with SIGKILL before its N-th mutating file operation, for N = 1, 2, ... until the
// sequence completes. After each kill a fresh object opens the archive and everything committed
// before must read back byte for byte; what the interrupted run wrote is either all there or
// not there at all. The same sequence is also run with every write from the N-th on failing
// with ENOSPC (a full disk).
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "archive/vaultora.h"
#include "archive_fixture.h"
#include "platform/file.h"

namespace vaultora {
namespace {

using test::payloadFor;
using test::readChain;
using test::ScriptedInteraction;
using test::TempDir;
using test::writeChain;

struct Committed {
    uint32_t a = 0, b = 0;
    std::vector<uint8_t> pa = payloadFor(100, 600000), pb = payloadFor(101, 900);
};

Committed makeCommitted(const std::string& path) {
    Committed c;
    Vaultora v(path);
    EXPECT_EQ(v.create(nullptr, 0), kOk);
    c.a = writeChain(v, c.pa);
    c.b = writeChain(v, c.pb);
    EXPECT_EQ(v.close(), kOk);
    return c;
}

// The interrupted work: a chain written with table saves, then a batch that writes a chain and
// changes the root directory, then the commit.
const std::vector<uint8_t>& newChainC() { static auto p = payloadFor(200, 700000); return p; }
const std::vector<uint8_t>& newChainD() { static auto p = payloadFor(201, 3000); return p; }

// Writes a chain like the fixture does, but a failure is an expected outcome here, not a test error.
Result writeChainQuietly(Vaultora& v, const std::vector<uint8_t>& payload, bool saveTable) {
    uint32_t prev = kNoCluster;
    for (size_t off = 0; off < payload.size(); off += kMaxPayload) {
        uint32_t c = v.allocateCluster(prev);
        if (prev != kNoCluster) v.mutableCot()[prev].next = c;
        size_t n = std::min<size_t>(kMaxPayload, payload.size() - off);
        if (Result rc = v.writeDataCluster(c, payload.data() + off, static_cast<uint32_t>(n), saveTable); rc != kOk)
            return rc;
        prev = c;
    }
    return kOk;
}

Result runChanges(const std::string& path) {
    Vaultora v(path);
    if (Result rc = v.open(OpenKey{}); rc != kOk) return rc;
    if (Result rc = writeChainQuietly(v, newChainC(), true); rc != kOk) return rc;
    v.setBatch(true);
    if (Result rc = writeChainQuietly(v, newChainD(), false); rc != kOk) return rc;
    ChainBuffer root;
    root.cluster = 0;
    if (Result rc = v.readCluster(root); rc != kOk) return rc;
    auto rec = unit::make(u"new");
    root.data.insert(root.data.end(), rec.begin(), rec.end());
    root.dirty = true;
    if (Result rc = v.writeDirectoryCluster(root, true); rc != kOk) return rc;
    v.setBatch(false);
    return v.close();
}

// Opens in a fresh object and checks the invariants; returns true when the new root is there.
bool verify(const std::string& path, const Committed& c, const std::string& where) {
    ScriptedInteraction ui;  // an unexpected question fails the test
    Vaultora v(path, &ui);
    Result rc = v.open(OpenKey{});
    EXPECT_EQ(rc, kOk) << where;
    if (rc != kOk) return false;
    EXPECT_EQ(readChain(v, c.a), c.pa) << where;
    EXPECT_EQ(readChain(v, c.b), c.pb) << where;
    ChainBuffer root;
    root.cluster = 0;
    EXPECT_EQ(v.readCluster(root), kOk) << where;
    const bool newRoot = root.data.size() == 48 + 54;
    EXPECT_TRUE(root.data.size() == 48 || newRoot) << where << " root of " << root.data.size() << " bytes";
    // Any other chain the table names is one of the new chains or a whole-cluster prefix of one
    // (an unfinished chain that no directory names yet). Once the directory change is there,
    // both new chains are complete: the directory is written last.
    int complete = 0;
    for (uint32_t s = 1; s < v.cot().size(); ++s) {
        if (s == c.a || s == c.b || !v.cot()[s].used() || v.previousCluster(s) != kNoCluster) continue;
        auto data = readChain(v, s);
        bool isPrefix = false;
        for (const auto* full : {&newChainC(), &newChainD()}) {
            if (data == *full) ++complete;
            if (data.size() <= full->size() && std::equal(data.begin(), data.end(), full->begin())) isPrefix = true;
        }
        EXPECT_TRUE(isPrefix) << where << " chain at " << s << " has " << data.size() << " bytes";
    }
    if (newRoot) {
        EXPECT_EQ(complete, 2) << where;
    }
    EXPECT_EQ(v.close(), kOk) << where;
    EXPECT_FALSE(fs::exists(path + ".vrt")) << where;
    return newRoot;
}

TEST(CrashSafety, KillAtEveryWriteLeavesOldOrNewStateNeverAMix) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    const std::string pristine = dir / "pristine.vra";
    Committed c = makeCommitted(pristine);
    std::vector<uint8_t> base;
    ASSERT_TRUE(fs::readWholeFile(pristine, base));

    int killed = 0, sawOld = 0, sawNew = 0;
    for (long n = 1; n < 500; ++n) {
        fs::removeTree(path + ".vrt");
        ASSERT_TRUE(fs::writeWholeFile(path, base.data(), base.size()));
        pid_t pid = fork();
        ASSERT_GE(pid, 0);
        if (pid == 0) {
            fault::reset();
            fault::setKillAt(n);
            _exit(runChanges(path) == kOk ? 0 : 1);
        }
        int status = 0;
        waitpid(pid, &status, 0);
        const bool wasKilled = WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL;
        const std::string where = "killed before step " + std::to_string(n);
        if (!wasKilled) {
            ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "run without a kill failed";
            EXPECT_TRUE(verify(path, c, "completed run"));
            break;
        }
        ++killed;
        (verify(path, c, where) ? sawNew : sawOld)++;
        if (HasFailure()) break;
    }
    RecordProperty("kill_points", killed);
    std::printf("kill points exercised: %d (old state %d, new state %d)\n", killed, sawOld, sawNew);
    EXPECT_GT(killed, 20);
    EXPECT_GT(sawOld, 0);
}

TEST(CrashSafety, FullDiskFailsTheRunAndKeepsTheArchiveConsistent) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    const std::string pristine = dir / "pristine.vra";
    Committed c = makeCommitted(pristine);
    std::vector<uint8_t> base;
    ASSERT_TRUE(fs::readWholeFile(pristine, base));
    int failedRuns = 0;
    for (long n = 1; n < 500; ++n) {
        fs::removeTree(path + ".vrt");
        ASSERT_TRUE(fs::writeWholeFile(path, base.data(), base.size()));
        fault::reset();
        fault::setFailFrom(n, ENOSPC);
        Result rc = runChanges(path);
        fault::reset();
        if (rc == kOk) break;
        ++failedRuns;
        verify(path, c, "disk full from step " + std::to_string(n));
        if (HasFailure()) break;
    }
    EXPECT_GT(failedRuns, 20);
}

}  // namespace
}  // namespace vaultora
