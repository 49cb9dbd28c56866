#include "platform/FileManager.h"

#include <algorithm>
#include <cerrno>

#include "platform/DirectoryAccess.h"
#include "platform/Process.h"
#include "tests/contract/FileFixture.h"

using namespace platform;

namespace {

class FileManagerContract : public FileFixture {
protected:
    [[nodiscard]] PathAccess path(const std::string& name) const { return PathAccess(at(name)); }

    [[nodiscard]] int copy(const std::string& source, const std::string& destination) const {
        return FileManagerCopyItem(path(source), path(destination));
    }

    [[nodiscard]] int move(const std::string& source, const std::string& destination) const {
        return FileManagerMoveItem(path(source), path(destination));
    }

    [[nodiscard]] int remove(const std::string& name) const {
        return FileManagerRemoveItem(path(name));
    }

    [[nodiscard]] int make(const std::string& name, IntermediateDirectories intermediates) const {
        return FileManagerCreateDirectory(at(name), intermediates, {.permissions = 0750});
    }
};

TEST_F(FileManagerContract, CopiesAFile) {
    file("source", "contents", 0640);
    EXPECT_EQ(copy("source", "copy"), 0);
    EXPECT_EQ(tree(), (Lines{"/", "copy: contents", "source: contents"}));
    EXPECT_EQ(modeOf("copy"), twin::kFile | 0640);
    EXPECT_FALSE(twin::AreOneFile(at("source"), at("copy")));
}

TEST_F(FileManagerContract, CopiesATreeWithAllThatIsInIt) {
    folder("source");
    folder("source/a", 0700);
    folder("source/a/empty");
    file("source/a/file", "1");
    file("source/file", "2");
    link("source/link", "a/file");
    link("source/a/dangling", "nowhere at all");
    EXPECT_EQ(copy("source", "copy"), 0);
    EXPECT_EQ(tree("copy"), tree("source"));
    EXPECT_EQ(tree("copy").size(), 7U);
    EXPECT_EQ(modeOf("copy/a"), twin::kFolder | 0700);
}

TEST_F(FileManagerContract, CopiesBelongToTheProcess) {
    folder("source");
    file("source/file");
    link("source/link", "file");
    ASSERT_EQ(copy("source", "copy"), 0);
    for (const auto& [name, copied] : twin::Tree(at("copy"))) {
        EXPECT_EQ(copied.owner, ProcessUserId()) << name;
        EXPECT_EQ(copied.group, ProcessGroupId()) << name;
    }
}

TEST_F(FileManagerContract, CopiesKeepTimesAndUserAttributes) {
    constexpr std::int64_t kTime = 1'000'000'000'123'456'789;
    const std::map<std::string, std::string> attributes{{"user.one", "1"},
                                                        {"user.two", std::string("\0x", 2)}};
    folder("source");
    twin::Put(at("source/folder"),
              {.mode = twin::kFolder | 0755, .attributes = attributes, .modified = kTime});
    twin::Put(at("source/file"), {.attributes = attributes, .modified = kTime + 1});
    twin::Put(at("source/link"),
              {.mode = twin::kLink | 0777, .contents = "x", .modified = kTime + 2});
    ASSERT_EQ(copy("source", "copy"), 0);
    EXPECT_EQ(item("copy/folder").modified, kTime);
    EXPECT_EQ(item("copy/file").modified, kTime + 1);
    EXPECT_EQ(item("copy/link").modified, kTime + 2);
    EXPECT_EQ(item("copy/folder").attributes, attributes);
    EXPECT_EQ(item("copy/file").attributes, attributes);
}

TEST_F(FileManagerContract, CopiesKeepManyUserAttributes) {
    twin::Item many;
    for (int i = 0; i < 30; ++i) {
        many.attributes["user.attribute-" + std::to_string(i)] = std::to_string(i);
    }
    many.attributes["user.large"] = std::string(1500, 'x');
    many.attributes["user.empty"] = "";
    twin::Put(at("source"), many);
    ASSERT_EQ(copy("source", "copy"), 0);
    EXPECT_EQ(item("copy").attributes, many.attributes);
}

TEST_F(FileManagerContract, CopiesLoseSetIdBits) {
    folder("source", 07777);
    file("source/file", "", 06755);
    ASSERT_EQ(copy("source", "copy"), 0);
    EXPECT_EQ(modeOf("copy"), twin::kFolder | 01777);
    EXPECT_EQ(modeOf("copy/file"), twin::kFile | 0755);
    ASSERT_EQ(copy("source/file", "file"), 0);
    EXPECT_EQ(modeOf("file"), twin::kFile | 0755);
}

TEST_F(FileManagerContract, CopiesKeepHardLinksInsideATree) {
    folder("source");
    folder("source/a");
    file("source/one", "shared");
    twin::PutName(at("source/one"), at("source/a/two"));
    twin::PutName(at("source/one"), at("outside"));
    ASSERT_EQ(copy("source", "copy"), 0);
    EXPECT_TRUE(twin::AreOneFile(at("copy/one"), at("copy/a/two")));
    EXPECT_FALSE(twin::AreOneFile(at("copy/one"), at("source/one")));
    EXPECT_EQ(tree("copy"), tree("source"));
}

TEST_F(FileManagerContract, CopiesLeaveSpecialFilesOut) {
    folder("source");
    file("source/file", "1");
    twin::Put(at("source/fifo"), {.mode = twin::kFifo | 0600});
    EXPECT_EQ(copy("source", "copy"), 0);
    EXPECT_EQ(tree("copy"), (Lines{"/", "file: 1"}));
    EXPECT_EQ(copy("source/fifo", "fifo"), EOPNOTSUPP);
    EXPECT_EQ(modeOf("fifo"), 0U);
}

TEST_F(FileManagerContract, CopiesALinkAndNotWhatItLeadsTo) {
    folder("folder");
    link("to-folder", "folder");
    link("dangling", "nowhere");
    EXPECT_EQ(copy("to-folder", "copy"), 0);
    EXPECT_EQ(copy("dangling", "other"), 0);
    EXPECT_EQ(tree("copy"), (Lines{" -> folder"}));
    EXPECT_EQ(tree("other"), (Lines{" -> nowhere"}));
}

TEST_F(FileManagerContract, CopiesToNothingThatIsThere) {
    file("source", "new");
    folder("folder");
    file("file", "old");
    link("dangling", "nowhere");
    const Lines before = tree();
    for (const char* name :
         {"folder", "file", "dangling", "source", ".", "folder/.", "folder/.."}) {
        EXPECT_EQ(copy("source", name), EEXIST) << name;
        EXPECT_EQ(copy("folder", name), EEXIST) << name;
        EXPECT_EQ(move("source", name), EEXIST) << name;
    }
    EXPECT_EQ(tree(), before);
}

TEST_F(FileManagerContract, RefusesATreeIntoItself) {
    folder("source");
    folder("source/a");
    file("source/a/file");
    const Lines before = tree();
    EXPECT_EQ(copy("source", "source/copy"), EINVAL);
    EXPECT_EQ(copy("source", "source/a/copy"), EINVAL);
    EXPECT_EQ(move("source", "source/a/moved"), EINVAL);
    EXPECT_EQ(tree(), before);
    EXPECT_EQ(copy("source", "source-beside"), 0);
}

TEST_F(FileManagerContract, SaysWhichEndIsMissing) {
    folder("folder");
    EXPECT_EQ(copy("missing", "copy"), ENOENT);
    EXPECT_EQ(move("missing", "copy"), ENOENT);
    EXPECT_EQ(remove("missing"), ENOENT);
    EXPECT_EQ(copy("folder", "missing/copy"), ENOENT);
    EXPECT_EQ(move("folder", "missing/copy"), ENOENT);
    file("file");
    EXPECT_EQ(copy("folder", "file/copy"), ENOTDIR);
    EXPECT_EQ(copy("file/below", "copy"), ENOTDIR);
}

TEST_F(FileManagerContract, TakesASlashAtTheEndForADirectory) {
    folder("folder");
    file("file");
    link("link", "folder");
    EXPECT_EQ(copy("folder/", "copy//"), 0);
    EXPECT_EQ(move("copy/", "moved/"), 0);
    for (const char* name : {"file/", "link/"}) {
        EXPECT_EQ(copy(name, "other"), ENOTDIR) << name;
        EXPECT_EQ(move(name, "other"), ENOTDIR) << name;
        EXPECT_EQ(remove(name), ENOTDIR) << name;
    }
    EXPECT_EQ(copy("file", "other/"), ENOTDIR);
    EXPECT_EQ(move("file", "other/"), ENOTDIR);
    EXPECT_EQ(remove("moved/"), 0);
    EXPECT_EQ(tree(), (Lines{"/", "file: ", "folder/", "link -> folder"}));
}

TEST_F(FileManagerContract, MovesEverythingAsItIs) {
    folder("source", 01700);
    file("source/file", "1", 04755);
    twin::Put(at("source/fifo"), {.mode = twin::kFifo | 0600});
    const Lines before = tree("source");
    EXPECT_EQ(move("source", "moved"), 0);
    EXPECT_EQ(tree("moved"), before);
    EXPECT_EQ(modeOf("moved"), twin::kFolder | 01700);
    EXPECT_EQ(modeOf("moved/file"), twin::kFile | 04755);
    EXPECT_EQ(modeOf("source"), 0U);
}

TEST_F(FileManagerContract, RemovesTreesAndNotWhatLinksLeadTo) {
    folder("kept");
    file("kept/file", "1");
    folder("tree");
    folder("tree/a");
    file("tree/a/file");
    link("tree/link", "../kept");
    link("link", "kept");
    EXPECT_EQ(remove("tree"), 0);
    EXPECT_EQ(remove("link"), 0);
    EXPECT_EQ(tree(), (Lines{"/", "kept/", "kept/file: 1"}));
}

TEST_F(FileManagerContract, RemovesNothingByTheNamesOfFoldersThemselves) {
    folder("a");
    folder("a/b");
    file("a/file");
    const Lines before = tree();
    for (const char* name : {"a/.", "a/b/..", "a/./", "a/b/../"}) {
        EXPECT_EQ(remove(name), EINVAL) << name;
    }
    EXPECT_EQ(tree(), before);
}

TEST_F(FileManagerContract, SetsAttributes) {
    file("file", "", 0600);
    link("link", "file");
    EXPECT_EQ(FileManagerSetAttributes({.permissions = 0751}, path("file")), 0);
    EXPECT_EQ(modeOf("file"), twin::kFile | 0751);
    EXPECT_EQ(FileManagerSetAttributes({.permissions = 0600}, path("link")), 0);
    EXPECT_EQ(modeOf("file"), twin::kFile | 0751);
    EXPECT_EQ(FileManagerSetAttributes({.owner = ProcessUserId(), .group = ProcessGroupId()},
                                       path("link")),
              0);
    EXPECT_EQ(FileManagerSetAttributes({.permissions = 0600}, path("missing")), ENOENT);
    EXPECT_EQ(FileManagerSetAttributes({}, path("file")), 0);
}

TEST_F(FileManagerContract, MakesADirectory) {
    EXPECT_EQ(make("new", IntermediateDirectories::kMustExist), 0);
    EXPECT_EQ(modeOf("new"), twin::kFolder | 0750);
    EXPECT_EQ(make("new", IntermediateDirectories::kMustExist), EEXIST);
    EXPECT_EQ(make("missing/new", IntermediateDirectories::kMustExist), ENOENT);
    EXPECT_EQ(FileManagerCreateDirectory(
                  at("open"), IntermediateDirectories::kMustExist, {.permissions = 01777}),
              0);
    EXPECT_EQ(modeOf("open"), twin::kFolder | 01777);
    EXPECT_EQ(FileManagerCreateDirectory("", IntermediateDirectories::kAreMade, {}), ENOENT);
}

TEST_F(FileManagerContract, MakesDirectoriesOnTheWay) {
    folder("there");
    EXPECT_EQ(make("there/a/b//c/", IntermediateDirectories::kAreMade), 0);
    EXPECT_EQ(tree("there"), (Lines{"/", "a/", "a/b/", "a/b/c/"}));
    EXPECT_EQ(modeOf("there"), twin::kFolder | 0755);
    EXPECT_EQ(modeOf("there/a/b"), twin::kFolder | 0750);
    EXPECT_EQ(make("there", IntermediateDirectories::kAreMade), 0);
    EXPECT_EQ(modeOf("there"), twin::kFolder | 0755);
}

TEST_F(FileManagerContract, MakesNoDirectoryThroughAFileOrADanglingLink) {
    file("file");
    link("dangling", "nowhere");
    folder("folder");
    link("link", "folder");
    EXPECT_EQ(make("file", IntermediateDirectories::kAreMade), EEXIST);
    EXPECT_EQ(make("file/below", IntermediateDirectories::kAreMade), ENOTDIR);
    EXPECT_EQ(make("dangling", IntermediateDirectories::kAreMade), ENOENT);
    EXPECT_EQ(make("dangling/below", IntermediateDirectories::kAreMade), ENOENT);
    EXPECT_EQ(make("link", IntermediateDirectories::kAreMade), 0);
    EXPECT_EQ(make("link/below", IntermediateDirectories::kAreMade), 0);
    EXPECT_EQ(tree("folder"), (Lines{"/", "below/"}));
}

TEST_F(FileManagerContract, ReplacesContents) {
    const auto bytes = std::as_bytes(std::span("new", 3));
    file("old", "old", 0640);
    link("link", "old");
    folder("folder");
    EXPECT_EQ(FileManagerReplaceContents(path("fresh"), bytes), 0);
    EXPECT_EQ(modeOf("fresh"), twin::kFile | 0644);
    EXPECT_EQ(FileManagerReplaceContents(path("link"), bytes), 0);
    EXPECT_EQ(tree("link"), (Lines{": new"}));
    EXPECT_EQ(tree("old"), (Lines{": old"}));
    EXPECT_EQ(FileManagerReplaceContents(path("old"), bytes), 0);
    EXPECT_EQ(modeOf("old"), twin::kFile | 0640);
    EXPECT_EQ(FileManagerReplaceContents(path("folder"), bytes), EISDIR);
    EXPECT_EQ(FileManagerReplaceContents(path("missing/x"), bytes), ENOENT);
    EXPECT_EQ(tree(), (Lines{"/", "folder/", "fresh: new", "link: new", "old: new"}));
}

// Folders held open.

TEST_F(FileManagerContract, ListsAFolderAndAllBelow) {
    folder("top");
    folder("top/a");
    file("top/a/file");
    folder("other");
    file("other/file");
    link("top/link", "../other");
    link("to-top", "top");
    const DirectoryAccess top(path("to-top"));
    std::vector<std::string> names;
    ASSERT_EQ(top.list(&names), 0);
    std::ranges::sort(names);
    EXPECT_EQ(names, (Lines{"a", "link"}));
    std::vector<std::string> paths;
    ASSERT_EQ(top.subpaths(&paths), 0);
    EXPECT_LT(std::ranges::find(paths, "a"), std::ranges::find(paths, "a/file"));
    std::ranges::sort(paths);
    EXPECT_EQ(paths, (Lines{"a", "a/file", "link"}));
}

TEST_F(FileManagerContract, ListsNothingButFolders) {
    file("file");
    link("dangling", "nowhere");
    std::vector<std::string> names{"as it was"};
    EXPECT_EQ(DirectoryAccess(path("file")).list(&names), ENOTDIR);
    EXPECT_EQ(DirectoryAccess(path("missing")).list(&names), ENOENT);
    EXPECT_EQ(DirectoryAccess(path("dangling")).subpaths(&names), ENOENT);
    EXPECT_EQ(names, (Lines{"as it was"}));
    FileStatus status;
    EXPECT_EQ(DirectoryAccess(path("missing")).item("x").lstat(&status), ENOENT);
    EXPECT_EQ(DirectoryAccess(path("missing")).makeDirectories("x"), ENOENT);
}

TEST_F(FileManagerContract, FollowsNoLinkInsideATree) {
    folder("top");
    folder("outside");
    file("outside/file", "1");
    link("top/link", "../outside");
    const DirectoryAccess top(path("top"));
    FileStatus status;
    EXPECT_EQ(top.item("link/file").lstat(&status), ENOTDIR);
    EXPECT_EQ(FileManagerRemoveItem(top.item("link/file")), ENOTDIR);
    EXPECT_EQ(top.makeDirectories("link/new"), ENOTDIR);
    EXPECT_EQ(top.item("link").lstat(&status), 0);
    EXPECT_EQ(tree("outside"), (Lines{"/", "file: 1"}));
}

TEST_F(FileManagerContract, MakesFoldersInsideATree) {
    folder("top");
    file("top/file");
    const DirectoryAccess top(path("top"));
    EXPECT_EQ(top.makeDirectories("a/b"), 0);
    EXPECT_EQ(top.makeDirectories("a/b/c"), 0);
    EXPECT_EQ(top.makeDirectories("a"), 0);
    EXPECT_EQ(top.makeDirectories("file/x"), ENOTDIR);
    EXPECT_EQ(top.makeDirectories("file"), ENOTDIR);
    EXPECT_EQ(tree("top"), (Lines{"/", "a/", "a/b/", "a/b/c/", "file: "}));
}

// Single items.

TEST_F(FileManagerContract, ReadsRegularFilesOnly) {
    file("file", "12345");
    link("link", "file");
    folder("folder");
    twin::Put(at("fifo"), {.mode = twin::kFifo | 0600});
    std::vector<std::byte> bytes;
    EXPECT_EQ(path("link").read(5, &bytes), 0);
    EXPECT_EQ(bytes.size(), 5U);
    EXPECT_EQ(path("file").read(4, &bytes), EFBIG);
    EXPECT_EQ(path("folder").read(5, &bytes), EINVAL);
    EXPECT_EQ(path("fifo").read(5, &bytes), EINVAL);
    EXPECT_EQ(path("missing").read(5, &bytes), ENOENT);
    EXPECT_EQ(path("file/").read(5, &bytes), ENOTDIR);
    EXPECT_EQ(bytes.size(), 5U);
}

TEST_F(FileManagerContract, ReadsLinksAndRealPaths) {
    folder("folder");
    link("link", "folder/../folder");
    link("dangling", "nowhere");
    std::string text = "as it was";
    EXPECT_EQ(path("folder").readLink(&text), EINVAL);
    EXPECT_EQ(path("missing").readLink(&text), ENOENT);
    EXPECT_EQ(path("dangling").realPath(&text), ENOENT);
    EXPECT_EQ(text, "as it was");
    EXPECT_EQ(path("link").readLink(&text), 0);
    EXPECT_EQ(text, "folder/../folder");
    std::string real;
    EXPECT_EQ(path("link").realPath(&real), 0);
    EXPECT_EQ(path("folder").realPath(&text), 0);
    EXPECT_EQ(real, text);
    EXPECT_TRUE(real.ends_with("/folder"));
    EXPECT_EQ(PathAccess("/").realPath(&text), 0);
    EXPECT_EQ(text, "/");
}

TEST_F(FileManagerContract, RemovesAnEmptyDirectoryAlone) {
    folder("folder");
    file("folder/file");
    link("link", "folder");
    EXPECT_EQ(path("folder").removeDirectory(), ENOTEMPTY);
    EXPECT_EQ(path("folder/file").removeDirectory(), ENOTDIR);
    EXPECT_EQ(path("link").removeDirectory(), ENOTDIR);
    EXPECT_EQ(path("missing").removeDirectory(), ENOENT);
    ASSERT_EQ(remove("folder/file"), 0);
    EXPECT_EQ(path("folder").removeDirectory(), 0);
    EXPECT_EQ(tree(), (Lines{"/", "link -> folder"}));
}

TEST_F(FileManagerContract, ChangesTheItemItselfAndNoLinksTarget) {
    file("file", "", 0600);
    link("link", "file");
    EXPECT_EQ(path("file").setMode(0644), 0);
    EXPECT_EQ(path("link").setMode(0600), EOPNOTSUPP);
    EXPECT_EQ(path("file/").setMode(0600), ENOTDIR);
    EXPECT_EQ(modeOf("file"), twin::kFile | 0644);
    EXPECT_EQ(path("link").setOwner(ProcessUserId(), ProcessGroupId()), 0);
    EXPECT_EQ(path("missing").setOwner(0, 0), ENOENT);
    EXPECT_EQ(path("file/").setOwner(ProcessUserId(), ProcessGroupId()), ENOTDIR);
}

}  // namespace
