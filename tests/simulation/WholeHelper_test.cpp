// Lives of the whole helper: heartbeats, location look-ups and database updates at once, behind
// clients that come and die, between services that are slow, wrong or away.
#include <gtest/gtest.h>
#include <malloc.h>

#include <array>
#include <string>

#include "heartbeat/HeartbeatMonitor.h"
#include "lasd/DatabaseTypes.h"
#include "location/LocationWaitFlag.h"
#include "platform/hvu/Gzip_test.h"
#include "platform/sim/SimEcho.h"
#include "platform/sim/SimFiles.h"
#include "platform/sim/SimHttp.h"
#include "platform/sim/SimLocation.h"
#include "platform/sim/SimMessagePort.h"
#include "tests/simulation/HelperWorld.h"
#include "tests/simulation/Seed.h"

using namespace platform;

namespace {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr std::uint64_t kRounds = 2'000;
#else
constexpr std::uint64_t kRounds = 100'000;
#endif

constexpr double kScriptEnd = 40.0;
constexpr double kLookUpTimeOut = 5.0;
constexpr int kChecksMax = 5;
constexpr std::array kVersions{"1.0", "1.1", "2.0"};
constexpr const char* kNotificationPort = "com.vendra.Linefold.lasd";
const std::string kServer = "https://configuration.vendra.example/";

/// What the whole of them saw, beside what every world sees.
struct WholeHappenings {
    int beats = 0;
    int leakedHolds = 0;
    int reports = 0;
    int zeroReports = 0;
    int shadowedLookUps = 0;
    int installations = 0;
    int notifications = 0;
    int failedCalls = 0;
};

HelperWorld::Happenings happened;
WholeHappenings seen;

std::string UrlOf(DatabaseType type, std::size_t version) {
    return kServer + kVersions.at(version) + "/" + DatabaseTypeName(type) + ".db.gz";
}

std::string ContentsOf(DatabaseType type, std::size_t version) {
    return std::string(DatabaseTypeName(type)) + " " + kVersions.at(version);
}

/// What the configuration server has, made once: the indexes and databases of all versions.
struct Shelf {
    std::array<std::string, kVersions.size()> indexes;
    std::array<std::array<std::string, kDatabaseTypes.size()>, kVersions.size()> databases;

    Shelf() {
        for (std::size_t version = 0; version < kVersions.size(); ++version) {
            PropertyList::Dictionary entries;
            for (std::size_t i = 0; i < kDatabaseTypes.size(); ++i) {
                const DatabaseType type = kDatabaseTypes.at(i);
                databases.at(version).at(i) = Gzip(ContentsOf(type, version));
                entries.emplace_back(DatabaseTypeName(type),
                                     PropertyList(PropertyList::Dictionary{
                                         {"Version", PropertyList(kVersions.at(version))},
                                         {"ContentURL", PropertyList(UrlOf(type, version))}}));
            }
            const auto index = PropertyListCreateXmlData(PropertyList(std::move(entries))).value();
            indexes.at(version).assign(reinterpret_cast<const char*>(index.data()), index.size());
        }
    }
};

const Shelf& TheShelf() {
    static const Shelf& shelf = *new Shelf;
    return shelf;
}

class WholeWorld final : public HelperWorld {
public:
    explicit WholeWorld(std::uint64_t seed)
        : HelperWorld(seed,
                      {.clientsMax = 4,
                       .scriptEnd = kScriptEnd,
                       .worldEnd = kScriptEnd + 300,
                       .pauseMax = 3.0,
                       .lifeMax = 12.0},
                      happened),
          isCalm_(Chance(50)),
          asksForNowhere_(Chance(15)) {
        forgetProcess();
        sim::MakeDirectory("/private/var/mobile/Library", 501);
        sim::OpenMessagePort(kNotificationPort);
        for (int i = 0; i < 3; ++i) {
            sim::At(i == 0 ? 0 : randomSeconds(kScriptEnd), [this] { changeServices(); });
        }
        if (!isCalm_) {
            sim::At(randomSeconds(kScriptEnd), [] { failSomething(); });
        }
    }

