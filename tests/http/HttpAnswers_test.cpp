// What the HTTP client makes of answers, the strange ones included. Runs in a private phone root.
#include <gtest/gtest.h>

#include <filesystem>

#include "platform/hvu/Gzip_test.h"
#include "tests/http/Fetch.h"
#include "tests/http/RawServer.h"
#include "tests/support/PhoneRoot.h"

namespace {

using hvu::Http::ErrorType;
using web::ErrorOf;
using web::Get;
using web::RawConnection;
using web::RawServer;

/// An answer with status 200 of these header lines.
std::string Answer(const std::string& headerLines, const std::string& body) {
    return "HTTP/1.1 200 OK\r\nContent-Length: " + std::to_string(body.size()) + "\r\n" +
           headerLines + "\r\n" + body;
}

RawServer::Script Say(std::string text) {
    return [text = std::move(text)](const RawConnection& client) { (void)client.send(text); };
}

/// Sends the same chunk for as long as the client takes it, behind this header.
RawServer::Script SayForEver(std::string header, std::string chunk) {
    return [header = std::move(header), chunk = std::move(chunk)](const RawConnection& client) {
        bool isThere = client.send(header);
        while (isThere) {
            isThere = client.send(chunk);
        }
    };
}

std::string Chunk(std::size_t size) {
    char digits[20];
    (void)std::snprintf(digits, sizeof digits, "%zx", size);
    return std::string(digits) + "\r\n" + std::string(size, 'x') + "\r\n";
}

TEST(HttpAnswers, BringBodyHeadersAndStatus) {
    const RawServer server(
        Say(Answer("content-type: application/x-gzip\r\nX-Two: a\r\nx-two: b\r\n", "the body")));
    const auto fetched = Get(server.url("/file"));
    EXPECT_TRUE(fetched.isOnQueue);
    EXPECT_EQ(fetched.error, ErrorType::kNone);
    EXPECT_EQ(fetched.status, 200);
    EXPECT_EQ(fetched.body, "the body");
    EXPECT_EQ(fetched.headers.find("Content-Type")->second, "application/x-gzip");
    EXPECT_EQ(fetched.headers.find("X-TWO")->second, "a, b");
}

TEST(HttpAnswers, AreAskedForWithTheHeadersGivenAndWithoutAProxy) {
    const RawServer server(Say(Answer("", "x")));
    setenv("http_proxy", "http://127.0.0.1:1", 1);
    setenv("ALL_PROXY", "http://127.0.0.1:1", 1);
    EXPECT_EQ(Get(server.url("/a/b?c")).status, 200);
    unsetenv("http_proxy");
    unsetenv("ALL_PROXY");
    const auto request = server.requests().at(0);
    EXPECT_TRUE(request.starts_with("GET /a/b?c HTTP/1.1\r\n")) << request;
    EXPECT_NE(request.find("\r\nAccept-Encoding: gzip\r\n"), std::string::npos) << request;
}

TEST(HttpAnswers, KeepEveryStatus) {
    for (const int status : {204, 304, 404, 500}) {
        const bool hasBody = status >= 400;
        const RawServer server(Say("HTTP/1.1 " + std::to_string(status) + " Text\r\n" +
                                   (hasBody ? "Content-Length: 4\r\n\r\npage" : "\r\n")));
        const auto fetched = Get(server.url());
        EXPECT_EQ(fetched.error, ErrorType::kNone) << status;
        EXPECT_EQ(fetched.status, status);
        EXPECT_EQ(fetched.body, hasBody ? "page" : "");
    }
}

TEST(HttpAnswers, MayBeEmpty) {
    const RawServer server(Say(Answer("Content-Encoding: gzip\r\n", "")));
    const auto fetched = Get(server.url());
    EXPECT_EQ(fetched.error, ErrorType::kNone);
    EXPECT_EQ(fetched.status, 200);
    EXPECT_EQ(fetched.body, "");
}

TEST(HttpAnswers, AreDecodedUnlessTheyAreGzipFiles) {
    const std::string zipped = Gzip("first ") + Gzip("second");
    const RawServer server([&](const RawConnection& client) {
        const std::string encoding = client.path() == "/x" ? "X-GZip" : "gzip";
        const std::string type = client.path() == "/file" ? "application/x-gzip" : "text/xml";
        (void)client.send(
            Answer("Content-Encoding: " + encoding + "\r\nContent-Type: " + type + "\r\n", zipped));
    });
    EXPECT_EQ(Get(server.url("/index")).body, "first second");
    EXPECT_EQ(Get(server.url("/x")).body, "first second");
    EXPECT_EQ(Get(server.url("/file")).body, zipped);
}

TEST(HttpAnswers, AreRefusedWhenTheirEncodingCannotBeUndone) {
    const std::string zipped = Gzip("a text of some length");
    const std::string encoding = "Content-Encoding: gzip\r\n";
    for (const auto& answer : {Answer("Content-Encoding: br\r\n", zipped),
                               Answer("Content-Encoding: gzip, gzip\r\n", zipped),
                               Answer(encoding, zipped.substr(0, zipped.size() - 2)),
                               Answer(encoding, zipped + "tail"),
                               Answer(encoding, "plain text")}) {
        const RawServer server(Say(answer));
        EXPECT_EQ(ErrorOf(server.url()), ErrorType::kBadAnswer) << answer;
    }
}

TEST(HttpAnswers, AreNotWholeWhenTheConnectionEnds) {
    for (const std::string answer :
         {"HTTP/1.1 200 OK\r\nContent-Length: 100\r\n\r\nhalf",
          "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n5\r\nhalf",
          "HTTP/1.1 200 OK\r\nContent-Le",
          ""}) {
        const RawServer server(Say(answer));
        EXPECT_EQ(ErrorOf(server.url()), ErrorType::kConnectionLost) << answer;
    }
}

TEST(HttpAnswers, AreRefusedWhenTheyAreNone) {
    for (const std::string answer :
         {"220 mail.example ESMTP\r\n", "\r\n\r\n\r\n", "HTTP/1.1 banana\r\n\r\n"}) {
        const RawServer server(Say(answer));
        const auto error = ErrorOf(server.url());
        EXPECT_TRUE(error == ErrorType::kBadAnswer || error == ErrorType::kConnectionLost)
            << answer;
    }
}

TEST(HttpAnswers, AreRefusedBeforeTheirBodyWhenItIsTooLarge) {
    const RawServer server(SayForEver("HTTP/1.1 200 OK\r\nContent-Length: 10737418240\r\n\r\n",
                                      std::string(65536, 'x')));
    const auto fetched = Get(server.url());
    EXPECT_EQ(fetched.error, ErrorType::kBodyTooLarge);
    EXPECT_EQ(fetched.status, 200);
    EXPECT_EQ(fetched.body, "");
}

TEST(HttpAnswers, MayNotHaveHeadersWithoutEnd) {
    const RawServer lines(SayForEver("HTTP/1.1 200 OK\r\n", "X-Line: value\r\n"));
    EXPECT_EQ(ErrorOf(lines.url()), ErrorType::kBadAnswer);
    const RawServer interim(SayForEver("", "HTTP/1.1 100 Continue\r\n\r\n"));
    EXPECT_EQ(ErrorOf(interim.url()), ErrorType::kBadAnswer);
}

TEST(HttpAnswers, DoNotTakeTrailersForHeaders) {
    const RawServer server(
        Say("HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n"
            "4\r\nbody\r\n0\r\nContent-Type: application/gzip\r\n\r\n"));
    const auto fetched = Get(server.url());
    EXPECT_EQ(fetched.body, "body");
    EXPECT_FALSE(fetched.headers.contains("Content-Type"));
}

TEST(HttpAnswers, MissWhenNobodyListens) {
    EXPECT_EQ(ErrorOf("http://127.0.0.1:1/"), ErrorType::kCannotConnect);
    EXPECT_EQ(ErrorOf("http://nobody.vendra.example/"), ErrorType::kHostNotFound);
}

TEST(HttpAnswers, AreMissedInTheLogWithoutTheQuery) {
    auto log = phone::LogReader::journal();
    EXPECT_EQ(ErrorOf("http://127.0.0.1:1/reverse?lat=51.5"), ErrorType::kCannotConnect);
    const auto lines = log.take();
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_TRUE(lines[0].starts_with("5 platform http://127.0.0.1:1/reverse: ")) << lines[0];
    EXPECT_EQ(lines[0].find("51.5"), std::string::npos);
}

std::size_t EntriesOf(const char* folder) {
    const std::filesystem::directory_iterator entries(folder);
    return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
}

TEST(HttpAnswers, LeaveNoThreadsAndDescriptorsBehind) {
    const RawServer server(Say(Answer("", "x")));
    const std::size_t threads = EntriesOf("/proc/self/task");
    EXPECT_EQ(Get(server.url()).status, 200);
    const std::size_t descriptors = EntriesOf("/proc/self/fd");
    for (int i = 0; i < 20; ++i) {
        EXPECT_EQ(Get(server.url()).status, 200);
    }
    // What served the requests may be about to end.
    EXPECT_TRUE(phone::Eventually([&] { return EntriesOf("/proc/self/task") <= threads; }));
    EXPECT_LE(EntriesOf("/proc/self/fd"), descriptors);
}

// Redirects.

std::string Redirect(const std::string& location, int status = 302) {
    return "HTTP/1.1 " + std::to_string(status) + " Elsewhere\r\nLocation: " + location +
           "\r\nContent-Length: 0\r\n\r\n";
}

/// Leads from /N to /N-1, and answers at /0.
void CountDown(const RawConnection& client) {
    const int left = std::atoi(client.path().c_str() + 1);
    (void)client.send(left == 0 ? Answer("X-Last: yes\r\n", "there")
                                : Redirect(std::to_string(left - 1)));
}

TEST(HttpRedirects, AreFollowedFiveTimes) {
    const RawServer server(CountDown);
    const auto fetched = Get(server.url("/5"));
    EXPECT_EQ(fetched.status, 200);
    EXPECT_EQ(fetched.body, "there");
    EXPECT_FALSE(fetched.headers.contains("Location")) << "headers of the last answer alone";
    EXPECT_TRUE(fetched.headers.contains("X-Last"));
    EXPECT_EQ(server.requests().size(), 6U);
}

TEST(HttpRedirects, EndAtTheSixthAndInALoop) {
    const RawServer server(CountDown);
    const auto fetched = Get(server.url("/6"));
    EXPECT_EQ(fetched.error, ErrorType::kRedirectRefused);
    EXPECT_EQ(fetched.status, 302);
    const RawServer loop(Say(Redirect("/again", 301)));
    EXPECT_EQ(ErrorOf(loop.url()), ErrorType::kRedirectRefused);
    EXPECT_EQ(loop.requests().size(), 6U);
}

TEST(HttpRedirects, LeadToNoOtherScheme) {
    for (const std::string target : {"file:///etc/passwd",
                                     "ftp://127.0.0.1/",
                                     "gopher://127.0.0.1:1/x",
                                     "javascript:x",
                                     "http://"}) {
        const RawServer server(Say(Redirect(target, 307)));
        const auto fetched = Get(server.url());
        EXPECT_EQ(fetched.error, ErrorType::kRedirectRefused) << target;
        EXPECT_EQ(fetched.body, "");
    }
}

TEST(HttpRedirects, WithoutATargetAreAnswers) {
    const RawServer server(Say("HTTP/1.1 302 Found\r\nContent-Length: 4\r\n\r\npage"));
    const auto fetched = Get(server.url());
    EXPECT_EQ(fetched.error, ErrorType::kNone);
    EXPECT_EQ(fetched.status, 302);
}

TEST(HttpRedirects, DoNotMakeUsReadTheirBody) {
    const RawServer last(Say(Answer("", "there")));
    const RawServer first(SayForEver(
        "HTTP/1.1 308 Moved\r\nLocation: " + last.url() + "\r\nTransfer-Encoding: chunked\r\n\r\n",
        Chunk(4096)));
    EXPECT_EQ(Get(first.url()).body, "there");
}

}  // namespace
