// The program itself, run against a service that plays a script.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdio>
#include <string>

#include "client/FakeService_test.h"

namespace {

using namespace fake;

struct Outcome {
    int exitStatus = -1;
    /// Both streams, in the order in which they were written.
    std::string output;
};

Outcome RunProgram(const Service& service,
                   const std::string& arguments,
                   const std::string& input = "</dev/null") {
    const std::string command = std::string(LFHELPER_PROGRAM) +
                                " --group \"$(id -gn)\" --service " + service.path() + " " +
                                arguments + " 2>&1 " + input;
    Outcome outcome;
    std::FILE* const pipe = popen(command.c_str(), "re");
    std::array<char, 4096> chunk{};
    std::size_t size = 0;
    while ((size = std::fread(chunk.data(), 1, chunk.size(), pipe)) != 0) {
        outcome.output.append(chunk.data(), size);
    }
    const int status = pclose(pipe);
    outcome.exitStatus = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    return outcome;
}

std::string List(const std::string& element) {
    return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n" + element +
           "\n</plist>\n";
}

bool Contains(const std::string& text, const std::string& part) {
    return text.find(part) != std::string::npos;
}

/// The reply of a routine with a number in it.
Bytes NumberReply(std::int32_t id, std::int32_t number) {
    Bytes reply = SimpleReply(id, 0, 40);
    Put<std::int32_t>(reply, 36, number);
    return reply;
}

class LfhelperTest : public testing::Test {
protected:
    /// Answers one request of one client.
    Outcome runAnswered(const std::string& arguments,
                        const Bytes& reply,
                        const std::vector<int>& descriptors = {},
                        const std::string& input = "</dev/null") {
        service.play([this, reply, descriptors](Service& self) {
            const Session session = self.checkIn();
            request = Receive(session.port.get()).bytes;
            Send(session.port.get(), reply, descriptors);
        });
        auto outcome = RunProgram(service, arguments, input);
        service.finish();
        return outcome;
    }

    /// What the service was asked to store; the value must lie behind the request.
    std::string valueSetBy(const std::string& arguments, const std::string& input = "</dev/null") {
        const auto outcome =
            runAnswered("preferences set " + arguments, SimpleReply(8683555, 0), {}, input);
        EXPECT_EQ(outcome.exitStatus, 0);
        EXPECT_EQ(outcome.output, "preferences set: success\n");
        EXPECT_EQ(Get<std::int32_t>(request, 20), 8683555);
        EXPECT_EQ(Get<std::uint32_t>(request, 40) + 568, request.size());
        return std::string(request.begin() + 568, request.end());
    }

    /// Answers the request for a value.
    Outcome runShowing(const std::string& arguments, const std::string& value) {
        return runAnswered("preferences get " + arguments,
                           BulkReply(8683556,
                                     static_cast<std::uint32_t>(value.size()),
                                     Bytes(value.begin(), value.end())));
    }

    [[nodiscard]] std::string requestText(std::size_t offset) const {
        return request.size() > offset ? reinterpret_cast<const char*>(request.data()) + offset
                                       : "";
    }

