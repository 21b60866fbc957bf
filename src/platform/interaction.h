#pragma once
// The one seam through which the engine asks questions and reports progress. The engine never
// prompts by itself: the command line, the GUI and the tests each give it an implementation.
#include <cstdint>
#include <string_view>

#include "platform/secure.h"

namespace vaultora {

// Message box styles: the button group in bits 0-2, the icon in bits 4-6, the default button in
// bits 8-9. The numbers are those the batch log's default-answer rule is written in.
namespace mb {
inline constexpr uint32_t kOk = 0;
inline constexpr uint32_t kOkCancel = 1;
inline constexpr uint32_t kAbortRetryIgnore = 2;
inline constexpr uint32_t kYesNoCancel = 3;
inline constexpr uint32_t kYesNo = 4;
inline constexpr uint32_t kRetryCancel = 5;
inline constexpr uint32_t kCancelTryContinue = 6;
inline constexpr uint32_t kIconError = 0x10;
inline constexpr uint32_t kIconQuestion = 0x20;
inline constexpr uint32_t kIconWarning = 0x30;
inline constexpr uint32_t kIconInformation = 0x40;
inline constexpr uint32_t kDefButton2 = 0x100;
inline constexpr uint32_t kDefButton3 = 0x200;
// askArchive with exactly this style shows the Yes/No/Cancel prompt with "Remember choice.".
inline constexpr uint32_t kRememberChoice = 4096;
}  // namespace mb

// Answers of message boxes and prompts.
enum Answer : int {
    kAnswerNone = 0,
    kAnswerOk = 1,
    kAnswerCancel = 2,
    kAnswerAbort = 3,
    kAnswerRetry = 4,
    kAnswerIgnore = 5,
    kAnswerYes = 6,
    kAnswerNo = 7,
    kAnswerTryAgain = 10,
    kAnswerContinue = 11,
    kAnswerYesAll = 1000,
    kAnswerNoAll = 1016,
};

// The answer a message of this style gets when nobody answers it.
int defaultAnswer(uint32_t style);

class Interaction {
public:
    virtual ~Interaction() = default;
    // A message box; returns the button pressed.
    virtual int message(std::u16string_view text, std::u16string_view caption, uint32_t style) = 0;
    // The archive code's question. With style mb::kRememberChoice: Yes/No/Cancel with "Remember
    // choice." (returns 6, 7, 2, or 1000/1016 when remembered); any other style is a message box.
    virtual int askArchive(std::u16string_view text, std::u16string_view caption, uint32_t style) {
        if (style == mb::kRememberChoice) return message(text, caption, mb::kYesNoCancel | mb::kIconQuestion);
        return message(text, caption, style);
    }
    // Yes / Yes All / No / No All / Cancel: returns 6, 1000, 7, 1016 or 2.
    virtual int askFiveWay(std::u16string_view text, std::u16string_view caption) = 0;
    // Asks for a password; `prompt` is the archive path. With `confirm` the password is entered
    // twice (a new archive or key block). False when the user cancelled.
    virtual bool password(std::u16string_view prompt, PasswordRecord& out, bool confirm) = 0;
    // Tells the asker that the last password was refused, before asking again. Default: nothing.
    virtual void passwordRejected() {}

    // Progress reporting.
    virtual void progressLog(std::u16string_view /*text*/, std::u16string_view /*detail*/) {}
    virtual void progressStatus(std::u16string_view /*text*/) {}
    virtual void progressPercent(int /*percent*/) {}  // -1 hides
    virtual void progressTitle(std::u16string_view /*text*/) {}
    virtual void addFilesEvent(uint32_t /*code*/, uint64_t /*value*/) {}

    // Writes an internal error note ("Error %d, File %s, line %d") to the operation log when one
    // is active; false when there is none (the caller keeps the note itself).
    virtual bool logError(std::u16string_view /*text*/) { return false; }
};

// Answers every question with the style's default answer and refuses passwords. Used where no
// user can be asked.
class DefaultInteraction : public Interaction {
public:
    int message(std::u16string_view, std::u16string_view, uint32_t style) override { return defaultAnswer(style); }
    int askFiveWay(std::u16string_view, std::u16string_view) override { return kAnswerYes; }
    bool password(std::u16string_view, PasswordRecord&, bool) override { return false; }
    static DefaultInteraction& instance();
};

}  // namespace vaultora
