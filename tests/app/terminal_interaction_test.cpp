// Questions and passwords on a terminal, driven through pipes.
#include <gtest/gtest.h>

#include <fcntl.h>
#include <unistd.h>

#include "app/terminal_interaction.h"
#include "platform/text.h"

namespace vaultora {
namespace {

// A terminal stand-in: what the user types is written to a pipe in advance; what the program
// shows and its error output are read back afterwards.
class FakeTerminal {
public:
    explicit FakeTerminal(const std::string& typed, bool hasTerminal = true) {
        EXPECT_EQ(pipe(m_in), 0);
        EXPECT_EQ(pipe(m_out), 0);
        EXPECT_EQ(pipe(m_err), 0);
        for (int* p : {m_out, m_err}) fcntl(p[0], F_SETFL, O_NONBLOCK);
        EXPECT_EQ(write(m_in[1], typed.data(), typed.size()), static_cast<ssize_t>(typed.size()));
        close(m_in[1]);
        ui = std::make_unique<TerminalInteraction>(hasTerminal ? m_in[0] : -1, hasTerminal ? m_out[1] : -1, m_err[1]);
    }
    ~FakeTerminal() {
        for (int fd : {m_in[0], m_out[0], m_out[1], m_err[0], m_err[1]}) close(fd);
    }
    std::string shown() { return drain(m_out[0]); }
    std::string errors() { return drain(m_err[0]); }
    std::unique_ptr<TerminalInteraction> ui;

private:
    static std::string drain(int fd) {
        std::string s;
        char buf[4096];
        ssize_t n;
        while ((n = read(fd, buf, sizeof buf)) > 0) s.append(buf, static_cast<size_t>(n));
        return s;
    }
    int m_in[2], m_out[2], m_err[2];
};

std::string narrow(const PasswordRecord& pw) { return std::string(pw.narrow.begin(), pw.narrow.end()); }

TEST(TerminalInteraction, ButtonsAnswerByKeyOrWordAndEnterTakesTheDefault) {
    FakeTerminal t("\nmaybe\nN\ncancel\n\n");
    EXPECT_EQ(t.ui->message(u"Overwrite?", u"Attention!", mb::kYesNoCancel | mb::kDefButton2), kAnswerNo);
    EXPECT_EQ(t.ui->message(u"Overwrite?", u"Attention!", mb::kYesNoCancel), kAnswerNo);  // "maybe" is asked again
    EXPECT_EQ(t.ui->message(u"Go on?", u"", mb::kOkCancel), kAnswerCancel);
    EXPECT_EQ(t.ui->message(u"Retry?", u"", mb::kRetryCancel), kAnswerRetry);
    const std::string shown = t.shown();
    EXPECT_NE(shown.find("Attention!: Overwrite?\n[Y]es / [N]o / [C]ancel [No]: "), std::string::npos) << shown;
    EXPECT_NE(shown.find("[O]K / [C]ancel [OK]: "), std::string::npos) << shown;
    // End of input: Cancel where there is one, Abort rather than an endless Retry.
    EXPECT_EQ(t.ui->message(u"Again?", u"", mb::kYesNoCancel), kAnswerCancel);
    EXPECT_EQ(t.ui->message(u"Again?", u"", mb::kAbortRetryIgnore | mb::kDefButton2), kAnswerAbort);
    // An OK message is shown on the error output and not waited for.
    EXPECT_EQ(t.ui->message(u"Done", u"Vaultora", mb::kOk), kAnswerOk);
    EXPECT_EQ(t.errors(), "Vaultora: Done\n");
}

TEST(TerminalInteraction, RememberChoiceAndFiveWayAnswers) {
    FakeTerminal t("y\ny\nn\n\nc\no\na\n");
    EXPECT_EQ(t.ui->askArchive(u"Overwrite a?", u"Attention!", mb::kRememberChoice), kAnswerYesAll);
    EXPECT_EQ(t.ui->askArchive(u"Overwrite b?", u"Attention!", mb::kRememberChoice), kAnswerNo);
    EXPECT_EQ(t.ui->askArchive(u"Overwrite c?", u"Attention!", mb::kRememberChoice), kAnswerCancel);
    EXPECT_EQ(t.ui->askFiveWay(u"Wipe?", u"Attention!"), kAnswerNoAll);
    EXPECT_EQ(t.ui->askFiveWay(u"Wipe?", u"Attention!"), kAnswerYesAll);
    const std::string shown = t.shown();
    EXPECT_NE(shown.find("Remember choice. (y/N): "), std::string::npos);
    EXPECT_EQ(shown.find("Remember choice.", shown.find("Overwrite c?")), std::string::npos);  // not after Cancel
    EXPECT_NE(shown.find("[Y]es / Yes [A]ll / [N]o / N[o] All / [C]ancel [Yes]: "), std::string::npos) << shown;
}

TEST(TerminalInteraction, NewPasswordIsValidatedAndConfirmed) {
    FakeTerminal t("\nshort\nlong enough 1\nsomething else\nlong enough 1\n\nlong enough 1\n");
    PasswordRecord pw;
    ASSERT_TRUE(t.ui->password(u"/tmp/new.vra", pw, true));
    EXPECT_EQ(narrow(pw), "long enough 1");
    EXPECT_EQ(pw.wide, SecureU16String(u"long enough 1"));
    const std::string shown = t.shown();
    EXPECT_NE(shown.find("Archive name: /tmp/new.vra\n"), std::string::npos);
    const size_t empty = shown.find("Password is empty");
    const size_t tooShort = shown.find("Password length is too short");
    const size_t mismatch = shown.find("Passwords mismatch");
    EXPECT_TRUE(empty < tooShort && tooShort < mismatch) << shown;
    EXPECT_EQ(shown.find("long enough"), std::string::npos);  // the password itself is never shown
    PasswordRecord next;
    EXPECT_FALSE(t.ui->password(u"/tmp/new.vra", next, false));  // end of input cancels
}

TEST(TerminalInteraction, WithoutTerminalDefaultsAreTakenAndSaid) {
    FakeTerminal t("y\n", false);
    EXPECT_EQ(t.ui->message(u"Overwrite\nfile?", u"Attention!", mb::kYesNo | mb::kDefButton2), kAnswerNo);
    EXPECT_EQ(t.ui->askArchive(u"Replace?", u"Attention!", mb::kRememberChoice), kAnswerYes);
    PasswordRecord pw;
    EXPECT_FALSE(t.ui->password(u"a.vra", pw, false));
    const std::string errors = t.errors();
    EXPECT_NE(errors.find("No terminal to ask: \"Overwrite file?\" answered NO\n"), std::string::npos) << errors;
    EXPECT_NE(errors.find("answered YES"), std::string::npos);
    EXPECT_NE(errors.find("VAULTORA_PASSWORD_FILE"), std::string::npos);
}

TEST(TerminalInteraction, PasswordFromFileAnswersUntilRefused) {
    FakeTerminal t("typed password\n");
    t.ui->setPasswordFromFile(PasswordRecord::fromUtf8("from the file"));
    PasswordRecord pw;
    ASSERT_TRUE(t.ui->password(u"a.vra", pw, true));  // the confirmation too
    EXPECT_EQ(narrow(pw), "from the file");
    t.ui->passwordRejected();
    EXPECT_FALSE(t.ui->password(u"a.vra", pw, false));  // no loop over a wrong password
    EXPECT_TRUE(t.shown().empty());                     // the terminal was never used

    FakeTerminal s("");
    s.ui->setPasswordFromFile(PasswordRecord::fromUtf8("short"));
    EXPECT_FALSE(s.ui->password(u"a.vra", pw, true));
    EXPECT_NE(s.errors().find("Password length is too short"), std::string::npos);
}

}  // namespace
}  // namespace vaultora