    Service service;
    Bytes request;
};

TEST_F(LfhelperTest, ChecksIn) {
    service.play([](Service& self) { (void)self.checkIn(); });
    const auto outcome = RunProgram(service, "check-in");
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_EQ(outcome.output, "check-in: success\n");
}

TEST_F(LfhelperTest, SaysThatTheCallerIsNotEntitled) {
    service.play([](Service& self) {
        const Descriptor connection = self.accept();
        (void)Receive(connection.get());
        Send(connection.get(), SimpleReply(4792174, 35));
    });
    const auto outcome = RunProgram(service, "check-in");
    EXPECT_EQ(outcome.exitStatus, 3);
    EXPECT_EQ(outcome.output,
              "lfhelper: check-in: 35 NOT_ENTITLED: the group of the caller is not entitled to use "
              "the service\n");
}

TEST_F(LfhelperTest, LinksACarrierBundle) {
    const auto outcome =
        runAnswered("link-carrier-bundle target link domain", SimpleReply(8683558, 0));
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_EQ(Get<std::int32_t>(request, 20), 8683558);
    EXPECT_EQ(requestText(32), "target");
    EXPECT_EQ(requestText(1056), "link");
    EXPECT_EQ(requestText(2080), "domain");
}

TEST_F(LfhelperTest, LinksACarrierBundleWithoutADomain) {
    const auto outcome = runAnswered("link-carrier-bundle target link", SimpleReply(8683558, 8));
    EXPECT_EQ(outcome.exitStatus, 1);
    EXPECT_EQ(requestText(2080), "");
    EXPECT_EQ(
        outcome.output,
        "lfhelper: link-carrier-bundle: 8 NO_ACCESS: the path is not one that the service may "
        "change\n");
}

TEST_F(LfhelperTest, CreatesASymbolicLink) {
    const auto outcome = runAnswered("--json create-symlink target link", SimpleReply(8683559, 5));
    EXPECT_EQ(outcome.exitStatus, 1);
    EXPECT_EQ(requestText(32) + requestText(1056), "targetlink");
    EXPECT_EQ(outcome.output,
              "{\"command\":\"create-symlink\",\"exitStatus\":1,\"code\":5,\"name\":\"FAILURE\","
              "\"meaning\":\"the operation failed, or an argument is not UTF-8 or no property "
              "list\","
              "\"target\":\"target\",\"link\":\"link\"}\n");
}

TEST_F(LfhelperTest, CopiesAFile) {
    const auto outcome = runAnswered("copy-file from to name", NumberReply(8683564, 1));
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_EQ(outcome.output, "copy-file: success\n");
    EXPECT_EQ(requestText(32) + " " + requestText(288) + " " + requestText(544), "from to name");
}

TEST_F(LfhelperTest, SaysWhenTheServiceDidNotDoIt) {
    const auto outcome = runAnswered("move-directory source to name", NumberReply(8683566, 0));
    EXPECT_EQ(outcome.exitStatus, 1);
    EXPECT_EQ(outcome.output,
              "lfhelper: move-directory: the service did not move source to to as name; its log "
              "tells why\n");
}

TEST_F(LfhelperTest, TellsProgramsThatItWasNotDone) {
    const auto outcome =
        runAnswered("--json copy-archive source destination", NumberReply(8683571, 0));
    EXPECT_EQ(outcome.exitStatus, 1);
    EXPECT_EQ(outcome.output,
              "{\"command\":\"copy-archive\",\"exitStatus\":1,\"code\":null,\"name\":\"NOT_DONE\","
              "\"meaning\":\"the service did not copy all of source to destination; its log "
              "tells why\",\"done\":false,\"source\":\"source\",\"destination\":"
              "\"destination\"}\n");
    EXPECT_EQ(requestText(32) + " " + requestText(288), "source destination");
}

TEST_F(LfhelperTest, TellsProgramsThatItWasDone) {
    const auto outcome = runAnswered("--json copy-log-directory source", NumberReply(8683565, 1));
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_TRUE(Contains(outcome.output, "\"done\":true,\"source\":\"source\"}"));
    EXPECT_EQ(requestText(32), "source");
}

TEST_F(LfhelperTest, ShowsAPropertyListFile) {
    const std::string list = List("<dict/>");
    const auto outcome = runAnswered(
        "load-plist path",
        BulkReply(
            8683572, static_cast<std::uint32_t>(list.size()), Bytes(list.begin(), list.end())));
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_EQ(outcome.output, list);
    EXPECT_EQ(requestText(32), "path");
}

TEST_F(LfhelperTest, SaysThatAPropertyListFileHoldsNoDictionary) {
    const auto outcome = runAnswered("load-plist path", SimpleReply(8683572, 9));
    EXPECT_EQ(outcome.exitStatus, 1);
    EXPECT_EQ(outcome.output.rfind("lfhelper: load-plist: 9 NO_DATA: ", 0), 0U);
}

TEST_F(LfhelperTest, DoesNotTakeAnAbsentValueForADictionary) {
    const auto outcome = runAnswered("load-plist path", BulkReply(8683572, 0));
    EXPECT_EQ(outcome.exitStatus, 1);
    EXPECT_TRUE(Contains(outcome.output, "ERROR_INVALID_REPLY"));
}

TEST_F(LfhelperTest, RemovesAPreferenceDomain) {
    const auto outcome =
        runAnswered("remove-preference-domain path domain", SimpleReply(8683560, 0));
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_EQ(Get<std::int32_t>(request, 20), 8683560);
    EXPECT_EQ(requestText(32) + requestText(1056), "pathdomain");
}

struct SetCase {
    const char* name;
    const char* arguments;
    const char* element;
};

class LfhelperSets : public LfhelperTest, public testing::WithParamInterface<SetCase> {};

TEST_P(LfhelperSets, AValueAsAPropertyList) {
    EXPECT_EQ(valueSetBy(GetParam().arguments), List(GetParam().element));
}

INSTANTIATE_TEST_SUITE_P(
    Types,
    LfhelperSets,
    testing::Values(
        SetCase{"Text", "d k 'a<b ü'", "<string>a&lt;b ü</string>"},
        SetCase{"EmptyText", "--type string d k ''", "<string></string>"},
        SetCase{"Integer", "d k -5 --type=integer", "<integer>-5</integer>"},
        SetCase{"HexadecimalInteger", "--type integer d k 0x10", "<integer>16</integer>"},
        SetCase{"Real", "--type real d k 0.50", "<real>0.5</real>"},
        SetCase{"EndlessReal", "--type real d k -- -inf", "<real>-infinity</real>"},
        SetCase{"True", "--type boolean d k true", "<true/>"},
        SetCase{"False", "--type boolean d k false", "<false/>"},
        SetCase{
            "Date", "--type date d k 2024-02-29T23:59:59Z", "<date>2024-02-29T23:59:59Z</date>"},
        SetCase{"Data", "--type data d k AP8=", "<data>AP8=</data>"}),
    [](const auto& test) { return std::string(test.param.name); });

struct ShowCase {
    const char* name;
    const char* element;
    const char* shown;
    const char* fields;  ///< at the end of the JSON object
};

class LfhelperShows : public LfhelperTest, public testing::WithParamInterface<ShowCase> {};

TEST_P(LfhelperShows, AValueAsSuch) {
    const auto outcome = runShowing("d k", List(GetParam().element));
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_EQ(outcome.output, GetParam().shown);
}

TEST_P(LfhelperShows, AValueInJson) {
    const auto outcome = runShowing("--json d k", List(GetParam().element));
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_TRUE(outcome.output.ends_with("\"domain\":\"d\",\"key\":\"k\"," +
                                         std::string(GetParam().fields) + "}\n"))
        << outcome.output;
}

INSTANTIATE_TEST_SUITE_P(
    Types,
    LfhelperShows,
    testing::Values(
        ShowCase{"Text",
                 "<string>\"&lt;ü\n</string>",
                 "\"<ü\n\n",
                 R"("type":"string","value":"\"<ü\u000a")"},
        ShowCase{"EmptyText", "<string/>", "\n", R"("type":"string","value":"")"},
        ShowCase{"TextLikeANumber", "<string>5</string>", "5\n", R"("type":"string","value":"5")"},
        ShowCase{"Integer",
                 "<integer>-9223372036854775808</integer>",
                 "-9223372036854775808\n",
                 R"("type":"integer","value":-9223372036854775808)"},
        ShowCase{"Real", "<real>0.1</real>", "0.1\n", R"("type":"real","value":0.1)"},
        ShowCase{"LargeReal", "<real>1e300</real>", "1e+300\n", R"("type":"real","value":1e+300)"},
        ShowCase{"True", "<true/>", "true\n", R"("type":"boolean","value":true)"},
        ShowCase{"False", "<false/>", "false\n", R"("type":"boolean","value":false)"}),
    [](const auto& test) { return std::string(test.param.name); });

TEST_F(LfhelperTest, HasNoJsonNumberForAnEndlessOne) {
    const auto outcome = runShowing("--json d k", List("<real>-inf</real>"));
    EXPECT_TRUE(Contains(outcome.output, R"("type":"real","plist":"<?xml )")) << outcome.output;
    EXPECT_TRUE(Contains(outcome.output, R"(<real>-inf</real>)"));
}

TEST_F(LfhelperTest, GivesProgramsAPropertyListAsAText) {
    const auto outcome = runShowing("--json d k", List("<dict/>"));
    EXPECT_TRUE(Contains(outcome.output, R"("type":"dictionary","plist":"<?xml version=\"1.0\")"))
        << outcome.output;
    EXPECT_TRUE(outcome.output.ends_with(R"(<dict/>\u000a</plist>\u000a"})"
                                         "\n"));
}

