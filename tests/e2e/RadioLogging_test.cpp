// Routine 21 through the real daemon, with a system bus and a modem manager of our own, without
// them, and with a bus that never answers.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>

#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

using Lines = std::vector<std::string>;

constexpr const char* kSocket = "/run/dbus/system_bus_socket";
constexpr const char* kRecord = "/run/modem-manager";
constexpr const char* kConfiguration = "/run/bus.conf";

/// A program that runs for as long as this lives.
class Program {
public:
    explicit Program(std::vector<std::string> words, const char* output = "/dev/null") {
        std::vector<char*> arguments;
        for (std::string& word : words) {
            arguments.push_back(word.data());
        }
        arguments.push_back(nullptr);
        pid_ = fork();
        if (pid_ == 0) {
            prctl(PR_SET_PDEATHSIG, SIGKILL);
            const int file = open(output, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
            dup2(file, STDOUT_FILENO);
            dup2(file, STDERR_FILENO);
            execv(arguments[0], arguments.data());
            _exit(127);
        }
    }

    ~Program() {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }

    Program(const Program&) = delete;
    Program& operator=(const Program&) = delete;

private:
    pid_t pid_ = -1;
};

std::vector<std::string> Recorded() {
    std::vector<std::string> lines;
    std::ifstream file(kRecord);
    for (std::string line; std::getline(file, line);) {
        lines.push_back(line);
    }
    return lines;
}

/// For when requests from before the modem manager came may or may not have reached it.
bool EventuallyEndsIn(const std::string& level) {
    return phone::Eventually([&level] {
        const auto lines = Recorded();
        return !lines.empty() && lines.back() == level;
    });
}

/// A bus as a system has it, but for its rules: everybody may do everything.
class Bus {
public:
    explicit Bus(const std::string& socket = kSocket)
        : program_({"/usr/bin/dbus-daemon", "--nofork", "--config-file", configuration(socket)}) {
        EXPECT_TRUE(phone::Eventually([&socket] { return fs::exists(socket); }));
    }

private:
    static std::string configuration(const std::string& socket) {
        fs::remove(socket);
        std::ofstream(kConfiguration)
            << "<!DOCTYPE busconfig PUBLIC '-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN' "
               "'http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd'><busconfig>"
               "<listen>unix:path="
            << socket
            << "</listen><auth>EXTERNAL</auth><policy context='default'>"
               "<allow user='*'/><allow own='*'/><allow send_destination='*'/>"
               "<allow receive_sender='*'/></policy></busconfig>";
        return kConfiguration;
    }

    Program program_;
};

class ModemManager {
public:
    explicit ModemManager(const std::string& socket = kSocket) : program_(words(socket), kRecord) {
        EXPECT_TRUE(phone::Eventually([] { return !Recorded().empty(); }));
    }

private:
    /// What an earlier one wrote down would be taken for this one's.
    static std::vector<std::string> words(const std::string& socket) {
        fs::remove(kRecord);
        return {phone::ProgramPath("linefold-sim"), "modem-manager", "--bus", socket};
    }