    ~WholeWorld() override {
        seen.beats += static_cast<int>(sim::SentEchoes().size());
        seen.notifications += static_cast<int>(sim::TakePortMessages(kNotificationPort).size());
        seen.failedCalls += sim::FailedCall().empty() ? 0 : 1;
        expectWholeDatabases();
        sim::Reset();
        forgetProcess();
    }

private:
    // What the services do.

    /// Seconds that something takes; in a calm world little enough to be told from a time-out.
    [[nodiscard]] double slowness(double most) const {
        return isCalm_ || Chance(50) ? 0.05 : randomSeconds(most);
    }

    void changeServices() {
        const double echoDelay = slowness(2.5);
        const bool isMute = !isCalm_ && Chance(20);
        sim::SetEchoGateway([echoDelay, isMute](const sim::SentEcho& request) {
            std::vector<sim::EchoAnswer> answers;
            if (!isMute) {
                answers.push_back({.delay = echoDelay, .datagram = sim::EchoReplyTo(request)});
            }
            return answers;
        });
        sim::SetInterface("pdp_ip0", Chance(80));
        answerLookUps();
        sim::SetTelephony({.isReachable = isCalm_ || Chance(90), .delay = telephonyDelay()});
        serveDatabases();
    }

    void answerLookUps() {
        const double delay = randomSeconds(8.0);
        sim::AnswerReverseGeocode(
            {.delay = delay,
             .items = sim::MapItemsOf({.countryCode = "DE", .locality = "Ulm"}),
             .error = Chance(20) ? std::optional(ORBError{"error"}) : std::nullopt,
             .isNever = Chance(20)});
        sim::AnswerIpLookup({.delay = randomSeconds(8.0),
                             .result = OrbIpLookupResult{.ipAddress = "192.0.2.7"},
                             .isNever = Chance(20)});
    }

    [[nodiscard]] double telephonyDelay() const { return isCalm_ ? 0 : slowness(2.5); }

    void serveDatabases() {
        const std::size_t version = sim::Random(kVersions.size());
        const double delay = slowness(3.0);
        sim::AttachToNetwork(Chance(85) ? sim::Network::kWifi : sim::Network::kCellular);
        sim::ServeUrl(kServer + "1/v3/lasd.plist",
                      {.body = TheShelf().indexes.at(version), .delay = delay});
        for (std::size_t i = 0; i < kDatabaseTypes.size(); ++i) {
            sim::ServeUrl(UrlOf(kDatabaseTypes.at(i), version),
                          {.status = Chance(90) ? 200 : 404,
                           .headers = {{"Content-Type", "application/x-gzip"}},
                           .body = TheShelf().databases.at(version).at(i),
                           .delay = delay});
        }
    }

    static void failSomething() {
        constexpr std::array kCalls{"CopyHostText",
                                    "ProtocolByName",
                                    "EchoSocket.open",
                                    "EchoSocket.setReceiveTimeout",
                                    "EchoSocket.send",
                                    "EchoSocket.receive",
                                    "GetTimeOfDay",
                                    "SerialQueue.repeat",
                                    "HttpRequest.create",
                                    "HttpRequest.start",
                                    "HVServerConnection.create",
                                    "HVServerConnection.setCivicInfo",
                                    "ORBMapService.ticketForReverseGeocodeCoordinate",
                                    "ORBMapService.ticketForOrbIpLookupForIpAddr"};
        sim::FailCall(kCalls.at(sim::Random(kCalls.size())),
                      static_cast<unsigned>(1 + sim::Random(3)));
    }

    // What the clients ask.

    static messages::Bytes heartbeat(bool isOn) {
        auto request = messages::Request(13);
        messages::Put(request, 32, std::int32_t{isOn ? 1 : 0});
        return request;
    }

