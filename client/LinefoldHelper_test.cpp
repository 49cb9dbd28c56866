#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <atomic>
#include <csignal>
#include <ctime>
#include <future>
#include <memory>
#include <set>

#include "client/FakeService_test.h"
#include "client/linefold_helper.h"

extern "C" {
const char* LFTestErrorNameFromC(int32_t code);
int32_t LFTestCallFromC(void);
}

namespace {

std::atomic<int> pauseCount{0};
std::function<void(int)> onPause;

}  // namespace

/// Stands in for the C library's: the pauses between two tries are counted, not waited for.
extern "C" int nanosleep(const timespec* /*length*/, timespec* /*rest*/) {
    const int number = ++pauseCount;
    if (onPause) {
        onPause(number);
    }
    return 0;
}

namespace {

using namespace fake;

struct DestroyHelper {
    void operator()(LFMobileHelper* helper) const { LFMobileHelperDestroy(helper); }
};

using Client = std::unique_ptr<LFMobileHelper, DestroyHelper>;

Client ClientOf(const Service& service) {
    return Client(LFMobileHelperCreateWithPath(service.path()));
}

bool HasEnded(int connection) {
    return Receive(connection).bytes.empty();
}

constexpr std::int32_t kSetTokenId = 8683549;
constexpr std::int32_t kCopyTokenId = 8683554;
constexpr std::int32_t kSetPreferenceId = 8683555;
constexpr std::int32_t kCopyPreferenceId = 8683556;
constexpr std::int32_t kIsSubscribedId = 8683561;

class LinefoldHelperTest : public testing::Test {
protected:
    void SetUp() override {
        pauseCount = 0;
        onPause = nullptr;
    }

