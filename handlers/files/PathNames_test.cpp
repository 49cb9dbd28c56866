#include "handlers/files/PathNames.h"

#include <gtest/gtest.h>

#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"

namespace {

TEST(PathNames, TakeAPathApartAsPosixDoes) {
    struct Case {
        const char* path;
        const char* base;
        const char* folder;
    };

    for (const auto& [path, base, folder] : {Case{"/usr/lib", "lib", "/usr"},
                                             Case{"/usr/", "usr", "/"},
                                             Case{"usr", "usr", "."},
                                             Case{"/", "/", "/"},
                                             Case{"//", "/", "/"},
                                             Case{".", ".", "."},
                                             Case{"..", "..", "."},
                                             Case{"", ".", "."},
                                             Case{"a//b//", "b", "a"},
                                             Case{"//a", "a", "/"},
                                             Case{"a/", "a", "."}}) {
        EXPECT_EQ(BaseName(path), base) << path;
        EXPECT_EQ(DirName(path), folder) << path;
    }
}

TEST(PathNames, CutAPathAfter1023Bytes) {
    const std::string path = "/" + std::string(1500, 'x');
    EXPECT_EQ(BaseName(path), std::string(1022, 'x'));
    const std::string folder = std::string(1023, 'x');
    EXPECT_EQ(DirName(folder + "/name"), ".");
    EXPECT_EQ(DirName(std::string(1000, 'x') + "/name"), std::string(1000, 'x'));
}

TEST(PathNames, TellWhatIsThere) {
    sim::Reset();
    sim::MakeFile("/tmp/file", {.mode = sim::kRegular | 0644});
    sim::MakeLink("/tmp/to-folder", "/tmp");
    sim::MakeLink("/tmp/dangling", "nowhere");
    EXPECT_EQ(KindAt(platform::PathAccess("/tmp/to-folder")), ItemKind::kDirectory);
    EXPECT_EQ(KindAt(platform::PathAccess("/tmp/file")), ItemKind::kOther);
    EXPECT_EQ(KindAt(platform::PathAccess("/tmp/dangling")), ItemKind::kNone);
    EXPECT_EQ(KindAt(platform::PathAccess("/tmp/missing")), ItemKind::kNone);
}

TEST(PathNames, TakeWhatAStrangersLinkLeadsToForNothing) {
    constexpr std::uint32_t kMobile = 501;
    sim::Reset();
    sim::MakeDirectory("/tmp/roots");
    sim::MakeDirectory("/tmp/mobiles", kMobile);
    sim::MakeLink("/tmp/to-roots", "roots", kMobile);
    sim::MakeLink("/tmp/to-mobiles", "mobiles", kMobile);
    EXPECT_EQ(KindAt(platform::PathAccess("/tmp/to-roots")), ItemKind::kNone);
    EXPECT_EQ(KindAt(platform::PathAccess("/tmp/to-mobiles")), ItemKind::kDirectory);
}

}  // namespace
