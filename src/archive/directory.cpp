#include "archive/directory.h"

#include <cstring>

#include "archive/walk.h"
#include "platform/disk_file.h"

namespace vaultora {

namespace {

char16_t nameUnit(const uint8_t* record, size_t i) { return static_cast<char16_t>(getU16(record + 46 + 2 * i)); }

// Matches pattern[pi..] against the record name from ni on; '*' backtracks to its last position.
bool matchRecord(const uint8_t* record, size_t nameLength, std::u16string_view pattern) {
    size_t p = 0, n = 0, starP = std::u16string_view::npos, starN = 0;
    while (n < nameLength) {
        if (p < pattern.size() && (pattern[p] == u'%' || pattern[p] == nameUnit(record, n))) {
            ++p;
            ++n;
        } else if (p < pattern.size() && pattern[p] == u'*') {
            starP = p++;
            starN = n;
        } else if (starP != std::u16string_view::npos) {
            p = starP + 1;
            n = ++starN;
        } else {
            return false;
        }
    }
    while (p < pattern.size() && pattern[p] == u'*') ++p;
    return p == pattern.size();
}

Result readChainCluster(Vaultora& a, uint32_t c, ChainBuffer& buffer) {
    buffer.cluster = c;
    return a.readCluster(buffer);
}

}  // namespace

size_t recordNameLength(const uint8_t* record) {
    const uint32_t length = unit::length(record);
    uint32_t end = unit::kind(record) == kUnitInline ? unit::start(record) : length;
    if (end > length || end < kUnitFixedSize) end = length;
    size_t n = (end - kUnitFixedSize) / 2;
    // The stored length may include padding: stop at the terminating zero.
    for (size_t i = 0; i < n; ++i)
        if (nameUnit(record, i) == 0) return i;
    return n;
}

bool recordNameMatches(const uint8_t* record, std::u16string_view pattern) {
    return matchRecord(record, recordNameLength(record), pattern);
}

bool recordNameEquals(const uint8_t* record, std::u16string_view name) {
    const size_t n = recordNameLength(record);
    if (n != name.size()) return false;
    for (size_t i = 0; i < n; ++i)
        if (nameUnit(record, i) != name[i]) return false;
    return true;
}

bool wildcardMatch(std::u16string_view pattern, std::u16string_view name) {
    SecureBytes r = makeRecordWithAttributes(name, 0, 0);
    return matchRecord(r.data(), name.size(), pattern);
}

void splitUnitPath(std::u16string_view path, std::u16string& folder, std::u16string& name) {
    while (!path.empty() && path.front() == u'\\') path.remove_prefix(1);
    const size_t slash = path.rfind(u'\\');
    if (slash == std::u16string_view::npos) {
        folder.clear();
        name.assign(path);
    } else {
        folder.assign(path.substr(0, slash));
        name.assign(path.substr(slash + 1));
    }
}

std::u16string joinUnitPath(std::u16string_view folder, std::u16string_view name) {
    while (!folder.empty() && folder.front() == u'\\') folder.remove_prefix(1);
    if (folder.empty()) return std::u16string(name);
    std::u16string out(folder);
    out += u'\\';
    out += name;
    return out;
}

Result resolveFolder(Vaultora& a, std::u16string_view path, uint32_t& cluster) {
    while (!path.empty() && path.front() == u'\\') path.remove_prefix(1);
    while (!path.empty() && path.back() == u'\\') path.remove_suffix(1);
    if (path.empty()) {
        cluster = 0;
        return kOk;
    }
    std::u16string parent, name;
    splitUnitPath(path, parent, name);
    uint32_t c = 0;
    if (Result rc = resolveFolder(a, parent, c); rc != kOk) return rc;
    if (c == kNoCluster) return kNotFound;
    SecureBytes copy;
    if (Result rc = findUnit(a, name, c, &copy); rc != kOk) return rc;
    cluster = unit::kind(copy.data()) == kUnitInline ? kNoCluster : unit::start(copy.data());
    return kOk;
}

Result findUnit(Vaultora& a, std::u16string_view pattern, uint32_t& cluster, SecureBytes* copy) {
    if (cluster >= a.cot().size()) return kInconsistent;
    uint32_t c = cluster;
    size_t steps = 0;
    ChainBuffer buffer;
    for (;;) {
        if (readChainCluster(a, c, buffer) != kOk) return kDirReadFailed;
        const size_t off = findInBuffer(buffer, pattern);
        if (off != std::string::npos) {
            cluster = c;
            if (copy != nullptr) {
                const uint8_t* r = buffer.data.data() + off;
                copy->assign(r, r + unit::length(r));
            }
            return kOk;
        }
        const uint32_t next = a.nextCluster(c);
        if (next == kEndOfChain || next == 0 || next == c || ++steps > a.cot().size()) break;
        c = next;
    }
    cluster = c;
    return kNotFound;
}

size_t findInBuffer(const ChainBuffer& buffer, std::u16string_view pattern) {
    const uint8_t* p = buffer.data.data();
    const size_t n = buffer.data.size();
    for (size_t off = 0; off + kUnitFixedSize <= n;) {
        const uint8_t* r = p + off;
        if (!unit::valid(r, n - off)) return std::string::npos;
        if (unit::kind(r) != kUnitDeleted && unit::kind(r) != kUnitVolume && recordNameMatches(r, pattern)) return off;
        off += unit::length(r);
    }
    return std::string::npos;
}

Result findUnitByPath(Vaultora& a, std::u16string_view path, SecureBytes& copy) {
    std::u16string folder, name;
    splitUnitPath(path, folder, name);
    uint32_t c = 0;
    if (Result rc = resolveFolder(a, folder, c); rc != kOk) return rc;
    if (c == kNoCluster) return kNotFound;
    return findUnit(a, name, c, &copy);
}

Result unitAttributes(Vaultora& a, std::u16string_view path, uint32_t& attributes) {
    SecureBytes copy;
    if (Result rc = findUnitByPath(a, path, copy); rc != kOk) return rc;
    attributes = unit::attributes(copy.data());
    return kOk;
}

Result pathChain(Vaultora& a, std::u16string_view folder, std::vector<uint32_t>& chain) {
    uint32_t c = 0;
    if (Result rc = resolveFolder(a, folder, c); rc != kOk) return rc;
    chain = a.chainClusters(c);
    return kOk;
}

Result readInlineUnit(Vaultora& a, std::u16string_view path, SecureBytes& buffer) {
    SecureBytes copy;
    if (Result rc = findUnitByPath(a, path, copy); rc != kOk) return rc;
    const uint8_t* r = copy.data();
    if (unit::kind(r) == kUnitInline) {
        const uint32_t start = unit::start(r), length = unit::length(r);
        if (start > length) return kInconsistent;
        try {
            buffer.insert(buffer.end(), r + start, r + length);
        } catch (const std::bad_alloc&) {
            return kNoMemoryForRecord;
        }
        return kOk;
    }
    if (unit::start(r) == 0 && unit::size(r) == 0) return kOk;
    return kNotInline;
}

Result uniqueName(Vaultora& a, uint32_t folderChain, std::u16string& name) {
    const std::u16string base = name;
    for (unsigned i = 0;; ++i) {
        std::u16string candidate = base;
        if (i > 0) {
            for (char ch : std::to_string(i)) candidate += static_cast<char16_t>(ch);
        }
        if (candidate.size() >= 260) return kInvalidName;
        uint32_t c = folderChain;
        Result rc = findUnit(a, candidate, c, nullptr);
        if (rc == kNotFound) {
            name = candidate;
            return kOk;
        }
        if (rc != kOk) return rc;
    }
}

SecureBytes makeRecordWithAttributes(std::u16string_view name, uint32_t size, uint32_t attributes) {
    SecureBytes r(kUnitFixedSize + 2 * name.size(), 0);
    unit::setLength(r.data(), static_cast<uint32_t>(r.size()));
    r[5] = kUnitSignature;
    for (size_t i = 0; i < name.size(); ++i) putU16(r.data() + 46 + 2 * i, name[i]);
    unit::setAttributes(r.data(), attributes);
    const uint64_t now = currentFileTime();
    unit::setTimes(r.data(), now, now, now);
    unit::setSize(r.data(), size);
    if (size > 0 && size < kInlineThreshold) {
        const uint32_t old = static_cast<uint32_t>(r.size());
        r.resize(old + size, 0);
        unit::setLength(r.data(), static_cast<uint32_t>(r.size()));
        unit::setKind(r.data(), kUnitInline);
        unit::setStart(r.data(), old);
    }
    return r;
}

Result makeUnitRecord(std::u16string_view name, const std::string* sourcePath, bool isFile, SecureBytes& record) {
    if (sourcePath == nullptr) {
        record = makeRecordWithAttributes(name, 0, isFile ? 0 : kAttrFolder);
        return kOk;
    }
    DiskInfo info;
    if (!diskInfo(*sourcePath, info)) return kSourceAttributes;
    const uint64_t size = info.isFolder() ? 0 : info.size;
    record = makeRecordWithAttributes(name, size < kInlineThreshold ? static_cast<uint32_t>(size) : 0, info.attributes);
    unit::setTimes(record.data(), info.created, info.modified, info.accessed);
    unit::setSize(record.data(), size);
    return kOk;
}

SecureBytes renamedRecord(const uint8_t* record, std::u16string_view name) {
    const uint32_t length = unit::length(record);
    const bool isInline = unit::kind(record) == kUnitInline;
    const uint32_t dataStart = isInline ? unit::start(record) : length;
    const uint32_t dataLength = length - dataStart;
    SecureBytes r(kUnitFixedSize + 2 * name.size() + dataLength, 0);
    std::memcpy(r.data(), record, 46);
    for (size_t i = 0; i < name.size(); ++i) putU16(r.data() + 46 + 2 * i, name[i]);
    const uint32_t newStart = static_cast<uint32_t>(kUnitFixedSize + 2 * name.size());
    if (dataLength != 0) std::memcpy(r.data() + newStart, record + dataStart, dataLength);
    unit::setLength(r.data(), static_cast<uint32_t>(r.size()));
    if (isInline) unit::setStart(r.data(), newStart);
    return r;
}

Result findRoom(Vaultora& a, uint32_t chainStart, ChainBuffer& buffer, const SecureBytes& record,
                const std::u16string* newName) {
    if (chainStart == kNoCluster) return kNotInline;
    if (chainStart >= a.cot().size()) return kInconsistent;
    size_t length = record.size();
    std::u16string name = newName != nullptr ? *newName : unit::name(record.data());
    if (newName != nullptr) length = renamedRecord(record.data(), *newName).size();
    if (buffer.dirty) {
        if (Result rc = a.writeDirectoryCluster(buffer, true); rc != kOk) return rc;
    }
    uint32_t c = chainStart;
    size_t steps = 0;
    for (;;) {
        if (readChainCluster(a, c, buffer) != kOk) return kDirReadFailed;
        if (findInBuffer(buffer, name) != std::string::npos) return kUnitExists;
        if (buffer.data.size() + length <= kMaxPayload) return kOk;
        const uint32_t next = a.nextCluster(c);
        if (next == kEndOfChain || next == 0 || next == c || ++steps > a.cot().size()) break;
        c = next;
    }
    uint32_t added = kNoCluster;
    if (Result rc = a.appendCluster(chainStart, added); rc != kOk) return rc;
    buffer.reset();
    buffer.cluster = added;
    return kOk;
}

Result addRecord(ChainBuffer& buffer, const SecureBytes& record, const std::u16string* newName) {
    SecureBytes renamed;
    const SecureBytes* r = &record;
    if (newName != nullptr) {
        renamed = renamedRecord(record.data(), *newName);
        r = &renamed;
    }
    const std::u16string name = unit::name(r->data());
    if (findInBuffer(buffer, name) != std::string::npos) return kUnitExists;
    if (buffer.data.size() + r->size() > kMaxPayload) return kNoRoom;
    buffer.data.insert(buffer.data.end(), r->begin(), r->end());
    buffer.dirty = true;
    return kOk;
}

bool markDeleted(uint8_t* record) {
    const bool was = unit::length(record) > 46 && getU16(record + 46) == 0x00E5;
    unit::setKind(record, kUnitDeleted);
    unit::setStart(record, kNoCluster);
    if (unit::length(record) >= kUnitFixedSize) putU16(record + 46, 0x00E5);
    return was;
}

bool squeeze(ChainBuffer& buffer) {
    SecureBytes& d = buffer.data;
    size_t read = 0, write = 0;
    bool removed = false, ok = true;
    while (read + kUnitFixedSize <= d.size()) {
        const uint8_t* r = d.data() + read;
        if (!unit::valid(r, d.size() - read)) {
            ok = false;
            break;
        }
        const uint32_t length = unit::length(r);
        if (unit::kind(r) == kUnitDeleted) {
            removed = true;
        } else {
            if (write != read) std::memmove(d.data() + write, r, length);
            write += length;
        }
        read += length;
    }
    if (removed) {
        // Keep whatever follows an invalid record untouched behind the squeezed part.
        if (read < d.size()) std::memmove(d.data() + write, d.data() + read, d.size() - read);
        const size_t newSize = write + (d.size() - read);
        std::memset(d.data() + newSize, 0, d.size() - newSize);
        d.resize(newSize);
        buffer.dirty = true;
    }
    return ok;
}

Result moveUnit(Vaultora& a, std::u16string_view destination, std::u16string_view source, std::u16string_view name,
                const std::u16string* newName) {
    auto trim = [](std::u16string_view p) {
        while (!p.empty() && p.front() == u'\\') p.remove_prefix(1);
        while (!p.empty() && p.back() == u'\\') p.remove_suffix(1);
        return p;
    };
    destination = trim(destination);
    source = trim(source);
    if (destination == source && newName == nullptr) return kUnitExists;
    if (newName != nullptr && newName->find_first_of(u"\\/:*?\"<>|") != std::u16string::npos)
        return a.errorNote(kInvalidName, "HXZip", __LINE__);
    const std::u16string own = joinUnitPath(source, name);
    // A folder may not go below itself; "x" may still move into its sibling "xy".
    if (destination.size() >= own.size() && destination.substr(0, own.size()) == own &&
        (destination.size() == own.size() || destination[own.size()] == u'\\'))
        return a.errorNote(kInvalidName, "HXZip", __LINE__);

    uint32_t sourceChain = 0;
    if (Result rc = resolveFolder(a, source, sourceChain); rc != kOk) return rc;
    uint32_t holder = sourceChain;
    SecureBytes record;
    if (Result rc = findUnit(a, name, holder, &record); rc != kOk) return rc;

    uint32_t destChain = 0;
    if (Result rc = resolveFolder(a, destination, destChain); rc != kOk) return rc;
    ChainBuffer dest;
    if (Result rc = findRoom(a, destChain, dest, record, newName); rc != kOk) return rc;
    if (Result rc = addRecord(dest, record, newName); rc != kOk) return rc;

    if (dest.cluster == holder) {
        // Same cluster: the old record is still in this buffer, in front of the new one.
        const size_t off = findInBuffer(dest, name);
        if (off == std::string::npos) return kNotFound;
        markDeleted(dest.data.data() + off);
        squeeze(dest);
        return a.writeDirectoryCluster(dest, true);
    }
    if (Result rc = a.writeDirectoryCluster(dest, true); rc != kOk) return rc;
    ChainBuffer src;
    src.cluster = holder;
    if (a.readCluster(src) != kOk) return kDirReadFailed;
    const size_t off = findInBuffer(src, name);
    if (off == std::string::npos) return kNotFound;
    markDeleted(src.data.data() + off);
    squeeze(src);
    return a.writeDirectoryCluster(src, true);
}

Result setUnitAttributes(Vaultora& a, std::u16string_view folder, std::u16string_view name, uint32_t attributes) {
    uint32_t c = 0;
    if (Result rc = resolveFolder(a, folder, c); rc != kOk) return rc;
    if (Result rc = findUnit(a, name, c, nullptr); rc != kOk) return rc;
    ChainBuffer buffer;
    buffer.cluster = c;
    if (a.readCluster(buffer) != kOk) return kDirReadFailed;
    const size_t off = findInBuffer(buffer, name);
    if (off == std::string::npos) return kInconsistent;
    unit::setAttributes(buffer.data.data() + off, attributes);
    buffer.dirty = true;
    return a.writeDirectoryCluster(buffer, true);
}

namespace {

// Descends into plain folders and looks at every directory cluster for a record that starts the
// wanted chain.
class cActorBlock_FDUBSC : public cActorBlock {
public:
    cActorBlock_FDUBSC(Vaultora& a, uint32_t wanted) : m_archive(a), m_wanted(wanted) {}
    Result actOnUnit(uint8_t* record, std::u16string_view folderPath) override {
        if (unit::attributes(record) != kAttrFolder || unit::kind(record) != kUnitChain) return kOk;
        const uint32_t start = unit::start(record);
        if (start == 0 || start == kNoCluster || start == m_wanted) return kOk;
        return walk(m_archive, u"*", start, joinUnitPath(folderPath, unit::name(record)), *this, nullptr);
    }
    Result afterCluster(ChainBuffer& buffer) override {
        const SecureBytes& d = buffer.data;
        for (size_t off = 0; off + kUnitFixedSize <= d.size();) {
            const uint8_t* r = d.data() + off;
            if (!unit::valid(r, d.size() - off)) break;
            if (unit::kind(r) == kUnitChain && unit::start(r) == m_wanted) {
                found.data = d;
                found.cluster = buffer.cluster;
                unit.assign(r, r + unit::length(r));
                return kOwnerFound;
            }
            off += unit::length(r);
        }
        return kOk;
    }
    ChainBuffer found;
    SecureBytes unit;

private:
    Vaultora& m_archive;
    uint32_t m_wanted;
};

}  // namespace

Result findOwnerOfCluster(Vaultora& a, uint32_t cluster, ChainBuffer& buffer, SecureBytes& unitOut) {
    uint32_t wanted = cluster;
    for (size_t steps = 0; steps <= a.cot().size(); ++steps) {
        cActorBlock_FDUBSC actor(a, wanted);
        Result rc = walk(a, u"*", 0, u"", actor, nullptr);
        if (rc == kOwnerFound) {
            buffer = std::move(actor.found);
            unitOut = std::move(actor.unit);
            return kOk;
        }
        if (rc != kOk) return rc;
        const uint32_t previous = a.previousCluster(wanted);
        if (previous == kNoCluster || previous == wanted) break;
        wanted = previous;
    }
    return kSourceAttributes;
}

}  // namespace vaultora
