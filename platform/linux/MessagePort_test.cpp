#include "platform/MessagePort.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cstring>
#include <filesystem>
#include <fstream>

#include "platform/MachMessage.h"
#include "platform/linux/OwnedFd.h"
#include "platform/linux/ServiceSocket.h"

namespace platform {
namespace {

namespace fs = std::filesystem;

using Bytes = std::vector<std::byte>;

const std::string kName = "com.vendra.test.port";

std::string PathOf(const std::string& name) {
    return std::string(kServiceDirectory) + "/" + name;
}

bool Send(const std::string& name, std::string_view text = "data", std::int32_t id = 0) {
    return MessagePortSendRequest(name, id, std::as_bytes(std::span(text)));
}

/// A listening socket at the port's path.
OwnedFd Own(int type = SOCK_SEQPACKET, int backlog = 8) {
    fs::create_directories(kServiceDirectory);
    fs::remove(PathOf(kName));
    OwnedFd socket(::socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strcpy(address.sun_path, PathOf(kName).c_str());
    EXPECT_EQ(bind(socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    if (type != SOCK_DGRAM) {
        EXPECT_EQ(listen(socket.get(), backlog), 0);
    }
    return socket;
}

OwnedFd Accept(const OwnedFd& listening) {
    return OwnedFd(accept4(listening.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
}

/// The next datagram of a connection; empty at its end.
Bytes Receive(const OwnedFd& connection) {
    Bytes datagram(1 << 20);
    const ssize_t size = recv(connection.get(), datagram.data(), datagram.size(), 0);
    datagram.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
    return datagram;
}

class MessagePortTest : public testing::Test {
protected:
    MessagePortTest() { fs::remove_all(PathOf(kName)); }

    ~MessagePortTest() override { fs::remove_all(PathOf(kName)); }
};

TEST_F(MessagePortTest, SendsAHeaderAndTheDataBehindIt) {
    const OwnedFd port = Own();
    EXPECT_TRUE(Send(kName, "some data", 7));
    const auto message = Receive(Accept(port));
    ASSERT_EQ(message.size(), 24U + 9U);
    const auto header = Load<MachMsgHeader>(std::span<const std::byte>(message), 0);
    EXPECT_EQ(header.size, 33U);
    EXPECT_EQ(header.id, 7);
    EXPECT_EQ(header.bits | header.localPort | header.remotePort | header.voucherPort, 0U);
    EXPECT_EQ(std::memcmp(message.data() + 24, "some data", 9), 0);
}

TEST_F(MessagePortTest, SendsEachMessageOnAConnectionOfItsOwn) {
    const OwnedFd port = Own();
    EXPECT_TRUE(Send(kName, "1"));
    EXPECT_TRUE(Send(kName, "", -1));
    const OwnedFd first = Accept(port);
    EXPECT_EQ(Receive(first).size(), 25U);
    EXPECT_EQ(Receive(first).size(), 0U) << "the connection has ended";
    EXPECT_EQ(Receive(Accept(port)).size(), 24U);
}

TEST_F(MessagePortTest, SendsNothingWhereNobodyIs) {
    EXPECT_FALSE(Send(kName));
    { const OwnedFd gone = Own(); }
    ASSERT_TRUE(fs::exists(PathOf(kName)));
    EXPECT_FALSE(Send(kName)) << "its owner is gone";
}

TEST_F(MessagePortTest, DoesNotWaitForAnOwnerThatTakesNoMore) {
    const OwnedFd port = Own(SOCK_SEQPACKET, 2);
    int sent = 0;
    while (sent < 100 && Send(kName)) {
        ++sent;
    }
    EXPECT_GT(sent, 0);
    EXPECT_LT(sent, 10) << "and returns at once when the owner is full";
    EXPECT_EQ(Receive(Accept(port)).size(), 28U);
    EXPECT_TRUE(Send(kName)) << "there is room again";
}

TEST_F(MessagePortTest, SendsNothingThatIsTooLargeForADatagram) {
    const OwnedFd port = Own();
    EXPECT_FALSE(Send(kName, std::string(64 << 20, 'x')));
    EXPECT_EQ(Receive(Accept(port)).size(), 0U);
    EXPECT_TRUE(Send(kName, std::string(64 << 10, 'x')));
    EXPECT_EQ(Receive(Accept(port)).size(), 24U + (64U << 10));
}

TEST_F(MessagePortTest, SendsNothingToAPathThatIsNoSocket) {
    fs::create_directories(kServiceDirectory);
    std::ofstream(PathOf(kName)) << "file";
    EXPECT_FALSE(Send(kName));
    fs::remove(PathOf(kName));
    ASSERT_EQ(mkfifo(PathOf(kName).c_str(), 0666), 0);
    EXPECT_FALSE(Send(kName));
    fs::remove(PathOf(kName));
    fs::create_directory(PathOf(kName));
    EXPECT_FALSE(Send(kName));
}

TEST_F(MessagePortTest, SendsNothingThroughALink) {
    const OwnedFd port = Own();
    const std::string link = "com.vendra.test.link";
    fs::create_symlink(kName, PathOf(link));
    EXPECT_FALSE(Send(link));
    fs::remove(PathOf(link));
}

TEST_F(MessagePortTest, SendsNothingToASocketOfAnotherType) {
    for (const int type : {SOCK_STREAM, SOCK_DGRAM}) {
        const OwnedFd port = Own(type);
        EXPECT_FALSE(Send(kName)) << type;
    }
}

TEST_F(MessagePortTest, KnowsNamesThatNameNoPort) {
    for (const std::string& name : {std::string(),
                                    std::string("."),
                                    std::string(".."),
                                    "../linefold/" + kName,
                                    "/" + kName,
                                    kName + std::string(1, '\0'),
                                    std::string(100, 'x'),
                                    std::string(100'000, 'x')}) {
        EXPECT_FALSE(Send(name));
    }
}

TEST_F(MessagePortTest, LeavesNoDescriptorOpen) {
    const auto descriptors = [] {
        return std::distance(fs::directory_iterator("/proc/self/fd"), {});
    };
    const OwnedFd port = Own();
    const auto before = descriptors();
    EXPECT_TRUE(Send(kName));
    EXPECT_FALSE(Send("nobody"));
    EXPECT_FALSE(Send(kName, std::string(64 << 20, 'x')));
    EXPECT_EQ(descriptors(), before);
}

}  // namespace
}  // namespace platform
