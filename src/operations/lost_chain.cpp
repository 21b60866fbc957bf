#include "operations/lost_chain.h"

#include <cstdio>

#include "archive/directory.h"
#include "platform/file.h"
#include "platform/messages.h"
#include "platform/paths.h"

namespace vaultora {

namespace {

// First cluster, in table order, whose `next` is a given cluster. Built once; an entry that a cut
// or a free has made wrong since is looked up again.
class Predecessors {
public:
    explicit Predecessors(const std::vector<CotEntry>& cot) : m_first(cot.size(), kNoCluster) {
        for (size_t i = 0; i < cot.size(); ++i) {
            const uint32_t n = cot[i].next;
            if (n != 0 && n < cot.size() && m_first[n] == kNoCluster) m_first[n] = static_cast<uint32_t>(i);
        }
    }
    uint32_t of(const std::vector<CotEntry>& cot, uint32_t c) {
        if (c >= m_first.size()) return kNoCluster;
        uint32_t p = m_first[c];
        if (p != kNoCluster && p < cot.size() && cot[p].next == c) return p;
        p = kNoCluster;
        for (size_t i = 0; i < cot.size(); ++i) {
            if (cot[i].next == c) {
                p = static_cast<uint32_t>(i);
                break;
            }
        }
        m_first[c] = p;
        return p;
    }

private:
    std::vector<uint32_t> m_first;
};

}  // namespace

Result HandleLostChains(Vaultora& archive, std::vector<uint32_t>& owner) {
    Interaction& ui = archive.ui();
    const size_t n = std::min(owner.size(), archive.cot().size());
    Predecessors predecessors(archive.cot());
    std::vector<uint32_t> stamp(n, 0);  // the round that last reached a cluster, to stop at loops
    uint32_t round = 0;
    bool freeAll = false;
    for (size_t i = 0; i < n; ++i) {
        const uint32_t c = static_cast<uint32_t>(i);
        if (owner[c] != kUnclaimed || !archive.cot()[c].used()) continue;
        ++round;

        // Cut the chain where it runs into an owned cluster, out of the table, into a free cluster
        // or back into itself.
        stamp[c] = round;
        for (uint32_t x = c;;) {
            const uint32_t next = archive.cot()[x].next;
            if (next == kEndOfChain) break;
            if (next >= n || !archive.cot()[next].used() || owner[next] != kUnclaimed || stamp[next] == round) {
                if (Result rc = archive.markModified(); rc != kOk) return rc;
                archive.mutableCot()[x].next = kEndOfChain;
                break;
            }
            stamp[next] = round;
            x = next;
        }

        // Its head: follow the first predecessor while it is unowned.
        uint32_t head = c;
        for (size_t steps = 0; steps < n; ++steps) {
            const uint32_t p = predecessors.of(archive.cot(), head);
            if (p == kNoCluster || p >= n || owner[p] != kUnclaimed || stamp[p] == round) break;
            stamp[p] = round;
            head = p;
        }
        const std::vector<uint32_t> chain = archive.chainClusters(head);

        int answer = kAnswerYes;
        if (!freeAll) {
            const std::u16string caption(msgText(Msg::kCaptionLostChain));
            answer = ui.askFiveWay(
                msgFormat(Msg::kLostChainQuestion, {head, static_cast<unsigned>(chain.size())}), caption);
        }
        switch (answer) {
            case kAnswerYesAll:
                freeAll = true;
                [[fallthrough]];
            case kAnswerYes:
                if (Result rc = archive.markModified(); rc != kOk) return rc;
                archive.freeChain(head);
                break;
            case kAnswerNo:
                if (Result rc = SaveChainToCrashFolder(archive, head); rc != kOk) return rc;
                // Kept in the archive: not asked about again in this run.
                for (uint32_t x : chain)
                    if (x < n) owner[x] = head;
                break;
            case kAnswerNoAll:
                return kOk;
            case kAnswerCancel:
                return kCancelled;
            default: {
                const std::u16string caption(msgText(Msg::kCheckingLostClusters));
                ui.message(msgText(Msg::kErrorStartingDialog), caption, mb::kOk | mb::kIconError);
                return kInconsistent;
            }
        }
    }
    return kOk;
}

Result SaveChainToCrashFolder(Vaultora& archive, uint32_t head, std::string* savedPath) {
    const std::string folder = paths::crashFolder();
    if (!fs::createDirectories(folder, 0700)) return kTempFolder;
    char name[32];
    std::snprintf(name, sizeof name, "/Cluster_0x%X", head);
    const std::string path = folder + name;
    File file;
    if (file.open(path, OpenMode::kCreateAlways) != 0) return kWriteFailed;
    uint64_t position = 0;
    for (uint32_t c : archive.chainClusters(head)) {
        ChainBuffer buffer;
        buffer.cluster = c;
        if (Result rc = archive.readCluster(buffer); rc != kOk) return rc;
        if (!file.writeAt(position, buffer.data.data(), buffer.data.size())) return kWriteFailed;
        position += buffer.data.size();
    }
    if (!file.sync()) return kWriteFailed;
    if (savedPath != nullptr) *savedPath = path;
    return kOk;
}

namespace {

// Sum of the payload lengths of a chain, from the records' descriptors where the format has them.
uint64_t chainPayloadLength(Vaultora& archive, uint32_t start) {
    uint64_t total = 0;
    std::vector<uint8_t> record;
    for (uint32_t c : archive.chainClusters(start)) {
        const CotEntry& e = archive.cot()[c];
        if (e.size == 0) continue;
        if (archive.header().isFormat2() && archive.readRecord(c, record) == kOk) {
            ClusterDescriptor d;
            if (readClusterDescriptor(record.data(), record.size(), archive.blockSize(), archive.recordCipher(), d) == kOk) {
                total += d.uncompressedLength;
                continue;
            }
        }
        ChainBuffer buffer;
        buffer.cluster = c;
        if (archive.readCluster(buffer) == kOk) total += buffer.data.size();
    }
    return total;
}

std::u16string lostName(uint32_t cluster, unsigned suffix) {
    char text[48];
    if (suffix == 0) std::snprintf(text, sizeof text, "LostCluster %08X", cluster);
    else std::snprintf(text, sizeof text, "LostCluster %08X_%u", cluster, suffix);
    std::u16string out;
    for (const char* p = text; *p != 0; ++p) out += static_cast<char16_t>(*p);
    return out;
}

}  // namespace

Result AddLostChain(Vaultora& archive, uint32_t cluster, bool asFile) {
    std::u16string name;
    for (unsigned suffix = 0;; ++suffix) {
        if (suffix > 0xFFFFFF) return kDirectoryUnusable;
        name = lostName(cluster, suffix);
        uint32_t c = 0;
        Result rc = findUnit(archive, name, c, nullptr);
        if (rc == kNotFound) break;
        if (rc != kOk) return kDirectoryUnusable;
    }
    SecureBytes record = makeRecordWithAttributes(name, 0, asFile ? 0 : kAttrFolder);
    unit::setStart(record.data(), cluster);
    if (asFile) unit::setSize(record.data(), chainPayloadLength(archive, cluster));
    ChainBuffer room;
    if (Result rc = findRoom(archive, 0, room, record, nullptr); rc != kOk) return rc;
    if (Result rc = addRecord(room, record, nullptr); rc != kOk) return rc;
    return archive.writeDirectoryCluster(room, true);
}

}  // namespace vaultora
