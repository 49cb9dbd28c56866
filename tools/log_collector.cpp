// Plays the system logger and the journal in a private phone root: drains /dev/log and
// /run/systemd/journal/socket for ever and keeps each entry as one line of a file. A sender blocks
// behind a socket that nobody reads, so this program never stops reading, whatever it is sent.
#include <fcntl.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "client/Descriptor.h"

namespace {

using linefold_client::Descriptor;

constexpr const char* kSyslogSocket = "/dev/log";
constexpr const char* kJournalSocket = "/run/systemd/journal/socket";
constexpr const char* kLogFolder = "/run/log";
constexpr const char* kSyslogFile = "/run/log/syslog";
constexpr const char* kJournalFile = "/run/log/journal";

// Room for the descriptors that one datagram can bring, 253 of them.
constexpr std::size_t kControlBytes = 2048;
constexpr std::size_t kMemoryFileBytesMax = 16UL * 1024 * 1024;

// The text on one line, so that the bytes that were sent can be told from it again.
std::string Escaped(std::string_view text) {
    static constexpr std::string_view kDigits = "0123456789abcdef";
    std::string line;
    line.reserve(text.size());
    for (const char character : text) {
        const auto byte = static_cast<unsigned char>(character);
        if (character == '\\') {
            line += "\\\\";
        } else if (character == '\n') {
            line += "\\n";
        } else if (byte < 0x20 || byte == 0x7f) {
            line += {'\\', 'x', kDigits[byte >> 4], kDigits[byte & 15]};
        } else {
            line += character;
        }
    }
    return line;
}

// A value that is one word of a line: absent is "-", and a blank cannot pass for the next word.
std::string Word(std::string_view text) {
    if (text.empty()) {
        return "-";
    }
    std::string word;
    for (const char character : Escaped(text)) {
        word += character == ' ' ? std::string("\\x20") : std::string(1, character);
    }
    return word;
}

struct JournalEntry {
    std::string_view priority;
    std::string_view identifier;
    std::string_view category;
    std::string_view message;

    void set(std::string_view key, std::string_view value) {
        if (key == "PRIORITY") {
            priority = value;
        } else if (key == "SYSLOG_IDENTIFIER") {
            identifier = value;
        } else if (key == "CATEGORY") {
            category = value;
        } else if (key == "MESSAGE") {
            message = value;
        }
    }
};

// The length that stands before a binary value, little-endian.
std::uint64_t LengthAt(std::string_view bytes) {
    std::uint64_t length = 0;
    for (std::size_t i = sizeof length; i-- > 0;) {
        length = length << 8 | static_cast<unsigned char>(bytes[i]);
    }
    return length;
}

// Takes the value of a length-prefixed field, its closing newline included, off the front. Nothing
// when it does not lie wholly inside.
std::optional<std::string_view> TakeBinaryValue(std::string_view& rest) {
    constexpr std::size_t kPrefix = sizeof(std::uint64_t);
    if (rest.size() < kPrefix + 1 || LengthAt(rest) > rest.size() - kPrefix - 1) {
        return std::nullopt;
    }
    const auto length = static_cast<std::size_t>(LengthAt(rest));
    const std::string_view value = rest.substr(kPrefix, length);
    rest.remove_prefix(kPrefix + length + 1);
    return value;
}

// Reads the fields of the journal's native protocol: KEY=value lines, and KEY lines followed by a
// length and as many bytes. What follows a damaged field is lost, as in the journal.
JournalEntry ParseJournalEntry(std::string_view rest) {
    JournalEntry entry;
    while (!rest.empty()) {
        const std::string_view line = rest.substr(0, rest.find('\n'));
        rest.remove_prefix(std::min(line.size() + 1, rest.size()));
        if (const auto equals = line.find('='); equals != line.npos) {
            entry.set(line.substr(0, equals), line.substr(equals + 1));
        } else if (!line.empty()) {
            const auto value = TakeBinaryValue(rest);
            if (!value) {
                break;
            }
            entry.set(line, *value);
        }
    }
    return entry;
}

std::string JournalLine(std::string_view datagram) {
    const JournalEntry entry = ParseJournalEntry(datagram);
    return Word(entry.priority) + ' ' + Word(entry.identifier) + ' ' + Word(entry.category) + ' ' +
           Escaped(entry.message) + '\n';
}

// Takes "<N>" off the front. RFC 3164 gives an entry without it severity notice, facility user.
unsigned TakePriority(std::string_view& rest) {
    constexpr unsigned kUserNotice = 13;
    unsigned priority = 0;
    if (!rest.starts_with('<')) {
        return kUserNotice;
    }
    const auto [end, error] = std::from_chars(rest.data() + 1, rest.data() + rest.size(), priority);
    if (error != std::errc() || end == rest.data() + rest.size() || *end != '>') {
        return kUserNotice;
    }
    rest.remove_prefix(static_cast<std::size_t>(end - rest.data()) + 1);
    return priority;
}

// "Nov 21 04:10:00 " as syslog(3) writes it.
void SkipTimestamp(std::string_view& rest) {
    constexpr std::string_view kShape = "Mmm dd hh:mm:ss ";
    if (rest.size() < kShape.size()) {
        return;
    }
    for (const std::size_t at : {3U, 6U, 9U, 12U, 15U}) {
        if (rest[at] != kShape[at]) {
            return;
        }
    }
    rest.remove_prefix(kShape.size());
}

// Takes "name[pid]: " or "name: " off the front and returns the name; empty when there is none.
std::string_view TakeTag(std::string_view& rest) {
    const auto colon = rest.find(": ");
    const std::string_view tag = rest.substr(0, colon == rest.npos ? 0 : colon);
    if (tag.empty() || tag.find(' ') != tag.npos) {
        return {};
    }
    rest.remove_prefix(tag.size() + 2);
    return tag.substr(0, tag.find('['));
}

std::string SyslogLine(std::string_view rest) {
    const unsigned priority = TakePriority(rest);
    SkipTimestamp(rest);
    const std::string_view identifier = TakeTag(rest);
    return std::to_string(priority & 7) + ' ' + std::to_string(priority >> 3) + ' ' +
           Word(identifier) + ' ' + Escaped(rest) + '\n';
}

[[noreturn]] void Fail(const char* what) {
    std::fprintf(stderr, "log-collector: %s: %s\n", what, std::strerror(errno));
    std::exit(1);
}

Descriptor BindSocket(const char* path) {
    Descriptor socket{::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)};
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path, sizeof address.sun_path - 1);
    const int on = 1;
    (void)unlink(path);  // Left behind by an earlier collector, or not there.
    if (!socket.isOpen() ||
        setsockopt(socket.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on) != 0 ||
        bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        chmod(path, 0666) != 0) {
        Fail(path);
    }
    return socket;
}