TEST_F(LfhelperTest, NamesTheDomainAndTheKeyOfAPreference) {
    (void)valueSetBy("com.vendra.test Key value");
    EXPECT_EQ(requestText(52), "com.vendra.test");
    EXPECT_EQ(requestText(308), "Key");
}

TEST_F(LfhelperTest, SetsAPropertyListAsItIs) {
    EXPECT_EQ(valueSetBy("--type plist d k -", "<<'END'\nnone at all\nEND\n"), "none at all\n");
}

TEST_F(LfhelperTest, DropsTheLineFeedBehindAValueOnStandardInput) {
    EXPECT_EQ(valueSetBy("d k -", "<<'END'\ntwo\n\nEND\n"), List("<string>two\n</string>"));
}

TEST_F(LfhelperTest, RemovesAPreferenceValueByOneByte) {
    const auto outcome = runAnswered("preferences remove d k", SimpleReply(8683555, 0));
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_EQ(outcome.output, "preferences remove: success\n");
    EXPECT_EQ(Get<std::uint32_t>(request, 564), 1U);
    EXPECT_EQ(requestText(52) + requestText(308), "dk");
}

TEST_F(LfhelperTest, AsksForTheValueOfADomain) {
    (void)runShowing("com.vendra.test Key", List("<true/>"));
    EXPECT_EQ(Get<std::int32_t>(request, 20), 8683556);
    EXPECT_EQ(requestText(32) + requestText(288), "com.vendra.testKey");
}

