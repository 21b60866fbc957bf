#pragma once
// Text conversions between the archive's UTF-16 and Linux byte strings.
#include <string>
#include <string_view>

namespace vaultora {

// UTF-16 -> UTF-8. Lone surrogates U+DC80..U+DCFF become the raw byte they escape; other lone
// surrogates are written as their 3-byte form so nothing is lost.
std::string toUtf8(std::u16string_view s);
// UTF-8 -> UTF-16. Every byte that is not part of valid UTF-8 becomes U+DC80+byte, so any Linux
// byte string round-trips exactly through toUtf8.
std::u16string fromUtf8(std::string_view s);

// printf-style formatting of a UTF-16 template: %s takes a u16string_view, %S a narrow (UTF-8)
// string, %d/%u/%X/%x take integers. Width and zero-pad flags are supported ("%04X", "%08X").
// Arguments are passed as a list of FormatArg values.
struct FormatArg {
    enum Kind { kInt, kUInt, kText16, kText8 } kind;
    long long i = 0;
    unsigned long long u = 0;
    std::u16string_view s16;
    std::string_view s8;
    FormatArg(int v) : kind(kInt), i(v) {}
    FormatArg(long v) : kind(kInt), i(v) {}
    FormatArg(long long v) : kind(kInt), i(v) {}
    FormatArg(unsigned v) : kind(kUInt), u(v) {}
    FormatArg(unsigned long v) : kind(kUInt), u(v) {}
    FormatArg(unsigned long long v) : kind(kUInt), u(v) {}
    FormatArg(std::u16string_view v) : kind(kText16), s16(v) {}
    FormatArg(const std::u16string& v) : kind(kText16), s16(v) {}
    FormatArg(const char16_t* v) : kind(kText16), s16(v) {}
    FormatArg(std::string_view v) : kind(kText8), s8(v) {}
    FormatArg(const std::string& v) : kind(kText8), s8(v) {}
    FormatArg(const char* v) : kind(kText8), s8(v) {}
};
std::u16string formatText(std::u16string_view fmt, std::initializer_list<FormatArg> args);

// ASCII-only case-insensitive comparison (option names, verbs, file extensions).
bool equalsIgnoreCaseAscii(std::string_view a, std::string_view b);
bool equalsIgnoreCase(std::u16string_view a, std::u16string_view b);

}  // namespace vaultora
