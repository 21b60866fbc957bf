#include "app/properties.h"

#include "app/archive_probe.h"
#include "platform/file.h"
#include "platform/messages.h"
#include "platform/text.h"

namespace vaultora {

std::string decodeRequestPath(const std::vector<uint8_t>& bytes) {
    std::u16string text;
    bool hasZero = false;
    for (uint8_t b : bytes) hasZero = hasZero || b == 0;
    const bool le = bytes.size() >= 2 && bytes[0] == 0xFF && bytes[1] == 0xFE;
    const bool be = bytes.size() >= 2 && bytes[0] == 0xFE && bytes[1] == 0xFF;
    if (le || be || hasZero) {
        for (size_t i = (le || be) ? 2 : 0; i + 1 < bytes.size(); i += 2) {
            const char16_t c = be ? static_cast<char16_t>((bytes[i] << 8) | bytes[i + 1])
                                  : static_cast<char16_t>(bytes[i] | (bytes[i + 1] << 8));
            if (c == 0) break;  // a terminating zero ends the path
            text.push_back(c);
        }
    } else {
        text = fromUtf8(std::string_view(reinterpret_cast<const char*>(bytes.data()), bytes.size()));
    }
    while (!text.empty() && (text.back() == u'\n' || text.back() == u'\r')) text.pop_back();
    return toUtf8(text);
}

std::vector<uint8_t> versionAnswer(const std::string& archivePath) {
    std::u16string text = std::u16string(msgText(Msg::kVersionCaption)) + u"\r\n";
    Header header;
    if (probeArchiveHeader(archivePath, header))
        text += formatText(u"%d.%d\r\n", {static_cast<int>(header.versionMajor), static_cast<int>(header.versionMinor)});
    else
        text += msgText(Msg::kVersionUndefined);
    std::vector<uint8_t> bytes = {0xFF, 0xFE};
    for (char16_t c : text) {
        bytes.push_back(static_cast<uint8_t>(c & 0xFF));
        bytes.push_back(static_cast<uint8_t>(c >> 8));
    }
    return bytes;
}

int answerVersionQuery(const std::string& requestFile) {
    std::vector<uint8_t> request;
    if (fs::isDirectory(requestFile) || !fs::readWholeFile(requestFile, request)) return static_cast<int>(kCannotOpen);
    const std::string archivePath = decodeRequestPath(request);
    if (archivePath.empty()) return static_cast<int>(kInconsistent);
    const std::vector<uint8_t> answer = versionAnswer(archivePath);
    // The answer takes the request's place in one step: written beside it, then renamed over it,
    // so a failed write leaves the request as it was.
    const std::string temporary = requestFile + ".answer";
    if (!fs::writeWholeFile(temporary, answer.data(), answer.size()) || !fs::renameFile(temporary, requestFile)) {
        (void)fs::removeFile(temporary);
        return static_cast<int>(kWriteFailed);
    }
    return 0;
}

int runProperties(const Invocation& call) { return answerVersionQuery(call.args[2]); }

}  // namespace vaultora
