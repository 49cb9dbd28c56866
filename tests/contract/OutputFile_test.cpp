#include "platform/OutputFile.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "tests/contract/Twin.h"

namespace {

using platform::OutputFile;

std::span<const std::byte> Bytes(std::string_view text) {
    return std::as_bytes(std::span(text));
}

class OutputFileContract : public testing::Test {
protected:
    OutputFileContract() { twin::Reset(); }

    [[nodiscard]] static std::string at(const std::string& name) {
        return twin::Folder() + "/" + name;
    }

    /// Opens, writes and closes; 0 or the first error.
    static int write(const std::string& path, std::string_view contents) {
        OutputFile file;
        if (const int error = file.open(path); error != 0) {
            return error;
        }
        const int error = file.write(Bytes(contents));
        return error != 0 ? error : file.close();
    }

    [[nodiscard]] static std::string contents(const std::string& path) {
        const auto file = twin::FileAt(path);
        return file ? file->contents : "(no file)";
    }
};

TEST_F(OutputFileContract, MakesAFile) {
    EXPECT_EQ(write(at("new"), "contents"), 0);
    EXPECT_EQ(contents(at("new")), "contents");
    EXPECT_EQ(twin::FileAt(at("new"))->permissions, 0644U);
}

TEST_F(OutputFileContract, EmptiesAFileAndKeepsItsMode) {
    twin::PutFile(at("old"), "what it held before", 0600);
    EXPECT_EQ(write(at("old"), "new"), 0);
    EXPECT_EQ(contents(at("old")), "new");
    EXPECT_EQ(twin::FileAt(at("old"))->permissions, 0600U);
}

TEST_F(OutputFileContract, WritesPieceBehindPiece) {
    OutputFile file;
    ASSERT_EQ(file.open(at("file")), 0);
    const std::string large(1UL << 20, 'x');
    EXPECT_EQ(file.write(Bytes("first ")), 0);
    EXPECT_EQ(file.write({}), 0);
    EXPECT_EQ(file.write(Bytes(large)), 0);
    EXPECT_EQ(file.close(), 0);
    EXPECT_EQ(contents(at("file")), "first " + large);
}

TEST_F(OutputFileContract, NeverFollowsALinkInTheLastStep) {
    twin::PutFile(at("precious"), "kept", 0644);
    twin::PutLink(at("link"), at("precious"));
    twin::PutLink(at("dangling"), at("nothing"));
    EXPECT_EQ(write(at("link"), "x"), ELOOP);
    EXPECT_EQ(write(at("dangling"), "x"), ELOOP);
    EXPECT_EQ(contents(at("precious")), "kept");
    EXPECT_FALSE(twin::FileAt(at("nothing")));
}

TEST_F(OutputFileContract, FollowsLinksOnTheWay) {
    twin::PutDirectory(at("folder"));
    twin::PutLink(at("way"), "folder");
    EXPECT_EQ(write(at("way/file"), "x"), 0);
    EXPECT_EQ(contents(at("folder/file")), "x");
}

TEST_F(OutputFileContract, OpensFilesOnly) {
    twin::PutDirectory(at("folder"));
    twin::PutFifo(at("fifo"));
    EXPECT_EQ(write(at("folder"), "x"), EISDIR);
    EXPECT_EQ(write(at("folder/."), "x"), EISDIR);
    EXPECT_EQ(write(at("folder/.."), "x"), EISDIR);
    EXPECT_EQ(write("/", "x"), EISDIR);
    EXPECT_EQ(write(at("fifo"), "x"), EINVAL);
    EXPECT_EQ(write(at("new/"), "x"), EISDIR);
    EXPECT_FALSE(twin::FileAt(at("new")));
}

TEST_F(OutputFileContract, SaysWhyAPathLeadsNowhere) {
    twin::PutFile(at("file"), "kept", 0644);
    EXPECT_EQ(write("", "x"), ENOENT);
    EXPECT_EQ(write(at("nowhere/file"), "x"), ENOENT);
    EXPECT_EQ(write(at("file/file"), "x"), ENOTDIR);
    EXPECT_EQ(write(at(std::string(256, 'n')), "x"), ENAMETOOLONG);
    EXPECT_EQ(contents(at("file")), "kept");
}

TEST_F(OutputFileContract, WritesNothingUnlessItIsOpen) {
    OutputFile file;
    EXPECT_EQ(file.write(Bytes("x")), EBADF);
    EXPECT_EQ(file.write({}), EBADF);
    EXPECT_EQ(file.close(), EBADF);
    ASSERT_EQ(file.open(at("file")), 0);
    EXPECT_EQ(file.close(), 0);
    EXPECT_EQ(file.write(Bytes("x")), EBADF);
    EXPECT_EQ(file.open(at("nowhere/file")), ENOENT);
    EXPECT_EQ(file.close(), EBADF);
}

TEST_F(OutputFileContract, ClosesTheOldWhenItOpensTheNew) {
    OutputFile file;
    ASSERT_EQ(file.open(at("first")), 0);
    EXPECT_EQ(file.write(Bytes("1")), 0);
    ASSERT_EQ(file.open(at("second")), 0);
    OutputFile moved = std::move(file);
    EXPECT_EQ(moved.write(Bytes("2")), 0);
    EXPECT_EQ(moved.close(), 0);
    EXPECT_EQ(contents(at("first")), "1");
    EXPECT_EQ(contents(at("second")), "2");
}

TEST_F(OutputFileContract, GoesOnWithAFileThatWasRemoved) {
    OutputFile file;
    ASSERT_EQ(file.open(at("file")), 0);
    twin::RemoveFile(at("file"));
    EXPECT_EQ(file.write(Bytes("unseen")), 0);
    EXPECT_EQ(file.close(), 0);
    EXPECT_FALSE(twin::FileAt(at("file")));
}

}  // namespace
