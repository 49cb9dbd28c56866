#include "lasd/LASDUpdater.h"

#include "Helper/Shared/Server/MessageLayouts.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "lasd/Updater_test.h"

using namespace updater_test;

namespace {

using Lines = std::vector<sim::LogLine>;

constexpr std::uint32_t kGsm = 8;
constexpr std::uint32_t kLte = 4;
constexpr std::uint32_t kAllTypes = 31;

class Updater : public testing::Test {
protected:
    Updater() {
        sim::Reset();
        sim::OpenMessagePort(kPort);
        server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
    }

    ~Updater() override {
        updater = nullptr;
        sim::Settle();  // it ends on its queue
        EXPECT_EQ(server->holdMask, 0U) << "every hold was released";
        MobileHelperServerDestroy(server);
    }

    /// A whole check, from the request to its end.
    void check(std::uint32_t mask) {
        updater->checkForUpdate(server, mask);
        sim::Settle();
    }

    /// What a check logs up to the comparison of versions.
    static Lines beginning(const char* mask, std::size_t indexSize) {
        return {Info(std::string("Trying to see if update available for mask ") + mask),
                Info("Reading local resource com.vendra.lasd"),
                Info("Fetching URL " + kIndexUrl),
                Info("URL retrieved " + kIndexUrl + ", size: " + std::to_string(indexSize) + " ")};
    }

    static void append(Lines& lines, const Lines& more) {
        lines.insert(lines.end(), more.begin(), more.end());
    }

    /// What the update of a type logs whose database was never there.
    static Lines update(const std::string& type, const std::string& version) {
        const std::string url = kServer + type + ".db.gz";
        const std::string file = kFolder + "/" + type + ".db";
        const auto size = std::to_string(Gzip(type + " " + version).size());
        return {
            Info("Fetching URL " + url),
            Info("URL retrieved " + url + ", size: " + size + " "),
            Info("uncompressing to " + file + ".tmp"),
            Info("Moving " + file + ".tmp to " + file),
            Info("Downloaded " + type + " database version " + version + " successfully"),
        };
    }

    /// The same of a type that is there, with a failure in the middle of it.
    void expectFailure(const std::string& lastLine) {
        check(kGsm);
        EXPECT_EQ(Heard(), Words{"UpdateFailed"});
        EXPECT_EQ(sim::UnifiedLog().back(), Error(lastLine));
        EXPECT_EQ(Recorded(), PropertyList());
    }

