#include "platform/linux/ServiceSocket.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>

#include <array>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <vector>

namespace platform {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view kName = "com.example.service";
const std::string kPath = std::string(kServiceDirectory) + "/com.example.service";

sockaddr_un Address(const std::string& path) {
    sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    return address;
}

bool Bind(const OwnedFd& socket, const std::string& path) {
    const auto address = Address(path);
    return bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

bool CanConnect(const std::string& path) {
    const OwnedFd client(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const auto address = Address(path);
    return connect(client.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

OwnedFd Socket(int domain, int type) {
    return OwnedFd(socket(domain, type | SOCK_CLOEXEC, 0));
}

/// At a path of its own, so that any number can be.
OwnedFd Listening(int type = SOCK_SEQPACKET) {
    static int count = 0;
    OwnedFd listening = Socket(AF_UNIX, type);
    const std::string path = "/tmp/listening" + std::to_string(++count);
    unlink(path.c_str());
    EXPECT_TRUE(Bind(listening, path));
    EXPECT_EQ(listen(listening.get(), 1), 0);
    return listening;
}

/// Runs in a process of its own, which exits as a program does; false comes back as failure.
bool InChild(const std::function<bool()>& body) {
    const pid_t pid = fork();
    if (pid == 0) {
        std::exit(body() ? 0 : 1);
    }
    int status = -1;
    return waitpid(pid, &status, 0) == pid && WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

struct Activation {
    std::string names = "";
    std::string count = "";
    std::string pid = "";  ///< empty: the process's own
};

/// The descriptor that is taken when these are handed over from 3 on; -1 for none.
int Taken(const std::vector<OwnedFd>& handedOver, const Activation& activation) {
    int taken = -1;
    std::array<int, 2> result{-1, -1};
    EXPECT_EQ(pipe2(result.data(), O_CLOEXEC), 0);
    const OwnedFd reading(result[0]);
    const OwnedFd writing(result[1]);
    EXPECT_TRUE(InChild([&] {
        constexpr int kOutOfTheWay = 100;
        std::vector<OwnedFd> copies;
        for (const OwnedFd& socket : handedOver) {
            copies.emplace_back(fcntl(socket.get(), F_DUPFD_CLOEXEC, kOutOfTheWay));
        }
        const OwnedFd answer(fcntl(writing.get(), F_DUPFD_CLOEXEC, kOutOfTheWay));
        for (int i = 0; i < static_cast<int>(copies.size()); ++i) {
            dup2(copies[static_cast<std::size_t>(i)].get(), 3 + i);
        }
        setenv("LISTEN_FDNAMES", activation.names.c_str(), 1);
        setenv("LISTEN_FDS", activation.count.c_str(), 1);
        const std::string pid = activation.pid.empty() ? std::to_string(getpid()) : activation.pid;
        setenv("LISTEN_PID", pid.c_str(), 1);
        const OwnedFd socket = TakeActivatedSocket(kName);
        const bool isMadeOurs =
            !socket.isOpen() || (fcntl(socket.get(), F_GETFD) == FD_CLOEXEC &&
                                 (fcntl(socket.get(), F_GETFL) & O_NONBLOCK) != 0);
        const int number = socket.get();
        return isMadeOurs && write(answer.get(), &number, sizeof number) == sizeof number;
    }));
    EXPECT_EQ(read(reading.get(), &taken, sizeof taken), static_cast<ssize_t>(sizeof taken));
    return taken;
}

template <typename... Sockets>
std::vector<OwnedFd> List(Sockets... sockets) {
    std::vector<OwnedFd> list;
    (list.push_back(std::move(sockets)), ...);
    return list;
}

const std::string kService(kName);

TEST(ActivatedSocket, IsFoundByItsNameAmongSeveral) {
    const auto sockets = List(Listening(), Listening(), Listening());
    EXPECT_EQ(Taken(sockets, {.names = kService + ":b:c", .count = "3"}), 3);
    EXPECT_EQ(Taken(sockets, {.names = "a:" + kService + ":c", .count = "3"}), 4);
    EXPECT_EQ(Taken(sockets, {.names = "a:b:" + kService, .count = "3"}), 5);
}

TEST(ActivatedSocket, OfAnotherNameIsNotOurs) {
    const auto sockets = List(Listening());
    for (const auto& names : {std::string("other"),
                              kService + "x",
                              std::string("x") + kService,
                              std::string(),
                              ":" + kService}) {
        EXPECT_EQ(Taken(sockets, {.names = names, .count = "1"}), -1) << names;
    }
}

TEST(ActivatedSocket, BeyondTheCountIsNotOurs) {
    const auto sockets = List(Listening(), Listening());
    for (const char* count : {"1", "0", "-1", "", "2x", "x", "99999999999", "1025"}) {
        EXPECT_EQ(Taken(sockets, {.names = "a:" + kService, .count = count}), -1) << count;
    }
}

TEST(ActivatedSocket, ForAnotherProcessIsNotOurs) {
    const auto sockets = List(Listening());
    for (const char* pid : {"1", "0", "-1", "x", "1x"}) {
        EXPECT_EQ(Taken(sockets, {.names = kService, .count = "1", .pid = pid}), -1) << pid;
    }
}

TEST(ActivatedSocket, MustListenAndBeOfOurKind) {
    const auto refused = [](OwnedFd socket) {
        return Taken(List(std::move(socket)), {.names = kService, .count = "1"}) == -1;
    };
    EXPECT_TRUE(refused(Socket(AF_UNIX, SOCK_SEQPACKET)));
    EXPECT_TRUE(refused(Socket(AF_UNIX, SOCK_DGRAM)));
    EXPECT_TRUE(refused(Listening(SOCK_STREAM)));
    OwnedFd internet = Socket(AF_INET, SOCK_STREAM);
    ASSERT_EQ(listen(internet.get(), 1), 0);
    EXPECT_TRUE(refused(std::move(internet)));
    EXPECT_TRUE(refused(OwnedFd(open("/dev/null", O_RDONLY | O_CLOEXEC))));
}

TEST(ActivatedSocket, OfTwoWithOneNameTheOneThatListensIsTaken) {
    const auto sockets = List(Socket(AF_UNIX, SOCK_SEQPACKET), Listening());
    EXPECT_EQ(Taken(sockets, {.names = kService + ":" + kService, .count = "2"}), 4);
}

class BoundSocket : public testing::Test {
protected:
    BoundSocket() { clear(); }

    ~BoundSocket() override { clear(); }

    static void clear() {
        for (const char* ending : {"", ".lock", ".new"}) {
            fs::remove_all(kPath + ending);
        }
    }

    static bool refuses() {
        return InChild([] { return !BindServiceSocket(kName).isOpen(); });
    }
};

TEST_F(BoundSocket, ListensAtItsPathForEverybody) {
    EXPECT_TRUE(InChild([] {
        const OwnedFd bound = BindServiceSocket(kName);
        struct stat status {};
        return bound.isOpen() && CanConnect(kPath) && stat(kPath.c_str(), &status) == 0 &&
               S_ISSOCK(status.st_mode) && (status.st_mode & 0777) == 0666 &&
               !fs::exists(kPath + ".new");
    }));
}

TEST_F(BoundSocket, TakesItsPathAlongAtExit) {
    ASSERT_TRUE(InChild([] { return BindServiceSocket(kName).isOpen(); }));
    EXPECT_FALSE(fs::exists(fs::symlink_status(kPath)));
}

TEST_F(BoundSocket, LeavesAPathThatSomebodyElseHasTaken) {
    ASSERT_TRUE(InChild([] {
        const OwnedFd bound = BindServiceSocket(kName);
        fs::remove(kPath);
        std::ofstream(kPath) << "somebody else's";
        return bound.isOpen();
    }));
    EXPECT_TRUE(fs::is_regular_file(kPath));
}

TEST_F(BoundSocket, IsRefusedWhileSomebodyAliveHoldsIt) {
    const OwnedFd holder = Socket(AF_UNIX, SOCK_SEQPACKET);
    ASSERT_TRUE(Bind(holder, kPath));
    ASSERT_EQ(listen(holder.get(), 1), 0);
    EXPECT_TRUE(refuses());
    EXPECT_TRUE(CanConnect(kPath));
}

TEST_F(BoundSocket, IsRefusedWhileAHolderIsTooBusyToAccept) {
    const OwnedFd holder = Socket(AF_UNIX, SOCK_SEQPACKET);
    ASSERT_TRUE(Bind(holder, kPath));
    ASSERT_EQ(listen(holder.get(), 0), 0);
    const OwnedFd waiting = Socket(AF_UNIX, SOCK_SEQPACKET);
    const auto address = Address(kPath);
    ASSERT_EQ(connect(waiting.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address),
              0);
    EXPECT_TRUE(refuses());
    EXPECT_TRUE(fs::is_socket(kPath));
}

TEST_F(BoundSocket, TakesThePlaceOfADeadOne) {
    {
        const OwnedFd dead = Socket(AF_UNIX, SOCK_SEQPACKET);
        ASSERT_TRUE(Bind(dead, kPath));
        ASSERT_TRUE(Bind(Socket(AF_UNIX, SOCK_SEQPACKET), kPath + ".new"));
    }
    EXPECT_TRUE(InChild([] {
        const OwnedFd bound = BindServiceSocket(kName);
        return bound.isOpen() && CanConnect(kPath);
    }));
}

TEST_F(BoundSocket, IsRefusedWhileAnotherOneIsBinding) {
    const OwnedFd lock(open((kPath + ".lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    ASSERT_EQ(flock(lock.get(), LOCK_EX), 0);
    EXPECT_TRUE(refuses());
    EXPECT_FALSE(fs::exists(kPath));
}

TEST_F(BoundSocket, IsRefusedWhereALinkStandsForTheLock) {
    fs::create_symlink("/tmp/elsewhere", kPath + ".lock");
    EXPECT_TRUE(refuses());
    EXPECT_FALSE(fs::exists("/tmp/elsewhere"));
}

TEST_F(BoundSocket, IsRefusedWhereAFolderIsInTheWay) {
    fs::create_directories(kPath + "/inside");
    EXPECT_TRUE(refuses());
    EXPECT_TRUE(fs::is_directory(kPath + "/inside"));
}

TEST_F(BoundSocket, IsRefusedWhereAFileOrALinkIsInTheWay) {
    std::ofstream(kPath) << "somebody else's";
    EXPECT_TRUE(refuses());
    EXPECT_EQ(fs::file_size(kPath), 15U);
    fs::remove(kPath);
    fs::create_symlink("missing", kPath);
    EXPECT_TRUE(refuses());
    EXPECT_TRUE(fs::is_symlink(kPath));
}

TEST_F(BoundSocket, IsRefusedWhereThePathIsTooLong) {
    EXPECT_TRUE(InChild([] { return !BindServiceSocket(std::string(200, 'n')).isOpen(); }));
    fs::remove(std::string(kServiceDirectory) + "/" + std::string(200, 'n') + ".lock");
}

}  // namespace
}  // namespace platform
