// A service for tests: a listening socket in a folder of its own, and a script that plays its part.
#pragma once

#include <dirent.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "client/Descriptor.h"

namespace fake {

using Bytes = std::vector<std::uint8_t>;
using linefold_client::Descriptor;

template <typename T>
void Put(Bytes& bytes, std::size_t offset, T value) {
    if (bytes.size() < offset + sizeof value) {
        bytes.resize(offset + sizeof value);
    }
    std::memcpy(bytes.data() + offset, &value, sizeof value);
}

template <typename T>
T Get(const Bytes& bytes, std::size_t offset) {
    T value{};
    if (offset + sizeof value <= bytes.size()) {
        std::memcpy(&value, bytes.data() + offset, sizeof value);
    }
    return value;
}

/// What arrived in one datagram; empty bytes stand for the end of the connection.
struct Message {
    Bytes bytes;
    Descriptor descriptor;
};

/// A script that waits for what never comes ends, so a client that does wrong fails its test.
inline void BoundWaiting(const Descriptor& socket) {
    const timeval limit{.tv_sec = 10, .tv_usec = 0};
    (void)setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
}

inline Message Receive(int connection) {
    Message message;
    message.bytes.resize(128 * 1024);
    iovec part{message.bytes.data(), message.bytes.size()};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
    msghdr header{};
    header.msg_iov = &part;
    header.msg_iovlen = 1;
    header.msg_control = control.data();
    header.msg_controllen = CMSG_LEN(sizeof(int));
    const ssize_t size = recvmsg(connection, &header, MSG_CMSG_CLOEXEC);
    message.bytes.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
    // A failed call leaves the control buffer as it was given.
    const cmsghdr* const item = size < 0 ? nullptr : CMSG_FIRSTHDR(&header);
    if (item != nullptr) {
        int number = -1;
        std::memcpy(&number, CMSG_DATA(item), sizeof number);
        message.descriptor = Descriptor(number);
    }
    return message;
}

inline void Send(int connection, Bytes bytes, const std::vector<int>& descriptors = {}) {
    iovec part{bytes.data(), bytes.size()};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(4 * sizeof(int))> control{};
    msghdr header{};
    header.msg_iov = &part;
    header.msg_iovlen = 1;
    if (!descriptors.empty()) {
        header.msg_control = control.data();
        header.msg_controllen = CMSG_SPACE(descriptors.size() * sizeof(int));
        cmsghdr* const item = CMSG_FIRSTHDR(&header);
        item->cmsg_level = SOL_SOCKET;
        item->cmsg_type = SCM_RIGHTS;
        item->cmsg_len = CMSG_LEN(descriptors.size() * sizeof(int));
        std::memcpy(CMSG_DATA(item), descriptors.data(), descriptors.size() * sizeof(int));
    }
    (void)sendmsg(connection, &header, MSG_NOSIGNAL);
}

/// A reply without a body that its caller does not write: header, NDR record and return code.
inline Bytes SimpleReply(std::int32_t requestId, std::int32_t code, std::uint32_t size = 36) {
    Bytes reply(size);
    Put<std::uint32_t>(reply, 4, size);
    Put<std::int32_t>(reply, 20, requestId + 100);
    Put<std::uint32_t>(reply, 28, 1);
    Put(reply, 32, code);
    return reply;
}

/// A 56-byte reply that announces out-of-line data, with the data behind it.
inline Bytes BulkReply(std::int32_t requestId, std::uint32_t size, const Bytes& behind = {}) {
    Bytes reply(56 + behind.size());
    std::copy(behind.begin(), behind.end(), reply.begin() + 56);
    Put<std::uint32_t>(reply, 0, 0x80000000);
    Put<std::uint32_t>(reply, 4, 56);
    Put<std::int32_t>(reply, 20, requestId + 100);
    Put<std::uint32_t>(reply, 24, 1);
    Put<std::uint32_t>(reply, 36, 0x01000101);
    Put(reply, 40, size);
    Put<std::uint32_t>(reply, 48, 1);
    Put(reply, 52, size);
    return reply;
}

inline Bytes PortReply() {
    Bytes reply(40);
    Put<std::uint32_t>(reply, 0, 0x80000000);
    Put<std::uint32_t>(reply, 4, 40);
    Put<std::int32_t>(reply, 20, 4792274);
    Put<std::uint32_t>(reply, 24, 1);
    Put<std::uint32_t>(reply, 28, 0x1234);
    Put<std::uint8_t>(reply, 38, 19);
    return reply;
}

enum class Seals { kAll, kAllButShrink, kNone };

inline Descriptor MemoryFile(const Bytes& data, Seals seals = Seals::kAll) {
    Descriptor file(memfd_create("test", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    for (std::size_t done = 0; done < data.size();) {
        const ssize_t written = write(file.get(), data.data() + done, data.size() - done);
        if (written <= 0) {
            std::abort();
        }
        done += static_cast<std::size_t>(written);
    }
    const int shrink = seals == Seals::kAll ? F_SEAL_SHRINK : 0;
    if (seals != Seals::kNone &&
        fcntl(file.get(), F_ADD_SEALS, F_SEAL_WRITE | F_SEAL_GROW | shrink) != 0) {
        std::abort();
    }
    return file;
}

inline std::pair<Descriptor, Descriptor> SocketPair(int type = SOCK_SEQPACKET) {
    std::array<int, 2> ends{-1, -1};
    if (socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, ends.data()) != 0) {
        std::abort();
    }
    return {Descriptor(ends[0]), Descriptor(ends[1])};
}

/// Descriptors that this process has open.
inline std::size_t OpenDescriptors() {
    DIR* const folder = opendir("/proc/self/fd");
    std::size_t count = 0;
    while (readdir(folder) != nullptr) {
        ++count;
    }
    closedir(folder);
    return count;
}

/// A client that has checked in: the end of its private port, and its watch port.
struct Session {
    Descriptor port;
    Descriptor watch;
};

class Service {
public:
    using Script = std::function<void(Service&)>;

    Service() {
        std::string pattern = "/tmp/linefold-client-test-XXXXXX";
        folder_ = mkdtemp(pattern.data());
        path_ = folder_ + "/service";
        bindAnew();
    }

    Service(const Service&) = delete;
    Service& operator=(const Service&) = delete;

    ~Service() {
        finish();
        (void)unlink(path_.c_str());
        (void)rmdir(folder_.c_str());
    }

    /// Listens, and plays the script on a thread of its own.
    void play(Script script) {
        startListening();
        thread_ = std::thread([this, script = std::move(script)] {
            script(*this);
            // Whoever connects now is refused and does not wait for an answer.
            listener_.reset();
        });
    }

    void finish() {
        if (thread_.joinable()) {
            thread_.join();
        }
    }

    void startListening() { (void)listen(listener_.get(), 64); }

    [[nodiscard]] const char* path() const { return path_.c_str(); }

    [[nodiscard]] Descriptor accept() {
        Descriptor connection(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
        BoundWaiting(connection);
        return connection;
    }

    /// Takes one client through its check-in.
    [[nodiscard]] Session checkIn(int pairFlags = 0) {
        const Descriptor connection = accept();
        Message request = Receive(connection.get());
        auto [ours, theirs] = SocketPair(SOCK_SEQPACKET | pairFlags);
        BoundWaiting(ours);
        BoundWaiting(request.descriptor);
        Send(connection.get(), PortReply(), {theirs.get()});
        checkInRequest = std::move(request.bytes);
        return {.port = std::move(ours), .watch = std::move(request.descriptor)};
    }

    Bytes checkInRequest;

private:
    void bindAnew() {
        listener_ = Descriptor(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
        BoundWaiting(listener_);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::memcpy(address.sun_path, path_.c_str(), path_.size());
        if (bind(listener_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) !=
            0) {
            std::abort();
        }
    }

    std::string folder_;
    std::string path_;
    Descriptor listener_;
    std::thread thread_;
};

}  // namespace fake
