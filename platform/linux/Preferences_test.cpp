// Preferences on real files of the mobile user. Runs in a private phone root.
#include "platform/Preferences.h"

#include <gtest/gtest.h>
#include <sys/fsuid.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <latch>
#include <thread>

#include "platform/linux/UserRights.h"
#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

using platform::PropertyList;

constexpr const char* kDomain = "com.example.test";

std::string Xml(const PropertyList& value) {
    const auto data = platform::PropertyListCreateXmlData(value).value();
    return {reinterpret_cast<const char*>(data.data()), data.size()};
}

PropertyList Entry(const char* key, const char* value) {
    return PropertyList(PropertyList::Dictionary{{key, PropertyList(value)}});
}

std::string Read(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

class Preferences : public testing::Test {
protected:
    Preferences() {
        phone::ResetMobileHome();
        fs::remove_all("/Library/Preferences");
        fs::create_directories("/Library/Preferences");
        platform::PreferencesFlushCachesForIdentifier(std::nullopt,
                                                      platform::PreferencesUser::kAny);
    }

    [[nodiscard]] static std::string fileOf(std::string_view domain) {
        return std::string(phone::kMobileLibrary) + "/Preferences/" + std::string(domain) +
               ".plist";
    }

    /// Puts a file there as the mobile user would.
    static void put(const std::string& path, const std::string& contents) {
        std::ofstream(path, std::ios::binary) << contents;
        ASSERT_EQ(chown(path.c_str(), phone::kMobileUser, phone::kMobileUser), 0);
    }

    static bool set(const char* key,
                    std::optional<PropertyList> value,
                    std::string_view domain = kDomain) {
        platform::PreferencesSetValue(key, std::move(value), domain);
        return platform::PreferencesSynchronize(domain);
    }

    static std::optional<PropertyList> copy(const char* key, std::string_view domain = kDomain) {
        return platform::PreferencesCopyValue(key, domain);
    }

    phone::LogReader journal_ = phone::LogReader::journal();
};

TEST_F(Preferences, AreKeptInAFileOfTheMobileUser) {
    EXPECT_TRUE(set("key", PropertyList("value")));
    EXPECT_EQ(Read(fileOf(kDomain)), Xml(Entry("key", "value")));

    struct stat status {};

    ASSERT_EQ(stat(fileOf(kDomain).c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0600U);
    EXPECT_EQ(status.st_uid, phone::kMobileUser);
    EXPECT_EQ(status.st_gid, phone::kMobileUser);
    EXPECT_EQ(std::distance(fs::directory_iterator(fs::path(fileOf(kDomain)).parent_path()), {}),
              1);
}

TEST_F(Preferences, AreSeenBeforeTheyAreWritten) {
    platform::PreferencesSetValue("key", PropertyList("value"), kDomain);
    EXPECT_EQ(copy("key"), PropertyList("value"));
    EXPECT_FALSE(fs::exists(fileOf(kDomain)));
    platform::PreferencesSetValue("key", std::nullopt, kDomain);
    EXPECT_EQ(copy("key"), std::nullopt);
    EXPECT_TRUE(platform::PreferencesSynchronize(kDomain));
    EXPECT_FALSE(fs::exists(fileOf(kDomain))) << "nothing changed, nothing is written";
}

TEST_F(Preferences, KeepOtherKeysAndTheirOrder) {
    put(fileOf(kDomain),
        "<plist><dict><key>z</key><true/><key>a</key><real>0.1</real></dict></plist>");
    EXPECT_TRUE(set("new", PropertyList("value")));
    EXPECT_TRUE(set("z", PropertyList(false)));
    EXPECT_EQ(Read(fileOf(kDomain)),
              Xml(PropertyList(PropertyList::Dictionary{{"z", PropertyList(false)},
                                                        {"a", PropertyList(0.1)},
                                                        {"new", PropertyList("value")}})));
    EXPECT_TRUE(set("a", std::nullopt));
    EXPECT_EQ(copy("a"), std::nullopt);
    EXPECT_EQ(copy("z"), PropertyList(false));
}

TEST_F(Preferences, AreReadAgainWhenSynchronizedOrFlushed) {
    put(fileOf(kDomain), Xml(Entry("key", "one")));
    EXPECT_EQ(copy("key"), PropertyList("one"));
    put(fileOf(kDomain), Xml(Entry("key", "two")));
    EXPECT_EQ(copy("key"), PropertyList("one")) << "from the cache";
    EXPECT_TRUE(platform::PreferencesSynchronize(kDomain));
    EXPECT_EQ(copy("key"), PropertyList("two"));
    put(fileOf(kDomain), Xml(Entry("key", "three")));
    platform::PreferencesFlushCachesForIdentifier("com.example.other",
                                                  platform::PreferencesUser::kAny);
    EXPECT_EQ(copy("key"), PropertyList("two"));
    platform::PreferencesFlushCachesForIdentifier(kDomain, platform::PreferencesUser::kAny);
    EXPECT_EQ(copy("key"), PropertyList("three"));
}

TEST_F(Preferences, AreAllForgottenByAFlushWithoutIdentifier) {
    put(fileOf(kDomain), Xml(Entry("key", "one")));
    EXPECT_EQ(copy("key"), PropertyList("one"));
    put(fileOf(kDomain), Xml(Entry("key", "two")));
    platform::PreferencesFlushCachesForIdentifier(std::nullopt, platform::PreferencesUser::kAny);
    EXPECT_EQ(copy("key"), PropertyList("two"));
}

TEST_F(Preferences, OfAnApplicationAreSearchedInFourPlaces) {
    const std::vector<std::string> places{"/Library/Preferences/.GlobalPreferences.plist",
                                          "/Library/Preferences/com.example.test.plist",
                                          fileOf(".GlobalPreferences"),
                                          fileOf(kDomain)};
    for (const auto& place : places) {
        std::ofstream(place) << Xml(Entry("key", place.c_str()));
        EXPECT_TRUE(platform::PreferencesAppSynchronize(kDomain));
        EXPECT_EQ(platform::PreferencesCopyAppValue("key", kDomain), PropertyList(place.c_str()));
    }
    fs::remove(fileOf(kDomain));
    EXPECT_TRUE(platform::PreferencesSynchronize(kDomain));
    EXPECT_EQ(copy("key"), std::nullopt) << "a domain alone is searched in one";
}

TEST_F(Preferences, HaveNamesThatAreFileNames) {
    for (const std::string& domain : {std::string(),
                                      std::string("a/b"),
                                      std::string("../x"),
                                      std::string("a\0b", 3),
                                      std::string(250, 'd')}) {
        EXPECT_FALSE(set("key", PropertyList("value"), domain));
        EXPECT_EQ(copy("key", domain), std::nullopt);
        EXPECT_EQ(journal_.take().size(), 2U) << "one for the set, one for the copy";
    }
    EXPECT_TRUE(fs::is_empty(fs::path(fileOf(kDomain)).parent_path()));
    EXPECT_TRUE(set("key", PropertyList("value"), std::string(249, 'd')));
    EXPECT_EQ(copy("key", std::string(249, 'd')), PropertyList("value"));
}

TEST_F(Preferences, GoThroughALinkAndLeaveIt) {
    const std::string folder = std::string(phone::kMobileLibrary) + "/Carrier Bundles/";
    put(folder + "real.plist", Xml(Entry("key", "one")));
    ASSERT_EQ(chmod((folder + "real.plist").c_str(), 0640), 0);
    fs::create_symlink("../Carrier Bundles/real.plist", fileOf(kDomain));
    EXPECT_EQ(copy("key"), PropertyList("one"));
    EXPECT_TRUE(set("key", PropertyList("two")));
    EXPECT_TRUE(fs::is_symlink(fileOf(kDomain)));
    EXPECT_EQ(Read(folder + "real.plist"), Xml(Entry("key", "two")));
    EXPECT_EQ(static_cast<unsigned>(fs::status(folder + "real.plist").permissions()), 0640U);
}

TEST_F(Preferences, MakeTheFileThatALinkNames) {
    fs::create_symlink("new.plist", fileOf(kDomain));
    EXPECT_TRUE(set("key", PropertyList("value")));
    EXPECT_EQ(Read(fileOf("new")), Xml(Entry("key", "value")));
    fs::create_symlink(fileOf("loop"), fileOf("loop"));
    EXPECT_FALSE(set("key", PropertyList("value"), "loop"));
}

TEST_F(Preferences, KeepADamagedFileBesideTheNewOne) {
    put(fileOf(kDomain), "<plist><dict><key>half");
    EXPECT_EQ(copy("key"), std::nullopt);
    EXPECT_EQ(Read(fileOf(kDomain)), "<plist><dict><key>half");
    EXPECT_TRUE(set("key", PropertyList("value")));
    EXPECT_EQ(Read(fileOf(kDomain) + ".damaged"), "<plist><dict><key>half");
    EXPECT_EQ(copy("key"), PropertyList("value"));
    const auto lines = journal_.take();
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[0],
              "3 platform preferences: /var/mobile/Library/Preferences/com.example.test.plist is "
              "damaged: "
              "it holds no property list with a dictionary");
}

TEST_F(Preferences, CallWhatHoldsNoDictionaryDamaged) {
    put(fileOf(kDomain), "");
    EXPECT_TRUE(set("key", PropertyList("value")));
    EXPECT_TRUE(fs::is_empty(fileOf(kDomain) + ".damaged"));
    put(fileOf(kDomain), "<plist><array/></plist>");
    EXPECT_TRUE(set("key", PropertyList("value")));
    EXPECT_EQ(Read(fileOf(kDomain) + ".damaged"), "<plist><array/></plist>");
    std::ofstream(fileOf("roots")) << "damaged";
    EXPECT_TRUE(set("key", PropertyList("value"), "roots"))
        << "another user's file has only one name";
    EXPECT_EQ(Read(fileOf("roots") + ".damaged"), "damaged");
}

TEST_F(Preferences, NeverReplaceWhatCannotBeRead) {
    std::ofstream(fileOf("secret")) << Xml(Entry("key", "root's"));
    ASSERT_EQ(chmod(fileOf("secret").c_str(), 0600), 0);
    ASSERT_EQ(mkfifo(fileOf("fifo").c_str(), 0666), 0);
    fs::create_directory(fileOf("folder"));
    fs::create_symlink("/dev/null", fileOf("device"));
    put(fileOf("large"), "");
    fs::resize_file(fileOf("large"), std::uintmax_t{100} << 30);
    for (const char* domain : {"secret", "fifo", "folder", "device", "large"}) {
        const auto type = fs::symlink_status(fileOf(domain)).type();
        EXPECT_EQ(copy("key", domain), std::nullopt);
        EXPECT_FALSE(set("key", PropertyList("value"), domain)) << domain;
        EXPECT_EQ(fs::symlink_status(fileOf(domain)).type(), type);
        EXPECT_EQ(journal_.take().size(), 2U) << domain;
    }
    EXPECT_EQ(Read(fileOf("secret")), Xml(Entry("key", "root's")));
}

TEST_F(Preferences, ReachNoMoreThanTheMobileUserCould) {
    fs::create_directories("/private/canary");
    std::ofstream("/private/canary/root.plist") << Xml(Entry("key", "root's"));
    fs::create_symlink("/private/canary/root.plist", fileOf(kDomain));
    EXPECT_EQ(copy("key"), PropertyList("root's")) << "everybody may read it";
    EXPECT_FALSE(set("key", PropertyList("value")));
    EXPECT_EQ(Read("/private/canary/root.plist"), Xml(Entry("key", "root's")));
    EXPECT_EQ(std::distance(fs::directory_iterator("/private/canary"), {}), 1);
    fs::remove(fileOf(kDomain));
    EXPECT_FALSE(fs::exists(fileOf(kDomain)));
}

TEST_F(Preferences, AreNotWrittenThroughAPlantedTemporaryFile) {
    std::ofstream("/private/canary-file") << "canary";
    ASSERT_EQ(chmod("/private/canary-file", 0666), 0);
    const std::string temporary =
        std::string(phone::kMobileLibrary) + "/Preferences/.linefold-mobile-helper.tmp";
    fs::create_symlink("/private/canary-file", temporary);
    EXPECT_TRUE(set("key", PropertyList("one")));
    ASSERT_EQ(mkfifo(temporary.c_str(), 0666), 0);
    EXPECT_TRUE(set("key", PropertyList("two")));
    EXPECT_FALSE(fs::exists(fs::symlink_status(temporary)));
    fs::create_directory(temporary);
    EXPECT_FALSE(set("key", PropertyList("three")));
    EXPECT_EQ(Read(fileOf(kDomain)), Xml(Entry("key", "two")));
    EXPECT_EQ(Read("/private/canary-file"), "canary");
}

TEST_F(Preferences, DropWhatCouldNotBeWritten) {
    fs::remove_all(phone::kMobileLibrary);
    EXPECT_FALSE(set("key", PropertyList("value")));
    EXPECT_EQ(copy("key"), std::nullopt);
    phone::ResetMobileHome();
    EXPECT_TRUE(platform::PreferencesSynchronize(kDomain));
    EXPECT_FALSE(fs::exists(fileOf(kDomain)));
}

TEST_F(Preferences, WriteWhatWaitsBeforeItIsTooMuch) {
    for (int i = 0; i < 100; ++i) {
        platform::PreferencesSetValue(std::to_string(i), PropertyList(std::int64_t{i}), kDomain);
    }
    EXPECT_TRUE(fs::exists(fileOf(kDomain)));
    for (const char* domain : {"large.a", "large.b"}) {
        platform::PreferencesSetValue("key", PropertyList(std::string(4U << 20, 'x')), domain);
    }
    EXPECT_TRUE(fs::exists(fileOf("large.a")));
    EXPECT_FALSE(fs::exists(fileOf("large.b")));
    EXPECT_TRUE(platform::PreferencesSynchronize(kDomain));
    EXPECT_TRUE(platform::PreferencesSynchronize("large.b"));
    EXPECT_EQ(copy("99"), PropertyList(std::int64_t{99}));
}

TEST_F(Preferences, RefuseMoreThanAFileMayHold) {
    const PropertyList half(std::string(9U << 20, 'x'));
    EXPECT_TRUE(set("one", half));
    EXPECT_FALSE(set("two", half));
    EXPECT_EQ(copy("one"), half);
    EXPECT_EQ(copy("two"), std::nullopt);
    EXPECT_EQ(journal_.take().size(), 1U);
}

TEST_F(Preferences, LoseNothingBetweenThreads) {
    std::vector<std::jthread> threads;
    for (int thread = 0; thread < 4; ++thread) {
        threads.emplace_back([thread] {
            for (int i = 0; i < 25; ++i) {
                EXPECT_TRUE(set(std::to_string(thread * 25 + i).c_str(), PropertyList(true)));
            }
        });
    }
    threads.clear();
    for (int i = 0; i < 100; ++i) {
        EXPECT_EQ(copy(std::to_string(i).c_str()), PropertyList(true)) << i;
    }
}

TEST(UserRights, AreTakenByOneThreadAndGivenBack) {
    const auto fileUser = [] { return static_cast<uid_t>(setfsuid(static_cast<uid_t>(-1))); };
    std::latch isTaken(1);
    std::jthread other([&] {
        isTaken.wait();
        EXPECT_EQ(fileUser(), 0U);
    });
    {
        const platform::UserRights rights("mobile");
        EXPECT_TRUE(rights.areHeld());
        EXPECT_EQ(fileUser(), phone::kMobileUser);
        EXPECT_EQ(getgroups(0, nullptr), 1);
        isTaken.count_down();
        other.join();
        EXPECT_EQ(fopen("/private/by-mobile", "w"), nullptr);
    }
    EXPECT_EQ(fileUser(), 0U);
    std::ofstream("/private/by-root") << "root";
    EXPECT_TRUE(fs::exists("/private/by-root"));
}

TEST(UserRights, AreNotHeldOfNobody) {
    const platform::UserRights rights("no-such-user");
    EXPECT_FALSE(rights.areHeld());
    EXPECT_EQ(setfsuid(static_cast<uid_t>(-1)), 0);
}

}  // namespace
