#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>
#include <zlib.h>

#include <cstring>
#include <fstream>

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

std::vector<uint8_t> fileBytes(const std::string& path) {
    std::vector<uint8_t> b;
    EXPECT_TRUE(fs::readWholeFile(path, b));
    return b;
}

// Decodes an unencrypted archive file independently of the engine: header fields, then the COT
// record at D + cotOffset with zlib directly.
struct RawArchive {
    uint32_t embedded = 0, dataOffset = 0, cotLength = 0;
    uint64_t cotOffset = 0;
    std::vector<uint8_t> table;  // raw COT bytes
    explicit RawArchive(const std::vector<uint8_t>& f, uint32_t at = 0) {
        embedded = at;
        EXPECT_EQ(std::memcmp(f.data() + at, "KorvelEncryptArc", 16), 0);
        dataOffset = getU32(&f[at + 24]);
        cotOffset = getU64(&f[at + 28]);
        cotLength = getU32(&f[at + 36]);
        size_t pos = at + dataOffset + cotOffset;
        EXPECT_EQ(pos + cotLength, f.size()) << "the table is the last thing in the file";
        uint32_t r = getU32(&f[pos]);
        uint8_t p = f[pos + 8];
        table.resize(r);
        uLongf len = r;
        EXPECT_EQ(uncompress(table.data(), &len, &f[pos + p], cotLength - p), Z_OK);
    }
    uint32_t next(uint32_t c) const { return getU32(&table[c * 16]); }
    uint64_t offset(uint32_t c) const { return getU64(&table[c * 16 + 4]); }
    uint32_t size(uint32_t c) const { return getU32(&table[c * 16 + 12]); }
};

TEST(ArchiveObject, CreatedArchiveReopensWithRootVolumeRecordAndNoTemporaryFolder) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        EXPECT_EQ(a.close(), kOk);
    }
    EXPECT_FALSE(fs::exists(path + ".vrt"));
    auto f = fileBytes(path);
    RawArchive raw(f);
    EXPECT_EQ(f[16], 2);
    EXPECT_EQ(f[17], 1);
    EXPECT_EQ(f[19], 8);
    EXPECT_EQ(getU32(&f[64]), 68u);
    EXPECT_EQ(raw.dataOffset, 68u);
    ASSERT_EQ(raw.table.size(), 16u);  // only cluster 0
    EXPECT_EQ(raw.next(0), kEndOfChain);

    ScriptedInteraction ui;
    Vaultora b(path, &ui);
    ASSERT_EQ(b.open(OpenKey{}), kOk);
    ChainBuffer root;
    root.cluster = 0;
    ASSERT_EQ(b.readCluster(root), kOk);
    ASSERT_EQ(root.data.size(), 48u);
    EXPECT_EQ(unit::kind(root.data.data()), kUnitVolume);
    EXPECT_EQ(unit::attributes(root.data.data()), 8u);
    EXPECT_EQ(unit::created(root.data.data()), 0x0000000800001999ull);
    EXPECT_EQ(unit::modified(root.data.data()), 0x13u);
}

TEST(ArchiveObject, DataChainsSurviveCommitAndTheFileEndsAtTheTable) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    auto big = payloadFor(1, 524289);  // two clusters
    auto small = payloadFor(2, 700);
    uint32_t s1, s2;
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        s1 = writeChain(a, big);
        s2 = writeChain(a, small);
        ASSERT_EQ(a.close(), kOk);
    }
    auto f = fileBytes(path);
    RawArchive raw(f);
    EXPECT_NE(raw.next(s1), kEndOfChain);
    EXPECT_EQ(raw.next(raw.next(s1)), kEndOfChain);
    // Each record lies inside the data area, before the table.
    for (uint32_t c : {s1, raw.next(s1), s2}) EXPECT_LE(raw.offset(c) + raw.size(c), raw.cotOffset);

    Vaultora b(path);
    ASSERT_EQ(b.open(OpenKey{}), kOk);
    EXPECT_EQ(readChain(b, s1), big);
    EXPECT_EQ(readChain(b, s2), small);
}

