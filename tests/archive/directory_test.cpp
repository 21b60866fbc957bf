// The directory tree: lookups, names, moving, the two-pass enumeration and clusters that fill up.
#include <gtest/gtest.h>

#include "archive/directory.h"
#include "archive/remove.h"
#include "archive/walk.h"
#include "platform/text.h"
#include "support/scripted_interaction.h"
#include "support/temp_dir.h"

namespace vaultora {
namespace {

using test::ScriptedInteraction;
using test::TempDir;

// Inserts a unit the way adding does: record, room, append, write.
uint32_t addUnit(Vaultora& a, std::u16string_view folder, std::u16string_view name, bool isFolder,
                 uint32_t extraBytes = 0) {
    uint32_t chain = 0;
    EXPECT_EQ(resolveFolder(a, folder, chain), kOk);
    SecureBytes record = makeRecordWithAttributes(name, 0, isFolder ? kAttrFolder : kAttrArchive);
    record.resize(record.size() + extraBytes, 0);
    unit::setLength(record.data(), static_cast<uint32_t>(record.size()));
    uint32_t start = kNoCluster;
    if (isFolder) start = a.allocateCluster(kNoCluster);
    unit::setStart(record.data(), isFolder ? start : 0);
    ChainBuffer buffer;
    EXPECT_EQ(findRoom(a, chain, buffer, record, nullptr), kOk);
    EXPECT_EQ(addRecord(buffer, record, nullptr), kOk);
    EXPECT_EQ(a.writeDirectoryCluster(buffer, true), kOk);
    return buffer.cluster;
}

class Names : public cActorBlock {
public:
    Result actOnUnit(uint8_t* record, std::u16string_view) override {
        names.push_back(toUtf8(unit::name(record)));
        return kOk;
    }
    std::vector<std::string> names;
};

struct Fixture {
    TempDir dir;
    ScriptedInteraction ui;
    Vaultora a{dir / "a.vra", &ui};
    Fixture() { EXPECT_EQ(a.create(nullptr, 0), kOk); }
};

TEST(Directory, WildcardLookupIsCaseSensitiveWithStarAndPercent) {
    EXPECT_TRUE(wildcardMatch(u"x%z", u"xyz"));
    EXPECT_FALSE(wildcardMatch(u"XYZ", u"xyz"));
    EXPECT_TRUE(wildcardMatch(u"q%e*y*", u"qwerty"));
    EXPECT_TRUE(wildcardMatch(u"*", u""));
    EXPECT_FALSE(wildcardMatch(u"a*b", u"acbd"));
    Fixture f;
    addUnit(f.a, u"", u"xyz", false);
    addUnit(f.a, u"", u"sub", true);
    addUnit(f.a, u"\\sub", u"inner", false);
    SecureBytes copy;
    EXPECT_EQ(findUnitByPath(f.a, u"x%z", copy), kOk);
    EXPECT_EQ(findUnitByPath(f.a, u"XYZ", copy), kNotFound);
    EXPECT_EQ(findUnitByPath(f.a, u"\\sub\\inner", copy), kOk);
    EXPECT_EQ(findUnitByPath(f.a, u"sub\\inner", copy), kOk);
}

TEST(Directory, StreamsAreEnumeratedAfterOrdinaryUnits) {
    Fixture f;
    addUnit(f.a, u"", u"notes.txt:info:$DATA", false);
    addUnit(f.a, u"", u"notes.txt", false);
    Names names;
    ASSERT_EQ(walk(f.a, u"*", 0, u"", names, nullptr), kOk);
    EXPECT_EQ(names.names, (std::vector<std::string>{"notes.txt", "notes.txt:info:$DATA"}));
}

TEST(Directory, UniqueNameAppendsTheFirstFreeNumber) {
    Fixture f;
    addUnit(f.a, u"", u"Draft", false);
    addUnit(f.a, u"", u"Draft1", false);
    std::u16string name = u"Draft";
    ASSERT_EQ(uniqueName(f.a, 0, name), kOk);
    EXPECT_EQ(name, u"Draft2");
}

TEST(Directory, RenameAndMoveRefuseBadNamesAndMovesIntoItself) {
    Fixture f;
    addUnit(f.a, u"", u"x", true);
    addUnit(f.a, u"x", u"y", true);
    addUnit(f.a, u"", u"xy", true);
    addUnit(f.a, u"", u"file", false);
    std::u16string bad = u"what?";
    EXPECT_EQ(moveUnit(f.a, u"", u"", u"file", &bad), kInvalidName);
    EXPECT_EQ(moveUnit(f.a, u"x\\y", u"", u"x", nullptr), kInvalidName);
    EXPECT_EQ(moveUnit(f.a, u"", u"", u"file", nullptr), kUnitExists);
    std::u16string renamed = u"renamed";
    ASSERT_EQ(moveUnit(f.a, u"", u"", u"file", &renamed), kOk);
    SecureBytes copy;
    EXPECT_EQ(findUnitByPath(f.a, u"file", copy), kNotFound);
    ASSERT_EQ(moveUnit(f.a, u"xy", u"", u"x", nullptr), kOk);  // a sibling whose name starts the same
    EXPECT_EQ(findUnitByPath(f.a, u"xy\\x\\y", copy), kOk);
    EXPECT_EQ(findUnitByPath(f.a, u"x", copy), kNotFound);
}

TEST(Directory, FullClusterGrowsTheChainAndAcceptsNothingMore) {
    Fixture f;
    f.a.setBatch(true);  // thousands of directory writes stay in the cache
    // The root holds the 48-byte volume record; fill cluster 0 to exactly 524,288 bytes.
    const uint32_t recordSize = 48 + 2 * 4;  // name "f000"
    uint32_t used = 48;
    int i = 0;
    while (used + recordSize * 2 <= kMaxPayload) {
        char16_t name[5] = {u'f', static_cast<char16_t>(u'A' + i / 676), static_cast<char16_t>(u'A' + i / 26 % 26),
                            static_cast<char16_t>(u'A' + i % 26), 0};
        EXPECT_EQ(addUnit(f.a, u"", name, false), 0u);
        used += recordSize;
        ++i;
    }
    const uint32_t rest = kMaxPayload - used;  // one record that fills the cluster exactly
    EXPECT_EQ(addUnit(f.a, u"", u"last", false, rest - recordSize), 0u);
    ChainBuffer root;
    root.cluster = 0;
    ASSERT_EQ(f.a.readCluster(root), kOk);
    EXPECT_EQ(root.data.size(), kMaxPayload);
    SecureBytes small = makeRecordWithAttributes(u"more", 0, 0);
    EXPECT_EQ(addRecord(root, small, nullptr), kNoRoom);
    const uint32_t second = addUnit(f.a, u"", u"more", false);
    EXPECT_NE(second, 0u);
    EXPECT_EQ(f.a.nextCluster(0), second);
    SecureBytes copy;
    EXPECT_EQ(findUnitByPath(f.a, u"more", copy), kOk);
}

TEST(Directory, RemovingAFolderRemovesItsSubtreeAfterOneQuestion) {
    Fixture f;
    addUnit(f.a, u"", u"top", true);
    addUnit(f.a, u"top", u"a", false);
    addUnit(f.a, u"top", u"inner", true);
    addUnit(f.a, u"top\\inner", u"b", false);
    f.ui.expect("File/folder '\\top'\nwill be removed from archive.", kAnswerYes);
    cRemoveFileActorBlock actor(f.a);
    ASSERT_EQ(walkPath(f.a, u"top", actor), kOk);
    SecureBytes copy;
    EXPECT_EQ(findUnitByPath(f.a, u"top", copy), kNotFound);
    EXPECT_FALSE(f.ui.remaining());
}

TEST(Directory, WalkStopsOnAChainThatPointsToItself) {
    Fixture f;
    const uint32_t c = f.a.allocateCluster(kNoCluster);
    f.a.mutableCot()[c].next = c;
    Names names;
    EXPECT_EQ(walk(f.a, u"*", c, u"", names, nullptr), kInconsistent);
}

TEST(Directory, ExtractToMemoryStopsAtCapacityWith69AndSearchFindsSpanningPatterns) {
    Fixture f;
    std::vector<uint8_t> data(kMaxPayload + 10, 'a');
    data[kMaxPayload - 2] = 'X';
    data[kMaxPayload - 1] = 'Y';
    data[kMaxPayload] = 'Z';
    uint32_t first = f.a.allocateCluster(kNoCluster);
    uint32_t second = f.a.allocateCluster(first);
    f.a.mutableCot()[first].next = second;
    ASSERT_EQ(f.a.writeDataCluster(first, data.data(), kMaxPayload, true), kOk);
    ASSERT_EQ(f.a.writeDataCluster(second, data.data() + kMaxPayload, 10, true), kOk);
    SecureBytes record = makeRecordWithAttributes(u"big", 0, kAttrArchive);
    unit::setStart(record.data(), first);
    unit::setSize(record.data(), data.size());
    ChainBuffer buffer;
    ASSERT_EQ(findRoom(f.a, 0, buffer, record, nullptr), kOk);
    ASSERT_EQ(addRecord(buffer, record, nullptr), kOk);
    ASSERT_EQ(f.a.writeDirectoryCluster(buffer, true), kOk);
    EXPECT_TRUE(searchUnitContent(f.a, record.data(), reinterpret_cast<const uint8_t*>("XYZ"), 3));
    EXPECT_FALSE(searchUnitContent(f.a, record.data(), reinterpret_cast<const uint8_t*>("XZ"), 2));
    std::vector<uint8_t> small(100);
    EXPECT_EQ(extractToMemory(f.a, small.data(), u"big", small.size()), kWriteFailed);
    EXPECT_EQ(small[99], 'a');
}

}  // namespace
}  // namespace vaultora
