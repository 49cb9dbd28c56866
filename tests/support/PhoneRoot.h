// What the tests inside a private phone root share: the real daemon, raw clients, and its logs.
//
// A harness of a few verbs: spawn, call, expect, stop.
#pragma once

#include <sys/resource.h>
#include <sys/types.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "Helper/Shared/Server/MessageLayouts.h"
#include "platform/linux/OwnedFd.h"

namespace phone {

inline constexpr std::string_view kServicePath = "/run/linefold/com.vendra.linefold.mobile-helper";
inline constexpr gid_t kEntitledGroup = 5010;
inline constexpr uid_t kMobileUser = 501;
inline constexpr const char* kMobileLibrary = "/private/var/mobile/Library";

using Bytes = std::vector<std::byte>;

/// The daemon's binary of this build, and another program of it by name.
[[nodiscard]] std::string DaemonPath();
[[nodiscard]] std::string ProgramPath(std::string_view name);

/// The real daemon. It is started with a listening socket of ours, as the service manager would,
/// which stays when the daemon goes.
class Daemon {
public:
    struct Options {
        std::string program = DaemonPath();
        bool isActivated = true;              ///< otherwise it binds the service itself
        std::optional<rlim_t> descriptors{};  ///< soft and hard limit
        std::vector<std::string> wrapper{};   ///< such as strace and its arguments
    };

    Daemon();
    explicit Daemon(Options options);
    ~Daemon();
    Daemon(const Daemon&) = delete;
    Daemon& operator=(const Daemon&) = delete;

    [[nodiscard]] pid_t pid() const { return pid_; }

    [[nodiscard]] bool isRunning();

    /// Waits for the end and tells the exit status, or minus the signal's number.
    int waitForExit();

    void signal(int number) const;

    /// Starts the next instance on the same socket.
    void startAgain();

private:
    void start();

    const Options options_;
    platform::OwnedFd listening_;
    pid_t pid_ = -1;
    std::optional<int> status_;
};

/// What came back: the bytes, and the descriptor beside them.
struct Reply {
    Bytes bytes;
    platform::OwnedFd descriptor{};

    [[nodiscard]] bool isEnd() const { return bytes.empty(); }

    [[nodiscard]] platform::MachMsgHeader header() const {
        return platform::Load<platform::MachMsgHeader>(bytes, 0);
    }

    /// The return code of a simple reply.
    [[nodiscard]] std::int32_t code() const {
        return platform::Load<std::int32_t>(bytes, platform::kOffsetOfReturnCode);
    }
};

/// A seqpacket socket to the daemon, used without any library of ours.
class Connection {
public:
    Connection() = default;

    explicit Connection(platform::OwnedFd socket) : socket_(std::move(socket)) {}

    /// Connects to the service as a process of this group (and user); asserts nothing.
    static Connection toService(gid_t group = kEntitledGroup, uid_t user = 0);

    [[nodiscard]] int get() const { return socket_.get(); }

    void close() { socket_.reset(); }

    /// Sends one datagram. False when the other side is gone.
    bool send(std::span<const std::byte> datagram, std::span<const int> descriptors = {}) const;

    /// Waits for one datagram (at most 20 s); an end when the connection ended.
    [[nodiscard]] Reply receive() const;

    [[nodiscard]] Reply call(std::span<const std::byte> datagram,
                             std::span<const int> descriptors = {}) const;

private:
    platform::OwnedFd socket_;
};

/// Builds a message: a header with this id, bits and the size of the whole, then zeros.
[[nodiscard]] Bytes Message(std::int32_t id, std::size_t size, std::uint32_t bits = 0);

void PutText(Bytes& message, std::size_t offset, std::string_view text);

/// How out-of-line data travels.
enum class Carriage : bool { kInline, kMemoryFile };

/// A memory file with these contents that nobody can change any more.
[[nodiscard]] platform::OwnedFd SealedFile(std::span<const std::byte> contents);

/// The bytes of a text.
[[nodiscard]] Bytes BytesOf(std::string_view text);

/// The answer of a routine that copies data out.
struct CopiedData {
    std::int32_t code = 0;
    std::string data{};         ///< empty for an absent value
    bool isWellFormed = false;  ///< every field of the reply as documented
    Carriage carriage = Carriage::kInline;
};

/// Takes an out-of-line reply apart.
[[nodiscard]] CopiedData TakeCopiedData(const Reply& reply);

/// The 40 bytes of a check-in.
[[nodiscard]] Bytes CheckInMessage();

/// A client that has checked in.
struct Client {
    Connection privatePort;
    platform::OwnedFd watch;  ///< closing it is the client's death
    std::int32_t code = 0;    ///< of the check-in
    Reply checkInReply{};

    static Client checkIn(gid_t group = kEntitledGroup, uid_t user = 0);

    /// Sends a simple request of text fields and returns the code.
    [[nodiscard]] std::int32_t callTexts(std::int32_t id,
                                         std::vector<std::string_view> texts) const;

    /// Routine 6. To 65,536 bytes the value rides behind the message unless told otherwise.
    [[nodiscard]] std::int32_t setPreference(std::string_view domain,
                                             std::string_view key,
                                             std::string_view value,
                                             std::optional<Carriage> carriage = {}) const;

    /// Routine 7 or 8.
    [[nodiscard]] CopiedData copyPreference(std::int32_t id,
                                            std::string_view domain,
                                            std::string_view key) const;

    void die() {
        watch.reset();
        privatePort.close();
    }
};

/// One of the two log channels, read from where it stood at construction.
class LogReader {
public:
    static LogReader journal();
    static LogReader systemLog();

    /// The daemon's lines since construction or the last call, everything included that was logged
    /// before this call: "PRIORITY CATEGORY TEXT" or "SEVERITY FACILITY TEXT".
    [[nodiscard]] std::vector<std::string> take();

private:
    enum class Channel : bool { kJournal, kSystemLog };

    explicit LogReader(Channel channel);

    void sendMarker(const std::string& marker) const;

    Channel channel_;
    std::string path_;
    off_t offset_ = 0;
};

void SleepBriefly();

/// Polls until the condition holds, at most 20 s.
template <typename Condition>
[[nodiscard]] bool Eventually(const Condition& condition) {
    for (int i = 0; i < 4000; ++i) {
        if (condition()) {
            return true;
        }
        SleepBriefly();
    }
    return false;
}

/// A fresh mobile Library folder with Preferences and Carrier Bundles, owned by the mobile user.
void ResetMobileHome();

}  // namespace phone
