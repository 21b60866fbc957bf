// The decisions of adding: replace questions per mode, to-all answers, name clashes,
// cancellation and failures in the middle of a body.
#include <gtest/gtest.h>
#include <fcntl.h>
#include <sys/stat.h>

#include "archive/directory.h"
#include "archive/walk.h"
#include "operations/add.h"
#include "platform/disk_file.h"
#include "platform/file.h"
#include "platform/text.h"
#include "support/scripted_interaction.h"
#include "support/temp_dir.h"

namespace vaultora {
namespace {

using test::ScriptedInteraction;
using test::TempDir;

// Records the status lines as "path|status".
class Recorder : public ScriptedInteraction {
public:
    void progressLog(std::u16string_view text, std::u16string_view detail) override {
        lines.push_back(toUtf8(text) + "|" + toUtf8(detail));
    }
    bool sawStatus(const std::string& s) const {
        for (const auto& l : lines)
            if (l.size() >= s.size() && l.compare(l.size() - s.size(), s.size(), s) == 0) return true;
        return false;
    }
    std::vector<std::string> lines;
};

void writeText(const std::string& path, const std::string& text, int64_t mtime) {
    ASSERT_TRUE(fs::writeWholeFile(path, text.data(), text.size()));
    struct timespec ts[2] = {{mtime, 0}, {mtime, 0}};
    ASSERT_EQ(::utimensat(AT_FDCWD, path.c_str(), ts, 0), 0);
}

std::string body(Vaultora& a, std::u16string_view path) {
    SecureBytes b;
    EXPECT_EQ(readUnitIntoBuffer(a, path, b), kOk);
    return std::string(b.begin(), b.end());
}

struct Fixture {
    TempDir dir;
    Recorder ui;
    Vaultora a{dir / "a.vra", &ui};
    Fixture() {
        streamAnswer = kAnswerYes;
        EXPECT_EQ(a.create(nullptr, 0), kOk);
        EXPECT_TRUE(fs::createDirectories(dir / "src"));
    }
    Result add(const std::string& source, int mode, ToAllFlags& flags) {
        Adder adder(a);
        Result rc = adder.AddTree(u"", dir / source, flags, mode);
        EXPECT_EQ(adder.flush(), kOk);
        return rc;
    }
};

TEST(AddRules, PlainAddSkipsSameTimeAndBodyAsksOtherwiseAndRemembersToAll) {
    Fixture f;
    writeText(f.dir / "src/same", "same body", 1000);
    writeText(f.dir / "src/changed", "old", 1000);
    writeText(f.dir / "src/newer", "old newer", 1000);
    ToAllFlags flags;
    ASSERT_EQ(f.add("src/*", kModePlain, flags), kOk);

    writeText(f.dir / "src/changed", "new", 1000);        // same time, other body: asks
    writeText(f.dir / "src/newer", "new newer", 2000);    // other time: asks
    f.ui.expect("The archive already contains file\n\\changed", kAnswerNo);
    f.ui.expect("\\newer", kAnswerYes);
    ToAllFlags again;
    ASSERT_EQ(f.add("src/*", kModePlain, again), kOk);
    EXPECT_EQ(body(f.a, u"changed"), "old");
    EXPECT_EQ(body(f.a, u"newer"), "new newer");
    EXPECT_TRUE(f.ui.sawStatus("changed|Skipped"));

    writeText(f.dir / "src/changed", "newest", 3000);
    writeText(f.dir / "src/newer", "newest newer", 3000);
    f.ui.expect("\\changed", kAnswerYesAll);  // no second question for "newer"
    ToAllFlags third;
    ASSERT_EQ(f.add("src/*", kModePlain, third), kOk);
    EXPECT_TRUE(third.overwriteAll);
    EXPECT_EQ(body(f.a, u"changed"), "newest");
    EXPECT_EQ(body(f.a, u"newer"), "newest newer");

    writeText(f.dir / "src/changed", "x", 4000);
    writeText(f.dir / "src/newer", "y", 4000);
    f.ui.expect("\\changed", kAnswerNoAll);
    ToAllFlags fourth;
    ASSERT_EQ(f.add("src/*", kModePlain, fourth), kOk);
    EXPECT_TRUE(fourth.skipAll);
    EXPECT_EQ(body(f.a, u"newer"), "newest newer");
    EXPECT_FALSE(f.ui.remaining());
}

TEST(AddRules, SynchronizeTakesOnlyNewerDiskFiles) {
    Fixture f;
    writeText(f.dir / "src/older", "archive copy", 2000);
    writeText(f.dir / "src/later", "archive copy", 2000);
    ToAllFlags flags;
    ASSERT_EQ(f.add("src/*", kModePlain, flags), kOk);
    writeText(f.dir / "src/older", "disk copy", 1000);
    writeText(f.dir / "src/later", "disk copy", 3000);
    ToAllFlags sync;
    ASSERT_EQ(f.add("src/*", kModeSynchronize, sync), kOk);
    EXPECT_EQ(body(f.a, u"older"), "archive copy");
    EXPECT_EQ(body(f.a, u"later"), "disk copy");
    EXPECT_TRUE(f.ui.sawStatus("older|Archive contains latest version"));
}

TEST(AddRules, ImportAsksForOlderDiskFilesExceptRootAutoRun) {
    Fixture f;
    ASSERT_TRUE(fs::createDirectories(f.dir / "src/sub"));
    writeText(f.dir / "src/AutoRun.inf", "archive", 2000);
    writeText(f.dir / "src/sub/AutoRun.inf", "archive", 2000);
    writeText(f.dir / "src/plain", "archive", 2000);
    ToAllFlags flags;
    ASSERT_EQ(f.add("src/*", kModePlain, flags), kOk);
    writeText(f.dir / "src/AutoRun.inf", "disk", 1000);
    writeText(f.dir / "src/sub/AutoRun.inf", "disk", 1000);
    writeText(f.dir / "src/plain", "disk", 1000);
    f.ui.expect("Imported file date is early", kAnswerYes);   // plain
    f.ui.expect("Imported file date is early", kAnswerNo);    // sub\AutoRun.inf
    ToAllFlags import;
    ASSERT_EQ(f.add("src/*", kModeImport, import), kOk);
    EXPECT_EQ(body(f.a, u"AutoRun.inf"), "archive");
    EXPECT_EQ(body(f.a, u"sub\\AutoRun.inf"), "archive");
    EXPECT_EQ(body(f.a, u"plain"), "disk");
    EXPECT_FALSE(f.ui.remaining());
}

TEST(AddRules, ExportOffersToWipeDiskFilesMissingFromTheArchive) {
    Fixture f;
    writeText(f.dir / "src/kept", "in archive", 1000);
    ToAllFlags flags;
    ASSERT_EQ(f.add("src/*", kModePlain, flags), kOk);
    writeText(f.dir / "src/extra1", "not in archive", 1000);
    writeText(f.dir / "src/extra2", "not in archive", 1000);
    writeText(f.dir / "src/extra3", "not in archive", 1000);
    f.ui.expect("Exported file '", kAnswerNo);
    f.ui.expect("Exported file '", kAnswerYesAll);
    ToAllFlags exportFlags;
    ASSERT_EQ(f.add("src/*", kModeExport, exportFlags), kOk);
    EXPECT_TRUE(fs::exists(f.dir / "src/extra1"));
    EXPECT_FALSE(fs::exists(f.dir / "src/extra2"));
    EXPECT_FALSE(fs::exists(f.dir / "src/extra3"));
    EXPECT_TRUE(f.ui.sawStatus("extra1|Exported file wipipng is skipped."));
    EXPECT_TRUE(f.ui.sawStatus("extra3|Exported file is wiped."));
}

TEST(AddRules, FileOverArchiveFolderIsRefusedWith76AndFolderIsMerged) {
    Fixture f;
    ASSERT_TRUE(fs::createDirectories(f.dir / "src/name"));
    writeText(f.dir / "src/name/inside", "1", 1000);
    ToAllFlags flags;
    ASSERT_EQ(f.add("src/name", kModePlain, flags), kOk);
    ASSERT_TRUE(fs::createDirectories(f.dir / "other"));
    writeText(f.dir / "other/name", "a file", 1000);
    f.ui.expect("But the archive contains a directory with same name.", kAnswerOk);
    ToAllFlags second;
    EXPECT_EQ(f.add("other/name", kModePlain, second), kInconsistent);
    uint32_t attributes = 0;
    ASSERT_EQ(unitAttributes(f.a, u"name", attributes), kOk);
    EXPECT_NE(attributes & kAttrFolder, 0u);
    // The same folder again merges: its new file joins the old one.
    writeText(f.dir / "src/name/second", "2", 1000);
    ToAllFlags third;
    ASSERT_EQ(f.add("src/name", kModePlain, third), kOk);
    EXPECT_EQ(body(f.a, u"name\\inside"), "1");
    EXPECT_EQ(body(f.a, u"name\\second"), "2");
}

TEST(AddRules, CancelInTheMiddleOfAFileLeavesNoUnitAndNoClusters) {
    Fixture f;
    std::vector<uint8_t> big(3 * kMaxPayload + 10, 'x');
    ASSERT_TRUE(fs::writeWholeFile(f.dir / "src/big", big.data(), big.size()));
    uint32_t cancel = 0;
    // The progress report after the first piece raises the stop flag.
    class Canceller : public Recorder {
    public:
        uint32_t* flag = nullptr;
        void progressPercent(int p) override {
            if (p > 0 && flag != nullptr) *flag = 1;
        }
    } ui;
    ui.flag = &cancel;
    ui.expect("Process Add files to archive will be terminated.", kAnswerYes);
    Vaultora a(f.dir / "b.vra", &ui);
    ASSERT_EQ(a.create(nullptr, 0), kOk);
    const size_t usedBefore = std::count_if(a.cot().begin(), a.cot().end(), [](const CotEntry& e) { return e.used(); });
    {
        AddOptions options;
        options.cancelFlag = &cancel;
        Adder adder(a, options);
        ToAllFlags flags;
        EXPECT_EQ(adder.AddTree(u"", f.dir / "src/big", flags, kModePlain), kCancelled);
    }
    SecureBytes u;
    EXPECT_EQ(findUnitByPath(a, u"big", u), kNotFound);
    EXPECT_EQ(std::count_if(a.cot().begin(), a.cot().end(), [](const CotEntry& e) { return e.used(); }), usedBefore);
    EXPECT_FALSE(ui.remaining());
}

TEST(AddRules, FailedReplaceKeepsTheOldVersion) {
    Fixture f;
    std::vector<uint8_t> oldBody(kMaxPayload + 100, 'o');
    ASSERT_TRUE(fs::writeWholeFile(f.dir / "src/file", oldBody.data(), oldBody.size()));
    ToAllFlags flags;
    ASSERT_EQ(f.add("src/file", kModePlain, flags), kOk);
    std::vector<uint8_t> newBody(3 * kMaxPayload, 'n');
    ASSERT_TRUE(fs::writeWholeFile(f.dir / "src/file", newBody.data(), newBody.size()));
    // The disk fills up while the second piece of the new body is written.
    f.ui.expect("The archive already contains file", kAnswerYes);
    f.ui.expect("because there is not enough space on the disk", kAnswerIgnore);
    {
        Adder adder(f.a);
        fault::reset();
        fault::setFailFrom(fault::steps() + 2, ENOSPC);
        ToAllFlags again;
        EXPECT_EQ(adder.AddTree(u"", f.dir / "src/file", again, kModePlain), kOk);
        fault::reset();
    }
    SecureBytes b;
    ASSERT_EQ(readUnitIntoBuffer(f.a, u"file", b), kOk);
    EXPECT_EQ(b.size(), oldBody.size());
    EXPECT_TRUE(std::equal(b.begin(), b.end(), oldBody.begin()));
    EXPECT_TRUE(f.ui.sawStatus("file|Error 5"));
    EXPECT_FALSE(f.ui.remaining());
}

TEST(AddRules, FileHeldOpenForWritingIsAskedAboutAndSkippedOnNo) {
    Fixture f;
    writeText(f.dir / "src/busy", std::string(2000, 'b'), 1000);
    File writer;
    ASSERT_EQ(writer.open(f.dir / "src/busy", OpenMode::kReadWrite), 0);
    f.ui.expect("is opened for write access by other applicaton.\n\nDo you want to write this file anyway?", kAnswerNo);
    ToAllFlags flags;
    ASSERT_EQ(f.add("src/busy", kModePlain, flags), kOk);
    SecureBytes u;
    EXPECT_EQ(findUnitByPath(f.a, u"busy", u), kNotFound);
    EXPECT_TRUE(f.ui.sawStatus("busy|Skipped"));
    f.ui.expect("is opened for write access", kAnswerYes);
    ToAllFlags second;
    ASSERT_EQ(f.add("src/busy", kModePlain, second), kOk);
    EXPECT_EQ(body(f.a, u"busy"), std::string(2000, 'b'));
}

TEST(AddRules, MissingSourceAndFifoAndTheArchiveItself) {
    Fixture f;
    std::u16string collected;
    f.a.collectedMessages = &collected;
    ToAllFlags flags;
    EXPECT_EQ(f.add("src/nothing-here", kModePlain, flags), kReadFailed);
    EXPECT_NE(toUtf8(collected).find("Source file not found - "), std::string::npos);
    f.a.collectedMessages = nullptr;
    ASSERT_EQ(::mkfifo((f.dir / "src/pipe").c_str(), 0600), 0);
    ASSERT_EQ(f.add("src/pipe", kModePlain, flags), kOk);
    EXPECT_TRUE(f.ui.sawStatus("pipe|Skipped"));
    ASSERT_EQ(f.add("a.vra", kModePlain, flags), kOk);
    SecureBytes u;
    EXPECT_EQ(findUnitByPath(f.a, u"a.vra", u), kNotFound);
    EXPECT_EQ(findUnitByPath(f.a, u"pipe", u), kNotFound);
}

TEST(AddRules, MemoryFileIsInlineOrChainedAndReplacedAfterTheQuestion) {
    Fixture f;
    Adder adder(f.a);
    const std::string small = "[autorun]\n";
    ASSERT_EQ(adder.AddMemoryFile(0, u"AutoRun.inf", reinterpret_cast<const uint8_t*>(small.data()), small.size(), 0x20,
                                  nullptr),
              kOk);
    std::string large(kMaxPayload + 1, 'L');
    f.ui.expect("The archive already contains file", kAnswerYes);
    ASSERT_EQ(adder.AddMemoryFile(0, u"AutoRun.inf", reinterpret_cast<const uint8_t*>(large.data()), large.size(), 0x20,
                                  nullptr),
              kOk);
    EXPECT_EQ(body(f.a, u"AutoRun.inf"), large);
    f.ui.expect("The archive already contains file", kAnswerNoAll);
    ASSERT_EQ(adder.AddMemoryFile(0, u"AutoRun.inf", reinterpret_cast<const uint8_t*>(small.data()), small.size(), 0x20,
                                  nullptr),
              kOk);
    EXPECT_EQ(body(f.a, u"AutoRun.inf"), large);
}

}  // namespace
}  // namespace vaultora
