// Other processes of the simulated world, and the ends of sockets that they hold.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

namespace sim {

// Processes.

struct Identity {
    std::int32_t pid = 0;
    std::uint32_t uid = 0;
    std::uint32_t gid = 0;
};

/// A process begins to live; connecting does it too.
void StartProcess(std::int32_t pid);

/// It ends, and who watches it will hear. What it holds is closed by closing its peers.
void ExitProcess(std::int32_t pid);

// Descriptors.

/// What a descriptor stands for; it is closed when nobody holds it any more.
class OpenFile {
public:
    OpenFile() = default;
    OpenFile(const OpenFile&) = delete;
    OpenFile& operator=(const OpenFile&) = delete;
    virtual ~OpenFile() = default;
};

using Descriptor = std::shared_ptr<OpenFile>;

struct Datagram {
    std::vector<std::byte> bytes;
    std::vector<Descriptor> descriptors{};
};

/// One end of a connected pair. The other end notices when this one is closed.
class Endpoint final : public OpenFile {
public:
    std::weak_ptr<Endpoint> other;
    std::deque<Datagram> inbox;
    std::size_t capacity = 64;  ///< datagrams that the inbox takes
    Identity peer;              ///< who connected, as the kernel saw it then

    [[nodiscard]] bool isHungUp() const { return other.expired(); }

    [[nodiscard]] bool hasRoom() const { return inbox.size() < capacity; }
};

class MemoryFile final : public OpenFile {
public:
    MemoryFile(std::span<const std::byte> contents, bool sealed)
        : bytes(contents.begin(), contents.end()), isSealed(sealed) {}

    std::vector<std::byte> bytes;
    bool isSealed;
};

/// Neither socket nor memory: a file, a terminal, a device.
class OtherFile final : public OpenFile {};

/// The end of a pair that a process outside the daemon holds.
class Peer {
public:
    Peer() = default;

    explicit Peer(std::shared_ptr<Endpoint> endpoint) : endpoint_(std::move(endpoint)) {}

    /// False when the other end is gone (broken pipe) or takes no more for now.
    bool send(std::span<const std::byte> datagram, std::vector<Descriptor> descriptors = {});

    /// The next datagram that has arrived, if any.
    [[nodiscard]] std::optional<Datagram> receive();

    /// The other end is gone; what it sent before may still be read.
    [[nodiscard]] bool isHungUp() const { return endpoint_ == nullptr || endpoint_->isHungUp(); }

    [[nodiscard]] bool isOpen() const { return endpoint_ != nullptr; }

    /// How many datagrams may wait here unread before a sender has to wait.
    void setCapacity(std::size_t datagrams) { endpoint_->capacity = datagrams; }

    void close() { endpoint_ = nullptr; }

private:
    std::shared_ptr<Endpoint> endpoint_;
};

/// A connected pair: this end stays with the process, the descriptor is passed to the daemon.
struct WatchPair {
    Peer kept;
    Descriptor passed;
};

[[nodiscard]] WatchPair MakeWatchPair();

/// The peer that a received descriptor stands for, closed when it is of another kind.
[[nodiscard]] Peer PeerOf(const Descriptor& descriptor);

// The service manager, which keeps a service's listening socket whoever serves it.

/// Connects as this process. The connection waits with the manager until a daemon accepts it.
[[nodiscard]] Peer Connect(const Identity& identity, std::string_view service);

/// Connections that no daemon has accepted yet; they have a daemon started.
[[nodiscard]] std::size_t WaitingConnections(std::string_view service);

/// Somebody else alive holds the service, so that no daemon can check it in.
void HoldServiceElsewhere(std::string_view service);

// The daemon's own tables.

/// Descriptors that the daemon may have open.
void SetDescriptorLimit(std::size_t limit);

[[nodiscard]] std::size_t OpenDescriptors();
[[nodiscard]] std::size_t PortNames();
[[nodiscard]] std::vector<std::uint32_t> ListPortNames();

/// The kernel cleans up after a daemon that has ended: ports, connections, timers and tasks. What
/// waits with the service manager stays.
void EndDaemon();

}  // namespace sim
