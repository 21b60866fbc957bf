#include "operations/recover.h"

#include <algorithm>
#include <cstdio>
#include <new>
#include <string>
#include <vector>

#include "archive/directory.h"
#include "operations/check.h"
#include "operations/lost_chain.h"
#include "platform/messages.h"
#include "platform/text.h"

namespace vaultora {

namespace {

// Cluster flags of the rebuild.
constexpr uint8_t kFlagDirectory = 0x01;  // the chain starting here reads as a directory
constexpr uint8_t kFlagSuccessor = 0x02;  // another cluster's `next` points here
constexpr uint8_t kFlagCrosslink = 0x04;  // more than one cluster points here
constexpr uint8_t kFlagNamed = 0x08;      // a unit record names this cluster as its start
constexpr uint8_t kFlagVisiting = 0x10;   // on the path of the current link check

constexpr size_t kMaxDepth = 1024;

// Reads every window of the data area and enters each record that decodes into the table.
Result scanRecords(Vaultora& a) {
    Interaction& ui = a.ui();
    std::vector<CotEntry>& cot = a.mutableCot();
    for (CotEntry& e : cot) e = CotEntry{};
    ui.progressTitle(msgFormat(Msg::kRecoverTitle, {a.path()}));
    ui.progressPercent(0);

    const uint32_t blockSize = a.blockSize();
    const int64_t fileSize = a.file().size();
    if (blockSize == 0 || fileSize < 0) return kInconsistent;
    const uint64_t dataStart = a.dataStart();
    const uint64_t dataLength = static_cast<uint64_t>(fileSize) > dataStart ? static_cast<uint64_t>(fileSize) - dataStart : 0;
    // Cluster numbers are handed out from the lowest free one, so a real archive never numbers a
    // cluster far beyond what its data can hold; a larger number is a false match, and believing
    // it would make the table as large as the number.
    const uint64_t plausible = std::min<uint64_t>(dataLength / 4 + 65536, 0xFFFFFFF0ull);

    std::vector<uint8_t> window;
    SecureBytes payload;
    uint32_t count = 0, highest = 0;
    int lastPercent = 0;
    for (uint64_t windowStart = 0; windowStart < dataLength; windowStart += kSpaceUnit) {
        if (a.cancelled()) return kCancelled;
        const size_t length = static_cast<size_t>(std::min<uint64_t>(kSpaceUnit, dataLength - windowStart));
        try {
            window.resize(length);
        } catch (const std::bad_alloc&) {
            return kNoMemory;
        }
        if (!a.file().readExact(dataStart + windowStart, window.data(), length)) return kReadFailed;
        for (size_t pos = 0; pos + blockSize <= length;) {
            ClusterDescriptor d;
            const uint8_t* at = window.data() + pos;
            bool found = readClusterDescriptor(at, length - pos, blockSize, a.recordCipher(), d) == kOk &&
                         d.cluster < plausible &&
                         decodeClusterRecord(true, at, d.recordLength, d.cluster, d.recordLength, blockSize,
                                             a.recordCipher(), payload) == kOk;
            if (!found) {
                pos += blockSize;
                continue;
            }
            try {
                if (d.cluster >= cot.size()) growTable(cot, d.cluster);
            } catch (const std::bad_alloc&) {
                return kNoMemory;
            }
            // A record is always written for an allocated cluster; a `next` of 0 cannot be true.
            cot[d.cluster] = CotEntry{d.next == 0 ? kEndOfChain : d.next, windowStart + pos, d.recordLength};
            ++count;
            highest = std::max(highest, d.cluster);
            pos += d.recordLength;
            const int percent = static_cast<int>((windowStart + pos) * 100 / dataLength);
            if (percent != lastPercent) {
                lastPercent = percent;
                ui.progressPercent(percent);
            }
            ui.progressStatus(msgFormat(Msg::kClustersRecovered, {count, highest}));
        }
    }
    payload.clear();
    a.setDataEnd(a.computeDataEnd());
    return kOk;
}

// A new empty root directory at cluster 0: only the volume record.
Result writeNewRoot(Vaultora& a) {
    std::vector<CotEntry>& cot = a.mutableCot();
    if (cot.empty()) growTable(cot, 0);
    cot[0] = CotEntry{kEndOfChain, 0, 0};
    ChainBuffer root;
    root.cluster = 0;
    const std::vector<uint8_t> volume = unit::volumeRecord();
    root.data.assign(volume.begin(), volume.end());
    root.dirty = true;
    return a.writeDirectoryCluster(root, true) == kOk ? kOk : kBadRecord;
}

// A directory payload is unit records back to back that add up to exactly its length.
bool directoryPayload(const SecureBytes& d) {
    size_t off = 0;
    while (off < d.size()) {
        if (off + kUnitFixedSize > d.size()) return false;
        const uint8_t* r = d.data() + off;
        if (!unit::valid(r, d.size() - off) || unit::kind(r) > kUnitDeleted) return false;
        const uint32_t length = unit::length(r);
        if (unit::kind(r) == kUnitInline && (unit::start(r) < kUnitFixedSize || unit::start(r) > length)) return false;
        off += length;
    }
    return true;
}

class Rebuild {
public:
    explicit Rebuild(Vaultora& a) : m_archive(a) {}

