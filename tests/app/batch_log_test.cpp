// The batch message log: file encoding, line format, answers without a user.
#include <gtest/gtest.h>


#include "app/batch_log.h"
#include "platform/file.h"
#include "platform/text.h"
#include "program_run.h"
#include "support/scripted_interaction.h"
#include "support/temp_dir.h"

namespace vaultora {
namespace {

using test::ScriptedInteraction;
using test::TempDir;

std::string logText(const std::string& path) {
    std::vector<uint8_t> bytes;
    EXPECT_TRUE(fs::readWholeFile(path, bytes));
    EXPECT_GE(bytes.size(), 2u);
    EXPECT_EQ(bytes[0], 0xFF);
    EXPECT_EQ(bytes[1], 0xFE);
    return toUtf8(test::fromUtf16le(bytes, 2));
}

using test::maskLogTimestamps;

TEST(BatchLog, QuestionsGetTheirStyleDefaultAndBothAreLogged) {
    TempDir dir;
    BatchLog log(dir / "log.txt", false);
    ScriptedInteraction fallback;  // must not be asked
    BatchLogInteraction ui(log, fallback);
    EXPECT_EQ(ui.message(u"Replace?", u"Attention!", mb::kYesNo | mb::kDefButton2), kAnswerNo);
    EXPECT_EQ(ui.message(u"Retry?", u"", mb::kAbortRetryIgnore | mb::kDefButton3), kAnswerIgnore);
    EXPECT_EQ(ui.askArchive(u"Overwrite?", u"Attention!", mb::kRememberChoice), kAnswerYes);
    EXPECT_EQ(ui.askFiveWay(u"Wipe?", u"Attention!"), kAnswerYes);
    EXPECT_EQ(ui.message(u"Odd", u"C", mb::kYesNo | mb::kDefButton3 | mb::kDefButton2), 0);
    EXPECT_TRUE(ui.logError(u"Error 76, File HXZip, line 12"));
    EXPECT_TRUE(fallback.asked.empty());

    const std::string text = logText(dir / "log.txt");
    const std::string expected = "TS Attention! Replace?\r\n\r\nMessage Result = NO\r\n"
                                 "TS Retry?\r\n\r\nMessage Result = IGNORE\r\n"
                                 "TS Attention! Overwrite?\r\n\r\nMessage Result = YES\r\n"
                                 "TS Attention! Wipe?\r\n\r\nMessage Result = YES\r\n"
                                 "TS C Odd\r\n\r\nMessage Result = Undefined\r\n"
                                 "TS Error 76, File HXZip, line 12\r\n";
    EXPECT_EQ(maskLogTimestamps(text), expected);
}

TEST(BatchLog, AppendsToAnExistingLogAndKeepsLinesWithinTheLimit) {
    TempDir dir;
    const std::string path = dir / "log.txt";
    BatchLog log(path, true);
    ASSERT_TRUE(log.line(u"first"));
    ASSERT_TRUE(log.line(std::u16string(3000, u'x'), u"Cap"));
    ASSERT_TRUE(log.lines(std::u16string(2500, u'y')));
    const std::string text = logText(path);
    std::vector<std::string> lines;
    for (size_t at = 0; at < text.size();) {
        size_t end = text.find("\r\n", at);
        ASSERT_NE(end, std::string::npos);
        lines.push_back(text.substr(at, end - at));
        at = end + 2;
    }
    ASSERT_EQ(lines.size(), 5u);  // one, one cut, three for the long collected text
    EXPECT_EQ(maskLogTimestamps(lines[0]), "TS first");
    EXPECT_EQ(lines[1].size(), kLogLineLimit - 2);
    const std::string cut = maskLogTimestamps(lines[1]);
    EXPECT_EQ(cut.substr(0, 7), "TS Cap ");
    EXPECT_EQ(cut.find_first_not_of('x', 7), std::string::npos);
    size_t ys = 0;
    for (size_t i = 2; i < 5; ++i) {
        EXPECT_LE(lines[i].size(), kLogLineLimit - 2);
        ys += static_cast<size_t>(std::count(lines[i].begin(), lines[i].end(), 'y'));
    }
    EXPECT_EQ(ys, 2500u);  // nothing of it lost
}

TEST(BatchLog, VerboseProgressAndAnUnwritableLogFallsBackToTheUser) {
    TempDir dir;
    BatchLog quiet(dir / "quiet.txt", false), verbose(dir / "verbose.txt", true);
    ScriptedInteraction fallback;
    BatchLogInteraction q(quiet, fallback), v(verbose, fallback);
    q.progressLog(u"/src/a.txt", u"added");
    v.progressLog(u"/src/a.txt", u"added");
    EXPECT_FALSE(fs::exists(dir / "quiet.txt"));
    EXPECT_EQ(maskLogTimestamps(logText(dir / "verbose.txt")), "TS /src/a.txt, added\r\n");

    BatchLog broken(dir / "no-such-folder/log.txt", false);
    BatchLogInteraction b(broken, fallback);
    fallback.expect("Continue?", kAnswerNo).expectPassword("a password 1");
    EXPECT_EQ(b.message(u"Continue?", u"Attention!", mb::kYesNo), kAnswerNo);
    PasswordRecord pw;
    EXPECT_TRUE(b.password(u"a.vra", pw, false));  // passwords always come from the user side
    EXPECT_EQ(std::string(pw.narrow.begin(), pw.narrow.end()), "a password 1");
    EXPECT_FALSE(fallback.remaining());
}

}  // namespace
}  // namespace vaultora
