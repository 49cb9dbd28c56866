#include "tests/http/Fetch.h"

#include <cstdlib>

#include "platform/Semaphore.h"

namespace web {

using namespace hvu::Http;

Fetched Get(const std::string& url, CellularUse use) {
    const auto session = HttpSession::create();
    session->setCellularUse(use);
    const auto request =
        HttpRequest::create(RequestType::kGet, url, {{"Accept-Encoding", "gzip"}}, session);
    if (request == nullptr) {
        std::abort();
    }
    const platform::SerialQueue queue("completions");
    const auto isDone = platform::Semaphore::create();
    Fetched fetched;
    request->setCompletionQueue(queue);
    request->setCompletionHandler([&](const std::shared_ptr<HttpResponse>& response) {
        fetched.isOnQueue = queue.isCurrent();
        fetched.hasResponse = response != nullptr;
        if (response != nullptr) {
            const auto& body = response->body();
            fetched.error = response->errorType();
            fetched.status = response->statusCode();
            fetched.body.assign(reinterpret_cast<const char*>(body.data()), body.size());
            fetched.headers = response->headers();
        }
        isDone->signal();
    });
    request->start({});
    isDone->wait();
    return fetched;
}

ErrorType ErrorOf(const std::string& url, CellularUse use) {
    return Get(url, use).error;
}

}  // namespace web
