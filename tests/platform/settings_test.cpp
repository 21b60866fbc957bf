#include "platform/settings.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

#include "platform/file.h"
#include "support/temp_dir.h"

namespace vaultora {
namespace {

using test::TempDir;

std::string readText(const std::string& path) {
    std::vector<uint8_t> bytes;
    if (!fs::readWholeFile(path, bytes)) return "<missing>";
    return std::string(bytes.begin(), bytes.end());
}

void writeText(const std::string& path, const std::string& text) {
    ASSERT_TRUE(fs::createDirectories(path.substr(0, path.rfind('/'))));
    ASSERT_TRUE(fs::writeWholeFile(path, text.data(), text.size()));
}

class SettingsTest : public ::testing::Test {
protected:
    void TearDown() override { fault::reset(); }
    TempDir dir;
    std::string user = dir / "cfg/user.reg";
    std::string system = dir / "system.reg";
    Settings store{user, system};
};

TEST_F(SettingsTest, WritesEachTypeInRegistryExportFormatAndReadsItBack) {
    ASSERT_TRUE(store.writeDword("SingleModeReopenDelay", 1000));
    ASSERT_TRUE(store.writeBinary("AppFlags", {0x01, 0xff, 0x00}));
    ASSERT_TRUE(store.writeString("TempFolder", "/a \"b\" \\c"));
    EXPECT_EQ(readText(user),
              "Windows Registry Editor Version 5.00\n"
              "\n"
              "[HKEY_CURRENT_USER\\Software\\Korvel\\Vaultora]\n"
              "\"SingleModeReopenDelay\"=dword:000003e8\n"
              "\"AppFlags\"=hex:01,ff,00\n"
              "\"TempFolder\"=\"/a \\\"b\\\" \\\\c\"\n");
    EXPECT_EQ(store.readDword("SingleModeReopenDelay", SettingsScope::kUserOnly), 1000u);
    EXPECT_EQ(store.readBinary("AppFlags"), (std::vector<uint8_t>{0x01, 0xff, 0x00}));
    EXPECT_EQ(store.readString("TempFolder", SettingsScope::kUserOnly), "/a \"b\" \\c");
    // An empty binary value deletes the value.
    ASSERT_TRUE(store.writeBinary("AppFlags", {}));
    EXPECT_FALSE(store.readBinary("AppFlags"));
    EXPECT_EQ(readText(user).find("AppFlags"), std::string::npos);
}

TEST_F(SettingsTest, ReadsHandWrittenFilesWithAnyCaseCrLfBomContinuedHexListsAndTypeChecks) {
    writeText(user,
              "\xEF\xBB\xBFWindows Registry Editor Version 5.00\r\n\r\n"
              "; a comment\r\n"
              "[hkey_current_user\\SOFTWARE\\korvel\\VAULTORA]\r\n"
              "\"appflags\"=hex:01,02,\\\r\n"
              "  03,04\r\n"
              "\"Delay\"=dword:A\r\n"
              "\"AsText\"=\"12\"\r\n"
              "\"ShortDword\"=hex(4):01,02\r\n");
    EXPECT_EQ(store.readBinary("AppFlags"), (std::vector<uint8_t>{1, 2, 3, 4}));
    EXPECT_EQ(store.readDword("DELAY", SettingsScope::kUserOnly), 10u);
    // A value of another type or size is absent.
    EXPECT_FALSE(store.readDword("AsText", SettingsScope::kUserOnly));
    EXPECT_FALSE(store.readDword("ShortDword", SettingsScope::kUserOnly));
    EXPECT_FALSE(store.readBinary("Delay"));
    // A write replaces the value of the same name instead of adding a second one.
    ASSERT_TRUE(store.writeDword("delay", 11));
    EXPECT_EQ(store.readDword("Delay", SettingsScope::kUserOnly), 11u);
    EXPECT_EQ(readText(user).find("dword:0000000a"), std::string::npos);
}

TEST_F(SettingsTest, UserValueComesFirstThenSystemValueThenDefault) {
    EXPECT_EQ(sendMailDelayBeforeDeleteTempFile(store), 0u);
    EXPECT_FALSE(fs::exists(user));  // reading never creates the file
    writeText(system,
              "Windows Registry Editor Version 5.00\n"
              "[HKEY_LOCAL_MACHINE\\SOFTWARE\\Korvel\\Vaultora]\n"
              "\"sendMailDelayBeforeDeleteTempFile\"=dword:000001f4\n");
    EXPECT_EQ(sendMailDelayBeforeDeleteTempFile(store), 500u);
    EXPECT_FALSE(store.readDword("sendMailDelayBeforeDeleteTempFile", SettingsScope::kUserOnly));
    ASSERT_TRUE(store.writeDword("sendMailDelayBeforeDeleteTempFile", 7));
    EXPECT_EQ(sendMailDelayBeforeDeleteTempFile(store), 7u);
    // The system file is read only.
    std::string before = readText(system);
    EXPECT_FALSE(store.writeDword(SettingsRoot::kLocalMachine, kSettingsKey, "x", 1));
    EXPECT_FALSE(store.deleteValue(SettingsRoot::kLocalMachine, kSettingsKey, "sendMailDelayBeforeDeleteTempFile"));
    EXPECT_EQ(readText(system), before);
    EXPECT_EQ(store.readDword(SettingsRoot::kLocalMachine, kSettingsKey, "sendMailDelayBeforeDeleteTempFile"), 500u);
}

TEST_F(SettingsTest, UnparsableFileIsKeptAsideAndDefaultsAreUsed) {
    const std::string garbage = "Windows Registry Editor Version 5.00\n[HKEY_CURRENT_USER\\Software\\Korvel\\Vaultora]\n"
                                "\"AppFlags\"=hex:zz\n";
    writeText(user, garbage);
    EXPECT_EQ(readAppFlags(store), kAppFlagsAbsent);
    EXPECT_EQ(readText(user + ".bad"), garbage);
    EXPECT_FALSE(fs::exists(user));

    writeText(user, "not a settings file at all");
    ASSERT_TRUE(store.writeDword("Delay", 3));
    EXPECT_EQ(readText(user + ".bad"), "not a settings file at all");
    EXPECT_EQ(store.readDword("Delay", SettingsScope::kUserOnly), 3u);
}

TEST_F(SettingsTest, WritesKeepUnrelatedKeysAndUnknownTypes) {
    writeText(user,
              "Windows Registry Editor Version 5.00\n\n"
              "[HKEY_CURRENT_USER\\Software\\Korvel\\OtherTool]\n"
              "@=\"default\"\n"
              "\"Expand\"=hex(2):41,00,00,00\n");
    ASSERT_TRUE(store.writeBinary("Recent", {0x61, 0, 0, 0}));
    std::string text = readText(user);
    EXPECT_NE(text.find("[HKEY_CURRENT_USER\\Software\\Korvel\\OtherTool]\n@=\"default\"\n\"Expand\"=hex(2):41,00,00,00\n"),
              std::string::npos);
    EXPECT_EQ(store.readString(SettingsRoot::kCurrentUser, "software\\korvel\\othertool", ""), "default");
}

TEST_F(SettingsTest, StringsThatCannotStandOnOneQuotedLineRoundTrip) {
    const std::string lines = "first\nsecond\r\n\"third\"";
    const std::string rawBytes = "/tmp/\xff\xfe-dir";
    ASSERT_TRUE(store.writeString("A", lines));
    ASSERT_TRUE(store.writeString("B", rawBytes));
    ASSERT_TRUE(store.writeString("C", ""));
    EXPECT_NE(readText(user).find("\"A\"=hex(1):66,00,69,00"), std::string::npos);
    EXPECT_EQ(store.readString("A", SettingsScope::kUserOnly), lines);
    EXPECT_EQ(store.readString("B", SettingsScope::kUserOnly), rawBytes);
    EXPECT_EQ(store.readString("C", SettingsScope::kUserOnly), "");
    EXPECT_FALSE(fs::exists(user + ".bad"));
}

TEST_F(SettingsTest, FailedWriteStepLeavesTheOldFileIntact) {
    ASSERT_TRUE(store.writeDword("Delay", 1));
    const std::string before = readText(user);
    // Each mutating step of the write (create temp, write, sync, rename) fails in turn.
    for (long step = 1;; ++step) {
        fault::reset();
        fault::setFailAt(step, EIO);
        bool ok = store.writeDword("Delay", 2);
        fault::reset();
        if (ok) {
            EXPECT_GE(step, 5) << "a write with a failing step reported success";
            EXPECT_EQ(store.readDword("Delay", SettingsScope::kUserOnly), 2u);
            break;
        }
        EXPECT_EQ(readText(user), before) << "step " << step;
        EXPECT_FALSE(fs::exists(user + ".tmp")) << "step " << step;
        ASSERT_LT(step, 10);
    }
}

TEST_F(SettingsTest, CrashAtAnyStepLeavesEitherTheOldOrTheNewFile) {
    ASSERT_TRUE(store.writeDword("Delay", 1));
    for (long step = 1; step <= 5; ++step) {
        ASSERT_TRUE(store.writeDword("Delay", 1));
        pid_t pid = fork();
        ASSERT_GE(pid, 0);
        if (pid == 0) {
            fault::reset();
            fault::setKillAt(step);
            (void)store.writeDword("Delay", 2);
            _exit(0);
        }
        int status = 0;
        ASSERT_EQ(waitpid(pid, &status, 0), pid);
        std::optional<uint32_t> v = store.readDword("Delay", SettingsScope::kUserOnly);
        ASSERT_TRUE(v) << "step " << step;
        EXPECT_TRUE(*v == 1 || *v == 2) << "step " << step;
        EXPECT_FALSE(fs::exists(user + ".bad"));
    }
}

TEST_F(SettingsTest, ConcurrentProcessesNeverLoseEachOthersValues) {
    constexpr int kProcesses = 4, kValues = 15;
    std::vector<pid_t> children;
    for (int p = 0; p < kProcesses; ++p) {
        pid_t pid = fork();
        ASSERT_GE(pid, 0);
        if (pid == 0) {
            Settings own(user, system);
            bool ok = true;
            for (int i = 0; i < kValues; ++i) {
                ok = own.writeDword("v" + std::to_string(p) + "_" + std::to_string(i), static_cast<uint32_t>(i)) && ok;
                ok = setAppFlag(1u << p, false, own) && ok;
            }
            _exit(ok ? 0 : 1);
        }
        children.push_back(pid);
    }
    for (pid_t pid : children) {
        int status = 0;
        ASSERT_EQ(waitpid(pid, &status, 0), pid);
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    }
    for (int p = 0; p < kProcesses; ++p)
        for (int i = 0; i < kValues; ++i)
            EXPECT_EQ(store.readDword("v" + std::to_string(p) + "_" + std::to_string(i), SettingsScope::kUserOnly),
                      static_cast<uint32_t>(i));
    EXPECT_EQ(readAppFlags(store), 0xFFFFFFF0u);
}

TEST_F(SettingsTest, AppFlagChangeRewritesTheWholeValueFromAllBitsSet) {
    EXPECT_TRUE(appFlag(appflag::kDynamicCompact, store));
    ASSERT_TRUE(setAppFlag(appflag::kRecentList, false, store));
    EXPECT_NE(readText(user).find("\"AppFlags\"=hex:df,ff,ff,ff\n"), std::string::npos);
    EXPECT_FALSE(appFlag(appflag::kRecentList, store));
    EXPECT_TRUE(appFlag(appflag::kDynamicCompact | appflag::kImageViewer, store));
    ASSERT_TRUE(setAppFlag(appflag::kRecentList, true, store));
    EXPECT_EQ(readAppFlags(store), 0xFFFFFFFFu);
}

TEST_F(SettingsTest, AppFlagsComeFromTheSystemFileAndAreChangedInTheUserFile) {
    writeText(system,
              "Windows Registry Editor Version 5.00\n"
              "[HKEY_LOCAL_MACHINE\\Software\\Korvel\\Vaultora]\n"
              "\"AppFlags\"=hex:00,00,00,00\n");
    EXPECT_FALSE(appFlag(appflag::kDynamicCompact, store));
    ASSERT_TRUE(setAppFlag(appflag::kOneAtATime, true, store));
    EXPECT_EQ(readAppFlags(store), appflag::kOneAtATime);
    // A user value of the wrong size counts as absent: every bit set.
    ASSERT_TRUE(store.writeBinary("AppFlags", {0, 0, 0}));
    EXPECT_EQ(readAppFlags(store), kAppFlagsAbsent);
}

TEST_F(SettingsTest, FramePosIsIgnoredWhenTooLargeOrNotBinaryAndShortOnesKeepDefaults) {
    ASSERT_TRUE(store.writeBinary("FramePos", std::vector<uint8_t>(57, 1)));
    EXPECT_FALSE(readFramePos(store));
    ASSERT_TRUE(store.writeString("FramePos", "x"));
    EXPECT_FALSE(readFramePos(store));

    FramePos pos;
    pos.left = -3;
    pos.bottom = 600;
    pos.columnWidths[5] = 42;
    pos.flags = FramePos::kShowHidden | (1u << 3);
    pos.sortColumn = 2;
    ASSERT_TRUE(writeFramePos(pos, store));
    ASSERT_EQ(store.readBinary("FramePos", SettingsScope::kUserOnly)->size(), FramePos::kSize);
    std::optional<FramePos> back = readFramePos(store);
    ASSERT_TRUE(back);
    EXPECT_EQ(back->encode(), pos.encode());
    EXPECT_TRUE(back->hasRect());

    ASSERT_TRUE(store.writeBinary("FramePos", {10, 0, 0, 0, 20, 0, 0, 0}));
    back = readFramePos(store);  // a short record keeps the other defaults
    ASSERT_TRUE(back);
    EXPECT_EQ(back->left, 10);
    EXPECT_EQ(back->top, 20);
    EXPECT_FALSE(back->hasRect());
    EXPECT_EQ(back->listViewMode, 1u);
    EXPECT_EQ(back->flags, FramePos::kShowTree | FramePos::kUseAutoRun);
    EXPECT_EQ(back->recipientMode, 1);
    EXPECT_EQ(back->sortColumn, -1);
}

TEST_F(SettingsTest, EncryptFlagChangeKeepsTheRestOfTheRecord) {
    ASSERT_TRUE(setFramePosFlag(FramePos::kUseAutoRun, false, store));
    std::optional<FramePos> pos = readFramePos(store);
    ASSERT_TRUE(pos);
    EXPECT_EQ(pos->flags, FramePos::kShowTree);

    FramePos stored;
    stored.right = 800;
    stored.bottom = 600;
    stored.flags = FramePos::kSortAscending | (1u << 4);  // bit 4 is reserved and must survive
    ASSERT_TRUE(writeFramePos(stored, store));
    ASSERT_TRUE(setFramePosFlag(FramePos::kUseAutoRun, true, store));
    pos = readFramePos(store);
    ASSERT_TRUE(pos);
    EXPECT_EQ(pos->flags, FramePos::kSortAscending | (1u << 4) | FramePos::kUseAutoRun);
    EXPECT_EQ(pos->right, 800);
}

TEST_F(SettingsTest, TempFolderIsTheChosenOrRuntimeFolderWithTrailingSlash) {
    const char* old = std::getenv("XDG_RUNTIME_DIR");
    std::string saved = old != nullptr ? old : "";
    setenv("XDG_RUNTIME_DIR", dir.path().c_str(), 1);
    std::string runtime = tempFolder(store);
    EXPECT_EQ(runtime, dir / "vaultora/");
    EXPECT_TRUE(fs::isDirectory(runtime));

    ASSERT_TRUE(writeTempFolder(dir / "chosen/sub", store));
    EXPECT_EQ(tempFolder(store), dir / "chosen/sub/");
    EXPECT_TRUE(fs::isDirectory(dir / "chosen/sub"));

    ASSERT_TRUE(store.writeDword("TempFolder", 1));  // not a string: back to the runtime folder
    EXPECT_EQ(tempFolder(store), runtime);
    if (old != nullptr)
        setenv("XDG_RUNTIME_DIR", saved.c_str(), 1);
    else
        unsetenv("XDG_RUNTIME_DIR");
}

}  // namespace
}  // namespace vaultora
