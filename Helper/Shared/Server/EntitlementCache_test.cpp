#include "Helper/Shared/Server/EntitlementCache.h"

#include <gtest/gtest.h>

#include "platform/sim/Sim.h"
#include "platform/sim/SimClient.h"

using namespace platform;

namespace {

constexpr std::string_view kName = "com.vendra.example.allow";
constexpr std::int32_t kPid = 100;
constexpr std::uint32_t kGroup = 300;

AuditToken Token(std::int32_t pid = kPid, std::uint32_t uid = 501, std::uint32_t gid = kGroup) {
    return {uid, uid, gid, uid, gid, static_cast<std::uint32_t>(pid), 0, 0};
}

class Entitlement : public testing::Test {
protected:
    Entitlement() {
        sim::Reset();
        sim::StartProcess(kPid);
        sim::GrantToGroup(kGroup, kName, PropertyList(true));
    }

    static std::size_t queries() { return sim::JournalCount("SecTask.copyValueForEntitlement"); }

    static std::size_t watchers() { return sim::JournalCount("ProcessExitSource.create"); }
};

TEST_F(Entitlement, IsHeldWithTheBooleanTrue) {
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_EQ(sim::JournalCount("SecTask.createWithAuditToken 100"), 1U);
    EXPECT_EQ(queries(), 1U);
    EXPECT_EQ(watchers(), 1U);
}

class EntitlementValue : public Entitlement, public testing::WithParamInterface<PropertyList> {};

TEST_P(EntitlementValue, OfAnotherKindOrFalseIsARefusal) {
    sim::GrantToGroup(kGroup, kName, GetParam());
    EXPECT_FALSE(HasEntitlement(kName, Token()));
    EXPECT_EQ(queries(), 1U);
    EXPECT_EQ(watchers(), 0U);
}

INSTANTIATE_TEST_SUITE_P(EachKind,
                         EntitlementValue,
                         testing::Values(PropertyList(false),
                                         PropertyList(std::int64_t{1}),
                                         PropertyList("true"),
                                         PropertyList(1.0),
                                         PropertyList(PropertyList::Date{1}),
                                         PropertyList(PropertyList::Data{std::byte{1}}),
                                         PropertyList(PropertyList::Array{PropertyList(true)}),
                                         PropertyList()));

TEST_F(Entitlement, IsNotHeldByAnotherGroup) {
    EXPECT_FALSE(HasEntitlement(kName, Token(kPid, 501, 301)));
    EXPECT_FALSE(HasEntitlement("com.vendra.example.other", Token()));
    EXPECT_EQ(watchers(), 0U);
}

TEST_F(Entitlement, IsNotHeldWhenNoTaskCanBeMade) {
    sim::FailCall("SecTask.createWithAuditToken", 1);
    EXPECT_FALSE(HasEntitlement(kName, Token()));
    EXPECT_TRUE(HasEntitlement(kName, Token()));
}

TEST_F(Entitlement, IsNotHeldWhenTheQuestionFails) {
    sim::FailCall("SecTask.copyValueForEntitlement", 1);
    EXPECT_FALSE(HasEntitlement(kName, Token()));
    EXPECT_TRUE(HasEntitlement(kName, Token()));
}

TEST_F(Entitlement, IsNotHeldByWhoCannotBeTold) {
    EXPECT_FALSE(HasEntitlement(kName, Token(0)));
    EXPECT_FALSE(HasEntitlement(kName, Token(-1)));
    EXPECT_FALSE(HasEntitlement(kName, Token(kPid, 65534)));
    EXPECT_FALSE(HasEntitlement(kName, Token(kPid, 501, 65534)));
    EXPECT_FALSE(HasEntitlement(kName, kUnknownSender));
    EXPECT_EQ(queries(), 0U);
}

TEST_F(Entitlement, IsAnsweredFromTheCacheTheSecondTime) {
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    sim::ClearJournal();
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_EQ(queries(), 0U);
    EXPECT_EQ(watchers(), 0U);
}

TEST_F(Entitlement, StaysInTheCacheThoughTheGrantIsGone) {
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    sim::GrantToGroup(kGroup, kName, PropertyList(false));
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_EQ(queries(), 1U);
}

TEST_F(Entitlement, IsRememberedByItsNameWithOneWatcherForAll) {
    sim::GrantToGroup(kGroup, "com.vendra.example.second", PropertyList(true));
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_TRUE(HasEntitlement("com.vendra.example.second", Token()));
    EXPECT_EQ(queries(), 2U);
    EXPECT_EQ(watchers(), 1U);
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_EQ(queries(), 2U);
}

TEST_F(Entitlement, ARefusalIsNotRemembered) {
    sim::GrantToGroup(kGroup, kName, PropertyList(false));
    EXPECT_FALSE(HasEntitlement(kName, Token()));
    sim::GrantToGroup(kGroup, kName, PropertyList(true));
    EXPECT_TRUE(HasEntitlement(kName, Token()));
}

TEST_F(Entitlement, IsForgottenWhenTheProcessExits) {
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    sim::ExitProcess(kPid);
    sim::Settle();
    EXPECT_EQ(sim::JournalCount("ProcessExitSource.cancel"), 1U);
    sim::StartProcess(kPid);
    sim::GrantToGroup(kGroup, kName, PropertyList(false));
    EXPECT_FALSE(HasEntitlement(kName, Token()));
    EXPECT_EQ(queries(), 2U);
}

TEST_F(Entitlement, DoesNotSpeakForTheNextBearerOfAProcessId) {
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    sim::ExitProcess(kPid);
    sim::StartProcess(kPid);
    sim::GrantToGroup(kGroup, kName, PropertyList(false));
    // The news of the exit has not been served yet.
    EXPECT_FALSE(HasEntitlement(kName, Token()));
    sim::Settle();
    EXPECT_FALSE(HasEntitlement(kName, Token()));
}

TEST_F(Entitlement, OfTheNextBearerSurvivesTheNewsOfTheFirstOnesExit) {
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    sim::ExitProcess(kPid);
    sim::StartProcess(kPid);
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    sim::Settle();
    sim::ClearJournal();
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_EQ(queries(), 0U);
}

TEST_F(Entitlement, IsAskedAgainWhenTheSameProcessIdComesWithOtherIds) {
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_FALSE(HasEntitlement(kName, Token(kPid, 501, 301)));
    EXPECT_TRUE(HasEntitlement(kName, Token(kPid, 502)));
    EXPECT_EQ(queries(), 3U);
    EXPECT_EQ(watchers(), 1U);
}

TEST_F(Entitlement, StandsUncachedWhenTheProcessCannotBeWatched) {
    sim::FailCall("ProcessExitSource.create", 1);
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_EQ(queries(), 2U);
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_EQ(queries(), 2U);
}

TEST_F(Entitlement, OfAProcessThatIsGoneAlreadyIsNotCached) {
    sim::ExitProcess(kPid);
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_EQ(queries(), 2U);
}

TEST_F(Entitlement, OfOneProcessIsKeptWhenAnotherExits) {
    sim::StartProcess(101);
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_TRUE(HasEntitlement(kName, Token(101)));
    sim::ExitProcess(101);
    sim::Settle();
    EXPECT_TRUE(HasEntitlement(kName, Token()));
    EXPECT_EQ(queries(), 2U);
}

}  // namespace
