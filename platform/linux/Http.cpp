// HTTP requests, each carried out on a thread of its own by the module that knows the protocol.
// What comes is kept once: the body grows where it stays.
#include "platform/hvu/Http.h"

#include <algorithm>
#include <array>
#include <new>
#include <utility>

#include "platform/Assertion.h"
#include "platform/BuildConstants.h"
#include "platform/DynamicLibrary.h"
#include "platform/hvu/GzipDecoder.h"
#include "platform/hvu/Url.h"
#include "platform/linux/HttpModule.h"
#include "platform/linux/PlatformLog.h"

namespace hvu::Http {
namespace {

using Compression::GzipDecoder;
using platform::LogLevel;

/// Of all header lines together, those of interim answers and redirects included.
constexpr std::size_t kHeaderMax = 256UL << 10;

std::string ModulePath() {
    return std::string(platform::kLibraryDirectory) + "/libLinefoldHttp.so";
}

struct Module {
    platform::DynamicLibrary library = platform::DynamicLibrary::open(ModulePath());
    decltype(&LinefoldHttpGet) get =
        library.function<std::remove_pointer_t<decltype(&LinefoldHttpGet)>>("LinefoldHttpGet");
};

const Module& TheModule() {
    static const Module& module = *new Module;
    return module;
}

std::string_view Trimmed(std::string_view text) {
    const auto start = text.find_first_not_of(" \t\r\n");
    return start == std::string_view::npos
               ? std::string_view()
               : text.substr(start, text.find_last_not_of(" \t\r\n") + 1 - start);
}

/// Takes an answer as it arrives.
class Collector final {
public:
    explicit Collector(std::size_t bodyMax) : bodyMax_(bodyMax) {}

    [[nodiscard]] bool takeHeaderLine(std::string_view line) {
        headerSize_ += line.size();
        if (headerSize_ > kHeaderMax) {
            return refuse(ErrorType::kBadAnswer);
        }
        if (line.starts_with("HTTP/")) {
            parts_.headers.clear();
        }
        const auto colon = line.find(':');
        if (colon != 0 && colon != std::string_view::npos) {
            addHeader(line.substr(0, colon), Trimmed(line.substr(colon + 1)));
        }
        return true;
    }

    [[nodiscard]] bool takeBody(std::span<const std::byte> bytes) {
        if (!std::exchange(hasBody_, true) && !prepareBody()) {
            return refuse(ErrorType::kBadAnswer);
        }
        return decoder_ == nullptr ? append(bytes) : decode(bytes);
    }

    [[nodiscard]] HttpResponse::Parts finish(ErrorType error, int statusCode) {
        parts_.error = refusal_.value_or(error);
        parts_.statusCode = statusCode;
        if (parts_.error == ErrorType::kNone && decoder_ != nullptr && !decoder_->isComplete()) {
            parts_.error = ErrorType::kBadAnswer;
        }
        return std::move(parts_);
    }

private:
    bool refuse(ErrorType why) {
        refusal_ = why;
        return false;
    }

    void addHeader(std::string_view name, std::string_view value) {
        const auto [header, isNew] = parts_.headers.try_emplace(std::string(name), value);
        if (!isNew) {
            header->second.append(", ").append(value);
        }
    }

    [[nodiscard]] std::string_view header(std::string_view name) const {
        const auto found = parts_.headers.find(name);
        return found == parts_.headers.end() ? std::string_view() : found->second;
    }

    /// False when the body has an encoding that cannot be undone.
    bool prepareBody() {
        reserveBody();
        const bool isGzipFile = header("Content-Type").find("gzip") != std::string_view::npos;
        const auto encoding = header("Content-Encoding");
        const auto isEncoding = [&](std::string_view name) {
            const case_insensitive_key_comparer before;
            return !before(encoding, name) && !before(name, encoding);
        };
        if (isGzipFile || encoding.empty() || isEncoding("identity")) {
            return true;
        }
        if (!isEncoding("gzip") && !isEncoding("x-gzip")) {
            return false;
        }
        decoder_ = std::make_unique<GzipDecoder>(
            bodyMax_, [this](std::span<const std::byte> bytes) { return append(bytes); });
        return true;
    }

    /// Addresses for the largest body, since memory comes only with what is written there, and a
    /// body that had to move while it grows would be there twice. Where addresses are scarce it
    /// moves.
    void reserveBody() {
        try {
            parts_.body.reserve(bodyMax_);
        } catch (const std::bad_alloc&) {
            parts_.body.clear();
        }
    }

    bool append(std::span<const std::byte> bytes) {
        if (bytes.size() > bodyMax_ - parts_.body.size()) {
            return refuse(ErrorType::kBodyTooLarge);
        }
        parts_.body.insert(parts_.body.end(), bytes.begin(), bytes.end());
        return true;
    }

