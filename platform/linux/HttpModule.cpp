// HTTP by libcurl. One handle serves one request with its redirects, so no connection is ever used
// under another policy than the one that it was made under.
#include "platform/linux/HttpModule.h"

#include <curl/curl.h>
#include <fcntl.h>
#include <openssl/crypto.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <memory>
#include <string>
#include <string_view>

#include "platform/linux/OutgoingInterface.h"

namespace {

constexpr int kRedirectsMax = 5;
constexpr long kBufferSize = 128L * 1024;

struct Deleter {
    void operator()(CURL* handle) const { curl_easy_cleanup(handle); }

    void operator()(curl_slist* list) const { curl_slist_free_all(list); }

    void operator()(CURLU* url) const { curl_url_cleanup(url); }

    void operator()(char* text) const { curl_free(text); }
};

template <typename T>
using Owned = std::unique_ptr<T, Deleter>;

/// What happens while one request is carried out.
struct Transfer {
    const LinefoldHttpRequest& request;
    LinefoldHttpResult& result;
    std::string location{};      ///< of the header that came last
    bool isHeaderWhole = false;  ///< its empty line has come
    bool hasBody = false;
    bool isRedirectBody = false;  ///< its answer was ended where its body began
    bool isSinkFull = false;
    bool isCellularRefused = false;
    bool hasSocket = false;
};

/// What libcurl and its libraries set up stays for the life of the process, and is not taken down
/// at its end: another thread may be in the middle of a request then.
bool IsReady() {
    static const bool isReady = OPENSSL_init_crypto(OPENSSL_INIT_NO_ATEXIT, nullptr) == 1 &&
                                curl_global_init(CURL_GLOBAL_ALL) == CURLE_OK;
    return isReady;
}

bool IsRedirect(int status) {
    constexpr std::array kStatuses{301, 302, 303, 307, 308};
    return std::ranges::find(kStatuses, status) != kStatuses.end();
}

// What libcurl calls.

/// The cellular rule. It is decided for each connection, since redirects and names lead anywhere,
/// and the socket is bound to the interface, so that a route that changes meanwhile moves nothing.
curl_socket_t OpenSocket(void* context, curlsocktype /*purpose*/, curl_sockaddr* address) noexcept {
    auto& transfer = *static_cast<Transfer*>(context);
    std::string interface;
    if (transfer.request.is_cellular_allowed == 0) {
        interface = platform::OutgoingInterface(address->addr);
        if (interface.empty()) {
            return CURL_SOCKET_BAD;
        }
        if (platform::IsCellular(interface)) {
            transfer.isCellularRefused = true;
            return CURL_SOCKET_BAD;
        }
    }
    const int made = socket(address->family, address->socktype | SOCK_CLOEXEC, address->protocol);
    if (made < 0) {
        return CURL_SOCKET_BAD;
    }
    if (!interface.empty() && setsockopt(made,
                                         SOL_SOCKET,
                                         SO_BINDTODEVICE,
                                         interface.c_str(),
                                         static_cast<socklen_t>(interface.size())) != 0) {
        close(made);
        return CURL_SOCKET_BAD;
    }
    transfer.hasSocket = true;
    return made;
}

void NoteStatus(Transfer& transfer, CURL* handle) {
    long status = 0;
    (void)curl_easy_getinfo(handle, CURLINFO_RESPONSE_CODE, &status);
    transfer.result.status_code = static_cast<int>(status);
}

constexpr std::string_view kLocation = "location:";

bool IsLocation(std::string_view line) {
    const auto isSame = [](char have, char wanted) {
        return (have >= 'A' && have <= 'Z' ? have - 'A' + 'a' : have) == wanted;
    };
    return line.size() > kLocation.size() &&
           std::ranges::equal(line.substr(0, kLocation.size()), kLocation, isSame);
}

std::string_view Trimmed(std::string_view text) {
    const auto start = text.find_first_not_of(" \t\r\n");
    return start == std::string_view::npos
               ? std::string_view()
               : text.substr(start, text.find_last_not_of(" \t\r\n") + 1 - start);
}

std::size_t TakeHeaderLine(char* bytes,
                           std::size_t /*one*/,
                           std::size_t size,
                           void* context) noexcept {
    auto& transfer = *static_cast<Transfer*>(context);
    if (transfer.hasBody) {
        return size;  // a trailer is no header
    }
    const std::string_view line(bytes, size);
    transfer.isHeaderWhole = line == "\r\n" || line == "\n";
    if (line.starts_with("HTTP/")) {
        transfer.location.clear();
    } else if (IsLocation(line)) {
        transfer.location = Trimmed(line.substr(kLocation.size()));
    }
    if (transfer.request.take_header_line(transfer.request.context, bytes, size) != 0) {
        transfer.isSinkFull = true;
        return CURL_WRITEFUNC_ERROR;
    }
    return size;
}

struct BodyContext {
    Transfer& transfer;
    CURL* handle;
};

std::size_t TakeBody(char* bytes, std::size_t /*one*/, std::size_t size, void* context) noexcept {
    const auto& [transfer, handle] = *static_cast<BodyContext*>(context);
    if (!transfer.hasBody) {
        transfer.hasBody = true;
        NoteStatus(transfer, handle);
        transfer.isRedirectBody =
            IsRedirect(transfer.result.status_code) && !transfer.location.empty();
    }
    if (transfer.isRedirectBody) {
        return CURL_WRITEFUNC_ERROR;
    }
    if (transfer.request.take_body(transfer.request.context, bytes, size) != 0) {
        transfer.isSinkFull = true;
        return CURL_WRITEFUNC_ERROR;
    }
    return size;
}

// The options of a request. One that libcurl refuses fails the request.

class Options final {
public:
    explicit Options(CURL* handle) : handle_(handle) {}

