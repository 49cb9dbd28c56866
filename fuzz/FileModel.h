// A file tree in memory, and what the operations of the file-system manager do to it by their
// description.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

namespace fuzz {

struct Item {
    enum class Kind : unsigned char { kFolder, kFile, kLink };

    Kind kind = Kind::kFolder;
    unsigned mode = 0755;
    std::string text{};  ///< of a file, or where a link leads
    std::map<std::string, std::unique_ptr<Item>> below{};
    Item* parent = nullptr;

    [[nodiscard]] bool isFolder() const { return kind == Kind::kFolder; }
};

/// Where a path leads: the folder of its last step, and what is there (or null).
struct Spot {
    int error = 0;
    Item* folder = nullptr;
    std::string name{};
    Item* item = nullptr;
};

enum class Mode : bool { kCopy, kMove };

/// Paths have no slash at their ends; relative ones start at the top. Results are those of the
/// manager.
class FileModel {
public:
    FileModel();

    int createDirectory(const std::string& path, unsigned mode, bool intermediates);
    bool createEmptyFile(const std::string& path);
    bool writeData(const std::string& path, const std::string& text);
    int createSymlink(const std::string& path, const std::string& target);
    int transfer(const std::string& source, const std::string& destination, Mode mode);
    int moveFile(const std::string& source, const std::string& destination);
    int copyNamedItem(const std::string& source,
                      const std::string& destination,
                      const std::string& name);
    int remove(const std::string& path);
    int setPermissions(const std::string& path, unsigned mode, bool recursive);

    /// What a path leads to, or null.
    [[nodiscard]] Item* followed(const std::string& path) const;
    /// What is at a path, or null.
    [[nodiscard]] Item* at(const std::string& path) const;

    /// 0, or why the folder cannot be listed.
    int list(const std::string& path, std::vector<std::string>* names) const;

    /// Whether what a transfer does depends on the order in which a folder is read.
    [[nodiscard]] bool dependsOnOrder(const std::string& source,
                                      const std::string& destination) const;

    /// One line for each item: kind, mode, path and text.
    [[nodiscard]] std::vector<std::string> lines() const;

private:
    [[nodiscard]] Spot spot(const std::string& path) const;
    [[nodiscard]] int walk(Item* from, const std::string& path, int* links, Item** end) const;
    int put(const Spot& from, const Spot& to, Mode mode);
    void merge(const std::string& source, const std::string& destination, Mode mode);
    void mergeItem(const std::string& source, const std::string& destination, Mode mode);

    std::unique_ptr<Item> top_;
};

}  // namespace fuzz
