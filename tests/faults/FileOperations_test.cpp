// Whole items that are being copied, moved or written when the process dies or a call fails: what
// is seen under the final name is the old or the new, never half.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <filesystem>
#include <fstream>

#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

const std::string kTop = "/tmp/file-operations";
const std::string kSource = kTop + "/from/source";
const std::string kCopy = kTop + "/to/copy";
constexpr const char* kTrace = "/run/file-operation.trace";
constexpr const char* kKill = "signal=SIGKILL";

/// All calls that touch files; those that an operation does not make are found out at once.
constexpr std::array kCalls{"openat",    "openat2",   "newfstatat", "fstat",           "read",
                            "write",     "lseek",     "ftruncate",  "copy_file_range", "getdents64",
                            "mkdirat",   "symlinkat", "linkat",     "readlinkat",      "utimensat",
                            "fchmod",    "fchown",    "fchownat",   "flistxattr",      "fgetxattr",
                            "fsetxattr", "unlinkat",  "renameat",   "renameat2",       "fsync"};

void WriteFile(const std::string& path, const std::string& contents) {
    std::ofstream(path, std::ios::binary) << contents;
}

std::string Contents(const std::string& path) {
    std::error_code error;
    std::string contents(fs::is_regular_file(path, error) ? fs::file_size(path) : 0, '\0');
    std::ifstream(path, std::ios::binary)
        .read(contents.data(), static_cast<std::streamsize>(contents.size()));
    return contents;
}