    messages::Bytes checkForUpdate() {
        auto request = messages::Request(14);
        // With more checks than that at once the holds run out and are handed out twice.
        const bool isWanted = ++checks_ <= kChecksMax;
        messages::Put(request, 32, static_cast<std::int32_t>(isWanted ? sim::Random(64) : 0));
        return isWanted ? request : messages::Request(19);
    }

    messages::Bytes civicAddress() const {
        auto request = messages::Request(18);
        messages::Put(request, 32, asksForNowhere_ ? 0.0 : 48.4);
        return request;
    }

    Question nextQuestion() override {
        switch (sim::Random(8)) {
            case 0:
            case 1:
                return {heartbeat(true), KERN_SUCCESS};
            case 2:
            case 3:
                return {heartbeat(false), KERN_SUCCESS};
            case 4:
                return {checkForUpdate(), KERN_SUCCESS};
            case 5:
                return {civicAddress(), KERN_SUCCESS};
            case 6:
                return {asksForNowhere_ ? civicAddress() : messages::Request(20), KERN_SUCCESS};
            default:
                return {messages::Message(8683562, 35), MIG_BAD_ARGUMENTS};
        }
    }

    /// One more client switches the heartbeat off, so that the helper may leave.
    void scriptEnded() override {
        sim::In(1, [this] {
            last_.checkIn([this](kern_return_t code) {
                EXPECT_EQ(code, KERN_SUCCESS);
                EXPECT_TRUE(last_.client.privatePort.send(heartbeat(false)));
                sim::In(1, [this] {
                    last_.die();
                    end();
                });
            });
        });
    }

    // What must hold.

    void checkMore() override {
        readJournal();
        checkHolds();
        EXPECT_LE(sim::OpenEchoSockets(), 1U) << "one beat after the other";
        EXPECT_TRUE(!isLookUpWaited_ || sim::Now() < lookUpBegan_ + kLookUpTimeOut + patience())
            << "a look-up whose report is due";
    }

    /// A time-out that is in time, unless the queue waits for the telephony daemon.
    [[nodiscard]] double patience() const { return isCalm_ ? 0.01 : 120.0; }

    void readJournal() {
        const auto& journal = sim::Journal();
        for (; journalRead_ < journal.size(); ++journalRead_) {
            const std::string& entry = journal[journalRead_];
            if (entry == "SerialQueue.after location time-outs") {
                seen.shadowedLookUps += isLookUpWaited_ ? 1 : 0;
                isLookUpWaited_ = true;
                lookUpBegan_ = sim::Now();
            } else if (entry == "SerialQueue.async location time-outs") {
                ++nowhereReportsDue_;
            } else if (entry.starts_with("HVServerConnection.addIdentifierException")) {
                takeReport();
            }
        }
    }

    /// A report is due exactly while a look-up is waited for, whichever kind it is of, and once for
    /// each time that somebody asks for nowhere.
    void takeReport() {
        if (asksForNowhere_) {
            EXPECT_GT(nowhereReportsDue_, 0) << "a report that nobody asked for";
            --nowhereReportsDue_;
            ++seen.zeroReports;
        } else {
            EXPECT_TRUE(isLookUpWaited_) << "a second report, or one that nobody asked for";
            isLookUpWaited_ = false;
            ++seen.reports;
        }
    }

    /// The heartbeat holds while it beats. A start while it beats leaves the old hold for good.
    void checkHolds() {
        const std::uint32_t hold = TheHeartbeatMonitor().hold;
        if (hold != lastHold_ && hold != 0 && lastHold_ != 0) {
            leakedHolds_ |= lastHold_;
            ++seen.leakedHolds;
        }
        lastHold_ = hold;
        EXPECT_EQ(hold & ~server()->holdMask, 0U) << "the heartbeat's hold is not held";
        EXPECT_EQ(leakedHolds_ & ~server()->holdMask, 0U) << "somebody released another's hold";
    }

