#include <gtest/gtest.h>

#include "crypto/key_block_params.h"

using namespace vaultora;

TEST(KeyBlockParams, PreferenceRecordRoundTripsWithRecipientId) {
    KeyBlockParams p;
    p.method = kMethodPublicKey;
    p.archiveAlg = 137;
    p.hash = 10;
    p.keyAlg = 3;
    p.iterationCount = 65536;
    p.recipientId = {0xDE, 0xAD, 0xBE, 0xEF, 1, 2, 3, 4};
    p.salt = std::array<uint8_t, 8>{1, 2, 3, 4, 5, 6, 7, 8};
    std::vector<uint8_t> bytes = EncodeKeyBlockParams(p);
    ASSERT_EQ(bytes.size(), 20u);
    EXPECT_EQ(bytes[4], 0x00);
    EXPECT_EQ(bytes[6], 0x01);  // 65536 little-endian
    EXPECT_EQ(bytes[8], 8);
    KeyBlockParams q;
    ASSERT_TRUE(DecodeKeyBlockParams(bytes.data(), bytes.size(), q));
    EXPECT_EQ(q.method, kMethodPublicKey);
    EXPECT_EQ(q.archiveAlg, 137);
    EXPECT_EQ(q.hash, 10);
    EXPECT_EQ(q.keyAlg, 3);
    EXPECT_EQ(q.iterationCount, 65536u);
    EXPECT_EQ(q.recipientId, p.recipientId);
    EXPECT_FALSE(q.salt) << "the salt is never stored";
}

TEST(KeyBlockParams, ShortOrTruncatedRecordsGiveTheDefaults) {
    std::vector<uint8_t> good = EncodeKeyBlockParams(KeyBlockParams{1, 4, 2, 4, std::nullopt, 5000, 0, {9, 9}, {}});
    for (size_t cut : {size_t{0}, size_t{11}, good.size() - 1}) {
        KeyBlockParams p;
        p.archiveAlg = 1;
        EXPECT_FALSE(DecodeKeyBlockParams(good.data(), cut, p)) << cut;
        EXPECT_EQ(p.method, kMethodPassword);
        EXPECT_EQ(p.archiveAlg, 10);
        EXPECT_EQ(p.hash, 128);
        EXPECT_EQ(p.keyAlg, 10);
        EXPECT_EQ(p.iterationCount, 1u);
        EXPECT_TRUE(p.recipientId.empty());
    }
    KeyBlockParams p;
    EXPECT_FALSE(DecodeKeyBlockParams(nullptr, 0, p));
    // Exactly 12 bytes with N = 0 is a whole record.
    std::vector<uint8_t> twelve = {1, 9, 8, 7, 0, 4, 0, 0, 0, 0, 0, 0};
    ASSERT_TRUE(DecodeKeyBlockParams(twelve.data(), twelve.size(), p));
    EXPECT_EQ(p.archiveAlg, 9);
    EXPECT_EQ(p.iterationCount, 1024u);
}

TEST(KeyBlockParams, SaltTextNeedsExactlyEightHexBytes) {
    std::array<uint8_t, 8> salt{};
    EXPECT_TRUE(ParseSalt(std::string_view("0a1B 2c3D 4e5F 6071"), salt));
    EXPECT_EQ(salt, (std::array<uint8_t, 8>{0x0A, 0x1B, 0x2C, 0x3D, 0x4E, 0x5F, 0x60, 0x71}));
    EXPECT_TRUE(ParseSalt(std::u16string_view(u"01 02 03 04 05 06 07 08 "), salt));
    EXPECT_EQ(FormatSalt(salt), "01 02 03 04 05 06 07 08 ");
    std::array<uint8_t, 8> untouched = salt;
    for (const char* bad : {"01 02 03 04 05 06 07", "01 02 03 04 05 06 07 08 09", "01 02 03 04 05 06 07 0", "01 02 03 04 05 06 07 0g",
                            "0-02 03 04 05 06 07 08", ""}) {
        EXPECT_FALSE(ParseSalt(std::string_view(bad), salt)) << bad;
        EXPECT_EQ(salt, untouched);
    }
    std::array<uint8_t, 8> a{}, b{};
    ASSERT_EQ(NewSalt(a), kOk);
    ASSERT_EQ(NewSalt(b), kOk);
    EXPECT_NE(a, b);
}

TEST(KeyBlockParams, IterationCountsRoundToRepresentableValues) {
    EXPECT_EQ(RepresentableIterationCount(1500), 1472u);  // shown; the dialog stays open
    EXPECT_EQ(RepresentableIterationCount(1472), 1472u);
    EXPECT_EQ(RepresentableIterationCount(1), 1024u);
    EXPECT_EQ(RepresentableIterationCount(1000000), 65536u);
    EXPECT_EQ(StepIterationCount(1024, -1), 1024u);
    EXPECT_EQ(StepIterationCount(1024, +1), 1088u);
    EXPECT_EQ(StepIterationCount(65536, +1), 65536u);
    EXPECT_EQ(StepIterationCount(65536, -1), 63488u);
}

TEST(KeyBlockParams, NewPasswordChecks) {
    auto rec = [](const char* s) { return PasswordRecord::fromUtf8(s); };
    EXPECT_EQ(CheckNewPassword(rec(""), rec("")), Msg::kPasswordEmpty);
    EXPECT_EQ(CheckNewPassword(rec("seven77"), rec("seven77")), Msg::kPasswordTooShort);
    // Eight characters in sixteen UTF-8 bytes still count as eight.
    EXPECT_EQ(CheckNewPassword(rec("\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4"),
                               rec("\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4\u00e4")),
              std::nullopt);
    EXPECT_EQ(CheckNewPassword(rec("long enough"), rec("long enougH")), Msg::kPasswordsMismatch);
    EXPECT_EQ(CheckNewPassword(rec("long enough"), rec("long enough")), std::nullopt);
    EXPECT_EQ(msgText(Msg::kInvalidSalt), u"Invalid salt value");
}
