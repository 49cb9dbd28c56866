// What copying a tree costs beside a walk that does nothing but open, make and copy: no times, no
// attributes, no modes, no hard links, no holes. And beside cp -a, which keeps all of these.
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <vector>

#include "bench/Bench.h"
#include "platform/FileManager.h"
#include "platform/linux/OwnedFd.h"

namespace {

namespace fs = std::filesystem;

using platform::OwnedFd;

constexpr int kFolders = 200;
constexpr int kFilesOfFolder = 100;
constexpr std::size_t kLargeFile = std::size_t{1} << 30;

void Require(bool holds, const std::string& what) {
    if (!holds) {
        throw std::runtime_error("cannot " + what + ": " + std::strerror(errno));
    }
}

/// A folder for the copies, in the memory of the phone root: a disk would be measured otherwise.
class Workshop {
public:
    Workshop() { Require(mkdtemp(path_.data()) != nullptr, "make " + path_); }

    ~Workshop() {
        std::error_code ignored;  // what stays says where it is by its name
        fs::remove_all(path_, ignored);
    }

    Workshop(const Workshop&) = delete;
    Workshop& operator=(const Workshop&) = delete;

    [[nodiscard]] std::string at(const std::string& name) const { return path_ + "/" + name; }

private:
    std::string path_ = "/tmp/tree-copy.XXXXXX";
};

void WriteFile(const std::string& path, std::size_t size) {
    const std::vector<char> bytes(std::min(size, std::size_t{1} << 20), 'x');
    const OwnedFd file(open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0644));
    for (std::size_t written = 0; written < size;) {
        const ssize_t count =
            write(file.get(), bytes.data(), std::min(bytes.size(), size - written));
        Require(count > 0, "write " + path);
        written += static_cast<std::size_t>(count);
    }
}

/// Sizes as configuration files and logs have them: most a page or two, some more.
void MakeSmallFiles(const std::string& top) {
    for (int i = 0; i < kFolders; ++i) {
        const std::string folder = top + "/" + std::to_string(i);
        fs::create_directories(folder);
        for (int j = 0; j < kFilesOfFolder; ++j) {
            const auto size =
                static_cast<std::size_t>(100 + j * 37 % 4000 + (j % 20 == 0 ? 30'000 : 0));
            WriteFile(folder + "/" + std::to_string(j), size);
        }
    }
}

// The floor.

void CopyPlainFile(int source, int copy, const char* name) {
    const OwnedFd from(openat(source, name, O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    const OwnedFd to(
        openat(copy, name, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0644));

    struct stat status {};

    Require(from.isOpen() && to.isOpen() && fstat(from.get(), &status) == 0, "copy a file");
    for (off_t left = status.st_size; left > 0;) {
        const ssize_t count = copy_file_range(
            from.get(), nullptr, to.get(), nullptr, static_cast<std::size_t>(left), 0);
        Require(count > 0, "copy a range");
        left -= count;
    }
}

void CopyPlainTree(int source, int copy) {
    DIR* const folder = fdopendir(dup(source));
    Require(folder != nullptr, "read a folder");
    while (const dirent* const entry = readdir(folder)) {
        const std::string name = entry->d_name;
        if (entry->d_type != DT_DIR) {
            CopyPlainFile(source, copy, entry->d_name);
        } else if (name != "." && name != "..") {
            Require(mkdirat(copy, entry->d_name, 0755) == 0, "make a folder");
            const OwnedFd from(openat(source, entry->d_name, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
            const OwnedFd to(openat(copy, entry->d_name, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
            CopyPlainTree(from.get(), to.get());
        }
    }
    closedir(folder);
}

void CopyByWalk(const std::string& source, const std::string& copy) {
    fs::create_directory(copy);
    const OwnedFd from(open(source.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const OwnedFd to(open(copy.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    CopyPlainTree(from.get(), to.get());
}

// Ours, and the system's own.

void CopyByFileManager(const std::string& source, const std::string& copy) {
    errno = FileManagerCopyItem(platform::PathAccess(source), platform::PathAccess(copy));
    Require(errno == 0, "copy by the file manager");
}

void CopyByProgram(const std::string& source, const std::string& copy) {
    const pid_t pid = fork();
    if (pid == 0) {
        execlp("cp", "cp", "-a", source.c_str(), copy.c_str(), nullptr);
        _exit(127);
    }
    int status = 0;
    Require(pid > 0 && waitpid(pid, &status, 0) == pid && status == 0, "copy by cp");
}

using Copy = void (*)(const std::string& source, const std::string& copy);

/// Times one copy, which is then removed.
double TimeCopy(const Workshop& workshop, const std::string& source, Copy copy) {
    const std::string end = workshop.at("copy");
    const double start = bench::Now();
    copy(source, end);
    const double time = bench::Now() - start;
    fs::remove_all(end);
    return time;
}

void CompareCopies(const Workshop& workshop,
                   const std::string& source,
                   const std::string& what,
                   int repetitions) {
    const auto timed = [&](Copy copy) {
        return [&, copy] { return TimeCopy(workshop, source, copy); };
    };
    bench::Print(
        what,
        bench::Compare(repetitions, {.floor = timed(CopyByWalk), .ours = timed(CopyByFileManager)}),
        "1.25",
        "1.0");
    bench::Print(
        what + ", beside cp -a",
        bench::Compare(1, {.floor = timed(CopyByProgram), .ours = timed(CopyByFileManager)}),
        "-",
        "-");
}

void TreeCopy() {
    bench::PinToOneCore();
    const Workshop workshop;
    MakeSmallFiles(workshop.at("small"));
    CompareCopies(workshop, workshop.at("small"), "tree copy, 20,000 small files", 5);
    fs::create_directory(workshop.at("large"));
    WriteFile(workshop.at("large/file"), kLargeFile);
    CompareCopies(workshop, workshop.at("large"), "tree copy, one file of 1 GiB", 3);
}

}  // namespace

int main() {
    return bench::Main(TreeCopy);
}
