// The configuration server of the simulator, as a test starts and ends it.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include "platform/linux/OwnedFd.h"

namespace web {

/// Serves /run/www, which goes with it.
class ConfigurationServer {
public:
    /// Waits until it serves. The options are those of linefold-sim configuration-server.
    explicit ConfigurationServer(std::vector<std::string> options = {});
    ~ConfigurationServer();
    ConfigurationServer(const ConfigurationServer&) = delete;
    ConfigurationServer& operator=(const ConfigurationServer&) = delete;

    /// Puts a file into the folder.
    static void put(const std::string& name, const std::string& contents);

    /// Ends it, and tells its exit status.
    int stop();

    /// The lines that it has printed since the last call, one for each request.
    [[nodiscard]] std::string takeOutput();

    static constexpr const char* kOrigin = "https://configuration.vendra.example";

private:
    platform::OwnedFd output_;
    pid_t pid_ = -1;
};

}  // namespace web
