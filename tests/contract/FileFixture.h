// A folder of files for the contract suite, and trees of it as texts.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "tests/contract/FileTwin.h"
#include "tests/contract/Twin.h"

class FileFixture : public testing::Test {
protected:
    [[nodiscard]] std::string at(const std::string& name) const { return root_ + "/" + name; }

    void file(const std::string& name,
              const std::string& contents = "",
              std::uint32_t mode = 0644) const {
        twin::Put(at(name), {.mode = twin::kFile | mode, .contents = contents});
    }

    void folder(const std::string& name, std::uint32_t mode = 0755) const {
        twin::Put(at(name), {.mode = twin::kFolder | mode});
    }

    void link(const std::string& name, const std::string& target) const {
        twin::Put(at(name), {.mode = twin::kLink | 0777, .contents = target});
    }

    /// One line for each item below: "folder/", "file: contents", "link -> target".
    [[nodiscard]] std::vector<std::string> tree(const std::string& name = "") const {
        std::vector<std::string> lines;
        for (const auto& [subpath, item] : twin::Tree(name.empty() ? root_ : at(name))) {
            switch (item.mode & twin::kTypeBits) {
                case twin::kFolder:
                    lines.push_back(subpath + "/");
                    break;
                case twin::kLink:
                    lines.push_back(subpath + " -> " + item.contents);
                    break;
                case twin::kFile:
                    lines.push_back(subpath + ": " + item.contents);
                    break;
                default:
                    lines.push_back(subpath + " is special");
            }
        }
        return lines;
    }

    [[nodiscard]] twin::Item item(const std::string& name) const {
        const auto found = twin::Tree(at(name));
        return found.empty() ? twin::Item{.mode = 0} : found.at("");
    }

    [[nodiscard]] std::uint32_t modeOf(const std::string& name) const { return item(name).mode; }

    using Lines = std::vector<std::string>;

private:
    // After the world was made anew.
    struct WorldReset {
        WorldReset() { twin::Reset(); }
    } reset_;

    const std::string root_ = twin::FreshFolder();
};
