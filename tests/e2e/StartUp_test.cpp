// Start and end of the process: its service, its exit statuses, its error lines.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

using Lines = std::vector<std::string>;

const Lines kNoServer{"3 - unable to create server objects - out of resources",
                      "3 - unable to startup LinefoldMobileHelper server"};

TEST(StartUp, BindsItsServiceForEverybodyAndTakesItAway) {
    phone::Daemon daemon({.isActivated = false});

    struct stat status {};

    ASSERT_EQ(stat(std::string(phone::kServicePath).c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0666U);
    EXPECT_EQ(phone::Client::checkIn().code, 0);
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.waitForExit(), 0);
    EXPECT_FALSE(fs::exists(phone::kServicePath));
}

TEST(StartUp, IsRefusedWhileAnotherInstanceServes) {
    auto journal = phone::LogReader::journal();
    phone::Daemon first({.isActivated = false});
    phone::Daemon second({.isActivated = false});
    EXPECT_EQ(second.waitForExit(), 1);
    EXPECT_EQ(journal.take(), kNoServer);
    EXPECT_EQ(phone::Client::checkIn().code, 0) << "the first one serves on";
}

TEST(StartUp, IsRefusedWhileAnActivatedInstanceServes) {
    phone::Daemon first;
    ASSERT_EQ(phone::Client::checkIn().code, 0);
    auto journal = phone::LogReader::journal();
    const pid_t second = fork();
    if (second == 0) {
        execl(phone::DaemonPath().c_str(), "LinefoldMobileHelper", nullptr);
        _exit(127);
    }
    int status = 0;
    ASSERT_EQ(waitpid(second, &status, 0), second);
    EXPECT_EQ(WEXITSTATUS(status), 1);
    EXPECT_EQ(journal.take(), kNoServer);
}

TEST(StartUp, ReplacesTheSocketOfAnInstanceThatDied) {
    phone::Daemon first({.isActivated = false});
    first.signal(SIGKILL);
    EXPECT_EQ(first.waitForExit(), -SIGKILL);
    phone::Daemon second({.isActivated = false});
    EXPECT_TRUE(phone::Eventually([] { return phone::Client::checkIn().code == 0; }));
}

TEST(StartUp, EndsWithSuccessOnBothTerminationSignals) {
    for (const int number : {SIGTERM, SIGINT}) {
        phone::Daemon daemon;
        const auto client = phone::Client::checkIn();
        ASSERT_EQ(client.code, 0);
        daemon.signal(number);
        EXPECT_EQ(daemon.waitForExit(), 0);
        EXPECT_TRUE(client.privatePort.receive().isEnd());
    }
}

TEST(StartUp, NeedsTheMobileUsersHome) {
    const auto saved = fs::path("/etc/passwd.saved");
    fs::rename("/etc/passwd", saved);
    std::ofstream("/etc/passwd") << "root:x:0:0::/root:/bin/sh\n";
    auto journal = phone::LogReader::journal();
    phone::Daemon daemon;
    EXPECT_EQ(daemon.waitForExit(), 1);
    fs::rename(saved, "/etc/passwd");
    EXPECT_EQ(journal.take(), Lines{"3 platform unable to find the home directory of user mobile"});
}

TEST(StartUp, RaisesItsDescriptorLimitAndIgnoresBrokenPipes) {
    phone::Daemon daemon;
    ASSERT_EQ(phone::Client::checkIn().code, 0);
    std::ifstream file("/proc/" + std::to_string(daemon.pid()) + "/status");
    std::ostringstream status;
    status << file.rdbuf();
    EXPECT_NE(status.str().find("\nUmask:\t0022\n"), std::string::npos);
    EXPECT_NE(status.str().find("\nSigIgn:\t0000000000001000\n"), std::string::npos);
}

TEST(StartUp, LogsToStandardErrorWhereNoJournalListens) {
    fs::rename("/run/systemd/journal/socket", "/run/systemd/journal/away");
    const std::string command = phone::DaemonPath() + " 2>/run/stderr.txt";
    phone::Daemon first({.isActivated = false});
    EXPECT_EQ(WEXITSTATUS(std::system(command.c_str())), 1);
    fs::rename("/run/systemd/journal/away", "/run/systemd/journal/socket");
    std::ifstream file("/run/stderr.txt");
    std::ostringstream text;
    text << file.rdbuf();
    EXPECT_EQ(text.str(),
              "LinefoldMobileHelper: unable to create server objects - out of resources\n"
              "LinefoldMobileHelper: unable to startup LinefoldMobileHelper server\n");
}

}  // namespace
