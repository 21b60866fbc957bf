// The batch verbs end to end: the real program in a private HOME, without a terminal.
#include <gtest/gtest.h>

#include <sys/stat.h>


#include "app/autorun.h"
#include "app/batch_delete.h"
#include "app/verb_session.h"
#include "archive/directory.h"
#include "archive/walk.h"
#include "archive_validation.h"
#include "platform/settings.h"
#include "program_run.h"
#include "support/scripted_interaction.h"

namespace vaultora {
namespace {

using test::ProgramHome;
using test::ProgramResult;

const std::string kPassword = "correct horse battery";

void writeText(const std::string& path, const std::string& text) {
    ASSERT_TRUE(fs::writeWholeFile(path, text.data(), text.size())) << path;
}

std::string readText(const std::string& path) {
    std::vector<uint8_t> bytes;
    if (!fs::readWholeFile(path, bytes)) return "<missing>";
    return std::string(bytes.begin(), bytes.end());
}

std::string readLog(const std::string& path) {
    std::vector<uint8_t> bytes;
    if (!fs::readWholeFile(path, bytes) || bytes.size() < 2) return "";
    EXPECT_EQ(bytes[0], 0xFF);
    EXPECT_EQ(bytes[1], 0xFE);
    return toUtf8(test::fromUtf16le(bytes, 2));
}

// A small tree: text files, an empty file, a file of several clusters, a nested folder.
void makeTree(const std::string& root) {
    ASSERT_TRUE(fs::createDirectories(root + "/docs/deep", 0755));
    writeText(root + "/a.txt", "alpha\n");
    writeText(root + "/b.log", "bravo\n");
    writeText(root + "/empty.txt", "");
    writeText(root + "/docs/c.txt", "charlie\n");
    writeText(root + "/docs/deep/d.md", "delta\n");
    std::string big(1300000, '\0');
    uint32_t x = 12345;
    for (char& c : big) {
        x = x * 1103515245u + 12345u;
        c = static_cast<char>(x >> 23);
    }
    writeText(root + "/big.bin", big);
}

// Compares two trees file by file (names and contents).
void expectSameTree(const std::string& a, const std::string& b) {
    std::vector<std::string> left = fs::listDirectory(a), right = fs::listDirectory(b);
    std::sort(left.begin(), left.end());
    std::sort(right.begin(), right.end());
    ASSERT_EQ(left, right) << a << " vs " << b;
    for (const std::string& name : left) {
        const std::string pa = a + "/" + name, pb = b + "/" + name;
        if (fs::isDirectory(pa)) {
            ASSERT_TRUE(fs::isDirectory(pb)) << pb;
            expectSameTree(pa, pb);
        } else {
            EXPECT_EQ(readText(pa), readText(pb)) << pb;
        }
    }
}

TEST(BatchVerbs, AddedTreeExtractsIdenticallyAndTheArchiveIsValid) {
    ProgramHome home;
    makeTree(home / "tree");
    home.usePassword(kPassword);
    ProgramResult r = home.run({"Add", "backup.vra", "tree"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_TRUE(r.out.empty());

    r = home.run({"Extract", "backup.vra", home / "out"});
    ASSERT_EQ(r.status, 0) << r.err;
    expectSameTree(home / "tree", home / "out/tree");

    test::ArchiveCensus census;
    test::expectValidArchive(home / "backup.vra", kPassword, &census);
    EXPECT_EQ(census.files, 6u);
    EXPECT_EQ(census.folders, 3u);

    // Adding to the existing archive opens it with the same password and keeps it valid.
    writeText(home / "later.txt", "later\n");
    r = home.run({"add", "backup.vra", "later.txt"});
    ASSERT_EQ(r.status, 0) << r.err;
    test::expectValidArchive(home / "backup.vra", kPassword);
}

TEST(BatchVerbs, ExtractPatternsAndTheExitCodeOfTheLastPattern) {
    ProgramHome home;
    makeTree(home / "tree");
    home.usePassword(kPassword);
    ASSERT_EQ(home.run({"Add", "p.vra", "tree/a.txt", "tree/b.log", "tree/docs"}).status, 0);

    writeText(home / "tree/docs/deep/e.txt", "echo\n");
    ASSERT_EQ(home.run({"Add", "p.vra", "tree/docs/"}).status, 0);  // a trailing slash names the folder
    ProgramResult r = home.run({"Extract", "p.vra", "out1", "*.txt"});
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(readText(home / "out1/a.txt"), "alpha\n");
    EXPECT_FALSE(fs::exists(home / "out1/b.log"));
    EXPECT_FALSE(fs::exists(home / "out1/docs"));

    r = home.run({"Extract", "p.vra", "out2", "%.log", "docs/deep/*"});
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(readText(home / "out2/b.log"), "bravo\n");
    EXPECT_EQ(readText(home / "out2/docs/deep/d.md"), "delta\n");
    EXPECT_EQ(readText(home / "out2/docs/deep/e.txt"), "echo\n");
    EXPECT_FALSE(fs::exists(home / "out2/docs/c.txt"));

    // A folder that is not in the archive fails the last pattern; an earlier one still ran.
    r = home.run({"Extract", "p.vra", "out3", "a.txt", "nowhere/*"});
    EXPECT_NE(r.status, 0);
    EXPECT_EQ(readText(home / "out3/a.txt"), "alpha\n");
    r = home.run({"Extract", "p.vra", "out4", "nowhere/*", "a.txt"});
    EXPECT_EQ(r.status, 0) << r.err;
}

TEST(BatchVerbs, ListFilesInEveryEncodingAndStarListsAreWipedAtTheEnd) {
    ProgramHome home;
    makeTree(home / "tree");
    home.usePassword(kPassword);
    writeText(home / "eight.lst", "# a comment\n" + (home / "tree/a.txt") + "\r\n\n" + (home / "tree/docs") + "\n");
    writeText(home / "le.lst", test::utf16le(u"tree/b.log\r\n#tree/big.bin\r\n", true));
    std::string be = "\xFE\xFF";
    for (char16_t c : std::u16string(u"tree/empty.txt\n")) {
        be.push_back(static_cast<char>(c >> 8));
        be.push_back(static_cast<char>(c & 0xFF));
    }
    writeText(home / "be.lst", be);

    ProgramResult r = home.run({"Add", "l.vra", "@eight.lst", "@*le.lst", "@*be.lst"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_TRUE(fs::exists(home / "eight.lst"));
    EXPECT_FALSE(fs::exists(home / "le.lst"));
    EXPECT_FALSE(fs::exists(home / "be.lst"));

    test::ArchiveCensus census;
    test::expectValidArchive(home / "l.vra", kPassword, &census);
    std::sort(census.paths.begin(), census.paths.end());
    EXPECT_EQ(census.paths, (std::vector<std::string>{"a.txt", "b.log", "docs", "docs\\c.txt", "docs\\deep",
                                                      "docs\\deep\\d.md", "empty.txt"}));

    // Archive name "*": named after the first item, beside it.
    r = home.run({"Add", "*", "@eight.lst"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_TRUE(fs::exists(home / "tree/a.vra"));
    // A "@*" list is wiped even when the run fails.
    writeText(home / "gone.lst", "tree/a.txt\n");
    r = home.run({"Add", "l.vra", "@*gone.lst", "-PKID", "ABCD"});
    EXPECT_EQ(r.status, 88);
    EXPECT_FALSE(fs::exists(home / "gone.lst"));
}

TEST(BatchVerbs, BatchLogRecordsEachItemAndAnswersQuestionsWithTheirDefaults) {
    ProgramHome home;
    makeTree(home / "tree");
    home.usePassword(kPassword);
    ProgramResult r = home.run({"Add", "g.vra", "tree/a.txt", "-LF", "add.log"});
    ASSERT_EQ(r.status, 0) << r.err;
    std::string log = test::maskLogTimestamps(readLog(home / "add.log"));
    EXPECT_EQ(log, "TS Add file 'tree/a.txt' to archive 'g.vra'\r\nTS No error!\r\n");

    // A changed file asks before it replaces; nobody answers, so the default (Yes) is taken and
    // logged, and the log is appended to (one byte-order mark).
    writeText(home / "tree/a.txt", "alpha two\n");
    r = home.run({"Add", "g.vra", "tree/a.txt", "-LV", "add.log"});
    ASSERT_EQ(r.status, 0) << r.err;
    log = test::maskLogTimestamps(readLog(home / "add.log"));
    EXPECT_EQ(log.find("\xEF\xBB\xBF"), std::string::npos);
    const size_t question = log.find("\r\nTS Attention! The archive already contains file\n\\a.txt\n\n"
                                     "Overwrite existing file?\r\n\r\nMessage Result = YES\r\n");
    EXPECT_NE(question, std::string::npos) << log;
    EXPECT_NE(log.find("tree/a.txt, added\r\n"), std::string::npos) << log;  // verbose: progress lines
    r = home.run({"Extract", "g.vra", "out"});
    ASSERT_EQ(r.status, 0);
    EXPECT_EQ(readText(home / "out/a.txt"), "alpha two\n");

    // Too few arguments in batch mode: logged with its answer, not only printed.
    r = home.run({"Add", "g.vra", "-LF", "few.log"});
    EXPECT_EQ(r.status, 104);
    EXPECT_EQ(test::maskLogTimestamps(readLog(home / "few.log")),
              "TS Vaultora Invalid argument\r\n\r\nMessage Result = OK\r\n");
}

TEST(BatchVerbs, ExitCodesOfTheErrorRows) {
    ProgramHome home;
    makeTree(home / "tree");
    writeText(home / "plain.txt", "not an archive\n");
    home.usePassword(kPassword);
    ASSERT_EQ(home.run({"Add", "e.vra", "tree/a.txt"}).status, 0);

    EXPECT_EQ(home.run({"Add", "e.vra"}).status, 104);
    EXPECT_EQ(home.run({"Add", "e.vra", "no-such-item"}).status, 104);
    EXPECT_EQ(home.run({"Add", "e.vra", "@missing.lst"}).status, 104);
    EXPECT_EQ(home.run({"Add", "e.vra", "tree/a.txt", "-PKID", "0123ABCD"}).status, 88);
    EXPECT_EQ(home.run({"Encrypt", "x.vra"}).status, 104);
    EXPECT_EQ(home.run({"Extract", "plain.txt", "out"}).status, static_cast<int>(kNotArchive));
    EXPECT_EQ(home.run({"Extract", "e.vra"}).status, 255);  // too few: usage
    EXPECT_EQ(home.run({"Frobnicate"}).status, 255);

    // Wrong password from the file: the open's result, asked once only.
    home.usePassword("wrong password here");
    ProgramResult r = home.run({"Extract", "e.vra", "out"});
    EXPECT_EQ(r.status, static_cast<int>(kWrongPassword));
    EXPECT_NE(r.err.find("The password you entered is invalid"), std::string::npos) << r.err;
    // No terminal and no password file: refused with a clear line, never a wait.
    home.setEnv("VAULTORA_PASSWORD_FILE", std::nullopt);
    r = home.run({"Extract", "e.vra", "out"});
    EXPECT_EQ(r.status, static_cast<int>(kCancelled));
    EXPECT_NE(r.err.find("VAULTORA_PASSWORD_FILE"), std::string::npos) << r.err;
    r = home.run({"Add", "new.vra", "tree/a.txt"});
    EXPECT_EQ(r.status, static_cast<int>(kCancelled));
    EXPECT_FALSE(fs::exists(home / "new.vra"));
    // A password file that cannot be read is an error, not a prompt.
    home.setEnv("VAULTORA_PASSWORD_FILE", home / "no-such-file");
    r = home.run({"Extract", "e.vra", "out"});
    EXPECT_EQ(r.status, static_cast<int>(kCannotOpen));
    EXPECT_NE(r.err.find("no-such-file"), std::string::npos) << r.err;
    // A new archive's password from the file is checked like a typed one.
    home.usePassword("short");
    r = home.run({"Add", "new.vra", "tree/a.txt"});
    EXPECT_EQ(r.status, static_cast<int>(kCancelled));
    EXPECT_NE(r.err.find("Password length is too short"), std::string::npos) << r.err;
    EXPECT_FALSE(fs::exists(home / "new.vra"));
}

TEST(BatchVerbs, EncryptStoresAutoRunAndTurnsItOn) {
    ProgramHome home;
    makeTree(home / "tree");
    home.usePassword(kPassword);
    ProgramResult r = home.run({"Encrypt", "enc.vra", "tree/docs/c.txt", "tree/a.txt"});
    ASSERT_EQ(r.status, 0) << r.err;
    test::expectValidArchive(home / "enc.vra", kPassword);

    test::ScriptedInteraction ui;
    Vaultora a(home / "enc.vra", &ui);
    const PasswordRecord pw = PasswordRecord::fromUtf8(kPassword);
    ASSERT_EQ(a.open(OpenKey{&pw}), kOk);
    SecureBytes bytes;
    ASSERT_EQ(readUnitIntoBuffer(a, u"AutoRun.inf", bytes), kOk);
    EXPECT_EQ(std::string(bytes.begin(), bytes.end()),
              test::utf16le(u"[AutoRun]\r\nOpen = \"c.txt\"\r\nExitOnClose = true\r\n", true));
    uint32_t attributes = 0;
    ASSERT_EQ(unitAttributes(a, u"AutoRun.inf", attributes), kOk);
    EXPECT_EQ(attributes & 0xFFFF, kAutoRunAttributes);
    a.close();

    Settings store(home / "config/vaultora/user.reg", home / "none.reg");
    std::optional<FramePos> pos = readFramePos(store);
    ASSERT_TRUE(pos.has_value());
    EXPECT_NE(pos->flags & FramePos::kUseAutoRun, 0u);
}

TEST(BatchVerbs, PropertiesAnswersTheVersionOfPlainAndSelfExtractingArchives) {
    ProgramHome home;
    home.usePassword(kPassword);
    writeText(home / "a.txt", "alpha\n");
    ASSERT_EQ(home.run({"Add", "v.vra", "a.txt"}).status, 0);
    // A self-extracting archive: a program in front of the whole archive.
    std::string sfx(70000, 'M');
    sfx += readText(home / "v.vra");
    writeText(home / "v.exe", sfx);

    const std::string version = test::utf16le(u"Version\r\n2.1\r\n", true);
    writeText(home / "req1", test::utf16le(fromUtf8(home / "v.vra"), true));
    EXPECT_EQ(home.run({"Properties", "req1"}).status, 0);
    EXPECT_EQ(readText(home / "req1"), version);

    writeText(home / "req2", test::utf16le(fromUtf8(home / "v.exe") + u'\0', false));
    EXPECT_EQ(home.run({"properties", home / "req2"}).status, 0);
    EXPECT_EQ(readText(home / "req2"), version);

    writeText(home / "req3", test::utf16le(u"a.txt", true));
    EXPECT_EQ(home.run({"Properties", "req3"}).status, 0);
    EXPECT_EQ(readText(home / "req3"), test::utf16le(u"Version\r\nUndefined", true));

    EXPECT_EQ(home.run({"Properties", "no-request"}).status, static_cast<int>(kCannotOpen));
    writeText(home / "req4", "\xFF\xFE");
    EXPECT_EQ(home.run({"Properties", "req4"}).status, static_cast<int>(kInconsistent));
    EXPECT_EQ(readText(home / "req4"), "\xFF\xFE");  // a request that gets no answer is left alone
    EXPECT_EQ(home.run({"Properties"}).status, 255);
}

TEST(BatchVerbs, DeleteNeedsTheArchivePassword) {
    ProgramHome home;
    home.usePassword(kPassword);
    writeText(home / "a.txt", "alpha\n");
    ASSERT_EQ(home.run({"Add", "d.vra", "a.txt"}).status, 0);

    home.usePassword("not the password");
    EXPECT_EQ(home.run({"Delete", "d.vra"}).status, 255);
    EXPECT_TRUE(fs::exists(home / "d.vra"));
    home.setEnv("VAULTORA_PASSWORD_FILE", std::nullopt);
    EXPECT_EQ(home.run({"Delete", "d.vra"}).status, 255);  // nobody to give it
    EXPECT_TRUE(fs::exists(home / "d.vra"));
    EXPECT_EQ(home.run({"Delete", "a.txt"}).status, 255);  // not an archive: kept
    EXPECT_TRUE(fs::exists(home / "a.txt"));
    EXPECT_EQ(home.run({"Delete", "never-there.vra"}).status, 0);

    // Asked in a session: a wrong password is refused with the message and asked again.
    test::ScriptedInteraction ui;
    ui.expectPassword("not the password")
        .expect("The password you entered is invalid", kAnswerOk)
        .expectPassword(kPassword);
    BatchSettings batch;
    VerbSession session(batch, ui);
    EXPECT_EQ(batchDelete({"v", "Delete", home / "d.vra"}, session), 0);
    EXPECT_FALSE(ui.remaining());
    EXPECT_FALSE(fs::exists(home / "d.vra"));
    EXPECT_FALSE(fs::exists(home / "d.vra.vrt"));
}

}  // namespace
}  // namespace vaultora