    Service service;
};

// ---- Requests: every routine, byte for byte, against a second statement of its layout ----------

struct FieldAt {
    std::size_t offset;
    Bytes bytes;
};

struct Routine {
    std::string name;
    std::function<std::int32_t(LFMobileHelper*)> call;
    std::int32_t id;
    std::uint32_t size;
    std::vector<FieldAt> fields;
    Bytes reply;
};

Bytes TextBytes(const std::string& text) {
    return {text.begin(), text.end()};
}

template <typename T>
Bytes ValueBytes(T value) {
    Bytes bytes;
    Put(bytes, 0, value);
    return bytes;
}

const std::string kFull256(256, 'x');
const std::string kFull1024(1024, 'y');

std::vector<Routine> AllRoutines() {
    using LF = LFMobileHelper*;
    static std::int32_t number;
    static std::array<char, LF_MOBILE_HELPER_TOKEN_SIZE> text;
    static std::array<std::uint8_t, 3> value{7, 8, 9};
    static void* data;
    static std::size_t size;
    const Bytes ndr = ValueBytes<std::uint64_t>(0x100000000);
    // clang-format off
    return {
        {"SetVoicemailToken", [](LF h) { return LFMobileHelperSetVoicemailToken(h, "token"); },
         8683549, 288, {{24, ndr}, {32, TextBytes("token")}}, SimpleReply(8683549, 0)},
        {"SetVoicemailTokenForKey", [](LF h) { return LFMobileHelperSetVoicemailTokenForKey(h, "key", kFull256.c_str()); },
         8683550, 544, {{24, ndr}, {32, TextBytes("key")}, {288, TextBytes(kFull256)}}, SimpleReply(8683550, 0)},
        {"ClearVoicemailToken", [](LF h) { return LFMobileHelperClearVoicemailToken(h); },
         8683551, 24, {}, SimpleReply(8683551, 0)},
        {"RemoveAllVoicemailRecords", [](LF h) { return LFMobileHelperRemoveAllVoicemailRecords(h); },
         8683552, 24, {}, SimpleReply(8683552, 0)},
        {"CopyVoicemailTokenForKey", [](LF h) { return LFMobileHelperCopyVoicemailTokenForKey(h, "key", text.data()); },
         8683553, 288, {{24, ndr}, {32, TextBytes("key")}}, SimpleReply(8683553, 0, 292)},
        {"CopyVoicemailToken", [](LF h) { return LFMobileHelperCopyVoicemailToken(h, text.data()); },
         8683554, 24, {}, SimpleReply(8683554, 0, 292)},
        {"SetPreferenceValue", [](LF h) { return LFMobileHelperSetPreferenceValue(h, "domain", "key", value.data(), value.size()); },
         8683555, 568, {{0, ValueBytes<std::uint32_t>(0x80000000)}, {24, ValueBytes<std::uint32_t>(1)},
                        {36, {0, 1, 0, 1}}, {40, ValueBytes<std::uint32_t>(3)}, {44, ndr},
                        {52, TextBytes("domain")}, {308, TextBytes("key")},
                        {564, ValueBytes<std::uint32_t>(3)}, {568, {7, 8, 9}}}, SimpleReply(8683555, 0)},
        {"RemovePreferenceValue", [](LF h) { return LFMobileHelperRemovePreferenceValue(h, "domain", "key"); },
         8683555, 568, {{0, ValueBytes<std::uint32_t>(0x80000000)}, {24, ValueBytes<std::uint32_t>(1)},
                        {36, {0, 1, 0, 1}}, {40, ValueBytes<std::uint32_t>(1)}, {44, ndr},
                        {52, TextBytes("domain")}, {308, TextBytes("key")},
                        {564, ValueBytes<std::uint32_t>(1)}, {568, {0}}}, SimpleReply(8683555, 0)},
        {"CopyPreferenceValue", [](LF h) { return LFMobileHelperCopyPreferenceValue(h, "domain", "key", &data, &size); },
         8683556, 544, {{24, ndr}, {32, TextBytes("domain")}, {288, TextBytes("key")}}, BulkReply(8683556, 0)},
        {"CopyAppPreferenceValue", [](LF h) { return LFMobileHelperCopyAppPreferenceValue(h, "domain", "key", &data, &size); },
         8683557, 544, {{24, ndr}, {32, TextBytes("domain")}, {288, TextBytes("key")}}, BulkReply(8683557, 0)},
        {"LinkCarrierBundle", [](LF h) { return LFMobileHelperLinkCarrierBundle(h, "target", kFull1024.c_str(), "domain"); },
         8683558, 3104, {{24, ndr}, {32, TextBytes("target")}, {1056, TextBytes(kFull1024)}, {2080, TextBytes("domain")}}, SimpleReply(8683558, 0)},
        {"CreateSymlink", [](LF h) { return LFMobileHelperCreateSymlink(h, "target", "link"); },
         8683559, 2080, {{24, ndr}, {32, TextBytes("target")}, {1056, TextBytes("link")}}, SimpleReply(8683559, 0)},
        {"RemovePreferenceDomain", [](LF h) { return LFMobileHelperRemovePreferenceDomain(h, "path", ""); },
         8683560, 2080, {{24, ndr}, {32, TextBytes("path")}}, SimpleReply(8683560, 0)},
        {"IsVoicemailSubscribed", [](LF h) { return LFMobileHelperIsVoicemailSubscribed(h, &number); },
         8683561, 24, {}, SimpleReply(8683561, 0, 40)},
        {"SetHeartbeatEnabled", [](LF h) { return LFMobileHelperSetHeartbeatEnabled(h, 1); },
         8683562, 36, {{24, ndr}, {32, {1, 0, 0, 0}}}, SimpleReply(8683562, 0)},
        {"CheckForDatabaseUpdate", [](LF h) { return LFMobileHelperCheckForDatabaseUpdate(h, 0x1F); },
         8683563, 36, {{24, ndr}, {32, {0x1F, 0, 0, 0}}}, SimpleReply(8683563, 0)},
        {"CopyFile", [](LF h) { return LFMobileHelperCopyFile(h, "from", "to", "name", &number); },
         8683564, 800, {{24, ndr}, {32, TextBytes("from")}, {288, TextBytes("to")}, {544, TextBytes("name")}}, SimpleReply(8683564, 0, 40)},
        {"CopyLogDirectory", [](LF h) { return LFMobileHelperCopyLogDirectory(h, "from", &number); },
         8683565, 288, {{24, ndr}, {32, TextBytes("from")}}, SimpleReply(8683565, 0, 40)},
        {"MoveDirectory", [](LF h) { return LFMobileHelperMoveDirectory(h, "from", "to", "name", &number); },
         8683566, 800, {{24, ndr}, {32, TextBytes("from")}, {288, TextBytes("to")}, {544, TextBytes("name")}}, SimpleReply(8683566, 0, 40)},
        {"RequestCountryCodeFromLocation", [](LF h) { return LFMobileHelperRequestCountryCodeFromLocation(h, 1.5, -2.0); },
         8683567, 48, {{24, ndr}, {32, {0, 0, 0, 0, 0, 0, 0xF8, 0x3F}}, {40, {0, 0, 0, 0, 0, 0, 0, 0xC0}}}, SimpleReply(8683567, 0)},
        {"CopyCountryCode", [](LF h) { return LFMobileHelperCopyCountryCode(h, text.data()); },
         8683568, 24, {}, SimpleReply(8683568, 0, 100)},
        {"RequestWanIPFromLocation", [](LF h) { return LFMobileHelperRequestWanIPFromLocation(h); },
         8683569, 24, {}, SimpleReply(8683569, 0)},
        {"SetRadioManagerLogging", [](LF h) { return LFMobileHelperSetRadioManagerLogging(h, -1); },
         8683570, 36, {{24, ndr}, {32, {0xFF, 0xFF, 0xFF, 0xFF}}}, SimpleReply(8683570, 0)},
        {"CopyArchive", [](LF h) { return LFMobileHelperCopyArchive(h, "from", "to", &number); },
         8683571, 544, {{24, ndr}, {32, TextBytes("from")}, {288, TextBytes("to")}}, SimpleReply(8683571, 0, 40)},
        {"LoadPlistFile", [](LF h) { return LFMobileHelperLoadPlistFile(h, "path", &data, &size); },
         8683572, 288, {{24, ndr}, {32, TextBytes("path")}}, BulkReply(8683572, 0)},
    };
    // clang-format on
}

Bytes ExpectedRequest(const Routine& routine) {
    Bytes expected(routine.size);
    Put(expected, 4, routine.size);
    Put(expected, 20, routine.id);
    for (const FieldAt& field : routine.fields) {
        expected.resize(std::max(expected.size(), field.offset + field.bytes.size()));
        std::copy(field.bytes.begin(),
                  field.bytes.end(),
                  expected.begin() + static_cast<std::ptrdiff_t>(field.offset));
    }
    return expected;
}

class EveryRoutine : public testing::TestWithParam<Routine> {};

TEST_P(EveryRoutine, SendsExactlyTheBytesOfItsLayout) {
    Service service;
    Message request;
    service.play([&request](Service& self) {
        const Session session = self.checkIn();
        request = Receive(session.port.get());
        Send(session.port.get(), GetParam().reply);
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(GetParam().call(client.get()), LF_MOBILE_HELPER_SUCCESS);
    service.finish();
    EXPECT_EQ(request.bytes, ExpectedRequest(GetParam()));
    EXPECT_FALSE(request.descriptor.isOpen());
}

TEST_P(EveryRoutine, ReturnsTheCodeOfTheService) {
    Service service;
    service.play([](Service& self) {
        const Session session = self.checkIn();
        (void)Receive(session.port.get());
        Send(session.port.get(), SimpleReply(GetParam().id, -77));
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(GetParam().call(client.get()), -77);
}

TEST_P(EveryRoutine, RefusesASuccessOfTheWrongSize) {
    Service service;
    bool hasEnded = false;
    service.play([&hasEnded](Service& self) {
        const Session session = self.checkIn();
        (void)Receive(session.port.get());
        Send(session.port.get(), SimpleReply(GetParam().id, 0, 44));
        hasEnded = HasEnded(session.watch.get());
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(GetParam().call(client.get()), LF_MOBILE_HELPER_ERROR_INVALID_REPLY);
    service.finish();
    EXPECT_TRUE(hasEnded);
}

TEST_P(EveryRoutine, RefusesAMissingHandle) {
    EXPECT_EQ(GetParam().call(nullptr), LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT);
}

std::string NameOfRoutine(const testing::TestParamInfo<Routine>& info) {
    return info.param.name;
}

INSTANTIATE_TEST_SUITE_P(Routines, EveryRoutine, testing::ValuesIn(AllRoutines()), NameOfRoutine);

TEST(EveryRoutineTable, HasAllOfThem) {
    std::set<std::int32_t> ids;
    for (const Routine& routine : AllRoutines()) {
        ids.insert(routine.id);
    }
    EXPECT_EQ(ids.size(), 24U) << "removal of a preference shares the routine that sets one";
}

// ---- The check-in ------------------------------------------------------------------------------

TEST_F(LinefoldHelperTest, ChecksInWithAMovedSendRightAndAWatchPort) {
    bool hasWatch = false;
    service.play([&hasWatch](Service& self) { hasWatch = self.checkIn().watch.isOpen(); });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_SUCCESS);
    service.finish();
    Bytes expected(40);
    Put<std::uint32_t>(expected, 0, 0x80000000);
    Put<std::uint32_t>(expected, 4, 40);
    Put<std::int32_t>(expected, 20, 4792174);
    Put<std::uint32_t>(expected, 24, 1);
    Put<std::uint8_t>(expected, 38, 17);
    EXPECT_EQ(service.checkInRequest, expected);
    EXPECT_TRUE(hasWatch);
}

TEST_F(LinefoldHelperTest, ChecksInOnceForManyCalls) {
    service.play([](Service& self) {
        const Session session = self.checkIn();
        for (int i = 0; i < 2; ++i) {
            (void)Receive(session.port.get());
            Send(session.port.get(), SimpleReply(kSetTokenId, 0));
        }
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_SUCCESS);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_SUCCESS);
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), "a"), LF_MOBILE_HELPER_SUCCESS);
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), "b"), LF_MOBILE_HELPER_SUCCESS);
}

