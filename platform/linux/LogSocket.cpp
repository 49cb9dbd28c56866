#include "platform/linux/LogSocket.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <cerrno>
#include <cstring>

namespace platform {

bool LogSocket::connect() {
    OwnedFd socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path_, sizeof address.sun_path - 1);
    if (!socket.isOpen() ||
        ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        return false;
    }
    socket_ = std::move(socket);
    return true;
}

LogSocket::Outcome LogSocket::send(const std::string& entry) {
    const std::lock_guard guard(lock_);
    // A reader that was started anew is found on the second try.
    for (int attempt = 0; attempt < 2; ++attempt) {
        if (!socket_.isOpen() && !connect()) {
            return Outcome::kAbsent;
        }
        if (::send(socket_.get(), entry.data(), entry.size(), MSG_DONTWAIT | MSG_NOSIGNAL) >= 0) {
            return Outcome::kSent;
        }
        if (errno == EAGAIN || errno == EMSGSIZE || errno == ENOBUFS) {
            ++dropped_;
            return Outcome::kDropped;
        }
        socket_.reset();
    }
    return Outcome::kAbsent;
}

void WriteToStandardError(const std::string& text) {
    std::string line = std::string(kLogIdentity) + ": " + text;
    if (line.ends_with('\n')) {
        line.pop_back();
    }
    line += '\n';
    (void)!write(STDERR_FILENO, line.data(), line.size());  // there is nowhere left to complain
}

}  // namespace platform
