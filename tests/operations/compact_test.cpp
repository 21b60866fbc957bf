#include <gtest/gtest.h>

#include <random>

#include "../archive/archive_fixture.h"
#include "archive/vaultora.h"
#include "operations/compact.h"
#include "platform/file.h"

namespace vaultora {
namespace {

using test::payloadFor;
using test::readChain;
using test::ScriptedInteraction;
using test::TempDir;
using test::writeChain;

class Compacting : public ::testing::Test {
protected:
    void SetUp() override { installOperationHooks(); }
    void TearDown() override { setArchiveHooks({}); }
};

std::vector<uint8_t> randomBytes(size_t n, uint32_t seed) {
    std::mt19937 rng(seed);
    std::vector<uint8_t> v(n);
    for (auto& b : v) b = static_cast<uint8_t>(rng());
    return v;
}

uint64_t liveRecordBytes(const Vaultora& a) {
    uint64_t total = 0;
    for (const CotEntry& e : a.cot())
        if (e.used() && !e.inClusterFile()) total += e.size;
    return total;
}

TEST_F(Compacting, FreedChainsLeaveNoGapAndTheFileIsLiveRecordsPlusTable) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    std::vector<std::vector<uint8_t>> data;
    std::vector<uint32_t> starts;
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        for (uint32_t i = 0; i < 8; ++i) {
            data.push_back(payloadFor(i, 1000 + i * 90000));
            starts.push_back(writeChain(a, data.back()));
        }
        ASSERT_EQ(a.close(), kOk);
    }
    {
        Vaultora a(path);
        ASSERT_EQ(a.open(OpenKey{}), kOk);
        for (uint32_t i : {1u, 4u, 5u}) ASSERT_TRUE(a.freeChain(starts[i]));
        // A replaced chain: new data appended behind, old freed.
        data[6] = payloadFor(60, 50000);
        a.freeChain(starts[6]);
        starts[6] = writeChain(a, data[6]);
        EXPECT_TRUE(hasSpaceToReclaim(a));
        ASSERT_EQ(a.close(), kOk);
    }
    EXPECT_FALSE(fs::exists(path + ".vrt"));
    Vaultora a(path);
    ASSERT_EQ(a.open(OpenKey{}), kOk);
    EXPECT_FALSE(hasSpaceToReclaim(a));
    EXPECT_EQ(a.header().cotOffset, liveRecordBytes(a));
    EXPECT_EQ(static_cast<uint64_t>(fs::fileSize(path)), a.dataStart() + a.header().cotOffset + a.header().cotLength);
    for (uint32_t i : {0u, 2u, 3u, 6u, 7u}) EXPECT_EQ(readChain(a, starts[i]), data[i]) << i;
}

TEST_F(Compacting, AlreadyCompactArchiveKeepsEveryRecordWhereItIs) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        writeChain(a, payloadFor(1, 700000));
        writeChain(a, payloadFor(2, 3000));
        ASSERT_EQ(a.close(), kOk);
    }
    std::vector<CotEntry> before;
    {
        Vaultora a(path);
        ASSERT_EQ(a.open(OpenKey{}), kOk);
        before = a.cot();
        ASSERT_EQ(Compact(a, true), kOk);
        EXPECT_EQ(a.cot(), before);
        EXPECT_FALSE(fs::exists(a.crashPath("~Cluster.dat")));
    }
    Vaultora a(path);
    ASSERT_EQ(a.open(OpenKey{}), kOk);
    EXPECT_EQ(a.cot(), before);
}

TEST_F(Compacting, UnforcedCompactDoesNothingWhenTheFlagIsClear) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    Vaultora a(path);
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    writeChain(a, payloadFor(1, 100));
    a.setCompactWhenUpdated(false);
    ASSERT_EQ(Compact(a, false), kOk);
    EXPECT_TRUE(a.isModified());
    ASSERT_EQ(a.close(), kOk);  // closing still commits
    EXPECT_FALSE(fs::exists(path + ".vrt"));
}

TEST_F(Compacting, ArchiveWithAllRecordsInClusterFilesCompactsFromDataStart) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    Vaultora a(path);
    ASSERT_EQ(a.create(nullptr, 0), kOk);  // only the root, in its cluster file
    ASSERT_EQ(Compact(a, true), kOk);
    EXPECT_EQ(a.cot()[0].offset, 0u);
    EXPECT_EQ(a.header().cotOffset, a.cot()[0].size);
}

TEST_F(Compacting, OverlappingMovePassesThroughTheClusterCopy) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    Vaultora a(path);
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    uint32_t small = writeChain(a, payloadFor(1, 100));
    auto bigData = randomBytes(200000, 9);
    uint32_t big = writeChain(a, bigData);
    a.freeChain(small);  // a gap smaller than the big record opens before it
    ASSERT_EQ(a.saveClusterTable(), kOk);
    uint64_t dest = 0;
    const uint64_t from = a.cot()[big].offset;
    ASSERT_LT(from, a.cot()[big].size);  // the move overlaps the record's own bytes
    ASSERT_EQ(MoveClusterRecord(a, big, dest), kOk);
    EXPECT_EQ(a.cot()[big].offset, 0u);
    EXPECT_FALSE(fs::exists(a.crashPath("~Cluster.dat")));
    EXPECT_EQ(readChain(a, big), bigData);
}

// Space unit 0 filled up to a 200,000-byte gap; behind it, in unit 1, a 300,000-byte record and a
// small one. The small one (last) moves into the gap, the large one does not fit and stays.
TEST_F(Compacting, RecordLargerThanTheGapStaysInItsSpaceUnit) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    Vaultora a(path);
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    uint32_t seed = 0;
    while (kSpaceUnit - a.dataEnd() > kMaxPayload + 300000) writeChain(a, randomBytes(kMaxPayload, ++seed), false);
    const uint64_t remaining = kSpaceUnit - a.dataEnd();
    writeChain(a, randomBytes(remaining - 200000, ++seed), false);
    const uint64_t gap = kSpaceUnit - a.dataEnd();
    ASSERT_GE(gap, 190000u);
    ASSERT_LT(gap, 300000u);
    auto large = randomBytes(300000, 1000);
    auto smallData = randomBytes(50000, 1001);
    uint32_t cl = writeChain(a, large, false);
    uint32_t cs = writeChain(a, smallData, false);
    ASSERT_EQ(a.cot()[cl].offset, kSpaceUnit);
    ASSERT_EQ(Compact(a, true), kOk);
    EXPECT_LT(a.cot()[cs].offset, kSpaceUnit);
    EXPECT_EQ(a.cot()[cl].offset, kSpaceUnit);
    // The root directory, still in its cluster file, is appended behind the last record.
    EXPECT_EQ(a.cot()[0].offset, kSpaceUnit + a.cot()[cl].size);
    EXPECT_EQ(a.header().cotOffset, a.cot()[0].offset + a.cot()[0].size);
    EXPECT_EQ(readChain(a, cl), large);
    EXPECT_EQ(readChain(a, cs), smallData);
}

}  // namespace
}  // namespace vaultora
