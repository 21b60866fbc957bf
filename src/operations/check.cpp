// The consistency check.
//
// The tree is walked depth first from the root folder's fixed record. Each unit's chain is
// followed through the table and every cluster on it is claimed in the owner map for the chain's
// start cluster. A cluster that is already claimed means two units share it (a crosslink), or the
// unit's chain runs into a free cluster (its body is gone). Folders are visited right after their
// own chain was claimed, so the order in which units are met is the order of a plain tree walk.
//
// Directory clusters are held in a small store for the time their folder is being visited: a
// unit deleted by the crosslink question may sit in the very cluster the walk is going through,
// and both must see the same bytes. A folder's clusters are written back (squeezed) when the
// folder is done; clusters read only by the crosslink search are written back right after it.
//
// Every walk over `next` links is bounded: the owner map stops a chain at the first cluster it
// meets twice, and the searches keep their own visited marks.
#include "operations/check.h"

#include <map>
#include <new>
#include <string>
#include <vector>

#include "archive/directory.h"
#include "archive/walk.h"
#include "operations/lost_chain.h"
#include "operations/recover.h"
#include "platform/messages.h"

namespace vaultora {

namespace {

// Deeper folder nesting than this is treated as damage (a directory that contains itself).
constexpr size_t kMaxDepth = 1024;

// Where a unit record lives: its directory cluster and its offset in the cluster's payload.
struct UnitRef {
    uint32_t cluster = kNoCluster;
    size_t offset = 0;
    bool operator==(const UnitRef&) const = default;
};

bool isFolderRecord(const uint8_t* r) { return (unit::attributes(r) & kAttrFolder) != 0; }

// Inline data, an empty file (start 0, size 0) and a unit without body (start 0xFFFFFFFF,
// size 0) own no cluster; cluster 0 belongs to the root directory.
bool ownsNothing(const uint8_t* r) {
    if (unit::kind(r) != kUnitChain) return true;
    const uint32_t start = unit::start(r);
    return (start == 0 || start == kNoCluster) && unit::size(r) == 0;
}

class DirectoryStore {
public:
    explicit DirectoryStore(Vaultora& a) : m_archive(a) {}

    // The decoded directory cluster c, read once; null when it is outside the table, free, or
    // cannot be read.
    ChainBuffer* get(uint32_t c) {
        auto it = m_buffers.find(c);
        if (it != m_buffers.end()) return &it->second;
        const auto& cot = m_archive.cot();
        if (c >= cot.size() || !cot[c].used()) return nullptr;
        ChainBuffer b;
        b.cluster = c;
        if (m_archive.readCluster(b) != kOk) return nullptr;
        return &m_buffers.emplace(c, std::move(b)).first->second;
    }

    // The record at ref when its cluster is held and a valid record starts there.
    uint8_t* record(const UnitRef& ref) {
        auto it = m_buffers.find(ref.cluster);
        if (it == m_buffers.end()) return nullptr;
        SecureBytes& d = it->second.data;
        if (ref.offset + kUnitFixedSize > d.size() || !unit::valid(d.data() + ref.offset, d.size() - ref.offset))
            return nullptr;
        return d.data() + ref.offset;
    }

    void touch(uint32_t c) {
        auto it = m_buffers.find(c);
        if (it != m_buffers.end()) it->second.dirty = true;
    }

    // Writes a changed cluster back without its deleted records, and forgets it.
    Result release(uint32_t c) {
        auto it = m_buffers.find(c);
        if (it == m_buffers.end()) return kOk;
        Result rc = kOk;
        if (it->second.dirty) {
            squeeze(it->second);
            it->second.dirty = true;
            rc = m_archive.writeDirectoryCluster(it->second, true);
        }
        m_buffers.erase(it);
        return rc;
    }

    // Releases every held cluster that is not marked in `keep`.
    Result releaseAllBut(const std::vector<uint8_t>& keep) {
        std::vector<uint32_t> held;
        for (const auto& [c, b] : m_buffers)
            if (c >= keep.size() || keep[c] == 0) held.push_back(c);
        Result rc = kOk;
        for (uint32_t c : held) {
            Result r = release(c);
            if (rc == kOk) rc = r;
        }
        return rc;
    }

private:
    Vaultora& m_archive;
    std::map<uint32_t, ChainBuffer> m_buffers;
};

class Checker {
public:
    explicit Checker(Vaultora& a) : m_archive(a), m_store(a) {}

