#pragma once
// Helpers for archive-object tests: make an archive with known data clusters and read them back.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "archive/vaultora.h"
#include "support/scripted_interaction.h"
#include "support/temp_dir.h"

namespace vaultora::test {

// A payload that differs per seed and compresses a little.
inline std::vector<uint8_t> payloadFor(uint32_t seed, size_t n) {
    std::vector<uint8_t> p(n);
    uint32_t x = seed * 2654435761u + 1;
    for (size_t i = 0; i < n; ++i) {
        x = x * 1103515245u + 12345u;
        p[i] = static_cast<uint8_t>((x >> 16) % 64 + 32);
    }
    return p;
}

// Writes `payload` as a new data chain of clusters of at most 524,288 bytes; returns its start.
inline uint32_t writeChain(Vaultora& a, const std::vector<uint8_t>& payload, bool saveTable = true) {
    uint32_t start = kNoCluster, prev = kNoCluster;
    for (size_t off = 0; off < payload.size(); off += kMaxPayload) {
        uint32_t c = a.allocateCluster(prev);
        if (prev != kNoCluster) a.mutableCot()[prev].next = c;
        else start = c;
        size_t n = std::min<size_t>(kMaxPayload, payload.size() - off);
        EXPECT_EQ(a.writeDataCluster(c, payload.data() + off, static_cast<uint32_t>(n), saveTable), kOk);
        prev = c;
    }
    return start;
}

inline std::vector<uint8_t> readChain(Vaultora& a, uint32_t start) {
    std::vector<uint8_t> out;
    for (uint32_t c : a.chainClusters(start)) {
        ChainBuffer b;
        b.cluster = c;
        Result rc = a.readCluster(b);
        EXPECT_EQ(rc, kOk) << "cluster " << c;
        if (rc != kOk) return {};
        out.insert(out.end(), b.data.begin(), b.data.end());
    }
    return out;
}

}  // namespace vaultora::test
