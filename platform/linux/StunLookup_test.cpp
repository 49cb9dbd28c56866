#include "platform/linux/StunLookup.h"

#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <stdexcept>

#include "tests/http/RawServer.h"
#include "tests/location/StunServer.h"

using namespace platform;

namespace {

using stun::Request;

/// A look-up under way, which is over within 20 seconds.
class Lookup {
public:
    explicit Lookup(const StunServer& server)
        : promise_(std::make_shared<std::promise<StunAnswer>>()), future_(promise_->get_future()) {
        StartStunLookup(server, share_, [promise = promise_](StunAnswer answer) {
            promise->set_value(std::move(answer));
        });
    }

    [[nodiscard]] StunAnswer answer() {
        if (future_.wait_for(std::chrono::seconds(20)) != std::future_status::ready) {
            throw std::runtime_error("no answer within 20 s");
        }
        return future_.get();
    }

private:
    const std::shared_ptr<int> share_ = std::make_shared<int>();
    const std::shared_ptr<std::promise<StunAnswer>> promise_;
    std::future<StunAnswer> future_;
};

StunAnswer Ask(const stun::Server& server, const std::string& host = "127.0.0.1") {
    return Lookup({.host = host, .port = server.port()}).answer();
}

TEST(StunLookup, GivesTheAddressThatTheServerTells) {
    const stun::Server server(
        [](const Request& request, int) { request.send(request.success(7)); });
    const StunAnswer answer = Ask(server);
    EXPECT_EQ(answer.address, "192.0.2.7");
    EXPECT_EQ(answer.error, "");
    EXPECT_EQ(server.requests(), 1);
}

TEST(StunLookup, SpeaksIPv6) {
    const stun::Server server([](const Request& request, int) { request.send(request.success(7)); },
                              "::1");
    EXPECT_EQ(Ask(server, "::1").address, "192.0.2.7");
}

TEST(StunLookup, ResolvesNames) {
    const stun::Server server(
        [](const Request& request, int) { request.send(request.success(7)); });
    EXPECT_EQ(Ask(server, "phone").address, "192.0.2.7");
}

TEST(StunLookup, TriesTheNextAddressWhenOneRefuses) {
    const stun::Server server(
        [](const Request& request, int) { request.send(request.success(7)); });
    EXPECT_EQ(Ask(server, "localhost").address, "192.0.2.7") << "which is ::1 as well";
}

TEST(StunLookup, AsksAgainWithTheSameTransaction) {
    std::vector<stun::Bytes> asked;
    const stun::Server server([&](const Request& request, int count) {
        asked.push_back(request.datagram());
        if (count == 2) {
            request.send(request.success(7));
        }
    });
    EXPECT_EQ(Ask(server).address, "192.0.2.7");
    EXPECT_EQ(asked.at(0), asked.at(1));
}

TEST(StunLookup, UsesANewTransactionEachTime) {
    std::vector<stun::Bytes> asked;
    const stun::Server server([&](const Request& request, int) {
        asked.push_back(request.datagram());
        request.send(request.success(7));
    });
    (void)Ask(server);
    (void)Ask(server);
    EXPECT_NE(asked.at(0), asked.at(1));
}

TEST(StunLookup, HearsTheAnswerAmongWhatIsNone) {
    const stun::Server server([](const Request& request, int) {
        request.sendFromElsewhere(request.success(66));
        request.send(stun::Bytes(64, 0xA5));
        request.send({});
        auto other = request.success(67);
        other[19] ^= 1;
        request.send(other);
        request.send(stun::Bytes(1400, 0));
        request.send(request.success(7));
        request.send(request.success(68));
    });
    EXPECT_EQ(Ask(server).address, "192.0.2.7");
}

TEST(StunLookup, GivesTheServersError) {
    const stun::Server server([](const Request& request, int) {
        request.send(request.response(stun::Attribute(0x0009, {0, 0, 4, 20}), 0x0111));
    });
    const StunAnswer answer = Ask(server);
    EXPECT_EQ(answer.address, "");
    EXPECT_EQ(answer.error, "the STUN server refused with error 420");
}

TEST(StunLookup, IsAnErrorAtOnceWhenNobodyListens) {
    EXPECT_EQ(Lookup({.host = "127.0.0.1", .port = "9"}).answer().error,
              "the STUN server cannot be reached: Connection refused");
    EXPECT_EQ(Lookup({.host = "2001:db8::1", .port = "9"}).answer().error,
              "the STUN server cannot be reached: Network is unreachable");
}

TEST(StunLookup, IsAnErrorWhenTheNameIsNone) {
    EXPECT_EQ(Lookup({.host = std::string(300, 'x'), .port = "9"})
                  .answer()
                  .error.find("the STUN server's name cannot be resolved: "),
              0U);
}

// All of them side by side, since each of them takes its whole time.
TEST(StunLookup, IsAnErrorWhenNoAnswerComes) {
    const stun::Server silent([](const Request&, int) {});
    const stun::Server garbage(
        [](const Request& request, int) { request.send(stun::Bytes(64, 0xA5)); });
    const stun::Server otherTransaction([](const Request& request, int) {
        auto answer = request.success(66);
        answer[8] ^= 1;
        request.send(answer);
    });
    const stun::Server elsewhere(
        [](const Request& request, int) { request.sendFromElsewhere(request.success(66)); });
    // A name server that takes questions and never answers: 198.51.100.1 is in resolv.conf.
    OwnedFd nameServer;
    web::InGateway([&nameServer] {
        nameServer.reset(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_port = htons(53);
        EXPECT_EQ(
            bind(nameServer.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    });
    std::vector<Lookup> lookups;
    for (const stun::Server* const server : {&silent, &garbage, &otherTransaction, &elsewhere}) {
        lookups.emplace_back(StunServer{.host = "127.0.0.1", .port = server->port()});
    }
    lookups.emplace_back(StunServer{.host = "stun.example", .port = "3478"});
    for (Lookup& lookup : lookups) {
        EXPECT_EQ(lookup.answer().error, "the STUN server does not answer");
    }
    EXPECT_LE(silent.requests(), 4) << "at 0, 0.5, 1.5 and 3.5 seconds";
    EXPECT_GE(silent.requests(), 3) << "the last of them may come late on a busy machine";
}

std::string Parsed(std::string_view text) {
    const auto server = ParseStunServer(text);
    return server ? server->host + " " + server->port : "none";
}

TEST(ParseStunServer, TakesHostsAndAddressesWithAndWithoutAPort) {
    EXPECT_EQ(Parsed("stun.example"), "stun.example 3478");
    EXPECT_EQ(Parsed("stun.example:19302"), "stun.example 19302");
    EXPECT_EQ(Parsed("192.0.2.1:1"), "192.0.2.1 1");
    EXPECT_EQ(Parsed("2001:db8::1"), "2001:db8::1 3478");
    EXPECT_EQ(Parsed("[2001:db8::1]"), "2001:db8::1 3478");
    EXPECT_EQ(Parsed("[2001:db8::1]:65535"), "2001:db8::1 65535");
    EXPECT_EQ(Parsed("::"), ":: 3478");
}

TEST(ParseStunServer, RefusesAllElse) {
    for (const char* const text : {"",
                                   ":",
                                   ":3478",
                                   "stun.example:",
                                   "stun.example:0",
                                   "stun.example:65536",
                                   "stun.example:99999999999",
                                   "stun.example:x",
                                   "stun.example:-1",
                                   "[",
                                   "[]",
                                   "[]:1",
                                   "[::1",
                                   "[::1]x",
                                   "[::1]x:1",
                                   "[::1]:",
                                   "[::1]:x"}) {
        EXPECT_EQ(Parsed(text), "none") << text;
    }
}

}  // namespace
