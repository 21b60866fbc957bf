#include "platform/settings.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "platform/file.h"
#include "platform/paths.h"
#include "platform/text.h"

namespace vaultora {

namespace {

constexpr std::string_view kHeader = "Windows Registry Editor Version 5.00";
constexpr std::string_view kUserRoot = "HKEY_CURRENT_USER";
constexpr std::string_view kMachineRoot = "HKEY_LOCAL_MACHINE";

// Value types, numbered as the registry numbers them (the N of "hex(N):").
constexpr uint32_t kTypeString = 1;
constexpr uint32_t kTypeBinary = 3;
constexpr uint32_t kTypeDword = 4;

// One value. Strings hold their UTF-8 text in `data`; DWORDs their 4 little-endian bytes.
struct Value {
    std::string name;
    uint32_t type = kTypeBinary;
    std::vector<uint8_t> data;
};

struct Key {
    std::string path;  // with its root: "HKEY_CURRENT_USER\Software\Korvel\Vaultora"
    std::vector<Value> values;
};

// A whole settings file. Key paths and value names are unique (case-insensitively).
struct Document {
    std::vector<Key> keys;
};

std::string_view rootName(SettingsRoot root) {
    return root == SettingsRoot::kCurrentUser ? kUserRoot : kMachineRoot;
}

std::string fullKey(SettingsRoot root, std::string_view key) {
    std::string k(rootName(root));
    if (!key.empty()) {
        k += '\\';
        k += key;
    }
    return k;
}

Key* findKey(Document& doc, std::string_view path) {
    for (Key& k : doc.keys)
        if (equalsIgnoreCaseAscii(k.path, path)) return &k;
    return nullptr;
}

const Value* findValue(const Document& doc, std::string_view path, std::string_view name) {
    for (const Key& k : doc.keys) {
        if (!equalsIgnoreCaseAscii(k.path, path)) continue;
        for (const Value& v : k.values)
            if (equalsIgnoreCaseAscii(v.name, name)) return &v;
    }
    return nullptr;
}

void setValue(Document& doc, std::string_view path, Value value) {
    Key* key = findKey(doc, path);
    if (key == nullptr) {
        doc.keys.push_back(Key{std::string(path), {}});
        key = &doc.keys.back();
    }
    for (Value& v : key->values) {
        if (equalsIgnoreCaseAscii(v.name, value.name)) {
            v.type = value.type;
            v.data = std::move(value.data);
            return;
        }
    }
    key->values.push_back(std::move(value));
}

// True when a value was removed.
bool removeValue(Document& doc, std::string_view path, std::string_view name) {
    Key* key = findKey(doc, path);
    if (key == nullptr) return false;
    for (auto it = key->values.begin(); it != key->values.end(); ++it) {
        if (equalsIgnoreCaseAscii(it->name, name)) {
            key->values.erase(it);
            return true;
        }
    }
    return false;
}

// ---- Parsing ----------------------------------------------------------------------------------

bool isSpace(char c) { return c == ' ' || c == '\t'; }

std::string_view trim(std::string_view s) {
    while (!s.empty() && isSpace(s.front())) s.remove_prefix(1);
    while (!s.empty() && isSpace(s.back())) s.remove_suffix(1);
    return s;
}

int hexDigit(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

// Parses 1 to 8 hex digits.
bool parseHex32(std::string_view s, uint32_t& out) {
    if (s.empty() || s.size() > 8) return false;
    out = 0;
    for (char c : s) {
        int d = hexDigit(c);
        if (d < 0) return false;
        out = out << 4 | static_cast<uint32_t>(d);
    }
    return true;
}

// Reads a quoted text starting at s[pos] == '"'; \\ and \" are the escapes (a backslash before
// any other character stands for itself). Leaves pos after the closing quote.
bool parseQuoted(std::string_view s, size_t& pos, std::string& out) {
    if (pos >= s.size() || s[pos] != '"') return false;
    out.clear();
    for (size_t i = pos + 1; i < s.size(); ++i) {
        char c = s[i];
        if (c == '"') {
            pos = i + 1;
            return true;
        }
        if (c == '\\' && i + 1 < s.size() && (s[i + 1] == '\\' || s[i + 1] == '"')) {
            out += s[++i];
            continue;
        }
        out += c;
    }
    return false;
}

bool parseByteList(std::string_view s, std::vector<uint8_t>& out) {
    out.clear();
    s = trim(s);
    if (s.empty()) return true;
    size_t pos = 0;
    while (true) {
        size_t comma = s.find(',', pos);
        std::string_view item = trim(s.substr(pos, comma == std::string_view::npos ? std::string_view::npos : comma - pos));
        if (item.size() != 2) return false;
        int hi = hexDigit(item[0]), lo = hexDigit(item[1]);
        if (hi < 0 || lo < 0) return false;
        out.push_back(static_cast<uint8_t>(hi << 4 | lo));
        if (comma == std::string_view::npos) return true;
        pos = comma + 1;
    }
}

// The hex(1) form of a string: UTF-16LE, normally ending in a zero character.
std::string stringFromUtf16Bytes(const std::vector<uint8_t>& bytes) {
    std::u16string u;
    for (size_t i = 0; i + 1 < bytes.size(); i += 2)
        u += static_cast<char16_t>(bytes[i] | bytes[i + 1] << 8);
    while (!u.empty() && u.back() == 0) u.pop_back();
    return toUtf8(u);
}

std::vector<uint8_t> utf16BytesFromString(std::string_view text) {
    std::u16string u = fromUtf8(text);
    std::vector<uint8_t> out;
    out.reserve(u.size() * 2 + 2);
    for (char16_t c : u) {
        out.push_back(static_cast<uint8_t>(c & 0xFF));
        out.push_back(static_cast<uint8_t>(c >> 8));
    }
    out.push_back(0);
    out.push_back(0);
    return out;
}

// Parses the text after '=' into a value; `more` supplies continuation lines for hex lists.
bool parseData(std::string data, const std::function<bool(std::string&)>& more, Value& v) {
    std::string_view d = trim(data);
    if (!d.empty() && d.front() == '"') {
        size_t pos = 0;
        std::string text;
        if (!parseQuoted(d, pos, text) || !trim(d.substr(pos)).empty()) return false;
        v.type = kTypeString;
        v.data.assign(text.begin(), text.end());
        return true;
    }
    if (d.substr(0, 6) == "dword:") {
        uint32_t x = 0;
        if (!parseHex32(d.substr(6), x)) return false;
        v.type = kTypeDword;
        v.data = {static_cast<uint8_t>(x), static_cast<uint8_t>(x >> 8), static_cast<uint8_t>(x >> 16),
                  static_cast<uint8_t>(x >> 24)};
        return true;
    }
    if (d.substr(0, 3) != "hex") return false;
    uint32_t type = kTypeBinary;
    size_t colon = d.find(':');
    if (colon == std::string_view::npos) return false;
    if (colon != 3) {
        std::string_view t = d.substr(3, colon - 3);
        if (t.size() < 3 || t.front() != '(' || t.back() != ')' || !parseHex32(t.substr(1, t.size() - 2), type))
            return false;
    }
    std::string list(d.substr(colon + 1));
    // A trailing backslash continues the list on the next line.
    while (!trim(list).empty() && trim(list).back() == '\\') {
        std::string_view t = trim(list);
        list = std::string(t.substr(0, t.size() - 1));
        std::string next;
        if (!more(next)) return false;
        list += trim(next);
    }
    std::vector<uint8_t> bytes;
    if (!parseByteList(list, bytes)) return false;
    if (type == kTypeString) {
        std::string text = stringFromUtf16Bytes(bytes);
        v.type = kTypeString;
        v.data.assign(text.begin(), text.end());
    } else {
        v.type = type;
        v.data = std::move(bytes);
    }
    return true;
}

bool parseDocument(const std::vector<uint8_t>& bytes, Document& doc) {
    doc.keys.clear();
    std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    if (text.substr(0, 3) == "\xEF\xBB\xBF") text.remove_prefix(3);
    std::vector<std::string_view> lines;
    while (!text.empty()) {
        size_t nl = text.find('\n');
        std::string_view line = text.substr(0, nl);
        if (!line.empty() && line.back() == '\r') line.remove_suffix(1);
        lines.push_back(line);
        if (nl == std::string_view::npos) break;
        text.remove_prefix(nl + 1);
    }
    size_t i = 0;
    auto skipBlank = [&] {
        while (i < lines.size() && (trim(lines[i]).empty() || trim(lines[i]).front() == ';')) ++i;
    };
    skipBlank();
    if (i == lines.size()) return true;  // an empty file holds no values
    if (trim(lines[i]) != kHeader) return false;
    ++i;
    std::string currentKey;
    bool haveKey = false;
    for (skipBlank(); i < lines.size(); ++i, skipBlank()) {
        std::string_view line = trim(lines[i]);
        if (line.front() == '[') {
            if (line.size() < 3 || line.back() != ']' || line[1] == '-') return false;
            currentKey = std::string(line.substr(1, line.size() - 2));
            haveKey = true;
            if (findKey(doc, currentKey) == nullptr) doc.keys.push_back(Key{currentKey, {}});
            continue;
        }
        if (!haveKey) return false;
        Value v;
        size_t pos = 0;
        if (line.front() == '@') {
            pos = 1;
        } else if (!parseQuoted(line, pos, v.name)) {
            return false;
        }
        if (pos >= line.size() || line[pos] != '=') return false;
        auto more = [&](std::string& next) {
            if (i + 1 >= lines.size()) return false;
            next = std::string(lines[++i]);
            return true;
        };
        if (!parseData(std::string(line.substr(pos + 1)), more, v)) return false;
        setValue(doc, currentKey, std::move(v));
    }
    return true;
}

// ---- Writing ----------------------------------------------------------------------------------

std::string quote(std::string_view s) {
    std::string out = "\"";
    for (char c : s) {
        if (c == '\\' || c == '"') out += '\\';
        out += c;
    }
    out += '"';
    return out;
}

// True when the text can stand between quotes on one line and read back the same: valid UTF-8
// without control characters other than tab.
bool fitsQuoted(std::string_view text) {
    std::u16string u = fromUtf8(text);
    for (size_t i = 0; i < u.size(); ++i) {
        char16_t c = u[i];
        if ((c < 0x20 && c != '\t') || c == 0x7F) return false;
        if (c >= 0xD800 && c <= 0xDBFF && i + 1 < u.size() && u[i + 1] >= 0xDC00 && u[i + 1] <= 0xDFFF) {
            ++i;
            continue;
        }
        if (c >= 0xD800 && c <= 0xDFFF) return false;  // an escaped byte that is not UTF-8
    }
    return true;
}

std::string hexList(const std::vector<uint8_t>& bytes) {
    static const char kDigits[] = "0123456789abcdef";
    std::string out;
    for (size_t i = 0; i < bytes.size(); ++i) {
        if (i != 0) out += ',';
        out += kDigits[bytes[i] >> 4];
        out += kDigits[bytes[i] & 15];
    }
    return out;
}

std::string serialize(const Document& doc) {
    std::string out(kHeader);
    out += "\n";
    for (const Key& k : doc.keys) {
        out += "\n[" + k.path + "]\n";
        for (const Value& v : k.values) {
            out += v.name.empty() ? std::string("@") : quote(v.name);
            out += '=';
            if (v.type == kTypeDword && v.data.size() == 4) {
                uint32_t x = static_cast<uint32_t>(v.data[0]) | static_cast<uint32_t>(v.data[1]) << 8 |
                             static_cast<uint32_t>(v.data[2]) << 16 | static_cast<uint32_t>(v.data[3]) << 24;
                char buf[16];
                std::snprintf(buf, sizeof buf, "dword:%08x", x);
                out += buf;
            } else if (v.type == kTypeString) {
                std::string_view text(reinterpret_cast<const char*>(v.data.data()), v.data.size());
                if (fitsQuoted(text))
                    out += quote(text);
                else
                    out += "hex(1):" + hexList(utf16BytesFromString(text));
            } else if (v.type == kTypeBinary) {
                out += "hex:" + hexList(v.data);
            } else {
                char buf[24];
                std::snprintf(buf, sizeof buf, "hex(%x):", v.type);
                out += buf + hexList(v.data);
            }
            out += '\n';
        }
    }
    return out;
}

// ---- Files and the lock -----------------------------------------------------------------------

std::string folderOf(const std::string& path) {
    size_t slash = path.rfind('/');
    if (slash == std::string::npos) return ".";
    return slash == 0 ? std::string("/") : path.substr(0, slash);
}

// An exclusive lock on "<file>.lock" for the lifetime of the object. It is an open-file-description
// lock, so it also keeps two threads of one process apart.
class StoreLock {
public:
    explicit StoreLock(const std::string& file) {
        if (m_file.open(file + ".lock", OpenMode::kOpenAlways) != 0) return;
        struct flock fl {};
        fl.l_type = F_WRLCK;
        fl.l_whence = SEEK_SET;
        int rc;
        do {
            rc = ::fcntl(m_file.fd(), F_OFD_SETLKW, &fl);
        } while (rc != 0 && errno == EINTR);
        if (rc != 0) m_file.close();
    }
    bool held() const { return m_file.isOpen(); }

private:
    File m_file;  // closing it releases the lock
};

enum class Load { kOk, kMissing, kUnreadable, kBad };

Load loadFile(const std::string& path, Document& doc) {
    doc.keys.clear();
    if (path.empty() || !fs::exists(path)) return Load::kMissing;
    std::vector<uint8_t> bytes;
    if (!fs::readWholeFile(path, bytes)) return Load::kUnreadable;
    if (!parseDocument(bytes, doc)) {
        doc.keys.clear();
        return Load::kBad;
    }
    return Load::kOk;
}

// Moves a user file that does not parse aside; called with the lock held. True when the path is
// free for a new file afterwards.
bool keepAside(const std::string& path) { return fs::renameFile(path, path + ".bad"); }

// Loads the user file for reading. A file that does not parse is re-read under the lock (a
// writer may just have replaced it) and moved aside when it is still bad.
Document loadUser(const std::string& path) {
    Document doc;
    if (loadFile(path, doc) == Load::kBad) {
        StoreLock lock(path);
        if (lock.held() && loadFile(path, doc) == Load::kBad) keepAside(path);
    }
    return doc;
}

Document loadSystem(const std::string& path) {
    Document doc;
    loadFile(path, doc);
    return doc;
}

void syncFolder(const std::string& folder) {
    int fd = ::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0) return;
    ::fsync(fd);
    ::close(fd);
}

// Read-change-write of the user file under the lock. `change` returns false when it changed
// nothing, and then the file is not rewritten.
bool modifyUser(const std::string& path, const std::function<bool(Document&)>& change) {
    if (path.empty()) return false;
    std::string folder = folderOf(path);
    if (!fs::createDirectories(folder, 0700)) return false;
    StoreLock lock(path);
    if (!lock.held()) return false;
    Document doc;
    switch (loadFile(path, doc)) {
        case Load::kOk:
        case Load::kMissing: break;
        case Load::kUnreadable: return false;  // never replace a file we could not read
        case Load::kBad:
            if (!keepAside(path)) return false;
            break;
    }
    if (!change(doc)) return true;
    std::string text = serialize(doc);
    std::string tmp = path + ".tmp";
    if (!fs::writeWholeFile(tmp, text.data(), text.size()) || !fs::renameFile(tmp, path)) {
        fs::removeFile(tmp);
        return false;
    }
    syncFolder(folder);
    return true;
}

std::optional<uint32_t> dwordOf(const Value* v) {
    if (v == nullptr || v->type != kTypeDword || v->data.size() != 4) return std::nullopt;
    return static_cast<uint32_t>(v->data[0]) | static_cast<uint32_t>(v->data[1]) << 8 |
           static_cast<uint32_t>(v->data[2]) << 16 | static_cast<uint32_t>(v->data[3]) << 24;
}

std::optional<std::vector<uint8_t>> binaryOf(const Value* v) {
    if (v == nullptr || v->type != kTypeBinary) return std::nullopt;
    return v->data;
}

std::optional<std::string> stringOf(const Value* v) {
    if (v == nullptr || v->type != kTypeString) return std::nullopt;
    return std::string(v->data.begin(), v->data.end());
}

}  // namespace

// ---- Settings ---------------------------------------------------------------------------------

std::atomic<Settings*> Settings::s_override{nullptr};

Settings::Settings(std::string userFile, std::string systemFile)
    : m_userFile(std::move(userFile)), m_systemFile(std::move(systemFile)) {}

Settings& Settings::instance() {
    if (Settings* s = s_override.load()) return *s;
    static Settings store(defaultUserFile(), defaultSystemFile());
    return store;
}

void Settings::setInstance(Settings* store) { s_override.store(store); }

std::string Settings::defaultUserFile() { return paths::configFolder() + "/user.reg"; }
std::string Settings::defaultSystemFile() { return "/etc/vaultora/system.reg"; }

namespace {
// The value as stored under one root of a store.
template <class Convert>
auto readFrom(const Settings& s, SettingsRoot root, std::string_view key, std::string_view name, Convert convert) {
    Document doc = root == SettingsRoot::kCurrentUser ? loadUser(s.userFile()) : loadSystem(s.systemFile());
    return convert(findValue(doc, fullKey(root, key), name));
}

// The user value, or with kUserThenMachine the system value when the user file has none of the
// right type.
template <class Convert>
auto readScoped(const Settings& s, std::string_view name, SettingsScope scope, Convert convert) {
    auto v = readFrom(s, SettingsRoot::kCurrentUser, kSettingsKey, name, convert);
    if (!v && scope == SettingsScope::kUserThenMachine)
        v = readFrom(s, SettingsRoot::kLocalMachine, kSettingsKey, name, convert);
    return v;
}

Value makeDword(std::string_view name, uint32_t x) {
    return Value{std::string(name), kTypeDword,
                 {static_cast<uint8_t>(x), static_cast<uint8_t>(x >> 8), static_cast<uint8_t>(x >> 16),
                  static_cast<uint8_t>(x >> 24)}};
}
}  // namespace

std::optional<uint32_t> Settings::readDword(SettingsRoot root, std::string_view key, std::string_view name) const {
    return readFrom(*this, root, key, name, dwordOf);
}

std::optional<std::vector<uint8_t>> Settings::readBinary(SettingsRoot root, std::string_view key,
                                                         std::string_view name) const {
    return readFrom(*this, root, key, name, binaryOf);
}

std::optional<std::string> Settings::readString(SettingsRoot root, std::string_view key,
                                                std::string_view name) const {
    return readFrom(*this, root, key, name, stringOf);
}

bool Settings::writeDword(SettingsRoot root, std::string_view key, std::string_view name, uint32_t value) {
    if (root != SettingsRoot::kCurrentUser) return false;
    return modifyUser(m_userFile, [&](Document& doc) {
        std::string path = fullKey(root, key);
        if (dwordOf(findValue(doc, path, name)) == value) return false;
        setValue(doc, path, makeDword(name, value));
        return true;
    });
}

bool Settings::writeBinary(SettingsRoot root, std::string_view key, std::string_view name,
                           const std::vector<uint8_t>& bytes) {
    if (root != SettingsRoot::kCurrentUser) return false;
    return modifyUser(m_userFile, [&](Document& doc) {
        std::string path = fullKey(root, key);
        if (bytes.empty()) return removeValue(doc, path, name);
        if (binaryOf(findValue(doc, path, name)) == bytes) return false;
        setValue(doc, path, Value{std::string(name), kTypeBinary, bytes});
        return true;
    });
}

bool Settings::writeString(SettingsRoot root, std::string_view key, std::string_view name, std::string_view text) {
    if (root != SettingsRoot::kCurrentUser) return false;
    return modifyUser(m_userFile, [&](Document& doc) {
        std::string path = fullKey(root, key);
        if (stringOf(findValue(doc, path, name)) == text) return false;
        setValue(doc, path, Value{std::string(name), kTypeString, std::vector<uint8_t>(text.begin(), text.end())});
        return true;
    });
}

bool Settings::deleteValue(SettingsRoot root, std::string_view key, std::string_view name) {
    if (root != SettingsRoot::kCurrentUser) return false;
    return modifyUser(m_userFile, [&](Document& doc) { return removeValue(doc, fullKey(root, key), name); });
}

std::optional<uint32_t> Settings::readDword(std::string_view name, SettingsScope scope) const {
    return readScoped(*this, name, scope, dwordOf);
}

std::optional<std::vector<uint8_t>> Settings::readBinary(std::string_view name, SettingsScope scope) const {
    return readScoped(*this, name, scope, binaryOf);
}

std::optional<std::string> Settings::readString(std::string_view name, SettingsScope scope) const {
    return readScoped(*this, name, scope, stringOf);
}

bool Settings::writeDword(std::string_view name, uint32_t value) {
    return writeDword(SettingsRoot::kCurrentUser, kSettingsKey, name, value);
}

bool Settings::writeBinary(std::string_view name, const std::vector<uint8_t>& bytes) {
    return writeBinary(SettingsRoot::kCurrentUser, kSettingsKey, name, bytes);
}

bool Settings::writeString(std::string_view name, std::string_view text) {
    return writeString(SettingsRoot::kCurrentUser, kSettingsKey, name, text);
}

bool Settings::deleteValue(std::string_view name) {
    return deleteValue(SettingsRoot::kCurrentUser, kSettingsKey, name);
}

bool Settings::updateBinary(std::string_view name, SettingsScope scope, const BinaryChange& change) {
    return modifyUser(m_userFile, [&](Document& doc) {
        std::string path = fullKey(SettingsRoot::kCurrentUser, kSettingsKey);
        std::optional<std::vector<uint8_t>> current = binaryOf(findValue(doc, path, name));
        if (!current && scope == SettingsScope::kUserThenMachine)
            current = readBinary(SettingsRoot::kLocalMachine, kSettingsKey, name);
        std::optional<std::vector<uint8_t>> next = change(current);
        if (!next) return false;
        if (next->empty()) return removeValue(doc, path, name);
        if (binaryOf(findValue(doc, path, name)) == *next) return false;
        setValue(doc, path, Value{std::string(name), kTypeBinary, std::move(*next)});
        return true;
    });
}

// ---- Typed settings ---------------------------------------------------------------------------

namespace {
constexpr std::string_view kAppFlags = "AppFlags";
constexpr std::string_view kSendMailDelay = "sendMailDelayBeforeDeleteTempFile";
constexpr std::string_view kFramePos = "FramePos";
constexpr std::string_view kTempFolder = "TempFolder";

uint32_t getLe32(const uint8_t* p) {
    return static_cast<uint32_t>(p[0]) | static_cast<uint32_t>(p[1]) << 8 | static_cast<uint32_t>(p[2]) << 16 |
           static_cast<uint32_t>(p[3]) << 24;
}

void putLe32(std::vector<uint8_t>& out, uint32_t x) {
    for (int i = 0; i < 4; ++i) out.push_back(static_cast<uint8_t>(x >> (8 * i)));
}

uint32_t flagsOf(const std::optional<std::vector<uint8_t>>& bytes) {
    return bytes && bytes->size() == 4 ? getLe32(bytes->data()) : kAppFlagsAbsent;
}
}  // namespace

uint32_t readAppFlags(const Settings& store) {
    return flagsOf(store.readBinary(kAppFlags, SettingsScope::kUserThenMachine));
}

bool appFlag(uint32_t mask, const Settings& store) { return (readAppFlags(store) & mask) == mask; }

bool setAppFlag(uint32_t mask, bool on, Settings& store) {
    return store.updateBinary(kAppFlags, SettingsScope::kUserThenMachine,
                              [&](const std::optional<std::vector<uint8_t>>& current) {
                                  uint32_t flags = flagsOf(current);
                                  flags = on ? flags | mask : flags & ~mask;
                                  std::vector<uint8_t> out;
                                  putLe32(out, flags);
                                  return std::optional<std::vector<uint8_t>>(std::move(out));
                              });
}

uint32_t sendMailDelayBeforeDeleteTempFile(const Settings& store) {
    return store.readDword(kSendMailDelay, SettingsScope::kUserThenMachine).value_or(0);
}

std::vector<uint8_t> FramePos::encode() const {
    std::vector<uint8_t> out;
    out.reserve(kSize);
    for (int32_t v : {left, top, right, bottom}) putLe32(out, static_cast<uint32_t>(v));
    putLe32(out, listViewMode);
    for (int32_t w : columnWidths) putLe32(out, static_cast<uint32_t>(w));
    putLe32(out, flags);
    putLe32(out, static_cast<uint32_t>(recipientMode));
    putLe32(out, static_cast<uint32_t>(sortColumn));
    return out;
}

std::optional<FramePos> FramePos::decode(const std::vector<uint8_t>& bytes) {
    if (bytes.size() > kSize) return std::nullopt;
    // A shorter record overlays the leading fields of the defaults.
    std::vector<uint8_t> full = FramePos().encode();
    if (!bytes.empty()) std::memcpy(full.data(), bytes.data(), bytes.size());
    const uint8_t* p = full.data();
    auto next = [&p] {
        uint32_t v = getLe32(p);
        p += 4;
        return v;
    };
    FramePos f;
    f.left = static_cast<int32_t>(next());
    f.top = static_cast<int32_t>(next());
    f.right = static_cast<int32_t>(next());
    f.bottom = static_cast<int32_t>(next());
    f.listViewMode = next();
    for (int32_t& w : f.columnWidths) w = static_cast<int32_t>(next());
    f.flags = next();
    f.recipientMode = static_cast<int32_t>(next());
    f.sortColumn = static_cast<int32_t>(next());
    return f;
}

std::optional<FramePos> readFramePos(const Settings& store) {
    std::optional<std::vector<uint8_t>> bytes = store.readBinary(kFramePos, SettingsScope::kUserOnly);
    if (!bytes || bytes->empty()) return std::nullopt;
    return FramePos::decode(*bytes);
}

bool writeFramePos(const FramePos& pos, Settings& store) { return store.writeBinary(kFramePos, pos.encode()); }

bool setFramePosFlag(uint32_t mask, bool on, Settings& store) {
    return store.updateBinary(kFramePos, SettingsScope::kUserOnly,
                              [&](const std::optional<std::vector<uint8_t>>& current) {
                                  FramePos pos;
                                  if (current && !current->empty())
                                      if (std::optional<FramePos> stored = FramePos::decode(*current)) pos = *stored;
                                  pos.flags = on ? pos.flags | mask : pos.flags & ~mask;
                                  return std::optional<std::vector<uint8_t>>(pos.encode());
                              });
}

std::string tempFolder(const Settings& store) {
    std::string folder;
    std::optional<std::string> chosen = store.readString(kTempFolder, SettingsScope::kUserOnly);
    if (chosen && !chosen->empty()) {
        folder = *chosen;
        if (!fs::createDirectories(folder, 0700)) return std::string();
    } else {
        folder = paths::runtimeFolder();
        if (folder.empty()) return std::string();
    }
    if (folder.back() != '/') folder += '/';
    return folder;
}

bool writeTempFolder(std::string_view path, Settings& store) { return store.writeString(kTempFolder, path); }

}  // namespace vaultora