TEST(ArchiveObject, OpenResultsForMissingForeignAndNewerFiles) {
    TempDir dir;
    Vaultora missing(dir / "none.vra");
    EXPECT_EQ(missing.open(OpenKey{}), kNoSuchFile);

    std::ofstream(dir / "text.vra") << "just some text, no header here";
    Vaultora foreign(dir / "text.vra");
    EXPECT_EQ(foreign.open(OpenKey{}), kNotArchive);

    for (auto [maj, min] : {std::pair{2, 2}, std::pair{3, 0}}) {
        const std::string path = dir / ("v" + std::to_string(maj) + std::to_string(min) + ".vra");
        {
            Vaultora a(path);
            ASSERT_EQ(a.create(nullptr, 0), kOk);
        }
        auto f = fileBytes(path);
        f[16] = static_cast<uint8_t>(maj);
        f[17] = static_cast<uint8_t>(min);
        ASSERT_TRUE(fs::writeWholeFile(path, f.data(), f.size()));
        Vaultora b(path);
        EXPECT_EQ(b.open(OpenKey{}), kNewerFormat);
    }
}

TEST(ArchiveObject, TruncatedOrDamagedArchivesGiveCodesNotCrashes) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        writeChain(a, payloadFor(5, 2000));
    }
    const auto good = fileBytes(path);
    for (size_t cut = 0; cut < good.size(); cut += 7) {
        std::vector<uint8_t> t(good.begin(), good.begin() + static_cast<long>(cut));
        ASSERT_TRUE(fs::writeWholeFile(path, t.data(), t.size()));
        Vaultora b(path);
        EXPECT_NE(b.open(OpenKey{}), kOk) << "cut at " << cut;
    }
    // A wrong stored table length.
    auto bad = good;
    putU32(&bad[36], getU32(&bad[36]) + 8);
    ASSERT_TRUE(fs::writeWholeFile(path, bad.data(), bad.size()));
    Vaultora c(path);
    EXPECT_NE(c.open(OpenKey{}), kOk);
}

TEST(ArchiveObject, UnencryptedHeaderCheckCatchesAChangedHeader) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
    }
    auto f = fileBytes(path);
    f[36] ^= 1;  // cotLength, covered by the check
    ASSERT_TRUE(fs::writeWholeFile(path, f.data(), f.size()));
    Vaultora b(path);
    EXPECT_EQ(b.open(OpenKey{}), kWrongPassword);
}

TEST(ArchiveObject, AllocateGrowsTableAndNeverHandsOutClusterZero) {
    TempDir dir;
    Vaultora a(dir / "a.vra");
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    a.mutableCot().resize(10);
    for (uint32_t i = 1; i < 10; ++i) a.mutableCot()[i] = {kEndOfChain, 0, 0};
    EXPECT_EQ(a.allocateCluster(3), 10u);
    EXPECT_EQ(a.cot().size(), 74u);
    a.mutableCot()[5] = {};
    EXPECT_EQ(a.allocateCluster(kNoCluster), 5u);
    uint32_t added = 0;
    ASSERT_EQ(a.appendCluster(2, added), kOk);
    EXPECT_EQ(a.nextCluster(2), added);
    EXPECT_EQ(a.previousCluster(added), 2u);
    EXPECT_NE(added, 0u);
}

TEST(ArchiveObject, ChainWalksEndOnALoopInADamagedTable) {
    TempDir dir;
    Vaultora a(dir / "a.vra");
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    a.mutableCot().resize(4);
    a.mutableCot()[1] = {2, 0, 0};
    a.mutableCot()[2] = {3, 0, 0};
    a.mutableCot()[3] = {1, 0, 0};
    EXPECT_LE(a.chainClusters(1).size(), a.cot().size() + 1);
    EXPECT_FALSE(a.freeChain(1));
}

TEST(ArchiveObject, LostClusterQuestionYesGivesEmptyNoGives76) {
    TempDir dir;
    ScriptedInteraction ui;
    Vaultora a(dir / "a.vra", &ui);
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    ui.expect("Cluster information is lost!\nCluster number 7\nTotal clusters 64", kAnswerYes)
        .expect("Cluster number 7", kAnswerNo);
    ChainBuffer b;
    b.cluster = 7;
    EXPECT_EQ(a.readCluster(b), kOk);
    EXPECT_TRUE(b.data.empty());
    EXPECT_EQ(a.readCluster(b), kInconsistent);
    EXPECT_EQ(ui.errorNotes.size(), 1u);
    EXPECT_NE(ui.errorNotes[0].find("Error 76, File HXZip"), std::string::npos);
}

