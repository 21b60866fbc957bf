#include "app/batch_log.h"

#include <chrono>
#include <ctime>

#include "platform/file.h"
#include "platform/text.h"

namespace vaultora {

namespace {

// What a question answered without a user is shown as: Yes/No/Cancel with the question icon, the
// plain form of the remember-choice prompt.
constexpr uint32_t kPlainQuestionStyle = mb::kYesNoCancel | mb::kIconQuestion;  // 35

std::u16string cutToLine(std::u16string_view body) {
    const size_t room = kLogLineLimit - 2;
    std::u16string out(body.substr(0, room));
    out += u"\r\n";
    return out;
}

std::u16string linePrefix(std::u16string_view caption) {
    std::u16string s = logTimestamp() + u" ";
    if (!caption.empty()) {
        s += caption;
        s += u" ";
    }
    return s;
}

}  // namespace

std::u16string_view answerName(int answer) {
    switch (answer) {
        case 1: return u"OK";
        case 2: return u"CANCEL";
        case 3: return u"ABORT";
        case 4: return u"RETRY";
        case 5: return u"IGNORE";
        case 6: return u"YES";
        case 7: return u"NO";
        case 8: return u"CLOSE";
        case 9: return u"HELP";
        case 10: return u"TRYAGAIN";
        case 11: return u"CONTINUE";
        case 32000: return u"TIMEOUT";
        default: return u"Undefined";
    }
}

std::u16string logTimestamp() {
    using namespace std::chrono;
    const system_clock::time_point now = system_clock::now();
    const std::time_t t = system_clock::to_time_t(now);
    const auto ms = duration_cast<milliseconds>(now.time_since_epoch()).count() % 1000;
    std::tm local{};
    localtime_r(&t, &local);
    return formatText(u"%u/%u/%u  %02u:%02u:%02u:%03u",
                      {static_cast<unsigned>(local.tm_year + 1900), static_cast<unsigned>(local.tm_mon + 1),
                       static_cast<unsigned>(local.tm_mday), static_cast<unsigned>(local.tm_hour),
                       static_cast<unsigned>(local.tm_min), static_cast<unsigned>(local.tm_sec),
                       static_cast<unsigned>(ms)});
}

bool BatchLog::append(std::u16string_view text) {
    File f;
    if (f.open(m_path, OpenMode::kOpenAlways) != 0) return false;
    int64_t size = f.size();
    if (size < 0) return false;
    std::string bytes;
    if (size == 0) bytes = "\xFF\xFE";
    for (char16_t c : text) {
        bytes.push_back(static_cast<char>(c & 0xFF));
        bytes.push_back(static_cast<char>(c >> 8));
    }
    return f.writeAt(static_cast<uint64_t>(size), bytes.data(), bytes.size());
}

bool BatchLog::line(std::u16string_view text, std::u16string_view caption) {
    return append(cutToLine(linePrefix(caption) + std::u16string(text)));
}

bool BatchLog::lines(std::u16string_view text, std::u16string_view caption) {
    std::u16string whole = linePrefix(caption) + std::u16string(text);
    const size_t room = kLogLineLimit - 2;
    std::u16string out;
    for (size_t at = 0; at < whole.size() || at == 0; at += room) {
        out += whole.substr(at, room);
        out += u"\r\n";
        if (whole.size() <= room) break;
    }
    return append(out);
}

int BatchLogInteraction::message(std::u16string_view text, std::u16string_view caption, uint32_t style) {
    if (!m_log.line(text, caption)) return m_fallback.message(text, caption, style);
    const int answer = defaultAnswer(style);
    (void)m_log.append(u"\r\nMessage Result = " + std::u16string(answerName(answer)) + u"\r\n");
    return answer;
}

int BatchLogInteraction::askArchive(std::u16string_view text, std::u16string_view caption, uint32_t style) {
    // The remember-choice prompt has no user here: it becomes the plain logged question.
    return message(text, caption, style == mb::kRememberChoice ? kPlainQuestionStyle : style);
}

int BatchLogInteraction::askFiveWay(std::u16string_view text, std::u16string_view caption) {
    return message(text, caption, kPlainQuestionStyle);
}

bool BatchLogInteraction::password(std::u16string_view prompt, PasswordRecord& out, bool confirm) {
    return m_fallback.password(prompt, out, confirm);
}

void BatchLogInteraction::progressLog(std::u16string_view text, std::u16string_view detail) {
    if (m_log.verbose()) (void)m_log.line(std::u16string(text) + u", " + std::u16string(detail));
}

bool BatchLogInteraction::logError(std::u16string_view text) { return m_log.line(text); }

}  // namespace vaultora