    Result run() {
        const size_t size = m_archive.cot().size();
        if (size == 0) return kInconsistent;
        try {
            m_owner.assign(size, kUnclaimed);
            m_active.assign(size, 0);
        } catch (const std::bad_alloc&) {
            return kNoMemory;
        }
        std::vector<uint32_t> rootChain;
        Result rc = claimRoot(rootChain);
        if (rc == kOk) rc = visitFolder(rootChain, u"");
        Result flushed = m_store.releaseAllBut({});
        if (rc == kOk) rc = flushed;
        if (rc == kOk) rc = HandleLostChains(m_archive, m_owner);
        return rc;
    }

private:
    Interaction& ui() { return m_archive.ui(); }
    uint32_t tableSize() const { return static_cast<uint32_t>(m_owner.size()); }
    bool allocated(uint32_t c) const { return c < m_archive.cot().size() && m_archive.cot()[c].used(); }

    int ask(Msg text, std::initializer_list<FormatArg> args, uint32_t style) {
        const std::u16string caption(msgText(Msg::kCaptionCheckArchive));
        return ui().message(msgFormat(text, args), caption, style);
    }

    Result cutAfter(uint32_t c) {
        if (Result rc = m_archive.markModified(); rc != kOk) return rc;
        m_archive.mutableCot()[c].next = kEndOfChain;
        return kOk;
    }

    // The root folder's chain starts at cluster 0 and is claimed before anything else.
    Result claimRoot(std::vector<uint32_t>& chain) {
        if (!allocated(0)) return m_archive.errorNote(kInconsistent, "HXZipWrite", __LINE__);
        uint32_t cur = 0;
        for (;;) {
            m_owner[cur] = 0;
            chain.push_back(cur);
            const uint32_t next = m_archive.nextCluster(cur);
            if (next == kEndOfChain) return kOk;
            if (next >= tableSize()) {
                int answer = ask(Msg::kNextBeyondTable, {u"", u"", next, tableSize(), cur}, mb::kOkCancel | mb::kIconWarning);
                if (answer != kAnswerOk) return kCancelled;
                return cutAfter(cur);
            }
            if (!allocated(next) || m_owner[next] != kUnclaimed) {
                // The root's chain runs into a free cluster or into itself: it ends here.
                m_archive.errorNote(kInconsistent, "HXZipWrite", __LINE__);
                return cutAfter(cur);
            }
            cur = next;
        }
    }

    Result visitFolder(const std::vector<uint32_t>& chain, const std::u16string& folderPath) {
        if (m_depth >= kMaxDepth) return m_archive.errorNote(kInconsistent, "HXZipWrite", __LINE__);
        ++m_depth;
        for (uint32_t c : chain) m_active[c] = 1;
        Result rc = kOk;
        for (uint32_t c : chain) {
            if (m_store.get(c) == nullptr) {
                rc = kDirReadFailed;
                break;
            }
            for (size_t off = 0; rc == kOk;) {
                ChainBuffer* b = m_store.get(c);
                if (off + kUnitFixedSize > b->data.size()) break;
                const uint8_t* r = b->data.data() + off;
                if (!unit::valid(r, b->data.size() - off)) {
                    rc = m_archive.errorNote(kInconsistent, "HXZipWrite", __LINE__);
                    break;
                }
                const uint32_t length = unit::length(r);
                if (unit::kind(r) != kUnitVolume && unit::kind(r) != kUnitDeleted) rc = visitUnit({c, off}, folderPath);
                off += length;
            }
            if (rc != kOk) break;
        }
        for (uint32_t c : chain) m_active[c] = 0;
        for (uint32_t c : chain) {
            Result w = m_store.release(c);
            if (rc == kOk) rc = w;
        }
        --m_depth;
        return rc;
    }

    void release(const std::vector<uint32_t>& claimed, uint32_t start) {
        for (uint32_t c : claimed)
            if (c < m_owner.size() && m_owner[c] == start) m_owner[c] = kUnclaimed;
    }

    void deleteUnit(const UnitRef& ref) {
        if (uint8_t* r = m_store.record(ref)) {
            markDeleted(r);
            m_store.touch(ref.cluster);
        }
    }

    Result bodyMissing(const UnitRef& ref, const std::u16string& folderPath, const std::vector<uint32_t>& claimed,
                       uint32_t start) {
        // What the unit claimed so far is no longer its own: a lost chain the user is asked about.
        release(claimed, start);
        uint8_t* r = m_store.record(ref);
        if (r == nullptr) return kInconsistent;
        Result rc = AskBodyMissing(m_archive, r, folderPath);
        if (rc == kOk) m_store.touch(ref.cluster);
        return rc;
    }

