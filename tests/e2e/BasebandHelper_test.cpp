// The co-hosted baseband helper server, as a module of our own in the phone's library folder.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

constexpr const char* kModule = "/usr/lib/linefold/libBasebandHelperServer.so";

class BasebandHelper : public testing::Test {
protected:
    BasebandHelper() {
        fs::remove_all("/run/baseband");
        fs::create_directories("/run/baseband");
        fs::copy_file(phone::ProgramPath("libBasebandHelperServer.so"),
                      kModule,
                      fs::copy_options::overwrite_existing);
        fs::permissions(kModule, fs::perms(0644));
    }

    ~BasebandHelper() override { fs::remove(kModule); }

    static void tell(const char* what) { std::ofstream(std::string("/run/baseband/") + what); }

    static std::string journal() {
        std::ifstream file("/run/baseband/journal");
        std::ostringstream text;
        text << file.rdbuf();
        return text.str();
    }

    static phone::Daemon::Options brisk() {
        return {.program = phone::ProgramPath("LinefoldMobileHelper-brisk")};
    }

    phone::LogReader log_ = phone::LogReader::journal();
};

TEST_F(BasebandHelper, IsStartedBeforeAndStoppedAfterTheServer) {
    phone::Daemon daemon;
    ASSERT_EQ(phone::Client::checkIn().code, 0);
    EXPECT_EQ(journal(), "create without log server\nstart\n");
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.waitForExit(), 0);
    EXPECT_EQ(journal(), "create without log server\nstart\nstop\nrelease\n");
}

TEST_F(BasebandHelper, PostponesTheExitWhileItIsBusy) {
    tell("busy");
    phone::Daemon daemon(brisk());
    phone::Client::checkIn().die();
    const std::string twice = "busy\nbusy\n";
    ASSERT_TRUE(phone::Eventually([&] { return journal().find(twice) != std::string::npos; }));
    EXPECT_TRUE(daemon.isRunning());
    fs::remove("/run/baseband/busy");
    EXPECT_EQ(daemon.waitForExit(), 0);
    EXPECT_TRUE(journal().ends_with("busy\nnot busy\nstop\nrelease\n"));
}

TEST_F(BasebandHelper, IsNotCreatedWhereTheProcessMayNotHostIt) {
    tell("refuse");
    phone::Daemon daemon(brisk());
    phone::Client::checkIn().die();
    EXPECT_EQ(daemon.waitForExit(), 0);
    EXPECT_EQ(journal(), "");
}

TEST_F(BasebandHelper, MayDecline) {
    tell("decline");
    phone::Daemon daemon(brisk());
    phone::Client::checkIn().die();
    EXPECT_EQ(daemon.waitForExit(), 0);
    EXPECT_EQ(journal(), "create without log server\n");
}

TEST_F(BasebandHelper, IsStoppedWhenTheServerCannotBeCreated) {
    phone::Daemon first({.isActivated = false});
    phone::Daemon second({.isActivated = false});
    EXPECT_EQ(second.waitForExit(), 1);
    EXPECT_TRUE(journal().ends_with("stop\nrelease\n"));
}

TEST_F(BasebandHelper, IsNotLoadedFromAFileThatOthersCanWrite) {
    fs::permissions(kModule, fs::perms(0666));
    phone::Daemon daemon;
    ASSERT_EQ(phone::Client::checkIn().code, 0);
    EXPECT_EQ(journal(), "");
    EXPECT_EQ(
        log_.take(),
        std::vector<std::string>{"3 platform not loading /usr/lib/linefold/"
                                 "libBasebandHelperServer.so: file and folder must be root's own"});
}

}  // namespace