    Result run() {
        if (m_archive.cot().empty() || !allocated(0)) {
            if (Result rc = writeNewRoot(m_archive); rc != kOk) return rc;
        }
        const size_t n = m_archive.cot().size();
        try {
            m_flags.assign(n, 0);
            m_visited.assign(n, 0);
        } catch (const std::bad_alloc&) {
            return kNoMemory;
        }
        checkLinks();
        for (size_t i = 0; i < n; ++i) {
            const uint32_t c = static_cast<uint32_t>(i);
            if (allocated(c) && (m_flags[c] & (kFlagSuccessor | kFlagCrosslink)) == 0 && readsAsDirectory(c))
                m_flags[c] |= kFlagDirectory;
        }
        if ((m_flags[0] & kFlagDirectory) == 0) {
            // The root directory is destroyed. What followed it in its chain is kept as a chain of
            // its own; the new root takes cluster 0.
            const uint32_t rest = m_archive.nextCluster(0);
            if (rest != kEndOfChain && rest < n && allocated(rest) && (m_flags[rest] & kFlagCrosslink) == 0) {
                m_flags[rest] &= static_cast<uint8_t>(~kFlagSuccessor);
                if (readsAsDirectory(rest)) m_flags[rest] |= kFlagDirectory;
            }
            if (Result rc = writeNewRoot(m_archive); rc != kOk) return rc;
        }
        m_flags[0] |= kFlagDirectory | kFlagNamed;

        const bool previousBatch = m_archive.setBatch(true);
        Result rc = attach(n);
        Result flushed = m_archive.flushDirectoryCache();
        m_archive.setBatch(previousBatch);
        return rc != kOk ? rc : flushed;
    }

private:
    bool allocated(uint32_t c) const { return c < m_archive.cot().size() && m_archive.cot()[c].used(); }

    // Cuts every chain at a loop or at a successor that does not exist, and marks successors
    // (0x02) and the clusters that several chains run into (0x04).
    void checkLinks() {
        const size_t n = m_flags.size();
        std::vector<CotEntry>& cot = m_archive.mutableCot();
        std::vector<uint32_t> path;
        for (size_t i = 0; i < n; ++i) {
            const uint32_t c = static_cast<uint32_t>(i);
            if (!allocated(c) || cot[c].next == kEndOfChain || (m_flags[c] & (kFlagSuccessor | kFlagCrosslink)) != 0)
                continue;
            path.clear();
            path.push_back(c);
            m_flags[c] |= kFlagVisiting;
            for (uint32_t x = c;;) {
                const uint32_t next = cot[x].next;
                if (next == kEndOfChain) break;
                if (next >= n || !allocated(next) || (m_flags[next] & kFlagVisiting) != 0) {
                    cot[x].next = kEndOfChain;
                    break;
                }
                path.push_back(next);
                // A chain already checked goes on to its end without loops: stop at it.
                if ((m_flags[next] & (kFlagSuccessor | kFlagCrosslink)) != 0) break;
                m_flags[next] |= kFlagVisiting;
                x = next;
            }
            bool merged = false;
            for (size_t k = 0; k < path.size(); ++k) {
                const uint32_t x = path[k];
                m_flags[x] &= static_cast<uint8_t>(~kFlagVisiting);
                if (k == 0 || merged) continue;
                if ((m_flags[x] & (kFlagSuccessor | kFlagCrosslink)) != 0) {
                    m_flags[x] |= kFlagCrosslink;
                    merged = true;
                } else {
                    m_flags[x] |= kFlagSuccessor;
                }
            }
        }
    }

    bool readsAsDirectory(uint32_t head) {
        size_t steps = 0;
        for (uint32_t c = head; c != kEndOfChain; c = m_archive.nextCluster(c)) {
            if (!allocated(c) || ++steps > m_flags.size()) return false;
            ChainBuffer b;
            b.cluster = c;
            if (m_archive.readCluster(b) != kOk || !directoryPayload(b.data)) return false;
        }
        return true;
    }

