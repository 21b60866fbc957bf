// Adding a generated tree from disk and extracting it again: every byte, name, time, mode and
// extended attribute must come back.
#include <gtest/gtest.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cstring>
#include <map>

#include "archive/directory.h"
#include "archive/extract.h"
#include "archive/walk.h"
#include "operations/add.h"
#include "platform/disk_file.h"
#include "platform/file.h"
#include "support/scripted_interaction.h"
#include "support/temp_dir.h"

namespace vaultora {
namespace {

using test::ScriptedInteraction;
using test::TempDir;

std::vector<uint8_t> bytesFor(uint32_t seed, size_t n) {
    std::vector<uint8_t> p(n);
    uint32_t x = seed * 2654435761u + 7;
    for (size_t i = 0; i < n; ++i) {
        x = x * 1103515245u + 12345u;
        p[i] = static_cast<uint8_t>(x >> 16);
    }
    return p;
}

void writeFile(const std::string& path, const std::vector<uint8_t>& data, mode_t mode = 0644) {
    ASSERT_TRUE(fs::writeWholeFile(path, data.data(), data.size())) << path;
    ASSERT_EQ(::chmod(path.c_str(), mode), 0);
}

bool userXattrsWork(const std::string& folder) {
    const std::string probe = folder + "/.probe";
    fs::writeWholeFile(probe, "x", 1);
    const bool ok = ::setxattr(probe.c_str(), "user.probe", "1", 1, 0) == 0;
    ::unlink(probe.c_str());
    return ok;
}

struct Entry {
    DiskKind kind;
    uint32_t mode;
    int64_t mtimeSec, mtimeNsec;
    std::vector<uint8_t> body;  // file bytes or link target
    std::map<std::string, std::string> xattrs;
};

// Everything below `root` that a round trip must keep, by relative path.
std::map<std::string, Entry> snapshot(const std::string& root) {
    std::map<std::string, Entry> out;
    std::vector<std::string> pending{""};
    while (!pending.empty()) {
        const std::string rel = pending.back();
        pending.pop_back();
        for (const std::string& name : fs::listDirectory(root + rel)) {
            const std::string r = rel + "/" + name;
            const std::string full = root + r;
            struct stat st {};
            EXPECT_EQ(::lstat(full.c_str(), &st), 0);
            Entry e;
            e.mode = st.st_mode;
            e.mtimeSec = st.st_mtim.tv_sec;
            e.mtimeNsec = st.st_mtim.tv_nsec;
            if (S_ISDIR(st.st_mode)) {
                e.kind = DiskKind::kFolder;
                pending.push_back(r);
            } else if (S_ISLNK(st.st_mode)) {
                e.kind = DiskKind::kSymlink;
                std::string target;
                readLink(full, target);
                e.body.assign(target.begin(), target.end());
            } else {
                e.kind = DiskKind::kFile;
                fs::readWholeFile(full, e.body);
                std::vector<std::string> names;
                listStreams(full, names);
                for (const std::string& n : names) {
                    SecureBytes v;
                    readStream(full, n, v);
                    e.xattrs[n] = std::string(v.begin(), v.end());
                }
            }
            out[r] = std::move(e);
        }
    }
    return out;
}

TEST(AddRoundTrip, GeneratedTreeComesBackByteForByteWithNamesTimesModesAndXattrs) {
    TempDir dir;
    const std::string src = dir / "src";
    ASSERT_TRUE(fs::createDirectories(src + "/nested/deeper/deepest"));
    ASSERT_TRUE(fs::createDirectories(src + "/empty folder"));
    if (!userXattrsWork(src)) GTEST_SKIP() << "the file system of " << src << " refuses user extended attributes";

    writeFile(src + "/empty", {});
    writeFile(src + "/one", bytesFor(1, 1));
    writeFile(src + "/five-eleven", bytesFor(2, 511));
    writeFile(src + "/five-twelve", bytesFor(3, 512));
    writeFile(src + "/nested/exact", bytesFor(4, 524288));
    writeFile(src + "/nested/exact-plus-one", bytesFor(5, 524289));
    writeFile(src + "/nested/deeper/big", bytesFor(6, 20u << 20));
    writeFile(src + "/nested/deeper/deepest/Ünïcödé ✓ 日本", bytesFor(7, 100));
    writeFile(src + "/bad-utf8-\xff\xfe-name", bytesFor(8, 33));
    writeFile(src + "/odd:na\\me*wh?at\"<x>|", bytesFor(9, 700));
    writeFile(src + "/50%", bytesFor(10, 5));
    writeFile(src + "/read-only", bytesFor(11, 44), 0444);
    writeFile(src + "/tool.sh", bytesFor(12, 900), 0755);
    writeFile(src + "/.hidden", bytesFor(13, 3), 0600);
    ASSERT_EQ(::symlink("nested/exact", (src + "/link-to-file").c_str()), 0);
    ASSERT_EQ(::symlink("nested", (src + "/link-to-folder").c_str()), 0);
    ASSERT_EQ(::symlink("/nowhere/at/all", (src + "/dangling").c_str()), 0);
    const std::string withXattrs = src + "/nested/tagged";
    writeFile(withXattrs, bytesFor(14, 2000));
    ASSERT_EQ(::setxattr(withXattrs.c_str(), "user.short", "v", 1, 0), 0);
    const std::vector<uint8_t> longValue = bytesFor(15, 3000);
    ASSERT_EQ(::setxattr(withXattrs.c_str(), "user.long", longValue.data(), longValue.size(), 0), 0);
    ASSERT_EQ(::setxattr(withXattrs.c_str(), "user.with:colon", "c", 1, 0), 0);
    ASSERT_EQ(::setxattr(withXattrs.c_str(), "user.empty", "", 0, 0), 0);
    // Read-only files get their attribute first so its stream write has to lift the bit.
    ASSERT_EQ(::chmod(withXattrs.c_str(), 0444), 0);
    // Folder times are set last, after everything inside them is written.
    for (const char* f : {"/nested/deeper/deepest", "/nested/deeper", "/nested", "/empty folder"}) {
        struct timespec ts[2] = {{1000000000, 123456700}, {1100000000, 987654300}};
        ASSERT_EQ(::utimensat(AT_FDCWD, (src + f).c_str(), ts, AT_SYMLINK_NOFOLLOW), 0);
    }
    const auto before = snapshot(src);

    const std::string path = dir / "a.vra";
    ScriptedInteraction ui;
    streamAnswer = kAnswerYes;
    ui.expect("Alternate Data Stream", kAnswerYesAll);
    {
        Vaultora a(path, &ui);
        ASSERT_EQ(a.create(nullptr, 0), kOk);
        ToAllFlags flags;
        Adder adder(a);
        ASSERT_EQ(adder.AddTree(u"", src + "/*", flags, kModePlain), kOk);
        EXPECT_EQ(adder.filesAdded, 22u);  // 18 files and links + 4 streams
        ASSERT_EQ(adder.flush(), kOk);
    }
    {
        Vaultora a(path, &ui);
        ASSERT_EQ(a.close(), kOk);
    }
    Vaultora a(path, &ui);
    ASSERT_EQ(a.open(OpenKey{}), kOk);

    // The units themselves: inline below 512 bytes, chains of whole clusters otherwise.
    SecureBytes u;
    ASSERT_EQ(findUnitByPath(a, u"five-eleven", u), kOk);
    EXPECT_EQ(unit::kind(u.data()), kUnitInline);
    ASSERT_EQ(findUnitByPath(a, u"five-twelve", u), kOk);
    EXPECT_EQ(unit::kind(u.data()), kUnitChain);
    ASSERT_EQ(findUnitByPath(a, u"empty", u), kOk);
    EXPECT_EQ(unit::start(u.data()), 0u);
    ASSERT_EQ(findUnitByPath(a, u"nested\\exact", u), kOk);
    EXPECT_EQ(a.chainClusters(unit::start(u.data())).size(), 1u);
    ASSERT_EQ(findUnitByPath(a, u"nested\\exact-plus-one", u), kOk);
    auto chain = a.chainClusters(unit::start(u.data()));
    ASSERT_EQ(chain.size(), 2u);
    ASSERT_EQ(findUnitByPath(a, u"odd\uF03Ana\uF05Cme\uF02Awh\uF03Fat\uF022\uF03Cx\uF03E\uF07C", u), kOk);
    ASSERT_EQ(findUnitByPath(a, u"nested\\tagged:short:$DATA", u), kOk);
    EXPECT_EQ(unit::kind(u.data()), kUnitInline);

    const std::string out = dir / "out";
    ASSERT_TRUE(fs::createDirectories(out));
    cExtractFileActorBlock actor(a, out);
    ASSERT_EQ(walk(a, u"*", 0, u"", actor, nullptr), kOk);
    const auto after = snapshot(out);

    ASSERT_EQ(after.size(), before.size());
    for (const auto& [rel, e] : before) {
        auto it = after.find(rel);
        ASSERT_NE(it, after.end()) << "missing after extraction: " << rel;
        const Entry& x = it->second;
        EXPECT_EQ(x.kind, e.kind) << rel;
        EXPECT_EQ(x.body, e.body) << rel;
        EXPECT_EQ(x.xattrs, e.xattrs) << rel;
        EXPECT_EQ(x.mtimeSec, e.mtimeSec) << rel;
        EXPECT_EQ(x.mtimeNsec / 100, e.mtimeNsec / 100) << rel;  // FILETIME keeps 100 ns steps
        if (e.kind != DiskKind::kSymlink) {
            EXPECT_EQ(x.mode & 07777, e.mode & 07777) << rel;
        }
    }
    EXPECT_FALSE(ui.remaining());
}

TEST(AddRoundTrip, StatisticsCountFilesFoldersAndSizes) {
    TempDir dir;
    ASSERT_TRUE(fs::createDirectories(dir / "s/sub"));
    writeFile(dir / "s/a", bytesFor(1, 600000));
    writeFile(dir / "s/sub/b", bytesFor(2, 10));
    ScriptedInteraction ui;
    Vaultora a(dir / "a.vra", &ui);
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    {
        ToAllFlags flags;
        Adder adder(a);
        ASSERT_EQ(adder.AddTree(u"", dir / "s", flags, kModePlain), kOk);
    }
    SizeCount count;
    ASSERT_EQ(countSizes(a, 0, count), kOk);
    EXPECT_EQ(count.files, 2u);
    EXPECT_EQ(count.folders, 2u);
    EXPECT_GE(count.realSize, 600000u);
    std::u16string text, caption;
    ASSERT_EQ(showArchiveStatistics(a, text, caption), kOk);
    EXPECT_NE(toUtf8(text).find("Files 2\nFolders 2\n"), std::string::npos) << toUtf8(text);
    EXPECT_NE(toUtf8(text).find("File format v.2.1"), std::string::npos);
    EXPECT_EQ(toUtf8(caption), "Archive statistic");
    EXPECT_EQ(toUtf8(sizeText(1536)), "1.5 KB");
    EXPECT_EQ(toUtf8(sizeText(1024)), "1 KB");
    EXPECT_EQ(toUtf8(sizeText(2047)), "2.0 KB");
}

}  // namespace
}  // namespace vaultora
