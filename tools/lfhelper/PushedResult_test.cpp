#include "tools/lfhelper/PushedResult.h"

#include <gtest/gtest.h>

#include "platform/MessagePort.h"

using namespace lfhelper;

namespace {

/// No port of the phone's, so that no daemon of another test has it.
constexpr std::string_view kPort = "com.vendra.test.pushed-result";

Answer Asked() {
    Answer answer;
    answer.fields.add("asked", std::int64_t{1});
    return answer;
}

void Push(std::int32_t id) {
    EXPECT_TRUE(platform::MessagePortSendRequest(kPort, id, {}));
}

/// Takes messages up to the one with the id 7.
PushedResult UpToSeven(Request ask) {
    return {
        .port = kPort,
        .secondsMax = 10,
        .ask = std::move(ask),
        .take = [](tools::NamedPort&, const tools::PortMessage& message) -> std::optional<Answer> {
            return message.id == 7 ? std::optional(Answer{.text = "seven\n"}) : std::nullopt;
        }};
}

// The port is held to the end of the process, so all of it is one test.
TEST(PushedResult, IsWhatComesWithinTheTime) {
    auto result = UpToSeven([](LFMobileHelper*) {
        Push(6);
        Push(7);
        return Asked();
    });
    const Answer answer = AwaitPushedResult(nullptr, result);
    EXPECT_EQ(answer.text, "seven\n");
    EXPECT_EQ(answer.problem.text, "");
    EXPECT_EQ(answer.fields.toString(), R"({"asked":1})");

    bool isAsked = false;
    const Answer second = AwaitPushedResult(nullptr, UpToSeven([&](LFMobileHelper*) {
                                                isAsked = true;
                                                return Asked();
                                            }));
    EXPECT_FALSE(isAsked) << "somebody has the port";
    EXPECT_EQ(second.problem.name, "PORT_NOT_FREE");
    EXPECT_EQ(second.problem.exitStatus, 3);
}

TEST(PushedResult, IsARefusalWhenTheServiceRefuses) {
    auto result = UpToSeven([](LFMobileHelper*) { return Answer{.code = 35}; });
    result.port = "com.vendra.test.refused";
    EXPECT_EQ(AwaitPushedResult(nullptr, result).code, 35);
}

TEST(PushedResult, IsAProblemWhenNothingComes) {
    auto result = UpToSeven([](LFMobileHelper*) { return Asked(); });
    result.port = "com.vendra.test.nothing";
    result.secondsMax = 1;
    const Answer answer = AwaitPushedResult(nullptr, result);
    EXPECT_EQ(answer.problem.name, "NO_RESULT");
    EXPECT_EQ(answer.problem.exitStatus, 1);
    EXPECT_EQ(answer.problem.text,
              "the service took the request, and no result came within 1 seconds");
    EXPECT_EQ(answer.fields.toString(), R"({"asked":1})");
}

}  // namespace
