#include "bench/Wire.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <fstream>
#include <stdexcept>
#include <system_error>

namespace bench {
namespace {

using platform::OwnedFd;

union ControlBuffer {
    cmsghdr header;
    std::array<std::byte, CMSG_SPACE(sizeof(int))> bytes;
};

[[noreturn]] void Fail(const char* what) {
    throw std::system_error(errno, std::generic_category(), what);
}

iovec PartOf(std::span<const std::byte> bytes) {
    return {.iov_base = const_cast<std::byte*>(bytes.data()), .iov_len = bytes.size()};
}

sockaddr_un Address(std::string_view path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.data(), path.size());
    return address;
}

OwnedFd LocalSocket() {
    OwnedFd socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    if (!socket.isOpen()) {
        Fail("socket");
    }
    return socket;
}

}  // namespace

phone::Bytes RefusedRequest() {
    return phone::Message(kFirstRoutineId, kRequestSize, platform::MACH_MSGH_BITS_COMPLEX);
}

void Send(int socket, std::span<const std::byte> datagram) {
    iovec part = PartOf(datagram);
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    if (sendmsg(socket, &message, MSG_NOSIGNAL) < 0) {
        Fail("sendmsg");
    }
}

void Receive(int socket, std::size_t expectedSize) {
    std::array<std::byte, 512> buffer;
    iovec part = PartOf(buffer);
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    if (recvmsg(socket, &message, 0) != static_cast<ssize_t>(expectedSize)) {
        Fail("recvmsg");
    }
}

void SendWithDescriptor(int socket, std::span<const std::byte> datagram, int descriptor) {
    ControlBuffer control{};
    control.header = {
        .cmsg_len = CMSG_LEN(sizeof(int)), .cmsg_level = SOL_SOCKET, .cmsg_type = SCM_RIGHTS};
    std::memcpy(CMSG_DATA(&control.header), &descriptor, sizeof descriptor);
    iovec part = PartOf(datagram);
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = &control;
    message.msg_controllen = sizeof control;
    if (sendmsg(socket, &message, MSG_NOSIGNAL) < 0) {
        Fail("sendmsg");
    }
}

OwnedFd ReceiveWithDescriptor(int socket, std::size_t smallest) {
    std::array<std::byte, 512> buffer;
    ControlBuffer control;
    iovec part = PartOf(buffer);
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = &control;
    message.msg_controllen = sizeof control;
    if (recvmsg(socket, &message, MSG_CMSG_CLOEXEC) < static_cast<ssize_t>(smallest)) {
        Fail("recvmsg");
    }
    const cmsghdr* const header = CMSG_FIRSTHDR(&message);
    int descriptor = -1;
    if (header != nullptr) {
        std::memcpy(&descriptor, CMSG_DATA(header), sizeof descriptor);
    }
    return OwnedFd(descriptor);
}

void ServeBlocking(int socket) {
    std::array<std::byte, 512> request;
    const std::array<std::byte, kReplySize> reply{};
    for (;;) {
        iovec part = PartOf(request);
        msghdr message{};
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        if (recvmsg(socket, &message, 0) <= 0) {
            return;
        }
        Send(socket, reply);
    }
}

double TimeRequests(int socket, int count, int outstanding) {
    static const phone::Bytes request = RefusedRequest();
    const auto start = std::chrono::steady_clock::now();
    for (int done = 0; done < count; done += outstanding) {
        for (int i = 0; i < outstanding; ++i) {
            Send(socket, request);
        }
        for (int i = 0; i < outstanding; ++i) {
            Receive(socket, kReplySize);
        }
    }
    const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - start;
    return taken.count() / count;
}

void BecomeEntitled() {
    if (setegid(phone::kEntitledGroup) != 0) {
        Fail("setegid");
    }
}

OwnedFd ConnectTo(std::string_view path) {
    OwnedFd socket = LocalSocket();
    const auto address = Address(path);
    if (connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        Fail("connect");
    }
    return socket;
}

OwnedFd ListenAt(std::string_view path) {
    OwnedFd socket = LocalSocket();
    const auto address = Address(path);
    unlink(address.sun_path);
    if (bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        listen(socket.get(), SOMAXCONN) != 0) {
        Fail("listen");
    }
    return socket;
}

CheckedIn CheckIn() {
    static const phone::Bytes request = phone::CheckInMessage();
    std::array<int, 2> ends{-1, -1};
    if (pipe2(ends.data(), O_CLOEXEC) != 0) {
        Fail("pipe");
    }
    CheckedIn client{.watch = OwnedFd(ends[0]), .privatePort = {}};
    const OwnedFd passed(ends[1]);
    const OwnedFd service = ConnectTo(phone::kServicePath);
    SendWithDescriptor(service.get(), request, passed.get());
    client.privatePort = ReceiveWithDescriptor(service.get(), kReplySize);
    if (!client.privatePort.isOpen()) {
        throw std::runtime_error("the check-in was refused");
    }
    return client;
}

long ProcessNumber(pid_t pid, const char* file, std::string_view name) {
    std::ifstream lines("/proc/" + std::to_string(pid) + "/" + file);
    for (std::string line; std::getline(lines, line);) {
        if (line.starts_with(name)) {
            return std::stol(line.substr(name.size()));
        }
    }
    throw std::runtime_error("no " + std::string(name) + " of the process");
}

}  // namespace bench
