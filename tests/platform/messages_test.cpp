#include <gtest/gtest.h>

#include "platform/messages.h"

namespace vaultora {

TEST(Messages, EveryNumberNamesOneText) {
    EXPECT_TRUE(duplicateMessageIds().empty()) << "first duplicate: " << duplicateMessageIds().front();
}

TEST(Messages, NumberedTextsAreTheDefaultLanguageTexts) {
    EXPECT_EQ(msgText(Msg::kCaptionVaultora), u"Vaultora");
    EXPECT_EQ(msgText(Msg::kCaptionAttention), u"Attention!");
    EXPECT_EQ(msgText(Msg::kCaptionError), u"Vaultora Error");
    EXPECT_EQ(msgFormat(Msg::kOpenError, {101}), u"Error 101  in opening archive.");
}

TEST(Messages, TranslatorReplacesTextsAndFallsBack) {
    setMessageTranslator([](Msg id, std::u16string& out) {
        if (id != Msg::kCaptionVaultora) return false;
        out = u"Tresor";
        return true;
    });
    EXPECT_EQ(msgText(Msg::kCaptionVaultora), u"Tresor");
    EXPECT_EQ(msgText(Msg::kCaptionAttention), u"Attention!");
    setMessageTranslator(nullptr);
    EXPECT_EQ(msgText(Msg::kCaptionVaultora), u"Vaultora");
}

}  // namespace vaultora
