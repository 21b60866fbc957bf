#include <gtest/gtest.h>

#include <random>

#include "../archive/archive_fixture.h"
#include "archive/vaultora.h"
#include "operations/compact.h"
#include "platform/file.h"
#include "platform/text.h"
#include "unit_helpers.h"

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

TEST_F(Compacting, AddsReplacesAndDeletesLeaveNoGapAndTheFileIsLiveRecordsPlusTable) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    std::vector<std::vector<uint8_t>> data;
    auto name = [](uint32_t i) { return u"file" + std::u16string(1, static_cast<char16_t>(u'0' + i)); };
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        for (uint32_t i = 0; i < 8; ++i) {
            data.push_back(randomBytes(1000 + i * 90000, i));
            ASSERT_EQ(test::putFile(a, name(i), data.back()), kOk);
        }
        ASSERT_EQ(a.close(), kOk);
    }
    {
        Vaultora a(path);
        ASSERT_EQ(a.open(OpenKey{}), kOk);
        for (uint32_t i : {1u, 4u, 5u}) ASSERT_EQ(test::removeFile(a, name(i)), kOk);
        data[6] = randomBytes(50000, 60);
        ASSERT_EQ(test::putFile(a, name(6), data[6]), kOk);
        EXPECT_TRUE(hasSpaceToReclaim(a));
        ASSERT_EQ(a.close(), kOk);
    }
    EXPECT_FALSE(fs::exists(path + ".vrt"));
    Vaultora a(path);
    ASSERT_EQ(a.open(OpenKey{}), kOk);
    EXPECT_FALSE(hasSpaceToReclaim(a));
    EXPECT_EQ(a.header().cotOffset, liveRecordBytes(a));
    EXPECT_EQ(static_cast<uint64_t>(fs::fileSize(path)), a.dataStart() + a.header().cotOffset + a.header().cotLength);
    for (uint32_t i : {0u, 2u, 3u, 6u, 7u}) {
        std::vector<uint8_t> back;
        ASSERT_EQ(test::getFile(a, name(i), back), kOk);
        EXPECT_EQ(back, data[i]) << i;
    }
    std::vector<uint8_t> gone;
    EXPECT_NE(test::getFile(a, name(1), gone), kOk);
}

TEST_F(Compacting, AlreadyCompactArchiveKeepsEveryRecordWhereItIs) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        ASSERT_EQ(test::putFile(a, u"big", payloadFor(1, 700000)), kOk);
        ASSERT_EQ(test::putFile(a, u"small", payloadFor(2, 3000)), kOk);
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
    auto nextName = [&seed] { return u"fill" + fromUtf8(std::to_string(++seed)); };
    while (kSpaceUnit - a.dataEnd() > kMaxPayload + 300000)
        ASSERT_EQ(test::putFile(a, nextName(), randomBytes(kMaxPayload, seed)), kOk);
    ASSERT_EQ(test::putFile(a, nextName(), randomBytes(kSpaceUnit - a.dataEnd() - 200000, seed)), kOk);
    const uint64_t gap = kSpaceUnit - a.dataEnd();
    ASSERT_GE(gap, 190000u);
    ASSERT_LT(gap, 300000u);
    auto large = randomBytes(300000, 1000);
    auto smallData = randomBytes(50000, 1001);
    ASSERT_EQ(test::putFile(a, u"large", large), kOk);
    ASSERT_EQ(test::putFile(a, u"small", smallData), kOk);
    SecureBytes rl, rs;
    ASSERT_EQ(findUnitByPath(a, u"large", rl), kOk);
    ASSERT_EQ(findUnitByPath(a, u"small", rs), kOk);
    const uint32_t cl = unit::start(rl.data()), cs = unit::start(rs.data());
    ASSERT_EQ(a.cot()[cl].offset, kSpaceUnit);
    ASSERT_EQ(Compact(a, true), kOk);
    EXPECT_LT(a.cot()[cs].offset, kSpaceUnit);
    EXPECT_EQ(a.cot()[cl].offset, kSpaceUnit);
    std::vector<uint8_t> back;
    ASSERT_EQ(test::getFile(a, u"large", back), kOk);
    EXPECT_EQ(back, large);
    ASSERT_EQ(test::getFile(a, u"small", back), kOk);
    EXPECT_EQ(back, smallData);
}

}  // namespace
}  // namespace vaultora
