// The files of the source tree, for tests that hold it to its rules.
#pragma once

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>
#include <string>
#include <vector>

namespace tree {

inline std::filesystem::path Root() {
    const char* const root = std::getenv("LINEFOLD_SOURCE_DIR");
    return root == nullptr ? std::filesystem::current_path() : std::filesystem::path(root);
}

inline std::string Read(const std::filesystem::path& file) {
    std::ifstream stream(Root() / file);
    std::ostringstream text;
    text << stream.rdbuf();
    return text.str();
}

/// Paths, relative to the root, of all files with one of the endings, outside build folders.
inline std::vector<std::string> Files(const std::set<std::string>& endings) {
    std::vector<std::string> files;
    for (auto entry = std::filesystem::recursive_directory_iterator(Root());
         entry != std::filesystem::recursive_directory_iterator();
         ++entry) {
        const auto path = std::filesystem::relative(entry->path(), Root());
        const auto name = path.filename().string();
        if (entry->is_directory() && (name == "build" || name == ".git")) {
            entry.disable_recursion_pending();
        } else if (entry->is_regular_file() && endings.contains(path.extension())) {
            files.push_back(path.string());
        }
    }
    return files;
}

}  // namespace tree
