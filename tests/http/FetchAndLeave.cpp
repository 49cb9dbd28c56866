// Starts requests and ends while they are under way: fetch_and_leave URL COUNT MICROSECONDS. With
// -1 it waits for the first, and ends with 3 if there was no response.
#include <chrono>
#include <cstdlib>
#include <string>
#include <thread>

#include "platform/Semaphore.h"
#include "platform/hvu/Http.h"

using namespace hvu::Http;

int main(int /*argc*/, char** argv) {
    const auto isDone = platform::Semaphore::create();
    bool hasResponse = false;
    for (int i = 0; i < std::atoi(argv[2]); ++i) {
        const auto request =
            HttpRequest::create(RequestType::kGet, argv[1], {}, HttpSession::create());
        request->setCompletionQueue(platform::SerialQueue("completions"));
        request->setCompletionHandler([&](const std::shared_ptr<HttpResponse>& response) {
            hasResponse = response != nullptr;
            isDone->signal();
        });
        request->start({});
    }
    if (const int microseconds = std::atoi(argv[3]); microseconds >= 0) {
        std::this_thread::sleep_for(std::chrono::microseconds(microseconds));
        std::exit(0);  // as from main, with all that ends with the process
    }
    isDone->wait();
    return hasResponse ? 0 : 3;
}