    Result attach(size_t n) {
        // The tree from the root first, so that questions name real paths; then the directories
        // that nothing reaches any more.
        if (Result rc = visitDirectory(0, u"", 0); rc != kOk) return rc;
        for (size_t i = 1; i < n; ++i) {
            const uint32_t c = static_cast<uint32_t>(i);
            if ((m_flags[c] & kFlagDirectory) == 0 || m_visited[c] != 0) continue;
            char text[32];
            std::snprintf(text, sizeof text, "\\LostCluster %08X", c);
            if (Result rc = visitDirectory(c, fromUtf8(text), 0); rc != kOk) return rc;
        }
        for (size_t i = 1; i < n; ++i) {
            const uint32_t c = static_cast<uint32_t>(i);
            if (!allocated(c) || (m_flags[c] & (kFlagSuccessor | kFlagCrosslink | kFlagNamed)) != 0) continue;
            if (Result rc = AddLostChain(m_archive, c, (m_flags[c] & kFlagDirectory) == 0); rc != kOk) return rc;
            m_flags[c] |= kFlagNamed;
        }
        return kOk;
    }

    // Marks every cluster the directory's units name, asks about units whose body is gone, and
    // enters the folders below it.
    Result visitDirectory(uint32_t head, const std::u16string& folderPath, size_t depth) {
        const size_t n = m_flags.size();
        for (uint32_t c = head; c != kEndOfChain && c < n; c = m_archive.nextCluster(c)) {
            if (m_visited[c] != 0 || !allocated(c)) break;
            m_visited[c] = 1;
            ChainBuffer b;
            b.cluster = c;
            if (m_archive.readCluster(b) != kOk) break;
            bool changed = false;
            for (size_t off = 0; off + kUnitFixedSize <= b.data.size();) {
                uint8_t* r = b.data.data() + off;
                if (!unit::valid(r, b.data.size() - off)) break;
                off += unit::length(r);
                if (unit::kind(r) != kUnitChain) continue;
                const uint32_t start = unit::start(r);
                if ((start == 0 || start == kNoCluster) && unit::size(r) == 0) continue;  // owns nothing
                if ((unit::attributes(r) & kAttrFolder) != 0 && start != 0 && !allocated(start) &&
                    start < m_flags.size() + 65536) {
                    // An empty folder's directory cluster holds no record, so the scan cannot find
                    // it: the folder gets its empty directory back.
                    if (Result rc = restoreEmptyDirectory(start); rc != kOk) return rc;
                    continue;
                }
                if (start == 0 || !allocated(start)) {
                    if (Result rc = AskBodyMissing(m_archive, r, folderPath); rc != kOk) return rc;
                    changed = true;
                    continue;
                }
                if (start < n) m_flags[start] |= kFlagNamed;
                if ((unit::attributes(r) & kAttrFolder) != 0 && start < n && (m_flags[start] & kFlagDirectory) != 0 &&
                    m_visited[start] == 0 && depth + 1 < kMaxDepth) {
                    const std::u16string path = folderPath + u'\\' + unit::name(r);
                    if (Result rc = visitDirectory(start, path, depth + 1); rc != kOk) return rc;
                }
            }
            if (changed) {
                squeeze(b);
                b.dirty = true;
                if (Result rc = m_archive.writeDirectoryCluster(b, true); rc != kOk) return rc;
            }
        }
        return kOk;
    }

    Result restoreEmptyDirectory(uint32_t c) {
        std::vector<CotEntry>& cot = m_archive.mutableCot();
        try {
            if (c >= cot.size()) growTable(cot, c);
            if (c >= m_flags.size()) {
                m_flags.resize(c + 1, 0);
                m_visited.resize(c + 1, 0);
            }
        } catch (const std::bad_alloc&) {
            return kNoMemory;
        }
        cot[c] = CotEntry{kEndOfChain, 0, 0};
        m_flags[c] |= kFlagDirectory | kFlagNamed;
        m_visited[c] = 1;
        return kOk;
    }

    Vaultora& m_archive;
    std::vector<uint8_t> m_flags;
    std::vector<uint8_t> m_visited;  // directory clusters already visited
};

}  // namespace

Result Recover(Vaultora& archive) {
    if (archive.header().versionMajor < 2) return kNewerFormat;  // 1.x records do not describe themselves
    if (!archive.isOpen()) return kCannotOpen;
    if (scanRecords(archive) != kOk) return kBadRecord;
    if (Result rc = Rebuild(archive).run(); rc != kOk) return rc;
    if (Result rc = archive.markModified(); rc != kOk) return rc;
    return archive.saveClusterTable();
}

}  // namespace vaultora
