#include "crypto/key_block_params.h"

#include <algorithm>

#include "crypto/random.h"
#include "crypto/s2k.h"
#include "platform/text.h"

namespace vaultora {

namespace {

uint32_t readLe32(const uint8_t* p) {
    return uint32_t{p[0]} | (uint32_t{p[1]} << 8) | (uint32_t{p[2]} << 16) | (uint32_t{p[3]} << 24);
}

void appendLe32(std::vector<uint8_t>& out, uint32_t v) {
    for (int i = 0; i < 4; ++i) out.push_back(static_cast<uint8_t>(v >> (8 * i)));
}

int hexDigit(char32_t c) {
    if (c >= '0' && c <= '9') return static_cast<int>(c - '0');
    if (c >= 'a' && c <= 'f') return static_cast<int>(c - 'a' + 10);
    if (c >= 'A' && c <= 'F') return static_cast<int>(c - 'A' + 10);
    return -1;
}

template <class CharT>
bool parseSaltText(std::basic_string_view<CharT> text, std::array<uint8_t, 8>& salt) {
    std::array<uint8_t, 8> bytes{};
    size_t count = 0;
    int high = -1;
    for (CharT ch : text) {
        if (ch == ' ') continue;
        int v = hexDigit(static_cast<char32_t>(ch));
        if (v < 0) return false;
        if (high < 0) {
            high = v;
            continue;
        }
        if (count == bytes.size()) return false;
        bytes[count++] = static_cast<uint8_t>((high << 4) | v);
        high = -1;
    }
    if (high >= 0 || count != bytes.size()) return false;
    salt = bytes;
    return true;
}

// Characters of the password as the user typed them (UTF-16 units of the wide form, else code
// points of the narrow form).
size_t passwordCharacters(const PasswordRecord& p) {
    if (!p.wide.empty()) return p.wide.size();
    return static_cast<size_t>(
        std::count_if(p.narrow.begin(), p.narrow.end(), [](char c) { return (static_cast<uint8_t>(c) & 0xC0) != 0x80; }));
}

}  // namespace

KeyBlockParams DefaultKeyBlockParams() { return KeyBlockParams{}; }

std::vector<uint8_t> EncodeKeyBlockParams(const KeyBlockParams& params) {
    std::vector<uint8_t> out;
    out.reserve(kPrefKBParamsMinimum + params.recipientId.size());
    out.push_back(params.method);
    out.push_back(params.archiveAlg);
    out.push_back(params.hash);
    out.push_back(params.keyAlg);
    appendLe32(out, params.iterationCount);
    appendLe32(out, static_cast<uint32_t>(params.recipientId.size()));
    out.insert(out.end(), params.recipientId.begin(), params.recipientId.end());
    return out;
}

bool DecodeKeyBlockParams(const uint8_t* data, size_t length, KeyBlockParams& out) {
    out = DefaultKeyBlockParams();
    if (data == nullptr || length < kPrefKBParamsMinimum) return false;
    const uint32_t idLength = readLe32(data + 8);
    if (idLength > length - kPrefKBParamsMinimum) return false;
    out.method = data[0] != 0 ? kMethodPassword : kMethodPublicKey;
    out.archiveAlg = data[1];
    out.hash = data[2];
    out.keyAlg = data[3];
    out.iterationCount = readLe32(data + 4);
    out.recipientId.assign(data + kPrefKBParamsMinimum, data + kPrefKBParamsMinimum + idLength);
    return true;
}

Result NewSalt(std::array<uint8_t, 8>& salt) { return RandomBytes(salt.data(), salt.size()); }

std::string FormatSalt(const std::array<uint8_t, 8>& salt) {
    static const char kHex[] = "0123456789ABCDEF";
    std::string s;
    for (uint8_t b : salt) {
        s.push_back(kHex[b >> 4]);
        s.push_back(kHex[b & 15]);
        s.push_back(' ');
    }
    return s;
}

bool ParseSalt(std::u16string_view text, std::array<uint8_t, 8>& salt) { return parseSaltText(text, salt); }
bool ParseSalt(std::string_view text, std::array<uint8_t, 8>& salt) { return parseSaltText(text, salt); }

uint32_t RepresentableIterationCount(int64_t typed) { return DecodeCount(EncodeCount(typed)); }

uint32_t StepIterationCount(int64_t current, int delta) {
    int code = static_cast<int>(EncodeCount(current)) + delta;
    code = std::clamp(code, 0, 0x60);
    return DecodeCount(static_cast<uint8_t>(code));
}

std::optional<Msg> CheckNewPassword(const PasswordRecord& password, const PasswordRecord& confirmation) {
    if (password.empty()) return Msg::kPasswordEmpty;
    if (passwordCharacters(password) < kMinimumPasswordLength) return Msg::kPasswordTooShort;
    const bool same = !password.wide.empty() || !confirmation.wide.empty()
                          ? password.wide == confirmation.wide
                          : password.narrow == confirmation.narrow;
    if (!same) return Msg::kPasswordsMismatch;
    return std::nullopt;
}

}  // namespace vaultora
