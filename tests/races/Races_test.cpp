// Lives of the daemon in which its main loop and its queues do everything at once, and which end in
// the middle of it.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <thread>

#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

constexpr int kLives = 6;
constexpr int kClients = 4;
constexpr int kRequestsMax = 2000;

/// A request of a row, with a number where it takes one.
phone::Bytes Request(std::int32_t id, std::int32_t number = 0) {
    const RoutineLayout& layout = *FindRoutineLayout(id);
    auto request = phone::Message(id, layout.requestSize);
    if (layout.requestSize >= 36) {
        platform::Store(std::span<std::byte>(request), 32, number);
    }
    return request;
}

/// What goes on behind its reply, beside something that does not.
std::vector<phone::Bytes> Questions() {
    return {Request(8683562, 1),   // the heartbeat, on
            Request(8683562, 0),   // and off
            Request(8683563, 31),  // all databases
            Request(8683567, 7),   // the address of a place
            Request(8683568),      // the country
            Request(8683569),      // the public address
            Request(8683570, 1)};  // radio logging
}

/// Comes, asks and goes, again and again, until the daemon is gone.
void BeAClient(int first, std::atomic<int>& answers) {
    const auto questions = Questions();
    for (int asked = 0; asked < kRequestsMax;) {
        const auto client = phone::Client::checkIn();
        if (client.code != 0) {
            return;
        }
        for (int i = 0; i < 5; ++i, ++asked) {
            const auto& question = questions.at(static_cast<std::size_t>(first + asked) % 7);
            if (client.privatePort.call(question).isEnd()) {
                return;
            }
            ++answers;
        }
    }
}

std::string Read(const fs::path& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// The reports of the sanitizer, which writes one file for each process.
std::string Reports(const fs::path& folder) {
    std::string reports;
    for (const auto& entry : fs::directory_iterator(folder)) {
        reports += Read(entry.path());
    }
    return reports;
}

/// A simulated service, until the end of the object.
class Simulator {
public:
    Simulator(const std::string& words, const std::string& network)
        : log_("/tmp/simulator-" + words) {
        const std::string command = (network.empty() ? "" : "nsenter --net=" + network + " ") +
                                    phone::ProgramPath("linefold-sim") + " " + words + " >" + log_ +
                                    " 2>&1 & echo $! >" + log_ + ".pid";
        EXPECT_EQ(std::system(command.c_str()), 0);
        EXPECT_TRUE(phone::Eventually([&] { return Read(log_).starts_with("ready"); })) << words;
        pid_ = std::stoi(Read(log_ + ".pid"));
    }

    Simulator(const Simulator&) = delete;
    Simulator& operator=(const Simulator&) = delete;

    ~Simulator() { kill(pid_, SIGTERM); }

    /// What it has said so far.
    [[nodiscard]] std::ptrdiff_t lines() const { return std::ranges::count(Read(log_), '\n'); }

private:
    const std::string log_;
    pid_t pid_ = 0;
};

constexpr const char* kGateway = "/run/netns/gateway";
constexpr const char* kPlatform =
    "<plist version=\"1.0\"><dict><key>CountryCode</key><string>DE</string>"
    "<key>ReverseGeocodeURL</key><string>http://198.51.100.1:8080/reverse</string>"
    "<key>StunServer</key><string>198.51.100.1:3478</string></dict></plist>";

TEST(Races, AreNotBetweenTheMainLoopAndTheQueues) {
    phone::ResetMobileHome();
    std::ofstream("/etc/linefold/platform.plist") << kPlatform;
    const Simulator telephony("telephony", "");
    const Simulator geocoder("geocoder", kGateway);
    const Simulator stun("stun", kGateway);
    fs::create_directories("/tmp/reports");
    setenv("TSAN_OPTIONS", "log_path=/tmp/reports/report exitcode=66", 1);
    for (int life = 0; life < kLives; ++life) {
        phone::Daemon daemon({.isActivated = false});  // nobody waits for a next one
        std::atomic<int> answers = 0;
        std::vector<std::thread> clients;
        for (int i = 0; i < kClients; ++i) {
            clients.emplace_back([&answers, i] { BeAClient(i, answers); });
        }
        const auto reports = telephony.lines();
        EXPECT_TRUE(phone::Eventually([&] {
            return answers > 50 * (life + 1) && telephony.lines() > reports + life % 3;
        })) << "nothing reaches the telephony daemon";
        daemon.signal(SIGTERM);
        EXPECT_EQ(daemon.waitForExit(), 0) << Reports("/tmp/reports");
        for (auto& client : clients) {
            client.join();
        }
    }
    unsetenv("TSAN_OPTIONS");
    EXPECT_EQ(Reports("/tmp/reports"), "");
}

#ifdef __SANITIZE_THREAD__
/// What the sanitizer is there for.
void Race() {
    int number = 0;
    std::thread other([&] { ++number; });
    ++number;
    other.join();
}

TEST(RacesDeathTest, AreReported) {
    EXPECT_EXIT((Race(), std::exit(0)), testing::ExitedWithCode(66), "data race");
}
#endif

}  // namespace
