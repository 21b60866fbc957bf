#include "support/scripted_interaction.h"

#include <gtest/gtest.h>

#include "platform/text.h"

namespace vaultora::test {

ScriptedInteraction& ScriptedInteraction::expect(const std::string& fragment, int answer) {
    m_script.push_back({false, fragment, answer, {}, false});
    return *this;
}

ScriptedInteraction& ScriptedInteraction::expectPassword(const std::string& password) {
    m_script.push_back({true, {}, 0, password, false});
    return *this;
}

ScriptedInteraction& ScriptedInteraction::expectPasswordCancel() {
    m_script.push_back({true, {}, 0, {}, true});
    return *this;
}

int ScriptedInteraction::answer(std::u16string_view text, std::u16string_view caption, uint32_t style) {
    std::string t = toUtf8(text);
    asked.push_back(t);
    captions.push_back(toUtf8(caption));
    styles.push_back(style);
    if (m_script.empty() || m_script.front().isPassword) {
        ADD_FAILURE() << "unexpected question: " << t;
        return defaultAnswer(style);
    }
    Step s = m_script.front();
    m_script.pop_front();
    EXPECT_NE(t.find(s.fragment), std::string::npos) << "expected a question containing '" << s.fragment
                                                     << "' but got: " << t;
    return s.answer;
}

int ScriptedInteraction::message(std::u16string_view text, std::u16string_view caption, uint32_t style) {
    return answer(text, caption, style);
}

int ScriptedInteraction::askFiveWay(std::u16string_view text, std::u16string_view caption) {
    return answer(text, caption, 0xFFFF);
}

bool ScriptedInteraction::password(std::u16string_view prompt, PasswordRecord& out, bool) {
    asked.push_back("password: " + toUtf8(prompt));
    if (m_script.empty() || !m_script.front().isPassword) {
        ADD_FAILURE() << "unexpected password question for " << toUtf8(prompt);
        return false;
    }
    Step s = m_script.front();
    m_script.pop_front();
    if (s.cancel) return false;
    out = PasswordRecord::fromUtf8(s.password);
    return true;
}

void ScriptedInteraction::progressStatus(std::u16string_view text) { statuses.push_back(toUtf8(text)); }

bool ScriptedInteraction::logError(std::u16string_view text) {
    errorNotes.push_back(toUtf8(text));
    return true;
}

}  // namespace vaultora::test
