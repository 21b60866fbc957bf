#include "operations/compact.h"

#include <algorithm>
#include <map>
#include <vector>

#include "archive/directory.h"
#include "operations/check.h"
#include "platform/messages.h"
#include "platform/text.h"

namespace vaultora {

namespace {

struct StoredRecord {
    uint32_t cluster;
    uint64_t offset;
    uint32_t size;
};

// The records of one 32 MiB space unit, in position order, and how far the unit is filled from
// its start once packed.
struct SpaceUnit {
    uint64_t start = 0;
    std::vector<StoredRecord> records;
};

uint64_t unitStart(uint64_t position) { return position / kSpaceUnit * kSpaceUnit; }

std::u16string unitNameOf(Vaultora& a, uint32_t cluster) {
    ChainBuffer buffer;
    SecureBytes unitRecord;
    if (findOwnerOfCluster(a, cluster, buffer, unitRecord) != kOk || unitRecord.size() < kUnitFixedSize) return {};
    return unit::name(unitRecord.data());
}

// Deletes the unit whose chain holds `cluster`: its record is marked deleted in its directory,
// the directory squeezed and written, and its chain freed.
Result deleteOwnerOf(Vaultora& a, uint32_t cluster) {
    ChainBuffer buffer;
    SecureBytes unitRecord;
    if (Result rc = findOwnerOfCluster(a, cluster, buffer, unitRecord); rc != kOk) return rc;
    const std::u16string name = unit::name(unitRecord.data());
    const size_t at = findInBuffer(buffer, name);
    if (at == std::string::npos) return kInconsistent;
    const uint32_t start = unit::start(buffer.data.data() + at);
    markDeleted(buffer.data.data() + at);
    squeeze(buffer);
    buffer.dirty = true;
    if (Result rc = a.writeDirectoryCluster(buffer, true); rc != kOk) return rc;
    if (unit::kind(unitRecord.data()) == kUnitChain) a.freeChain(start);
    return kOk;
}

// Collects the records stored in the archive, sorted by position. Two records that share bytes
// are a crosslink on disk: one of the two units owning them is deleted, as the user chooses.
Result buildUsedSpaceList(Vaultora& a, std::vector<StoredRecord>& out) {
    a.ui().progressStatus(msgText(Msg::kCreatingUsedSpaceList));
    for (;;) {
        out.clear();
        const auto& cot = a.cot();
        int lastPercent = -1;
        for (size_t c = 0; c < cot.size(); ++c) {
            const int percent = static_cast<int>(c * 100 / cot.size());
            if (percent != lastPercent) a.ui().progressPercent(lastPercent = percent);
            if (cot[c].used() && !cot[c].inClusterFile() && cot[c].size != 0)
                out.push_back({static_cast<uint32_t>(c), cot[c].offset, cot[c].size});
        }
        std::sort(out.begin(), out.end(), [](const StoredRecord& x, const StoredRecord& y) {
            return x.offset != y.offset ? x.offset < y.offset : x.cluster < y.cluster;
        });
        size_t overlap = out.size();
        for (size_t i = 1; i < out.size() && overlap == out.size(); ++i)
            if (out[i].offset < out[i - 1].offset + out[i - 1].size) overlap = i;
        if (overlap == out.size()) return kOk;

        const uint32_t c1 = out[overlap].cluster;
        const uint32_t c2 = out[overlap - 1].cluster;
        const std::u16string name1 = unitNameOf(a, c1);
        const std::u16string name2 = unitNameOf(a, c2);
        const std::u16string caption(msgText(Msg::kCaptionCompacting));
        if (name1.empty() || name2.empty()) {
            a.ui().message(msgText(Msg::kCrosslinkNoUnit), caption, mb::kOk | mb::kIconError);
            // Leave the cluster without an owner out: its bytes are not moved, nothing names it.
            a.mutableCot()[name1.empty() ? c1 : c2].size = 0;
            continue;
        }
        const int answer = a.ui().message(msgFormat(Msg::kCrosslinkQuestion, {name1, name2}), caption,
                                          mb::kYesNoCancel | mb::kIconQuestion);
        if (answer == kAnswerCancel) return kCancelled;
        if (deleteOwnerOf(a, answer == kAnswerYes ? c1 : c2) != kOk) {
            a.ui().message(msgText(Msg::kCrosslinksDetected), caption, mb::kOk | mb::kIconError);
            return kInconsistent;
        }
    }
}

}  // namespace

Result MoveClusterRecord(Vaultora& a, uint32_t cluster, uint64_t& destination) {
    auto& cot = a.mutableCot();
    if (cluster >= cot.size()) return kInconsistent;
    const uint64_t from = cot[cluster].offset;
    const uint32_t n = cot[cluster].size;
    if (from == destination) {
        destination += n;
        return kOk;
    }
    std::vector<uint8_t> record(n);
    if (!a.file().readExact(a.dataStart() + from, record.data(), n)) return kReadFailed;
    const bool overlaps = destination < from + n && from < destination + n;
    cot[cluster].offset = destination;
    if (overlaps) {
        // The record is about to be written over its own old bytes: keep a copy that the next
        // open appends to the archive if this move is cut short, and a table that says so.
        if (a.writeClusterCopy(cluster, record) != kOk) return kClusterCopyWriteFailed;
        if (a.saveClusterTable() != kOk) return kCotSaveFailed;
        std::vector<uint8_t> back;
        if (!fs::readWholeFile(a.crashPath("~Cluster.dat"), back) || back.size() != 8ull + n ||
            getU32(back.data()) != cluster)
            return kClusterCopyUnreadable;
    }
    if (!a.file().writeAt(a.dataStart() + destination, record.data(), n)) return kWriteFailed;
    if (!a.file().sync()) return kFlushFailed;
    if (overlaps) {
        a.deleteClusterCopy();
    } else if (a.saveClusterTable() != kOk) {
        return kCotSaveFailed;
    }
    destination += n;
    return kOk;
}

Result Compact(Vaultora& a, bool force) {
    if (!force && !a.compactWhenUpdated()) return kOk;
    if (!a.isOpen() || a.isReadOnly()) return kCannotOpen;
    a.ui().progressTitle(msgText(Msg::kCompactingArchive));
    a.ui().progressPercent(-1);
    if (a.isBatch()) a.setBatch(false);
    if (Result rc = a.flushDirectoryCache(); rc != kOk) return rc;
    if (Result rc = CheckArchive(a); rc != kOk) return rc;
    // What the check changed goes out now, so the chains it freed are free for the moves.
    if (Result rc = a.flushDirectoryCache(); rc != kOk) return rc;

    std::vector<StoredRecord> records;
    if (Result rc = buildUsedSpaceList(a, records); rc != kOk) return rc;
    // From here on the saved table copy must match the table in memory: a gap that a record is
    // moved into is free in both.
    if (Result rc = a.markModified(); rc != kOk) return rc;
    if (Result rc = a.saveClusterTable(); rc != kOk) return rc;

    // Group the records by space unit.
    std::map<uint64_t, SpaceUnit> units;
    for (const StoredRecord& r : records) {
        SpaceUnit& u = units[unitStart(r.offset)];
        u.start = unitStart(r.offset);
        u.records.push_back(r);
    }
    // Close the gaps inside every space unit: its records back to back from the unit's start.
    std::map<uint64_t, uint64_t> fill;  // unit start -> end of its packed records
    int unitNumber = 0;
    for (auto& [start, u] : units) {
        a.ui().progressStatus(msgFormat(Msg::kCompactingSpaceUnit, {unitNumber++}));
        a.ui().progressPercent(0);
        uint64_t dest = start;
        for (StoredRecord& r : u.records) {
            if (a.cancelled()) return kCancelled;
            if (Result rc = MoveClusterRecord(a, r.cluster, dest); rc != kOk) return rc;
            r.offset = dest - r.size;
            a.ui().progressPercent(static_cast<int>((dest - start) * 100 / kSpaceUnit));
        }
        fill[start] = dest;
    }
    // Empty the space units from the end of the data area into the first gaps that take their
    // records, last record first. Every unit before the last one counts, empty ones too.
    if (!units.empty()) {
        const uint64_t lastStart = units.rbegin()->first;
        for (uint64_t s = 0; s < lastStart; s += kSpaceUnit) fill.emplace(s, s);
    }
    int round = 0;
    bool finished = units.size() < 2;
    while (!finished) {
        a.ui().progressStatus(msgFormat(Msg::kCompactingLastSpaceUnit, {round++}));
        auto last = std::prev(units.end());
        SpaceUnit& lu = last->second;
        while (!lu.records.empty()) {
            if (a.cancelled()) return kCancelled;
            const StoredRecord r = lu.records.back();
            uint64_t target = kCotNotStored;
            for (auto& [start, end] : fill) {
                if (start >= last->first) break;
                if (end + r.size <= start + kSpaceUnit) {
                    target = start;
                    break;
                }
            }
            if (target == kCotNotStored) {
                finished = true;
                break;
            }
            uint64_t dest = fill[target];
            if (Result rc = MoveClusterRecord(a, r.cluster, dest); rc != kOk) return rc;
            fill[target] = dest;
            lu.records.pop_back();
            fill[last->first] -= r.size;
            a.ui().progressPercent(static_cast<int>((dest - target) * 100 / kSpaceUnit));
        }
        if (!finished && lu.records.empty()) {
            fill.erase(last->first);
            units.erase(last);
            // Units that are empty now are no longer the end of the data area.
            while (!units.empty() && units.rbegin()->second.records.empty()) units.erase(std::prev(units.end()));
            if (units.size() < 2) finished = true;
        }
    }
    uint64_t dataEnd = 0;
    for (const auto& [start, end] : fill)
        if (end > start) dataEnd = std::max(dataEnd, end);
    a.setDataEnd(dataEnd);
    return a.commitTail();
}

bool hasSpaceToReclaim(const Vaultora& a) {
    if (a.isModified() || a.header().cotOffset == kCotNotStored) return true;
    std::vector<StoredRecord> records;
    for (size_t c = 0; c < a.cot().size(); ++c) {
        const CotEntry& e = a.cot()[c];
        if (!e.used()) continue;
        if (e.inClusterFile()) return true;
        if (e.size != 0) records.push_back({static_cast<uint32_t>(c), e.offset, e.size});
    }
    std::sort(records.begin(), records.end(),
              [](const StoredRecord& x, const StoredRecord& y) { return x.offset < y.offset; });
    uint64_t expect = 0;
    for (const StoredRecord& r : records) {
        if (r.offset != expect) {
            // The only gap a compact archive may have is where a record would cross into the next
            // space unit and so starts that unit instead.
            if (r.offset != unitStart(r.offset) || r.offset < expect || expect + r.size <= r.offset) return true;
        }
        expect = r.offset + r.size;
    }
    return expect != a.header().cotOffset;
}

void installOperationHooks() {
    ArchiveHooks hooks;
    hooks.compact = &Compact;
    hooks.offerRecovery = &OfferRecovery;
    setArchiveHooks(hooks);
}

}  // namespace vaultora
