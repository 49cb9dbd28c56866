// What servers may not do: keep a request for ever, or the process from leaving. Built with short
// times, and run in a private phone root.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include "tests/http/ConfigurationServer.h"
#include "tests/http/Fetch.h"
#include "tests/http/RawServer.h"
#include "tests/support/PhoneRoot.h"

namespace {

using hvu::Http::ErrorType;
using web::ErrorOf;
using web::Get;
using web::RawConnection;
using web::RawServer;

constexpr int kLongMs = 60'000;

/// Says this, and then nothing for as long as the client waits.
RawServer::Script SayAndWait(std::string text) {
    return [text = std::move(text)](const RawConnection& client) {
        (void)client.send(text);
        client.pause(kLongMs);
    };
}

TEST(HttpTimes, EndAConnectionThatIsNeverMade) {
    EXPECT_EQ(ErrorOf("http://198.51.100.99/"), ErrorType::kTimedOut);
}

TEST(HttpTimes, EndALookUpThatIsNeverAnswered) {
    platform::OwnedFd nameServer;
    web::InGateway([&] {
        nameServer.reset(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_port = htons(53);
        ASSERT_EQ(bind(nameServer.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    });
    const auto error = ErrorOf("http://nobody.vendra.example/");
    EXPECT_TRUE(error == ErrorType::kTimedOut || error == ErrorType::kHostNotFound);
}

TEST(HttpTimes, EndAHandshakeThatIsNeverFinished) {
    const RawServer server(SayAndWait(""));
    EXPECT_EQ(ErrorOf("https" + server.url().substr(std::string("http").size())),
              ErrorType::kTimedOut);
}

TEST(HttpTimes, EndAnAnswerThatNeverBegins) {
    const RawServer server(SayAndWait(""));
    const auto fetched = Get(server.url());
    EXPECT_EQ(fetched.error, ErrorType::kTimedOut);
    EXPECT_EQ(fetched.status, 0);
}

TEST(HttpTimes, EndAnAnswerThatStopsInTheMiddle) {
    const RawServer server(SayAndWait("HTTP/1.1 200 OK\r\nContent-Length: 100\r\n\r\nhalf"));
    const auto fetched = Get(server.url());
    EXPECT_EQ(fetched.error, ErrorType::kTimedOut);
    EXPECT_EQ(fetched.status, 200);
}

TEST(HttpTimes, EndAnAnswerThatTricklesForEver) {
    const RawServer server([](const RawConnection& client) {
        bool isThere = client.send("HTTP/1.1 200 OK\r\nContent-Length: 1000000\r\n\r\n");
        while (isThere) {
            isThere = client.send("drop");
            client.pause(100);
        }
    });
    EXPECT_EQ(ErrorOf(server.url()), ErrorType::kTimedOut);
}

/// The exit status of the program that fetches, or minus the signal's number.
int RunFetchAndLeave(const std::string& url, int fetches, int microseconds) {
    const std::string program = phone::ProgramPath("fetch_and_leave");
    const std::string count = std::to_string(fetches);
    const std::string time = std::to_string(microseconds);
    const pid_t child = fork();
    if (child == 0) {
        execl(program.c_str(), program.c_str(), url.c_str(), count.c_str(), time.c_str(), nullptr);
        _exit(127);
    }
    int status = 0;
    (void)waitpid(child, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

TEST(HttpExit, IsPossibleInTheMiddleOfARequest) {
    web::ConfigurationServer server;
    server.put("file", std::string(4UL << 20, 'x'));
    const std::string url = std::string(web::ConfigurationServer::kOrigin) + "/file";
    for (int round = 0; round < 40; ++round) {
        ASSERT_EQ(RunFetchAndLeave(url, 3, 1000 * round), 0) << round;
    }
    const RawServer silent(SayAndWait(""));
    EXPECT_EQ(RunFetchAndLeave(silent.url(), 3, 50'000), 0);
}

TEST(HttpModule, MayBeAbsent) {
    const std::string module = "/usr/lib/linefold/libLinefoldHttp.so";
    ASSERT_EQ(rename(module.c_str(), (module + ".away").c_str()), 0);
    auto log = phone::LogReader::journal();
    EXPECT_EQ(RunFetchAndLeave("http://127.0.0.1:1/", 1, -1), 3) << "no response";
    const auto lines = log.take();
    ASSERT_EQ(rename((module + ".away").c_str(), module.c_str()), 0);
    EXPECT_EQ(
        lines,
        (std::vector<std::string>{"3 platform no HTTP client: " + module + " cannot be used"}));
    EXPECT_EQ(RunFetchAndLeave("http://127.0.0.1:1/", 1, -1), 0) << "a response, which is an error";
}

}  // namespace
