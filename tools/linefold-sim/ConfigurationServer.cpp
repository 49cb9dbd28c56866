#include "tools/linefold-sim/ConfigurationServer.h"

#include <arpa/inet.h>
#include <linux/magic.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/vfs.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <csignal>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/BuildConstants.h"
#include "platform/linux/OwnedFd.h"
#include "tools/linefold-sim/CertificateAuthority.h"
#include "tools/linefold-sim/ChildProcess.h"

namespace simulator {
namespace {

constexpr int kUsage = 2;
constexpr const char* kGateway = "198.51.100.1";
constexpr int kTriesToConnect = 250;
constexpr int kTickMs = 20;

struct Options {
    std::string folder;
    std::uint16_t port = 443;
    Flaw flaw = Flaw::kNone;
    std::vector<std::pair<std::string, std::string>> redirects;
};

int Complain(const std::string& why, int status) {
    (void)std::fprintf(stderr, "linefold-sim: %s\n", why.c_str());
    return status;
}

// The words.

std::optional<Flaw> FlawByName(std::string_view name) {
    constexpr std::array<std::pair<std::string_view, Flaw>, 5> kFlaws{
        {{"trusted", Flaw::kNone},
         {"expired", Flaw::kExpired},
         {"other-host", Flaw::kOtherHost},
         {"self-signed", Flaw::kSelfSigned},
         {"unknown-authority", Flaw::kUnknownAuthority}}};
    const auto* const found =
        std::ranges::find(kFlaws, name, [](const auto& entry) { return entry.first; });
    return found == kFlaws.end() ? std::nullopt : std::optional(found->second);
}

/// What goes into the server's configuration must not end a text there, nor name a variable.
bool IsPlain(std::string_view text) {
    return !text.empty() && std::ranges::none_of(text, [](char c) {
        return static_cast<unsigned char>(c) < 0x20 || c == '"' || c == '\\' || c == '$' ||
               c == 0x7f;
    });
}

bool TakeOption(std::string_view name, std::string_view value, Options* options) {
    if (name == "--certificate") {
        const auto flaw = FlawByName(value);
        options->flaw = flaw.value_or(Flaw::kNone);
        return flaw.has_value();
    }
    if (name == "--redirect") {
        const auto equals = value.find('=');
        options->redirects.emplace_back(
            value.substr(0, equals),
            equals == std::string_view::npos ? std::string_view() : value.substr(equals + 1));
        return value.starts_with('/') && IsPlain(options->redirects.back().first) &&
               IsPlain(options->redirects.back().second);
    }
    const auto [end, error] =
        std::from_chars(value.data(), value.data() + value.size(), options->port);
    return name == "--port" && error == std::errc() && end == value.data() + value.size() &&
           options->port != 0;
}

/// Says what is wrong.
std::optional<Options> Parse(std::span<const std::string_view> words) {
    Options options;
    std::size_t at = 0;
    for (; at < words.size() && words[at].starts_with("--"); at += 2) {
        if (at + 1 == words.size() || !TakeOption(words[at], words[at + 1], &options)) {
            (void)Complain("cannot use " + std::string(words[at]) +
                               (at + 1 == words.size() ? "" : " " + std::string(words[at + 1])),
                           kUsage);
            return std::nullopt;
        }
    }
    std::error_code error;
    if (at + 1 != words.size()) {
        (void)Complain("one folder is needed", kUsage);
        return std::nullopt;
    }
    options.folder = std::filesystem::canonical(words[at], error).string();
    if (error || !std::filesystem::is_directory(options.folder) || !IsPlain(options.folder)) {
        (void)Complain("cannot serve " + std::string(words[at]) + ", which must be a folder",
                       kUsage);
        return std::nullopt;
    }
    return options;
}

// The sandbox.

bool IsOnFileSystem(const char* path, long kind) {
    struct statfs status {};

    return statfs(path, &status) == 0 && status.f_type == kind;
}

/// A bundle of certificates is a machine's trust, so it is touched nowhere but in the phone's
/// private root, where it lies in memory and the gateway's network stands beside it.
bool IsInSandbox() {
    return geteuid() == 0 && IsOnFileSystem("/etc/ssl/certs", TMPFS_MAGIC) &&
           IsOnFileSystem("/run", TMPFS_MAGIC) &&
           IsOnFileSystem("/run/netns/gateway", NSFS_MAGIC) &&
           std::filesystem::is_directory("/private/var/mobile");
}

// The server.

/// A folder that goes with us.
class WorkFolder {
public:
    WorkFolder() {
        std::string pattern = "/run/configuration-server.XXXXXX";
        path_ = mkdtemp(pattern.data()) == nullptr ? std::string() : pattern;
    }

