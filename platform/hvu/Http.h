// The HTTP client: a session with its policy, requests, and what came back.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/SerialQueue.h"

namespace hvu::Http {

enum class RequestType : std::int32_t { kGet = 0 };

/// Why there is no whole answer. The status code is 0 unless the server had sent one before.
enum class ErrorType : std::int32_t {
    kUnknown = 0,
    kNone = 1,  ///< the whole answer came, whatever its status
    kHostNotFound = 2,
    kCannotConnect = 3,
    kCellularForbidden = 4,  ///< every way to the server leads over the cellular network
    kTimedOut = 5,
    kNotTrusted = 6,  ///< no secure connection, or one with somebody else
    kConnectionLost = 7,
    kRedirectRefused = 8,  ///< too many of them, or one that leads where we do not go
    kBodyTooLarge = 9,
    kBadAnswer = 10,  ///< no HTTP, or a content encoding that cannot be undone
    kBadUrl = 11,
};

/// Texts for the log. A status code that has no name is "unknown", and 0 is "no status".
[[nodiscard]] const char* asString(ErrorType error);
[[nodiscard]] const char* asString(int statusCode);

/// The order of header names, by strcasecmp.
struct case_insensitive_key_comparer {
    using is_transparent = void;
    bool operator()(std::string_view a, std::string_view b) const;
};

using HeaderMap = std::map<std::string, std::string, case_insensitive_key_comparer>;

enum class CellularUse : bool { kForbidden, kAllowed };

/// The policy that requests share.
class HttpSession final {
public:
    /// A new session, which may use any network.
    [[nodiscard]] static std::shared_ptr<HttpSession> create();

    /// Holds for requests that are started after it. What a forbidden network still carries are
    /// look-ups of names.
    void setCellularUse(CellularUse use) { cellularUse_ = use; }

    [[nodiscard]] CellularUse cellularUse() const { return cellularUse_; }

    /// The largest body, decoded, likewise; what is larger is ErrorType::kBodyTooLarge.
    void setBodyLimit(std::size_t bytes) { bodyLimit_ = bytes; }

    [[nodiscard]] std::size_t bodyLimit() const { return bodyLimit_; }

    /// Until a server must have sent all, if that is less than the platform lets it have anyhow;
    /// likewise.
    void setTimeLimit(long seconds) { timeLimitSeconds_ = seconds; }

    [[nodiscard]] std::optional<long> timeLimitSeconds() const { return timeLimitSeconds_; }

private:
    CellularUse cellularUse_ = CellularUse::kAllowed;
    std::size_t bodyLimit_ = std::size_t{256} << 20;
    std::optional<long> timeLimitSeconds_{};
};

/// What a server answered, or why it did not.
class HttpResponse final {
public:
    struct Parts {
        ErrorType error = ErrorType::kNone;
        int statusCode = 0;
        std::vector<std::byte> body{};
        HeaderMap headers{};
    };

    explicit HttpResponse(Parts parts) : parts_(std::move(parts)) {}

    [[nodiscard]] ErrorType errorType() const { return parts_.error; }

    [[nodiscard]] int statusCode() const { return parts_.statusCode; }

    /// At most as large as the session lets it be, 256 MiB unless it was told otherwise. A body
    /// that came with the content encoding gzip is decoded, unless its content type contains
    /// "gzip": then it is as it came.
    [[nodiscard]] const std::vector<std::byte>& body() const { return parts_.body; }

    /// The body, moved out.
    [[nodiscard]] std::vector<std::byte> takeBody() { return std::exchange(parts_.body, {}); }

    /// Values of one name are joined by ", ".
    [[nodiscard]] const HeaderMap& headers() const { return parts_.headers; }

private:
    Parts parts_;
};

/// One request. It is set up and started on one thread, and needs nobody to hold it meanwhile.
class HttpRequest final : public std::enable_shared_from_this<HttpRequest> {
    struct Private {};

public:
    /// Null when the URL cannot be used: it must be http or https and name a host.
    [[nodiscard]] static std::shared_ptr<HttpRequest> create(RequestType type,
                                                             std::string_view url,
                                                             HeaderMap headers,
                                                             std::shared_ptr<HttpSession> session);

    HttpRequest(Private,
                std::string_view url,
                HeaderMap headers,
                std::shared_ptr<HttpSession> session)
        : url_(url), headers_(std::move(headers)), session_(std::move(session)) {}

    void setCompletionQueue(const platform::SerialQueue& queue) { completionQueue_ = queue; }

    /// Called once on the completion queue; with null when the system has no HTTP client to offer.
    /// Redirects are followed, at most 5 and never from https to http.
    void setCompletionHandler(std::function<void(std::shared_ptr<HttpResponse>)> handler) {
        completionHandler_ = std::move(handler);
    }

    /// Begins, and does not wait. Once; queue and handler are set before. A GET carries no body:
    /// `body` is empty.
    void start(std::vector<std::byte> body);

private:
    const std::string url_;
    const HeaderMap headers_;
    const std::shared_ptr<HttpSession> session_;
    std::optional<platform::SerialQueue> completionQueue_;
    std::function<void(std::shared_ptr<HttpResponse>)> completionHandler_;
};

}  // namespace hvu::Http
