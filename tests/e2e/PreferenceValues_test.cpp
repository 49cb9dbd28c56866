// Routines 6, 7 and 8 through the real daemon, on real files, with both logs read back.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <thread>

#include "platform/PropertyList.h"
#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

using phone::Carriage;
using platform::PropertyList;
using Lines = std::vector<std::string>;

constexpr std::int32_t kCopy = 8683556;
constexpr std::int32_t kCopyApp = 8683557;
constexpr std::int32_t kLinkCarrierBundle = 8683558;
constexpr std::int32_t kRemovePreferenceDomain = 8683560;
constexpr const char* kDomain = "com.vendra.test";
constexpr std::size_t kMostData = 16U << 20;

std::string Text(const std::optional<std::vector<std::byte>>& data) {
    return {reinterpret_cast<const char*>(data.value().data()), data->size()};
}

std::string Xml(const PropertyList& value) {
    return Text(PropertyListCreateXmlData(value));
}

std::string Binary(const PropertyList& value) {
    return Text(PropertyListCreateBinaryData(value));
}

std::optional<PropertyList> Parse(const std::string& text) {
    return platform::PropertyListCreateWithData(std::as_bytes(std::span(text)));
}

std::string Read(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

std::string Repeat(std::string_view text, std::size_t times) {
    std::string repeated;
    repeated.reserve(text.size() * times);
    for (std::size_t i = 0; i < times; ++i) {
        repeated += text;
    }
    return repeated;
}

/// One value of every kind, and what is hard to keep.
PropertyList EveryKind() {
    return PropertyList(PropertyList::Dictionary{
        {"text", PropertyList("Grüße \xF0\x9F\x93\xB1 <&>\r\n")},
        {"<markup>&", PropertyList("")},
        {"data", PropertyList(PropertyList::Data{std::byte{0}, std::byte{255}})},
        {"date", PropertyList(PropertyList::Date{-1})},
        {"integer", PropertyList(std::numeric_limits<std::int64_t>::min())},
        {"real", PropertyList(0.1 + 0.2)},
        {"true", PropertyList(true)},
        {"array",
         PropertyList(PropertyList::Array{
             PropertyList(false), PropertyList(), PropertyList(PropertyList::Array())})}});
}

class PreferenceValues : public testing::Test {
protected:
    PreferenceValues() {
        phone::ResetMobileHome();
        fs::remove_all("/Library/Preferences");
        fs::create_directories("/Library/Preferences");
    }

    [[nodiscard]] static std::string fileOf(std::string_view domain) {
        return std::string(phone::kMobileLibrary) + "/Preferences/" + std::string(domain) +
               ".plist";
    }

    [[nodiscard]] std::int32_t set(std::string_view value, std::string_view key = "key") const {
        return client_.setPreference(kDomain, key, value);
    }

    [[nodiscard]] phone::CopiedData copy(std::string_view key = "key") const {
        return client_.copyPreference(kCopy, kDomain, key);
    }

    /// Peak of the daemon's memory so far, in MiB.
    [[nodiscard]] std::size_t peakMemory() const { return memory("VmHWM:"); }

    [[nodiscard]] std::size_t memory(const std::string& name) const {
        std::ifstream status("/proc/" + std::to_string(daemon_.pid()) + "/status");
        for (std::string word; status >> word;) {
            if (word == name) {
                std::size_t kib = 0;
                status >> kib;
                return kib >> 10;
            }
        }
        return 0;
    }

    phone::Daemon daemon_;
    phone::Client client_ = phone::Client::checkIn();
    phone::LogReader journal_ = phone::LogReader::journal();
    phone::LogReader systemLog_ = phone::LogReader::systemLog();
};

TEST_F(PreferenceValues, OfEveryKindComeBackAsTheyWere) {
    const PropertyList value = EveryKind();
    for (const std::string& form : {Xml(value), Binary(value)}) {
        for (const Carriage carriage : {Carriage::kInline, Carriage::kMemoryFile}) {
            ASSERT_EQ(client_.setPreference(kDomain, "key", form, carriage), 0);
            EXPECT_EQ(Parse(Read(fileOf(kDomain))),
                      PropertyList(PropertyList::Dictionary{{"key", value}}));
            const auto copied = copy();
            EXPECT_TRUE(copied.isWellFormed);
            EXPECT_EQ(copied.data, Xml(value));
        }
    }
}

TEST_F(PreferenceValues, OfAnySizeTravel) {
    const std::size_t around = Xml(PropertyList("")).size();
    const std::size_t inDomain =
        Xml(PropertyList(PropertyList::Dictionary{{"key", PropertyList("")}})).size();
    for (const std::size_t size : {std::size_t{1},
                                   65'536 - around,
                                   65'537 - around,
                                   std::size_t{1} << 20,
                                   kMostData - inDomain}) {
        const std::string value = Xml(PropertyList(std::string(size, 'x')));
        ASSERT_EQ(set(value), 0);
        const auto copied = copy();
        EXPECT_TRUE(copied.isWellFormed) << size;
        EXPECT_EQ(copied.data.size(), value.size());
        EXPECT_TRUE(copied.data == value);
        EXPECT_EQ(copied.carriage == Carriage::kMemoryFile, value.size() > 65'536);
    }
}

TEST_F(PreferenceValues, OfTheLargestSizeReplaceEachOther) {
    const std::size_t inDomain =
        Xml(PropertyList(PropertyList::Dictionary{{"key", PropertyList("")}})).size();
    for (const char fill : {'a', 'b'}) {
        const std::string value = Xml(PropertyList(std::string(kMostData - inDomain, fill)));
        ASSERT_EQ(set(value), 0);
        EXPECT_TRUE(copy().data == value);
    }
    EXPECT_LT(peakMemory(), 72U) << "the request, its value, the file and its value, 16 MiB each";
}

TEST_F(PreferenceValues, BeyondTheLargestFileChangeNothing) {
    ASSERT_EQ(set(Xml(PropertyList("old"))), 0);
    EXPECT_EQ(set(Xml(PropertyList(std::string(kMostData - Xml(PropertyList("")).size(), 'x')))), 0)
        << "what synchronising says is not in the reply";
    EXPECT_EQ(copy().data, Xml(PropertyList("old")));
    EXPECT_EQ(journal_.take(),
              Lines{"3 platform preferences: /var/mobile/Library/Preferences/com.vendra.test.plist "
                    "cannot be written: it would hold more than 16 MiB or 200,000 objects, or "
                    "characters that XML "
                    "cannot hold"});
    EXPECT_EQ(set(std::string(kMostData + 1, 'x')), 6);
}

TEST_F(PreferenceValues, AreRemovedByOneByteWhateverItIs) {
    for (int byte = 0; byte < 256; byte += 51) {
        ASSERT_EQ(set(Xml(PropertyList(true))), 0);
        ASSERT_EQ(set(Xml(PropertyList(true)), "other"), 0);
        EXPECT_EQ(set(std::string(1, static_cast<char>(byte))), 0);
        EXPECT_EQ(copy().data, "");
        EXPECT_EQ(copy("other").data, Xml(PropertyList(true)));
    }
    EXPECT_EQ(client_.setPreference(kDomain, "other", "x", Carriage::kMemoryFile), 0);
    EXPECT_EQ(Parse(Read(fileOf(kDomain))), PropertyList());
}

TEST_F(PreferenceValues, ThatAreAbsentAreAnEmptyReply) {
    const auto copied = copy("absent");
    EXPECT_EQ(copied.code, 0);
    EXPECT_TRUE(copied.isWellFormed);
    EXPECT_EQ(copied.data, "");
    EXPECT_EQ(set("x", "absent"), 0) << "and may be removed";
    EXPECT_FALSE(fs::exists(fileOf(kDomain)));
    EXPECT_EQ(systemLog_.take(), Lines{});
}

TEST_F(PreferenceValues, AreLoggedByTheirLength) {
    const std::string value = Xml(PropertyList("value"));
    const std::string length = std::to_string(value.size());
    ASSERT_EQ(set(value), 0);
    EXPECT_EQ(systemLog_.take(), Lines{});
    EXPECT_EQ(copy().data, value);
    EXPECT_EQ(systemLog_.take(), Lines{"3 3 VM_ALLOCATE " + length + "l (mhs1)\\n"});
    EXPECT_EQ(client_.copyPreference(kCopyApp, kDomain, "key").data, value);
    EXPECT_EQ(systemLog_.take(), Lines{"3 3 VM_ALLOCATE " + length + "l (mhs2)\\n"});
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(PreferenceValues, OfOtherProcessesAreSeen) {
    for (const char* text : {"one", "two"}) {
        std::ofstream(fileOf(kDomain))
            << Xml(PropertyList(PropertyList::Dictionary{{"key", PropertyList(text)}}));
        EXPECT_EQ(copy().data, Xml(PropertyList(text)));
    }
}

TEST_F(PreferenceValues, OfApplicationsAreSearchedInFourPlaces) {
    EXPECT_TRUE(client_.copyPreference(kCopyApp, kDomain, "key").isWellFormed);
    for (const std::string& place : {std::string("/Library/Preferences/.GlobalPreferences.plist"),
                                     std::string("/Library/Preferences/com.vendra.test.plist"),
                                     fileOf(".GlobalPreferences"),
                                     fileOf(kDomain)}) {
        const PropertyList value(place);
        std::ofstream(place) << Xml(PropertyList(PropertyList::Dictionary{{"key", value}}));
        EXPECT_EQ(client_.copyPreference(kCopyApp, kDomain, "key").data, Xml(value));
    }
    ASSERT_EQ(set("x"), 0);
    EXPECT_EQ(copy().data, "") << "routine 7 looks at the domain alone";
    EXPECT_EQ(client_.copyPreference(kCopyApp, kDomain, "key").data,
              Xml(PropertyList(fileOf(".GlobalPreferences"))));
}

TEST_F(PreferenceValues, FollowTheCarrierBundleThatALinkSelects) {
    const std::string link = fileOf("com.vendra.carrier");
    for (const char* bundle : {"one", "two"}) {
        const std::string file =
            std::string(phone::kMobileLibrary) + "/Carrier Bundles/" + bundle + ".plist";
        std::ofstream(file) << Xml(
            PropertyList(PropertyList::Dictionary{{"key", PropertyList(bundle)}}));
        ASSERT_EQ(client_.callTexts(kLinkCarrierBundle, {file, link, "com.vendra.carrier"}), 0);
        EXPECT_EQ(client_.copyPreference(kCopy, "com.vendra.carrier", "key").data,
                  Xml(PropertyList(bundle)));
    }
    ASSERT_EQ(client_.callTexts(kRemovePreferenceDomain, {link, "com.vendra.carrier"}), 0);
    EXPECT_EQ(client_.copyPreference(kCopy, "com.vendra.carrier", "key").data, "");
}

TEST_F(PreferenceValues, NeedTextsInTheirNames) {
    const std::string value = Xml(PropertyList(true));
    for (const char* text : {"\xFF", "a\xC0\x80", "\xED\xA0\x80"}) {
        EXPECT_EQ(client_.setPreference(text, "key", value), 5);
        EXPECT_EQ(client_.setPreference(kDomain, text, "x"), 5);
        EXPECT_EQ(client_.copyPreference(kCopy, text, "key").code, 5);
        EXPECT_EQ(client_.copyPreference(kCopy, kDomain, text).code, 5);
        EXPECT_EQ(client_.copyPreference(kCopyApp, text, "key").code, 5);
        EXPECT_EQ(client_.copyPreference(kCopyApp, kDomain, text).code, 5);
    }
    EXPECT_TRUE(fs::is_empty(fs::path(fileOf(kDomain)).parent_path()));
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(PreferenceValues, TakeWhatFillsAField) {
    const std::string key(256, 'k');
    ASSERT_EQ(set(Xml(PropertyList("value")), key), 0);
    EXPECT_EQ(copy(key).data, Xml(PropertyList("value")));
    EXPECT_EQ(copy(key.substr(1)).data, "");
    ASSERT_EQ(set(Xml(PropertyList("empty")), ""), 0);
    EXPECT_EQ(copy("").data, Xml(PropertyList("empty")));
}

TEST_F(PreferenceValues, HaveDomainsThatAreFileNames) {
    const std::string value = Xml(PropertyList(true));
    for (const std::string& domain : {std::string(),
                                      std::string("../escape"),
                                      std::string("a/b"),
                                      std::string(250, 'd'),
                                      std::string(256, 'd')}) {
        EXPECT_EQ(client_.setPreference(domain, "key", value), 0);
        const auto copied = client_.copyPreference(kCopy, domain, "key");
        EXPECT_TRUE(copied.isWellFormed && copied.data.empty()) << domain;
        EXPECT_EQ(journal_.take().at(0),
                  "3 platform preferences: \"" + domain.substr(0, 249) + "\" cannot name a domain");
    }
    EXPECT_TRUE(fs::is_empty(fs::path(fileOf(kDomain)).parent_path()));
    EXPECT_EQ(client_.setPreference(std::string(249, 'd'), "key", value), 0);
    EXPECT_EQ(client_.copyPreference(kCopy, std::string(249, 'd'), "key").data, value);
}

TEST_F(PreferenceValues, ThatAreNoPropertyListsChangeNothing) {
    ASSERT_EQ(set(Xml(EveryKind())), 0);
    const std::string before = Read(fileOf(kDomain));
    const std::string plist = "<plist version=\"1.0\">";
    for (const std::string& value :
         {std::string(),
          std::string("xx"),
          std::string(2, '\0'),
          std::string("bplist00"),
          plist,
          plist + "</plist>",
          plist + "<integer>12abc</integer></plist>",
          plist + "<integer/></plist>",
          plist + "<real>1,5</real></plist>",
          plist + "<integer>9223372036854775808</integer></plist>",
          plist + "<real>abc</real></plist>",
          plist + "<date>2001-13-01T00:00:00Z</date></plist>",
          plist + "<data>Y</data></plist>",
          plist + "<dict><key>a</key></dict></plist>",
          plist + "<true/>text</plist>",
          plist + "<true/><true/></plist>",
          std::string("<true/>"),
          plist + "<null/></plist>",
          plist + "<string>\xFF</string></plist>",
          plist + "<string>\x01</string></plist>",
          plist + std::string("<string>\0</string></plist>", 26),
          "<!DOCTYPE plist [<!ENTITY a \"a\">]>" + plist + "<string>&a;</string></plist>",
          plist + Repeat("<array>", 65) + Repeat("</array>", 65) + "</plist>",
          Binary(EveryKind()).substr(1),
          Binary(EveryKind()).substr(0, 100)}) {
        EXPECT_EQ(set(value), 5) << value;
    }
    EXPECT_EQ(Read(fileOf(kDomain)), before);
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(PreferenceValues, UnderKeysThatXmlCannotHoldAreNotStored) {
    ASSERT_EQ(set(Xml(EveryKind())), 0);
    const std::string before = Read(fileOf(kDomain));
    EXPECT_EQ(set(Xml(PropertyList(true)), "control \x01"), 0);
    EXPECT_EQ(copy("control \x01").data, "");
    EXPECT_EQ(Read(fileOf(kDomain)), before);
    EXPECT_EQ(journal_.take().size(), 1U);
}

/// Lists of the full size that cost a careless reader time, stack or memory.
std::vector<std::string> HostileLists() {
    const std::string plist = "<plist version=\"1.0\">";
    const auto filled = [](const std::string& start,
                           std::string_view unit,
                           const std::string& end) {
        return start + Repeat(unit, (kMostData - start.size() - end.size()) / unit.size()) + end;
    };
    std::vector<std::string> lists{
        filled(plist, "<array>", ""),
        filled(plist, "<dict><key>a</key>", ""),
        filled(plist + "<array>", "<true/>", "</array></plist>"),
        filled(plist + "<string>", "&amp;", "</string></plist>"),
        filled(plist + "<string>", "<![CDATA[<]]>", "</string></plist>"),
        filled(plist + "<string>", "x", ""),
        filled(plist + "<data>", "AAAA", "</data></plist>"),
        filled(plist + "<data>", " ", "</data></plist>"),
        filled(plist + "<integer>", "1", "</integer></plist>"),
        filled(plist, "<!-- -->", "<true/></plist>"),
        filled("", "<", ""),
        filled(plist + "<true ", "\"\"", ""),
        filled("", "&", ""),
    };
    // As many objects as are taken, each of a size that wastes the most.
    const std::string text = "<string>" + std::string(60, 'x') + "</string>";
    lists.push_back(plist + "<array>" + Repeat(text, 199'999) + "</array></plist>");
    const std::string entry = "<key>" + std::string(60, 'k') + "</key>" + text;
    lists.push_back(plist + "<dict>" + Repeat(entry, 99'999) + "</dict></plist>");
    // One leaf, referred to until the limit.
    const std::string leaf =
        std::string("\x4F\x12\x00\x10\x00\x00", 6) + std::string(1U << 20, 'x');
    const std::string array = std::string("\xAF\x10\x3F") + std::string(63, '\x01');
    const std::size_t table = 8 + array.size() + leaf.size();
    const auto number = [](std::size_t value, int width) {
        std::string bytes;
        for (int shift = 8 * (width - 1); shift >= 0; shift -= 8) {
            bytes += static_cast<char>(value >> shift);
        }
        return bytes;
    };
    lists.push_back("bplist00" + array + leaf + number(8, 4) + number(8 + array.size(), 4) +
                    std::string(6, '\0') + "\x04\x01" + number(2, 8) + number(0, 8) +
                    number(table, 8));
    return lists;
}

TEST_F(PreferenceValues, OfHostileListsCostLittleMemory) {
    ASSERT_EQ(set(Xml(PropertyList("old")), "old"), 0);
    int number = 0;
    for (const std::string& list : HostileLists()) {
        const auto code = set(list);
        EXPECT_TRUE(code == 0 || code == 5) << number << ": " << code;
        (void)copy();
        EXPECT_LT(peakMemory(), 64U) << number;
        ++number;
    }
    EXPECT_EQ(copy("old").data, Xml(PropertyList("old")));
    EXPECT_LT(memory("RssAnon:"), 4U) << "and nothing of it stays";
    EXPECT_TRUE(daemon_.isRunning());
}

TEST_F(PreferenceValues, OfFilesThatCannotBeReadStayAsTheyAre) {
    const std::string value = Xml(PropertyList("new"));
    std::ofstream(fileOf("secret")) << "secret";
    ASSERT_EQ(chmod(fileOf("secret").c_str(), 0600), 0);
    ASSERT_EQ(mkfifo(fileOf("fifo").c_str(), 0666), 0);
    fs::create_symlink("/dev/zero", fileOf("device"));
    fs::create_directory(fileOf("folder"));
    std::ofstream(fileOf("sparse")) << "";
    fs::resize_file(fileOf("sparse"), std::uintmax_t{100} << 30);
    for (const char* domain : {"secret", "fifo", "device", "folder", "sparse"}) {
        const auto type = fs::symlink_status(fileOf(domain)).type();
        EXPECT_EQ(client_.setPreference(domain, "key", value), 0);
        EXPECT_EQ(client_.copyPreference(kCopy, domain, "key").data, "");
        EXPECT_EQ(fs::symlink_status(fileOf(domain)).type(), type);
        EXPECT_EQ(journal_.take().size(), 2U) << domain;
    }
    EXPECT_EQ(Read(fileOf("secret")), "secret");
    EXPECT_EQ(fs::file_size(fileOf("sparse")), std::uintmax_t{100} << 30);
}

TEST_F(PreferenceValues, OfADamagedFileAreKeptBesideTheNewOnes) {
    std::ofstream(fileOf(kDomain)) << "<plist><dict>half";
    EXPECT_EQ(copy().data, "");
    EXPECT_EQ(set(Xml(PropertyList("new"))), 0);
    EXPECT_EQ(Read(fileOf(kDomain) + ".damaged"), "<plist><dict>half");
    EXPECT_EQ(copy().data, Xml(PropertyList("new")));
}

/// A canary of root's, and what the mobile user may make of it: nothing.
TEST_F(PreferenceValues, GainTheMobileUserNothing) {
    const std::string canary =
        Xml(PropertyList(PropertyList::Dictionary{{"key", PropertyList("canary")}}));
    fs::create_directories("/private/preferences-canary");
    for (const char* name :
         {"/private/preferences-canary/open.plist", "/private/preferences-canary/closed.plist"}) {
        std::ofstream(name) << canary;
    }
    ASSERT_EQ(chmod("/private/preferences-canary/closed.plist", 0600), 0);
    const std::string temporary =
        std::string(phone::kMobileLibrary) + "/Preferences/.linefold-mobile-helper.tmp";
    for (const char* target : {"/private/preferences-canary/open.plist",
                               "/private/preferences-canary/closed.plist",
                               "/private/preferences-canary/new.plist"}) {
        fs::remove(fileOf(kDomain));
        fs::create_symlink(target, fileOf(kDomain));
        EXPECT_EQ(set(Xml(PropertyList("new"))), 0);
        fs::remove(fileOf(kDomain));
        fs::create_symlink(target, temporary);
        EXPECT_EQ(set(Xml(PropertyList("new"))), 0);
        EXPECT_EQ(copy().data, Xml(PropertyList("new")));
    }
    EXPECT_EQ(Read("/private/preferences-canary/open.plist"), canary);
    EXPECT_EQ(Read("/private/preferences-canary/closed.plist"), canary);
    EXPECT_EQ(std::distance(fs::directory_iterator("/private/preferences-canary"), {}), 2);
}

TEST_F(PreferenceValues, SurviveFilesThatAreSwappedAllTheTime) {
    fs::create_directories("/private/preferences-canary");
    std::ofstream("/private/preferences-canary/root.plist") << "canary";
    std::atomic<bool> isOver = false;
    std::thread swapper([&] {
        for (int turn = 0; !isOver; ++turn) {
            unlink(fileOf(kDomain).c_str());
            if (turn % 3 == 0) {
                (void)symlink("/private/preferences-canary/root.plist", fileOf(kDomain).c_str());
            } else if (turn % 3 == 1) {
                (void)mkfifo(fileOf(kDomain).c_str(), 0666);
            }
        }
    });
    for (int i = 0; i < 300; ++i) {
        EXPECT_EQ(set(Xml(PropertyList(std::int64_t{i}))), 0);
        EXPECT_EQ(copy().code, 0);
    }
    isOver = true;
    swapper.join();
    EXPECT_EQ(Read("/private/preferences-canary/root.plist"), "canary");
}

TEST_F(PreferenceValues, OfEightClientsAtOnceAreAllKept) {
    std::vector<std::thread> clients;
    for (int number = 0; number < 8; ++number) {
        clients.emplace_back([number] {
            const auto client = phone::Client::checkIn();
            for (int i = 0; i < 25; ++i) {
                const std::string key = std::to_string(number) + "." + std::to_string(i);
                EXPECT_EQ(client.setPreference(kDomain, key, Xml(PropertyList(key))), 0);
            }
        });
    }
    for (auto& client : clients) {
        client.join();
    }
    EXPECT_EQ(Parse(Read(fileOf(kDomain)))->as<PropertyList::Dictionary>()->size(), 200U);
    EXPECT_EQ(copy("7.24").data, Xml(PropertyList("7.24")));
}

}  // namespace
