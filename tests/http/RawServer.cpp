#include "tests/http/RawServer.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <poll.h>
#include <sched.h>
#include <sys/socket.h>

#include <array>
#include <cctype>
#include <cstdlib>

namespace web {
namespace {

constexpr int kTickMs = 20;

bool IsReady(int socket, short events, int milliseconds) {
    pollfd entry{.fd = socket, .events = events, .revents = 0};
    return poll(&entry, 1, milliseconds) == 1 && (entry.revents & events) != 0;
}

/// Everything up to the empty line; of what does not begin with a letter, the first byte.
std::string ReadRequest(int socket, const std::atomic<bool>& isStopping) {
    std::string request;
    while (!isStopping && request.find("\r\n\r\n") == std::string::npos) {
        char byte = 0;
        if (!IsReady(socket, POLLIN, kTickMs)) {
            continue;
        }
        if (recv(socket, &byte, 1, 0) != 1) {
            break;
        }
        request.push_back(byte);
        if (std::isalpha(static_cast<unsigned char>(request.front())) == 0) {
            break;
        }
    }
    return request;
}

platform::OwnedFd Listen(std::string_view address, std::string* origin) {
    const bool isV6 = address.find(':') != std::string_view::npos;
    platform::OwnedFd socket(::socket(isV6 ? AF_INET6 : AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in6 v6{};
    sockaddr_in v4{};
    v6.sin6_family = AF_INET6;
    v4.sin_family = AF_INET;
    const std::string text(address);
    auto* const place = isV6 ? reinterpret_cast<sockaddr*>(&v6) : reinterpret_cast<sockaddr*>(&v4);
    socklen_t size = isV6 ? sizeof v6 : sizeof v4;
    if (inet_pton(isV6 ? AF_INET6 : AF_INET,
                  text.c_str(),
                  isV6 ? static_cast<void*>(&v6.sin6_addr) : &v4.sin_addr) != 1 ||
        bind(socket.get(), place, size) != 0 || listen(socket.get(), 16) != 0 ||
        getsockname(socket.get(), place, &size) != 0) {
        std::abort();
    }
    const auto port = std::to_string(ntohs(isV6 ? v6.sin6_port : v4.sin_port));
    *origin = "http://" + (isV6 ? "[" + text + "]" : text) + ":" + port;
    return socket;
}

}  // namespace

std::string RawConnection::path() const {
    const auto start = request_.find(' ') + 1;
    return request_.substr(start, request_.find(' ', start) - start);
}

bool RawConnection::send(std::string_view bytes) const {
    while (!bytes.empty() && !isStopping_) {
        if (!IsReady(socket_, POLLOUT, kTickMs)) {
            continue;
        }
        const auto sent = ::send(socket_, bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        if (sent < 0 && errno != EAGAIN) {
            return false;
        }
        bytes.remove_prefix(sent < 0 ? 0 : static_cast<std::size_t>(sent));
    }
    return bytes.empty();
}

void RawConnection::pause(int milliseconds) const {
    std::array<char, 4096> ignored{};
    for (; milliseconds > 0 && !isStopping_; milliseconds -= kTickMs) {
        if (IsReady(socket_, POLLIN, kTickMs) &&
            recv(socket_, ignored.data(), ignored.size(), 0) <= 0) {
            return;
        }
    }
}

RawServer::RawServer(Script script, std::string_view address)
    : script_(std::move(script)),
      listening_(Listen(address, &origin_)),
      thread_([this] { serve(); }) {}

RawServer::~RawServer() {
    isStopping_ = true;
    thread_.join();
}

std::string RawServer::url(std::string_view path) const {
    return origin_ + std::string(path);
}

std::vector<std::string> RawServer::requests() const {
    const std::lock_guard guard(lock_);
    return requests_;
}

void RawServer::serve() {
    while (!isStopping_) {
        if (!IsReady(listening_.get(), POLLIN, kTickMs)) {
            continue;
        }
        const platform::OwnedFd client(accept4(listening_.get(), nullptr, nullptr, SOCK_CLOEXEC));
        const RawConnection connection(
            client.get(), ReadRequest(client.get(), isStopping_), isStopping_);
        {
            const std::lock_guard guard(lock_);
            requests_.push_back(connection.request());
        }
        if (!connection.request().empty()) {
            script_(connection);
        }
        shutdown(client.get(), SHUT_WR);
    }
}

void InGateway(const std::function<void()>& task) {
    std::thread([&task] {
        const platform::OwnedFd space(open("/run/netns/gateway", O_RDONLY | O_CLOEXEC));
        if (setns(space.get(), CLONE_NEWNET) != 0) {
            std::abort();
        }
        task();
    }).join();
}

}  // namespace web
