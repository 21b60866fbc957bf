#include "app/terminal_interaction.h"

#include <fcntl.h>
#include <termios.h>
#include <unistd.h>

#include <cerrno>

#include "app/batch_log.h"
#include "crypto/key_block_params.h"
#include "platform/messages.h"
#include "platform/text.h"

namespace vaultora {

namespace {

char16_t lowerAscii(char16_t c) { return (c >= u'A' && c <= u'Z') ? static_cast<char16_t>(c + 32) : c; }

std::u16string withoutAmpersand(std::u16string_view label) {
    std::u16string s;
    for (char16_t c : label)
        if (c != u'&') s.push_back(c);
    return s;
}

std::u16string trim(std::u16string_view s) {
    size_t b = 0, e = s.size();
    while (b < e && (s[b] == u' ' || s[b] == u'\t')) ++b;
    while (e > b && (s[e - 1] == u' ' || s[e - 1] == u'\t')) --e;
    return std::u16string(s.substr(b, e - b));
}

// Echo off on a terminal for the lifetime of the object.
class EchoOff {
public:
    explicit EchoOff(int fd) : m_fd(fd) {
        if (isatty(fd) && tcgetattr(fd, &m_saved) == 0) {
            termios t = m_saved;
            t.c_lflag &= ~static_cast<tcflag_t>(ECHO);
            t.c_lflag |= ECHONL;
            m_active = tcsetattr(fd, TCSAFLUSH, &t) == 0;
        }
    }
    ~EchoOff() {
        if (m_active) tcsetattr(m_fd, TCSANOW, &m_saved);
    }

private:
    int m_fd;
    termios m_saved{};
    bool m_active = false;
};

}  // namespace

char16_t buttonKey(std::u16string_view label) {
    size_t amp = label.find(u'&');
    if (amp == std::u16string_view::npos || amp + 1 >= label.size()) return label.empty() ? 0 : lowerAscii(label[0]);
    return lowerAscii(label[amp + 1]);
}

std::u16string buttonText(std::u16string_view label) {
    size_t amp = label.find(u'&');
    if (amp == std::u16string_view::npos || amp + 1 >= label.size()) return std::u16string(label);
    std::u16string s(label.substr(0, amp));
    s += u'[';
    s += label[amp + 1];
    s += u']';
    s += label.substr(amp + 2);
    return s;
}

TerminalInteraction::TerminalInteraction(int inFd, int outFd, int errFd) : m_in(inFd), m_out(outFd), m_err(errFd) {}

TerminalInteraction::~TerminalInteraction() {
    if (m_ownsFds && m_in >= 0) ::close(m_in);
}

std::unique_ptr<TerminalInteraction> TerminalInteraction::onControllingTerminal() {
    int fd = ::open("/dev/tty", O_RDWR | O_NOCTTY | O_CLOEXEC);
    auto t = std::make_unique<TerminalInteraction>(fd, fd, STDERR_FILENO);
    t->m_ownsFds = fd >= 0;
    return t;
}

void TerminalInteraction::write(int fd, std::u16string_view text) {
    if (fd < 0) return;
    const std::string bytes = toUtf8(text);
    size_t done = 0;
    while (done < bytes.size()) {
        ssize_t n = ::write(fd, bytes.data() + done, bytes.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return;
        done += static_cast<size_t>(n);
    }
}

std::optional<std::string> TerminalInteraction::readLine() {
    std::string line;
    for (;;) {
        char c = 0;
        ssize_t n = ::read(m_in, &c, 1);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            if (line.empty()) return std::nullopt;
            break;
        }
        if (c == '\n') break;
        line.push_back(c);
    }
    if (!line.empty() && line.back() == '\r') line.pop_back();
    return line;
}

bool TerminalInteraction::readSecret(SecureString& out) {
    out.clear();
    bool any = false;
    for (;;) {
        char c = 0;
        ssize_t n = ::read(m_in, &c, 1);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            if (!any) return false;
            break;
        }
        any = true;
        if (c == '\n') break;
        out.push_back(c);
        c = 0;
    }
    if (!out.empty() && out.back() == '\r') out.pop_back();
    return true;
}

