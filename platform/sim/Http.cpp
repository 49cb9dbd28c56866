// HTTP requests that scripted servers answer.
#include "platform/hvu/Http.h"

#include <utility>

#include "platform/hvu/Url.h"
#include "platform/sim/SimHttp.h"
#include "platform/sim/World.h"

namespace {

struct Web {
    std::map<std::string, sim::HttpAnswer, std::less<>> answers;
    std::vector<sim::HttpRequestSeen> requests;
    sim::Network network = sim::Network::kWifi;
};

Web& TheWeb() {
    static Web& web = *new Web;
    return web;
}

sim::HttpAnswer FailWith(hvu::Http::ErrorType error) {
    return {.status = 0, .error = error};
}

/// What becomes of a request that the phone's networks let through, or not.
sim::HttpAnswer AnswerTo(std::string_view url, hvu::Http::CellularUse use) {
    const Web& web = TheWeb();
    if (web.network == sim::Network::kNone) {
        return FailWith(hvu::Http::ErrorType::kCannotConnect);
    }
    if (web.network == sim::Network::kCellular && use == hvu::Http::CellularUse::kForbidden) {
        return FailWith(hvu::Http::ErrorType::kCellularForbidden);
    }
    const auto found = web.answers.find(url);
    return found == web.answers.end() ? FailWith(hvu::Http::ErrorType::kCannotConnect)
                                      : found->second;
}

std::vector<std::byte> Bytes(std::string_view text) {
    const auto* const start = reinterpret_cast<const std::byte*>(text.data());
    return {start, start + text.size()};
}

std::shared_ptr<hvu::Http::HttpResponse> ResponseOf(const sim::HttpAnswer& answer) {
    if (answer.kind == sim::HttpAnswer::Kind::kNoResponse) {
        return nullptr;
    }
    return std::make_shared<hvu::Http::HttpResponse>(
        hvu::Http::HttpResponse::Parts{.error = answer.error,
                                       .statusCode = answer.status,
                                       .body = Bytes(answer.body),
                                       .headers = answer.headers});
}

}  // namespace

namespace sim {

void ServeUrl(std::string_view url, HttpAnswer answer) {
    TheWeb().answers.insert_or_assign(std::string(url), std::move(answer));
}

void AttachToNetwork(Network network) {
    TheWeb().network = network;
}

const std::vector<HttpRequestSeen>& HttpRequests() {
    return TheWeb().requests;
}

void ResetHttp() {
    TheWeb() = Web();
}

}  // namespace sim

namespace hvu::Http {

std::shared_ptr<HttpRequest> HttpRequest::create(RequestType /*type*/,
                                                 std::string_view url,
                                                 HeaderMap headers,
                                                 std::shared_ptr<HttpSession> session) {
    if (sim::CallFails("HttpRequest.create", url) || !IsUsableUrl(url)) {
        return nullptr;
    }
    return std::make_shared<HttpRequest>(Private(), url, std::move(headers), std::move(session));
}

void HttpRequest::start(std::vector<std::byte> body) {
    if (!completionQueue_ || !completionHandler_ || !body.empty()) {
        throw sim::ContractBroken("a request needs a queue and a handler, and a GET has no body");
    }
    const bool fails = sim::CallFails("HttpRequest.start", url_);
    const auto use = session_->cellularUse();
    TheWeb().requests.push_back(
        {.url = url_, .headers = headers_, .cellularUse = use, .queue = completionQueue_->label()});
    auto answer = AnswerTo(url_, use);
    if (answer.body.size() > session_->bodyLimit()) {
        answer = FailWith(ErrorType::kBodyTooLarge);
    }
    if (fails) {
        answer.kind = sim::HttpAnswer::Kind::kNoResponse;
    }
    if (answer.kind == sim::HttpAnswer::Kind::kNever) {
        return;
    }
    sim::In(answer.delay, [self = shared_from_this(), answer] {
        self->completionQueue_->async([self, answer] {
            const auto handler = std::exchange(self->completionHandler_, nullptr);
            handler(ResponseOf(answer));
        });
    });
}

}  // namespace hvu::Http