TEST_F(LfhelperTest, ShowsAnyOtherValueAsAPropertyList) {
    const std::string list = List("<array>\n\t<true/>\n</array>");
    EXPECT_EQ(runShowing("d k", list).output, list);
}

TEST_F(LfhelperTest, ShowsEveryValueAsAPropertyListWhenAsked) {
    EXPECT_EQ(runShowing("--plist d k", List("<true/>")).output, List("<true/>"));
}

TEST_F(LfhelperTest, AsksForTheValueOfAnApplication) {
    const auto outcome = runAnswered("preferences get --application d k", BulkReply(8683557, 0));
    EXPECT_EQ(Get<std::int32_t>(request, 20), 8683557);
    EXPECT_EQ(outcome.exitStatus, 4);
    EXPECT_EQ(outcome.output, "lfhelper: preferences get: there is no value of \"k\" in d\n");
}

TEST_F(LfhelperTest, TellsProgramsOfAnAbsentValue) {
    EXPECT_EQ(
        runShowing("--json d k", "").output,
        "{\"command\":\"preferences get\",\"exitStatus\":4,\"code\":0,\"name\":\"SUCCESS\","
        "\"meaning\":\"success\",\"domain\":\"d\",\"key\":\"k\",\"type\":null,\"value\":null}\n");
}

TEST_F(LfhelperTest, RefusesAValueThatIsNoPropertyList) {
    const auto outcome = runShowing("d k", "not a list");
    EXPECT_EQ(outcome.exitStatus, 1);
    EXPECT_TRUE(Contains(outcome.output, "ERROR_INVALID_REPLY")) << outcome.output;
}

TEST_F(LfhelperTest, ShowsAListThatIsTooLongToParse) {
    const std::string list = List("<string>" + std::string(16U << 20, 'x') + "</string>");
    const Descriptor file = MemoryFile(Bytes(list.begin(), list.end()));
    const auto outcome = runAnswered("preferences get d k",
                                     BulkReply(8683556, static_cast<std::uint32_t>(list.size())),
                                     {file.get()});
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_TRUE(outcome.output == list);
}

TEST_F(LfhelperTest, ShowsARawReplyFieldByField) {
    const auto outcome =
        runAnswered("raw 8683562 '0000000001000000 01:00:00:00'", SimpleReply(8683562, -304));
    EXPECT_EQ(outcome.exitStatus, 1);
    EXPECT_EQ(Get<std::uint32_t>(request, 4), 36U);
    EXPECT_EQ(request.size(), 36U);
    EXPECT_TRUE(Contains(outcome.output, "reply of 36 bytes\n")) << outcome.output;
    EXPECT_TRUE(Contains(outcome.output, "  0000  00 00 00 00              msgh_bits: simple\n"));
    EXPECT_TRUE(Contains(outcome.output, "msgh_id: 8683662, the reply to 8683562\n"));
    EXPECT_TRUE(Contains(outcome.output, "  0018  00 00 00 00 01 00 00 00  NDR record\n"));
    EXPECT_TRUE(Contains(outcome.output, "return code: -304 BAD_ARGUMENTS: "));
}

TEST_F(LfhelperTest, ShowsWhatStandsBehindTheFieldsOfARawReply) {
    Bytes reply = SimpleReply(8683568, 0, 100);
    Put<std::uint16_t>(reply, 36, 0x4544);
    const auto outcome = runAnswered("raw 0x848030", reply);
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_EQ(Get<std::int32_t>(request, 20), 8683568);
    EXPECT_TRUE(Contains(outcome.output, "  0024  44 45 00 ")) << outcome.output;
    EXPECT_TRUE(Contains(outcome.output, "|DE..............|\n"));
}