TEST_F(LinefoldHelperTest, ReturnsARefusedCheckInFromTheFirstCall) {
    service.play([](Service& self) {
        const Descriptor connection = self.accept();
        (void)Receive(connection.get());
        Send(connection.get(), SimpleReply(4792174, 35));
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperClearVoicemailToken(client.get()), LF_MOBILE_HELPER_NOT_ENTITLED);
}

TEST_F(LinefoldHelperTest, DestroyingHangsUpTheWatchPort) {
    bool hasEnded = false;
    service.play([&hasEnded](Service& self) {
        const Session session = self.checkIn();
        hasEnded = HasEnded(session.watch.get()) && HasEnded(session.port.get());
    });
    auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_SUCCESS);
    client.reset();
    service.finish();
    EXPECT_TRUE(hasEnded);
}

TEST_F(LinefoldHelperTest, WaitsOnAPrivatePortThatCameWithoutBlocking) {
    service.play([](Service& self) {
        const Session session = self.checkIn(SOCK_NONBLOCK);
        Message request;
        while (request.bytes.empty()) {
            request = Receive(session.port.get());
        }
        Send(session.port.get(), SimpleReply(kSetTokenId, 0));
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), "a"), LF_MOBILE_HELPER_SUCCESS);
}

TEST_F(LinefoldHelperTest, LeavesNoDescriptorOpenAcrossExec) {
    service.play([](Service& self) { (void)self.checkIn(); });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_SUCCESS);
    service.finish();
    for (int number = 3; number < 64; ++number) {
        const int flags = fcntl(number, F_GETFD);
        const bool isSocket = fcntl(number, F_GETFL) >= 0 && [number] {
            struct stat status {};
            return fstat(number, &status) == 0 && S_ISSOCK(status.st_mode);
        }();
        EXPECT_TRUE(flags < 0 || !isSocket || (flags & FD_CLOEXEC) != 0) << number;
    }
}

// ---- Forged replies: each is refused, ends the connection and leaves no descriptor behind
// --------

struct Forgery {
    std::string name;
    std::function<Bytes(Bytes)> forge;
    std::function<std::vector<Descriptor>()> beside;
};

std::vector<Descriptor> NothingBeside() {
    return {};
}

std::vector<Descriptor> List(Descriptor one) {
    std::vector<Descriptor> list;
    list.push_back(std::move(one));
    return list;
}

