#include "tests/http/ConfigurationServer.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/wait.h>

#include <array>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <utility>

#include "tests/support/PhoneRoot.h"

namespace web {
namespace {

constexpr const char* kFolder = "/run/www";
constexpr int kStartTimeoutMs = 20'000;

}  // namespace

ConfigurationServer::ConfigurationServer(std::vector<std::string> options) {
    std::filesystem::create_directories(kFolder);
    options.insert(options.begin(), {phone::ProgramPath("linefold-sim"), "configuration-server"});
    options.emplace_back(kFolder);
    std::array<int, 2> ends{-1, -1};
    if (pipe2(ends.data(), O_CLOEXEC) != 0) {
        std::abort();
    }
    output_.reset(ends[0]);
    const platform::OwnedFd input(ends[1]);
    std::vector<char*> words;
    for (auto& option : options) {
        words.push_back(option.data());
    }
    words.push_back(nullptr);
    pid_ = fork();
    if (pid_ == 0) {
        dup2(input.get(), STDOUT_FILENO);
        execv(words[0], words.data());
        _exit(127);
    }
    pollfd entry{.fd = output_.get(), .events = POLLIN, .revents = 0};
    if (poll(&entry, 1, kStartTimeoutMs) != 1 || !takeOutput().starts_with("serving ")) {
        std::abort();
    }
}

ConfigurationServer::~ConfigurationServer() {
    (void)stop();
    std::filesystem::remove_all(kFolder);
}

void ConfigurationServer::put(const std::string& name, const std::string& contents) {
    const std::filesystem::path path = std::string(kFolder) + "/" + name;
    std::filesystem::create_directories(path.parent_path());
    std::ofstream(path, std::ios::binary) << contents;
}

int ConfigurationServer::stop() {
    int status = -1;
    if (const pid_t pid = std::exchange(pid_, -1); pid > 0) {
        kill(pid, SIGTERM);
        (void)waitpid(pid, &status, 0);
    }
    return status;
}

std::string ConfigurationServer::takeOutput() {
    std::array<char, 4096> bytes{};
    pollfd entry{.fd = output_.get(), .events = POLLIN, .revents = 0};
    std::string text;
    while (poll(&entry, 1, 0) == 1 && (entry.revents & POLLIN) != 0) {
        const ssize_t size = read(output_.get(), bytes.data(), bytes.size());
        text.append(bytes.data(), size > 0 ? static_cast<std::size_t>(size) : 0);
    }
    return text;
}

}  // namespace web
