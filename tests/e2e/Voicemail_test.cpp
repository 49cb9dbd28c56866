// Routines 0 to 5 and 12 through the real daemon, on the real store, with both logs read back.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <thread>

#include "tests/support/VoicemailCalls.h"

namespace fs = std::filesystem;

namespace {

using Lines = std::vector<std::string>;

constexpr const char* kFolder = "/private/var/db/linefold";
constexpr const char* kFile = "/private/var/db/linefold/voicemail.plist";
constexpr const char* kLibrary = "/usr/lib/linefold/libVisualVoicemail.so";
constexpr std::string_view kNotUtf8 = "\xC3(";

std::string Read(const char* path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

class Voicemail : public testing::Test {
protected:
    Voicemail() {
        fs::remove_all(kFolder);
        fs::remove_all("/run/voicemail");
        fs::create_directories("/run/voicemail");
    }

    ~Voicemail() override { fs::remove(kLibrary); }

    static void installLibrary(fs::perms mode = fs::perms(0644)) {
        fs::copy_file(phone::ProgramPath("libVisualVoicemail.so"),
                      kLibrary,
                      fs::copy_options::overwrite_existing);
        fs::permissions(kLibrary, mode);
    }

    static void subscribe() { std::ofstream("/run/voicemail/subscribed"); }

    /// The out value of routine 12; -1 when the reply is anything but a success.
    static std::int32_t isSubscribed(const phone::Client& client) {
        const auto reply = client.privatePort.call(phone::Message(8683561, 24));
        return reply.bytes.size() == 40 && reply.code() == 0
                   ? platform::Load<std::int32_t>(reply.bytes, 36)
                   : -1;
    }

    phone::Daemon daemon_;
    phone::Client client_ = phone::Client::checkIn();
    phone::LogReader journal_ = phone::LogReader::journal();
    phone::LogReader systemLog_ = phone::LogReader::systemLog();
};

TEST_F(Voicemail, TokensComeBackAndLeaveNoTraceInTheLogs) {
    for (const std::string& token : {std::string("secret"),
                                     std::string("\x01\x1F <&> \xF0\x9F\x93\xB1"),
                                     std::string(255, 'x')}) {
        EXPECT_EQ(phone::SetToken(client_, token), 0);
        EXPECT_EQ(phone::SetTokenForKey(client_, token, token), 0);
        const auto copied = phone::CopyToken(client_);
        EXPECT_TRUE(copied.isWellFormed);
        EXPECT_EQ(copied.token, token);
        EXPECT_EQ(phone::CopyTokenForKey(client_, token).token, token);
    }
    EXPECT_EQ(journal_.take(), Lines{});
    EXPECT_EQ(systemLog_.take(), Lines{});
}

TEST_F(Voicemail, TokensOutliveTheDaemon) {
    EXPECT_EQ(phone::SetToken(client_, "main"), 0);
    EXPECT_EQ(phone::SetTokenForKey(client_, "key", "other"), 0);
    daemon_.signal(SIGKILL);
    daemon_.startAgain();
    const auto client = phone::Client::checkIn();
    EXPECT_EQ(phone::CopyToken(client).token, "main");
    EXPECT_EQ(phone::CopyTokenForKey(client, "key").token, "other");
}

TEST_F(Voicemail, TokensThatAreAbsentAreTheEmptyString) {
    const auto main = phone::CopyToken(client_);
    const auto other = phone::CopyTokenForKey(client_, "absent");
    EXPECT_TRUE(main.isWellFormed && other.isWellFormed);
    EXPECT_EQ(main.code, 0);
    EXPECT_EQ(other.code, 0);
    EXPECT_EQ(main.token + other.token, "");
    EXPECT_FALSE(fs::exists(kFolder)) << "asking makes nothing";
}

TEST_F(Voicemail, TokensOfTheWholeFieldAreKeptAndReadAsTheEmptyString) {
    const std::string token(256, 'y');
    EXPECT_EQ(phone::SetToken(client_, token), 0);
    EXPECT_NE(Read(kFile).find(token), std::string::npos);
    const auto copied = phone::CopyToken(client_);
    EXPECT_TRUE(copied.isWellFormed);
    EXPECT_EQ(copied.code, 0);
    EXPECT_EQ(copied.token, "");
}

TEST_F(Voicemail, TokensThatAreNotUtf8AreRefused) {
    EXPECT_EQ(phone::SetToken(client_, "main"), 0);
    EXPECT_EQ(phone::SetToken(client_, kNotUtf8), 5);
    EXPECT_EQ(phone::SetTokenForKey(client_, kNotUtf8, "token"), 5);
    EXPECT_EQ(phone::SetTokenForKey(client_, "key", kNotUtf8), 5);
    const auto copied = phone::CopyTokenForKey(client_, kNotUtf8);
    EXPECT_EQ(copied.code, 5);
    EXPECT_TRUE(copied.isWellFormed);
    EXPECT_EQ(phone::CopyToken(client_).token, "main");
}

TEST_F(Voicemail, TokensAreClearedAndWiped) {
    EXPECT_EQ(phone::SetToken(client_, "main"), 0);
    EXPECT_EQ(phone::SetTokenForKey(client_, "key", "other"), 0);
    EXPECT_EQ(phone::ClearToken(client_), 0);
    EXPECT_EQ(phone::CopyToken(client_).token, "");
    EXPECT_EQ(phone::CopyTokenForKey(client_, "key").token, "other");
    EXPECT_EQ(phone::SetToken(client_, "main"), 0);
    EXPECT_EQ(phone::RemoveAllRecords(client_), 0);
    EXPECT_EQ(phone::CopyToken(client_).token, "");
    EXPECT_EQ(phone::CopyTokenForKey(client_, "key").token, "");
    EXPECT_EQ(Read(kFile).find("main"), std::string::npos);
    EXPECT_EQ(Read(kFile).find("other"), std::string::npos);
}

TEST_F(Voicemail, FailuresOfTheStoreAreLoggedWithoutTokens) {
    EXPECT_EQ(phone::SetToken(client_, "old"), 0);
    ASSERT_EQ(chmod(kFolder, 0777), 0);
    EXPECT_EQ(phone::SetToken(client_, "secret"), 0);
    EXPECT_EQ(phone::SetTokenForKey(client_, "hidden", "secret"), 0);
    EXPECT_EQ(phone::RemoveAllRecords(client_), 0);
    const std::string line =
        "3 platform voicemail: /private/var/db/linefold must be a folder of root's own, so nothing "
        "in it is used";
    EXPECT_EQ(journal_.take(), Lines(4, line));
    ASSERT_EQ(chmod(kFolder, 0700), 0);
    EXPECT_EQ(phone::CopyToken(client_).token, "old");
    EXPECT_EQ(systemLog_.take(), Lines{});
}

TEST_F(Voicemail, StoresOfAllKindsNeitherCrashNorBlockTheDaemon) {
    fs::create_directory(kFolder);
    fs::permissions(kFolder, fs::perms(0700));
    ASSERT_EQ(mkfifo(kFile, 0600), 0);
    EXPECT_EQ(phone::SetToken(client_, "token"), 0);
    EXPECT_EQ(phone::CopyToken(client_).token, "");
    fs::remove(kFile);
    std::ofstream(kFile) << "<plist><dict><key>Records</key><array><dict><key>Key";
    EXPECT_EQ(phone::CopyTokenForKey(client_, "key").token, "");
    EXPECT_EQ(phone::SetToken(client_, "token"), 0);
    EXPECT_EQ(phone::CopyToken(client_).token, "token");
    EXPECT_EQ(journal_.take().size(), 4U);
    EXPECT_TRUE(daemon_.isRunning());
}

TEST_F(Voicemail, TokensOfManyClientsAreAllKept) {
    std::atomic<int> failures = 0;
    {
        std::vector<std::jthread> threads;
        for (int thread = 0; thread < 4; ++thread) {
            threads.emplace_back([thread, &failures] {
                const auto client = phone::Client::checkIn();
                for (int i = 0; i < 10; ++i) {
                    const std::string name = std::to_string(thread * 10 + i);
                    failures += phone::SetTokenForKey(client, name, name) == 0 ? 0 : 1;
                }
            });
        }
    }
    EXPECT_EQ(failures, 0);
    for (int i = 0; i < 40; ++i) {
        EXPECT_EQ(phone::CopyTokenForKey(client_, std::to_string(i)).token, std::to_string(i));
    }
}

TEST_F(Voicemail, IsSubscribedWhenTheLibrarySaysSo) {
    installLibrary();
    EXPECT_FALSE(fs::exists("/run/voicemail/journal")) << "nobody has asked yet";
    EXPECT_EQ(isSubscribed(client_), 0);
    subscribe();
    EXPECT_EQ(isSubscribed(client_), 1);
    EXPECT_EQ(isSubscribed(phone::Client::checkIn()), 1);
    EXPECT_EQ(Read("/run/voicemail/journal"), "loaded\nasked\nasked\nasked\n");
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(Voicemail, IsNotSubscribedForGoodWithoutTheLibrary) {
    EXPECT_EQ(isSubscribed(client_), 0);
    installLibrary();
    subscribe();
    EXPECT_EQ(isSubscribed(client_), 0);
    EXPECT_FALSE(fs::exists("/run/voicemail/journal"));
    EXPECT_EQ(journal_.take(), Lines{});
    daemon_.signal(SIGTERM);
    daemon_.startAgain();
    EXPECT_EQ(isSubscribed(phone::Client::checkIn()), 1) << "the next daemon looks again";
}

TEST_F(Voicemail, IsNotSubscribedByALibraryWithoutTheFunction) {
    fs::copy_file(phone::ProgramPath("libBasebandHelperServer.so"), kLibrary);
    fs::permissions(kLibrary, fs::perms(0644));
    EXPECT_EQ(isSubscribed(client_), 0);
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(Voicemail, IsNotSubscribedByALibraryThatOthersCanWrite) {
    installLibrary(fs::perms(0666));
    subscribe();
    EXPECT_EQ(isSubscribed(client_), 0);
    EXPECT_EQ(isSubscribed(client_), 0);
    EXPECT_FALSE(fs::exists("/run/voicemail/journal"));
    EXPECT_EQ(journal_.take(),
              Lines{"3 platform not loading /usr/lib/linefold/libVisualVoicemail.so: file and "
                    "folder must be root's own"});
}

}  // namespace
