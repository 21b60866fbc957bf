#pragma once
// Questions and passwords on the controlling terminal, for the command-line verbs.
//
// A message box becomes a line with its caption and text and a choice line that shows the buttons
// of its style with the key that answers each ("[Y]es / [N]o / [C]ancel [No]: "); an empty answer
// takes the default button. A message with only "OK" goes to the error output and is not waited for. The
// remember-choice prompt asks Yes/No/Cancel and then "Remember choice." (y/N) after Yes or No. The
// five-way prompt offers Yes, Yes All, No, No All and Cancel. End of input answers Cancel where the
// style has it, else the default answer.
//
// Passwords are read with echo off. A new password is asked twice and checked as the password
// dialog checks it ("Password is empty", "Password length is too short", "Passwords mismatch");
// end of input cancels.
//
// Without a terminal nothing is read: every question gets its style's default answer and a line on
// the error output says so; a password question is refused (cancelled) with a line that names
// VAULTORA_PASSWORD_FILE.
//
// A password given from a file (VAULTORA_PASSWORD_FILE) answers every password question, the
// confirmation of a new password included; once it has been refused it is not offered again, so a
// wrong password cannot make a loop.
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/interaction.h"
#include "platform/secure.h"

namespace vaultora {

class TerminalInteraction : public Interaction {
public:
    // `inFd`/`outFd`: the terminal (or any pair of descriptors, in tests); -1 when there is none.
    // `errFd` takes the notes written when there is no terminal.
    TerminalInteraction(int inFd, int outFd, int errFd);
    ~TerminalInteraction() override;
    TerminalInteraction(const TerminalInteraction&) = delete;
    TerminalInteraction& operator=(const TerminalInteraction&) = delete;

    // Opens the controlling terminal (/dev/tty); without one the interaction has no terminal.
    static std::unique_ptr<TerminalInteraction> onControllingTerminal();

    void setPasswordFromFile(const PasswordRecord& password) { m_filePassword = password; }
    bool hasTerminal() const { return m_in >= 0 && m_out >= 0; }

    int message(std::u16string_view text, std::u16string_view caption, uint32_t style) override;
    int askArchive(std::u16string_view text, std::u16string_view caption, uint32_t style) override;
    int askFiveWay(std::u16string_view text, std::u16string_view caption) override;
    bool password(std::u16string_view prompt, PasswordRecord& out, bool confirm) override;
    void passwordRejected() override;
    bool logError(std::u16string_view text) override;

private:
    struct Choice {
        int answer;
        std::u16string label;  // with '&' before the key
    };
    int choose(std::u16string_view text, std::u16string_view caption, const std::vector<Choice>& choices,
               int defaultChoice, int onEnd);
    void write(int fd, std::u16string_view text);
    // Reads one line (without its end); nullopt at end of input.
    std::optional<std::string> readLine();
    // The same into wiping memory; false at end of input.
    bool readSecret(SecureString& out);
    bool readPassword(std::u16string_view label, PasswordRecord& out);
    int noTerminal(std::u16string_view text, int answer);

    int m_in;
    int m_out;
    int m_err;
    bool m_ownsFds = false;
    std::optional<PasswordRecord> m_filePassword;
    bool m_fileRefused = false;
};

// The key that answers a button label: the character after '&', lower-cased.
char16_t buttonKey(std::u16string_view label);
// The label as the terminal shows it: "&Yes" -> "[Y]es".
std::u16string buttonText(std::u16string_view label);

}  // namespace vaultora
