#pragma once
// Helpers for the check and recovery tests: archives with hand-made trees and damage.
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "archive/directory.h"
#include "archive/vaultora.h"
#include "support/scripted_interaction.h"
#include "support/temp_dir.h"

namespace vaultora::test {

inline std::vector<uint8_t> piece(uint32_t seed, size_t n) {
    std::vector<uint8_t> p(n);
    uint32_t x = seed * 2654435761u + 7;
    for (auto& b : p) {
        x = x * 1103515245u + 12345u;
        b = static_cast<uint8_t>((x >> 16) % 61 + 33);
    }
    return p;
}

// A chain of `count` clusters of small payloads, linked before the records are written so that
// every record names its successor (as the adder writes them). Returns the clusters in order.
inline std::vector<uint32_t> makeChain(Vaultora& a, size_t count, uint32_t seed, std::vector<uint8_t>* all = nullptr) {
    std::vector<uint32_t> chain;
    uint32_t prev = kNoCluster;
    for (size_t i = 0; i < count; ++i) {
        uint32_t c = a.allocateCluster(prev);
        if (prev != kNoCluster) a.mutableCot()[prev].next = c;
        chain.push_back(c);
        prev = c;
    }
    for (size_t i = 0; i < count; ++i) {
        std::vector<uint8_t> p = piece(seed + static_cast<uint32_t>(i), 700 + 10 * i);
        EXPECT_EQ(a.writeDataCluster(chain[i], p.data(), static_cast<uint32_t>(p.size()), false), kOk);
        if (all != nullptr) all->insert(all->end(), p.begin(), p.end());
    }
    EXPECT_EQ(a.saveClusterTable(), kOk);
    return chain;
}

// Adds a record to the folder whose directory chain starts at `folder`.
inline void addUnit(Vaultora& a, uint32_t folder, std::u16string_view name, uint32_t start, uint64_t size,
                    uint32_t attributes = 0) {
    SecureBytes record = makeRecordWithAttributes(name, 0, attributes);
    unit::setStart(record.data(), start);
    unit::setSize(record.data(), size);
    ChainBuffer room;
    ASSERT_EQ(findRoom(a, folder, room, record, nullptr), kOk);
    ASSERT_EQ(addRecord(room, record, nullptr), kOk);
    ASSERT_EQ(a.writeDirectoryCluster(room, true), kOk);
}

// A file unit with a chain of `clusters` clusters; returns the chain.
inline std::vector<uint32_t> addFile(Vaultora& a, uint32_t folder, std::u16string_view name, size_t clusters,
                                     uint32_t seed, std::vector<uint8_t>* data = nullptr) {
    std::vector<uint8_t> all;
    std::vector<uint32_t> chain = makeChain(a, clusters, seed, &all);
    addUnit(a, folder, name, chain.front(), all.size());
    if (data != nullptr) *data = all;
    return chain;
}

// A folder unit with a fresh empty directory; returns its directory cluster.
inline uint32_t addFolder(Vaultora& a, uint32_t parent, std::u16string_view name) {
    uint32_t c = a.allocateCluster(kNoCluster);
    addUnit(a, parent, name, c, 0, kAttrFolder);
    return c;
}

// The unit at `path`, or an empty buffer.
inline SecureBytes unitAt(Vaultora& a, std::u16string_view path) {
    SecureBytes copy;
    if (findUnitByPath(a, path, copy) != kOk) copy.clear();
    return copy;
}

// Names of the units in the folder whose chain starts at `folder`, in directory order.
inline std::vector<std::string> namesIn(Vaultora& a, uint32_t folder) {
    std::vector<std::string> out;
    for (uint32_t c : a.chainClusters(folder)) {
        ChainBuffer b;
        b.cluster = c;
        EXPECT_EQ(a.readCluster(b), kOk);
        for (size_t off = 0; off + kUnitFixedSize <= b.data.size(); off += unit::length(b.data.data() + off)) {
            const uint8_t* r = b.data.data() + off;
            if (!unit::valid(r, b.data.size() - off)) break;
            if (unit::kind(r) == kUnitVolume || unit::kind(r) == kUnitDeleted) continue;
            std::string name;
            for (char16_t ch : unit::name(r)) name += static_cast<char>(ch);
            out.push_back(name);
        }
    }
    return out;
}

// Replaces the archive hooks for one test.
class HooksGuard {
public:
    explicit HooksGuard(const ArchiveHooks& hooks) : m_saved(archiveHooks()) { setArchiveHooks(hooks); }
    ~HooksGuard() { setArchiveHooks(m_saved); }

private:
    ArchiveHooks m_saved;
};

}  // namespace vaultora::test