    template <typename T>
    void set(CURLoption option, T value) {
        isSet_ = isSet_ && curl_easy_setopt(handle_, option, value) == CURLE_OK;
    }

    [[nodiscard]] bool areSet() const { return isSet_; }

private:
    CURL* const handle_;
    bool isSet_ = true;
};

/// The environment, and what a user has set up for other programs, change nothing.
void SetConduct(Options& options) {
    options.set(CURLOPT_NOSIGNAL, 1L);
    options.set(CURLOPT_PROXY, "");
    options.set(CURLOPT_PROTOCOLS_STR, "http,https");
    // Each redirect is judged by us.
    options.set(CURLOPT_FOLLOWLOCATION, 0L);
    // A body comes as the server sent it.
    options.set(CURLOPT_HTTP_CONTENT_DECODING, 0L);
    // One file a connection: nothing that came after this would help.
    options.set(CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
    options.set(CURLOPT_SSL_VERIFYPEER, 1L);
    options.set(CURLOPT_SSL_VERIFYHOST, 2L);
    options.set(CURLOPT_BUFFERSIZE, kBufferSize);
    // A look-up of a name that takes longer than the request is left behind.
    options.set(CURLOPT_QUICK_EXIT, 1L);
}

void SetLimits(Options& options, const LinefoldHttpRequest& request) {
    options.set(CURLOPT_CONNECTTIMEOUT_MS, static_cast<long>(request.connect_timeout_ms));
    options.set(CURLOPT_LOW_SPEED_LIMIT, 1L);
    options.set(CURLOPT_LOW_SPEED_TIME, static_cast<long>(request.stall_timeout_s));
    options.set(CURLOPT_TIMEOUT, static_cast<long>(request.total_timeout_s));
    options.set(CURLOPT_MAXFILESIZE_LARGE, static_cast<curl_off_t>(request.body_max));
}

void SetCallbacks(Options& options, Transfer& transfer, BodyContext& body) {
    options.set(CURLOPT_OPENSOCKETFUNCTION, &OpenSocket);
    options.set(CURLOPT_OPENSOCKETDATA, &transfer);
    options.set(CURLOPT_HEADERFUNCTION, &TakeHeaderLine);
    options.set(CURLOPT_HEADERDATA, &transfer);
    options.set(CURLOPT_WRITEFUNCTION, &TakeBody);
    options.set(CURLOPT_WRITEDATA, &body);
    options.set(CURLOPT_ERRORBUFFER, transfer.result.detail);
}

Owned<curl_slist> HeaderList(const char* const* lines) {
    Owned<curl_slist> list;
    for (; *lines != nullptr; ++lines) {
        if (curl_slist* const longer = curl_slist_append(list.get(), *lines)) {
            (void)list.release();
            list.reset(longer);
        }
    }
    return list;
}

// How it ended.

LinefoldHttpOutcome OutcomeOf(CURLcode code, const Transfer& transfer) {
    switch (code) {
        case CURLE_OK:
            // Where a connection ends in the middle of a header, libcurl sees an answer.
            return transfer.isHeaderWhole ? LINEFOLD_HTTP_DONE : LINEFOLD_HTTP_CONNECTION_LOST;
        case CURLE_COULDNT_RESOLVE_HOST:
            return LINEFOLD_HTTP_HOST_NOT_FOUND;
        case CURLE_COULDNT_CONNECT:
            return transfer.isCellularRefused && !transfer.hasSocket
                       ? LINEFOLD_HTTP_CELLULAR_FORBIDDEN
                       : LINEFOLD_HTTP_CANNOT_CONNECT;
        case CURLE_OPERATION_TIMEDOUT:
            return LINEFOLD_HTTP_TIMED_OUT;
        case CURLE_SSL_CONNECT_ERROR:
        case CURLE_SSL_ENGINE_INITFAILED:
        case CURLE_SSL_CERTPROBLEM:
        case CURLE_SSL_CIPHER:
        case CURLE_PEER_FAILED_VERIFICATION:
        case CURLE_SSL_CACERT_BADFILE:
        case CURLE_SSL_ISSUER_ERROR:
        case CURLE_SSL_INVALIDCERTSTATUS:
            return LINEFOLD_HTTP_NOT_TRUSTED;
        case CURLE_PARTIAL_FILE:
        case CURLE_RECV_ERROR:
        case CURLE_SEND_ERROR:
        case CURLE_GOT_NOTHING:
            return LINEFOLD_HTTP_CONNECTION_LOST;
        case CURLE_FILESIZE_EXCEEDED:
            return LINEFOLD_HTTP_BODY_TOO_LARGE;
        case CURLE_UNSUPPORTED_PROTOCOL:  // an answer that is none
        case CURLE_WEIRD_SERVER_REPLY:
        case CURLE_BAD_CONTENT_ENCODING:
            return LINEFOLD_HTTP_BAD_ANSWER;
        case CURLE_URL_MALFORMAT:
            return LINEFOLD_HTTP_BAD_URL;
        default:
            return transfer.isSinkFull ? LINEFOLD_HTTP_SINK_REFUSED : LINEFOLD_HTTP_UNKNOWN;
    }
}

// Redirects.

/// Where a redirect leads from `url`, or nothing when we do not go there.
Owned<char> Target(const char* url, const std::string& location) {
    const Owned<CURLU> place(curl_url());
    char* scheme = nullptr;
    if (curl_url_set(place.get(), CURLUPART_URL, url, 0) != CURLUE_OK ||
        curl_url_get(place.get(), CURLUPART_SCHEME, &scheme, 0) != CURLUE_OK) {
        return nullptr;
    }
    const std::string from = Owned<char>(scheme).get();
    char* target = nullptr;
    scheme = nullptr;
    if (curl_url_set(place.get(), CURLUPART_URL, location.c_str(), CURLU_URLENCODE) != CURLUE_OK ||
        curl_url_get(place.get(), CURLUPART_SCHEME, &scheme, 0) != CURLUE_OK) {
        return nullptr;
    }
    const std::string to = Owned<char>(scheme).get();
    const bool isAllowed = to == "https" || (to == "http" && from == "http");
    if (!isAllowed || curl_url_get(place.get(), CURLUPART_URL, &target, 0) != CURLUE_OK) {
        return nullptr;
    }
    return Owned<char>(target);
}

/// One answer.
LinefoldHttpOutcome PerformOnce(CURL* handle, Transfer& transfer, const char* url) {
    transfer.result.status_code = 0;
    transfer.result.detail[0] = '\0';
    transfer.location.clear();
    transfer.isHeaderWhole = false;
    transfer.hasBody = false;
    transfer.isRedirectBody = false;
    transfer.isCellularRefused = false;
    transfer.hasSocket = false;
    if (curl_easy_setopt(handle, CURLOPT_URL, url) != CURLE_OK) {
        return LINEFOLD_HTTP_UNKNOWN;
    }
    const CURLcode code = curl_easy_perform(handle);
    NoteStatus(transfer, handle);
    return transfer.isRedirectBody ? LINEFOLD_HTTP_DONE : OutcomeOf(code, transfer);
}

LinefoldHttpOutcome Perform(CURL* handle, Transfer& transfer) {
    std::string url = transfer.request.url;
    for (int redirects = 0;; ++redirects) {
        const auto outcome = PerformOnce(handle, transfer, url.c_str());
        if (outcome != LINEFOLD_HTTP_DONE || !IsRedirect(transfer.result.status_code) ||
            transfer.location.empty()) {
            return outcome;
        }
        const auto target = Target(url.c_str(), transfer.location);
        if (target == nullptr || redirects == kRedirectsMax) {
            return LINEFOLD_HTTP_REDIRECT_REFUSED;
        }
        url = target.get();
    }
}

}  // namespace

void LinefoldHttpGet(const LinefoldHttpRequest* request, LinefoldHttpResult* result) noexcept {
    *result = {};
    const Owned<CURL> handle(IsReady() ? curl_easy_init() : nullptr);
    const Owned<curl_slist> headers = HeaderList(request->header_lines);
    Transfer transfer{.request = *request, .result = *result};
    BodyContext body{.transfer = transfer, .handle = handle.get()};
    if (handle == nullptr) {
        return;
    }
    Options options(handle.get());
    SetConduct(options);
    SetLimits(options, *request);
    SetCallbacks(options, transfer, body);
    options.set(CURLOPT_HTTPHEADER, headers.get());
    if (options.areSet()) {
        result->outcome = Perform(handle.get(), transfer);
    }
}
