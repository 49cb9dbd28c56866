// The radio manager of this platform is the modem manager, which a module speaks to.
//
// It may take its time, or a broken bus may not answer at all: the requests go out on a queue of
// their own, one after the other, so that whoever asks never waits.
#include "platform/RadioManager.h"

#include <mutex>
#include <string>
#include <vector>

#include "platform/BuildConstants.h"
#include "platform/DynamicLibrary.h"
#include "platform/SerialQueue.h"
#include "platform/linux/RadioModule.h"

namespace platform {
namespace {

/// Requests that wait behind a modem manager that does not answer. At the limit the newest takes
/// the place of the one before it: how it ends is what counts.
constexpr std::size_t kMostWaiting = 8;

void SetLogging(bool isEnabled) {
    static const auto setLogging =
        DynamicLibrary::open(std::string(kLibraryDirectory) + "/libLinefoldRadio.so")
            .function<int(int)>("LinefoldRadioSetLogging");
    if (setLogging != nullptr) {
        (void)setLogging(isEnabled ? 1 : 0);  // whatever it says, nobody is there to be told
    }
}

class Requests {
public:
    /// Immortal: the queue's thread reaches it to the very end.
    static Requests& shared() {
        static auto* const requests = new Requests();
        return *requests;
    }

    void add(bool isEnabled) {
        const std::lock_guard lock(mutex_);
        if (waiting_.size() == kMostWaiting) {
            waiting_.back() = isEnabled;
            return;
        }
        waiting_.push_back(isEnabled);
        queue_.async([this] { SetLogging(takeFirst()); });
    }

private:
    bool takeFirst() {
        const std::lock_guard lock(mutex_);
        const bool first = waiting_.front();
        waiting_.erase(waiting_.begin());
        return first;
    }

    const SerialQueue queue_{"com.vendra.linefold.radio-manager", QualityOfService::kUtility};
    std::mutex mutex_;
    std::vector<bool> waiting_;  // one task of the queue for each
};

}  // namespace

void RadioManagerSetLogToFile(bool isEnabled) {
    Requests::shared().add(isEnabled);
}

}  // namespace platform
