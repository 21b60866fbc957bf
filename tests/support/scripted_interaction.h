#pragma once
// An Interaction for tests: questions are answered from a script of (text fragment, answer)
// pairs in order; a question that is not expected fails the running test.
#include <deque>
#include <string>
#include <vector>

#include "platform/interaction.h"

namespace vaultora::test {

class ScriptedInteraction : public Interaction {
public:
    // Expect a question whose text contains `fragment` (UTF-8) and answer it with `answer`.
    ScriptedInteraction& expect(const std::string& fragment, int answer);
    // Expect a password question and answer it (an empty optional = cancel).
    ScriptedInteraction& expectPassword(const std::string& password);
    ScriptedInteraction& expectPasswordCancel();

    int message(std::u16string_view text, std::u16string_view caption, uint32_t style) override;
    int askFiveWay(std::u16string_view text, std::u16string_view caption) override;
    bool password(std::u16string_view prompt, PasswordRecord& out, bool confirm) override;
    void passwordRejected() override { ++rejectedPasswords; }
    void progressStatus(std::u16string_view text) override;
    bool logError(std::u16string_view text) override;

    // Everything asked or shown, in order (UTF-8), for assertions.
    std::vector<std::string> asked;
    std::vector<std::string> captions;
    std::vector<uint32_t> styles;
    std::vector<std::string> statuses;
    std::vector<std::string> errorNotes;
    int rejectedPasswords = 0;
    bool remaining() const { return !m_script.empty(); }

private:
    struct Step {
        bool isPassword;
        std::string fragment;
        int answer;
        std::string password;
        bool cancel;
    };
    std::deque<Step> m_script;
    int answer(std::u16string_view text, std::u16string_view caption, uint32_t style);
};

}  // namespace vaultora::test
