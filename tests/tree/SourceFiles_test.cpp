// Every source is built, and every folder of sources says what it is.
#include <gtest/gtest.h>

#include "tests/tree/SourceTree.h"

namespace {

TEST(SourceFiles, AreAllBuilt) {
    const char* const commandsFile = std::getenv("LINEFOLD_COMPILE_COMMANDS");
    ASSERT_NE(commandsFile, nullptr);
    const auto commands = tree::Read(commandsFile);
    for (const auto& file : tree::Files({".cpp", ".c"})) {
        EXPECT_NE(commands.find("/" + file + "\""), std::string::npos)
            << file << " is built by nothing";
    }
}

TEST(SourceFiles, SayWhatTheirFolderIs) {
    for (const auto& file : tree::Files({".txt"})) {
        if (file != "CMakeLists.txt") {
            EXPECT_TRUE(tree::Read(file).starts_with("# ")) << file;
        }
    }
}

TEST(SourceFiles, HeadersOpenWithWhatTheyAre) {
    for (const auto& file : tree::Files({".h"})) {
        const auto text = tree::Read(file);
        EXPECT_TRUE(text.starts_with("// ") || text.starts_with("/* ")) << file;
        EXPECT_TRUE(text.find("#pragma once") != std::string::npos ||
                    text.find("#ifndef ") != std::string::npos)
            << file;
    }
}

}  // namespace