TEST_F(LfhelperTest, SwitchesTheHeartbeat) {
    for (const bool isOn : {true, false}) {
        Service another;
        another.play([this](Service& self) {
            const Session session = self.checkIn();
            request = Receive(session.port.get()).bytes;
            Send(session.port.get(), SimpleReply(8683562, 0));
        });
        const auto outcome = RunProgram(another, isOn ? "heartbeat on" : "heartbeat off");
        another.finish();
        EXPECT_EQ(outcome.exitStatus, 0) << outcome.output;
        ASSERT_EQ(request.size(), 36U);
        EXPECT_EQ(request[32], isOn ? 1 : 0);
    }
}

TEST_F(LfhelperTest, TellsProgramsOfTheHeartbeat) {
    const auto outcome = runAnswered("--json heartbeat on", SimpleReply(8683562, 5));
    EXPECT_EQ(outcome.exitStatus, 1);
    EXPECT_TRUE(Contains(outcome.output, "\"state\":\"on\"")) << outcome.output;
    EXPECT_TRUE(Contains(outcome.output, "\"code\":5"));
}

TEST_F(LfhelperTest, ShowsARawBulkReply) {
    const auto outcome = runAnswered("raw 8683572", BulkReply(8683572, 3, {'a', 'b', 0xFF}));
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_TRUE(Contains(outcome.output, "msgh_bits: complex\n")) << outcome.output;
    EXPECT_TRUE(Contains(outcome.output, "data size: 3\n"));
    EXPECT_TRUE(Contains(outcome.output, "  0034  03 00 00 00              data count: 3\n"));
    EXPECT_TRUE(Contains(outcome.output, "|ab.|\n"));
}

TEST_F(LfhelperTest, ShowsRawRepliesThatAreCutShort) {
    for (const std::size_t size : {1U, 3U, 4U, 23U, 24U, 31U, 35U}) {
        Service another;
        another.play([size](Service& self) {
            const Session session = self.checkIn();
            (void)Receive(session.port.get());
            Send(session.port.get(), Bytes(size, 'A'));
        });
        const auto outcome = RunProgram(another, "raw 1");
        EXPECT_EQ(outcome.exitStatus, 1);
        EXPECT_TRUE(Contains(outcome.output, "reply of " + std::to_string(size) + " bytes\n"));
        EXPECT_TRUE(Contains(outcome.output, "ERROR_INVALID_REPLY")) << outcome.output;
    }
}

TEST_F(LfhelperTest, TellsOfADescriptorBesideARawReply) {
    const Descriptor file = MemoryFile(Bytes(100'000));
    const auto outcome =
        runAnswered("--json raw 8683572", BulkReply(8683572, 100'000), {file.get()});
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_TRUE(
        Contains(outcome.output, "\"header\":{\"bits\":2147483648,\"size\":56,\"id\":8683672}"));
    EXPECT_TRUE(Contains(outcome.output, "\"reply\":\"0000008038000000")) << outcome.output;
    EXPECT_TRUE(Contains(outcome.output, "\"descriptors\":1}"));
}

TEST_F(LfhelperTest, WritesTheHeaderThatItIsTold) {
    const auto outcome =
        runAnswered("raw --complex --claim-size 568 -- -7 00ff", SimpleReply(-7, -303));
    EXPECT_EQ(outcome.exitStatus, 1);
    Bytes expected(24);
    Put<std::uint32_t>(expected, 0, 0x80000000);
    Put<std::uint32_t>(expected, 4, 568);
    Put<std::int32_t>(expected, 20, -7);
    Put<std::uint16_t>(expected, 24, 0xFF00);
    EXPECT_EQ(request, expected);
    EXPECT_TRUE(Contains(outcome.output, "msgh_id: 93, the reply to -7\n")) << outcome.output;
}

TEST_F(LfhelperTest, SaysThatTheConnectionWasLost) {
    service.play([](Service& self) {
        const Session session = self.checkIn();
        (void)Receive(session.port.get());
    });
    const auto outcome = RunProgram(service, "create-symlink a b");
    EXPECT_EQ(outcome.exitStatus, 1);
    EXPECT_TRUE(Contains(outcome.output, "ERROR_CONNECTION_LOST")) << outcome.output;
}

}  // namespace
