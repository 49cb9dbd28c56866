// A database of 100 MB uncompressed into a file, against zlib inflating it without writing. The
// file lies where databases are installed, which in the private phone root is memory (tmpfs).
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>
#include <zlib.h>

#include <array>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <random>
#include <stdexcept>
#include <string>
#include <vector>

#include "bench/Bench.h"
#include "platform/OutputFile.h"
#include "platform/hvu/Compression.h"

namespace {

constexpr int kRepetitions = 7;
constexpr int kGzipWindow = 15 + 16;
constexpr std::size_t kDatabaseSize = 100'000'000;
constexpr const char* kFile = "/var/mobile/Library/bench.db.tmp";
constexpr const char* kZipped = "/run/bench.db.gz";

/// Rows as such databases have them: places, identities, a few names that come again.
std::string Database() {
    constexpr std::array kNames{"umts", "lte", "gsm", "scdma", "macro", "micro", "pico", "indoor"};
    std::mt19937 random(1);
    std::string rows;
    rows.reserve(kDatabaseSize + 200);
    while (rows.size() < kDatabaseSize) {
        std::array<char, 200> row{};
        const int size = std::snprintf(row.data(),
                                       row.size(),
                                       "310,%03u,%u,%u,%s,%d.%05u,%d.%05u,%s,%u\n",
                                       static_cast<unsigned>(random() % 40),
                                       static_cast<unsigned>(random() % 3000),
                                       static_cast<unsigned>(random()),
                                       kNames[random() % 4],
                                       static_cast<int>(random() % 90),
                                       static_cast<unsigned>(random() % 100'000),
                                       -static_cast<int>(random() % 180),
                                       static_cast<unsigned>(random() % 100'000),
                                       kNames[4 + random() % 4],
                                       static_cast<unsigned>(random() % 64) * 250);
        rows.append(row.data(), static_cast<std::size_t>(size));
    }
    return rows;
}

std::vector<std::byte> Zip(const std::string& text) {
    z_stream stream{};
    if (deflateInit2(&stream, 6, Z_DEFLATED, kGzipWindow, 8, Z_DEFAULT_STRATEGY) != Z_OK) {
        throw std::runtime_error("no compressor");
    }
    std::vector<std::byte> data(deflateBound(&stream, text.size()));
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(text.data()));
    stream.avail_in = static_cast<uInt>(text.size());
    stream.next_out = reinterpret_cast<Bytef*>(data.data());
    stream.avail_out = static_cast<uInt>(data.size());
    (void)deflate(&stream, Z_FINISH);
    data.resize(stream.total_out);
    data.shrink_to_fit();
    (void)deflateEnd(&stream);
    return data;
}

double TimeInflating(const std::vector<std::byte>& data) {
    const double start = bench::Now();
    std::vector<Bytef> buffer(128UL * 1024);
    z_stream stream{};
    (void)inflateInit2(&stream, kGzipWindow);
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<std::byte*>(data.data()));
    stream.avail_in = static_cast<uInt>(data.size());
    int code = Z_OK;
    while (code == Z_OK) {
        stream.next_out = buffer.data();
        stream.avail_out = static_cast<uInt>(buffer.size());
        code = inflate(&stream, Z_NO_FLUSH);
    }
    (void)inflateEnd(&stream);
    if (code != Z_STREAM_END) {
        throw std::runtime_error("zlib does not decode what it encoded");
    }
    return bench::Now() - start;
}

double TimeInstalling(const std::vector<std::byte>& data) {
    (void)std::remove(kFile);
    const double start = bench::Now();
    platform::OutputFile file;
    if (file.open(kFile) != 0 || !hvu::Compression::Decompress(data, file) || file.close() != 0) {
        throw std::runtime_error("the database is not installed");
    }
    return bench::Now() - start;
}

double TimeGzip() {
    (void)std::remove(kFile);
    const std::string command = std::string("gzip -dc ") + kZipped + " >" + kFile;
    const double start = bench::Now();
    if (std::system(command.c_str()) != 0) {
        throw std::runtime_error("gzip failed");
    }
    return bench::Now() - start;
}

long PeakOfMemory() {
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    return usage.ru_maxrss;
}

/// What a process that has the body in memory needs on top of it, in kilobytes. A process of its
/// own starts with the peak that it has.
long MemoryToInstall(const std::vector<std::byte>& data) {
    std::array<int, 2> ends{-1, -1};
    if (pipe(ends.data()) != 0) {
        throw std::runtime_error("no pipe");
    }
    const pid_t child = fork();
    if (child == 0) {
        const long before = PeakOfMemory();
        (void)TimeInstalling(data);
        const long needed = PeakOfMemory() - before;
        _exit(write(ends[1], &needed, sizeof needed) == sizeof needed ? 0 : 1);
    }
    close(ends[1]);
    long needed = 0;
    const bool isTold = read(ends[0], &needed, sizeof needed) == sizeof needed;
    close(ends[0]);
    (void)waitpid(child, nullptr, 0);
    if (!isTold) {
        throw std::runtime_error("the memory is not measured");
    }
    return needed;
}

void InstallDatabase() {
    bench::PinToOneCore();
    const auto data = Zip(Database());
    std::ofstream(kZipped, std::ios::binary)
        .write(reinterpret_cast<const char*>(data.data()),
               static_cast<std::streamsize>(data.size()));
    const auto install = [&] { return TimeInstalling(data); };
    bench::Print("database of 100 MB to tmpfs; floor: zlib, not written",
                 bench::Compare(kRepetitions,
                                {.floor = [&] { return TimeInflating(data); }, .ours = install}),
                 "1.20",
                 "1.10");
    bench::Print("the same; floor: gzip -dc, to the same folder",
                 bench::Compare(kRepetitions, {.floor = TimeGzip, .ours = install}),
                 "-",
                 "-");
    bench::Print({.what = "the same: memory beside the body of " +
                          bench::Megabytes(static_cast<long>(data.size() / 1024)),
                  .measured = bench::Megabytes(MemoryToInstall(data)),
                  .atMost = "1 MB",
                  .reachFor = "-"});
    (void)std::remove(kFile);
    (void)std::remove(kZipped);
}

}  // namespace

int main() {
    return bench::Main(InstallDatabase);
}