    bool decode(std::span<const std::byte> bytes) {
        switch (decoder_->decode(bytes)) {
            case GzipDecoder::Result::kGoOn:
                return true;
            case GzipDecoder::Result::kTooLarge:
            case GzipDecoder::Result::kSinkFailed:
                return refuse(ErrorType::kBodyTooLarge);
            case GzipDecoder::Result::kDamaged:
                break;
        }
        return refuse(ErrorType::kBadAnswer);
    }

    const std::size_t bodyMax_;
    HttpResponse::Parts parts_;
    std::optional<ErrorType> refusal_;
    std::unique_ptr<GzipDecoder> decoder_;
    std::size_t headerSize_ = 0;
    bool hasBody_ = false;
};

int TakeHeaderLine(void* context, const char* line, std::size_t size) noexcept {
    return static_cast<Collector*>(context)->takeHeaderLine({line, size}) ? 0 : 1;
}

int TakeBody(void* context, const void* bytes, std::size_t size) noexcept {
    const std::span piece(static_cast<const std::byte*>(bytes), size);
    return static_cast<Collector*>(context)->takeBody(piece) ? 0 : 1;
}

ErrorType ErrorOf(LinefoldHttpOutcome outcome) {
    static_assert(static_cast<int>(ErrorType::kNone) == LINEFOLD_HTTP_DONE &&
                      static_cast<int>(ErrorType::kBadUrl) == LINEFOLD_HTTP_BAD_URL,
                  "the module's numbers are ours");
    return outcome == LINEFOLD_HTTP_SINK_REFUSED ? ErrorType::kUnknown
                                                 : static_cast<ErrorType>(outcome);
}

std::vector<std::string> HeaderLines(const HeaderMap& headers) {
    std::vector<std::string> lines;
    for (const auto& [name, value] : headers) {
        lines.push_back(name + ": " + value);
    }
    return lines;
}

std::vector<const char*> Pointers(const std::vector<std::string>& lines) {
    std::vector<const char*> pointers;
    for (const auto& line : lines) {
        pointers.push_back(line.c_str());
    }
    pointers.push_back(nullptr);
    return pointers;
}

/// Null when there is no module.
std::shared_ptr<HttpResponse> Get(const std::string& url,
                                  const HeaderMap& headers,
                                  const HttpSession& session) {
    if (TheModule().get == nullptr) {
        platform::PlatformLog(
            LogLevel::kError, "no HTTP client: %s cannot be used", ModulePath().c_str());
        return nullptr;
    }
    Collector collector(session.bodyLimit());
    const auto lines = HeaderLines(headers);
    const auto pointers = Pointers(lines);
    const LinefoldHttpRequest request{
        .url = url.c_str(),
        .header_lines = pointers.data(),
        .is_cellular_allowed = session.cellularUse() == CellularUse::kAllowed ? 1 : 0,
        .body_max = session.bodyLimit(),
        .connect_timeout_ms = platform::kHttpConnectTimeoutMs,
        .stall_timeout_s = platform::kHttpStallTimeoutSeconds,
        .total_timeout_s =
            std::min(session.timeLimitSeconds().value_or(platform::kHttpTotalTimeoutSeconds),
                     platform::kHttpTotalTimeoutSeconds),
        .context = &collector,
        .take_header_line = &TakeHeaderLine,
        .take_body = &TakeBody,
    };
    LinefoldHttpResult result{};
    TheModule().get(&request, &result);
    if (result.outcome != LINEFOLD_HTTP_DONE && result.detail[0] != '\0') {
        // A query may tell where the device is, and is nobody's who reads a log.
        const std::string place = url.substr(0, url.find('?'));
        platform::PlatformLog(LogLevel::kDefault, "%s: %s", place.c_str(), result.detail);
    }
    return std::make_shared<HttpResponse>(
        collector.finish(ErrorOf(result.outcome), result.status_code));
}

}  // namespace

std::shared_ptr<HttpRequest> HttpRequest::create(RequestType /*type*/,
                                                 std::string_view url,
                                                 HeaderMap headers,
                                                 std::shared_ptr<HttpSession> session) {
    if (!IsUsableUrl(url)) {
        return nullptr;
    }
    return std::make_shared<HttpRequest>(Private(), url, std::move(headers), std::move(session));
}

void HttpRequest::start(std::vector<std::byte> body) {
    PLATFORM_ASSERT(completionQueue_ && completionHandler_ && body.empty());
    // What the session says now holds, and the network's thread does not look at it again.
    const platform::SerialQueue network("com.vendra.http", platform::QualityOfService::kUtility);
    network.async([self = shared_from_this(), session = *session_] {
        auto response = Get(self->url_, self->headers_, session);
        self->completionQueue_->async(
            [response, handler = std::exchange(self->completionHandler_, nullptr)] {
                handler(response);
            });
    });
}

}  // namespace hvu::Http
