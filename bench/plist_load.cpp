// A property-list file loaded by the daemon (routine 23), against a process that reads the file and
// sends its bytes back by the same road, and does nothing else: no walk by the rule for links, no
// parsing, no serialising, no log line.
#include <fcntl.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "bench/Bench.h"
#include "bench/Wire.h"
#include "platform/PropertyList.h"

namespace {

constexpr int kRepetitions = 15;
constexpr std::size_t kBytesOfRepetition = 4U << 20;
constexpr std::size_t kMostRequests = 500;
constexpr std::int32_t kLoadPlistFile = kFirstRoutineId + 23;
constexpr const char* kFile = "/private/bench.plist";

/// A dictionary like a carrier bundle's, of about this size in either form.
platform::PropertyList ListOfSize(std::size_t size) {
    constexpr std::size_t kEntrySize = 128;
    platform::PropertyList::Dictionary entries;
    for (std::size_t i = 0; i < size / kEntrySize; ++i) {
        entries.emplace_back("SomeSettingOfACarrier" + std::to_string(i),
                             i % 4 == 0 ? platform::PropertyList(true)
                                        : platform::PropertyList(std::string(60, 'x')));
    }
    return platform::PropertyList(std::move(entries));
}

phone::Bytes ReadFile(int file) {
    phone::Bytes contents(static_cast<std::size_t>(lseek(file, 0, SEEK_END)));
    if (pread(file, contents.data(), contents.size(), 0) != static_cast<ssize_t>(contents.size())) {
        throw std::runtime_error("cannot read the list");
    }
    return contents;
}

void SendBack(int socket, std::span<const std::byte> contents) {
    phone::Bytes reply(kOutOfLineReplySize);
    if (contents.size() <= platform::kMaxInlineData) {
        reply.insert(reply.end(), contents.begin(), contents.end());
        bench::Send(socket, reply);
    } else {
        bench::SendWithDescriptor(socket, reply, phone::SealedFile(contents).get());
    }
}

void Serve(int socket) {
    phone::Bytes request(kRoutineLayouts[23].requestSize);
    while (recv(socket, request.data(), request.size(), 0) > 0) {
        const platform::OwnedFd file(open(kFile, O_RDONLY | O_CLOEXEC));
        SendBack(socket, ReadFile(file.get()));
    }
}

/// Asks and takes the answer out of the datagram or the memory file.
void Load(int socket, const phone::Bytes& request, phone::Bytes& buffer) {
    bench::Send(socket, request);
    if (buffer.size() <= platform::kMaxInlineData) {
        if (recv(socket, buffer.data(), buffer.size(), 0) <= ssize_t{kOutOfLineReplySize}) {
            throw std::runtime_error("no list in the reply");
        }
        return;
    }
    const auto data = bench::ReceiveWithDescriptor(socket, kOutOfLineReplySize);
    if (pread(data.get(), buffer.data(), buffer.size(), 0) <= 0) {
        throw std::runtime_error("no list beside the reply");
    }
}

double TimeLoads(int socket, std::size_t size) {
    const auto& layout = kRoutineLayouts[23];
    auto request = phone::Message(kLoadPlistFile, layout.requestSize);
    phone::PutText(request, layout.offsetOfField(0), kFile);
    phone::Bytes buffer(kOutOfLineReplySize + size);
    const std::size_t count = std::clamp<std::size_t>(kBytesOfRepetition / size, 1, kMostRequests);
    const double start = bench::Now();
    for (std::size_t i = 0; i < count; ++i) {
        Load(socket, request, buffer);
    }
    return (bench::Now() - start) / static_cast<double>(count);
}

void Compare(const phone::Client& client, std::size_t kibibytes) {
    // Written as the daemon writes it, so that both sides send the same number of bytes.
    const auto list = platform::PropertyListCreateXmlData(ListOfSize(kibibytes << 10)).value();
    std::ofstream(kFile, std::ios::binary)
        .write(reinterpret_cast<const char*>(list.data()),
               static_cast<std::streamsize>(list.size()));
    std::array<int, 2> ends{-1, -1};
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()) != 0) {
        throw std::runtime_error("no pair of sockets");
    }
    const platform::OwnedFd asking(ends[0]);
    platform::OwnedFd serving(ends[1]);
    const bench::FloorServer floor([&] { Serve(serving.get()); });
    serving.reset();
    const auto comparison =
        bench::Compare(kRepetitions,
                       {.floor = [&] { return TimeLoads(asking.get(), list.size()); },
                        .ours = [&] { return TimeLoads(client.privatePort.get(), list.size()); }});
    bench::Print(
        "property-list file of " + std::to_string(list.size() >> 10) + " KiB; floor: read, sent",
        comparison,
        "-",
        "-");
}

void PlistLoad() {
    bench::PinToOneCore();
    const phone::Daemon daemon;
    const auto client = phone::Client::checkIn();
    for (const std::size_t kibibytes : {4U, 40U, 1024U}) {
        Compare(client, kibibytes);
    }
    std::filesystem::remove(kFile);
}

}  // namespace

int main() {
    return bench::Main(PlistLoad);
}
