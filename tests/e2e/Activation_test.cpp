// Clients that arrive at any instant around the idle exit, with a service manager that keeps the
// socket: all of them are served, by one instance of the daemon or by the next.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <csignal>
#include <future>
#include <random>
#include <thread>

#include "tests/support/PhoneRoot.h"

namespace {

constexpr int kRounds = 25;
constexpr std::size_t kArrivalsPerRound = 4;
constexpr int kTriesMax = 100;
constexpr auto kIdleInterval = std::chrono::milliseconds(600);

/// The service manager's part, with the brisk daemon.
class Activator {
public:
    Activator() : pid_(fork()) {
        if (pid_ == 0) {
            prctl(PR_SET_PDEATHSIG, SIGTERM);
            execl(phone::ProgramPath("activator").c_str(),
                  "activator",
                  std::string(phone::kServicePath).c_str(),
                  std::string(kServiceName).c_str(),
                  phone::ProgramPath("LinefoldMobileHelper-brisk").c_str(),
                  nullptr);
            _exit(127);
        }
    }

    ~Activator() {
        kill(pid_, SIGTERM);
        waitpid(pid_, nullptr, 0);
    }

    Activator(const Activator&) = delete;
    Activator& operator=(const Activator&) = delete;

private:
    const pid_t pid_;
};

/// Checks in as a client should: an end before the reply means connect again. True when served.
bool IsServed() {
    for (int attempt = 0; attempt < kTriesMax; ++attempt) {
        const auto client = phone::Client::checkIn();
        if (client.code == 0) {
            return client.callTexts(8683558, {"/a", "/refused", ""}) == 8;
        }
        if (client.code != -1) {
            return false;
        }
        phone::SleepBriefly();
    }
    return false;
}

TEST(Activation, ClientsAroundTheIdleExitAreAllServed) {
    const Activator activator;
    ASSERT_TRUE(phone::Eventually([] { return phone::Connection::toService().get() >= 0; }));
    const auto seed = static_cast<unsigned>(getpid()) * 2654435761U ^ std::random_device()();
    std::mt19937 random(seed);
    std::uniform_int_distribution<int> microsecondsAround(-3000, 5000);
    for (int round = 0; round < kRounds; ++round) {
        ASSERT_TRUE(IsServed()) << "seed " << seed << ", round " << round;
        std::this_thread::sleep_for(kIdleInterval +
                                    std::chrono::microseconds(microsecondsAround(random)));
        // Several at once: the first may still be let in by the instance that the others just miss.
        std::array<std::future<bool>, kArrivalsPerRound> arrivals;
        for (auto& arrival : arrivals) {
            arrival = std::async(std::launch::async, IsServed);
        }
        for (auto& arrival : arrivals) {
            EXPECT_TRUE(arrival.get()) << "seed " << seed << ", round " << round;
        }
        std::this_thread::sleep_for(kIdleInterval +
                                    std::chrono::microseconds(microsecondsAround(random)));
    }
}

}  // namespace
