#include "platform/HVServerConnection.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>

#include "platform/MachMessage.h"
#include "tests/location/PortServer.h"

using namespace platform;

namespace {

namespace fs = std::filesystem;

constexpr std::string_view kSuccess =
    "<plist version=\"1.0\"><dict><key>Domain</key><integer>0</integer>"
    "<key>Error</key><integer>0</integer></dict></plist>";

std::string KeysOf(const PropertyList& body) {
    std::string keys;
    for (const auto& [key, value] : *body.as<PropertyList::Dictionary>()) {
        const auto* const text = value.as<std::string>();
        keys += key + "=" + (text == nullptr ? "?" : *text) + ";";
    }
    return keys;
}

int Descriptors() {
    int count = 0;
    for ([[maybe_unused]] const auto& entry : fs::directory_iterator("/proc/self/fd")) {
        ++count;
    }
    return count;
}

class HVServerConnectionTest : public testing::Test {
protected:
    HVServerConnectionTest() {
        fs::create_directories("/run/linefold");
        fs::remove(port::kPath);
    }

    ~HVServerConnectionTest() override { fs::remove(port::kPath); }

    static void notified(HVServerConnection& /*connection*/,
                         const PropertyList& notification,
                         void* context) {
        static_cast<HVServerConnectionTest*>(context)->notifications_.push_back(notification);
    }

    [[nodiscard]] std::shared_ptr<HVServerConnection> connect() {
        _HVServerConnectionAddIdentifierException("LinefoldMobileHelper");
        return _HVServerConnectionCreate(notified, this);
    }

    /// The status of a report of an address to this server.
    HVError report(const port::PortServer::Script& script,
                   const std::string& address = "192.0.2.1") {
        const port::PortServer server(script);
        const auto connection = connect();
        return connection == nullptr
                   ? HVError{-1, -1}
                   : _HVServerConnectionSetLocalRoutableAddress(*connection, address);
    }

    /// The status when the report is answered by this.
    HVError answeredBy(std::string_view xml, std::int32_t id = 103) {
        return report([&](const port::PortConnection& connection) {
            (void)connection.receive();
            (void)connection.receive();
            connection.sendMessage(id, xml);
            connection.hang();
        });
    }

