#pragma once
// The batch message log: what the command-line verbs write instead of asking when -LF or -LV
// names a log file.
//
// Log file: UTF-16LE text that starts with the byte-order mark FF FE when it is created; every
// write appends at the end. A log line is
//     <timestamp> <caption> <text>\r\n      or, without a caption,      <timestamp> <text>\r\n
// with the local time as "year/month/day  hh:mm:ss:mmm" (month and day without leading zeros, two
// spaces before the time). A line holds at most 1024 characters. A question is logged as one line
// and then answered with the default answer of its style, which is appended as
//     \r\nMessage Result = <NAME>\r\n
// so that an empty line stands between the question and its result.
#include <cstdint>
#include <string>
#include <string_view>

#include "platform/interaction.h"

namespace vaultora {

// The longest log line, CR LF included.
inline constexpr size_t kLogLineLimit = 1024;

// "OK", "CANCEL", ..., "TIMEOUT" (32000); "Undefined" for anything else.
std::u16string_view answerName(int answer);
// The current local time as the log writes it: "2026/12/6  09:05:03:042".
std::u16string logTimestamp();

class BatchLog {
public:
    BatchLog(std::string path, bool verbose) : m_path(std::move(path)), m_verbose(verbose) {}
    const std::string& path() const { return m_path; }
    bool verbose() const { return m_verbose; }

    // Writes one timestamped line; an empty caption gives the form without a caption. A text too
    // long for one line is cut at the line limit. False when the file cannot be written.
    bool line(std::u16string_view text, std::u16string_view caption = {});
    // Like line(), but a text too long for one line goes on over further lines, so that nothing
    // is lost (the collected messages of a long add).
    bool lines(std::u16string_view text, std::u16string_view caption = {});
    // Appends text as it is (no timestamp, no line end).
    bool append(std::u16string_view text);

private:
    std::string m_path;
    bool m_verbose;
};

// Answers every question from the log: each message is logged with its caption and answered with
// its style's default answer (there is nobody to show it to), and the answer is logged. When the log
// cannot be written the question goes to `fallback` instead. Passwords are always asked through
// `fallback`: a log cannot answer them. In verbose mode progress lines ("path, status") are logged
// too. Error notes of the engine go to the log.
class BatchLogInteraction : public Interaction {
public:
    BatchLogInteraction(BatchLog& log, Interaction& fallback) : m_log(log), m_fallback(fallback) {}
    int message(std::u16string_view text, std::u16string_view caption, uint32_t style) override;
    int askArchive(std::u16string_view text, std::u16string_view caption, uint32_t style) override;
    int askFiveWay(std::u16string_view text, std::u16string_view caption) override;
    bool password(std::u16string_view prompt, PasswordRecord& out, bool confirm) override;
    void passwordRejected() override { m_fallback.passwordRejected(); }
    void progressLog(std::u16string_view text, std::u16string_view detail) override;
    bool logError(std::u16string_view text) override;

private:
    BatchLog& m_log;
    Interaction& m_fallback;
};

}  // namespace vaultora