int TerminalInteraction::noTerminal(std::u16string_view text, int answer) {
    std::u16string shown(text);
    for (char16_t& c : shown)
        if (c == u'\n') c = u' ';
    write(m_err, msgFormat(Msg::kNoTerminalAnswer, {shown, answerName(answer)}) + u"\n");
    return answer;
}

int TerminalInteraction::choose(std::u16string_view text, std::u16string_view caption,
                                const std::vector<Choice>& choices, int defaultChoice, int onEnd) {
    if (!hasTerminal()) return noTerminal(text, defaultChoice);
    std::u16string head;
    if (!caption.empty()) head = std::u16string(caption) + u": ";
    write(m_out, u"\n" + head + std::u16string(text) + u"\n");
    std::u16string list, defaultLabel;
    for (const Choice& c : choices) {
        if (!list.empty()) list += u" / ";
        list += buttonText(c.label);
        if (c.answer == defaultChoice) defaultLabel = withoutAmpersand(c.label);
    }
    for (;;) {
        write(m_out, msgFormat(Msg::kTerminalChoose, {list, defaultLabel}));
        std::optional<std::string> line = readLine();
        if (!line) {
            write(m_out, u"\n");
            return onEnd;
        }
        const std::u16string typed = trim(fromUtf8(*line));
        if (typed.empty() && defaultChoice != kAnswerNone) return defaultChoice;
        for (const Choice& c : choices) {
            if ((typed.size() == 1 && lowerAscii(typed[0]) == buttonKey(c.label)) ||
                equalsIgnoreCase(typed, withoutAmpersand(c.label)))
                return c.answer;
        }
    }
}

int TerminalInteraction::message(std::u16string_view text, std::u16string_view caption, uint32_t style) {
    const uint32_t group = style & 7;
    const int def = defaultAnswer(style);
    auto label = [](Msg m) { return std::u16string(msgText(m)); };
    std::vector<Choice> choices;
    switch (group) {
        case mb::kOk: {
            // Nothing to choose: shown on the error output (where a script sees it too), not waited for.
            std::u16string head = caption.empty() ? u"" : std::u16string(caption) + u": ";
            write(m_err, head + std::u16string(text) + u"\n");
            return kAnswerOk;
        }
        case mb::kOkCancel: choices = {{kAnswerOk, label(Msg::kButtonOk)}, {kAnswerCancel, label(Msg::kButtonCancel)}}; break;
        case mb::kAbortRetryIgnore:
            choices = {{kAnswerAbort, label(Msg::kButtonAbort)},
                       {kAnswerRetry, label(Msg::kButtonRetry)},
                       {kAnswerIgnore, label(Msg::kButtonIgnore)}};
            break;
        case mb::kYesNoCancel:
            choices = {{kAnswerYes, label(Msg::kButtonYes)},
                       {kAnswerNo, label(Msg::kButtonNo)},
                       {kAnswerCancel, label(Msg::kButtonCancel)}};
            break;
        case mb::kYesNo: choices = {{kAnswerYes, label(Msg::kButtonYes)}, {kAnswerNo, label(Msg::kButtonNo)}}; break;
        case mb::kRetryCancel:
            choices = {{kAnswerRetry, label(Msg::kButtonRetry)}, {kAnswerCancel, label(Msg::kButtonCancel)}};
            break;
        case mb::kCancelTryContinue:
            choices = {{kAnswerCancel, label(Msg::kButtonCancel)},
                       {kAnswerTryAgain, label(Msg::kButtonTryAgain)},
                       {kAnswerContinue, label(Msg::kButtonContinue)}};
            break;
        default: return hasTerminal() ? def : noTerminal(text, def);
    }
    int onEnd = def;
    for (const Choice& c : choices)
        if (c.answer == kAnswerCancel) onEnd = kAnswerCancel;
    if (group == mb::kAbortRetryIgnore) onEnd = kAnswerAbort;  // never retry on a closed input
    return choose(text, caption, choices, def, onEnd);
}

