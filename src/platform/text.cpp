#include "platform/text.h"

#include <cstdio>

namespace vaultora {

namespace {

void putUtf8(std::string& out, char32_t cp) {
    if (cp < 0x80) {
        out += static_cast<char>(cp);
    } else if (cp < 0x800) {
        out += static_cast<char>(0xC0 | (cp >> 6));
        out += static_cast<char>(0x80 | (cp & 0x3F));
    } else if (cp < 0x10000) {
        out += static_cast<char>(0xE0 | (cp >> 12));
        out += static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
        out += static_cast<char>(0x80 | (cp & 0x3F));
    } else {
        out += static_cast<char>(0xF0 | (cp >> 18));
        out += static_cast<char>(0x80 | ((cp >> 12) & 0x3F));
        out += static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
        out += static_cast<char>(0x80 | (cp & 0x3F));
    }
}

void putUtf16(std::u16string& out, char32_t cp) {
    if (cp < 0x10000) {
        out += static_cast<char16_t>(cp);
    } else {
        cp -= 0x10000;
        out += static_cast<char16_t>(0xD800 + (cp >> 10));
        out += static_cast<char16_t>(0xDC00 + (cp & 0x3FF));
    }
}

}  // namespace

std::string toUtf8(std::u16string_view s) {
    std::string out;
    out.reserve(s.size());
    for (size_t i = 0; i < s.size(); ++i) {
        char32_t c = s[i];
        if (c >= 0xD800 && c <= 0xDBFF && i + 1 < s.size() && s[i + 1] >= 0xDC00 && s[i + 1] <= 0xDFFF) {
            c = 0x10000 + ((c - 0xD800) << 10) + (s[i + 1] - 0xDC00);
            ++i;
            putUtf8(out, c);
        } else if (c >= 0xDC80 && c <= 0xDCFF) {
            out += static_cast<char>(c - 0xDC00);  // escaped raw byte
        } else {
            putUtf8(out, c);
        }
    }
    return out;
}

std::u16string fromUtf8(std::string_view s) {
    std::u16string out;
    out.reserve(s.size());
    size_t i = 0;
    auto byte = [&](size_t k) { return static_cast<unsigned char>(s[k]); };
    while (i < s.size()) {
        unsigned char b = byte(i);
        size_t len = 0;
        char32_t cp = 0;
        char32_t min = 0;
        if (b < 0x80) { out += b; ++i; continue; }
        if ((b & 0xE0) == 0xC0) { len = 2; cp = b & 0x1F; min = 0x80; }
        else if ((b & 0xF0) == 0xE0) { len = 3; cp = b & 0x0F; min = 0x800; }
        else if ((b & 0xF8) == 0xF0) { len = 4; cp = b & 0x07; min = 0x10000; }
        bool ok = len != 0 && i + len <= s.size();
        for (size_t k = 1; ok && k < len; ++k) {
            if ((byte(i + k) & 0xC0) != 0x80) ok = false;
            else cp = (cp << 6) | (byte(i + k) & 0x3F);
        }
        // Overlong forms, surrogates and values past U+10FFFF are not valid UTF-8: escape them
        // byte by byte so the original bytes come back.
        if (ok && (cp < min || cp > 0x10FFFF || (cp >= 0xD800 && cp <= 0xDFFF))) ok = false;
        if (!ok) {
            out += static_cast<char16_t>(0xDC00 + b);
            ++i;
            continue;
        }
        putUtf16(out, cp);
        i += len;
    }
    return out;
}

std::u16string formatText(std::u16string_view fmt, std::initializer_list<FormatArg> args) {
    std::u16string out;
    auto it = args.begin();
    for (size_t i = 0; i < fmt.size(); ++i) {
        char16_t c = fmt[i];
        if (c != u'%' || i + 1 >= fmt.size()) { out += c; continue; }
        if (fmt[i + 1] == u'%') { out += u'%'; ++i; continue; }
        size_t j = i + 1;
        bool zero = false;
        bool left = false;
        if (j < fmt.size() && fmt[j] == u'-') { left = true; ++j; }
        if (j < fmt.size() && fmt[j] == u'0') { zero = true; ++j; }
        int width = 0;
        while (j < fmt.size() && fmt[j] >= u'0' && fmt[j] <= u'9') width = width * 10 + (fmt[j++] - u'0');
        while (j < fmt.size() && (fmt[j] == u'l' || fmt[j] == u'h' || fmt[j] == u'I')) ++j;  // size modifiers
        if (j >= fmt.size()) { out.append(fmt.substr(i)); break; }
        char16_t conv = fmt[j];
        std::u16string piece;
        if (it == args.end()) {
            piece = std::u16string(fmt.substr(i, j - i + 1));  // missing argument: keep the conversion as written
        } else {
            const FormatArg& a = *it++;
            if (conv == u's' || conv == u'S') {
                piece = a.kind == FormatArg::kText16 ? std::u16string(a.s16)
                      : a.kind == FormatArg::kText8  ? fromUtf8(a.s8)
                                                     : u"";
            } else {
                char buf[40];
                long long sv = a.kind == FormatArg::kInt ? a.i : static_cast<long long>(a.u);
                unsigned long long uv = a.kind == FormatArg::kUInt ? a.u : static_cast<unsigned long long>(a.i);
                switch (conv) {
                    case u'd': case u'i': std::snprintf(buf, sizeof buf, "%lld", sv); break;
                    case u'u': std::snprintf(buf, sizeof buf, "%llu", a.kind == FormatArg::kInt ? static_cast<unsigned long long>(static_cast<uint32_t>(a.i)) : uv); break;
                    case u'X': std::snprintf(buf, sizeof buf, "%llX", a.kind == FormatArg::kInt ? static_cast<unsigned long long>(static_cast<uint32_t>(a.i)) : uv); break;
                    case u'x': std::snprintf(buf, sizeof buf, "%llx", a.kind == FormatArg::kInt ? static_cast<unsigned long long>(static_cast<uint32_t>(a.i)) : uv); break;
                    default: buf[0] = 0; break;
                }
                piece = fromUtf8(buf);
            }
        }
        if (static_cast<int>(piece.size()) < width) {
            std::u16string pad(width - piece.size(), zero && !left ? u'0' : u' ');
            piece = left ? piece + pad : pad + piece;
        }
        out += piece;
        i = j;
    }
    return out;
}

bool equalsIgnoreCaseAscii(std::string_view a, std::string_view b) {
    if (a.size() != b.size()) return false;
    for (size_t i = 0; i < a.size(); ++i) {
        char x = a[i], y = b[i];
        if (x >= 'A' && x <= 'Z') x += 32;
        if (y >= 'A' && y <= 'Z') y += 32;
        if (x != y) return false;
    }
    return true;
}

bool equalsIgnoreCase(std::u16string_view a, std::u16string_view b) {
    if (a.size() != b.size()) return false;
    for (size_t i = 0; i < a.size(); ++i) {
        char16_t x = a[i], y = b[i];
        if (x >= u'A' && x <= u'Z') x += 32;
        if (y >= u'A' && y <= u'Z') y += 32;
        if (x != y) return false;
    }
    return true;
}

}  // namespace vaultora