    // The per-unit step: claim the unit's chain, then visit the folder it is.
    Result visitUnit(const UnitRef& ref, const std::u16string& folderPath) {
        uint8_t* r = m_store.record(ref);
        if (r == nullptr) return kInconsistent;
        if (ownsNothing(r)) return kOk;
        const std::u16string name = unit::name(r);
        const uint32_t start = unit::start(r);
        const uint32_t size = tableSize();
        if (start >= size) {
            int answer = ask(Msg::kStartBeyondTable, {folderPath, name, start, size}, mb::kOkCancel | mb::kIconWarning);
            if (answer != kAnswerOk) return kCancelled;
            deleteUnit(ref);
            return kOk;
        }
        if (start == 0) return bodyMissing(ref, folderPath, {}, start);  // cluster 0 is the root's

        std::vector<uint32_t> claimed;
        uint32_t cur = start;
        for (size_t steps = 0;; ++steps) {
            if (steps > 2 * static_cast<size_t>(size) + 2) return m_archive.errorNote(kInconsistent, "HXZipWrite", __LINE__);
            if (!allocated(cur)) return bodyMissing(ref, folderPath, claimed, start);
            if (m_owner[cur] != kUnclaimed) {
                const uint32_t first = m_owner[cur];
                if (first == 0) return bodyMissing(ref, folderPath, claimed, start);
                bool deleted = false;
                if (Result rc = resolveCrosslink(ref, folderPath, first, claimed, deleted); rc != kOk) return rc;
                if (deleted) return kOk;
            }
            m_owner[cur] = start;
            claimed.push_back(cur);
            const uint32_t next = m_archive.nextCluster(cur);
            if (next == kEndOfChain) break;
            if (next >= size) {
                int answer = ask(Msg::kNextBeyondTable, {folderPath, name, next, size, cur}, mb::kOkCancel | mb::kIconWarning);
                if (answer != kAnswerOk) return kCancelled;
                if (Result rc = cutAfter(cur); rc != kOk) return rc;
                break;
            }
            cur = next;
        }

        r = m_store.record(ref);
        if (r == nullptr || unit::kind(r) != kUnitChain || !isFolderRecord(r)) return kOk;
        // A folder whose directory is one being visited already (it lies inside itself) is not
        // entered again.
        for (uint32_t c : claimed)
            if (m_active[c] != 0) return kOk;
        for (uint32_t c : claimed) {
            if (m_store.get(c) == nullptr) return bodyMissing(ref, folderPath, claimed, start);
        }
        return visitFolder(claimed, folderPath + u'\\' + name);
    }

    // The current unit met a cluster claimed by the chain that starts at `first`.
    Result resolveCrosslink(const UnitRef& ref, const std::u16string& folderPath, uint32_t first,
                            const std::vector<uint32_t>& claimed, bool& deleted) {
        UnitRef found;
        std::u16string foundPath;
        Result rc = findFirstWithStart(first, found, foundPath);
        if (rc != kOk) {
            (void)m_store.releaseAllBut(m_active);
            return rc;
        }
        const uint8_t* fr = m_store.record(found);
        const uint8_t* cr = m_store.record(ref);
        if (fr == nullptr || cr == nullptr) return kInconsistent;
        const std::u16string foundName = unit::name(fr);
        const std::u16string currentName = unit::name(cr);
        const bool self = found == ref;
        int answer = ask(Msg::kCheckCrosslinkQuestion, {foundPath, foundName, folderPath, currentName},
                         mb::kYesNoCancel | mb::kIconQuestion);
        if (answer == kAnswerYes && !self) {
            for (uint32_t& o : m_owner)
                if (o == first) o = kUnclaimed;
            deleteUnit(found);
        } else if (answer == kAnswerYes || answer == kAnswerNo) {
            // A chain that runs into itself names the same unit twice: either answer removes it.
            release(claimed, unit::start(cr));
            deleteUnit(ref);
            deleted = true;
        } else if (answer == kAnswerCancel) {
            rc = kCancelled;
        } else {
            rc = kUnexpectedAnswer;
        }
        // Clusters read only for the search go back now (with the found unit deleted in them).
        Result w = m_store.releaseAllBut(m_active);
        return rc != kOk ? rc : w;
    }