    std::vector<PropertyList> notifications_;
};

TEST_F(HVServerConnectionTest, IsNullWhenNobodyOwnsThePort) {
    EXPECT_EQ(connect(), nullptr);
    { const auto gone = port::Listen(1); }
    EXPECT_EQ(connect(), nullptr) << "its owner is gone";
}

TEST_F(HVServerConnectionTest, IsNullWhenNoSocketStandsThere) {
    std::ofstream(port::kPath).close();
    EXPECT_EQ(connect(), nullptr);
    fs::remove(port::kPath);
    ASSERT_EQ(mkfifo(port::kPath, 0600), 0);
    EXPECT_EQ(connect(), nullptr);
    fs::remove(port::kPath);
    const auto listening = port::Listen(1);
    fs::rename(port::kPath, "/run/linefold/elsewhere");
    fs::create_symlink("elsewhere", port::kPath);
    EXPECT_EQ(connect(), nullptr) << "a link to a socket is none of ours";
    fs::remove("/run/linefold/elsewhere");
}

TEST_F(HVServerConnectionTest, OpensAndHandsTheFourTextsOver) {
    port::Message opening;
    port::Message sent;
    HVError status;
    {
        const port::PortServer server([&](const port::PortConnection& connection) {
            opening = connection.receive();
            sent = connection.receive();
            connection.answer(sent.id + 100, 0, 0);
            connection.hang();
        });
        status = _HVServerConnectionSetCivicInfoBasedOnCurrentLocation(
            *connect(), "GB", "England", "London", "SW1A 0AA");
    }
    EXPECT_EQ(status, HVError());
    EXPECT_EQ(opening.id, 1);
    EXPECT_TRUE(opening.isSizeTrue);
    EXPECT_EQ(opening.body.find("IdentifierExceptions")->as<PropertyList::Array>()->at(0),
              PropertyList("LinefoldMobileHelper"));
    EXPECT_EQ(sent.id, 2);
    EXPECT_TRUE(sent.isSizeTrue);
    EXPECT_EQ(KeysOf(sent.body), "CountryCode=GB;State=England;City=London;PostalCode=SW1A 0AA;");
}

TEST_F(HVServerConnectionTest, TellsAbsentTextsFromEmptyOnes) {
    port::Message sent;
    {
        const port::PortServer server([&](const port::PortConnection& connection) {
            (void)connection.receive();
            sent = connection.receive();
            connection.answer(102, 0, 0);
            connection.hang();
        });
        EXPECT_EQ(_HVServerConnectionSetCivicInfoBasedOnCurrentLocation(
                      *connect(), "GB", "", std::nullopt, ""),
                  HVError());
    }
    EXPECT_EQ(KeysOf(sent.body), "CountryCode=GB;State=;PostalCode=;");
}

TEST_F(HVServerConnectionTest, ListsAnExceptionOnce) {
    _HVServerConnectionAddIdentifierException("LinefoldMobileHelper");
    _HVServerConnectionAddIdentifierException("LinefoldMobileHelper");
    port::Message opening;
    EXPECT_EQ(report([&](const port::PortConnection& connection) {
                  opening = connection.receive();
                  (void)connection.receive();
                  connection.answer(103, 0, 0);
                  connection.hang();
              }),
              HVError());
    EXPECT_EQ(opening.body.find("IdentifierExceptions")->as<PropertyList::Array>()->size(), 1U);
}

TEST_F(HVServerConnectionTest, OpensOnceForTwoCalls) {
    std::vector<std::int32_t> ids;
    {
        const port::PortServer server([&](const port::PortConnection& connection) {
            for (auto message = connection.receive(); message.id != 0;
                 message = connection.receive()) {
                ids.push_back(message.id);
                connection.answer(message.id + 100, 0, 0);
            }
        });
        const auto connection = connect();
        EXPECT_EQ(_HVServerConnectionSetLocalRoutableAddress(*connection, ""), HVError());
        EXPECT_EQ(_HVServerConnectionSetLocalRoutableAddress(*connection, std::nullopt), HVError());
    }
    EXPECT_EQ(ids, (std::vector<std::int32_t>{1, 3, 3}));
}

TEST_F(HVServerConnectionTest, GivesTheDaemonsErrorAsItIs) {
    EXPECT_EQ(report([](const port::PortConnection& connection) {
                  (void)connection.receive();
                  (void)connection.receive();
                  connection.answer(103, -2147483648LL, 2147483647);
                  connection.hang();
              }),
              (HVError{-2147483647 - 1, 2147483647}));
}

TEST_F(HVServerConnectionTest, TakesABinaryAnswer) {
    const auto answer = PropertyListCreateBinaryData(
        PropertyList(PropertyList::Dictionary{{"Error", PropertyList(std::int64_t{7})},
                                              {"Domain", PropertyList(std::int64_t{3})},
                                              {"More", PropertyList("later")}}));
    EXPECT_EQ(report([&](const port::PortConnection& connection) {
                  (void)connection.receive();
                  (void)connection.receive();
                  connection.sendBytes(port::MessageBytes(103, *answer));
                  connection.hang();
              }),
              (HVError{3, 7}));
}

TEST_F(HVServerConnectionTest, PassesNotificationsOnAndWaitsForTheAnswer) {
    EXPECT_EQ(report([](const port::PortConnection& connection) {
                  connection.sendMessage(200, "<plist><string>early</string></plist>");
                  (void)connection.receive();
                  (void)connection.receive();
                  connection.sendMessage(999, kSuccess);
                  connection.sendMessage(200, "no property list");
                  connection.sendMessage(102, kSuccess);
                  connection.sendMessage(200, "<plist><string>late</string></plist>");
                  connection.answer(103, 0, 5);
                  connection.hang();
              }),
              (HVError{0, 5}));
    EXPECT_EQ(notifications_,
              (std::vector<PropertyList>{PropertyList("early"), PropertyList("late")}));
}

TEST_F(HVServerConnectionTest, RefusesAnAnswerThatIsNone) {
    const HVError bad{kHVErrorDomainPOSIX, EBADMSG};
    const std::string start = "<plist version=\"1.0\"><dict><key>Domain</key><integer>0</integer>";
    EXPECT_EQ(answeredBy("no property list"), bad);
    EXPECT_EQ(answeredBy(""), bad);
    EXPECT_EQ(answeredBy("<plist><array/></plist>"), bad);
    EXPECT_EQ(answeredBy(start + "</dict></plist>"), bad);
    EXPECT_EQ(answeredBy(start + "<key>Error</key><string>0</string></dict></plist>"), bad);
    EXPECT_EQ(answeredBy(start + "<key>Error</key><integer>2147483648</integer></dict></plist>"),
              bad);
    EXPECT_EQ(answeredBy("<plist><dict><key>Error</key><integer>0</integer></dict></plist>"), bad);
}

TEST_F(HVServerConnectionTest, RefusesADatagramWithAWrongHeader) {
    const HVError bad{kHVErrorDomainPOSIX, EBADMSG};
    const auto sends = [this](std::vector<std::byte> datagram) {
        return report([&](const port::PortConnection& connection) {
            (void)connection.receive();
            (void)connection.receive();
            connection.sendBytes(datagram);
            connection.hang();
        });
    };
    auto lying = port::MessageBytes(103, std::as_bytes(std::span(kSuccess)));
    lying[4] ^= std::byte{1};
    EXPECT_EQ(sends(lying), bad);
    EXPECT_EQ(sends(std::vector<std::byte>(23)), bad);
    EXPECT_EQ(sends(port::MessageBytes(103, std::vector<std::byte>(100 << 10))), bad)
        << "larger than any answer";
}

TEST_F(HVServerConnectionTest, IsAnErrorWhenTheDaemonGoes) {
    const HVError reset{kHVErrorDomainPOSIX, ECONNRESET};
    EXPECT_EQ(report([](const port::PortConnection& connection) {
                  (void)connection.receive();
                  (void)connection.receive();
              }),
              reset);
    EXPECT_EQ(report([](const port::PortConnection& /*connection*/) {}), reset);
}

TEST_F(HVServerConnectionTest, RefusesTextsThatCannotTravel) {
    EXPECT_EQ(report([](const port::PortConnection& connection) { connection.hang(); }, "a\x01"),
              (HVError{kHVErrorDomainPOSIX, EINVAL}));
}

TEST_F(HVServerConnectionTest, KeepsNoDescriptorAlsoNotOneThatWasSent) {
    const int before = Descriptors();
    for (int i = 0; i < 5; ++i) {
        EXPECT_EQ(report([](const port::PortConnection& connection) {
                      (void)connection.receive();
                      (void)connection.receive();
                      const auto answer =
                          port::MessageBytes(103, std::as_bytes(std::span(kSuccess)));
                      connection.sendBytes(answer, 0);
                      connection.hang();
                  }),
                  HVError());
    }
    EXPECT_EQ(Descriptors(), before);
}

TEST_F(HVServerConnectionTest, IsATimeOutWhenTheDaemonTalksAndNeverAnswers) {
    EXPECT_EQ(report([](const port::PortConnection& connection) {
                  while (connection.sendMessage(200, "<plist><string>still</string></plist>")) {
                  }
              }),
              (HVError{kHVErrorDomainPOSIX, ETIMEDOUT}));
    EXPECT_EQ(notifications_.size(), 64U) << "no more of them are listened to";
}

TEST_F(HVServerConnectionTest, IsATimeOutWhenTheDaemonTakesNoConnection) {
    const auto listening = port::Listen(0);
    const auto first = connect();
    ASSERT_NE(first, nullptr) << "waits in the only place there is";
    const auto second = connect();
    ASSERT_NE(second, nullptr) << "a daemon that is busy is there";
    EXPECT_EQ(_HVServerConnectionSetLocalRoutableAddress(*second, ""),
              (HVError{kHVErrorDomainPOSIX, ETIMEDOUT}));
    EXPECT_EQ(_HVServerConnectionSetLocalRoutableAddress(*first, ""),
              (HVError{kHVErrorDomainPOSIX, ETIMEDOUT}));
}

}  // namespace
