#include "lasd/HttpFetcher.h"

#include <gtest/gtest.h>

#include "platform/RunLoop.h"
#include "platform/hvu/Gzip_test.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"
#include "platform/sim/SimHttp.h"

namespace {

using hvu::Http::ErrorType;
using platform::LogLevel;

const std::string kUrl = "https://configuration.vendra.example/1/v3/gsm.gz";
const std::string kFile = "/var/mobile/Library/gsm.tmp";
const hvu::Http::HeaderMap kGzipType{{"Content-Type", "application/x-gzip"}};

sim::LogLine Info(std::string text) {
    return {.level = LogLevel::kInfo, .text = std::move(text)};
}

sim::LogLine Error(std::string text) {
    return {.level = LogLevel::kError, .text = std::move(text)};
}

/// The line that ends a fetch, or a write, that was refused.
sim::LogLine LastLine() {
    return sim::UnifiedLog().empty() ? Error("(no line)") : sim::UnifiedLog().back();
}

class HttpFetcherTest : public testing::Test {
protected:
    HttpFetcherTest() { sim::Reset(); }

    bool fetch(Networks networks = Networks::kAny) { return fetcher_.fetch(kUrl, networks); }

    bool fetchAnswer(sim::HttpAnswer answer) {
        sim::ServeUrl(kUrl, std::move(answer));
        return fetch();
    }

    /// A body of gzip data lies in memory.
    void fetchGzip(std::string body) {
        EXPECT_TRUE(fetchAnswer({.headers = kGzipType, .body = std::move(body)}));
        sim::ClearLogs();
    }

