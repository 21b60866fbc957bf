// The consistency check: crosslinks, chains leaving the table, missing bodies and lost chains,
// each answered from a script.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>

#include "check_fixture.h"
#include "operations/check.h"
#include "platform/file.h"

namespace vaultora {
namespace {

using test::addFile;
using test::addFolder;
using test::addUnit;
using test::makeChain;
using test::namesIn;
using test::ScriptedInteraction;
using test::TempDir;
using test::unitAt;

std::string hex4(uint32_t c) {
    char b[16];
    std::snprintf(b, sizeof b, "%04X", c);
    return b;
}

struct CheckTest : ::testing::Test {
    TempDir dir;
    ScriptedInteraction ui;
    ScriptedInteraction next;  // for a second check; outlives the archive
    Vaultora a{dir / "a.vra", &ui};
    void SetUp() override { ASSERT_EQ(a.create(nullptr, 0), kOk); }
    bool isFree(uint32_t c) const { return c >= a.cot().size() || !a.cot()[c].used(); }
};

TEST_F(CheckTest, ConsistentTreeWithEmptyAndInlineUnitsAsksNothing) {
    addFile(a, 0, u"big", 3, 1);
    uint32_t sub = addFolder(a, 0, u"sub");
    addFile(a, sub, u"inner", 2, 9);
    addFolder(a, sub, u"emptyFolder");
    addUnit(a, 0, u"empty", 0, 0);           // an empty file: start 0, size 0
    addUnit(a, sub, u"noBody", kNoCluster, 0);
    SecureBytes inlineUnit = makeRecordWithAttributes(u"tiny", 5, 0);
    ChainBuffer room;
    ASSERT_EQ(findRoom(a, 0, room, inlineUnit, nullptr), kOk);
    ASSERT_EQ(addRecord(room, inlineUnit, nullptr), kOk);
    ASSERT_EQ(a.writeDirectoryCluster(room, true), kOk);
    const auto before = a.cot();

    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_TRUE(ui.asked.empty());
    EXPECT_EQ(ui.statuses.front(), "Checking lost clusters");
    EXPECT_EQ(a.cot(), before);
}

TEST_F(CheckTest, CrosslinkNamesTheEarlierUnitFirstAndYesRemovesIt) {
    std::vector<uint8_t> data;
    auto chain = addFile(a, 0, u"A", 2, 3, &data);
    addUnit(a, 0, u"B", chain.front(), data.size());
    ui.expect("The following units have crosslinks\n1) \\A\n2) \\B\n", kAnswerYes);
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_FALSE(ui.remaining());
    EXPECT_EQ(namesIn(a, 0), std::vector<std::string>{"B"});
    EXPECT_EQ(unit::start(unitAt(a, u"B").data()), chain.front());
    EXPECT_EQ(a.chainClusters(chain.front()), chain) << "the chain now belongs to B alone, nothing was freed";

    a.setInteraction(&next);
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_TRUE(next.asked.empty());
}

TEST_F(CheckTest, CrosslinkNoRemovesTheLaterUnitAndReturnsWhatItClaimedAsLost) {
    auto chainA = addFile(a, 0, u"A", 2, 3);
    uint32_t sub = addFolder(a, 0, u"sub");
    // B has a cluster of its own, then runs into A's second cluster.
    auto own = makeChain(a, 1, 40);
    a.mutableCot()[own[0]].next = chainA[1];
    addUnit(a, sub, u"B", own[0], 2000);
    ui.expect("1) \\A\n2) \\sub\\B\n", kAnswerNo)
        .expect("Cluster number " + hex4(own[0]) + ",\nCluster chain length 1.", kAnswerYes);
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_FALSE(ui.remaining());
    EXPECT_TRUE(namesIn(a, sub).empty());
    EXPECT_TRUE(isFree(own[0]));
    EXPECT_EQ(a.chainClusters(chainA[0]), chainA);
}

TEST_F(CheckTest, ChainLeavingTheTableIsCutAfterOkAndKeepsItsFirstClusters) {
    auto chain = addFile(a, 0, u"F", 3, 5);
    a.mutableCot()[chain[1]].next = 5000;
    // The third cluster is no longer reached from F: it is asked about as a lost chain.
    ui.expect("Cluster chain of unit '\\F'\ncontents a next cluster 1388 more then table size", kAnswerOk)
        .expect("Cluster number " + hex4(chain[2]) + ",\nCluster chain length 1.", kAnswerYes);
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_FALSE(ui.remaining());
    EXPECT_EQ(ui.captions.front(), "Check Archive Content");
    EXPECT_EQ(a.chainClusters(chain[0]), (std::vector<uint32_t>{chain[0], chain[1]}));
    EXPECT_TRUE(isFree(chain[2]));
}

TEST_F(CheckTest, CancelStopsWith83AndKeepsTheRepairsMadeBefore) {
    addFile(a, 0, u"A", 1, 1);
    auto second = addFile(a, 0, u"B", 1, 2);
    addUnit(a, 0, u"C", 4000, 10);
    a.mutableCot()[second[0]].next = 6000;
    ui.expect("contents a next cluster 1770", kAnswerOk).expect("has start cluster FA0", kAnswerCancel);
    EXPECT_EQ(CheckArchive(a), kCancelled);
    EXPECT_EQ(a.nextCluster(second[0]), kEndOfChain) << "the cut made before the cancel stays";
    EXPECT_EQ(namesIn(a, 0), (std::vector<std::string>{"A", "B", "C"}));
}

TEST_F(CheckTest, MissingBodyKeptWithoutBodyIsReportedNextTimeAsStartingBeyondTheTable) {
    auto chain = addFile(a, 0, u"F", 1, 7);
    ASSERT_TRUE(a.freeChain(chain[0]));
    ui.expect("File body was not found inside the archive.\nUnit info:\n Name '\\F'\n Cluster " +
                  std::to_string(chain[0]) + ", size",
              kAnswerNo);
    EXPECT_EQ(CheckArchive(a), kOk);
    SecureBytes f = unitAt(a, u"F");
    ASSERT_FALSE(f.empty());
    EXPECT_EQ(unit::start(f.data()), kNoCluster);

    next.expect("Cluster chain of unit '\\F'\nhas start cluster FFFFFFFF it is more then max cluster", kAnswerOk);
    a.setInteraction(&next);
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_FALSE(next.remaining());
    EXPECT_TRUE(namesIn(a, 0).empty());
}

TEST_F(CheckTest, ChainRunningIntoAFreeClusterAsksForTheBodyAndReturnsItsClustersAsLost) {
    auto chain = addFile(a, 0, u"F", 3, 7);
    a.mutableCot()[chain[2]] = CotEntry{};  // the last cluster is gone
    ui.expect("File body was not found", kAnswerYes)
        .expect("Cluster number " + hex4(chain[0]) + ",\nCluster chain length 2.", kAnswerYes);
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_FALSE(ui.remaining());
    EXPECT_TRUE(isFree(chain[0]));
    EXPECT_TRUE(isFree(chain[1]));
}

TEST_F(CheckTest, ChainLoopingIntoItselfIsACrosslinkWithItselfAndEnds) {
    auto chain = addFile(a, 0, u"F", 3, 2);
    a.mutableCot()[chain[2]].next = chain[0];
    ui.expect("1) \\F\n2) \\F\n", kAnswerYes)
        .expect("Cluster number " + hex4(chain[0]) + ",\nCluster chain length 3.", kAnswerYes);
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_FALSE(ui.remaining());
    for (uint32_t c : chain) EXPECT_TRUE(isFree(c));
}

TEST_F(CheckTest, LostChainIsReportedOnceFromItsHeadWhateverItsNumbering) {
    // Clusters allocated in one order and linked in another: the head is the highest number.
    auto c = makeChain(a, 3, 11);
    auto& cot = a.mutableCot();
    cot[c[2]].next = c[0];
    cot[c[0]].next = c[1];
    cot[c[1]].next = kEndOfChain;
    ui.expect("Cluster number " + hex4(c[2]) + ",\nCluster chain length 3.", kAnswerYes);
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_EQ(ui.asked.size(), 1u);
    EXPECT_EQ(ui.captions.front(), "Lost cluster chain is detected.");
    for (uint32_t x : c) EXPECT_TRUE(isFree(x));
}

TEST_F(CheckTest, LostChainRunningIntoAUnitIsCutInFrontOfItAndLoopsEnd) {
    auto owned = addFile(a, 0, u"F", 2, 1);
    auto into = makeChain(a, 1, 20);
    a.mutableCot()[into[0]].next = owned[1];
    auto loop = makeChain(a, 2, 30);
    a.mutableCot()[loop[1]].next = loop[0];
    ui.expect("Cluster number " + hex4(into[0]) + ",\nCluster chain length 1.", kAnswerYes)
        .expect("Cluster number " + hex4(loop[0]) + ",\nCluster chain length 2.", kAnswerYesAll);
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_FALSE(ui.remaining());
    EXPECT_EQ(a.chainClusters(owned[0]), owned);
    EXPECT_TRUE(isFree(into[0]));
    EXPECT_TRUE(isFree(loop[0]) && isFree(loop[1]));
}

TEST_F(CheckTest, NoSavesTheWholeChainIntoTheCrashFolderAndNoAllStops) {
    TempDir state;
    const char* old = std::getenv("XDG_STATE_HOME");
    const std::string saved = old != nullptr ? old : "";
    setenv("XDG_STATE_HOME", state.path().c_str(), 1);

    std::vector<uint8_t> data;
    auto kept = makeChain(a, 2, 50, &data);
    auto later = makeChain(a, 1, 60);
    auto last = makeChain(a, 1, 70);
    ui.expect("Cluster number " + hex4(kept[0]) + ",\nCluster chain length 2.", kAnswerNo)
        .expect("Cluster number " + hex4(later[0]), kAnswerNoAll);
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_FALSE(ui.remaining()) ;
    EXPECT_EQ(ui.asked.size(), 2u) << "the saved chain is not asked about again, nothing after No All";

    char name[32];
    std::snprintf(name, sizeof name, "Cluster_0x%X", kept[0]);
    std::vector<uint8_t> file;
    EXPECT_TRUE(fs::readWholeFile(state / ("vaultora/~VRACrash/" + std::string(name)), file));
    EXPECT_EQ(file, data);
    EXPECT_FALSE(isFree(kept[0]) || isFree(later[0]) || isFree(last[0])) << "nothing was freed";

    if (old != nullptr) setenv("XDG_STATE_HOME", saved.c_str(), 1);
    else unsetenv("XDG_STATE_HOME");
}

TEST_F(CheckTest, UnknownAnswerToTheLostChainPromptReportsTheDialogError) {
    makeChain(a, 1, 80);
    ui.expect("Cluster number", 0).expect("Error in starting dialog", kAnswerOk);
    EXPECT_EQ(CheckArchive(a), kInconsistent);
    EXPECT_EQ(ui.captions.back(), "Checking lost clusters");
}

}  // namespace
}  // namespace vaultora
