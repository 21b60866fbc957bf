#include "app/list_file.h"

#include <algorithm>

#include "platform/file.h"
#include "platform/text.h"

namespace vaultora {

namespace {

void addLine(std::string line, std::vector<std::string>& out) {
    if (!line.empty() && line.back() == '\r') line.pop_back();
    if (line.empty() || line[0] == '#') return;
    out.push_back(std::move(line));
}

}  // namespace

std::vector<std::string> decodeListText(const std::vector<uint8_t>& bytes) {
    std::vector<std::string> out;
    const bool le = bytes.size() >= 2 && bytes[0] == 0xFF && bytes[1] == 0xFE;
    const bool be = bytes.size() >= 2 && bytes[0] == 0xFE && bytes[1] == 0xFF;
    if (le || be) {
        std::u16string text;
        for (size_t i = 2; i + 1 < bytes.size(); i += 2) {
            const uint8_t lo = le ? bytes[i] : bytes[i + 1];
            const uint8_t hi = le ? bytes[i + 1] : bytes[i];
            text.push_back(static_cast<char16_t>(lo | (hi << 8)));
        }
        size_t start = 0;
        while (start <= text.size()) {
            size_t end = text.find(u'\n', start);
            if (end == std::u16string::npos) end = text.size();
            addLine(toUtf8(std::u16string_view(text).substr(start, end - start)), out);
            start = end + 1;
        }
        return out;
    }
    std::string line;
    for (uint8_t b : bytes) {
        if (b == '\n') {
            addLine(std::move(line), out);
            line.clear();
        } else {
            line.push_back(static_cast<char>(b));
        }
    }
    addLine(std::move(line), out);
    return out;
}

bool expandItems(const std::vector<std::string>& items, ItemList& out, std::string& failed) {
    for (const std::string& item : items) {
        if (item.size() < 2 || item[0] != '@') {
            out.paths.push_back(item);
            continue;
        }
        const bool wipe = item[1] == '*';
        const std::string listPath = item.substr(wipe ? 2 : 1);
        std::vector<uint8_t> bytes;
        if (listPath.empty() || fs::isDirectory(listPath) || !fs::readWholeFile(listPath, bytes)) {
            failed = listPath;
            return false;
        }
        if (wipe) out.wipeAtEnd.push_back(listPath);
        for (std::string& p : decodeListText(bytes)) out.paths.push_back(std::move(p));
    }
    return true;
}

bool wipeAndDelete(const std::string& path) {
    {
        File f;
        if (f.open(path, OpenMode::kReadWrite) == 0) {
            const int64_t size = f.size();
            const std::vector<uint8_t> zeros(65536, 0);
            for (int64_t at = 0; at < size; at += static_cast<int64_t>(zeros.size())) {
                const size_t n = static_cast<size_t>(std::min<int64_t>(size - at, static_cast<int64_t>(zeros.size())));
                if (!f.writeAt(static_cast<uint64_t>(at), zeros.data(), n)) break;
            }
            (void)f.sync();
        }
    }
    return fs::removeFile(path);
}

std::string archiveNameForItem(const std::string& item, bool isFolder) {
    std::string path = item;
    while (path.size() > 1 && path.back() == '/') path.pop_back();
    if (isFolder) return path + ".vra";
    const size_t slash = path.find_last_of('/');
    const size_t nameStart = slash == std::string::npos ? 0 : slash + 1;
    const size_t tailStart = std::max(nameStart, path.size() >= 4 ? path.size() - 4 : 0);
    const size_t dot = path.rfind('.');
    if (dot != std::string::npos && dot >= tailStart && dot > nameStart) return path.substr(0, dot) + ".vra";
    return path + ".vra";
}

}  // namespace vaultora
