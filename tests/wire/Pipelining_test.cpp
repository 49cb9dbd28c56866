// Many requests at once: their order, a client that does not read, and what a flood leaves behind.
#include <sys/socket.h>

#include <fstream>
#include <string>

#include "tests/wire/WireTest.h"

namespace wire {
namespace {

using phone::Message;

class PipeliningTest : public WireTest {
protected:
    /// A request that can be told from others by the id of its reply.
    [[nodiscard]] bool sendWithoutWaiting(std::int32_t id) const {
        const auto request = Message(id, kHeaderSize);
        return ::send(client_.privatePort.get(),
                      request.data(),
                      request.size(),
                      MSG_DONTWAIT | MSG_NOSIGNAL) > 0;
    }

    void expectReply(std::int32_t id) const {
        ASSERT_EQ(client_.privatePort.receive().bytes, SimpleReply(id, kBadId)) << id;
    }

    /// Sends until nothing more fits, however often others are served meanwhile.
    [[nodiscard]] std::int32_t sendUntilStuck(const phone::Client& other) const {
        std::int32_t sent = 0;
        for (int refused = 0; refused < 200;) {
            if (sendWithoutWaiting(sent)) {
                ++sent;
                refused = 0;
            } else {
                ++refused;
                EXPECT_EQ(CodeOf(other.privatePort, Message(-1, kHeaderSize)), kBadId);
            }
        }
        return sent;
    }
};

/// Pages that are the daemon's own, in KiB.
std::size_t ResidentMemory(pid_t pid) {
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    for (std::string line; std::getline(status, line);) {
        if (line.starts_with("VmRSS:")) {
            return std::stoul(line.substr(6));
        }
    }
    return 0;
}

/// Sixteen requests, none of them right, no two alike.
std::vector<Bytes> MalformedRequests() {
    std::vector<Bytes> requests;
    for (std::uint32_t i = 0; i < 4; ++i) {
        requests.push_back(Message(static_cast<std::int32_t>(i), kHeaderSize));
        requests.push_back(Message(8683549, 287 - i));
        requests.push_back(Message(8683558, 3104, kComplex | i));
        requests.push_back(WellFormedRequest(kRoutineLayouts[6]));
        Put(requests.back(), 564, 1 + i);
    }
    return requests;
}

}  // namespace

TEST_F(PipeliningTest, AnswersSixteenOutstandingRequestsInOrder) {
    for (std::int32_t id = 0; id < 16; ++id) {
        ASSERT_TRUE(sendWithoutWaiting(id));
    }
    for (std::int32_t id = 0; id < 16; ++id) {
        expectReply(id);
    }
}

TEST_F(PipeliningTest, AnswersAThousandRequestsInOrderWithAsManyOutstandingAsFit) {
    std::int32_t sent = 0;
    for (std::int32_t answered = 0; answered < 1000; ++answered) {
        while (sent < 1000 && sendWithoutWaiting(sent)) {
            ++sent;
        }
        expectReply(answered);
    }
    EXPECT_EQ(sent, 1000);
}

TEST_F(PipeliningTest, LetsAClientThatDoesNotReadWaitAndNobodyElse) {
    const auto other = phone::Client::checkIn();
    const auto sent = sendUntilStuck(other);
    EXPECT_GT(sent, 100);
    for (std::int32_t id = 0; id < sent; ++id) {
        expectReply(id);
    }
    EXPECT_EQ(codeOf(Message(0, kHeaderSize)), kBadId);
}

TEST_F(PipeliningTest, ForgetsAClientThatLeavesWithoutReading) {
    auto leaving = phone::Client::checkIn();
    std::swap(leaving, client_);
    EXPECT_GT(sendUntilStuck(leaving), 0);
    std::swap(leaving, client_);
    leaving.die();
    EXPECT_EQ(codeOf(Message(0, kHeaderSize)), kBadId);
}

TEST_F(PipeliningTest, LeavesNoMemoryBehindAfterAHundredThousandMalformedRequests) {
    const auto requests = MalformedRequests();
    std::size_t memoryWarm = 0;
    for (int round = 0; round < 7000; ++round) {
        for (const Bytes& request : requests) {
            ASSERT_TRUE(client_.privatePort.send(request));
        }
        for (const Bytes& request : requests) {
            ASSERT_EQ(client_.privatePort.receive().header().id,
                      platform::Load<std::int32_t>(request, 20) + 100);
        }
        memoryWarm = round == 700 ? ResidentMemory(daemon_->pid()) : memoryWarm;
    }
    EXPECT_LE(ResidentMemory(daemon_->pid()), memoryWarm + 200);
}

TEST_F(PipeliningTest, LeavesNoMemoryBehindAfterTwentyThousandStrangeDescriptors) {
    const auto [kept, passed] = Pipe();
    std::size_t memoryWarm = 0;
    for (int round = 0; round < 20'000; ++round) {
        const std::vector<int> descriptors(1 + static_cast<std::size_t>(round) % 3, passed.get());
        ASSERT_EQ(codeOf(Message(8683551, kHeaderSize), descriptors), kBadArguments);
        memoryWarm = round == 2000 ? ResidentMemory(daemon_->pid()) : memoryWarm;
    }
    EXPECT_LE(ResidentMemory(daemon_->pid()), memoryWarm + 200);
}

}  // namespace wire
