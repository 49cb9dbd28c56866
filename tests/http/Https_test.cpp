// The HTTP client and the configuration server over real HTTPS. Runs in a private phone root.
#include <gtest/gtest.h>

#include <fstream>

#include "lasd/HttpFetcher.h"
#include "platform/hvu/Gzip_test.h"
#include "tests/http/ConfigurationServer.h"
#include "tests/http/Fetch.h"
#include "tests/http/RawServer.h"
#include "tests/support/PhoneRoot.h"

namespace {

using hvu::Http::CellularUse;
using hvu::Http::ErrorType;
using web::ConfigurationServer;
using web::ErrorOf;
using web::Get;

const std::string kOrigin = ConfigurationServer::kOrigin;

std::string Read(const char* path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

std::string Bundle() {
    return Read("/etc/ssl/certs/ca-certificates.crt");
}

TEST(Https, BringsTheIndexDecodedAndADatabaseAsItIs) {
    const std::string index(5000, 'i');
    const std::string database = Gzip("rows and rows");
    ConfigurationServer server;
    server.put("1/v3/lasd.plist", index);
    server.put("gsm.db.gz", database);
    const auto first = Get(kOrigin + "/1/v3/lasd.plist", CellularUse::kForbidden);
    EXPECT_EQ(first.body, index);
    EXPECT_EQ(first.headers.find("content-encoding")->second, "gzip");
    const auto second = Get(kOrigin + "/gsm.db.gz", CellularUse::kForbidden);
    EXPECT_EQ(second.body, database);
    EXPECT_EQ(second.headers.find("content-type")->second, "application/x-gzip");
    EXPECT_EQ(Get(kOrigin + "/nothing").status, 404);
    EXPECT_EQ(server.takeOutput(),
              "GET /1/v3/lasd.plist 200\nGET /gsm.db.gz 200\nGET /nothing 404\n");
}

TEST(Https, TrustsNobodyElse) {
    for (const char* flaw : {"expired", "other-host", "self-signed", "unknown-authority"}) {
        ConfigurationServer server({"--certificate", flaw});
        server.put("file", "secret");
        const auto fetched = Get(kOrigin + "/file");
        EXPECT_EQ(fetched.error, ErrorType::kNotTrusted) << flaw;
        EXPECT_EQ(fetched.status, 0);
        EXPECT_EQ(fetched.body, "");
        EXPECT_EQ(server.takeOutput(), "") << "nothing was asked";
    }
}

TEST(Https, TrustsTheAuthorityForAsLongAsTheServerIsThere) {
    const std::string before = Bundle();
    ConfigurationServer server;
    EXPECT_NE(Bundle(), before);
    EXPECT_EQ(Get(kOrigin + "/").error, ErrorType::kNone);
    EXPECT_EQ(server.stop(), 0);
    EXPECT_EQ(Bundle(), before);
}

TEST(Https, IsNotWhatAPlainServerSpeaks) {
    const web::RawServer server([](const web::RawConnection& client) {
        (void)client.send("HTTP/1.1 200 OK\r\nContent-Length: 1\r\n\r\nx");
    });
    const std::string address = server.url("/").substr(std::string("http").size());
    EXPECT_EQ(ErrorOf("https" + address), ErrorType::kNotTrusted);
}

TEST(Https, IsNeverLeftByARedirect) {
    const web::RawServer plain([](const web::RawConnection& client) {
        (void)client.send("HTTP/1.1 200 OK\r\nContent-Length: 1\r\n\r\nx");
    });
    ConfigurationServer server(
        {"--redirect", "/out=" + plain.url(), "--redirect", "/in=" + kOrigin + "/file"});
    server.put("file", "there");
    EXPECT_EQ(ErrorOf(kOrigin + "/out"), ErrorType::kRedirectRefused);
    EXPECT_EQ(plain.requests().size(), 0U);
    EXPECT_EQ(Get(kOrigin + "/in").body, "there");
}

TEST(Https, IsEnteredByARedirectAndThenNotLeft) {
    const web::RawServer plain([](const web::RawConnection& client) {
        const std::string target = client.path() == "/in" ? "/out" : "/file";
        (void)client.send("HTTP/1.1 302 Found\r\nLocation: " + kOrigin + target +
                          "\r\nContent-Length: 0\r\n\r\n");
    });
    ConfigurationServer server({"--redirect", "/out=" + plain.url("/again")});
    server.put("file", "there");
    EXPECT_EQ(Get(plain.url("/file")).body, "there");
    EXPECT_EQ(ErrorOf(plain.url("/in")), ErrorType::kRedirectRefused);
}

// The fetcher of the updater, which waits on its own queue's thread as the updater does.

constexpr const char* kFile = "/var/mobile/Library/gsm.db.tmp";

TEST(HttpFetcher, WritesADatabaseUncompressed) {
    phone::ResetMobileHome();
    const std::string rows(300'000, 'r');
    ConfigurationServer server;
    server.put("gsm.db.gz", Gzip(rows) + Gzip("last"));
    auto log = phone::LogReader::journal();
    HttpFetcher fetcher;
    ASSERT_TRUE(fetcher.fetch(kOrigin + "/gsm.db.gz", Networks::kWifiOnly));
    ASSERT_TRUE(fetcher.writeUncompressed(kFile));
    EXPECT_TRUE(Read(kFile) == rows + "last");
    const std::string url = kOrigin + "/gsm.db.gz";
    EXPECT_EQ(log.take(),
              (std::vector<std::string>{"6 - Fetching URL " + url,
                                        "6 - URL retrieved " + url + ", size: " +
                                            std::to_string(fetcher.body().size()) + " "}));
}

TEST(HttpFetcher, LeavesNothingOfADatabaseThatIsDamaged) {
    phone::ResetMobileHome();
    ConfigurationServer server;
    server.put("gsm.db.gz", Gzip(std::string(300'000, 'r')) + "tail");
    HttpFetcher fetcher;
    ASSERT_TRUE(fetcher.fetch(kOrigin + "/gsm.db.gz", Networks::kWifiOnly));
    EXPECT_FALSE(fetcher.writeUncompressed(kFile));
    EXPECT_FALSE(std::filesystem::exists(kFile));
}

TEST(HttpFetcher, TellsWhyAServerIsNotTrusted) {
    ConfigurationServer server({"--certificate", "expired"});
    auto log = phone::LogReader::journal();
    HttpFetcher fetcher;
    EXPECT_FALSE(fetcher.fetch(kOrigin + "/x", Networks::kWifiOnly));
    const auto lines = log.take();
    ASSERT_EQ(lines.size(), 3U);
    EXPECT_EQ(lines[1],
              "5 platform " + kOrigin + "/x: SSL certificate problem: certificate has expired");
    EXPECT_EQ(lines[2],
              "3 - HTTP request failed for URL " + kOrigin +
                  "/x with error server not trusted errorcode 0 (no status)");
}

}  // namespace
