// Downloads one URL into memory, and on request writes the gzip data that came into a file.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/SerialQueue.h"
#include "platform/hvu/Http.h"

enum class Networks : bool { kAny, kWifiOnly };

/// Made for one download. Every failure is told in one error line and never tried again.
class HttpFetcher final {
public:
    HttpFetcher();
    HttpFetcher(const HttpFetcher&) = delete;
    HttpFetcher& operator=(const HttpFetcher&) = delete;
    ~HttpFetcher() = default;

    /// Waits for the answer, so never on the main loop. True when one with status 200 and a body
    /// came.
    [[nodiscard]] bool fetch(const std::string& url, Networks networks);

    /// What the last fetch brought; it stays in place until the next one.
    [[nodiscard]] const std::vector<std::byte>& body() const { return body_; }

    /// Decodes the body into the file. What is written in part is removed again.
    [[nodiscard]] bool writeUncompressed(const std::string& path) const;

private:
    [[nodiscard]] bool isGzip() const;
    void complete(const std::string& url, const std::shared_ptr<hvu::Http::HttpResponse>& response);

    const platform::SerialQueue downloadQueue_;
    std::vector<std::byte> body_;
    hvu::Http::HeaderMap headers_;
};
