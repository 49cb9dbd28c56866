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

Outcome RunProgram(const Service& service, const std::string& arguments) {
    const std::string command = std::string(LFHELPER_PROGRAM) +
                                " --group \"$(id -gn)\" --service " + service.path() + " " +
                                arguments + " 2>&1 </dev/null";
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

bool Contains(const std::string& text, const std::string& part) {
    return text.find(part) != std::string::npos;
}

class LfhelperTest : public testing::Test {
protected:
    /// Answers one request of one client.
    Outcome runAnswered(const std::string& arguments,
                        const Bytes& reply,
                        const std::vector<int>& descriptors = {}) {
        service.play([this, reply, descriptors](Service& self) {
            const Session session = self.checkIn();
            request = Receive(session.port.get()).bytes;
            Send(session.port.get(), reply, descriptors);
        });
        auto outcome = RunProgram(service, arguments);
        service.finish();
        return outcome;
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
              "\"meaning\":\"the operation failed, or an argument is not UTF-8\","
              "\"target\":\"target\",\"link\":\"link\"}\n");
}

TEST_F(LfhelperTest, RemovesAPreferenceDomain) {
    const auto outcome =
        runAnswered("remove-preference-domain path domain", SimpleReply(8683560, 0));
    EXPECT_EQ(outcome.exitStatus, 0);
    EXPECT_EQ(Get<std::int32_t>(request, 20), 8683560);
    EXPECT_EQ(requestText(32) + requestText(1056), "pathdomain");
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
