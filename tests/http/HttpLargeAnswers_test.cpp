// Bodies as large as they may be, and larger. Runs in a private phone root; too slow for
// sanitizers.
#include <gtest/gtest.h>

#include <fstream>

#include "platform/Semaphore.h"
#include "platform/hvu/Gzip_test.h"
#include "tests/http/Fetch.h"
#include "tests/http/RawServer.h"

namespace {

using hvu::Http::ErrorType;
using web::RawConnection;
using web::RawServer;

constexpr std::size_t kMiB = 1UL << 20;
constexpr std::size_t kBodyMax = 256 * kMiB;

const std::string kChunked = "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n";

/// A chunk of 1 MiB.
std::string Chunk() {
    return "100000\r\n" + std::string(kMiB, 'x') + "\r\n";
}

TEST(HttpLargeAnswers, AreCutOffWhenTheirBodyTurnsOutTooLarge) {
    std::size_t sent = 0;
    {
        const RawServer server([&sent](const RawConnection& client) {
            const std::string chunk = Chunk();
            for (bool isThere = client.send(kChunked); isThere; ++sent) {
                isThere = client.send(chunk);
            }
        });
        EXPECT_EQ(web::ErrorOf(server.url()), ErrorType::kBodyTooLarge);
    }
    EXPECT_GE(sent, kBodyMax / kMiB);
    EXPECT_LT(sent, kBodyMax / kMiB + 64) << "what the sockets hold beside it";
}

TEST(HttpLargeAnswers, AreCutOffWhenTheyDecodeToTooMuch) {
    const std::string member = Gzip(std::string(kBodyMax / 4, '\0'));
    const std::string bomb = member + member + member + member + Gzip("x");
    const RawServer server([&bomb](const RawConnection& client) {
        (void)client.send("HTTP/1.1 200 OK\r\nContent-Encoding: gzip\r\nContent-Length: " +
                          std::to_string(bomb.size()) + "\r\n\r\n" + bomb);
    });
    EXPECT_EQ(web::ErrorOf(server.url()), ErrorType::kBodyTooLarge);
}

std::size_t PeakOfMemory() {
    std::ifstream status("/proc/self/status");
    for (std::string word; status >> word;) {
        if (word == "VmHWM:") {
            std::size_t kilobytes = 0;
            status >> kilobytes;
            return kilobytes * 1024;
        }
    }
    return 0;
}

/// What is in memory now, from where the peak is counted again.
std::size_t NewPeakOfMemory() {
    std::ofstream("/proc/self/clear_refs") << "5";
    return PeakOfMemory();
}

/// Starts a request whose body is looked at in place.
std::size_t SizeOfBody(const std::string& url) {
    const auto request = hvu::Http::HttpRequest::create(
        hvu::Http::RequestType::kGet, url, {}, hvu::Http::HttpSession::create());
    const auto isDone = platform::Semaphore::create();
    std::size_t size = 0;
    request->setCompletionQueue(platform::SerialQueue("completions"));
    request->setCompletionHandler([&](const std::shared_ptr<hvu::Http::HttpResponse>& response) {
        size = response->takeBody().size();
        isDone->signal();
    });
    request->start({});
    isDone->wait();
    return size;
}

TEST(HttpMemory, HoldsABodyOfUnknownSizeOnce) {
    constexpr std::size_t kChunks = 100;
    const std::string chunk = Chunk();
    const RawServer server([&](const RawConnection& client) {
        (void)client.send(kChunked);
        for (std::size_t i = 0; i < kChunks; ++i) {
            (void)client.send(chunk);
        }
        (void)client.send("0\r\n\r\n");
    });
    const std::size_t before = NewPeakOfMemory();
    EXPECT_EQ(SizeOfBody(server.url()), kChunks * kMiB);
    EXPECT_LT(PeakOfMemory() - before, (kChunks + 8) * kMiB);
}

}  // namespace
