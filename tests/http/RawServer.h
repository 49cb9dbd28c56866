// A server that says to each connection what a test tells it to, byte by byte.
#pragma once

#include <atomic>
#include <functional>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/linux/OwnedFd.h"

namespace web {

/// One client of the server, whose request has come.
class RawConnection {
public:
    RawConnection(int socket, std::string request, const std::atomic<bool>& isStopping)
        : socket_(socket), request_(std::move(request)), isStopping_(isStopping) {}

    [[nodiscard]] const std::string& request() const { return request_; }

    /// The path that was asked for.
    [[nodiscard]] std::string path() const;

    /// False when the client is gone or the server is to end.
    bool send(std::string_view bytes) const;

    /// Waits, but for no longer than the client and the server are there.
    void pause(int milliseconds) const;

private:
    const int socket_;
    const std::string request_;
    const std::atomic<bool>& isStopping_;
};

/// Serves one connection after the other on a thread of its own, until it goes.
class RawServer {
public:
    using Script = std::function<void(const RawConnection&)>;

    explicit RawServer(Script script, std::string_view address = "127.0.0.1");
    ~RawServer();
    RawServer(const RawServer&) = delete;
    RawServer& operator=(const RawServer&) = delete;

    /// "http://address:port" and the path.
    [[nodiscard]] std::string url(std::string_view path = "/") const;

    /// What clients asked for, headers and all.
    [[nodiscard]] std::vector<std::string> requests() const;

private:
    void serve();

    const Script script_;
    std::string origin_;
    platform::OwnedFd listening_;
    std::atomic<bool> isStopping_ = false;
    mutable std::mutex lock_;
    std::vector<std::string> requests_;  // under lock_
    std::thread thread_;
};

/// Runs it on a thread whose network is the gateway's: what it opens stays there.
void InGateway(const std::function<void()>& task);

}  // namespace web
