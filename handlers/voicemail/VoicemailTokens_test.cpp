#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimMailbox.h"

namespace {

using Tokens = std::map<std::string, std::string, std::less<>>;

constexpr std::string_view kNotUtf8 = "\xC3(";
const std::string kUmlauts = "T\xC3\xB6ken \xF0\x9F\x93\xB1";

/// A field of 256 bytes as it came in a message.
String256 Field(std::string_view text) {
    std::array<std::byte, 256> field{};
    std::memcpy(field.data(), text.data(), text.size());
    return String256(std::span<const std::byte, 256>(field));
}

kern_return_t Set(std::string_view token) {
    auto field = Field(token);
    return server_LFMobileHelperSetVoicemailToken(7, field);
}

kern_return_t SetForKey(std::string_view key, std::string_view token) {
    auto keyField = Field(key);
    auto tokenField = Field(token);
    return server_LFMobileHelperSetVoicemailTokenForKey(7, keyField, tokenField);
}

struct Copied {
    kern_return_t code = 0;
    OutString<256> field{};

    [[nodiscard]] std::string text() const {
        return {field.data(), strnlen(field.data(), field.size())};
    }

    /// All of the field behind the text.
    [[nodiscard]] bool isPadded() const {
        return std::ranges::all_of(std::span(field).subspan(text().size()),
                                   [](char byte) { return byte == '\0'; });
    }
};

Copied Copy() {
    Copied copied;
    copied.code = server_LFMobileHelperCopyVoicemailToken(7, copied.field);
    return copied;
}

Copied CopyForKey(std::string_view key) {
    auto field = Field(key);
    Copied copied;
    copied.code = server_LFMobileHelperCopyVoicemailTokenForKey(7, field, copied.field);
    return copied;
}

class VoicemailTokens : public testing::Test {
protected:
    VoicemailTokens() { sim::Reset(); }

