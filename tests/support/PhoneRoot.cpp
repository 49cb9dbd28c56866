#include "tests/support/PhoneRoot.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <stdexcept>
#include <system_error>

namespace phone {
namespace {

using platform::OwnedFd;

constexpr int kReplyTimeoutMs = 20'000;
constexpr std::size_t kReplyCapacity = 128U << 10;

[[noreturn]] void Fail(const char* what) {
    throw std::system_error(errno, std::generic_category(), what);
}

sockaddr_un Address(std::string_view path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.data(), path.size());
    return address;
}

OwnedFd Listen() {
    std::filesystem::create_directories("/run/linefold");
    unlink(std::string(kServicePath).c_str());
    OwnedFd socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const auto address = Address(kServicePath);
    if (bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        chmod(address.sun_path, 0666) != 0 || listen(socket.get(), SOMAXCONN) != 0) {
        Fail("listen");
    }
    return socket;
}

/// Takes a group and a user for this thread alone, for as long as the object lives.
class BorrowedIdentity {
public:
    BorrowedIdentity(gid_t group, uid_t user) {
        if (syscall(SYS_setresgid, -1, group, -1) != 0 ||
            syscall(SYS_setresuid, -1, user, -1) != 0) {
            Fail("identity");
        }
    }

    ~BorrowedIdentity() {
        syscall(SYS_setresuid, -1, 0, -1);
        syscall(SYS_setresgid, -1, 0, -1);
    }

    BorrowedIdentity(const BorrowedIdentity&) = delete;
    BorrowedIdentity& operator=(const BorrowedIdentity&) = delete;
};

/// Between fork and exec: nothing here allocates.
void BecomeDaemon(const Daemon::Options& options, int listening, char** arguments, char* pidText) {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (options.descriptors) {
        const rlimit limit{.rlim_cur = *options.descriptors, .rlim_max = *options.descriptors};
        setrlimit(RLIMIT_NOFILE, &limit);
    }
    if (listening >= 0) {
        if (listening == 3 ? fcntl(3, F_SETFD, 0) != 0 : dup2(listening, 3) < 0) {
            _exit(126);
        }
        std::snprintf(pidText, 16, "%d", getpid());
        setenv("LISTEN_PID", pidText, 1);
        setenv("LISTEN_FDS", "1", 1);
        setenv("LISTEN_FDNAMES", std::string(kServiceName).c_str(), 1);
    }
    execv(arguments[0], arguments);
    _exit(127);
}

}  // namespace

std::string ProgramPath(std::string_view name) {
    const auto tests = std::filesystem::read_symlink("/proc/self/exe").parent_path();
    return tests / name;
}

std::string DaemonPath() {
    return ProgramPath("LinefoldMobileHelper");
}

Daemon::Daemon() : Daemon(Options()) {}

Daemon::Daemon(Options options) : options_(std::move(options)) {
    if (options_.isActivated) {
        listening_ = Listen();
    }
    start();
    const auto answers = [this] { return Connection::toService().get() >= 0 || !isRunning(); };
    if (!options_.isActivated && !Eventually(answers)) {
        throw std::runtime_error("the daemon does not bind its service");
    }
}

Daemon::~Daemon() {
    if (isRunning()) {
        signal(SIGKILL);
        waitForExit();
    }
}

void Daemon::start() {
    std::vector<char*> arguments;
    for (const auto& word : options_.wrapper) {
        arguments.push_back(const_cast<char*>(word.c_str()));
    }
    arguments.push_back(const_cast<char*>(options_.program.c_str()));
    arguments.push_back(nullptr);
    std::array<char, 16> pidText{};
    status_.reset();
    pid_ = fork();
    if (pid_ == 0) {
        if (chdir("/") == 0) {
            BecomeDaemon(options_, listening_.get(), arguments.data(), pidText.data());
        }
        _exit(125);
    }
}

void Daemon::startAgain() {
    waitForExit();
    start();
}

bool Daemon::isRunning() {
    int status = 0;
    if (!status_ && waitpid(pid_, &status, WNOHANG) == pid_) {
        status_ = WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
    }
    return !status_;
}