    /// At the end of the world nothing but those holds keeps the helper.
    [[nodiscard]] bool mayStay() const override {
        EXPECT_EQ(server()->holdMask, leakedHolds_);
        EXPECT_FALSE(isLookUpWaited_);
        EXPECT_EQ(nowhereReportsDue_, 0);
        return leakedHolds_ != 0;
    }

    void instanceEnded() override {
        EXPECT_EQ(sim::OpenEchoSockets(), 0U);
        EXPECT_EQ(sim::TelephonyConnections(), 0U);
        forgetProcess();
        journalRead_ = sim::Journal().size();
        isLookUpWaited_ = false;
        nowhereReportsDue_ = 0;
        leakedHolds_ = 0;
        lastHold_ = 0;
    }

    /// The next instance is another process.
    static void forgetProcess() {
        TheHeartbeatMonitor().timer = nullptr;
        TheHeartbeatMonitor().hold = 0;
        TheHeartbeatMonitor().server = nullptr;
        (void)LocationWaitFlagTake();
    }

    /// Old or new, and never half: what is recorded is installed, in one version or another.
    static void expectWholeDatabases() {
        const PropertyList recorded = sim::StoredPreferences("com.vendra.lasd");
        for (const DatabaseType type : kDatabaseTypes) {
            const std::string name = std::string(DatabaseTypeName(type));
            const auto file = sim::FileAt("/private/var/mobile/Library/LASD/" + name + ".db");
            if (!file) {
                EXPECT_EQ(recorded.find(name), nullptr) << name;
                continue;
            }
            ++seen.installations;
            bool isWhole = false;
            for (std::size_t version = 0; version < kVersions.size(); ++version) {
                isWhole = isWhole || file->contents == ContentsOf(type, version);
            }
            EXPECT_TRUE(isWhole) << name << ": " << file->contents;
        }
    }

    const bool isCalm_;
    const bool asksForNowhere_;
    PatientClient last_{999, kEntitledGroup};
    int checks_ = 0;
    std::size_t journalRead_ = 0;
    bool isLookUpWaited_ = false;
    double lookUpBegan_ = 0;
    int nowhereReportsDue_ = 0;
    std::uint32_t lastHold_ = 0;
    std::uint32_t leakedHolds_ = 0;
};

std::size_t AllocatedBytes() {
    return mallinfo2().uordblks;
}

TEST(WholeHelper, KeepsItsPromisesInRandomWorlds) {
    happened = {};
    seen = {};
    std::size_t early = 0;
    ForEachSeed(kRounds, [&](std::uint64_t seed) {
        WholeWorld(seed).live();
        early = seed == kRounds / 10 ? AllocatedBytes() : early;
    });
    if (SeedToReplay() != 0 || HasFailure()) {
        return;
    }
    constexpr int kRoundsMade = static_cast<int>(kRounds);
    EXPECT_LT(AllocatedBytes(), early + (std::size_t{1} << 20)) << "memory stays flat";
    EXPECT_GT(happened.instances, kRoundsMade);
    EXPECT_GT(happened.idleExits, kRoundsMade / 2);
    EXPECT_GT(happened.answers, kRoundsMade);
    EXPECT_GT(happened.deadOnArrival, 0);
    EXPECT_GT(seen.beats, kRoundsMade);
    EXPECT_GT(seen.leakedHolds, kRoundsMade / 10);
    EXPECT_GT(seen.reports, kRoundsMade / 3);
    EXPECT_GT(seen.zeroReports, kRoundsMade / 20);
    EXPECT_GT(seen.shadowedLookUps, kRoundsMade / 20);
    EXPECT_GT(seen.installations, kRoundsMade / 2);
    EXPECT_GT(seen.notifications, kRoundsMade / 2);
    EXPECT_GT(seen.failedCalls, kRoundsMade / 20);
    std::printf("%d instances, %d answers, %d beats, %d and %d reports, %d installed databases\n",
                happened.instances,
                happened.answers,
                seen.beats,
                seen.reports,
                seen.zeroReports,
                seen.installations);
}

}  // namespace
