#pragma once
// A full decode of an archive with the engine's reading side: every directory and data cluster is
// read and its record checked against the cluster table, every chain is walked, and every used
// table entry must belong to exactly one chain; then the engine's own check must find nothing to
// ask about.
#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "archive/format.h"
#include "archive/vaultora.h"
#include "operations/check.h"
#include "platform/file.h"
#include "platform/text.h"
#include "support/scripted_interaction.h"

namespace vaultora::test {

struct ArchiveCensus {
    uint32_t files = 0;
    uint32_t folders = 0;
    std::vector<std::string> paths;  // "folder\name" of every unit, UTF-8
};

inline void expectValidArchive(const std::string& path, const std::string& password, ArchiveCensus* census = nullptr) {
    SCOPED_TRACE("archive " + path);
    EXPECT_FALSE(fs::exists(path + ".vrt")) << "temporary folder left behind";
    ScriptedInteraction ui;  // any question fails the test
    Vaultora a(path, &ui);
    const PasswordRecord pw = PasswordRecord::fromUtf8(password);
    ASSERT_EQ(a.open(OpenKey{&pw}), kOk);
    const Header& h = a.header();
    ASSERT_NE(h.cotOffset, kCotNotStored);
    const uint64_t fileSize = static_cast<uint64_t>(fs::fileSize(path));
    if (!h.hasExtendedBlock()) {
        EXPECT_EQ(a.dataStart() + h.cotOffset + h.cotLength, fileSize);
    }

    const std::vector<CotEntry>& cot = a.cot();
    std::vector<bool> owned(cot.size(), false);
    std::vector<std::pair<uint64_t, uint32_t>> extents;

    // Claims the chain from `start`, checks each record, returns the payloads in order.
    auto claimChain = [&](uint32_t start, std::vector<SecureBytes>& payloads) {
        uint32_t c = start;
        for (size_t guard = 0; c != kEndOfChain; ++guard) {
            ASSERT_LT(guard, cot.size()) << "chain loops";
            ASSERT_LT(c, cot.size());
            ASSERT_TRUE(cot[c].used()) << "chain runs into free cluster " << c;
            ASSERT_FALSE(owned[c]) << "cluster " << c << " is in two chains";
            owned[c] = true;
            ASSERT_FALSE(cot[c].inClusterFile()) << "cluster " << c << " was never moved into the archive";
            extents.emplace_back(cot[c].offset, cot[c].size);
            std::vector<uint8_t> record;
            ASSERT_EQ(a.readRecord(c, record), kOk) << "cluster " << c;
            ClusterDescriptor d;
            ASSERT_EQ(readClusterDescriptor(record.data(), record.size(), a.blockSize(), a.recordCipher(), d), kOk);
            EXPECT_EQ(d.cluster, c);
            EXPECT_EQ(d.next, cot[c].next);
            SecureBytes payload;
            ASSERT_EQ(decodeClusterRecord(true, record.data(), record.size(), c, cot[c].size, a.blockSize(),
                                          a.recordCipher(), payload),
                      kOk);
            EXPECT_LE(payload.size(), kMaxPayload);
            payloads.push_back(std::move(payload));
            c = cot[c].next;
        }
    };

    std::function<void(uint32_t, const std::u16string&)> visitFolder = [&](uint32_t chain, const std::u16string& folder) {
        std::vector<SecureBytes> clusters;
        claimChain(chain, clusters);
        for (const SecureBytes& dir : clusters) {
            for (size_t off = 0; off + kUnitFixedSize <= dir.size();) {
                const uint8_t* r = dir.data() + off;
                ASSERT_TRUE(unit::valid(r, dir.size() - off)) << "bad unit record in " << toUtf8(folder);
                off += unit::length(r);
                const uint8_t kind = unit::kind(r);
                if (kind == kUnitVolume || kind == kUnitDeleted) continue;
                const std::u16string name = unit::name(r);
                const std::u16string unitPath = folder.empty() ? name : folder + u"\\" + name;
                if (census) census->paths.push_back(toUtf8(unitPath));
                if ((unit::attributes(r) & kAttrFolder) != 0) {
                    if (census) ++census->folders;
                    visitFolder(unit::start(r), unitPath);
                    continue;
                }
                if (census) ++census->files;
                if (kind == kUnitInline) {
                    EXPECT_EQ(unit::length(r) - unit::start(r), unit::size(r)) << toUtf8(unitPath);
                    continue;
                }
                ASSERT_EQ(kind, kUnitChain);
                if (unit::start(r) == 0) {
                    EXPECT_EQ(unit::size(r), 0u) << toUtf8(unitPath);
                    continue;
                }
                std::vector<SecureBytes> body;
                claimChain(unit::start(r), body);
                uint64_t total = 0;
                for (const SecureBytes& piece : body) total += piece.size();
                EXPECT_EQ(total, unit::size(r)) << toUtf8(unitPath);
            }
        }
    };
    visitFolder(0, u"");

    for (size_t i = 0; i < cot.size(); ++i)
        if (cot[i].used()) {
            EXPECT_TRUE(owned[i]) << "cluster " << i << " belongs to no unit";
        }
    std::sort(extents.begin(), extents.end());
    for (size_t i = 0; i < extents.size(); ++i) {
        EXPECT_LE(extents[i].first + extents[i].second, h.cotOffset) << "record past the data area";
        if (i > 0) {
            EXPECT_LE(extents[i - 1].first + extents[i - 1].second, extents[i].first) << "records overlap";
        }
    }
    EXPECT_EQ(CheckArchive(a), kOk);
    EXPECT_TRUE(ui.asked.empty()) << "the check asked: " << (ui.asked.empty() ? "" : ui.asked.front());
    a.close();
}

}  // namespace vaultora::test
