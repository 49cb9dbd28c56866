// A log's reader, for tests: a datagram socket at a path, which may read or stall.
#pragma once

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <optional>
#include <string>

#include "platform/linux/OwnedFd.h"

namespace platform {

/// Takes the place of whatever is at the path; the path goes with it.
class DatagramReader {
public:
    explicit DatagramReader(std::string path)
        : path_(std::move(path)),
          socket_(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
        sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
        path_.copy(address.sun_path, sizeof address.sun_path - 1);
        unlink(path_.c_str());
        isBound_ =
            bind(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
    }

    ~DatagramReader() { unlink(path_.c_str()); }

    DatagramReader(const DatagramReader&) = delete;
    DatagramReader& operator=(const DatagramReader&) = delete;

    [[nodiscard]] bool isBound() const { return isBound_; }

    /// The next datagram that has arrived, or none.
    [[nodiscard]] std::optional<std::string> take() const {
        std::array<char, 65'536> bytes{};
        const ssize_t length = recv(socket_.get(), bytes.data(), bytes.size(), 0);
        return length < 0
                   ? std::nullopt
                   : std::optional(std::string(bytes.data(), static_cast<std::size_t>(length)));
    }

    /// Takes all that has arrived and tells how much it was.
    int drain() const {
        int count = 0;
        while (take()) {
            ++count;
        }
        return count;
    }

private:
    const std::string path_;
    const OwnedFd socket_;
    bool isBound_ = false;
};

}  // namespace platform
