#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <thread>

#include "tests/contract/Twin.h"

namespace twin {

namespace fs = std::filesystem;

namespace {

/// Goes with the process.
class TemporaryFolder {
public:
    TemporaryFolder() : path_(fs::temp_directory_path().string() + "/contract.XXXXXX") {
        if (mkdtemp(path_.data()) == nullptr) {
            std::abort();
        }
    }

    TemporaryFolder(const TemporaryFolder&) = delete;
    TemporaryFolder& operator=(const TemporaryFolder&) = delete;

    ~TemporaryFolder() { fs::remove_all(path_); }

    [[nodiscard]] const std::string& path() const { return path_; }

private:
    std::string path_;
};

}  // namespace

void Reset() {
    umask(022);
    for (const auto& entry : fs::directory_iterator(Folder())) {
        fs::remove_all(entry.path());
    }
}

void Spend(double seconds) {
    std::this_thread::sleep_for(std::chrono::duration<double>(seconds));
}

Pair MakePair() {
    std::array<int, 2> ends{-1, -1};
    (void)socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data());
    return {.descriptor = ends[0], .closeOther = [other = ends[1]] { close(other); }};
}

std::string Folder() {
    static const TemporaryFolder folder;
    return folder.path();
}

void PutFile(const std::string& path, const std::string& contents, std::uint32_t permissions) {
    std::ofstream(path, std::ios::binary) << contents;
    fs::permissions(path, static_cast<fs::perms>(permissions));
}

void PutDirectory(const std::string& path) {
    fs::create_directory(path);
}

void PutLink(const std::string& path, const std::string& target) {
    fs::create_symlink(target, path);
}

void PutFifo(const std::string& path) {
    (void)mkfifo(path.c_str(), 0644);
}

void RemoveFile(const std::string& path) {
    fs::remove(path);
}

std::optional<File> FileAt(const std::string& path) {
    const auto status = fs::symlink_status(path);
    if (status.type() != fs::file_type::regular) {
        return std::nullopt;
    }
    std::ifstream file(path, std::ios::binary);
    return File{.contents = {std::istreambuf_iterator<char>(file), {}},
                .permissions = static_cast<std::uint32_t>(status.permissions())};
}

}  // namespace twin