    WorkFolder(const WorkFolder&) = delete;
    WorkFolder& operator=(const WorkFolder&) = delete;

    ~WorkFolder() {
        std::error_code error;
        std::filesystem::remove_all(path_, error);
    }

    [[nodiscard]] const std::string& path() const { return path_; }

private:
    std::string path_;
};

std::string Configuration(const Options& options,
                          const std::string& work,
                          const CertificateAuthority& authority) {
    std::string text =
        "daemon off;\nmaster_process off;\nuser root;\nerror_log stderr crit;\n"
        "pid " +
        work +
        "/pid;\nevents { worker_connections 128; }\nhttp {\n"
        "log_format line '$request_method $request_uri $status';\naccess_log /dev/stdout line;\n"
        "default_type application/octet-stream;\ntypes { application/x-gzip gz; text/xml plist; }\n"
        "gzip on; gzip_types text/xml; gzip_min_length 64;\nserver_tokens off;\n";
    for (const char* kind : {"client_body", "proxy", "fastcgi", "uwsgi", "scgi"}) {
        text += std::string(kind) + "_temp_path " + work + "/" + kind + ";\n";
    }
    text += "server {\nlisten " + std::to_string(options.port) + " ssl;\nserver_name " +
            platform::kConfigurationHost + ";\nssl_certificate " + authority.certificate() +
            ";\nssl_certificate_key " + authority.key() + ";\nroot \"" + options.folder + "\";\n";
    for (const auto& [path, url] : options.redirects) {
        text += "location = \"" + path + "\" { return 302 \"" + url + "\"; }\n";
    }
    return text + "}\n}\n";
}

bool Accepts(std::uint16_t port) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    inet_pton(AF_INET, kGateway, &address.sin_addr);
    const platform::OwnedFd probe(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    return connect(probe.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) == 0;
}

bool HasEnded(pid_t server) {
    return waitpid(server, nullptr, WNOHANG) != 0;
}

bool WaitUntilItServes(pid_t server, std::uint16_t port) {
    for (int tries = 0; tries < kTriesToConnect; ++tries) {
        if (HasEnded(server)) {
            return false;
        }
        if (Accepts(port)) {
            return true;
        }
        (void)poll(nullptr, 0, kTickMs);
    }
    return false;
}

/// What is waited for, and until then blocked: nothing of ours is left behind, whenever they come.
sigset_t BlockSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    for (const int signal : {SIGTERM, SIGINT, SIGCHLD}) {
        sigaddset(&signals, signal);
    }
    sigprocmask(SIG_BLOCK, &signals, nullptr);
    return signals;
}

/// Until it, or we, are to end.
int ServeUntilTheEnd(pid_t server, const sigset_t& signals) {
    for (;;) {
        const int signal = sigwaitinfo(&signals, nullptr);
        if (signal == SIGCHLD && HasEnded(server)) {
            return Complain("nginx has ended", 1);
        }
        if (signal == SIGTERM || signal == SIGINT) {
            kill(server, SIGTERM);
            (void)waitpid(server, nullptr, 0);
            return 0;
        }
    }
}

int Serve(const Options& options,
          const std::string& work,
          const CertificateAuthority& authority,
          const sigset_t& signals) {
    const std::string file = work + "/nginx.conf";
    std::ofstream(file) << Configuration(options, work, authority);
    const pid_t server = Start({"nginx", "-p", work, "-e", "stderr", "-c", file}, Space::kGateway);
    if (server < 0 || !WaitUntilItServes(server, options.port)) {
        return Complain("nginx does not serve", 1);
    }
    (void)std::printf("serving %s at https://%s%s/\n",
                      options.folder.c_str(),
                      platform::kConfigurationHost,
                      options.port == 443 ? "" : (":" + std::to_string(options.port)).c_str());
    return ServeUntilTheEnd(server, signals);
}

}  // namespace

int PlayConfigurationServer(std::span<const std::string_view> words) {
    const auto options = Parse(words);
    if (!options) {
        return kUsage;
    }
    if (!IsInSandbox()) {
        return Complain("configuration-server runs inside of tools/sandbox only, as its root", 1);
    }
    const sigset_t signals = BlockSignals();
    const WorkFolder work;
    if (work.path().empty()) {
        return Complain("cannot make a folder in /run", 1);
    }
    const auto authority =
        CertificateAuthority::create(work.path(), platform::kConfigurationHost, options->flaw);
    return authority ? Serve(*options, work.path(), *authority, signals) : 1;
}

}  // namespace simulator
