#include "handlers/files/FileSystemManager.h"

#include <algorithm>
#include <cerrno>

#include "platform/Process.h"
#include "tests/contract/FileFixture.h"

using platform::PropertyList;

namespace {

using Recursive = FileSystemInterface::Recursive;
using Intermediates = FileSystemInterface::Intermediates;
using Paths = FileSystemInterface::Paths;

class FileSystemManagerContract : public FileFixture {
protected:
    int copy(const std::string& source, const std::string& destination) {
        return manager_.copyItem(at(source).c_str(), at(destination).c_str());
    }

    int move(const std::string& source, const std::string& destination) {
        return manager_.moveItem(at(source).c_str(), at(destination).c_str());
    }

    int moveFile(const std::string& source, const std::string& destination) {
        return manager_.moveFile(at(source).c_str(), at(destination).c_str());
    }

    int copyNamed(const std::string& source, const std::string& destination) {
        return manager_.copyNamedItem(at(source), at(destination), "name");
    }

    int movePrefixed(const std::string& prefix,
                     const std::string& source,
                     const std::string& destination) {
        return manager_.moveEntriesWithPrefix(prefix, at(source), at(destination));
    }

    [[nodiscard]] Lines listed(const std::string& name, Paths paths = Paths::kNames) {
        std::list<std::string> entries{"from before"};
        EXPECT_EQ(manager_.listDirectory(at(name), &entries, paths), 0);
        entries.sort();
        return {entries.begin(), entries.end()};
    }