int TerminalInteraction::askArchive(std::u16string_view text, std::u16string_view caption, uint32_t style) {
    if (style != mb::kRememberChoice) return message(text, caption, style);
    const int answer = message(text, caption, mb::kYesNoCancel | mb::kIconQuestion);
    if ((answer != kAnswerYes && answer != kAnswerNo) || !hasTerminal()) return answer;
    write(m_out, msgFormat(Msg::kTerminalYesNo, {msgText(Msg::kRememberChoice)}));
    std::optional<std::string> line = readLine();
    if (!line) {
        write(m_out, u"\n");
        return answer;
    }
    const std::u16string typed = trim(fromUtf8(*line));
    const bool remember = equalsIgnoreCase(typed, u"y") || equalsIgnoreCase(typed, u"yes");
    if (!remember) return answer;
    return answer == kAnswerYes ? kAnswerYesAll : kAnswerNoAll;
}

int TerminalInteraction::askFiveWay(std::u16string_view text, std::u16string_view caption) {
    auto label = [](Msg m) { return std::u16string(msgText(m)); };
    const std::vector<Choice> choices = {{kAnswerYes, label(Msg::kButtonYes)},
                                         {kAnswerYesAll, label(Msg::kButtonYesAll)},
                                         {kAnswerNo, label(Msg::kButtonNo)},
                                         {kAnswerNoAll, label(Msg::kButtonNoAll)},
                                         {kAnswerCancel, label(Msg::kButtonCancel)}};
    return choose(text, caption, choices, kAnswerYes, kAnswerCancel);
}

bool TerminalInteraction::readPassword(std::u16string_view label, PasswordRecord& out) {
    // Echo goes off before the prompt shows, so nothing typed after it is ever echoed (stale
    // type-ahead from before the prompt is dropped).
    EchoOff quiet(m_in);
    write(m_out, label);
    SecureString typed;
    if (!readSecret(typed)) {
        write(m_out, u"\n");
        return false;
    }
    out = PasswordRecord::fromUtf8(std::string_view(typed.data(), typed.size()));
    return true;
}

bool TerminalInteraction::password(std::u16string_view prompt, PasswordRecord& out, bool confirm) {
    if (m_filePassword) {
        if (m_fileRefused) return false;
        if (confirm) {
            if (std::optional<Msg> bad = CheckNewPassword(*m_filePassword, *m_filePassword)) {
                write(m_err, msgFormat(Msg::kPasswordFileWrong, {msgText(*bad)}) + u"\n");
                return false;
            }
        }
        out = *m_filePassword;
        return true;
    }
    if (!hasTerminal()) {
        write(m_err, msgFormat(Msg::kNoTerminalPassword, {prompt}) + u"\n");
        return false;
    }
    write(m_out, u"\n" + msgFormat(Msg::kTerminalArchiveName, {prompt}) + u"\n");
    for (;;) {
        PasswordRecord first;
        if (!readPassword(msgText(Msg::kTerminalPassword), first)) return false;
        if (first.wide.empty()) {
            write(m_out, std::u16string(msgText(Msg::kPasswordEmpty)) + u"\n");
            continue;
        }
        if (first.wide.size() < kMinimumPasswordLength) {
            write(m_out, std::u16string(msgText(Msg::kPasswordTooShort)) + u"\n");
            continue;
        }
        if (confirm) {
            PasswordRecord second;
            do {
                if (!readPassword(msgText(Msg::kTerminalConfirmPassword), second)) return false;
            } while (second.wide.empty());
            if (std::optional<Msg> bad = CheckNewPassword(first, second)) {
                write(m_out, std::u16string(msgText(*bad)) + u"\n");
                continue;
            }
        }
        out = std::move(first);
        return true;
    }
}

void TerminalInteraction::passwordRejected() {
    if (m_filePassword) m_fileRefused = true;
}

bool TerminalInteraction::logError(std::u16string_view text) {
    write(m_err, std::u16string(text) + u"\n");
    return true;
}

}  // namespace vaultora
