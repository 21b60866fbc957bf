// Recovery: the table rebuilt from the records, the tree reattached, a destroyed root replaced.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstring>

#include "archive/password_ops.h"
#include "check_fixture.h"
#include "crypto/key_block_params.h"
#include "operations/check.h"
#include "operations/recover.h"
#include "platform/file.h"

namespace vaultora {
namespace {

using test::addFile;
using test::addFolder;
using test::HooksGuard;
using test::makeChain;
using test::namesIn;
using test::ScriptedInteraction;
using test::TempDir;
using test::unitAt;

std::vector<uint8_t> chainData(Vaultora& a, uint32_t start) {
    std::vector<uint8_t> out;
    for (uint32_t c : a.chainClusters(start)) {
        ChainBuffer b;
        b.cluster = c;
        EXPECT_EQ(a.readCluster(b), kOk);
        out.insert(out.end(), b.data.begin(), b.data.end());
    }
    return out;
}

std::string lostName(uint32_t c) {
    char b[32];
    std::snprintf(b, sizeof b, "LostCluster %08X", c);
    return b;
}

// Overwrites `n` bytes of the data area at `offset` (relative to the data area).
void smash(const std::string& path, uint64_t offset, uint64_t n) {
    std::vector<uint8_t> f;
    ASSERT_TRUE(fs::readWholeFile(path, f));
    const uint64_t at = getU32(&f[24]) + offset;
    ASSERT_LE(at + n, f.size());
    std::memset(&f[at], 0x5A, n);
    ASSERT_TRUE(fs::writeWholeFile(path, f.data(), f.size()));
}

void smashTable(const std::string& path) {
    std::vector<uint8_t> f;
    ASSERT_TRUE(fs::readWholeFile(path, f));
    smash(path, getU64(&f[28]), getU32(&f[36]));
}

struct Built {
    std::vector<uint8_t> a, b;
    uint32_t aStart = 0, dChain = 0, gChain = 0;
};

// root: A (3 clusters), D { B (2 clusters), E (empty folder) }, G (a folder whose directory
// cluster holds something that is not a directory). Committed and closed.
Built build(const std::string& path) {
    Built out;
    ScriptedInteraction ui;
    Vaultora v(path, &ui);
    EXPECT_EQ(v.create(nullptr, 0), kOk);
    out.aStart = addFile(v, 0, u"A", 3, 1, &out.a).front();
    out.dChain = addFolder(v, 0, u"D");
    addFile(v, out.dChain, u"B", 2, 5, &out.b);
    addFolder(v, out.dChain, u"E");
    out.gChain = addFolder(v, 0, u"G");
    const std::vector<uint8_t> junk = test::piece(99, 300);
    EXPECT_EQ(v.writeDataCluster(out.gChain, junk.data(), static_cast<uint32_t>(junk.size()), true), kOk);
    EXPECT_EQ(v.close(), kOk);
    return out;
}

struct RecoverTest : ::testing::Test {
    TempDir dir;
    std::string path = dir / "a.vra";
    ScriptedInteraction ui;
    HooksGuard hooks{ArchiveHooks{nullptr, OfferRecovery}};
};

TEST_F(RecoverTest, DamagedTableIsRebuiltFromTheRecordsAndTheTreeComesBackWhole) {
    Built built = build(path);
    smashTable(path);
    ui.expect("is damaged!\n\nDo you want to recover it?", kAnswerYes);
    {
        Vaultora v(path, &ui);
        ASSERT_EQ(v.open(OpenKey{}), kOk);
        EXPECT_TRUE(v.isModified());
        EXPECT_EQ(namesIn(v, 0), (std::vector<std::string>{"A", "D", "G"}));
        EXPECT_EQ(namesIn(v, built.dChain), (std::vector<std::string>{"B", "E"}));
        EXPECT_EQ(chainData(v, built.aStart), built.a);
        EXPECT_EQ(chainData(v, unit::start(unitAt(v, u"D\\B").data())), built.b);
        EXPECT_NE(std::find(ui.statuses.begin(), ui.statuses.end(), "Clusters recovered 8, max cluster number " +
                                std::to_string(built.gChain)),
                  ui.statuses.end());
        EXPECT_EQ(v.close(), kOk);
    }
    ScriptedInteraction quiet;
    Vaultora v(path, &quiet);
    ASSERT_EQ(v.open(OpenKey{}), kOk) << "the recovered table was committed";
    EXPECT_EQ(chainData(v, unit::start(unitAt(v, u"D\\B").data())), built.b);
    EXPECT_TRUE(quiet.asked.empty());
}

TEST_F(RecoverTest, DestroyedRootGivesANewRootWithTheFormerUnitsAsLostClusters) {
    Built built = build(path);
    {
        ScriptedInteraction quiet;
        Vaultora v(path, &quiet);
        ASSERT_EQ(v.open(OpenKey{}), kOk);
        const CotEntry root = v.cot()[0];
        v.close();
        smash(path, root.offset, root.size);
    }
    smashTable(path);
    ui.expect("is damaged!", kAnswerYes);
    Vaultora v(path, &ui);
    ASSERT_EQ(v.open(OpenKey{}), kOk);
    EXPECT_EQ(namesIn(v, 0), (std::vector<std::string>{lostName(built.aStart), lostName(built.dChain),
                                                       lostName(built.gChain)}));
    SecureBytes a = unitAt(v, fromUtf8(lostName(built.aStart)));
    EXPECT_EQ(unit::attributes(a.data()), 0u);
    EXPECT_EQ(unit::size(a.data()), built.a.size());
    EXPECT_EQ(chainData(v, unit::start(a.data())), built.a);
    // The lost directory chain is a folder again, with its former entries.
    SecureBytes d = unitAt(v, fromUtf8(lostName(built.dChain)));
    EXPECT_EQ(unit::attributes(d.data()), kAttrFolder);
    EXPECT_EQ(namesIn(v, unit::start(d.data())), (std::vector<std::string>{"B", "E"}));
    // A directory cluster that does not read as one is kept as a file.
    SecureBytes g = unitAt(v, fromUtf8(lostName(built.gChain)));
    EXPECT_EQ(unit::attributes(g.data()), 0u);
    EXPECT_EQ(unit::size(g.data()), 300u);
    EXPECT_TRUE(ui.asked.size() == 1);
}

TEST_F(RecoverTest, DeclinedRecoveryKeepsTheLoadFailureAndCancelIs83) {
    build(path);
    smashTable(path);
    ui.expect("is damaged!", kAnswerNo).expect("is damaged!", kAnswerCancel);
    Vaultora v(path, &ui);
    Result declined = v.open(OpenKey{});
    EXPECT_NE(declined, kOk);
    EXPECT_NE(declined, kCancelled);
    EXPECT_EQ(v.open(OpenKey{}), kCancelled);
}

TEST_F(RecoverTest, FormatOneArchiveIsNotRecovered) {
    Vaultora v(path, &ui);
    ASSERT_EQ(v.create(nullptr, 0), kOk);
    makeChain(v, 2, 3);
    const auto before = v.cot();
    v.mutableHeader().versionMajor = 1;
    EXPECT_EQ(Recover(v), kNewerFormat);
    EXPECT_EQ(v.cot(), before) << "nothing was scanned";
    EXPECT_TRUE(ui.statuses.empty());
    v.mutableHeader().versionMajor = 2;
}

TEST_F(RecoverTest, EncryptedArchiveIsRecoveredWithItsKey) {
    const PasswordRecord password = PasswordRecord::fromUtf8("correct horse");
    KeyBlockParams params = DefaultKeyBlockParams();
    params.archiveAlg = 7;
    params.keyAlg = 7;
    std::vector<uint8_t> data;
    uint32_t start = 0;
    {
        ScriptedInteraction quiet;
        Vaultora v(path, &quiet);
        ASSERT_EQ(createWithPassword(v, params, password), kOk);
        start = addFile(v, 0, u"secret", 3, 42, &data).front();
        ASSERT_EQ(v.close(), kOk);
    }
    smashTable(path);
    ui.expect("is damaged!", kAnswerYes);
    Vaultora v(path, &ui);
    OpenKey key;
    key.password = &password;
    ASSERT_EQ(v.open(key), kOk);
    EXPECT_EQ(namesIn(v, 0), std::vector<std::string>{"secret"});
    EXPECT_EQ(chainData(v, start), data);
}

TEST_F(RecoverTest, RecordsNamingEachOtherInACircleAreCutIntoOneLostChain) {
    std::vector<uint32_t> loop;
    {
        ScriptedInteraction quiet;
        Vaultora v(path, &quiet);
        ASSERT_EQ(v.create(nullptr, 0), kOk);
        // Two records that name each other as successor.
        loop = makeChain(v, 2, 3);
        v.mutableCot()[loop[1]].next = loop[0];
        const std::vector<uint8_t> p = test::piece(1, 500);
        ASSERT_EQ(v.writeDataCluster(loop[1], p.data(), static_cast<uint32_t>(p.size()), true), kOk);
        ASSERT_EQ(v.close(), kOk);
    }
    smashTable(path);
    ui.expect("is damaged!", kAnswerYes);
    Vaultora v(path, &ui);
    ASSERT_EQ(v.open(OpenKey{}), kOk);
    EXPECT_EQ(namesIn(v, 0), std::vector<std::string>{lostName(loop[0])});
    EXPECT_EQ(v.chainClusters(loop[0]), loop);
    // And the check agrees that the result is consistent.
    EXPECT_EQ(CheckArchive(v), kOk);
    EXPECT_EQ(ui.asked.size(), 1u);
}

}  // namespace
}  // namespace vaultora