    FileSystemManager manager_;
};

// Transfers.

TEST_F(FileSystemManagerContract, CopiesWhereNothingIs) {
    folder("source");
    file("source/file", "1");
    EXPECT_EQ(copy("source", "copy"), 0);
    EXPECT_EQ(copy("source/file", "file"), 0);
    EXPECT_EQ(tree(),
              (Lines{"/", "copy/", "copy/file: 1", "file: 1", "source/", "source/file: 1"}));
}

TEST_F(FileSystemManagerContract, SaysMinusOneForAMissingSource) {
    link("dangling", "nowhere");
    EXPECT_EQ(copy("missing", "copy"), -1);
    EXPECT_EQ(move("missing", "moved"), -1);
    EXPECT_EQ(moveFile("missing", "moved"), -1);
    EXPECT_EQ(copy("dangling", "copy"), -1);
    EXPECT_EQ(tree(), (Lines{"/", "dangling -> nowhere"}));
}

TEST_F(FileSystemManagerContract, SaysWhyAnItemGoesNowhere) {
    file("source", "1");
    EXPECT_EQ(copy("source", "missing/copy"), ENOENT);
    EXPECT_EQ(move("source", "missing/moved"), ENOENT);
    EXPECT_EQ(copy("source", "source/copy"), ENOTDIR);
    EXPECT_EQ(tree(), (Lines{"/", "source: 1"}));
}

TEST_F(FileSystemManagerContract, CopiesNoDirectoryOntoAFile) {
    folder("source");
    file("source/file", "1");
    file("file", "old");
    const Lines before = tree();
    EXPECT_EQ(copy("source", "file"), EEXIST);
    EXPECT_EQ(move("source", "file"), EEXIST);
    EXPECT_EQ(tree(), before);
}

TEST_F(FileSystemManagerContract, ReplacesAFileByAFile) {
    file("source", "new", 0600);
    file("file", "old");
    EXPECT_EQ(copy("source", "file"), 0);
    EXPECT_EQ(tree(), (Lines{"/", "file: new", "source: new"}));
    EXPECT_EQ(modeOf("file"), twin::kFile | 0600);
    EXPECT_EQ(move("source", "file"), 0);
    EXPECT_EQ(tree(), (Lines{"/", "file: new"}));
}

TEST_F(FileSystemManagerContract, PutsAFileIntoADirectoryUnderItsOwnName) {
    folder("folder");
    file("folder/source", "old");
    file("source", "new");
    EXPECT_EQ(copy("source", "folder"), 0);
    EXPECT_EQ(tree("folder"), (Lines{"/", "source: new"}));
    file("other", "2");
    EXPECT_EQ(move("other", "folder/"), 0);
    EXPECT_EQ(tree("folder"), (Lines{"/", "other: 2", "source: new"}));
}

TEST_F(FileSystemManagerContract, PutsADirectoryIntoADirectoryUnderItsOwnName) {
    folder("source");
    file("source/file", "1");
    folder("folder");
    EXPECT_EQ(copy("source/", "folder/"), 0);
    EXPECT_EQ(tree("folder"), (Lines{"/", "source/", "source/file: 1"}));
    EXPECT_EQ(move("folder/source", "."), 0) << "merged with what has its name";
    EXPECT_EQ(tree(), (Lines{"/", "folder/", "source/", "source/file: 1"}));
}

TEST_F(FileSystemManagerContract, ReplacesAFileInTheDirectoryByADirectory) {
    folder("source");
    file("source/file", "1");
    folder("folder");
    file("folder/source", "old");
    EXPECT_EQ(copy("source", "folder"), 0);
    EXPECT_EQ(tree("folder"), (Lines{"/", "source/", "source/file: 1"}));
}

TEST_F(FileSystemManagerContract, MergesACopiedTreeItemByItem) {
    folder("source");
    folder("source/a");
    folder("source/a/new");
    file("source/a/both", "new");
    file("source/a/only", "1");
    file("source/top", "2");
    folder("folder");
    folder("folder/source");
    folder("folder/source/a");
    file("folder/source/a/both", "old");
    file("folder/source/a/kept", "3");
    const Lines source = tree("source");
    EXPECT_EQ(copy("source", "folder"), 0);
    EXPECT_EQ(tree("folder/source"),
              (Lines{"/", "a/", "a/both: new", "a/kept: 3", "a/new/", "a/only: 1", "top: 2"}));
    EXPECT_EQ(tree("source"), source);
}

TEST_F(FileSystemManagerContract, MergesAMovedTreeAndRemovesTheEmptiedDirectory) {
    folder("source");
    folder("source/new");
    file("source/new/file", "1");
    file("source/both", "new");
    folder("folder");
    folder("folder/source");
    file("folder/source/both", "old");
    EXPECT_EQ(move("source", "folder"), 0);
    EXPECT_EQ(tree(),
              (Lines{"/",
                     "folder/",
                     "folder/source/",
                     "folder/source/both: new",
                     "folder/source/new/",
                     "folder/source/new/file: 1"}));
}

TEST_F(FileSystemManagerContract, LeavesFoldersThatWereThereOnBothSidesOfAMove) {
    folder("source");
    folder("source/a");
    file("source/a/file", "1");
    folder("folder");
    folder("folder/source");
    folder("folder/source/a");
    EXPECT_EQ(move("source", "folder"), 0);
    EXPECT_EQ(tree("folder"), (Lines{"/", "source/", "source/a/", "source/a/file: 1"}));
    EXPECT_EQ(tree("source"), (Lines{"/", "a/"}));
}

TEST_F(FileSystemManagerContract, RemovesAnEmptySourceEvenAfterAMergedCopy) {
    folder("source");
    folder("folder");
    folder("folder/source");
    EXPECT_EQ(copy("source", "folder"), 0);
    EXPECT_EQ(tree(), (Lines{"/", "folder/", "folder/source/"}));
}

TEST_F(FileSystemManagerContract, MergesAroundWhatCannotBeReplaced) {
    folder("source");
    file("source/a", "a file");
    folder("source/b");
    file("source/b/file", "1");
    file("source/c", "2");
    folder("folder");
    folder("folder/source");
    folder("folder/source/a");
    file("folder/source/b", "in the way of a folder");
    EXPECT_EQ(copy("source", "folder"), 0) << "what could not be merged is not told";
    EXPECT_EQ(tree("folder/source"), (Lines{"/", "a/", "b: in the way of a folder", "c: 2"}));
}

TEST_F(FileSystemManagerContract, FollowsNoLinkInsideAMerge) {
    folder("source");
    folder("source/a");
    file("source/a/file", "1");
    folder("outside");
    folder("folder");
    folder("folder/source");
    link("folder/source/a", "../../outside");
    EXPECT_EQ(copy("source", "folder"), 0);
    EXPECT_EQ(tree("outside"), (Lines{"/"}));
    EXPECT_EQ(tree("folder/source"), (Lines{"/", "a -> ../../outside"}));
}

TEST_F(FileSystemManagerContract, TransfersALinkAsALink) {
    folder("target");
    file("target/file", "1");
    link("link", "target");
    folder("folder");
    EXPECT_EQ(copy("link", "copy"), 0);
    EXPECT_EQ(move("link", "folder"), 0);
    EXPECT_EQ(tree("copy"), (Lines{" -> target"}));
    EXPECT_EQ(tree("folder"), (Lines{"/", "link -> target"}));
}

TEST_F(FileSystemManagerContract, MovesAFileToNothingOnly) {
    folder("source");
    file("source/file", "1");
    file("file", "old");
    folder("folder");
    EXPECT_EQ(moveFile("source", "file"), EEXIST);
    EXPECT_EQ(moveFile("source", "folder"), EEXIST);
    EXPECT_EQ(moveFile("source", "missing/x"), ENOENT);
    EXPECT_EQ(moveFile("source", "moved"), 0);
    EXPECT_EQ(tree("moved"), (Lines{"/", "file: 1"}));
    EXPECT_EQ(tree("file"), (Lines{": old"}));
}

TEST_F(FileSystemManagerContract, CopiesANamedItemIntoADirectoryThatItMakes) {
    folder("source");
    file("source/name", "1");
    EXPECT_EQ(copyNamed("source", "made/on/the/way"), 0);
    EXPECT_EQ(tree("made"), (Lines{"/", "on/", "on/the/", "on/the/way/", "on/the/way/name: 1"}));
    EXPECT_EQ(modeOf("made/on/the/way"), twin::kFolder | 0755);
    EXPECT_EQ(copyNamed("source", "made/on/the/way"), 0) << "replaces it";
    file("file");
    EXPECT_EQ(copyNamed("source", "file/below"), -1) << "cannot be made";
    EXPECT_EQ(copyNamed("made", "made"), -1) << "no such source";
}

TEST_F(FileSystemManagerContract, MovesEntriesByPrefix) {
    folder("from");
    folder("to");
    for (const char* name : {"from/ab1", "from/ab2", "from/a", "from/b-ab"}) {
        file(name, name);
    }
    EXPECT_EQ(movePrefixed("ab", "from/", "to/"), 0);
    EXPECT_EQ(listed("to"), (Lines{"ab1", "ab2"}));
    EXPECT_EQ(movePrefixed("", "from/", "to/"), 0);
    EXPECT_EQ(listed("to"), (Lines{"a", "ab1", "ab2", "b-ab"}));
    EXPECT_EQ(movePrefixed("", "from/", "to/"), 0) << "nothing to move";
    EXPECT_EQ(movePrefixed("", "missing/", "to/"), ENOENT);
}

TEST_F(FileSystemManagerContract, JoinsPrefixDirectoriesPlainly) {
    folder("from");
    file("from/a", "1");
    EXPECT_EQ(movePrefixed("a", "from", "to-"), -1) << "no such source: froma";
    EXPECT_EQ(movePrefixed("a", "from/", "to-"), 0);
    EXPECT_EQ(tree("to-a"), (Lines{": 1"}));
}

// Attributes and directories.

TEST_F(FileSystemManagerContract, SetsPermissions) {
    folder("folder");
    folder("folder/a");
    file("folder/a/file");
    link("folder/link", "a/file");
    EXPECT_EQ(manager_.setPermissions(at("folder").c_str(), 0700, Recursive::kNo), 0);
    EXPECT_EQ(modeOf("folder"), twin::kFolder | 0700);
    EXPECT_EQ(modeOf("folder/a"), twin::kFolder | 0755);
    EXPECT_EQ(manager_.setPermissions(at("folder").c_str(), 0711, Recursive::kYes), 0);
    for (const char* name : {"folder", "folder/a", "folder/a/file"}) {
        EXPECT_EQ(modeOf(name) & 07777, 0711U) << name;
    }
    EXPECT_EQ(manager_.setPermissions(at("folder/a/file").c_str(), 0600, Recursive::kYes), 0);
    EXPECT_EQ(modeOf("folder/a/file"), twin::kFile | 0600);
}

TEST_F(FileSystemManagerContract, SetsOwners) {
    folder("folder");
    file("folder/file");
    const auto uid = platform::ProcessUserId();
    const auto gid = platform::ProcessGroupId();
    EXPECT_EQ(manager_.setOwner(at("folder").c_str(), uid, gid, Recursive::kNo), 0);
    EXPECT_EQ(manager_.setOwner(at("folder").c_str(), uid, gid, Recursive::kYes), 0);
    EXPECT_EQ(item("folder/file").owner, uid);
    EXPECT_EQ(item("folder/file").group, gid);
}

TEST_F(FileSystemManagerContract, SaysInItsOwnWayThatNothingIsThere) {
    const std::string missing = at("missing");
    EXPECT_EQ(manager_.setPermissions(missing.c_str(), 0700, Recursive::kNo), -1);
    EXPECT_EQ(manager_.setPermissions(missing.c_str(), 0700, Recursive::kYes), 5);
    EXPECT_EQ(manager_.setOwner(missing.c_str(), 0, 0, Recursive::kNo), -1);
    EXPECT_EQ(manager_.setOwner(missing.c_str(), 0, 0, Recursive::kYes), 5);
    EXPECT_EQ(manager_.remove(missing), ENOENT);
    EXPECT_FALSE(manager_.exists(missing));
    EXPECT_FALSE(manager_.isDirectory(missing.c_str()));
    EXPECT_FALSE(manager_.isSymlink(missing));
    EXPECT_EQ(manager_.realPath(missing), "");
    EXPECT_EQ(manager_.readLink(missing), "");
    EXPECT_EQ(manager_.loadDictionary(missing), std::nullopt);
    EXPECT_EQ(manager_.loadData(missing), std::nullopt);
}

TEST_F(FileSystemManagerContract, CreatesDirectories) {
    EXPECT_EQ(manager_.createDirectory(at("a"), 0751, Intermediates::kNo), 0);
    EXPECT_EQ(manager_.createDirectory(at("a"), 0755, Intermediates::kNo), EEXIST);
    EXPECT_EQ(manager_.createDirectory(at("b/c"), 0755, Intermediates::kNo), ENOENT);
    EXPECT_EQ(manager_.createDirectory(at("b/c"), 0755, Intermediates::kCreate), 0);
    EXPECT_EQ(manager_.createDirectory(at("a"), 0755, Intermediates::kCreate), 0);
    EXPECT_EQ(modeOf("a"), twin::kFolder | 0751);
    EXPECT_EQ(tree(), (Lines{"/", "a/", "b/", "b/c/"}));
}

TEST_F(FileSystemManagerContract, CreatesNoDirectoryForOwnersThatNobodyKnows) {
    for (const char* names : {"of a user", "of a group"}) {
        const bool isUser = std::string_view(names) == "of a user";
        EXPECT_EQ(manager_.createDirectoryWithOwner(at("new"),
                                                    0755,
                                                    isUser ? "no-such-user" : "",
                                                    isUser ? "" : "no-such-group",
                                                    Intermediates::kCreate),
                  EINVAL)
            << names;
    }
    EXPECT_EQ(tree(), (Lines{"/"}));
}

// Questions.

TEST_F(FileSystemManagerContract, TellsWhatIsThere) {
    folder("folder");
    file("file");
    link("link", "folder");
    link("dangling", "nowhere");
    EXPECT_TRUE(manager_.exists(at("folder")) && manager_.exists(at("file")));
    EXPECT_TRUE(manager_.exists(at("link")));
    EXPECT_FALSE(manager_.exists(at("dangling")));
    EXPECT_TRUE(manager_.isDirectory(at("link").c_str()));
    EXPECT_FALSE(manager_.isDirectory(at("file").c_str()));
    EXPECT_TRUE(manager_.isSymlink(at("link")) && manager_.isSymlink(at("dangling")));
    EXPECT_FALSE(manager_.isSymlink(at("folder")));
    EXPECT_EQ(manager_.readLink(at("dangling")), "nowhere");
    EXPECT_EQ(manager_.readLink(at("file")), "");
    EXPECT_EQ(manager_.realPath(at("link")), manager_.realPath(at("folder")));
}

TEST_F(FileSystemManagerContract, ListsADirectory) {
    folder("folder");
    file("folder/a");
    folder("folder/b");
    file("folder/b/below");
    EXPECT_EQ(listed("folder"), (Lines{"a", "b"}));
    EXPECT_EQ(listed("folder", Paths::kFull), (Lines{at("folder/a"), at("folder/b")}));
    EXPECT_EQ(listed("folder/", Paths::kFull), (Lines{at("folder//a"), at("folder//b")}));
    std::list<std::string> entries{"from before"};
    EXPECT_EQ(manager_.listDirectory(at("missing"), &entries, Paths::kNames), ENOENT);
    EXPECT_TRUE(entries.empty());
    EXPECT_EQ(manager_.listDirectory(at("folder/a"), &entries, Paths::kNames), ENOTDIR);
}

TEST_F(FileSystemManagerContract, CutsLongLinks) {
    link("link", std::string(1030, 'x'));
    EXPECT_EQ(manager_.readLink(at("link")), std::string(1023, 'x'));
}

TEST_F(FileSystemManagerContract, RemovesTrees) {
    folder("folder");
    file("folder/file");
    EXPECT_EQ(manager_.remove(at("folder")), 0);
    EXPECT_EQ(manager_.remove(at("folder")), ENOENT);
    EXPECT_EQ(tree(), (Lines{"/"}));
}

TEST_F(FileSystemManagerContract, CreatesSymlinks) {
    EXPECT_EQ(manager_.createSymlink(at("link").c_str(), "target"), 0);
    EXPECT_EQ(manager_.createSymlink(at("link").c_str(), "other"), EEXIST);
    EXPECT_EQ(manager_.createSymlink(at("missing/link").c_str(), "target"), ENOENT);
    EXPECT_EQ(manager_.createSymlink(at("empty").c_str(), ""), ENOENT);
    EXPECT_EQ(tree(), (Lines{"/", "link -> target"}));
}

// Contents.

TEST_F(FileSystemManagerContract, LoadsWhatItWrote) {
    const PropertyList dictionary(PropertyList::Dictionary{{"key", PropertyList("value")}});
    const PropertyList array(PropertyList::Array{PropertyList("value")});
    EXPECT_TRUE(manager_.writeDictionary(at("dictionary"), &dictionary));
    EXPECT_TRUE(manager_.writePropertyList(at("binary"), &dictionary));
    EXPECT_TRUE(manager_.writePropertyList(at("array"), &array));
    EXPECT_EQ(manager_.loadDictionary(at("dictionary")), dictionary);
    EXPECT_EQ(manager_.loadDictionary(at("binary")), dictionary);
    EXPECT_EQ(manager_.loadDictionary(at("array")), std::nullopt);
    EXPECT_TRUE(item("dictionary").contents.starts_with("<?xml"));
    EXPECT_TRUE(item("binary").contents.starts_with("bplist00"));
    EXPECT_FALSE(manager_.writeDictionary(at("array"), &array));
}

TEST_F(FileSystemManagerContract, WritesNothingForNull) {
    EXPECT_FALSE(manager_.writeData(at("new"), nullptr));
    EXPECT_FALSE(manager_.writePropertyList(at("new"), nullptr));
    EXPECT_FALSE(manager_.writeDictionary(at("new"), nullptr));
    EXPECT_EQ(tree(), (Lines{"/"}));
}

TEST_F(FileSystemManagerContract, WritesAndLoadsData) {
    const std::vector<std::byte> data(3, std::byte{'x'});
    const std::vector<std::byte> none;
    file("file", "something longer");
    EXPECT_TRUE(manager_.writeData(at("file"), &data));
    EXPECT_TRUE(manager_.writeData(at("empty"), &none));
    EXPECT_EQ(manager_.loadData(at("file")), data);
    EXPECT_EQ(manager_.loadData(at("empty")), none);
    EXPECT_FALSE(manager_.writeData(at("missing/file"), &data));
    folder("folder");
    EXPECT_FALSE(manager_.writeData(at("folder"), &data));
    EXPECT_EQ(tree(), (Lines{"/", "empty: ", "file: xxx", "folder/"}));
}

TEST_F(FileSystemManagerContract, LoadsDataByAsciiPathsOnly) {
    file("f\xC3\xB6n", "1");
    EXPECT_TRUE(manager_.exists(at("f\xC3\xB6n")));
    EXPECT_EQ(manager_.loadData(at("f\xC3\xB6n")), std::nullopt);
}

TEST_F(FileSystemManagerContract, TakesWhatIsTooLargeForMissing) {
    constexpr std::size_t kMost = 16U << 20;
    file("large", std::string(kMost + 1, 'x'));
    EXPECT_EQ(manager_.loadData(at("large")), std::nullopt);
    EXPECT_EQ(manager_.loadDictionary(at("large")), std::nullopt);
    file("most", std::string(kMost, 'x'));
    ASSERT_TRUE(manager_.loadData(at("most")));
    EXPECT_EQ(manager_.loadData(at("most"))->size(), kMost);
}

TEST_F(FileSystemManagerContract, LoadsNothingButRegularFiles) {
    folder("folder");
    twin::Put(at("fifo"), {.mode = twin::kFifo | 0600});
    file("damaged", "<plist><dict>");
    for (const char* name : {"folder", "fifo"}) {
        EXPECT_EQ(manager_.loadData(at(name)), std::nullopt) << name;
        EXPECT_EQ(manager_.loadDictionary(at(name)), std::nullopt) << name;
    }
    EXPECT_EQ(manager_.loadDictionary(at("damaged")), std::nullopt);
}

TEST_F(FileSystemManagerContract, EmptiesFiles) {
    file("file", "contents", 0640);
    folder("folder");
    EXPECT_TRUE(manager_.createEmptyFile(at("file").c_str()));
    EXPECT_TRUE(manager_.createEmptyFile(at("new").c_str()));
    EXPECT_FALSE(manager_.createEmptyFile(at("folder").c_str()));
    EXPECT_FALSE(manager_.createEmptyFile(at("missing/new").c_str()));
    EXPECT_EQ(tree(), (Lines{"/", "file: ", "folder/", "new: "}));
    EXPECT_EQ(modeOf("file"), twin::kFile | 0640);
}

TEST_F(FileSystemManagerContract, LeavesAFileThatItCannotWriteAnewAsItIs) {
    const PropertyList impossible("a control character: \x01");
    file("file", "old");
    EXPECT_FALSE(manager_.writePropertyList(at("file"), &impossible));
    EXPECT_EQ(tree(), (Lines{"/", "file: old"}));
}

}  // namespace
