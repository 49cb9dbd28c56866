#include "handlers/voicemail/VoicemailSubscription.h"

#include <gtest/gtest.h>

#include <atomic>
#include <latch>
#include <thread>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimLibraries.h"

namespace {

constexpr const char* kLibrary = "/usr/lib/linefold/libVisualVoicemail.so";
constexpr const char* kSymbol = "_MBSharedServiceIsSubscribed";

unsigned char answer = 0;
std::atomic<int> questions = 0;

unsigned char IsSubscribed() {
    ++questions;
    return answer;
}

class VoicemailSubscriptionTest : public testing::Test {
protected:
    VoicemailSubscriptionTest() {
        sim::Reset();
        answer = 0;
        questions = 0;
    }

    static void makeLibrary() {
        sim::MakeLibrary(kLibrary, {{kSymbol, reinterpret_cast<void*>(IsSubscribed)}});
    }

    VoicemailSubscription subscription_;
};

TEST_F(VoicemailSubscriptionTest, IsWhatTheLibrarySaysEachTime) {
    makeLibrary();
    EXPECT_FALSE(subscription_.isSubscribed());
    answer = 1;
    EXPECT_TRUE(subscription_.isSubscribed());
    answer = 0;
    EXPECT_FALSE(subscription_.isSubscribed());
    EXPECT_EQ(questions, 3);
}

TEST_F(VoicemailSubscriptionTest, IsTrueForEveryBooleanThatIsNotZero) {
    makeLibrary();
    for (const unsigned char boolean : std::initializer_list<unsigned char>{1, 2, 128, 255}) {
        answer = boolean;
        EXPECT_TRUE(subscription_.isSubscribed()) << int{boolean};
    }
}

TEST_F(VoicemailSubscriptionTest, LooksTheFunctionUpOnce) {
    makeLibrary();
    EXPECT_TRUE(sim::Journal().empty()) << "and not before it is asked";
    (void)subscription_.isSubscribed();
    (void)subscription_.isSubscribed();
    EXPECT_EQ(sim::Journal(),
              (std::vector<std::string>{std::string("DynamicLibrary.open ") + kLibrary,
                                        std::string("DynamicLibrary.function ") + kSymbol}));
}

TEST_F(VoicemailSubscriptionTest, IsFalseForGoodWithoutTheLibrary) {
    EXPECT_FALSE(subscription_.isSubscribed());
    makeLibrary();
    answer = 1;
    EXPECT_FALSE(subscription_.isSubscribed());
    EXPECT_EQ(sim::JournalCount("DynamicLibrary.open"), 1U);
    EXPECT_TRUE(sim::UnifiedLog().empty());
    EXPECT_TRUE(sim::SystemLogLines().empty());
}

TEST_F(VoicemailSubscriptionTest, IsFalseForGoodWithoutTheFunction) {
    sim::MakeLibrary(kLibrary, {{"MBSharedServiceIsSubscribed", nullptr}});
    EXPECT_FALSE(subscription_.isSubscribed());
    makeLibrary();
    answer = 1;
    EXPECT_FALSE(subscription_.isSubscribed());
    EXPECT_EQ(questions, 0);
}

TEST_F(VoicemailSubscriptionTest, IsFalseForGoodWhenTheLookUpFailed) {
    makeLibrary();
    answer = 1;
    for (const char* call : {"DynamicLibrary.open", "DynamicLibrary.function"}) {
        VoicemailSubscription subscription;
        sim::FailCall(call, 1);
        EXPECT_FALSE(subscription.isSubscribed()) << call;
        EXPECT_FALSE(subscription.isSubscribed()) << call;
    }
    EXPECT_TRUE(subscription_.isSubscribed());
}

TEST_F(VoicemailSubscriptionTest, IsLookedUpOnceForThreadsThatAskAtOnce) {
    makeLibrary();
    answer = 1;
    std::atomic<int> subscribed = 0;
    {
        std::latch start(8);
        std::vector<std::jthread> threads;
        for (int i = 0; i < 8; ++i) {
            threads.emplace_back([this, &start, &subscribed] {
                start.arrive_and_wait();
                subscribed += subscription_.isSubscribed() ? 1 : 0;
            });
        }
    }
    EXPECT_EQ(subscribed, 8);
    EXPECT_EQ(questions, 8);
    EXPECT_EQ(sim::JournalCount("DynamicLibrary.open"), 1U);
}

/// The routine's own record lasts for the process, so this is the one test that asks it.
TEST_F(VoicemailSubscriptionTest, IsTheAnswerOfTheRoutine) {
    makeLibrary();
    std::int32_t isSubscribed = 77;
    EXPECT_EQ(server_LFMobileHelperIsVoicemailSubscribed(7, isSubscribed), 0);
    EXPECT_EQ(isSubscribed, 0);
    answer = 128;
    EXPECT_EQ(server_LFMobileHelperIsVoicemailSubscribed(7, isSubscribed), 0);
    EXPECT_EQ(isSubscribed, 1);
    EXPECT_EQ(sim::JournalCount("DynamicLibrary.open"), 1U);
}

}  // namespace
