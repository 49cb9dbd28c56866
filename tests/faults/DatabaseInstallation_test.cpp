// A database that is being installed when the daemon dies, or a call fails: what the record calls
// installed is there, whole. Some daemons at a time run side by side, each on a phone of its own.
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "platform/linux/DatagramReader_test.h"
#include "tests/updates/UpdateRig.h"
#include "tools/NamedPort.h"

namespace fs = std::filesystem;

namespace {

using namespace updates;

constexpr int kWorkers = 3;
constexpr int kCallsMax = 200;  // of one name in an installation, and more than there are
const std::string kFile = kFolder + "/gsm.db";

/// Large enough to be written in several pieces.
std::string Database(char version) {
    return std::string(300'000, version);
}

// A worker's phone.

void Require(bool holds, const char* what) {
    if (!holds) {
        throw std::runtime_error(what + std::string(": ") + std::strerror(errno));
    }
}

/// The home, the services and the journal of this process are its own from here on.
void EnterPhoneOfItsOwn() {
    Require(unshare(CLONE_NEWNS) == 0, "unshare");
    Require(mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0, "private mounts");
    for (const char* folder : {"/private", "/run/linefold", "/run/systemd/journal"}) {
        fs::create_directories(folder);
        Require(mount("tmpfs", folder, "tmpfs", 0, "mode=755") == 0, folder);
    }
}

enum class Before : std::uint8_t { kNothing, kOlderFile };

void PreparePhone(Before before) {
    phone::ResetMobileHome();
    if (before == Before::kOlderFile) {
        fs::create_directories(kFolder);
        std::ofstream(kFile) << Database('1');
        Record({{"gsm", Entry("1", "x")}});
    }
}

/// The version that is recorded, 0 for none.
int RecordedVersion() {
    const PropertyList record = Recorded();
    const auto* const entry = record.find("gsm");
    const auto* const version = entry == nullptr ? nullptr : entry->find("Version");
    return version == nullptr ? 0 : std::stoi(*version->as<std::string>());
}

/// The version that the file holds as a whole, 0 for no file, -1 for anything else.
int VersionOnDisk() {
    const std::string contents = Contents(kFile);
    if (contents == "(no file)") {
        return 0;
    }
    return contents == Database('1') ? 1 : contents == Database('2') ? 2 : -1;
}

// A daemon with one fault.

struct Fault {
    std::string call;
    int number = 0;    ///< of the call among those of this name that touch the installation
    std::string what;  ///< for strace: "signal=SIGKILL" or "error=EIO"

    [[nodiscard]] std::string text() const {
        return call + " " + std::to_string(number) + " " + what;
    }
};

/// The user's folder and what lies below it. The steps that lead there change nothing and end like
/// the first one below, so they are left out.
std::vector<std::string> TouchedPaths() {
    const std::string library = "/private/var/mobile/Library";
    return {library,
            library + "/LASD",
            library + "/LASD/gsm.db",
            library + "/LASD/gsm.db.tmp",
            library + "/Preferences",
            library + "/Preferences/com.vendra.lasd.plist",
            library + "/Preferences/.linefold-mobile-helper.tmp",
            "/var/mobile/Library/Preferences/",
            "/var/mobile/Library/Preferences/com.vendra.lasd.plist"};
}

std::vector<std::string> Strace(const Fault& fault, const std::string& trace) {
    std::vector<std::string> words{
        "/usr/bin/strace",
        "--quiet=attach,path-resolution",
        "-D",
        "-f",
        "-o",
        trace,
        "-e",
        "trace=" + fault.call,
        "-e",
        "inject=" + fault.call + ":" + fault.what + ":when=" + std::to_string(fault.number)};
    for (const auto& path : TouchedPaths()) {
        words.insert(words.end(), {"-P", path});
    }
    return words;
}

class FaultyDaemon {
public:
    explicit FaultyDaemon(const Fault& fault)
        : daemon_({.wrapper = Strace(fault, kTrace)}), client_(phone::Client::checkIn()) {}

    /// Asks for the update and waits for its outcome, or for the daemon's death.
    std::string update(tools::NamedPort& port) {
        if (client_.code != 0 || !Ask(client_, kGsm)) {
            return "(dead)";
        }
        for (;;) {
            const bool isAlive = daemon_.isRunning();
            const auto message = port.receive(isAlive ? 5 : 0);
            if (message || !isAlive) {
                return message ? NameOf(message->body).value_or("(something else)") : "(dead)";
            }
        }
    }

    /// Ends the daemon and tells whether it came as far as the fault.
    bool wasHit() {
        if (daemon_.isRunning()) {
            daemon_.signal(SIGTERM);
        }
        if (daemon_.waitForExit() != 0) {
            return true;
        }
        std::string text;
        return phone::Eventually([&] {
                   text = Contents(kTrace);
                   return text.find("+++ exited") != std::string::npos;
               }) &&
               text.find("(INJECTED)") != std::string::npos;
    }

private:
    static constexpr const char* kTrace = "/run/linefold/trace";
    phone::Daemon daemon_;
    phone::Client client_;
};

// The journal.

/// The daemon's last line, without those that the platform adds for operators.
std::string LastLine(const platform::DatagramReader& journal) {
    std::string last;
    while (const auto entry = journal.take()) {
        const auto start = entry->find("MESSAGE=");
        if (start != std::string::npos && entry->find("CATEGORY=platform") == std::string::npos) {
            last = entry->substr(start + 8, entry->find('\n', start) - start - 8);
        }
    }
    return last;
}

/// The lines that may be the last of an installation that failed at a file.
bool IsLineOfFailure(const std::string& line) {
    static constexpr std::array kBeginnings{
        "Cannot create /var/mobile/Library/LASD errno set to ",
        "Failed to commit the data to file for /var/mobile/Library/LASD/gsm.db.tmp",
        "Failed to remove the previous download at location /var/mobile/Library/LASD/gsm.db",
        "Could not rename /var/mobile/Library/LASD/gsm.db.tmp to /var/mobile/Library/LASD/gsm.db: ",
        // That the file or its record did not reach the disk is told by the platform, behind this.
        "Moving /var/mobile/Library/LASD/gsm.db.tmp to /var/mobile/Library/LASD/gsm.db"};
    return std::ranges::any_of(
        kBeginnings, [&line](const char* beginning) { return line.starts_with(beginning); });
}

// The sweeps.

struct Job {
    std::string call;
    std::string what;
};

/// What a worker found out.
struct Findings {
    std::ostringstream failures;
    std::array<int, 5> counts{};  ///< tried; and, for a record that is still old, old, gone and new
};

enum Count : std::size_t { kTried, kBothOld, kFileGone, kFileNew, kBothNew };

void Expect(bool holds, Findings& findings, const std::string& what) {
    if (!holds) {
        findings.failures << what << "\n";
    }
}

/// The record tells the truth, but for the steps between the removal of the old file and the record
/// of the new one.
void CheckRecord(Before before, Findings& findings, const std::string& what) {
    const int recorded = RecordedVersion();
    const int onDisk = VersionOnDisk();
    const int old = before == Before::kOlderFile ? 1 : 0;
    Expect(recorded == old || recorded == 2, findings, what + ": the record is damaged");
    Expect(onDisk == old || onDisk == 0 || onDisk == 2, findings, what + ": half a file");
    Expect(recorded != 2 || onDisk == 2, findings, what + ": recorded, and not there");
    ++findings.counts[recorded == 2   ? kBothNew
                      : onDisk == 2   ? kFileNew
                      : onDisk == old ? kBothOld
                                      : kFileGone];
}

class Worker {
public:
    Worker() : journal_("/run/systemd/journal/socket") {}

    void run(const Job& job, Before before) {
        for (int number = 1; number < kCallsMax; ++number) {
            const Fault fault{.call = job.call, .number = number, .what = job.what};
            PreparePhone(before);
            (void)journal_.drain();
            if (!tryOnce(fault, before)) {
                return;
            }
        }
        Expect(false, findings_, job.call + " " + job.what + ": there is no end");
    }

    [[nodiscard]] Findings& findings() { return findings_; }

private:
    /// False when the fault was not met.
    bool tryOnce(const Fault& fault, Before before) {
        FaultyDaemon daemon(fault);
        const std::string outcome = daemon.update(port_);
        const std::string line = LastLine(journal_);
        if (!daemon.wasHit()) {
            Expect(outcome == "UpdateAvailable gsm", findings_, fault.text() + ": " + outcome);
            return false;
        }
        ++findings_.counts[kTried];
        CheckRecord(before, findings_, fault.text());
        if (fault.what.starts_with("error")) {
            checkOutcome(fault, outcome, line);
        } else {
            checkNextTry(fault);
        }
        return true;
    }

    void checkOutcome(const Fault& fault, const std::string& outcome, const std::string& line) {
        const std::string what = fault.text() + ": " + outcome + " behind \"" + line + "\"";
        if (outcome == "UpdateAvailable gsm") {
            Expect(line == "Downloaded gsm database version 2 successfully", findings_, what);
            Expect(RecordedVersion() == 2, findings_, what + ", and not recorded");
        } else {
            Expect(outcome == "UpdateFailed" && IsLineOfFailure(line), findings_, what);
        }
        Expect(!port_.receive(0), findings_, what + ", and there was more");
    }

    /// Whatever a dead daemon has left, the next one brings it to an end.
    void checkNextTry(const Fault& fault) {
        const bool wasRecorded = RecordedVersion() == 2;
        (void)port_.receive(0);  // it may have been told just before the end
        phone::Daemon daemon;
        const auto client = phone::Client::checkIn();
        Expect(Ask(client, kGsm), findings_, fault.text() + ": the next daemon does not answer");
        const auto message = port_.receive(20'000);
        const auto outcome = message ? NameOf(message->body).value_or("") : "(nothing)";
        Expect(outcome == (wasRecorded ? "NoUpdateRequired" : "UpdateAvailable gsm"),
               findings_,
               fault.text() + ": then " + outcome);
        Expect(VersionOnDisk() == 2 && RecordedVersion() == 2,
               findings_,
               fault.text() + ": not mended");
    }

    platform::DatagramReader journal_;
    tools::NamedPort port_ = tools::NamedPort::own("com.vendra.Linefold.lasd").value();
    Findings findings_;
};

std::string FindingsFile(int worker) {
    return "/tmp/findings-" + std::to_string(worker);
}

/// Every n-th job of the list, in a process of its own.
[[noreturn]] void Work(int worker, std::span<const Job> jobs, Before before) {
    std::ofstream file(FindingsFile(worker));
    try {
        EnterPhoneOfItsOwn();
        Worker work;
        for (std::size_t i = static_cast<std::size_t>(worker); i < jobs.size(); i += kWorkers) {
            work.run(jobs[i], before);
        }
        for (const int count : work.findings().counts) {
            file << " " << count;
        }
        file << "\n" << work.findings().failures.str();
    } catch (const std::exception& problem) {
        file << "0 0 0 0 0\n" << problem.what() << "\n";
    }
    file.close();
    _exit(0);
}

/// Shares the jobs out, adds up what was found and fails for each failure.
std::array<int, 5> Sweep(std::span<const Job> jobs, Before before) {
    std::array<pid_t, kWorkers> workers{};
    for (int i = 0; i < kWorkers; ++i) {
        workers[static_cast<std::size_t>(i)] = fork();
        if (workers[static_cast<std::size_t>(i)] == 0) {
            Work(i, jobs, before);
        }
    }
    std::array<int, 5> sums{};
    for (int i = 0; i < kWorkers; ++i) {
        int status = -1;
        EXPECT_EQ(waitpid(workers[static_cast<std::size_t>(i)], &status, 0),
                  workers[static_cast<std::size_t>(i)]);
        EXPECT_EQ(status, 0);
        std::ifstream file(FindingsFile(i));
        for (int& sum : sums) {
            int count = -1;
            EXPECT_TRUE(file >> count);
            sum += count;
        }
        const std::string failures{std::istreambuf_iterator<char>(file), {}};
        EXPECT_EQ(failures, "\n");
        fs::remove(FindingsFile(i));
    }
    return sums;
}

constexpr std::array kCalls{"openat",
                            "newfstatat",
                            "fstat",
                            "close",
                            "read",
                            "write",
                            "readlink",
                            "readlinkat",
                            "mkdirat",
                            "unlinkat",
                            "fchmod",
                            "fsync",
                            "renameat",
                            "renameat2",
                            "linkat",
                            "rename",
                            "unlink"};

std::vector<Job> JobsOf(std::span<const char* const> whats) {
    std::vector<Job> jobs;
    for (const char* call : kCalls) {
        for (const char* what : whats) {
            jobs.push_back({.call = call, .what = what});
        }
    }
    return jobs;
}

void Tell(const char* what, const std::array<int, 5>& counts) {
    std::printf(
        "  %s: %d faults; record and file old: %d, old record, file gone: %d, old record, "
        "file new: %d, both new: %d\n",
        what,
        counts[kTried],
        counts[kBothOld],
        counts[kFileGone],
        counts[kFileNew],
        counts[kBothNew]);
}

class DatabaseInstallation : public testing::Test {
protected:
    static void SetUpTestSuite() { ForgetOtherAuthorities(); }

    DatabaseInstallation() {
        PutIndex({{"gsm", Entry("2", PutDatabase("gsm.db.gz", Database('2')))}});
    }

    web::ConfigurationServer server_;
};

TEST_F(DatabaseInstallation, LeavesATrueRecordWhateverCallIsTheLast) {
    const auto jobs = JobsOf(std::array{"signal=SIGKILL"});
    const auto counts = Sweep(jobs, Before::kOlderFile);
    Tell("killed", counts);
    EXPECT_GE(counts[kTried], 40);
    EXPECT_GE(counts[kBothOld], 10);
    EXPECT_GE(counts[kFileGone], 1) << "the old file goes before the new one comes";
    EXPECT_GE(counts[kFileNew], 1) << "and the record follows";
    EXPECT_GE(counts[kBothNew], 1);
}

TEST_F(DatabaseInstallation, OfTheFirstDatabaseLeavesATrueRecord) {
    const auto jobs = JobsOf(std::array{"signal=SIGKILL"});
    const auto counts = Sweep(jobs, Before::kNothing);
    Tell("killed, for the first time", counts);
    EXPECT_GE(counts[kTried], 40);
    EXPECT_EQ(counts[kFileGone], 0);
}

TEST_F(DatabaseInstallation, EndsWithItsLineAndOneNotificationWhateverCallFails) {
    const auto jobs =
        JobsOf(std::array{"error=ENOSPC", "error=EIO", "error=EACCES", "error=EROFS"});
    const auto counts = Sweep(jobs, Before::kOlderFile);
    Tell("failed", counts);
    EXPECT_GE(counts[kTried], 150);
    EXPECT_GE(counts[kBothNew], 1) << "some failures do not matter";
}

}  // namespace
