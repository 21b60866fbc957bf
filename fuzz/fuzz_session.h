#pragma once
// What the fuzz target does with one input, shared with the seed writer (which checks that every
// seed it writes opens cleanly).
#include <string>

#include "archive/vaultora.h"

namespace vaultora::fuzz {

// The password of the encrypted seeds; the target offers it to every archive.
inline constexpr const char* kPassword = "fuzz password";

// Answers like a user who accepts every offer: Yes to recovery and repairs, OK to messages.
class AcceptingInteraction : public Interaction {
public:
    int message(std::u16string_view, std::u16string_view, uint32_t style) override;
    int askFiveWay(std::u16string_view, std::u16string_view) override { return kAnswerYes; }
    bool password(std::u16string_view, PasswordRecord& out, bool) override;
};

struct SessionResult {
    Result open = kOk;
    Result check = kOk;
    size_t units = 0;
};

// Opens the archive at `path` with the fuzz password (recovery offered on a damaged table), reads
// every unit of its tree and every body, runs the consistency check and closes (which commits).
SessionResult openAndReadTree(const std::string& path, bool check);

// Points the settings, state and runtime folders into `folder` so nothing outside it is touched.
void isolateEnvironment(const std::string& folder);

}  // namespace vaultora::fuzz