int Daemon::waitForExit() {
    int status = 0;
    if (!status_ && waitpid(pid_, &status, 0) == pid_) {
        status_ = WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
    }
    return status_.value();
}

void Daemon::signal(int number) const {
    kill(pid_, number);
}

Connection Connection::toService(gid_t group, uid_t user) {
    OwnedFd socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const auto address = Address(kServicePath);
    const BorrowedIdentity identity(group, user);
    if (connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        return {};
    }
    return Connection(std::move(socket));
}

bool Connection::send(std::span<const std::byte> datagram, std::span<const int> descriptors) const {
    iovec part{.iov_base = const_cast<std::byte*>(datagram.data()), .iov_len = datagram.size()};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    std::vector<std::byte> control(CMSG_SPACE(descriptors.size_bytes()));
    if (!descriptors.empty()) {
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        cmsghdr* const header = CMSG_FIRSTHDR(&message);
        *header = {.cmsg_len = CMSG_LEN(descriptors.size_bytes()),
                   .cmsg_level = SOL_SOCKET,
                   .cmsg_type = SCM_RIGHTS};
        std::memcpy(CMSG_DATA(header), descriptors.data(), descriptors.size_bytes());
    }
    return sendmsg(get(), &message, MSG_NOSIGNAL) >= 0;
}

Reply Connection::receive() const {
    pollfd state{.fd = get(), .events = POLLIN, .revents = 0};
    if (poll(&state, 1, kReplyTimeoutMs) != 1) {
        throw std::runtime_error("no reply within 20 s");
    }
    Reply reply{.bytes = Bytes(kReplyCapacity)};
    std::array<std::byte, 256> control{};
    iovec part{.iov_base = reply.bytes.data(), .iov_len = reply.bytes.size()};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    const ssize_t length = recvmsg(get(), &message, MSG_CMSG_CLOEXEC);
    reply.bytes.resize(length > 0 ? static_cast<std::size_t>(length) : 0);
    if (const cmsghdr* const header = CMSG_FIRSTHDR(&message);
        length > 0 && header != nullptr && header->cmsg_type == SCM_RIGHTS) {
        int descriptor = -1;
        std::memcpy(&descriptor, CMSG_DATA(header), sizeof descriptor);
        reply.descriptor.reset(descriptor);
    }
    return reply;
}

Reply Connection::call(std::span<const std::byte> datagram,
                       std::span<const int> descriptors) const {
    return send(datagram, descriptors) ? receive() : Reply();
}

Bytes Message(std::int32_t id, std::size_t size, std::uint32_t bits) {
    Bytes message(size);
    platform::Store(
        std::span<std::byte>(message),
        0,
        platform::MachMsgHeader{.bits = bits, .size = static_cast<std::uint32_t>(size), .id = id});
    return message;
}

void PutText(Bytes& message, std::size_t offset, std::string_view text) {
    std::memcpy(message.data() + offset, text.data(), text.size());
}

