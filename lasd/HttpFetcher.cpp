#include "lasd/HttpFetcher.h"

#include <cerrno>
#include <cstring>
#include <string_view>

#include "platform/Log.h"
#include "platform/OutputFile.h"
#include "platform/PathAccess.h"
#include "platform/Semaphore.h"
#include "platform/hvu/Compression.h"

using hvu::Http::HttpRequest;
using hvu::Http::HttpResponse;
using hvu::Http::HttpSession;
using platform::Log;
using platform::LogLevel;

namespace {

constexpr int kOk = 200;
constexpr const char* kContentType = "Content-Type";
constexpr const char* kGzip = "gzip";

std::shared_ptr<HttpRequest> MakeRequest(const std::string& url, Networks networks) {
    const auto session = HttpSession::create();
    if (networks == Networks::kWifiOnly) {
        session->setCellularUse(hvu::Http::CellularUse::kForbidden);
    }
    return HttpRequest::create(
        hvu::Http::RequestType::kGet, url, {{"Accept-Encoding", kGzip}}, session);
}

/// Decodes into a file that is open, and closes it: what the system could not keep is no success.
bool Uncompress(std::span<const std::byte> body, platform::OutputFile file) {
    const bool isDecoded = hvu::Compression::Decompress(body, file);
    return file.close() == 0 && isDecoded;
}

void RemovePartOf(const std::string& path) {
    if (const int error = platform::PathAccess(path).remove(); error != 0) {
        Log(LogLevel::kError,
            "Failed to remove partially uncompressed file at %s: %s",
            path.c_str(),
            std::strerror(error));
    }
}

}  // namespace

HttpFetcher::HttpFetcher()
    : downloadQueue_("com.vendra.httpdownloadqueue", platform::QualityOfService::kUtility) {}

bool HttpFetcher::fetch(const std::string& url, Networks networks) {
    body_.clear();
    headers_.clear();
    if (url.empty()) {
        Log(LogLevel::kError, "URL is empty");
        return false;
    }
    Log(LogLevel::kInfo, "Fetching URL %s", url.c_str());
    const auto request = MakeRequest(url, networks);
    if (request == nullptr) {
        Log(LogLevel::kError, "Cannot create HTTP request for URL %s", url.c_str());
        return false;
    }
    const auto isDone = platform::Semaphore::create();
    request->setCompletionQueue(downloadQueue_);
    // This object is there until the wait below has ended, and the signal is what ends it.
    request->setCompletionHandler(
        [this, url, isDone](const std::shared_ptr<HttpResponse>& response) {
            complete(url, response);
            isDone->signal();
        });
    request->start({});
    isDone->wait();
    return !body_.empty();
}

void HttpFetcher::complete(const std::string& url, const std::shared_ptr<HttpResponse>& response) {
    if (response == nullptr) {
        Log(LogLevel::kError, "Did not receive HTTP response!");
        return;
    }
    const auto error = response->errorType();
    const int status = response->statusCode();
    if (error != hvu::Http::ErrorType::kNone || status != kOk) {
        Log(LogLevel::kError,
            "HTTP request failed for URL %s with error %s errorcode %d (%s)",
            url.c_str(),
            hvu::Http::asString(error),
            status,
            hvu::Http::asString(status));
        return;
    }
    body_ = response->takeBody();
    headers_ = response->headers();
    // The blank at the end belongs to the text.
    Log(LogLevel::kInfo,
        "URL retrieved %s, size: %lu ",
        url.c_str(),
        static_cast<unsigned long>(body_.size()));
}

bool HttpFetcher::isGzip() const {
    const auto type = headers_.find(kContentType);
    if (type == headers_.end()) {
        Log(LogLevel::kError, "Cannot find %s header in response!", kContentType);
        return false;
    }
    if (type->second.find(kGzip) == std::string::npos) {
        Log(LogLevel::kError,
            "Expected to find %s in %s header, found %s instead",
            kGzip,
            kContentType,
            type->second.c_str());
        return false;
    }
    return true;
}

bool HttpFetcher::writeUncompressed(const std::string& path) const {
    if (body_.empty()) {
        Log(LogLevel::kError, "Cannot uncompress downloaded buffer without a response!");
        return false;
    }
    if (!isGzip()) {
        return false;
    }
    platform::OutputFile file;
    if (const int error = file.open(path); error != 0) {
        Log(LogLevel::kError, "Cannot open output file %s: %s", path.c_str(), std::strerror(error));
        return false;
    }
    if (!Uncompress(body_, std::move(file))) {
        Log(LogLevel::kError, "Could not uncompress HTTP response to %s!", path.c_str());
        RemovePartOf(path);
        return false;
    }
    return true;
}