    ~VoicemailTokens() override {
        EXPECT_TRUE(sim::UnifiedLog().empty());
        EXPECT_TRUE(sim::SystemLogLines().empty());
    }
};

TEST_F(VoicemailTokens, ComeBackAsTheyWereSet) {
    EXPECT_EQ(Set(kUmlauts), 0);
    EXPECT_EQ(sim::TheMailbox().token, kUmlauts);
    const Copied copied = Copy();
    EXPECT_EQ(copied.code, 0);
    EXPECT_EQ(copied.text(), kUmlauts);
    EXPECT_TRUE(copied.isPadded());
}

TEST_F(VoicemailTokens, UnderKeysAreKeptApart) {
    EXPECT_EQ(Set("main"), 0);
    EXPECT_EQ(SetForKey("a", "one"), 0);
    EXPECT_EQ(SetForKey("b", "two"), 0);
    EXPECT_EQ(SetForKey("a", "three"), 0);
    EXPECT_EQ(sim::TheMailbox().tokensForKeys, (Tokens{{"a", "three"}, {"b", "two"}}));
    EXPECT_EQ(CopyForKey("a").text(), "three");
    EXPECT_EQ(CopyForKey("b").text(), "two");
    EXPECT_EQ(Copy().text(), "main");
}

TEST_F(VoicemailTokens, ThatAreAbsentAreTheEmptyStringAndASuccess) {
    for (const Copied& copied : {Copy(), CopyForKey("absent")}) {
        EXPECT_EQ(copied.code, 0);
        EXPECT_EQ(copied.text(), "");
        EXPECT_TRUE(copied.isPadded());
    }
}

TEST_F(VoicemailTokens, MayBeEmpty) {
    EXPECT_EQ(Set(""), 0);
    EXPECT_EQ(SetForKey("", ""), 0);
    EXPECT_EQ(sim::TheMailbox().token, "");
    EXPECT_EQ(sim::TheMailbox().tokensForKeys, (Tokens{{"", ""}}));
    EXPECT_EQ(CopyForKey("").code, 0);
}

TEST_F(VoicemailTokens, OfTheWholeFieldAreStoredWholeAndDoNotFitAReply) {
    const std::string fits(255, 'x');
    const std::string fills(256, 'y');
    EXPECT_EQ(Set(fits), 0);
    EXPECT_EQ(Copy().text(), fits);
    EXPECT_EQ(Set(fills), 0);
    EXPECT_EQ(sim::TheMailbox().token, fills);
    EXPECT_EQ(Copy().code, 0);
    EXPECT_EQ(Copy().text(), "");
    EXPECT_TRUE(Copy().isPadded());
}

TEST_F(VoicemailTokens, UnderAKeyOfTheWholeFieldAreFound) {
    const std::string key(256, 'k');
    EXPECT_EQ(SetForKey(key, "token"), 0);
    EXPECT_EQ(CopyForKey(key).text(), "token");
    EXPECT_EQ(CopyForKey(key.substr(1)).text(), "");
    EXPECT_EQ(SetForKey(key, std::string(256, 't')), 0);
    EXPECT_EQ(CopyForKey(key).text(), "");
}

TEST_F(VoicemailTokens, ThatLoseHalfACharacterAtTheEndOfTheFieldAreRefused) {
    EXPECT_EQ(Set("old"), 0);
    EXPECT_EQ(Set(std::string(255, 'x') + "\xC3"), 5);
    EXPECT_EQ(sim::TheMailbox().token, "old");
}

TEST_F(VoicemailTokens, ThatAreNotUtf8ChangeNothing) {
    EXPECT_EQ(Set(kNotUtf8), 5);
    EXPECT_EQ(SetForKey(kNotUtf8, "token"), 5);
    EXPECT_EQ(SetForKey("key", kNotUtf8), 5);
    EXPECT_EQ(CopyForKey(kNotUtf8).code, 5);
    EXPECT_EQ(CopyForKey(kNotUtf8).text(), "");
    EXPECT_TRUE(sim::Journal().empty()) << "the store is not asked";
}

TEST_F(VoicemailTokens, AreClearedWithoutThoseUnderKeys) {
    EXPECT_EQ(Set("main"), 0);
    EXPECT_EQ(SetForKey("key", "token"), 0);
    EXPECT_EQ(server_LFMobileHelperClearVoicemailToken(7), 0);
    EXPECT_EQ(sim::TheMailbox().token, std::nullopt);
    EXPECT_EQ(Copy().text(), "");
    EXPECT_EQ(CopyForKey("key").text(), "token");
    EXPECT_EQ(server_LFMobileHelperClearVoicemailToken(7), 0) << "twice is harmless";
}

TEST_F(VoicemailTokens, AreWipedWithThoseUnderKeysAndTheMainOneFirst) {
    EXPECT_EQ(Set("main"), 0);
    EXPECT_EQ(SetForKey("key", "token"), 0);
    sim::ClearJournal();
    EXPECT_EQ(server_LFMobileHelperRemoveAllVoicemailRecords(7), 0);
    EXPECT_EQ(
        sim::Journal(),
        (std::vector<std::string>{"MailboxStoreSetToken none", "MailboxStoreRemoveAllRecords 0"}));
    EXPECT_EQ(sim::TheMailbox().token, std::nullopt);
    EXPECT_TRUE(sim::TheMailbox().tokensForKeys.empty());
}

TEST_F(VoicemailTokens, AreClearedAlsoWhenTheRecordsCannotBeWiped) {
    EXPECT_EQ(Set("main"), 0);
    EXPECT_EQ(SetForKey("key", "token"), 0);
    sim::FailCall("MailboxStoreRemoveAllRecords", 1);
    EXPECT_EQ(server_LFMobileHelperRemoveAllVoicemailRecords(7), 0);
    EXPECT_EQ(sim::TheMailbox().token, std::nullopt);
    EXPECT_EQ(sim::TheMailbox().tokensForKeys.size(), 1U);
}

TEST_F(VoicemailTokens, AnswerSuccessWhateverTheStoreDoes) {
    for (const char* call : {"MailboxStoreSetToken",
                             "MailboxStoreSetTokenForKey",
                             "MailboxStoreCopyToken",
                             "MailboxStoreCopyTokenForKey"}) {
        sim::FailCall(call, 1);
        EXPECT_EQ(Set("main"), 0) << call;
        EXPECT_EQ(SetForKey("key", "token"), 0) << call;
        EXPECT_EQ(Copy().code, 0) << call;
        EXPECT_EQ(CopyForKey("key").code, 0) << call;
        EXPECT_EQ(sim::FailedCall(), call);
    }
}

}  // namespace