OwnedFd SealedFile(std::span<const std::byte> contents) {
    OwnedFd file(memfd_create("test", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    if (write(file.get(), contents.data(), contents.size()) !=
            static_cast<ssize_t>(contents.size()) ||
        fcntl(file.get(), F_ADD_SEALS, F_SEAL_WRITE | F_SEAL_GROW | F_SEAL_SHRINK) != 0) {
        Fail("memory file");
    }
    return file;
}

Bytes BytesOf(std::string_view text) {
    const auto bytes = std::as_bytes(std::span(text));
    return {bytes.begin(), bytes.end()};
}

CopiedData TakeCopiedData(const Reply& reply) {
    if (reply.isEnd() || (reply.header().bits & platform::MACH_MSGH_BITS_COMPLEX) == 0) {
        return {.code = reply.isEnd() ? -1 : reply.code()};
    }
    const auto size = platform::Load<std::uint32_t>(reply.bytes, platform::kOffsetOfOutOfLineSize);
    CopiedData copied{.carriage =
                          reply.descriptor.isOpen() ? Carriage::kMemoryFile : Carriage::kInline};
    if (copied.carriage == Carriage::kMemoryFile) {
        copied.data.resize(size);
        if (pread(reply.descriptor.get(), copied.data.data(), size, 0) !=
            static_cast<ssize_t>(size)) {
            Fail("memory file");
        }
    } else {
        const auto behind = std::span(reply.bytes).subspan(kOutOfLineReplySize);
        copied.data.assign(reinterpret_cast<const char*>(behind.data()), behind.size());
    }
    std::array<std::uint8_t, 8> ndr{};
    std::memcpy(ndr.data(), reply.bytes.data() + kOffsetOfOutOfLineReplyNdr, ndr.size());
    constexpr int kSeals = F_SEAL_WRITE | F_SEAL_GROW | F_SEAL_SHRINK;
    const bool isSealed = copied.carriage == Carriage::kInline ||
                          (fcntl(reply.descriptor.get(), F_GET_SEALS) & kSeals) == kSeals;
    copied.isWellFormed =
        reply.header().size == kOutOfLineReplySize && copied.data.size() == size && isSealed &&
        ndr == platform::kNdrRecord &&
        (size > platform::kMaxInlineData) == (copied.carriage == Carriage::kMemoryFile) &&
        platform::Load<std::uint32_t>(reply.bytes, platform::kOffsetOfDescriptorCount) == 1 &&
        platform::Load<std::uint64_t>(reply.bytes, platform::kOffsetOfDescriptor) == 0 &&
        platform::Load<std::uint32_t>(reply.bytes, platform::kOffsetOfOutOfLineFlags) ==
            0x01000101 &&
        platform::Load<std::uint32_t>(reply.bytes, kOffsetOfOutOfLineReplyCount) == size;
    return copied;
}

Bytes CheckInMessage() {
    auto message = Message(kCheckInId, kCheckInRequestSize, platform::MACH_MSGH_BITS_COMPLEX);
    const std::span<std::byte> bytes(message);
    platform::Store(bytes, platform::kOffsetOfDescriptorCount, std::uint32_t{1});
    platform::Store(bytes, platform::kOffsetOfPortDisposition, std::uint8_t{17});
    return message;
}

Client Client::checkIn(gid_t group, uid_t user) {
    std::array<int, 2> ends{-1, -1};
    if (pipe2(ends.data(), O_CLOEXEC) != 0) {
        Fail("pipe");
    }
    Client client{.privatePort = {}, .watch = OwnedFd(ends[0])};
    const OwnedFd passed(ends[1]);
    const auto service = Connection::toService(group, user);
    client.checkInReply = service.call(CheckInMessage(), std::array{passed.get()});
    if (client.checkInReply.isEnd()) {
        client.code = -1;
    } else if ((client.checkInReply.header().bits & platform::MACH_MSGH_BITS_COMPLEX) == 0) {
        client.code = client.checkInReply.code();
    } else {
        client.privatePort = Connection(std::move(client.checkInReply.descriptor));
    }
    return client;
}

std::int32_t Client::callTexts(std::int32_t id, std::vector<std::string_view> texts) const {
    const RoutineLayout& layout = *FindRoutineLayout(id);
    auto message = Message(id, layout.requestSize);
    for (std::size_t i = 0; i < texts.size(); ++i) {
        PutText(message, layout.offsetOfField(i), texts[i]);
    }
    const auto reply = privatePort.call(message);
    return reply.isEnd() ? -1 : reply.code();
}

std::int32_t Client::setPreference(std::string_view domain,
                                   std::string_view key,
                                   std::string_view value,
                                   std::optional<Carriage> carriage) const {
    const RoutineLayout& layout = kRoutineLayouts[6];
    auto message = Message(layout.id, layout.requestSize, platform::MACH_MSGH_BITS_COMPLEX);
    const std::span<std::byte> bytes(message);
    const auto size = static_cast<std::uint32_t>(value.size());
    platform::Store(bytes, platform::kOffsetOfDescriptorCount, std::uint32_t{1});
    platform::Store(bytes, platform::kOffsetOfOutOfLineFlags, kOutOfLineReplyFlags);
    platform::Store(bytes, platform::kOffsetOfOutOfLineSize, size);
    platform::Store(bytes, layout.offsetOfField(2), size);
    PutText(message, layout.offsetOfField(0), domain);
    PutText(message, layout.offsetOfField(1), key);
    const auto data = BytesOf(value);
    const bool isLarge = value.size() > platform::kMaxInlineData;
    Reply reply;
    if (carriage.value_or(isLarge ? Carriage::kMemoryFile : Carriage::kInline) ==
        Carriage::kMemoryFile) {
        const OwnedFd file = SealedFile(data);
        reply = privatePort.call(message, std::array{file.get()});
    } else {
        message.insert(message.end(), data.begin(), data.end());
        reply = privatePort.call(message);
    }
    return reply.isEnd() ? -1 : reply.code();
}

CopiedData Client::copyPreference(std::int32_t id,
                                  std::string_view domain,
                                  std::string_view key) const {
    const RoutineLayout& layout = *FindRoutineLayout(id);
    auto message = Message(id, layout.requestSize);
    PutText(message, layout.offsetOfField(0), domain);
    PutText(message, layout.offsetOfField(1), key);
    return TakeCopiedData(privatePort.call(message));
}

LogReader LogReader::journal() {
    return LogReader(Channel::kJournal);
}

LogReader LogReader::systemLog() {
    return LogReader(Channel::kSystemLog);
}

LogReader::LogReader(Channel channel)
    : channel_(channel),
      path_(channel == Channel::kJournal ? "/run/log/journal" : "/run/log/syslog") {
    (void)take();
}

void LogReader::sendMarker(const std::string& marker) const {
    const OwnedFd socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    const bool isJournal = channel_ == Channel::kJournal;
    const auto address = Address(isJournal ? "/run/systemd/journal/socket" : "/dev/log");
    const std::string entry = isJournal
                                  ? "PRIORITY=7\nSYSLOG_IDENTIFIER=marker\nMESSAGE=" + marker + "\n"
                                  : "<31>Jan  1 00:00:00 marker: " + marker;
    if (sendto(socket.get(),
               entry.data(),
               entry.size(),
               0,
               reinterpret_cast<const sockaddr*>(&address),
               sizeof address) < 0) {
        Fail("log marker");
    }
}

std::vector<std::string> LogReader::take() {
    static int markers = 0;
    const std::string marker =
        "marker-" + std::to_string(getpid()) + "-" + std::to_string(++markers) + ".";
    // The sockets keep the order: what was logged before the marker stands before it.
    sendMarker(marker);
    std::string text;
    if (!Eventually([&] {
            const OwnedFd file(open(path_.c_str(), O_RDONLY | O_CLOEXEC));
            struct stat status {};
            if (!file.isOpen() || fstat(file.get(), &status) != 0) {
                return false;
            }
            text.resize(static_cast<std::size_t>(status.st_size - offset_));
            return pread(file.get(), text.data(), text.size(), offset_) ==
                       static_cast<ssize_t>(text.size()) &&
                   text.find(marker + "\n") != std::string::npos;
        })) {
        throw std::runtime_error("the log is not drained");
    }
    text.resize(text.find(marker + "\n") + marker.size() + 1);
    offset_ += static_cast<off_t>(text.size());
    std::vector<std::string> lines;
    const std::string identity = " LinefoldMobileHelper ";
    for (std::size_t start = 0; start < text.size();) {
        const auto end = text.find('\n', start);
        auto line = text.substr(start, end - start);
        if (const auto at = line.find(identity); at != std::string::npos) {
            lines.push_back(line.erase(at, identity.size() - 1));
        }
        start = end + 1;
    }
    return lines;
}

void SleepBriefly() {
    const timespec pause{.tv_sec = 0, .tv_nsec = 5'000'000};
    nanosleep(&pause, nullptr);
}

void ResetMobileHome() {
    namespace fs = std::filesystem;
    fs::remove_all(kMobileLibrary);
    for (const char* folder : {"", "/Preferences", "/Carrier Bundles"}) {
        const std::string path = std::string(kMobileLibrary) + folder;
        fs::create_directories(path);
        if (chown(path.c_str(), kMobileUser, kMobileUser) != 0) {
            Fail("chown");
        }
    }
}

}  // namespace phone