TEST(ArchiveObject, ClusterFileWithBadPrefixOrLengthIs76) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    Vaultora a(path);
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    // The root lives in its cluster file until the commit.
    const std::string cls = a.clusterFilePath(0);
    auto good = fileBytes(cls);
    ASSERT_EQ(good[0], 'H');
    auto bad = good;
    bad[1] = 'Y';
    ASSERT_TRUE(fs::writeWholeFile(cls, bad.data(), bad.size()));
    std::vector<uint8_t> rec;
    EXPECT_EQ(a.readRecord(0, rec), kInconsistent);
    bad = good;
    bad.push_back(0);
    ASSERT_TRUE(fs::writeWholeFile(cls, bad.data(), bad.size()));
    EXPECT_EQ(a.readRecord(0, rec), kInconsistent);
    ASSERT_TRUE(fs::writeWholeFile(cls, good.data(), good.size()));
    EXPECT_EQ(a.readRecord(0, rec), kOk);
}

TEST(ArchiveObject, SavingTheTableAtAPositionCutsTheFileThere) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    Vaultora a(path);
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    uint32_t s = writeChain(a, payloadFor(3, 100000));
    const uint64_t end = a.dataEnd();
    // Make the file longer than it should be.
    std::vector<uint8_t> junk(5000, 0xAB);
    ASSERT_TRUE(a.file().writeAt(a.dataStart() + end + 100, junk.data(), junk.size()));
    uint64_t de = end;
    ASSERT_EQ(a.moveAllClusterFiles(de), kOk);
    ASSERT_EQ(a.saveClusterTable(de), kOk);
    EXPECT_EQ(static_cast<uint64_t>(a.file().size()), a.dataStart() + de + a.header().cotLength);
    ASSERT_EQ(a.close(), kOk);
    Vaultora b(path);
    ASSERT_EQ(b.open(OpenKey{}), kOk);
    EXPECT_EQ(readChain(b, s), payloadFor(3, 100000));
}

TEST(ArchiveObject, PlacementRuleSkipsToTheNext32MiBBoundary) {
    TempDir dir;
    Vaultora a(dir / "a.vra");
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    a.setDataEnd(kSpaceUnit - 10);
    uint32_t c = a.allocateCluster(kNoCluster);
    auto p = payloadFor(1, 1000);
    ASSERT_EQ(a.writeDataCluster(c, p.data(), 1000, true), kOk);
    EXPECT_EQ(a.cot()[c].offset, kSpaceUnit);
    EXPECT_EQ(a.dataEnd(), kSpaceUnit + a.cot()[c].size);
}

TEST(ArchiveObject, ResumesFromCotCopyAfterAnInterruptedRun) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    auto before = payloadFor(10, 3000);
    auto during = payloadFor(11, 5000);
    uint32_t s1 = 0, s2 = 0;
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        s1 = writeChain(a, before);
        ASSERT_EQ(a.close(), kOk);
    }
    pid_t pid = fork();
    if (pid == 0) {
        Vaultora a(path);
        if (a.open(OpenKey{}) != kOk) _exit(2);
        s2 = writeChain(a, during);
        _exit(s2 == 1 ? 3 : 4);  // leave without committing
    }
    int status = 0;
    waitpid(pid, &status, 0);
    ASSERT_TRUE(WIFEXITED(status));
    ASSERT_TRUE(fs::exists(path + ".vrt/~COT.dat"));
    {
        ScriptedInteraction ui;  // nothing may be asked
        Vaultora a(path, &ui);
        ASSERT_EQ(a.open(OpenKey{}), kOk);
        EXPECT_TRUE(a.isModified());
        EXPECT_EQ(readChain(a, s1), before);
        uint32_t s = a.cot().size() > 2 && a.cot()[2].used() ? 2 : 0;
        ASSERT_NE(s, 0u);
        EXPECT_EQ(readChain(a, s), during);
        ASSERT_EQ(a.close(), kOk);
    }
    EXPECT_FALSE(fs::exists(path + ".vrt"));
    // With only the older copy left, the archive still opens.
    {
        Vaultora a(path);
        ASSERT_EQ(a.open(OpenKey{}), kOk);
        writeChain(a, payloadFor(12, 100));
        writeChain(a, payloadFor(13, 100));
        a.file().close();  // simulate the end of the process: no commit
    }
    ASSERT_TRUE(fs::exists(path + ".vrt/~COTCopy.dat"));
    fs::removeFile(path + ".vrt/~COT.dat");
    Vaultora b(path);
    ASSERT_EQ(b.open(OpenKey{}), kOk);
    EXPECT_TRUE(b.isModified());
    EXPECT_EQ(readChain(b, s1), before);
}

