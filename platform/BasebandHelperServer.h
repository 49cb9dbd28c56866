// The baseband-manager helper server, a separately supplied part that may live in this process.
#pragma once

#include <memory>

namespace platform {

/// A log server that the helper may share; the daemon has none to give.
class LogServer;

/// True when the running system brings the helper server and lets this process host it.
[[nodiscard]] bool CanHostBasebandHelperServer();

class BasebandHelperServer {
public:
    /// Possibly empty: the helper may decline.
    [[nodiscard]] static std::shared_ptr<BasebandHelperServer> create(
        std::shared_ptr<LogServer> logServer);

    BasebandHelperServer(const BasebandHelperServer&) = delete;
    BasebandHelperServer& operator=(const BasebandHelperServer&) = delete;

    void start();
    void stop();
    [[nodiscard]] bool isBusy();

protected:
    BasebandHelperServer() = default;
    ~BasebandHelperServer() = default;
};

}  // namespace platform
