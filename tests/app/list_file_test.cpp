// Items of the add verbs: list files, archive name "*", wiping of "@*" lists.
#include <gtest/gtest.h>

#include "app/list_file.h"
#include "platform/file.h"
#include "program_run.h"
#include "support/temp_dir.h"

namespace vaultora {
namespace {

std::vector<uint8_t> bytesOf(const std::string& s) { return std::vector<uint8_t>(s.begin(), s.end()); }

TEST(ListFile, DecodesEightBitBytesAndUtf16Lines) {
    using V = std::vector<std::string>;
    EXPECT_EQ(decodeListText(bytesOf("# comment\n/a b/c\r\n\n  spaced\n/last")), (V{"/a b/c", "  spaced", "/last"}));
    EXPECT_EQ(decodeListText(bytesOf("/caf\xE9\n")), V{"/caf\xE9"});  // bytes of a Linux name kept
    // Non-ASCII UTF-16 becomes the UTF-8 bytes of the Linux name.
    EXPECT_EQ(decodeListText(bytesOf(test::utf16le(u"/\u00e9t\u00e9\r\n#x\r\n/b", true))), (V{"/\xC3\xA9t\xC3\xA9", "/b"}));
    EXPECT_TRUE(decodeListText({}).empty());
}

TEST(ListFile, ArchiveNameForStar) {
    EXPECT_EQ(archiveNameForItem("/d/report.doc", false), "/d/report.vra");
    EXPECT_EQ(archiveNameForItem("notes.md", false), "notes.vra");
    EXPECT_EQ(archiveNameForItem("/d/page.html", false), "/d/page.html.vra");  // no dot in the last four
    EXPECT_EQ(archiveNameForItem("/d/a.tar.gz", false), "/d/a.tar.vra");
    EXPECT_EQ(archiveNameForItem("/d.x/readme", false), "/d.x/readme.vra");  // a dot of the folder is no extension
    EXPECT_EQ(archiveNameForItem("/d/.abc", false), "/d/.abc.vra");
    EXPECT_EQ(archiveNameForItem("/d/photos.2024/", true), "/d/photos.2024.vra");
}

TEST(ListFile, ExpandsItemsAndWipesStarListsToZerosBeforeDeleting) {
    test::TempDir dir;
    const std::string list = dir / "l.txt";
    ASSERT_TRUE(fs::writeWholeFile(list, "/one\n/two\n", 10));
    ItemList items;
    std::string failed;
    ASSERT_TRUE(expandItems({"/plain", "@" + list, "@*" + list}, items, failed));
    EXPECT_EQ(items.paths, (std::vector<std::string>{"/plain", "/one", "/two", "/one", "/two"}));
    EXPECT_EQ(items.wipeAtEnd, std::vector<std::string>{list});
    ItemList none;
    EXPECT_FALSE(expandItems({"@" + (dir / "missing")}, none, failed));
    EXPECT_EQ(failed, dir / "missing");

    // The bytes are overwritten before the name goes: a second link to the file sees zeros.
    const std::string link = dir / "link";
    ASSERT_EQ(::link(list.c_str(), link.c_str()), 0);
    EXPECT_TRUE(wipeAndDelete(list));
    EXPECT_FALSE(fs::exists(list));
    std::vector<uint8_t> left;
    ASSERT_TRUE(fs::readWholeFile(link, left));
    EXPECT_EQ(left, std::vector<uint8_t>(10, 0));
}

}  // namespace
}  // namespace vaultora