std::vector<Descriptor> OneFile() {
    return List(MemoryFile(Bytes(100'000)));
}

std::vector<Descriptor> ThreeFiles() {
    auto list = OneFile();
    list.push_back(MemoryFile(Bytes(100'000)));
    list.push_back(MemoryFile(Bytes(100'000)));
    return list;
}

template <typename T>
std::function<Bytes(Bytes)> With(std::size_t offset, T value) {
    return [offset, value](Bytes bytes) {
        Put(bytes, offset, value);
        return bytes;
    };
}

std::function<Bytes(Bytes)> Resized(std::size_t size) {
    return [size](Bytes bytes) {
        bytes.resize(size);
        return bytes;
    };
}

Bytes AsItIs(Bytes bytes) {
    return bytes;
}

void SendBeside(int connection, const Bytes& bytes, const std::vector<Descriptor>& beside) {
    std::vector<int> numbers;
    for (const Descriptor& descriptor : beside) {
        numbers.push_back(descriptor.get());
    }
    Send(connection, bytes, numbers);
}

using CallUnderTest = std::function<std::int32_t(LFMobileHelper*)>;

std::int32_t ResultOfForgedReply(const Forgery& forgery,
                                 const Bytes& honest,
                                 const CallUnderTest& call) {
    Service service;
    service.play([&](Service& self) {
        const Session session = self.checkIn();
        (void)Receive(session.port.get());
        SendBeside(session.port.get(), forgery.forge(honest), forgery.beside());
        EXPECT_TRUE(HasEnded(session.watch.get()));
    });
    const auto client = ClientOf(service);
    return call(client.get());
}

std::string NameOfForgery(const testing::TestParamInfo<Forgery>& info) {
    return info.param.name;
}

class ForgedSimpleReply : public testing::TestWithParam<Forgery> {};

TEST_P(ForgedSimpleReply, IsRefused) {
    const std::size_t before = OpenDescriptors();
    std::int32_t value = 5;
    const auto result = ResultOfForgedReply(
        GetParam(), SimpleReply(kIsSubscribedId, 0, 40), [&value](LFMobileHelper* helper) {
            return LFMobileHelperIsVoicemailSubscribed(helper, &value);
        });
    EXPECT_EQ(result, LF_MOBILE_HELPER_ERROR_INVALID_REPLY);
    EXPECT_EQ(value, 0);
    EXPECT_EQ(OpenDescriptors(), before);
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Forgeries, ForgedSimpleReply, testing::Values(
    Forgery{"IdOfTheRequest", With<std::int32_t>(20, kIsSubscribedId), NothingBeside},
    Forgery{"IdOfAnotherReply", With<std::int32_t>(20, kIsSubscribedId + 101), NothingBeside},
    Forgery{"ComplexBit", With<std::uint32_t>(0, 0x80000000), NothingBeside},
    Forgery{"OtherBits", With<std::uint32_t>(0, 1), NothingBeside},
    Forgery{"SizeOneMore", With<std::uint32_t>(4, 41), NothingBeside},
    Forgery{"SizeHuge", With<std::uint32_t>(4, 0xFFFFFFFF), NothingBeside},
    Forgery{"RemotePort", With<std::uint32_t>(8, 1), NothingBeside},
    Forgery{"LocalPort", With<std::uint32_t>(12, 1), NothingBeside},
    Forgery{"VoucherPort", With<std::uint32_t>(16, 1), NothingBeside},
    Forgery{"NdrRecord", With<std::uint32_t>(28, 0x01000000), NothingBeside},
    Forgery{"OneByte", Resized(1), NothingBeside},
    Forgery{"LessThanAHeader", Resized(23), NothingBeside},
    Forgery{"HeaderOnly", Resized(24), NothingBeside},
    Forgery{"OneByteShort", Resized(39), NothingBeside},
    Forgery{"OneByteLong", Resized(41), NothingBeside},
    Forgery{"LongerThanTheBuffer", Resized(100'000), NothingBeside},
    Forgery{"ErrorOfFullSize", With<std::int32_t>(32, 5), NothingBeside},
    Forgery{"SuccessWithoutValue", [](Bytes) { return SimpleReply(kIsSubscribedId, 0, 36); }, NothingBeside},
    Forgery{"BulkReply", [](Bytes) { return BulkReply(kIsSubscribedId, 0); }, NothingBeside},
    Forgery{"OneDescriptor", AsItIs, OneFile},
    Forgery{"ThreeDescriptors", AsItIs, ThreeFiles}), NameOfForgery);

// clang-format on

class ForgedBulkReply : public testing::TestWithParam<Forgery> {};

TEST_P(ForgedBulkReply, IsRefused) {
    const std::size_t before = OpenDescriptors();
    void* data = &data;
    std::size_t size = 5;
    const auto result = ResultOfForgedReply(
        GetParam(), BulkReply(kCopyPreferenceId, 4, {1, 2, 3, 4}), [&](LFMobileHelper* helper) {
            return LFMobileHelperCopyPreferenceValue(helper, "domain", "key", &data, &size);
        });
    EXPECT_EQ(result, LF_MOBILE_HELPER_ERROR_INVALID_REPLY);
    EXPECT_EQ(data, nullptr);
    EXPECT_EQ(size, 0U);
    EXPECT_EQ(OpenDescriptors(), before);
}

Bytes BulkOf(std::uint32_t size) {
    return BulkReply(kCopyPreferenceId, size);
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Forgeries, ForgedBulkReply, testing::Values(
    Forgery{"Id", With<std::int32_t>(20, kCopyPreferenceId + 101), NothingBeside},
    Forgery{"NotComplex", With<std::uint32_t>(0, 0), NothingBeside},
    Forgery{"SizeWithTheData", With<std::uint32_t>(4, 60), NothingBeside},
    Forgery{"NoDescriptorCounted", With<std::uint32_t>(24, 0), NothingBeside},
    Forgery{"TwoDescriptorsCounted", With<std::uint32_t>(24, 2), NothingBeside},
    Forgery{"PortDescriptor", With<std::uint8_t>(39, 0), NothingBeside},
    Forgery{"NotDeallocated", With<std::uint8_t>(36, 0), NothingBeside},
    Forgery{"SizeOneMore", With<std::uint32_t>(40, 5), NothingBeside},
    Forgery{"CountOneMore", With<std::uint32_t>(52, 5), NothingBeside},
    Forgery{"BothOneMore", [](Bytes) { return BulkReply(kCopyPreferenceId, 5, {1, 2, 3, 4}); }, NothingBeside},
    Forgery{"BothOneLess", [](Bytes) { return BulkReply(kCopyPreferenceId, 3, {1, 2, 3, 4}); }, NothingBeside},
    Forgery{"NdrRecord", With<std::uint32_t>(44, 1), NothingBeside},
    Forgery{"CutInTheDescriptor", Resized(42), NothingBeside},
    Forgery{"CutBeforeTheCount", Resized(55), NothingBeside},
    Forgery{"DataMissing", Resized(56), NothingBeside},
    Forgery{"SimpleSuccess", [](Bytes) { return SimpleReply(kCopyPreferenceId, 0, 56); }, NothingBeside},
    Forgery{"LargeWithoutFile", [](Bytes) { return BulkOf(65'537); }, NothingBeside},
    Forgery{"LargeBehindTheMessage", [](Bytes) { return BulkReply(kCopyPreferenceId, 65'537, Bytes(65'537)); }, NothingBeside},
    Forgery{"HugeWithoutFile", [](Bytes) { return BulkOf(0xFFFFFFFF); }, NothingBeside},
    Forgery{"FileAndDataBehind", AsItIs, OneFile},
    Forgery{"FileForNothing", [](Bytes) { return BulkOf(0); }, OneFile},
    Forgery{"FileOneByteShort", [](Bytes) { return BulkOf(100'001); }, OneFile},
    Forgery{"FileAboveTheLimit", [](Bytes) { return BulkOf((64U << 20) + 1); }, OneFile},
    Forgery{"ThreeFiles", [](Bytes) { return BulkOf(100'000); }, ThreeFiles},
    Forgery{"FileWithoutSeals", [](Bytes) { return BulkOf(100'000); },
            [] { return List(MemoryFile(Bytes(100'000), Seals::kNone)); }},
    Forgery{"FileThatCanShrink", [](Bytes) { return BulkOf(100'000); },
            [] { return List(MemoryFile(Bytes(100'000), Seals::kAllButShrink)); }},
    Forgery{"SocketForAFile", [](Bytes) { return BulkOf(100'000); },
            [] { return List(SocketPair().first); }}), NameOfForgery);

// clang-format on

class ForgedCheckInReply : public testing::TestWithParam<Forgery> {};

TEST_P(ForgedCheckInReply, IsRefusedAndNotTriedAgain) {
    const std::size_t before = OpenDescriptors();
    {
        Service service;
        service.play([](Service& self) {
            const Descriptor connection = self.accept();
            const Message request = Receive(connection.get());
            SendBeside(connection.get(), GetParam().forge(PortReply()), GetParam().beside());
            EXPECT_TRUE(HasEnded(request.descriptor.get()));
        });
        const auto client = ClientOf(service);
        EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_ERROR_INVALID_REPLY);
    }
    EXPECT_EQ(OpenDescriptors(), before);
}

std::vector<Descriptor> OneSocket() {
    return List(SocketPair().first);
}

std::vector<Descriptor> TwoSockets() {
    auto [first, second] = SocketPair();
    auto list = List(std::move(first));
    list.push_back(std::move(second));
    return list;
}

std::vector<Descriptor> ListeningSocket() {
    Descriptor listener(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    // With the family alone the kernel chooses a name that no file has.
    (void)bind(listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(sa_family_t));
    (void)listen(listener.get(), 1);
    return List(std::move(listener));
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Forgeries, ForgedCheckInReply, testing::Values(
    Forgery{"Id", With<std::int32_t>(20, 4792275), OneSocket},
    Forgery{"NotComplex", With<std::uint32_t>(0, 0), OneSocket},
    Forgery{"Short", Resized(39), OneSocket},
    Forgery{"Long", Resized(41), OneSocket},
    Forgery{"NoDescriptorCounted", With<std::uint32_t>(24, 0), OneSocket},
    Forgery{"Disposition", With<std::uint8_t>(38, 17), OneSocket},
    Forgery{"OutOfLineDescriptor", With<std::uint8_t>(39, 1), OneSocket},
    Forgery{"NoPort", AsItIs, NothingBeside},
    Forgery{"TwoPorts", AsItIs, TwoSockets},
    Forgery{"FileForAPort", AsItIs, OneFile},
    Forgery{"StreamForAPort", AsItIs, [] { return List(SocketPair(SOCK_STREAM).first); }},
    Forgery{"ListenerForAPort", AsItIs, ListeningSocket},
    Forgery{"SimpleSuccess", [](Bytes) { return SimpleReply(4792174, 0); }, NothingBeside},
    Forgery{"LongError", [](Bytes) { return SimpleReply(4792174, 5, 40); }, NothingBeside},
    Forgery{"ErrorWithAPort", [](Bytes) { return SimpleReply(4792174, 5); }, OneSocket}), NameOfForgery);

// clang-format on

TEST_F(LinefoldHelperTest, ConnectsAgainAfterAForgedReply) {
    service.play([](Service& self) {
        Session session = self.checkIn();
        (void)Receive(session.port.get());
        Send(session.port.get(), SimpleReply(kSetTokenId + 1, 0));
        session = self.checkIn();
        (void)Receive(session.port.get());
        Send(session.port.get(), SimpleReply(kSetTokenId, 0));
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), "a"),
              LF_MOBILE_HELPER_ERROR_INVALID_REPLY);
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), "a"), LF_MOBILE_HELPER_SUCCESS);
}

// ---- Connecting, and connecting again ----------------------------------------------------------

TEST_F(LinefoldHelperTest, ReportsAMissingServiceAtOnce) {
    const Client client(LFMobileHelperCreateWithPath("/nonexistent/service"));
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_ERROR_NO_SERVICE);
    EXPECT_EQ(pauseCount, 0);
}

TEST_F(LinefoldHelperTest, GivesUpOnASocketThatNobodyListensOn) {
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_ERROR_NO_SERVICE);
    EXPECT_EQ(pauseCount, 10);
}

TEST_F(LinefoldHelperTest, ConnectsAgainAfterARefusal) {
    onPause = [this](int number) {
        if (number == 3) {
            service.play([](Service& self) { (void)self.checkIn(); });
        }
    };
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_SUCCESS);
    EXPECT_EQ(pauseCount, 3);
}

TEST_F(LinefoldHelperTest, ConnectsAgainAfterTheEndOfFile) {
    service.play([](Service& self) {
        {
            const Descriptor connection = self.accept();
            (void)Receive(connection.get());
        }
        (void)self.checkIn();
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_SUCCESS);
    EXPECT_EQ(pauseCount, 1);
}

TEST_F(LinefoldHelperTest, ConnectsAgainAfterAReset) {
    service.play([](Service& self) {
        {
            // Closing with the request unread is what resets the connection.
            const Descriptor connection = self.accept();
            std::uint8_t peeked = 0;
            (void)recv(connection.get(), &peeked, sizeof peeked, MSG_PEEK);
        }
        (void)self.checkIn();
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_SUCCESS);
    EXPECT_EQ(pauseCount, 1);
}

TEST_F(LinefoldHelperTest, ChecksInAnewForARequestThatCouldNotBeDelivered) {
    std::promise<void> firstPortIsClosed;
    service.play([&firstPortIsClosed](Service& self) {
        (void)self.checkIn();
        firstPortIsClosed.set_value();
        const Session session = self.checkIn();
        EXPECT_EQ(Get<std::int32_t>(Receive(session.port.get()).bytes, 20), kSetTokenId);
        Send(session.port.get(), SimpleReply(kSetTokenId, 0));
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_SUCCESS);
    firstPortIsClosed.get_future().wait();
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), "a"), LF_MOBILE_HELPER_SUCCESS);
}

TEST_F(LinefoldHelperTest, DoesNotRepeatARequestWhoseReplyWasLost) {
    int requests = 0;
    service.play([&requests](Service& self) {
        for (const std::int32_t lastReply : {0, 1}) {
            const Session session = self.checkIn();
            requests += Receive(session.port.get()).bytes.empty() ? 0 : 1;
            if (lastReply == 1) {
                Send(session.port.get(), SimpleReply(kSetTokenId, 0));
            }
        }
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), "a"),
              LF_MOBILE_HELPER_ERROR_CONNECTION_LOST);
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), "b"), LF_MOBILE_HELPER_SUCCESS);
    service.finish();
    EXPECT_EQ(requests, 2);
}

TEST_F(LinefoldHelperTest, DoesNotRepeatARequestThatDiedUnread) {
    service.play([](Service& self) {
        const Session session = self.checkIn();
        std::uint8_t peeked = 0;
        (void)recv(session.port.get(), &peeked, sizeof peeked, MSG_PEEK);
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), "a"),
              LF_MOBILE_HELPER_ERROR_CONNECTION_LOST);
}

TEST_F(LinefoldHelperTest, RefusesAFileThatIsNoSocket) {
    const std::string path = std::string(service.path()) + "-file";
    Descriptor(open(path.c_str(), O_CREAT | O_CLOEXEC | O_WRONLY, 0600)).reset();
    const Client client(LFMobileHelperCreateWithPath(path.c_str()));
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_ERROR_NOT_A_SERVICE);
    EXPECT_EQ(unlink(path.c_str()), 0);
}

TEST_F(LinefoldHelperTest, RefusesASocketOfAnotherKind) {
    const std::string path = std::string(service.path()) + "-stream";
    const Descriptor stream(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.c_str(), path.size());
    EXPECT_EQ(bind(stream.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(listen(stream.get(), 1), 0);
    const Client client(LFMobileHelperCreateWithPath(path.c_str()));
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_ERROR_NOT_A_SERVICE);
    EXPECT_EQ(unlink(path.c_str()), 0);
}

TEST_F(LinefoldHelperTest, TellsAPathThatIsTooLongFromAMissingService) {
    const Client longest(LFMobileHelperCreateWithPath(("/" + std::string(106, 'n')).c_str()));
    EXPECT_EQ(LFMobileHelperCheckIn(longest.get()), LF_MOBILE_HELPER_ERROR_NO_SERVICE);
    const Client tooLong(LFMobileHelperCreateWithPath(("/" + std::string(107, 'n')).c_str()));
    EXPECT_EQ(LFMobileHelperCheckIn(tooLong.get()), LF_MOBILE_HELPER_ERROR_PATH_TOO_LONG);
}

// ---- Arguments ---------------------------------------------------------------------------------

TEST_F(LinefoldHelperTest, SendsNothingForATextThatIsTooLong) {
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), std::string(257, 'x').c_str()),
              LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG);
    EXPECT_EQ(
        LFMobileHelperLinkCarrierBundle(client.get(), "a", "b", std::string(1025, 'x').c_str()),
        LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG);
    EXPECT_EQ(LFMobileHelperCreateSymlink(client.get(), std::string(1025, 'x').c_str(), "b"),
              LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG);
    // Nobody listens: a connection would have been refused and tried again.
    EXPECT_EQ(pauseCount, 0);
}

TEST_F(LinefoldHelperTest, SendsNothingForAMissingArgument) {
    const auto client = ClientOf(service);
    std::size_t size = 1;
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), nullptr),
              LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT);
    EXPECT_EQ(LFMobileHelperCopyVoicemailToken(client.get(), nullptr),
              LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT);
    EXPECT_EQ(LFMobileHelperIsVoicemailSubscribed(client.get(), nullptr),
              LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT);
    EXPECT_EQ(LFMobileHelperCopyPreferenceValue(client.get(), "d", "k", nullptr, &size),
              LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT);
    EXPECT_EQ(LFMobileHelperSetPreferenceValue(client.get(), "d", "k", nullptr, 1),
              LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT);
    EXPECT_EQ(size, 0U);
    EXPECT_EQ(pauseCount, 0);
}

TEST_F(LinefoldHelperTest, SendsNothingForAValueAboveTheLimit) {
    const auto client = ClientOf(service);
    const Bytes value(LF_MOBILE_HELPER_MAX_VALUE_SIZE + 1);
    EXPECT_EQ(LFMobileHelperSetPreferenceValue(client.get(), "d", "k", value.data(), value.size()),
              LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG);
    EXPECT_EQ(pauseCount, 0);
}

// ---- Out values and bulk data ------------------------------------------------------------------

/// Plays one client that sends one request and is answered with `reply`.
void Answer(Service& service, const Bytes& reply, const std::vector<int>& descriptors = {}) {
    service.play([reply, descriptors](Service& self) {
        const Session session = self.checkIn();
        (void)Receive(session.port.get());
        Send(session.port.get(), reply, descriptors);
    });
}

TEST_F(LinefoldHelperTest, EndsATextThatFillsItsField) {
    Bytes reply = SimpleReply(kCopyTokenId, 0, 292);
    std::fill(reply.begin() + 36, reply.end(), std::uint8_t{'t'});
    Answer(service, reply);
    const auto client = ClientOf(service);
    std::array<char, LF_MOBILE_HELPER_TOKEN_SIZE> token{};
    token.back() = 'x';
    EXPECT_EQ(LFMobileHelperCopyVoicemailToken(client.get(), token.data()),
              LF_MOBILE_HELPER_SUCCESS);
    EXPECT_EQ(std::string(token.data()), std::string(256, 't'));
}

TEST_F(LinefoldHelperTest, CopiesACountryCode) {
    Bytes reply = SimpleReply(8683568, 0, 100);
    Put<std::uint16_t>(reply, 36, 0x4544);
    Answer(service, reply);
    const auto client = ClientOf(service);
    std::array<char, LF_MOBILE_HELPER_COUNTRY_CODE_SIZE> code{};
    EXPECT_EQ(LFMobileHelperCopyCountryCode(client.get(), code.data()), LF_MOBILE_HELPER_SUCCESS);
    EXPECT_STREQ(code.data(), "DE");
}

TEST_F(LinefoldHelperTest, CopiesANumber) {
    Bytes reply = SimpleReply(kIsSubscribedId, 0, 40);
    Put<std::int32_t>(reply, 36, -2);
    Answer(service, reply);
    const auto client = ClientOf(service);
    std::int32_t number = 0;
    EXPECT_EQ(LFMobileHelperIsVoicemailSubscribed(client.get(), &number), LF_MOBILE_HELPER_SUCCESS);
    EXPECT_EQ(number, -2);
}

TEST_F(LinefoldHelperTest, EmptiesOutValuesOfAFailure) {
    Answer(service, SimpleReply(kCopyTokenId, 5));
    const auto client = ClientOf(service);
    std::array<char, LF_MOBILE_HELPER_TOKEN_SIZE> token{'x', 'y'};
    EXPECT_EQ(LFMobileHelperCopyVoicemailToken(client.get(), token.data()),
              LF_MOBILE_HELPER_FAILURE);
    EXPECT_STREQ(token.data(), "");
}

Bytes Pattern(std::size_t size) {
    Bytes bytes(size);
    for (std::size_t i = 0; i < size; ++i) {
        bytes[i] = static_cast<std::uint8_t>(i * 31 + (i >> 8));
    }
    return bytes;
}

void ExpectCopy(Service& service, const Bytes& expected) {
    const auto client = ClientOf(service);
    void* data = nullptr;
    std::size_t size = 0;
    EXPECT_EQ(LFMobileHelperCopyPreferenceValue(client.get(), "d", "k", &data, &size),
              LF_MOBILE_HELPER_SUCCESS);
    const auto* const bytes = static_cast<const std::uint8_t*>(data);
    EXPECT_TRUE(bytes != nullptr && Bytes(bytes, bytes + size) == expected);
    LFMobileHelperFree(data);
}

class BulkData : public testing::TestWithParam<std::size_t> {};

TEST_P(BulkData, IsCopiedOutOfAReply) {
    const Bytes value = Pattern(GetParam());
    const auto size = static_cast<std::uint32_t>(value.size());
    const bool isInline = size <= 65'536;
    const Descriptor file = MemoryFile(value);
    Service service;
    Answer(service,
           BulkReply(kCopyPreferenceId, size, isInline ? value : Bytes{}),
           isInline ? std::vector<int>{} : std::vector<int>{file.get()});
    ExpectCopy(service, value);
}

TEST_P(BulkData, IsCopiedOutOfAFileThatIsLongerThanAnnounced) {
    const Bytes value = Pattern(GetParam());
    Bytes longer = value;
    longer.push_back(1);
    const Descriptor file = MemoryFile(longer);
    Service service;
    Answer(service,
           BulkReply(kCopyPreferenceId, static_cast<std::uint32_t>(value.size())),
           {file.get()});
    ExpectCopy(service, value);
}

TEST_P(BulkData, TravelsWithARequest) {
    const Bytes value = Pattern(GetParam());
    Message request;
    Service service;
    service.play([&request](Service& self) {
        const Session session = self.checkIn();
        request = Receive(session.port.get());
        Send(session.port.get(), SimpleReply(kSetPreferenceId, 0));
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperSetPreferenceValue(client.get(), "d", "k", value.data(), value.size()),
              LF_MOBILE_HELPER_SUCCESS);
    service.finish();
    EXPECT_EQ(Get<std::uint32_t>(request.bytes, 40), value.size());
    EXPECT_EQ(Get<std::uint32_t>(request.bytes, 564), value.size());
    Bytes arrived(request.bytes.begin() + 568, request.bytes.end());
    if (value.size() > 65'536) {
        EXPECT_TRUE(arrived.empty());
        EXPECT_EQ(fcntl(request.descriptor.get(), F_GET_SEALS) &
                      (F_SEAL_WRITE | F_SEAL_GROW | F_SEAL_SHRINK),
                  F_SEAL_WRITE | F_SEAL_GROW | F_SEAL_SHRINK);
        arrived.resize(value.size() + 1);
        arrived.resize(static_cast<std::size_t>(std::max<ssize_t>(
            0, pread(request.descriptor.get(), arrived.data(), arrived.size(), 0))));
    }
    EXPECT_EQ(request.descriptor.isOpen(), value.size() > 65'536);
    EXPECT_TRUE(arrived == value);
}

INSTANTIATE_TEST_SUITE_P(Sizes,
                         BulkData,
                         testing::Values(1, 65'535, 65'536, 65'537, 16U << 20),
                         testing::PrintToStringParamName());

TEST_F(LinefoldHelperTest, SendsAnEmptyValueWithNothingBeside) {
    Message request;
    service.play([&request](Service& self) {
        const Session session = self.checkIn();
        request = Receive(session.port.get());
        Send(session.port.get(), SimpleReply(kSetPreferenceId, 0));
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperSetPreferenceValue(client.get(), "d", "k", nullptr, 0),
              LF_MOBILE_HELPER_SUCCESS);
    service.finish();
    EXPECT_EQ(request.bytes.size(), 568U);
    EXPECT_FALSE(request.descriptor.isOpen());
}

TEST_F(LinefoldHelperTest, TellsAnAbsentValueByANullPointer) {
    Answer(service, BulkReply(kCopyPreferenceId, 0));
    const auto client = ClientOf(service);
    void* data = &data;
    std::size_t size = 7;
    EXPECT_EQ(LFMobileHelperCopyPreferenceValue(client.get(), "d", "k", &data, &size),
              LF_MOBILE_HELPER_SUCCESS);
    EXPECT_EQ(data, nullptr);
    EXPECT_EQ(size, 0U);
    LFMobileHelperFree(data);
}

// ---- Threads, signals, processes ---------------------------------------------------------------

TEST_F(LinefoldHelperTest, ServesEightThreadsOnOneHandle) {
    constexpr int kThreads = 8;
    constexpr int kCalls = 200;
    service.play([](Service& self) {
        const Session session = self.checkIn();
        for (int i = 0; i < kThreads * kCalls; ++i) {
            // Gives back the text that it was asked for, so a mixed-up reply shows.
            const Message request = Receive(session.port.get());
            Bytes reply = SimpleReply(8683553, 0, 292);
            std::copy_n(request.bytes.begin() + 32, 256, reply.begin() + 36);
            Send(session.port.get(), reply);
        }
    });
    const auto client = ClientOf(service);
    std::atomic<int> correct{0};
    std::vector<std::thread> threads;
    for (int number = 0; number < kThreads; ++number) {
        threads.emplace_back([&client, &correct, key = "key " + std::to_string(number)] {
            std::array<char, LF_MOBILE_HELPER_TOKEN_SIZE> token{};
            for (int i = 0; i < kCalls; ++i) {
                const auto code =
                    LFMobileHelperCopyVoicemailTokenForKey(client.get(), key.c_str(), token.data());
                correct += code == LF_MOBILE_HELPER_SUCCESS && key == token.data() ? 1 : 0;
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(correct, kThreads * kCalls);
}

TEST_F(LinefoldHelperTest, IsNotInterruptedBySignals) {
    struct sigaction ignoring {};

    ignoring.sa_handler = [](int) {};

    struct sigaction before {};

    ASSERT_EQ(sigaction(SIGUSR1, &ignoring, &before), 0);
    service.play([caller = pthread_self()](Service& self) {
        const Session session = self.checkIn();
        (void)Receive(session.port.get());
        for (int i = 0; i < 100; ++i) {
            (void)pthread_kill(caller, SIGUSR1);
        }
        Send(session.port.get(), SimpleReply(kSetTokenId, 0));
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperSetVoicemailToken(client.get(), "a"), LF_MOBILE_HELPER_SUCCESS);
    service.finish();
    EXPECT_EQ(sigaction(SIGUSR1, &before, nullptr), 0);
}

TEST_F(LinefoldHelperTest, ConnectsAnewInAForkedChild) {
    service.play([](Service& self) {
        const Session fromParent = self.checkIn();
        const Session fromChild = self.checkIn();
        EXPECT_EQ(Get<std::uint8_t>(Receive(fromChild.port.get()).bytes, 32), 'c');
        Send(fromChild.port.get(), SimpleReply(kSetTokenId, 7));
    });
    const auto client = ClientOf(service);
    EXPECT_EQ(LFMobileHelperCheckIn(client.get()), LF_MOBILE_HELPER_SUCCESS);
    const pid_t child = fork();
    if (child == 0) {
        // The child has copies of the script's descriptors, so it would see no end of them.
        (void)alarm(20);
        _exit(LFMobileHelperSetVoicemailToken(client.get(), "child") == 7 ? 0 : 1);
    }
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

// ---- Raw messages ------------------------------------------------------------------------------

TEST_F(LinefoldHelperTest, SendsRawBytesBehindAHeader) {
    Message request;
    service.play([&request](Service& self) {
        const Session session = self.checkIn();
        request = Receive(session.port.get());
        Send(session.port.get(), {1, 2, 3});
    });
    const auto client = ClientOf(service);
    const std::array<std::uint8_t, 2> body{0xAB, 0xCD};
    Bytes reply(8);
    std::size_t size = 0;
    EXPECT_EQ(
        LFMobileHelperSendRaw(
            client.get(), -5, body.data(), body.size(), reply.data(), reply.size(), &size, nullptr),
        LF_MOBILE_HELPER_SUCCESS);
    service.finish();
    Bytes expected(24);
    Put<std::uint32_t>(expected, 4, 26);
    Put<std::int32_t>(expected, 20, -5);
    Put<std::uint16_t>(expected, 24, 0xCDAB);
    EXPECT_EQ(request.bytes, expected);
    EXPECT_EQ(size, 3U);
    EXPECT_EQ(reply, (Bytes{1, 2, 3, 0, 0, 0, 0, 0}));
}

TEST_F(LinefoldHelperTest, TellsTheSizeOfARawReplyThatDoesNotFit) {
    Answer(service, Bytes(100, 9));
    const auto client = ClientOf(service);
    Bytes reply(10);
    std::size_t size = 0;
    EXPECT_EQ(LFMobileHelperSendRaw(
                  client.get(), 1, nullptr, 0, reply.data(), reply.size(), &size, nullptr),
              LF_MOBILE_HELPER_ERROR_REPLY_TOO_LARGE);
    EXPECT_EQ(size, 100U);
    EXPECT_EQ(reply, Bytes(10, 9));
}

TEST_F(LinefoldHelperTest, HandsOutTheDescriptorOfARawReply) {
    const Descriptor file = MemoryFile({'d'});
    Answer(service, Bytes(24), {file.get()});
    const auto client = ClientOf(service);
    Bytes reply(24);
    std::size_t size = 0;
    int number = -1;
    const Bytes message(24);
    EXPECT_EQ(LFMobileHelperSendMessage(client.get(),
                                        message.data(),
                                        message.size(),
                                        reply.data(),
                                        reply.size(),
                                        &size,
                                        &number),
              LF_MOBILE_HELPER_SUCCESS);
    const Descriptor received(number);
    char letter = 0;
    EXPECT_EQ(pread(received.get(), &letter, 1, 0), 1);
    EXPECT_EQ(letter, 'd');
}

TEST(LinefoldHelperRaw, ClosesTheDescriptorOfAReplyThatNobodyWants) {
    const Descriptor file = MemoryFile({'d'});
    const std::size_t before = OpenDescriptors();
    {
        Service service;
        Answer(service, Bytes(24), {file.get()});
        const auto client = ClientOf(service);
        std::size_t size = 0;
        EXPECT_EQ(LFMobileHelperSendRaw(client.get(), 1, nullptr, 0, nullptr, 0, &size, nullptr),
                  LF_MOBILE_HELPER_ERROR_REPLY_TOO_LARGE);
    }
    EXPECT_EQ(OpenDescriptors(), before);
}

TEST_F(LinefoldHelperTest, RefusesARawMessageThatNoBufferHolds) {
    service.play([](Service& self) { EXPECT_TRUE(HasEnded(self.checkIn().port.get())); });
    const Bytes huge(16U << 20);
    std::size_t size = 0;
    {
        const auto client = ClientOf(service);
        EXPECT_EQ(LFMobileHelperSendRaw(
                      client.get(), 1, huge.data(), huge.size(), nullptr, 0, &size, nullptr),
                  LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG);
    }
}

TEST_F(LinefoldHelperTest, RefusesHolesInRawMessages) {
    const auto client = ClientOf(service);
    std::size_t size = 3;
    EXPECT_EQ(LFMobileHelperSendRaw(client.get(), 1, nullptr, 1, nullptr, 0, &size, nullptr),
              LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT);
    EXPECT_EQ(LFMobileHelperSendRaw(client.get(), 1, nullptr, 0, nullptr, 1, &size, nullptr),
              LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT);
    EXPECT_EQ(LFMobileHelperSendMessage(client.get(), nullptr, 0, nullptr, 0, nullptr, nullptr),
              LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT);
    EXPECT_EQ(size, 0U);
}

// ---- Codes, and the header in C ----------------------------------------------------------------

TEST(LinefoldHelperCodes, AllHaveANameAndAMeaning) {
    for (const std::int32_t code :
         {0,          3,          5,          6,          8,          9,          35,
          -300,       -303,       -304,       -309,       0x10000002, 0x10000003, 0x10000004,
          0x10000005, 0x1000000a, 0x1000000d, 0x10000010, 0x10004004, 0x10004008, 0x10004009}) {
        EXPECT_STRNE(LFMobileHelperErrorName(code), "UNKNOWN") << code;
        EXPECT_STRNE(LFMobileHelperErrorString(code), LFMobileHelperErrorString(1)) << code;
    }
}

TEST(LinefoldHelperCodes, UnknownOnesAreSaidToBe) {
    EXPECT_STREQ(LFMobileHelperErrorName(1), "UNKNOWN");
    EXPECT_STREQ(LFMobileHelperErrorString(1), "a code that is not documented");
}

TEST(LinefoldHelperFromC, ServesACProgram) {
    EXPECT_STREQ(LFTestErrorNameFromC(LF_MOBILE_HELPER_NOT_ENTITLED), "NOT_ENTITLED");
    EXPECT_EQ(LFTestCallFromC(), LF_MOBILE_HELPER_ERROR_NO_SERVICE);
}

TEST(LinefoldHelperHandle, NullIsHarmlessToDestroyAndFree) {
    LFMobileHelperDestroy(nullptr);
    LFMobileHelperFree(nullptr);
    EXPECT_EQ(LFMobileHelperCheckIn(nullptr), LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT);
}

}  // namespace
