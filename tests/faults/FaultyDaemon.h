// The daemon, with one of its system calls made to fail or to be its last.
#pragma once

#include <array>
#include <csignal>
#include <fstream>
#include <string>
#include <utility>
#include <vector>

#include "tests/support/PhoneRoot.h"

namespace faults {

/// The calls that reading and replacing a file make, or might make.
inline constexpr std::array kFileCalls{"openat",
                                       "fstat",
                                       "newfstatat",
                                       "read",
                                       "readlink",
                                       "unlinkat",
                                       "fchmod",
                                       "write",
                                       "fsync",
                                       "renameat",
                                       "renameat2",
                                       "linkat",
                                       "rename",
                                       "unlink",
                                       "mkdir"};

/// The daemon with a fault at the n-th of its calls of one name that touch one of the paths.
class FaultyDaemon {
public:
    FaultyDaemon(const std::vector<std::string>& paths,
                 const std::string& call,
                 int n,
                 const std::string& fault)
        : daemon_({.wrapper = wrapper(paths, call, n, fault)}) {}

    phone::Daemon& daemon() { return daemon_; }

    /// Whether the daemon came as far as the fault.
    [[nodiscard]] bool wasHit() {
        if (daemon_.isRunning()) {
            daemon_.signal(SIGTERM);
        }
        if (daemon_.waitForExit() != 0) {
            return true;
        }
        std::string text;
        return phone::Eventually([&] {
                   std::ifstream file(kTrace);
                   text.assign(std::istreambuf_iterator<char>(file), {});
                   return text.find("+++ exited") != std::string::npos;
               }) &&
               text.find("(INJECTED)") != std::string::npos;
    }

private:
    static constexpr const char* kTrace = "/run/trace";

    static std::vector<std::string> wrapper(const std::vector<std::string>& paths,
                                            const std::string& call,
                                            int n,
                                            const std::string& fault) {
        std::vector<std::string> words{
            "/usr/bin/strace",
            "--quiet=attach,path-resolution",
            "-D",
            "-f",
            "-o",
            kTrace,
            "-e",
            "inject=" + call + ":" + fault + ":when=" + std::to_string(n)};
        for (const std::string& path : paths) {
            words.insert(words.end(), {"-P", path});
        }
        return words;
    }

    phone::Daemon daemon_;
};

}  // namespace faults