/// A little of everything.
void MakeSource() {
    fs::create_directories(kSource + "/folder");
    WriteFile(kSource + "/file", "contents");
    WriteFile(kSource + "/large", std::string(70'000, 'x'));
    fs::create_hard_link(kSource + "/file", kSource + "/folder/second");
    fs::create_symlink("file", kSource + "/link");
    fs::permissions(kSource + "/file", fs::perms(0666));
    WriteFile(kSource + "/folder/sparse", "start");
    fs::resize_file(kSource + "/folder/sparse", 40'000);
    // Refused by file systems in memory before Linux 6.6: then there is one call less to fail.
    (void)setxattr((kSource + "/file").c_str(), "user.x", "y", 1, 0);
}

/// Names, kinds and contents of all that lies below a path; empty when nothing is there.
std::vector<std::string> Tree(const std::string& path) {
    std::vector<std::string> lines;
    if (!fs::exists(fs::symlink_status(path))) {
        return lines;
    }
    lines.emplace_back("the top");
    for (const auto& entry : fs::recursive_directory_iterator(path)) {
        const std::string name = entry.path().string().substr(path.size());
        lines.push_back(entry.is_symlink()     ? name + " -> " + fs::read_symlink(entry).string()
                        : entry.is_directory() ? name + "/"
                                               : name + ": " + Contents(entry.path()));
    }
    std::sort(lines.begin(), lines.end());
    return lines;
}

std::vector<std::string> Names(const std::string& folder) {
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator(folder)) {
        names.push_back(entry.path().filename());
    }
    return names;
}

int StatusOf(std::vector<std::string> command) {
    std::vector<char*> arguments;
    for (auto& argument : command) {
        arguments.push_back(argument.data());
    }
    arguments.push_back(nullptr);
    const pid_t pid = fork();
    if (pid == 0) {
        // The loader complains when its calls are the ones that fail.
        dup2(open("/dev/null", O_WRONLY | O_CLOEXEC), STDERR_FILENO);
        execv(arguments[0], arguments.data());
        _exit(127);
    }
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

struct Ending {
    std::string call;  ///< that the fault was to hit
    bool succeeded = false;
    bool wasHit = false;  ///< the operation came as far as the fault
};

class FileOperations : public testing::Test {
protected:
    FileOperations() {
        fs::remove_all(kTop);
        fs::create_directories(kTop + "/from");
        fs::create_directories(kTop + "/to");
    }

    ~FileOperations() override {
        (void)umount2((kTop + "/to").c_str(), MNT_DETACH);  // most tests mount nothing
        fs::remove_all(kTop);
    }

    static Ending perform(const std::string& operation,
                          const std::string& call,
                          const std::string& fault,
                          int n) {
        const std::string injection = "inject=" + call + ":" + fault + ":when=" + std::to_string(n);
        const int status = StatusOf({"/usr/bin/strace",
                                     "-o",
                                     kTrace,
                                     "-e",
                                     "trace=" + call,
                                     "-e",
                                     injection,
                                     phone::ProgramPath("file-operation"),
                                     operation,
                                     kSource,
                                     kCopy});
        const bool isKilled = fault == kKill && status != 0 && status != 1;
        return {.call = call,
                .succeeded = status == 0,
                .wasHit = isKilled || Contents(kTrace).find("(INJECTED)") != std::string::npos};
    }

    /// Each call of the operation in turn; `check` looks at what is left, and cleans up.
    template <typename Check>
    static int sweep(const std::string& operation, const std::string& fault, const Check& check) {
        int faults = 0;
        for (const char* call : kCalls) {
            for (int n = 1; n < 100; ++n) {
                SCOPED_TRACE(operation + " with " + fault + " at " + call + " " +
                             std::to_string(n));
                const Ending ending = perform(operation, call, fault, n);
                check(ending);
                if (!ending.wasHit) {
                    EXPECT_TRUE(ending.succeeded);
                    break;
                }
                ++faults;
            }
        }
        return faults;
    }
};

class FaultyFileOperations : public FileOperations,
                             public testing::WithParamInterface<const char*> {};

TEST_P(FaultyFileOperations, CopyAllOrNothing) {
    MakeSource();
    const auto source = Tree(kSource);
    const std::string fault = GetParam();
    const int faults = sweep("copy", fault, [&](const Ending& ending) {
        const auto copy = Tree(kCopy);
        EXPECT_TRUE(copy.empty() || copy == source);
        EXPECT_EQ(Tree(kSource), source);
        if (ending.succeeded) {
            EXPECT_EQ(copy, source);
        }
        // A process that lives on cleans up after itself, unless just that fails; after one that
        // died the next one does.
        if (fault != kKill && ending.call != "unlinkat") {
            EXPECT_EQ(Names(kTop + "/to").size(), copy.empty() ? 0U : 1U);
        }
        fs::remove_all(kCopy);
        if (fault != kKill && ending.call == "unlinkat") {
            EXPECT_TRUE(perform("copy", "openat", fault, 1000).succeeded);
            EXPECT_EQ(Names(kTop + "/to"), std::vector<std::string>{"copy"}) << "the rest is gone";
            fs::remove_all(kCopy);
        }
    });
    EXPECT_GT(faults, 60);
    EXPECT_TRUE(perform("copy", "openat", "error=EIO", 1000).succeeded);
    EXPECT_EQ(Names(kTop + "/to"), std::vector<std::string>{"copy"});
}

TEST_P(FaultyFileOperations, WriteTheOldOrTheNew) {
    const std::string old = "old";
    const std::string fresh(20'000, 'n');
    WriteFile(kSource, fresh);
    WriteFile(kCopy, old);
    const std::string fault = GetParam();
    const int faults = sweep("write", fault, [&](const Ending& ending) {
        const std::string found = Contents(kCopy);
        EXPECT_TRUE(found == old || found == fresh);
        if (ending.succeeded) {
            EXPECT_EQ(found, fresh);
        }
        if (fault != kKill) {
            EXPECT_EQ(Names(kTop + "/to"), std::vector<std::string>{"copy"});
        }
        WriteFile(kCopy, old);
    });
    EXPECT_GT(faults, 10);
}

INSTANTIATE_TEST_SUITE_P(Of,
                         FaultyFileOperations,
                         testing::Values("error=ENOSPC", "error=EIO", "error=EACCES", kKill));

TEST_F(FileOperations, MoveToAnotherFileSystemWithoutLosingAnything) {
    ASSERT_EQ(mount("tmpfs", (kTop + "/to").c_str(), "tmpfs", 0, "size=4m,mode=0755"), 0);
    MakeSource();
    const auto source = Tree(kSource);
    for (const char* fault : {"error=EIO", kKill}) {
        const int faults = sweep("move", fault, [&](const Ending& ending) {
            const auto copy = Tree(kCopy);
            EXPECT_TRUE(copy == source || (copy.empty() && Tree(kSource) == source));
            if (ending.succeeded) {
                EXPECT_EQ(copy, source);
                EXPECT_TRUE(Tree(kSource).empty());
            }
            fs::remove_all(kCopy);
            fs::remove_all(kSource);
            MakeSource();
        });
        EXPECT_GT(faults, 60);
    }
}

}  // namespace
