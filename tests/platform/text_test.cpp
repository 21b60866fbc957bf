#include <gtest/gtest.h>

#include "platform/text.h"

namespace vaultora {

TEST(Text, InvalidUtf8BytesRoundTripThroughSurrogateEscapes) {
    std::string raw = "a\xff\xc3(b\xe2\x82\xac\xed\xa0\x80";  // stray byte, bad continuation, euro, encoded surrogate
    std::u16string u = fromUtf8(raw);
    EXPECT_EQ(u[1], 0xDCFF);
    EXPECT_EQ(u[2], 0xDCC3);
    EXPECT_EQ(toUtf8(u), raw);
}

TEST(Text, SupplementaryCharactersBecomeSurrogatePairs) {
    std::u16string u = fromUtf8("\xf0\x9f\x98\x80");
    ASSERT_EQ(u.size(), 2u);
    EXPECT_EQ(u[0], 0xD83D);
    EXPECT_EQ(toUtf8(u), "\xf0\x9f\x98\x80");
}

TEST(Text, FormatHandlesWidthsAndBothStringKinds) {
    EXPECT_EQ(formatText(u"CN%04X.CLS", {0x1a}), u"CN001A.CLS");
    EXPECT_EQ(formatText(u"LostCluster %08X", {0x1234u}), u"LostCluster 00001234");
    EXPECT_EQ(formatText(u"Error %d, File %s, line %d", {83, "HXZip", 12}), u"Error 83, File HXZip, line 12");
    EXPECT_EQ(formatText(u"'%s' %d%%", {std::u16string(u"x"), -1}), u"'x' -1%");
}

}  // namespace vaultora