TEST(ArchiveObject, WithoutAnyTableCopyAndNoStoredTableTheOpenFails) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        a.file().close();  // never committed: the header says the table is not stored
    }
    fs::removeTree(path + ".vrt");
    Vaultora b(path);
    EXPECT_EQ(b.open(OpenKey{}), kBadRecord);
}

TEST(ArchiveObject, HeaderCopyLeftBehindIsAdoptedAndWrittenBack) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        writeChain(a, payloadFor(1, 100));
        ASSERT_EQ(a.close(), kOk);
    }
    auto good = fileBytes(path);
    std::vector<uint8_t> header(good.begin(), good.begin() + 68);
    // The header in the archive is stale (an older table position), the copy is the new one.
    auto stale = good;
    putU64(&stale[28], 0);
    ASSERT_TRUE(fs::writeWholeFile(path, stale.data(), stale.size()));
    ASSERT_TRUE(fs::createDirectories(path + ".vrt"));
    ASSERT_TRUE(fs::writeWholeFile(path + ".vrt/~Signature.dat", header.data(), header.size()));
    {
        Vaultora a(path);
        ASSERT_EQ(a.open(OpenKey{}), kOk);
    }
    EXPECT_EQ(fileBytes(path), good);
    // A short copy is discarded and the archive's header used.
    ASSERT_TRUE(fs::createDirectories(path + ".vrt"));
    ASSERT_TRUE(fs::writeWholeFile(path + ".vrt/~Signature.dat", header.data(), 30));
    Vaultora b(path);
    EXPECT_EQ(b.open(OpenKey{}), kOk);
    EXPECT_FALSE(fs::exists(path + ".vrt/~Signature.dat"));
}

TEST(ArchiveObject, CancellingTheMasterKeyCopyQuestionEndsTheOpenAndKeepsTheCopy) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
    }
    ASSERT_TRUE(fs::createDirectories(path + ".vrt"));
    const char block[] = "block";
    ASSERT_TRUE(fs::writeWholeFile(path + ".vrt/~MasterKeyPkt.dat", block, 5));
    ScriptedInteraction ui;
    ui.expect("Master key block copy exists in temporary directory.", kAnswerCancel);
    Vaultora a(path, &ui);
    EXPECT_EQ(a.open(OpenKey{}), kCancelled);
    EXPECT_TRUE(fs::exists(path + ".vrt/~MasterKeyPkt.dat"));
    ui.expect("Master key block copy exists", kAnswerNo);
    EXPECT_EQ(a.open(OpenKey{}), kOk);
}

TEST(ArchiveObject, InterruptedClusterFileRewriteIsPutBack) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        a.file().close();  // leave it modified, root in CN0000.CLS
    }
    // The rewrite renamed the old file and stopped before the new one was complete.
    ASSERT_TRUE(fs::renameFile(path + ".vrt/CN0000.CLS", path + ".vrt/CN0000.REN"));
    const char partial[] = "HX";
    ASSERT_TRUE(fs::writeWholeFile(path + ".vrt/CN0000.CLS", partial, 2));
    Vaultora a(path);
    ASSERT_EQ(a.open(OpenKey{}), kOk);
    ChainBuffer root;
    root.cluster = 0;
    ASSERT_EQ(a.readCluster(root), kOk);
    EXPECT_EQ(root.data.size(), 48u);
    EXPECT_FALSE(fs::exists(path + ".vrt/CN0000.REN"));
}

