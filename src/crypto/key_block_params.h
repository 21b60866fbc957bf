#pragma once
// The key block parameters: how a new archive key is made and protected (method, algorithms, S2K
// salt and iteration count, public-key recipient), with the stored preference record.
//
// Preference record "PrefKBParams" (little-endian):
//   0   u8   method (non-zero = password)
//   1   u8   archive algorithm
//   2   u8   hash
//   3   u8   key algorithm
//   4   u32  iteration count
//   8   u32  length N of the recipient ID
//   12  N    recipient ID
// The salt is never stored; the recipient key block is not stored either.
#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/messages.h"
#include "platform/result.h"
#include "platform/secure.h"

namespace vaultora {

inline constexpr uint8_t kMethodPublicKey = 0;
inline constexpr uint8_t kMethodPassword = 1;
inline constexpr size_t kPrefKBParamsMinimum = 12;
inline constexpr size_t kMinimumPasswordLength = 8;

struct KeyBlockParams {
    uint8_t method = kMethodPassword;
    uint8_t archiveAlg = 10;   // symmetric identifier of the new archive key
    uint8_t hash = 128;        // hash of the S2K and of archive key generation
    uint8_t keyAlg = 10;       // cipher (and key size) that protects the archive key
    // S2K salt; when absent, a fresh random salt is drawn for each packet written.
    std::optional<std::array<uint8_t, 8>> salt;
    uint32_t iterationCount = 1;  // decoded S2K count; written rounded down to a representable one
    uint32_t recipientKeyKind = 0;
    std::vector<uint8_t> recipientId;
    std::vector<uint8_t> recipientKeyBlock;  // as the key manager returned it; not stored
};

// The defaults: password method, Twofish archive and key algorithm, SHA-256, count 1 (written as
// 1024), no recipient, no salt.
KeyBlockParams DefaultKeyBlockParams();
// The preference record of `params`.
std::vector<uint8_t> EncodeKeyBlockParams(const KeyBlockParams& params);
// Reads a preference record. A missing (null), short or truncated value gives the defaults and
// false.
bool DecodeKeyBlockParams(const uint8_t* data, size_t length, KeyBlockParams& out);

// A fresh random salt.
[[nodiscard]] Result NewSalt(std::array<uint8_t, 8>& salt);
// Salt text: two upper-case hexadecimal digits and one space per byte ("0A 1B ... ").
std::string FormatSalt(const std::array<uint8_t, 8>& salt);
// Parses salt text: spaces are skipped, each byte is two hexadecimal digits of either case; exactly
// 8 bytes. False means "Invalid salt value".
bool ParseSalt(std::u16string_view text, std::array<uint8_t, 8>& salt);
bool ParseSalt(std::string_view text, std::array<uint8_t, 8>& salt);

// The representable count the typed count is written as (rounded down, at least 1024, at most
// 65536). When it differs from `typed` the value must be shown and confirmed again.
uint32_t RepresentableIterationCount(int64_t typed);
// One step of the iteration spin control: re-encode, move the code by `delta`, clamp to 0..96.
uint32_t StepIterationCount(int64_t current, int delta);

// Checks a new password and its confirmation; the message to show, or nothing when acceptable.
// Empty: "Password is empty"; under 8 characters: "Password length is too short"; different
// confirmation: "Passwords mismatch".
std::optional<Msg> CheckNewPassword(const PasswordRecord& password, const PasswordRecord& confirmation);

}  // namespace vaultora