    HttpFetcher fetcher_;
};

std::string Text(const std::vector<std::byte>& bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

std::string FileContents() {
    const auto file = sim::FileAt(kFile);
    return file ? file->contents : "(no file)";
}

TEST_F(HttpFetcherTest, KeepsTheBodyOfAnAnswer) {
    EXPECT_TRUE(fetchAnswer({.body = "versions"}));
    EXPECT_EQ(Text(fetcher_.body()), "versions");
    const std::vector expected{Info("Fetching URL " + kUrl),
                               Info("URL retrieved " + kUrl + ", size: 8 ")};
    EXPECT_EQ(sim::UnifiedLog(), expected);
}

TEST_F(HttpFetcherTest, RefusesAnEmptyUrlBeforeAnythingElse) {
    EXPECT_FALSE(fetcher_.fetch("", Networks::kAny));
    EXPECT_EQ(sim::UnifiedLog(), std::vector{Error("URL is empty")});
    EXPECT_TRUE(sim::HttpRequests().empty());
}

TEST_F(HttpFetcherTest, NamesAUrlThatCannotBeUsed) {
    EXPECT_FALSE(fetcher_.fetch("file:///etc/passwd", Networks::kAny));
    const std::vector expected{Info("Fetching URL file:///etc/passwd"),
                               Error("Cannot create HTTP request for URL file:///etc/passwd")};
    EXPECT_EQ(sim::UnifiedLog(), expected);
}

TEST_F(HttpFetcherTest, AsksForGzipOnItsOwnQueue) {
    EXPECT_TRUE(fetchAnswer({.body = "x"}));
    ASSERT_EQ(sim::HttpRequests().size(), 1U);
    const auto& request = sim::HttpRequests()[0];
    EXPECT_EQ(request.url, kUrl);
    EXPECT_EQ(request.headers, (hvu::Http::HeaderMap{{"Accept-Encoding", "gzip"}}));
    EXPECT_EQ(request.queue, "com.vendra.httpdownloadqueue");
    EXPECT_EQ(request.cellularUse, hvu::Http::CellularUse::kAllowed);
}

TEST_F(HttpFetcherTest, KeepsOffTheCellularNetworkWhenAsked) {
    sim::AttachToNetwork(sim::Network::kCellular);
    sim::ServeUrl(kUrl, {.body = "x"});
    EXPECT_FALSE(fetch(Networks::kWifiOnly));
    EXPECT_EQ(sim::HttpRequests().at(0).cellularUse, hvu::Http::CellularUse::kForbidden);
    EXPECT_EQ(LastLine(),
              Error("HTTP request failed for URL " + kUrl +
                    " with error cellular network forbidden errorcode 0 (no status)"));
    EXPECT_TRUE(fetch(Networks::kAny));
}

TEST_F(HttpFetcherTest, SaysThatNoAnswerCame) {
    EXPECT_FALSE(fetchAnswer({.kind = sim::HttpAnswer::Kind::kNoResponse}));
    EXPECT_EQ(LastLine(), Error("Did not receive HTTP response!"));
}

TEST_F(HttpFetcherTest, RefusesEveryStatusBut200) {
    const std::vector<std::pair<int, std::string>> statuses{{201, "created"},
                                                            {204, "no content"},
                                                            {206, "partial content"},
                                                            {301, "moved permanently"},
                                                            {304, "not modified"},
                                                            {404, "not found"},
                                                            {503, "service unavailable"},
                                                            {599, "unknown"}};
    for (const auto& [status, text] : statuses) {
        EXPECT_FALSE(fetchAnswer({.status = status, .headers = kGzipType, .body = "page"}));
        EXPECT_EQ(LastLine(),
                  Error("HTTP request failed for URL " + kUrl + " with error no error errorcode " +
                        std::to_string(status) + " (" + text + ")"));
        EXPECT_TRUE(fetcher_.body().empty());
    }
}

TEST_F(HttpFetcherTest, RefusesAnAnswerThatDidNotComeWhole) {
    EXPECT_FALSE(fetchAnswer({.body = "part", .error = ErrorType::kConnectionLost}));
    EXPECT_EQ(LastLine(),
              Error("HTTP request failed for URL " + kUrl +
                    " with error connection lost errorcode 200 (OK)"));
    EXPECT_TRUE(fetcher_.body().empty());
}

TEST_F(HttpFetcherTest, CountsAnEmptyBodyAsFailure) {
    EXPECT_FALSE(fetchAnswer({.headers = kGzipType, .body = ""}));
    EXPECT_EQ(LastLine(), Info("URL retrieved " + kUrl + ", size: 0 "));
}

TEST_F(HttpFetcherTest, WaitsAsLongAsTheAnswerTakesAndHoldsUpNobodyElse) {
    sim::ServeUrl(kUrl, {.body = "x", .delay = 3600});
    const platform::SerialQueue updater("LASDUpdater");
    double fetchedAt = 0;
    updater.async([&] { fetchedAt = fetch() ? sim::Now() : -1; });
    double servedAt = 0;
    platform::RunLoop::current().after(10, [&] { servedAt = sim::Now(); });
    sim::Settle();
    EXPECT_EQ(fetchedAt, 3600);
    EXPECT_EQ(servedAt, 10);
}

TEST_F(HttpFetcherTest, WaitsForEverWhenNothingEndsTheRequest) {
    sim::ServeUrl(kUrl, {.kind = sim::HttpAnswer::Kind::kNever});
    EXPECT_THROW((void)fetch(), sim::NothingLeftToHappen);
}

TEST_F(HttpFetcherTest, BeginsASecondFetchEmpty) {
    fetchGzip(Gzip("old"));
    EXPECT_FALSE(fetchAnswer({.status = 404}));
    EXPECT_TRUE(fetcher_.body().empty());
    EXPECT_TRUE(fetchAnswer({.body = "new"}));
    EXPECT_FALSE(fetcher_.writeUncompressed(kFile));
    EXPECT_EQ(LastLine(), Error("Cannot find Content-Type header in response!"));
}

TEST_F(HttpFetcherTest, WritesNothingWithoutAnAnswer) {
    EXPECT_FALSE(fetcher_.writeUncompressed(kFile));
    EXPECT_EQ(LastLine(), Error("Cannot uncompress downloaded buffer without a response!"));
    EXPECT_FALSE(sim::FileAt(kFile));
}

TEST_F(HttpFetcherTest, FindsTheContentTypeInAnySpelling) {
    for (const char* name : {"content-type", "CONTENT-TYPE", "Content-type"}) {
        EXPECT_TRUE(fetchAnswer(
            {.headers = {{name, "application/gzip; charset=binary"}}, .body = Gzip(name)}));
        EXPECT_TRUE(fetcher_.writeUncompressed(kFile));
        EXPECT_EQ(FileContents(), name);
    }
}

TEST_F(HttpFetcherTest, GoesByTheContentTypeAndNotByTheData) {
    for (const std::string type : {"application/octet-stream", "application/x-GZIP", ""}) {
        EXPECT_TRUE(fetchAnswer({.headers = {{"Content-Type", type}}, .body = Gzip("x")}));
        EXPECT_FALSE(fetcher_.writeUncompressed(kFile));
        EXPECT_EQ(
            LastLine(),
            Error("Expected to find gzip in Content-Type header, found " + type + " instead"));
        EXPECT_FALSE(sim::FileAt(kFile));
    }
}

TEST_F(HttpFetcherTest, ReplacesWhatTheFileHeld) {
    fetchGzip(Gzip("new") + Gzip(" and more"));
    sim::MakeFile(kFile,
                  {.mode = sim::kRegular | 0600, .owner = 501, .contents = "a long old text"});
    EXPECT_TRUE(fetcher_.writeUncompressed(kFile));
    EXPECT_EQ(FileContents(), "new and more");
    EXPECT_EQ(sim::FileAt(kFile)->owner, 501U);
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

TEST_F(HttpFetcherTest, SaysWhyAFileCannotBeOpened) {
    fetchGzip(Gzip("x"));
    EXPECT_FALSE(fetcher_.writeUncompressed("/nowhere/file"));
    const std::vector expected{
        Error("Cannot open output file /nowhere/file: No such file or directory")};
    EXPECT_EQ(sim::UnifiedLog(), expected);
}

TEST_F(HttpFetcherTest, FollowsNoLinkAtTheEndOfThePath) {
    fetchGzip(Gzip("x"));
    sim::MakeFile("/tmp/precious", {.mode = sim::kRegular | 0600, .contents = "kept"});
    sim::MakeLink(kFile, "/tmp/precious", 501);
    EXPECT_FALSE(fetcher_.writeUncompressed(kFile));
    EXPECT_EQ(LastLine(),
              Error("Cannot open output file " + kFile + ": Too many levels of symbolic links"));
    EXPECT_EQ(sim::FileAt("/tmp/precious")->contents, "kept");
    EXPECT_TRUE(sim::FileAt(kFile)->is(sim::kLink));
}

TEST_F(HttpFetcherTest, RemovesWhatItCouldNotDecode) {
    const std::string whole = Gzip("a text that is long enough to be cut");
    for (const std::string& body :
         {std::string("no gzip data"), whole.substr(0, whole.size() - 1), whole + "tail"}) {
        fetchGzip(body);
        EXPECT_FALSE(fetcher_.writeUncompressed(kFile));
        const std::vector expected{Error("Could not uncompress HTTP response to " + kFile + "!")};
        EXPECT_EQ(sim::UnifiedLog(), expected);
        EXPECT_FALSE(sim::FileAt(kFile));
    }
}

TEST_F(HttpFetcherTest, RemovesWhatTheSystemCouldNotKeep) {
    for (const char* call : {"OutputFile.write", "OutputFile.close"}) {
        fetchGzip(Gzip("some text"));
        sim::FailCall(call, 1);
        EXPECT_FALSE(fetcher_.writeUncompressed(kFile));
        EXPECT_EQ(sim::FailedCall(), call);
        EXPECT_EQ(LastLine(), Error("Could not uncompress HTTP response to " + kFile + "!"));
        EXPECT_FALSE(sim::FileAt(kFile));
    }
}

TEST_F(HttpFetcherTest, SaysThatAPartStaysBehind) {
    fetchGzip("no gzip data");
    sim::FailCall("PathAccess.remove", 1);
    EXPECT_FALSE(fetcher_.writeUncompressed(kFile));
    const std::vector expected{
        Error("Could not uncompress HTTP response to " + kFile + "!"),
        Error("Failed to remove partially uncompressed file at " + kFile + ": Input/output error")};
    EXPECT_EQ(sim::UnifiedLog(), expected);
}

TEST_F(HttpFetcherTest, FailsWithOneErrorLineWhicheverCallFails) {
    sim::ServeUrl(kUrl, {.headers = kGzipType, .body = Gzip("text")});
    for (unsigned n = 1;; ++n) {
        sim::ClearLogs();
        sim::FailCall(n);
        HttpFetcher fetcher;
        const bool isDone = fetcher.fetch(kUrl, Networks::kAny) && fetcher.writeUncompressed(kFile);
        if (sim::FailedCall().empty()) {
            EXPECT_TRUE(isDone);
            EXPECT_GT(n, 5U);
            break;
        }
        EXPECT_FALSE(isDone) << sim::FailedCall();
        EXPECT_EQ(LastLine().level, LogLevel::kError) << sim::FailedCall();
    }
}

}  // namespace