    Program program_;
};

/// What should be a bus, and takes connections without ever a word.
platform::OwnedFd SilentBus() {
    fs::remove(kSocket);
    platform::OwnedFd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::char_traits<char>::copy(address.sun_path, kSocket, std::string_view(kSocket).size());
    EXPECT_EQ(bind(socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(listen(socket.get(), 64), 0);
    return socket;
}

class RadioLogging : public testing::Test {
protected:
    RadioLogging() {
        fs::create_directories("/run/dbus");
        fs::remove(kSocket);
    }

    [[nodiscard]] std::int32_t set(std::int32_t isEnabled) const {
        auto request = phone::Message(8683570, 36);
        platform::Store(std::span<std::byte>(request), 32, isEnabled);
        const auto reply = client_.privatePort.call(request);
        return reply.bytes.size() == 36 ? reply.code() : -1;
    }

    /// Whether the modem manager is told these levels, in this order, and nothing else.
    [[nodiscard]] static testing::AssertionResult tells(Lines levels) {
        levels.insert(levels.begin(), "ready");
        if (phone::Eventually([&levels] { return Recorded() == levels; })) {
            return testing::AssertionSuccess();
        }
        return testing::AssertionFailure() << testing::PrintToString(Recorded());
    }

    phone::Daemon daemon_;
    phone::Client client_ = phone::Client::checkIn();
    phone::LogReader journal_ = phone::LogReader::journal();
    phone::LogReader systemLog_ = phone::LogReader::systemLog();
};

TEST_F(RadioLogging, IsSwitchedAtTheModemManagerInOrder) {
    const Bus bus;
    const ModemManager modemManager;
    EXPECT_EQ(set(1), 0);
    EXPECT_EQ(set(0), 0);
    EXPECT_EQ(set(-7), 0);
    EXPECT_TRUE(tells({"root DEBUG", "root ERR", "root DEBUG"}));
    EXPECT_EQ(systemLog_.take(),
              (Lines{"3 3 Enabling wireless radio manager logs: 1",
                     "3 3 Enabling wireless radio manager logs: 0",
                     "3 3 Enabling wireless radio manager logs: -7"}));
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(RadioLogging, IsLoggedAndNothingElseWithoutABus) {
    EXPECT_EQ(set(7), 0);
    EXPECT_EQ(systemLog_.take(), Lines{"3 3 Enabling wireless radio manager logs: 7"});
    const Bus bus;
    const ModemManager modemManager;
    EXPECT_EQ(set(0), 0);
    EXPECT_TRUE(EventuallyEndsIn("root ERR")) << "the bus that comes later is used";
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(RadioLogging, IsLoggedAndNothingElseWithoutAModemManager) {
    const Bus bus;
    EXPECT_EQ(set(1), 0);
    const ModemManager modemManager;
    EXPECT_EQ(set(0), 0);
    EXPECT_TRUE(EventuallyEndsIn("root ERR"));
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(RadioLogging, IsLoggedAndNothingElseWithoutTheModule) {
    const fs::path module = "/usr/lib/linefold/libLinefoldRadio.so";
    fs::rename(module, "/usr/lib/linefold/away");
    EXPECT_EQ(set(1), 0);
    EXPECT_EQ(set(0), 0);
    EXPECT_EQ(systemLog_.take().size(), 2U);
    EXPECT_EQ(journal_.take(), Lines{});
    fs::rename("/usr/lib/linefold/away", module);
}

TEST_F(RadioLogging, MakesNobodyWaitForABusThatDoesNotAnswer) {
    const auto bus = SilentBus();
    EXPECT_EQ(set(1), 0);
    const platform::OwnedFd connection(accept4(bus.get(), nullptr, nullptr, SOCK_CLOEXEC));
    ASSERT_TRUE(connection.isOpen());
    for (int i = 0; i < 20; ++i) {
        ASSERT_EQ(client_.callTexts(8683549, {"token"}), 0);
    }
    // It says who it is and waits: while it does, all of the above was served.
    std::array<char, 4096> said{};
    EXPECT_GT(recv(connection.get(), said.data(), said.size(), 0), 0);
    EXPECT_EQ(recv(connection.get(), said.data(), said.size(), MSG_DONTWAIT), -1) << "still there";
    pollfd end{.fd = connection.get(), .events = POLLIN, .revents = 0};
    EXPECT_EQ(poll(&end, 1, 20'000), 1) << "and gives up";
    EXPECT_EQ(recv(connection.get(), said.data(), said.size(), MSG_DONTWAIT), 0);
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(RadioLogging, ReachesItsLastStateBehindABusThatDoesNotAnswer) {
    const std::string other = "/run/dbus/other";
    const Bus bus(other);
    const ModemManager modemManager(other);
    const auto silent = SilentBus();
    EXPECT_EQ(set(1), 0);
    platform::OwnedFd first(accept4(silent.get(), nullptr, nullptr, SOCK_CLOEXEC));
    for (int i = 0; i < 50; ++i) {
        EXPECT_EQ(set(1), 0);
    }
    EXPECT_EQ(set(0), 0);
    fs::rename(other, kSocket);
    first.reset();
    EXPECT_TRUE(EventuallyEndsIn("root ERR"));
    EXPECT_LE(Recorded().size(), 9U) << "the first line, and eight that waited";
}

TEST_F(RadioLogging, IsNoObstacleToTheEndOfTheDaemon) {
    const auto bus = SilentBus();
    EXPECT_EQ(set(1), 0);
    const platform::OwnedFd connection(accept4(bus.get(), nullptr, nullptr, SOCK_CLOEXEC));
    ASSERT_TRUE(connection.isOpen());
    daemon_.signal(SIGTERM);
    EXPECT_EQ(daemon_.waitForExit(), 0);
}

}  // namespace