Descriptor OpenLog(const char* path) {
    Descriptor file{open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC | O_NOFOLLOW, 0644)};
    if (!file.isOpen()) {
        Fail(path);
    }
    return file;
}

// Takes the first descriptor of a datagram and closes the others. The kernel gives them to us
// whether we want them or not, and a collector that ran out of descriptors would lose entries.
Descriptor TakeDescriptor(msghdr& message) {
    Descriptor first;
    for (cmsghdr* part = CMSG_FIRSTHDR(&message); part; part = CMSG_NXTHDR(&message, part)) {
        if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) {
            continue;
        }
        for (std::size_t at = 0; CMSG_LEN(at + sizeof(int)) <= part->cmsg_len; at += sizeof(int)) {
            int number = -1;
            std::memcpy(&number, CMSG_DATA(part) + at, sizeof number);
            Descriptor received{number};
            if (!first.isOpen()) {
                first = std::move(received);
            }
        }
    }
    return first;
}

// The content of a sealed memory file. Anything else could block a reader or change under it, and
// only a memory file has seals.
std::string ReadMemoryFile(const Descriptor& file) {
    const int seals = fcntl(file.get(), F_GET_SEALS);

    struct stat status {};

    if (seals < 0 || (seals & F_SEAL_SHRINK) == 0 || fstat(file.get(), &status) != 0 ||
        static_cast<std::uint64_t>(status.st_size) > kMemoryFileBytesMax) {
        return {};
    }
    std::string content(static_cast<std::size_t>(status.st_size), '\0');
    const ssize_t count = pread(file.get(), content.data(), content.size(), 0);
    content.resize(count > 0 ? static_cast<std::size_t>(count) : 0);
    return content;
}

// One entry: what stands in the datagram, or in the memory file that came instead. Nothing when no
// datagram waits.
std::optional<std::string> Receive(const Descriptor& socket) {
    // A datagram is as large as the buffer its sender could get, so its size is asked for first.
    const ssize_t size = recv(socket.get(), nullptr, 0, MSG_PEEK | MSG_TRUNC | MSG_DONTWAIT);
    if (size < 0) {
        return std::nullopt;
    }
    std::string text(static_cast<std::size_t>(size), '\0');
    alignas(cmsghdr) std::array<char, kControlBytes> control{};
    iovec part{text.data(), text.size()};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    if (recvmsg(socket.get(), &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC) < 0) {
        return std::nullopt;
    }
    const Descriptor file = TakeDescriptor(message);
    if (file.isOpen()) {
        return ReadMemoryFile(file);
    }
    return text;
}

struct Channel {
    Descriptor socket;
    Descriptor file;
    std::string (*line)(std::string_view entry);
};

void Drain(const Channel& channel) {
    while (const auto entry = Receive(channel.socket)) {
        const std::string line = channel.line(*entry);
        // One write a line, so a reader never meets half of one. A full disk loses the line only.
        (void)!write(channel.file.get(), line.data(), line.size());
    }
}

[[noreturn]] void Collect(const std::array<Channel, 2>& channels) {
    std::array<pollfd, 2> waiting{};
    for (std::size_t i = 0; i < channels.size(); ++i) {
        waiting[i] = {channels[i].socket.get(), POLLIN, 0};
    }
    for (;;) {
        (void)poll(waiting.data(), waiting.size(), -1);  // Interrupted: the loop asks again.
        for (const Channel& channel : channels) {
            Drain(channel);
        }
    }
}

// Whoever waits for the end of our output must not wait for the collector.
void LetGoOfTerminal() {
    const Descriptor null{open("/dev/null", O_RDWR | O_CLOEXEC)};
    for (int standard = 0; standard <= 2; ++standard) {
        if (!null.isOpen() || dup2(null.get(), standard) < 0) {
            Fail("/dev/null");
        }
    }
    (void)setsid();  // Fails only for a leader of a group, which a new child is not.
    (void)chdir("/");
}

}  // namespace

// Returns 0 once both sockets are bound; the collector itself goes on in the background.
int main(int argc, char**) {
    if (argc != 1) {
        std::fputs("usage: log-collector\n", stderr);
        return 2;
    }
    if (mkdir(kLogFolder, 0755) != 0 && errno != EEXIST) {
        Fail(kLogFolder);
    }
    const std::array<Channel, 2> channels{
        Channel{BindSocket(kSyslogSocket), OpenLog(kSyslogFile), SyslogLine},
        Channel{BindSocket(kJournalSocket), OpenLog(kJournalFile), JournalLine},
    };
    const pid_t child = fork();
    if (child < 0) {
        Fail("fork");
    }
    if (child > 0) {
        return 0;
    }
    LetGoOfTerminal();
    Collect(channels);
}
