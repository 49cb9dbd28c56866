// Preference values of several sizes, asked for and read, against two processes that send as many
// bytes back, by the same road. The daemon reads and parses the domain's file at each call, writes
// the value out anew and logs its length; so a second floor reads that file, and nothing more.
#include <fcntl.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <stdexcept>

#include "bench/Bench.h"
#include "bench/Wire.h"
#include "platform/PropertyList.h"

namespace {

constexpr int kRepetitions = 21;
constexpr std::size_t kBytesOfRepetition = 8U << 20;
constexpr std::size_t kMostRequests = 1'000;
constexpr std::int32_t kCopyPreferenceValue = kFirstRoutineId + 7;
constexpr std::string_view kDomain = "com.vendra.bulk";
constexpr std::string_view kKey = "key";

std::string XmlOf(std::size_t length) {
    const auto xml =
        platform::PropertyListCreateXmlData(platform::PropertyList(std::string(length, 'x')));
    return {reinterpret_cast<const char*>(xml.value().data()), xml->size()};
}

/// A value whose property list is of this size.
std::string ValueOfSize(std::size_t size) {
    // Not from the empty text, which has a shorter tag.
    return XmlOf(size - XmlOf(1).size() + 1);
}

void ReadFile(const std::string& path, phone::Bytes& buffer) {
    const platform::OwnedFd file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (read(file.get(), buffer.data(), buffer.size()) <= 0) {
        throw std::runtime_error("cannot read " + path);
    }
}

/// Answers with `size` bytes behind an empty reply; reads the file before, if there is one.
void Serve(int socket, std::size_t size, const std::string& file) {
    phone::Bytes reply(kOutOfLineReplySize + size);
    const auto head = std::span(reply).first(kOutOfLineReplySize);
    phone::Bytes contents(2 * size + 4096);
    phone::Bytes request(kRoutineLayouts[7].requestSize);
    while (recv(socket, request.data(), request.size(), 0) > 0) {
        if (!file.empty()) {
            ReadFile(file, contents);
        }
        if (size <= platform::kMaxInlineData) {
            bench::Send(socket, reply);
        } else {
            const auto data = phone::SealedFile(std::span(reply).subspan(head.size()));
            bench::SendWithDescriptor(socket, head, data.get());
        }
    }
}

void ReceiveValue(int socket, phone::Bytes& buffer) {
    const std::size_t size = buffer.size() - kOutOfLineReplySize;
    ssize_t received = 0;
    if (size <= platform::kMaxInlineData) {
        received = recv(socket, buffer.data(), buffer.size(), 0) -
                   static_cast<ssize_t>(kOutOfLineReplySize);
    } else {
        const auto data = bench::ReceiveWithDescriptor(socket, kOutOfLineReplySize);
        received = pread(data.get(), buffer.data(), size, 0);
    }
    if (received != static_cast<ssize_t>(size)) {
        throw std::runtime_error("a reply of another size");
    }
}

double TimeValues(int socket, std::size_t size) {
    const auto& layout = kRoutineLayouts[7];
    auto request = phone::Message(kCopyPreferenceValue, layout.requestSize);
    phone::PutText(request, layout.offsetOfField(0), kDomain);
    phone::PutText(request, layout.offsetOfField(1), kKey);
    phone::Bytes buffer(kOutOfLineReplySize + size);
    const std::size_t count = std::min(kBytesOfRepetition / size, kMostRequests);
    const double start = bench::Now();
    for (std::size_t i = 0; i < count; ++i) {
        bench::Send(socket, request);
        ReceiveValue(socket, buffer);
    }
    return (bench::Now() - start) / static_cast<double>(count);
}

void CompareValues(const phone::Client& client, std::size_t size, const std::string& file) {
    std::array<int, 2> ends{-1, -1};
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()) != 0) {
        throw std::runtime_error("no pair of sockets");
    }
    const platform::OwnedFd asking(ends[0]);
    platform::OwnedFd serving(ends[1]);
    const bench::FloorServer floor([&] { Serve(serving.get(), size, file); });
    serving.reset();
    const auto comparison =
        bench::Compare(kRepetitions,
                       {.floor = [&] { return TimeValues(asking.get(), size); },
                        .ours = [&] { return TimeValues(client.privatePort.get(), size); }});
    bench::Print("value of " + std::to_string(size >> 10) +
                     " KiB; floor: " + (file.empty() ? "" : "file read, ") + "sent " +
                     (size <= platform::kMaxInlineData ? "inline" : "as sealed memfd"),
                 comparison,
                 "-",
                 "-");
}

void BulkReplies() {
    bench::PinToOneCore();
    const phone::Daemon daemon;
    const auto client = phone::Client::checkIn();
    const std::string file =
        std::string(phone::kMobileLibrary) + "/Preferences/" + std::string(kDomain) + ".plist";
    for (const std::size_t kibibytes : {1U, 4U, 64U, 1024U}) {
        const std::size_t size = kibibytes << 10;
        if (client.setPreference(kDomain, kKey, ValueOfSize(size)) != 0) {
            throw std::runtime_error("the value is not taken");
        }
        CompareValues(client, size, "");
        CompareValues(client, size, file);
    }
}

}  // namespace

int main() {
    return bench::Main(BulkReplies);
}