    MobileHelperServer* server = nullptr;
    std::shared_ptr<LASDUpdater> updater = LASDUpdater::create();
};

TEST_F(Updater, InstallsWhatIsNewerWithGsmFirst) {
    const auto index = ServeIndex({Offer("umts", "1.5"), Offer("gsm", "2.0")});
    check(9);
    Lines expected = beginning("9", index.size());
    const std::string none = "We have don't have a previously downloaded ";
    append(expected,
           {Info(none + "umts database, server has 1.5, update required"),
            Info(none + "gsm database, server has 2.0, update required")});
    append(expected, update("gsm", "2.0"));
    append(expected, update("umts", "1.5"));
    EXPECT_EQ(sim::UnifiedLog(), expected);
    EXPECT_EQ(Heard(), (Words{"UpdateAvailable gsm", "UpdateAvailable umts"}));
    EXPECT_EQ(FileContents(kFolder + "/gsm.db"), "gsm 2.0");
    EXPECT_EQ(FileContents(kFolder + "/umts.db"), "umts 1.5");
}

TEST_F(Updater, InstallsAllFiveInTheirOrder) {
    ServeIndex({Offer("scdma", "1"),
                Offer("lte", "1"),
                Offer("cdma", "1"),
                Offer("umts", "1"),
                Offer("gsm", "1")});
    check(0xFFFFFFFF);
    EXPECT_EQ(Heard(),
              (Words{"UpdateAvailable gsm",
                     "UpdateAvailable umts",
                     "UpdateAvailable cdma",
                     "UpdateAvailable lte",
                     "UpdateAvailable scdma"}));
}

TEST_F(Updater, RecordsTheWholeEntryOfTheServer) {
    auto offer = Offer("gsm", "2.0");
    offer.second =
        PropertyList(Dictionary{{"Size", PropertyList(std::int64_t{7})},
                                {"ContentURL", *offer.second.find("ContentURL")},
                                {"Mirrors", PropertyList(PropertyList::Array{PropertyList("a")})},
                                {"Version", PropertyList("2.0")}});
    ServeIndex({offer});
    Record({{"lte", Entry("1", "x")}, {"gsm", Entry("1", "y")}});
    check(kAllTypes);
    EXPECT_EQ(*Recorded().find("gsm"), offer.second);
    EXPECT_EQ(*Recorded().find("lte"), Entry("1", "x"));
}

TEST_F(Updater, RequiresNothingTheSecondTime) {
    const auto index = ServeIndex({Offer("gsm", "2.0")});
    check(kGsm);
    (void)Heard();
    sim::ClearLogs();
    check(kGsm);
    Lines expected = beginning("8", index.size());
    append(expected,
           {Info("gsm version 2.0 matches server version"),
            Error("No update required for any databases")});
    EXPECT_EQ(sim::UnifiedLog(), expected);
    EXPECT_EQ(Heard(), Words{"NoUpdateRequired"});
    EXPECT_EQ(sim::HttpRequests().size(), 3U);
}

TEST_F(Updater, InstallsAnEarlierVersionToo) {
    ServeIndex({Offer("gsm", "1.9")});
    Record({{"gsm", Entry("1.10", "x")}});
    check(kGsm);
    EXPECT_EQ(sim::UnifiedLog().at(4),
              Info("We have gsm version 1.10, server has 1.9, update required"));
    EXPECT_EQ(Heard(), Words{"UpdateAvailable gsm"});
}

TEST_F(Updater, GoesByTheRecordAndNotByTheFile) {
    ServeIndex({Offer("gsm", "2")});
    Record({{"gsm", Entry("2", "x")}});
    check(kGsm);
    EXPECT_EQ(Heard(), Words{"NoUpdateRequired"});
    EXPECT_FALSE(sim::FileAt(kFolder));
}

TEST_F(Updater, FetchesTheIndexForAMaskWithoutKnownBits) {
    const auto index = ServeIndex({Offer("gsm", "2")});
    check(0xFFFFFFE0);
    Lines expected = beginning("ffffffe0", index.size());
    append(expected, {Error("No update required for any databases")});
    EXPECT_EQ(sim::UnifiedLog(), expected);
    EXPECT_EQ(Heard(), Words{"NoUpdateRequired"});
    EXPECT_EQ(sim::JournalCount("PreferencesCopyValue"), 0U);
    check(0);
    EXPECT_EQ(Heard(), Words{"NoUpdateRequired"});
}

TEST_F(Updater, UpdatesNoTypeThatTheIndexLacks) {
    const auto index = ServeIndex({Offer("gsm", "2")});
    check(kLte);
    Lines expected = beginning("4", index.size());
    append(expected,
           {Info("lte db is not present locally, update required"),
            Error("No update required for any databases")});
    EXPECT_EQ(sim::UnifiedLog(), expected);
    EXPECT_EQ(Heard(), Words{"NoUpdateRequired"});
}

TEST_F(Updater, SaysNothingOfATypeThatTheIndexLacksBesideOneThatIsUpdated) {
    ServeIndex({Offer("gsm", "2")});
    check(kLte | kGsm);
    EXPECT_EQ(Heard(), Words{"UpdateAvailable gsm"});
}

TEST_F(Updater, LeavesOutWhatOnlyEarlierChecksAskedFor) {
    ServeIndex({{"gsm", Entry("2", kServer + "missing.gz")}});
    check(kGsm);
    EXPECT_EQ(Heard(), Words{"UpdateFailed"});
    ServeIndex({Offer("gsm", "2"), Offer("lte", "2")});
    check(kLte);
    EXPECT_EQ(Heard(), Words{"UpdateAvailable lte"});
    EXPECT_EQ(Recorded().find("gsm"), nullptr);
}

TEST_F(Updater, TriesATypeAgainThatFailed) {
    ServeIndex({{"gsm", Entry("2", kServer + "missing.gz")}});
    check(kGsm);
    ServeIndex({Offer("gsm", "2")});
    check(kGsm);
    EXPECT_EQ(Heard(), (Words{"UpdateFailed", "UpdateAvailable gsm"}));
}

TEST_F(Updater, UsesWiFiOnly) {
    ServeIndex({Offer("gsm", "2")});
    check(kGsm);
    ASSERT_EQ(sim::HttpRequests().size(), 2U);
    for (const auto& request : sim::HttpRequests()) {
        EXPECT_EQ(request.cellularUse, hvu::Http::CellularUse::kForbidden);
        EXPECT_EQ(request.queue, "com.vendra.httpdownloadqueue");
    }
}

// Failures.

TEST_F(Updater, TellsThatTheIndexCannotBeFetched) {
    check(kGsm);
    const Lines expected{Info("Trying to see if update available for mask 8"),
                         Info("Reading local resource com.vendra.lasd"),
                         Info("Fetching URL " + kIndexUrl),
                         Error("HTTP request failed for URL " + kIndexUrl +
                               " with error cannot connect errorcode 0 (no status)"),
                         Error("Could not fetch data from source " + kIndexUrl)};
    EXPECT_EQ(sim::UnifiedLog(), expected);
    EXPECT_EQ(Heard(), Words{"UpdateFailed"});
}

TEST_F(Updater, CountsAnIndexThatCannotBeReadAsNothingToUpdate) {
    for (const std::string& body : {std::string("<html>not found</html>"),
                                    std::string("bplist00"),
                                    std::string("<plist version=\"1.0\"><array/></plist>"),
                                    std::string("<plist version=\"1.0\"><dict></plist>")}) {
        sim::ServeUrl(kIndexUrl, {.body = body});
        sim::ClearLogs();
        check(kGsm);
        Lines expected = beginning("8", body.size());
        append(expected,
               {Error("Could not create version dictionary from downloaded plist!"),
                Error("No update required for any databases")});
        EXPECT_EQ(sim::UnifiedLog(), expected);
        EXPECT_EQ(Heard(), Words{"NoUpdateRequired"});
    }
}

TEST_F(Updater, SaysNothingOfAnEntryWithoutAContentUrl) {
    for (const auto& entry :
         {PropertyList(Dictionary{{"Version", PropertyList("2")}}),
          PropertyList(Dictionary{{"Version", PropertyList("2")},
                                  {"ContentURL", PropertyList(std::int64_t{1})}}),
          Entry("2", "")}) {
        const auto index = ServeIndex({{"gsm", entry}});
        sim::ClearLogs();
        check(kGsm);
        Lines expected = beginning("8", index.size());
        append(expected,
               {Info("We have don't have a previously downloaded gsm database, server has 2, "
                     "update required"),
                Error("URL for gsm database is empty")});
        EXPECT_EQ(sim::UnifiedLog(), expected);
        EXPECT_EQ(Heard(), Words{});
    }
}

TEST_F(Updater, SaysNothingOfATypeThatItKnowsNothingOf) {
    updater->updateDatabase(DatabaseType::kCdma);
    EXPECT_EQ(sim::UnifiedLog(), Lines{Error("Could not find cdma database URL")});
    updater->updateDatabase(DatabaseType{64});
    EXPECT_EQ(sim::UnifiedLog().back(), Error("Could not find unknown database URL"));
    EXPECT_EQ(Heard(), Words{});
}

TEST_F(Updater, SaysOfEveryFailedDownloadThatWiFiMayBeOff) {
    const std::string url = kServer + "gsm.db.gz";
    ServeIndex({{"gsm", Entry("2", url)}});
    const std::string line =
        "Cannot download file " + url + ". Either Wifi is turned OFF or not Wifi attached";
    expectFailure(line);
    sim::ServeUrl(url, {.status = 404, .body = "page"});
    expectFailure(line);
    sim::ServeUrl(url, {.body = ""});
    expectFailure(line);
    EXPECT_EQ(sim::JournalCount("OutputFile"), 0U);
}

TEST_F(Updater, SaysTheSameOfAUrlThatIsNone) {
    for (const std::string url : {"gsm.db.gz", "file:///etc/passwd", "https://", "/x.gz"}) {
        ServeIndex({{"gsm", Entry("2", url)}});
        expectFailure("Cannot download file " + url +
                      ". Either Wifi is turned OFF or not Wifi attached");
    }
}

TEST_F(Updater, FailsOnTheCellularNetwork) {
    ServeIndex({Offer("gsm", "2")});
    sim::AttachToNetwork(sim::Network::kCellular);
    expectFailure("Could not fetch data from source " + kIndexUrl);
}

TEST_F(Updater, FailsWhenWiFiIsLostBetweenIndexAndDatabase) {
    ServeIndex({Offer("gsm", "2")});
    sim::ServeUrl(kIndexUrl, {.body = ServeIndex({Offer("gsm", "2")}), .delay = 1});
    sim::At(1, [] { sim::AttachToNetwork(sim::Network::kCellular); });
    expectFailure("Cannot download file " + kServer +
                  "gsm.db.gz. Either Wifi is turned OFF or not Wifi attached");
}

TEST_F(Updater, MakesTheFolderBeforeItFetches) {
    ServeIndex({Offer("gsm", "2")});
    sim::MakeFile(kFolder, {.mode = sim::kRegular | 0644});
    expectFailure("Cannot create /var/mobile/Library/LASD errno set to File exists");
    EXPECT_EQ(sim::HttpRequests().size(), 1U);
}

TEST_F(Updater, FailsWithADatabaseThatIsNoGzip) {
    const std::string url = kServer + "gsm.db.gz";
    ServeIndex({{"gsm", Entry("2", url)}});
    sim::ServeUrl(url, {.headers = {{"Content-Type", "application/gzip"}}, .body = "corrupt"});
    const std::string temporary = kFolder + "/gsm.db.tmp";
    expectFailure("Failed to commit the data to file for " + temporary);
    EXPECT_FALSE(sim::FileAt(temporary));
    EXPECT_EQ(sim::UnifiedLog().at(sim::UnifiedLog().size() - 2),
              Error("Could not uncompress HTTP response to " + temporary + "!"));
}

TEST_F(Updater, FailsWithAUrlThatEndsInASlash) {
    const std::string url = kServer;
    ServeIndex({{"gsm", Entry("2", url)}});
    ServeDatabase(url, "contents");
    expectFailure("Failed to remove the previous download at location " + kFolder + "/");
    EXPECT_EQ(FileContents(kFolder + "/.tmp"), "contents");
}

TEST_F(Updater, LeavesTheFileOfATypeThatIsNoneUnrecorded) {
    const std::string url = kServer + "x.gz";
    ServeDatabase(url, "contents");
    EXPECT_FALSE(updater->downloadDatabase(url, DatabaseType{64}));
    EXPECT_EQ(FileContents(kFolder + "/x"), "contents");
    EXPECT_EQ(sim::JournalCount("Preferences"), 0U);
    EXPECT_EQ(sim::UnifiedLog().back().text.substr(0, 6), "Moving");
}

TEST_F(Updater, FailsWhenTheRecordCannotBeWritten) {
    ServeIndex({Offer("gsm", "2")});
    Record({{"gsm", Entry("1", "x")}});
    sim::FailCall("PreferencesSynchronize", 1);
    check(kGsm);
    EXPECT_EQ(Heard(), Words{"UpdateFailed"});
    EXPECT_EQ(Recorded().find("gsm")->find("Version")->as<std::string>()->c_str(),
              std::string("1"));
    EXPECT_EQ(FileContents(kFolder + "/gsm.db"), "gsm 2");
    check(kGsm);
    EXPECT_EQ(Heard(), Words{"UpdateAvailable gsm"});
}

TEST_F(Updater, WritesNoRecordOfAFileThatTheDiskMayNotHave) {
    ServeIndex({Offer("gsm", "2")});
    sim::FailCall("PathAccess.synchronize", 1);
    check(kGsm);
    EXPECT_EQ(Heard(), Words{"UpdateFailed"});
    EXPECT_EQ(sim::JournalCount("PreferencesSetValue"), 0U);
}

TEST_F(Updater, RecordsAfterTheFileIsInstalled) {
    ServeIndex({Offer("gsm", "2")});
    check(kGsm);
    EXPECT_TRUE(sim::JournalHasInOrder({"PathAccess.moveOnto",
                                        "PathAccess.synchronize",
                                        "PreferencesSetValue com.vendra.lasd",
                                        "PreferencesSynchronize com.vendra.lasd",
                                        "MessagePortSendRequest"}));
}

TEST_F(Updater, GoesOnWithTheNextTypeAfterAFailure) {
    ServeIndex({Offer("lte", "2"), {"gsm", Entry("2", kServer + "missing.gz")}});
    check(kGsm | kLte);
    EXPECT_EQ(Heard(), (Words{"UpdateFailed", "UpdateAvailable lte"}));
}

TEST_F(Updater, LosesTheOutcomeWhenNobodyListens) {
    sim::CloseMessagePort(kPort);
    const auto index = ServeIndex({Offer("gsm", "2")});
    check(kGsm);
    Lines expected = beginning("8", index.size());
    append(expected,
           {Info("We have don't have a previously downloaded gsm database, server has 2, update "
                 "required")});
    append(expected, update("gsm", "2"));
    EXPECT_EQ(sim::UnifiedLog(), expected);
    EXPECT_EQ(*Recorded().find("gsm"), Entry("2", kServer + "gsm.db.gz"));
}

/// Whatever fails, the outcome is told once, and the record tells of nothing that is not there.
TEST_F(Updater, EndsWithOneNotificationWhicheverCallFails) {
    for (unsigned n = 1;; ++n) {
        sim::Reset();
        sim::OpenMessagePort(kPort);
        ServeIndex({Offer("gsm", "2")});
        sim::MakeDirectory(kFolder);
        sim::MakeFile(kFolder + "/gsm.db", {.mode = sim::kRegular | 0644, .contents = "gsm 1"});
        sim::FailCall(n);
        LASDUpdater::create()->checkForUpdate(server, kGsm);
        sim::Settle();
        const std::string failed = sim::FailedCall();
        const bool isRecorded = Recorded().find("gsm") != nullptr;
        const auto heard = Heard();
        EXPECT_TRUE(!isRecorded || FileContents(kFolder + "/gsm.db") == "gsm 2") << failed;
        EXPECT_EQ(heard.size(), failed == "MessagePortSendRequest" ? 0U : 1U) << failed;
        EXPECT_EQ(server->holdMask, 0U) << failed;
        if (failed.empty()) {
            EXPECT_EQ(heard, Words{"UpdateAvailable gsm"});
            EXPECT_GT(n, 15U);
            break;
        }
    }
}

// Holds and the queue.

TEST_F(Updater, TakesAHoldBeforeItAnswers) {
    updater->checkForUpdate(server, kGsm);
    EXPECT_EQ(server->holdMask, 1U);
    EXPECT_EQ(sim::UnifiedLog(), Lines{Info("Trying to see if update available for mask 8")});
    sim::Settle();
    EXPECT_EQ(server->holdMask, 0U);
}

TEST_F(Updater, TakesOneMoreHoldForEachDatabase) {
    const auto index = ServeIndex({Offer("gsm", "2"), Offer("lte", "2")});
    sim::ServeUrl(kIndexUrl, {.body = index, .delay = 10});
    std::vector<std::uint32_t> masks;
    sim::At(5, [&] { masks.push_back(server->holdMask); });
    for (const char* type : {"gsm", "lte"}) {
        sim::ServeUrl(
            kServer + type + ".db.gz",
            {.headers = {{"Content-Type", "application/gzip"}}, .body = Gzip("x"), .delay = 10});
    }
    sim::At(15, [&] { masks.push_back(server->holdMask); });
    sim::At(25, [&] { masks.push_back(server->holdMask); });
    check(kGsm | kLte);
    sim::RunFor(31);
    EXPECT_EQ(masks, (std::vector<std::uint32_t>{1, 3, 3}));
    EXPECT_EQ(Heard(), (Words{"UpdateAvailable gsm", "UpdateAvailable lte"}));
}

TEST_F(Updater, WorksOffOneRequestAfterTheOther) {
    const auto index = ServeIndex({Offer("gsm", "2")});
    sim::ServeUrl(kIndexUrl, {.body = index, .delay = 1});
    for (int i = 0; i < 200; ++i) {
        updater->checkForUpdate(server, kGsm);
    }
    EXPECT_EQ(server->holdMask, 0xFFFFFFFF) << "there are no more bits than these";
    sim::At(99.5, [] { EXPECT_EQ(sim::JournalCount("HttpRequest.start " + kIndexUrl), 100U); });
    sim::RunFor(201);
    EXPECT_EQ(sim::JournalCount("HttpRequest.start " + kIndexUrl), 200U);
    Words expected(200, "NoUpdateRequired");
    expected.front() = "UpdateAvailable gsm";
    EXPECT_EQ(Heard(), expected);
}

TEST_F(Updater, DropsWhatComesWhileTooManyRequestsWait) {
    for (std::uint32_t i = 0; i < LASDUpdater::kChecksMax; ++i) {
        updater->checkForUpdate(server, kGsm);
    }
    sim::ClearLogs();
    updater->checkForUpdate(server, kLte);
    const Lines expected{Info("Trying to see if update available for mask 4"),
                         Error("database check dropped: 4096 are under way")};
    EXPECT_EQ(sim::UnifiedLog(), expected);
    sim::OpenMessagePort(kPort, 2 * LASDUpdater::kChecksMax);
    sim::Settle();
    updater->checkForUpdate(server, kGsm);
    sim::Settle();
    EXPECT_EQ(Heard(), Words(LASDUpdater::kChecksMax + 1, "UpdateFailed"));
}

TEST_F(Updater, IsThereBeforeMainForTheWholeProcess) {
    EXPECT_EQ(&LASDUpdater::shared(), &LASDUpdater::shared());
    LASDUpdater::shared().checkForUpdate(server, kGsm);
    sim::Settle();
    EXPECT_EQ(Heard(), Words{"UpdateFailed"});
}

}  // namespace