TEST(ArchiveObject, DirectoryCacheHoldsBatchWritesUntilTheBatchEnds) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    Vaultora a(path);
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    ASSERT_EQ(a.close(), kOk);
    ASSERT_EQ(a.open(OpenKey{}), kOk);
    a.setBatch(true);
    ChainBuffer root;
    root.cluster = 0;
    ASSERT_EQ(a.readCluster(root), kOk);
    auto rec = unit::make(u"x");
    root.data.insert(root.data.end(), rec.begin(), rec.end());
    root.dirty = true;
    ASSERT_EQ(a.writeDirectoryCluster(root, true), kOk);
    EXPECT_FALSE(fs::exists(a.clusterFilePath(0)));
    ChainBuffer again;
    again.cluster = 0;
    ASSERT_EQ(a.readCluster(again), kOk);
    EXPECT_EQ(again.data.size(), 98u);
    a.setBatch(false);
    EXPECT_TRUE(fs::exists(a.clusterFilePath(0)));
    ASSERT_EQ(a.close(), kOk);
    Vaultora b(path);
    ASSERT_EQ(b.open(OpenKey{}), kOk);
    ChainBuffer r2;
    r2.cluster = 0;
    ASSERT_EQ(b.readCluster(r2), kOk);
    EXPECT_EQ(r2.data.size(), 98u);
}

// Two processes: a writer locks others out; a reader lets others read only.
TEST(ArchiveLocking, WriterExcludesOthersAndReaderAllowsReadersOnly) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
    }
    for (bool childReadOnly : {false, true}) {
        int toChild[2], toParent[2];
        ASSERT_EQ(pipe(toChild), 0);
        ASSERT_EQ(pipe(toParent), 0);
        pid_t pid = fork();
        if (pid == 0) {
            Vaultora a(path);
            char c = a.openFile(childReadOnly) == kOk ? 'k' : 'f';
            (void)!write(toParent[1], &c, 1);
            (void)!read(toChild[0], &c, 1);
            _exit(0);
        }
        char c = 0;
        ASSERT_EQ(read(toParent[0], &c, 1), 1);
        ASSERT_EQ(c, 'k');
        Vaultora here(path);
        if (childReadOnly) {
            EXPECT_EQ(here.openFile(false), kInUse);
            EXPECT_EQ(here.open(OpenKey{}), kOk);
            EXPECT_TRUE(here.isReadOnly());
        } else {
            EXPECT_EQ(here.openFile(true), kInUse);
            EXPECT_EQ(here.open(OpenKey{}), kInUse);
        }
        here.close();
        (void)!write(toChild[1], "x", 1);
        int status = 0;
        waitpid(pid, &status, 0);
        for (int fd : {toChild[0], toChild[1], toParent[0], toParent[1]}) ::close(fd);
    }
}

// An archive the user may not write fails the read-write open with 71 and opens read-only. Root
// may write any file, so as root the check runs in a child that has given up root.
TEST(ArchiveLocking, UnwritableArchiveOpensReadOnly) {
    TempDir dir;
    const std::string path = dir / "a.vra";
    {
        Vaultora a(path);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        writeChain(a, payloadFor(1, 100));
    }
    ASSERT_EQ(chmod(path.c_str(), 0444), 0);
    ASSERT_EQ(chmod(dir.path().c_str(), 0755), 0);
    pid_t pid = fork();
    ASSERT_GE(pid, 0);
    if (pid == 0) {
        if (geteuid() == 0 && (setgid(65534) != 0 || setuid(65534) != 0)) _exit(10);
        Vaultora a(path);
        if (a.openFile(false) != kCannotOpen) _exit(11);
        if (a.open(OpenKey{}) != kOk) _exit(12);
        if (!a.isReadOnly()) _exit(13);
        _exit(0);
    }
    int status = 0;
    waitpid(pid, &status, 0);
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 0) << "10 no unprivileged user, 11 read-write open, 12 open, 13 not read-only";
}

}  // namespace
}  // namespace vaultora