    // The first unit, in walk order, whose chain starts at `first` and that is not empty.
    Result findFirstWithStart(uint32_t first, UnitRef& found, std::u16string& foundPath) {
        std::vector<uint8_t> seen(tableSize(), 0);
        return searchFolder(0, u"", first, seen, 0, found, foundPath);
    }

    Result searchFolder(uint32_t chainStart, const std::u16string& folderPath, uint32_t first, std::vector<uint8_t>& seen,
                        size_t depth, UnitRef& found, std::u16string& foundPath) {
        if (depth >= kMaxDepth) return kNotFound;
        for (uint32_t c = chainStart; c != kEndOfChain; c = m_archive.nextCluster(c)) {
            if (c >= seen.size() || seen[c] != 0) break;
            seen[c] = 1;
            if (m_store.get(c) == nullptr) break;
            for (size_t off = 0;;) {
                ChainBuffer* b = m_store.get(c);
                if (off + kUnitFixedSize > b->data.size()) break;
                const uint8_t* r = b->data.data() + off;
                if (!unit::valid(r, b->data.size() - off)) break;
                const uint32_t length = unit::length(r);
                const uint8_t kind = unit::kind(r);
                if (kind == kUnitChain) {
                    const uint32_t start = unit::start(r);
                    const bool empty = start == 0 && unit::size(r) == 0;
                    if (start == first && !empty) {
                        found = {c, off};
                        foundPath = folderPath;
                        return kOk;
                    }
                    if (isFolderRecord(r) && !empty && start < seen.size() && seen[start] == 0) {
                        const std::u16string name = unit::name(r);
                        Result rc = searchFolder(start, folderPath + u'\\' + name, first, seen, depth + 1, found, foundPath);
                        if (rc != kNotFound) return rc;
                    }
                }
                off += length;
            }
        }
        return kNotFound;
    }

    Vaultora& m_archive;
    DirectoryStore m_store;
    std::vector<uint32_t> m_owner;
    std::vector<uint8_t> m_active;  // directory clusters of the folders being visited
    size_t m_depth = 0;
};

}  // namespace

Result AskBodyMissing(Vaultora& archive, uint8_t* record, std::u16string_view folderPath) {
    const std::u16string word(msgText(isFolderRecord(record) ? Msg::kWordFolder : Msg::kWordFile));
    std::u16string path(folderPath);
    if (path.empty() || path.back() != u'\\') path += u'\\';
    path += unit::name(record);
    const std::u16string caption(msgText(Msg::kCaptionVaultora));
    int answer = archive.ui().message(
        msgFormat(Msg::kBodyMissing, {word, path, static_cast<int>(unit::start(record)), sizeText(unit::size(record))}),
        caption, mb::kYesNoCancel | mb::kIconQuestion);
    switch (answer) {
        case kAnswerYes: markDeleted(record); return kOk;
        case kAnswerNo: unit::setStart(record, kNoCluster); return kOk;
        case kAnswerCancel: return kCancelled;
        default: return kUnexpectedAnswer;
    }
}

Result CheckArchive(Vaultora& archive) {
    if (!archive.isOpen()) return kCannotOpen;
    archive.ui().progressStatus(msgText(Msg::kCheckingLostClusters));
    Result rc = Checker(archive).run();
    // Whatever was repaired (also before a cancel) goes into the table copy.
    if (archive.isModified()) {
        Result saved = archive.saveClusterTable();
        if (rc == kOk) rc = saved;
    }
    return rc;
}

Result OfferRecovery(Vaultora& archive, Result loadResult) {
    const std::u16string caption(msgText(Msg::kCaptionVaultora));
    int answer = archive.ui().message(msgFormat(Msg::kRecoverQuestion, {archive.path()}), caption,
                                      mb::kYesNoCancel | mb::kIconQuestion);
    if (answer == kAnswerCancel) return kCancelled;
    // Declined: the archive stays unopened, so the load failure is what the open reports.
    if (answer != kAnswerYes) return loadResult != kOk ? loadResult : kBadRecord;
    Result rc = Recover(archive);
    archive.ui().progressPercent(-1);
    if (rc != kOk && rc != kCancelled) {
        const std::u16string errorCaption(msgText(Msg::kCaptionError));
        archive.ui().message(msgFormat(Msg::kRecoverError, {static_cast<unsigned>(rc), archive.path()}), errorCaption,
                             mb::kOk | mb::kIconError);
    }
    return rc;
}

}  // namespace vaultora
