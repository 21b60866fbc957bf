// AutoRun.inf: the exact bytes written, the lenient reader, and the file inside an archive.
#include <gtest/gtest.h>

#include "app/autorun.h"
#include "archive/password_ops.h"
#include "archive/walk.h"
#include "crypto/key_block_params.h"
#include "operations/add.h"
#include "program_run.h"
#include "support/scripted_interaction.h"
#include "support/temp_dir.h"

namespace vaultora {
namespace {

Result parse(const std::u16string& text, AutoRunSettings& s) {
    const std::string bytes = test::utf16le(text, true);
    return parseAutoRun(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size(), s);
}

TEST(AutoRun, WritesTheExactText) {
    AutoRunSettings s;
    s.openFile = u"docs\\a.txt";
    const std::string plain = test::utf16le(u"[AutoRun]\r\nOpen = \"docs\\a.txt\"\r\nExitOnClose = false\r\n", true);
    EXPECT_EQ(encodeAutoRun(s), std::vector<uint8_t>(plain.begin(), plain.end()));

    s.program = u"viewer.exe";
    s.exitOnClose = true;
    s.exportPath = u"/home/u/export";
    s.importPath = u"/home/u/import";
    const std::vector<uint8_t> bytes = encodeAutoRun(s);
    EXPECT_EQ(test::fromUtf16le(bytes, 2),
              u"[AutoRun]\r\nOpen = \"viewer.exe\" \"docs\\a.txt\"\r\nExitOnClose = true\r\n\r\n[Synchronize]\r\n"
              u"ExportPath = \"/home/u/export\"\r\nImportPath = \"/home/u/import\"\r\n");

    AutoRunSettings back;
    ASSERT_EQ(parseAutoRun(bytes.data(), bytes.size(), back), kOk);
    EXPECT_EQ(back.program, s.program);
    EXPECT_EQ(back.openFile, s.openFile);
    EXPECT_TRUE(back.exitOnClose);
    EXPECT_TRUE(back.synchronizePath.empty());
    EXPECT_EQ(back.exportFolder(), u"/home/u/export");
    EXPECT_EQ(back.importFolder(), u"/home/u/import");
}

TEST(AutoRun, ReaderIsLenientAboutCaseSpacesAndTokens) {
    AutoRunSettings s;
    s.exitOnClose = true;
    ASSERT_EQ(parse(u"; made by hand\r\n[autorun]\r\nOPEN=report.doc\r\nExitOnClose   =   yes\r\nOther = 1\r\n"
                    u"[SYNCHRONIZE]\r\nSynchronizePath = \"/data/my folder\"\r\nExportPath=\"unclosed\r\n",
                    s),
              kOk);
    EXPECT_EQ(s.openFile, u"report.doc");
    EXPECT_TRUE(s.program.empty());
    EXPECT_TRUE(s.exitOnClose);  // "yes" leaves the flag as it was
    EXPECT_EQ(s.synchronizePath, u"/data/my folder");
    EXPECT_TRUE(s.exportPath.empty());  // an unclosed quote makes the line invalid
    EXPECT_EQ(s.exportFolder(), u"/data/my folder");

    AutoRunSettings t;
    ASSERT_EQ(parse(u"[AutoRun]\nExitOnClose = TRUE\nOpen = \"viewer.exe\"   \"docs\\a.txt\"\n", t), kOk);
    EXPECT_TRUE(t.exitOnClose);
    EXPECT_EQ(t.program, u"viewer.exe");
    EXPECT_EQ(t.openFile, u"docs\\a.txt");
    ASSERT_EQ(parse(u"[AutoRun]\nExitOnClose = 0\n", t), kOk);
    EXPECT_FALSE(t.exitOnClose);
}

TEST(AutoRun, MalformedFilesKeepWhatWasRead) {
    AutoRunSettings s;
    EXPECT_EQ(parse(u"Open = \"a.txt\"\r\n", s), kInconsistent);  // no [AutoRun] section
    EXPECT_TRUE(s.openFile.empty());
    EXPECT_EQ(parse(u"[AutoRun]\r\nOpen = \"a.txt\"\r\n[Other]\r\nX = 1\r\n", s), kInconsistent);
    EXPECT_EQ(s.openFile, u"a.txt");
    EXPECT_EQ(s.setRememberedFolder(3, u"/x"), kInconsistent);
    EXPECT_EQ(s.setRememberedFolder(kModeSynchronize, u"/x"), kOk);
    EXPECT_EQ(s.synchronizePath, u"/x");
}

TEST(AutoRun, StoredHiddenInTheRootAndReplaced) {
    test::TempDir dir;
    test::ScriptedInteraction ui;
    Vaultora a(dir / "a.vra", &ui);
    KeyBlockParams plain = DefaultKeyBlockParams();
    plain.archiveAlg = 0;
    ASSERT_EQ(createWithPassword(a, plain, PasswordRecord{}), kOk);

    AutoRunSettings missing;
    EXPECT_NE(readAutoRun(missing, a), kOk);
    AutoRunSettings s;
    s.openFile = u"first.txt";
    ASSERT_EQ(writeAutoRun(s, a), kOk);
    s.openFile = u"second.txt";
    s.synchronizePath = u"/sync";
    ASSERT_EQ(writeAutoRun(s, a), kOk);  // replaces without asking
    ASSERT_EQ(a.close(), kOk);

    Vaultora b(dir / "a.vra", &ui);
    ASSERT_EQ(b.open(OpenKey{}), kOk);
    AutoRunSettings back;
    ASSERT_EQ(readAutoRun(back, b), kOk);
    EXPECT_EQ(back.openFile, u"second.txt");
    EXPECT_EQ(back.synchronizePath, u"/sync");
    SecureBytes raw;
    ASSERT_EQ(readUnitIntoBuffer(b, kAutoRunName, raw), kOk);
    const std::vector<uint8_t> expected = encodeAutoRun(s);
    EXPECT_EQ(std::vector<uint8_t>(raw.begin(), raw.end()), expected);
    EXPECT_TRUE(ui.asked.empty());
}

}  // namespace
}  // namespace vaultora
