#include "app/autorun.h"

#include "archive/walk.h"
#include "operations/add.h"
#include "platform/text.h"

namespace vaultora {

namespace {

constexpr size_t kMaxLine = 1024;
constexpr size_t kMaxToken = 1024;

char16_t lowerAscii(char16_t c) { return (c >= u'A' && c <= u'Z') ? static_cast<char16_t>(c + 32) : c; }

bool startsWithIgnoreCase(std::u16string_view s, std::u16string_view prefix) {
    if (s.size() < prefix.size()) return false;
    for (size_t i = 0; i < prefix.size(); ++i)
        if (lowerAscii(s[i]) != lowerAscii(prefix[i])) return false;
    return true;
}

// The text after `key`, optional spaces, "=" and optional spaces; false when the line is not
// such a line.
bool keyValue(std::u16string_view line, std::u16string_view key, std::u16string_view& value) {
    if (!startsWithIgnoreCase(line, key)) return false;
    size_t i = key.size();
    while (i < line.size() && line[i] == u' ') ++i;
    if (i >= line.size() || line[i] != u'=') return false;
    ++i;
    while (i < line.size() && line[i] == u' ') ++i;
    value = line.substr(i);
    return true;
}

// One value token from the front of `rest`, which is advanced past it. False when the token is
// invalid (unclosed quote, too long) or there is none.
bool takeToken(std::u16string_view& rest, std::u16string& token) {
    size_t i = 0;
    while (i < rest.size() && rest[i] == u' ') ++i;
    if (i >= rest.size()) return false;
    size_t end;
    if (rest[i] == u'"') {
        end = rest.find(u'"', i + 1);
        if (end == std::u16string_view::npos) return false;
        token.assign(rest.substr(i + 1, end - i - 1));
        ++end;
    } else {
        end = rest.find(u' ', i);
        if (end == std::u16string_view::npos) end = rest.size();
        token.assign(rest.substr(i, end - i));
    }
    if (token.size() > kMaxToken) return false;
    rest = rest.substr(end);
    return true;
}

bool hasMore(std::u16string_view rest) {
    for (char16_t c : rest)
        if (c != u' ') return true;
    return false;
}

void readOpen(std::u16string_view value, AutoRunSettings& s) {
    std::u16string first, second;
    if (!takeToken(value, first)) return;
    if (hasMore(value)) {
        if (!takeToken(value, second)) return;
        s.program = first;
        s.openFile = second;
    } else {
        s.openFile = first;
    }
}

void readExitOnClose(std::u16string_view value, AutoRunSettings& s) {
    std::u16string token;
    if (!takeToken(value, token)) return;
    if (equalsIgnoreCase(token, u"true") || token == u"1") s.exitOnClose = true;
    else if (equalsIgnoreCase(token, u"false") || token == u"0") s.exitOnClose = false;
}

std::vector<std::u16string> splitLines(const uint8_t* data, size_t size) {
    size_t at = 0;
    bool bigEndian = false;
    if (size >= 2 && data[0] == 0xFF && data[1] == 0xFE) at = 2;
    else if (size >= 2 && data[0] == 0xFE && data[1] == 0xFF) at = 2, bigEndian = true;
    std::vector<std::u16string> lines;
    std::u16string line;
    for (; at + 1 < size; at += 2) {
        const char16_t c = bigEndian ? static_cast<char16_t>((data[at] << 8) | data[at + 1])
                                     : static_cast<char16_t>(data[at] | (data[at + 1] << 8));
        if (c == u'\n') {
            if (!line.empty() && line.back() == u'\r') line.pop_back();
            lines.push_back(line.substr(0, kMaxLine));
            line.clear();
        } else {
            line.push_back(c);
        }
    }
    if (!line.empty()) {
        if (line.back() == u'\r') line.pop_back();
        lines.push_back(line.substr(0, kMaxLine));
    }
    return lines;
}

}  // namespace

Result AutoRunSettings::setRememberedFolder(int mode, std::u16string_view path) {
    switch (mode) {
        case kModeSynchronize: synchronizePath = path; return kOk;
        case kModeExport: exportPath = path; return kOk;
        case kModeImport: importPath = path; return kOk;
        default: return kInconsistent;
    }
}

std::vector<uint8_t> encodeAutoRun(const AutoRunSettings& s) {
    std::u16string text = u"[AutoRun]\r\nOpen = ";
    if (!s.program.empty()) text += u"\"" + s.program + u"\" ";
    text += u"\"" + s.openFile + u"\"\r\n";
    text += s.exitOnClose ? u"ExitOnClose = true\r\n" : u"ExitOnClose = false\r\n";
    if (!s.synchronizePath.empty() || !s.exportPath.empty() || !s.importPath.empty()) {
        text += u"\r\n[Synchronize]\r\n";
        if (!s.synchronizePath.empty()) text += u"SynchronizePath = \"" + s.synchronizePath + u"\"\r\n";
        if (!s.exportPath.empty()) text += u"ExportPath = \"" + s.exportPath + u"\"\r\n";
        if (!s.importPath.empty()) text += u"ImportPath = \"" + s.importPath + u"\"\r\n";
    }
    std::vector<uint8_t> bytes = {0xFF, 0xFE};
    for (char16_t c : text) {
        bytes.push_back(static_cast<uint8_t>(c & 0xFF));
        bytes.push_back(static_cast<uint8_t>(c >> 8));
    }
    return bytes;
}

Result parseAutoRun(const uint8_t* data, size_t size, AutoRunSettings& s) {
    const std::vector<std::u16string> lines = splitLines(data, size);
    size_t i = 0;
    while (i < lines.size() && !equalsIgnoreCase(lines[i], u"[AutoRun]")) ++i;
    if (i == lines.size()) return kInconsistent;
    for (++i; i < lines.size() && (lines[i].empty() || lines[i][0] != u'['); ++i) {
        std::u16string_view value;
        if (keyValue(lines[i], u"Open", value)) readOpen(value, s);
        else if (keyValue(lines[i], u"ExitOnClose", value)) readExitOnClose(value, s);
    }
    if (i == lines.size()) return kOk;
    // The line that ended the section starts the search for the next one.
    while (i < lines.size() && !equalsIgnoreCase(lines[i], u"[Synchronize]")) ++i;
    if (i == lines.size()) return kInconsistent;
    for (++i; i < lines.size() && (lines[i].empty() || lines[i][0] != u'['); ++i) {
        std::u16string_view value;
        std::u16string token;
        int mode = -1;
        if (keyValue(lines[i], u"SynchronizePath", value)) mode = kModeSynchronize;
        else if (keyValue(lines[i], u"ExportPath", value)) mode = kModeExport;
        else if (keyValue(lines[i], u"ImportPath", value)) mode = kModeImport;
        if (mode >= 0 && takeToken(value, token)) (void)s.setRememberedFolder(mode, token);
    }
    return kOk;
}

Result readAutoRun(AutoRunSettings& settings, Vaultora& archive) {
    SecureBytes bytes;
    if (Result rc = readUnitIntoBuffer(archive, kAutoRunName, bytes); rc != kOk) return rc;
    return parseAutoRun(bytes.data(), bytes.size(), settings);
}

Result writeAutoRun(const AutoRunSettings& settings, Vaultora& archive) {
    const std::vector<uint8_t> bytes = encodeAutoRun(settings);
    Adder adder(archive);
    ToAllFlags replace;  // an existing AutoRun.inf is replaced without a question
    replace.overwriteAll = true;
    Result rc = adder.AddMemoryFile(0, kAutoRunName, bytes.data(), bytes.size(), kAutoRunAttributes, &replace);
    if (rc == kOk) rc = adder.flush();
    return rc;
}

}  // namespace vaultora
