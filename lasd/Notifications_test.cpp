#include "lasd/Notifications.h"

#include "lasd/Updater_test.h"

using namespace updater_test;

namespace {

std::string Hex(const std::vector<std::byte>& bytes) {
    static constexpr char kDigits[] = "0123456789abcdef";
    std::string text;
    for (const std::byte byte : bytes) {
        text += kDigits[std::to_integer<unsigned>(byte) >> 4];
        text += kDigits[std::to_integer<unsigned>(byte) & 15];
    }
    return text;
}

class Notifications : public testing::Test {
protected:
    Notifications() { sim::Reset(); }
};

TEST_F(Notifications, NameTheOutcome) {
    const auto nameOf = [](NotificationKind kind) {
        return MakeNotification(kind, DatabaseType{});
    };
    EXPECT_EQ(nameOf(NotificationKind::kNoUpdateRequired),
              PropertyList(
                  Dictionary{{"Notification", PropertyList("com.vendra.lasd.NoUpdateRequired")}}));
    EXPECT_EQ(
        nameOf(NotificationKind::kUpdateFailed),
        PropertyList(Dictionary{{"Notification", PropertyList("com.vendra.lasd.UpdateFailed")}}));
}

TEST_F(Notifications, NameTheTypeOfAnUpdateThatIsOneOfTheFive) {
    for (const DatabaseType type : kDatabaseTypes) {
        EXPECT_EQ(MakeNotification(NotificationKind::kUpdateAvailable, type),
                  PropertyList(
                      Dictionary{{"Notification", PropertyList("com.vendra.lasd.UpdateAvailable")},
                                 {"DBType", PropertyList(DatabaseTypeName(type))}}));
    }
    EXPECT_EQ(MakeNotification(NotificationKind::kUpdateAvailable, DatabaseType{32}).find("DBType"),
              nullptr);
}

TEST_F(Notifications, NameNoTypeOfAFailure) {
    for (const DatabaseType type : kDatabaseTypes) {
        EXPECT_EQ(MakeNotification(NotificationKind::kUpdateFailed, type),
                  MakeNotification(NotificationKind::kUpdateFailed, DatabaseType{}));
    }
}

TEST_F(Notifications, ArriveAsBinaryPropertyListsWithMessageIdZero) {
    sim::OpenMessagePort(kPort);
    SendNotification(MakeNotification(NotificationKind::kUpdateAvailable, DatabaseType::kGsm));
    const auto messages = sim::TakePortMessages(kPort);
    ASSERT_EQ(messages.size(), 1U);
    EXPECT_EQ(messages[0].id, 0);
    EXPECT_EQ(Hex(messages[0].data),
              "62706c6973743030"            // bplist00
              "d201020304"                  // a dictionary of two
              "5c4e6f74696669636174696f6e"  // Notification
              "56444254797065"              // DBType
              "5f101f636f6d2e76656e6472612e6c6173642e557064617465417661696c61626c65"
              "5367736d"    // gsm
              "080d1a2143"  // where they begin
              "000000000000010100000000000000050000000000000000"
              "0000000000000047");
}

TEST_F(Notifications, AreLostWithoutAPort) {
    SendNotification(MakeNotification(NotificationKind::kUpdateFailed, DatabaseType::kGsm));
    EXPECT_TRUE(sim::UnifiedLog().empty());
    EXPECT_EQ(sim::JournalCount("MessagePortSendRequest com.vendra.Linefold.lasd"), 1U);
}

TEST_F(Notifications, AreLostAtAPortThatIsFull) {
    sim::OpenMessagePort(kPort, 1);
    SendNotification(MakeNotification(NotificationKind::kNoUpdateRequired, DatabaseType{}));
    SendNotification(MakeNotification(NotificationKind::kUpdateFailed, DatabaseType{}));
    EXPECT_EQ(Heard(), Words{"NoUpdateRequired"});
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

}  // namespace
