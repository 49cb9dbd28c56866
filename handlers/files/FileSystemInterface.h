// FileSystemInterface: the file operations of the request handlers, with the results that they
// test.
#pragma once

#include <cstddef>
#include <cstdint>
#include <list>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/PropertyList.h"

/// Paths are UTF-8 texts. Results are mixed on purpose, and told with each operation, since callers
/// test them as they are: 0 for success, otherwise an errno value, a failure code of the file
/// manager (an errno value, too, and never absent), -1 from a failed POSIX call, or 5 where nothing
/// was there to work on. The order of the operations is binding.
///
/// Links that strangers own lead nowhere, and below a folder that is worked on no link is followed:
/// platform/PathAccess.h and platform/DirectoryAccess.h have the rules.
class FileSystemInterface {
public:
    enum class Recursive : bool { kNo, kYes };
    enum class Intermediates : bool { kNo, kCreate };
    enum class Paths : bool { kNames, kFull };

    FileSystemInterface(const FileSystemInterface&) = delete;
    FileSystemInterface& operator=(const FileSystemInterface&) = delete;
    virtual ~FileSystemInterface() = default;

    /// moveItemWithOwner with the process's own uid and gid.
    virtual int moveItem(const char* source, const char* destination) = 0;

    /// Gives the source to the owner and moves it: to the path if nothing is there, else in the
    /// place of the file there, else into the directory there under its own name. Trees that meet
    /// are merged item by item, and what of them could not be merged is not told. 0, -1 (no such
    /// source), 17 (a directory onto a file), or, where nothing was, a failure code.
    virtual int moveItemWithOwner(const char* source,
                                  const char* destination,
                                  std::uint32_t uid,
                                  std::uint32_t gid) = 0;

    /// Gives the source to the process, with all below it, and moves it to a path where nothing
    /// is. 0, -1 (no such source), or a failure code.
    virtual int moveFile(const char* source, const char* destination) = 0;

    /// The same as moveItem, but copies; the source is given to the process all the same. What is
    /// in the way is removed first, so a file that is copied onto itself is lost.
    virtual int copyItem(const char* source, const char* destination) = 0;

    /// Copies source directory/name to destination directory/name, and makes the destination
    /// directory (0755) if it is missing. What copyItem gives, or -1 if it could not be made.
    virtual int copyNamedItem(std::string_view sourceDirectory,
                              std::string_view destinationDirectory,
                              std::string_view name) = 0;

    /// Of the item alone: 0 or -1. Recursive, with all that lies below it: 0, 5 when there is
    /// nothing at the path, the item's own failure code, or the last one below it. Links are never
    /// followed to what they lead to.
    virtual int setPermissions(const char* path, std::uint32_t mode, Recursive recursive) = 0;
    virtual int setOwner(const char* path,
                         std::uint32_t uid,
                         std::uint32_t gid,
                         Recursive recursive) = 0;

    /// 0 or a failure code.
    virtual int createDirectory(std::string_view path,
                                std::uint32_t mode,
                                Intermediates intermediates) = 0;

    /// The same; names that are empty set no owner and no group, and one that nobody knows is
    /// EINVAL.
    virtual int createDirectoryWithOwner(std::string_view path,
                                         std::uint32_t mode,
                                         std::string_view ownerName,
                                         std::string_view groupName,
                                         Intermediates intermediates) = 0;

    [[nodiscard]] virtual bool exists(std::string_view path) = 0;

    /// Empties the list and fills it with the entries. 0 or a failure code.
    virtual std::int32_t listDirectory(std::string_view directory,
                                       std::list<std::string>* entries,
                                       Paths paths) = 0;

    /// Moves every entry whose name begins so. Both directories are to end in a slash: names are
    /// put behind them as they are. The first result that is not 0 ends it.
    virtual int moveEntriesWithPrefix(std::string_view prefix,
                                      std::string_view sourceDirectory,
                                      std::string_view destinationDirectory) = 0;

    /// Removes an item with all below it. 0 or a failure code.
    virtual int remove(std::string_view path) = 0;

    /// basename(3) and dirname(3) of the first 1023 bytes.
    [[nodiscard]] virtual std::string baseName(std::string_view path) = 0;
    [[nodiscard]] virtual std::string dirName(std::string_view path) = 0;

    /// realpath(3), and readlink(2) of at most 1023 bytes; empty on failure.
    [[nodiscard]] virtual std::string realPath(std::string_view path) = 0;
    [[nodiscard]] virtual std::string readLink(std::string_view path) = 0;

    /// The dictionary at the top of a property-list file.
    [[nodiscard]] virtual std::optional<platform::PropertyList> loadDictionary(
        std::string_view path) = 0;

    /// The bytes of a file whose path is ASCII.
    [[nodiscard]] virtual std::optional<std::vector<std::byte>> loadData(std::string_view path) = 0;

    /// Replaces a file in one step. False for null and on failure.
    virtual bool writeData(std::string_view path, const std::vector<std::byte>* data) = 0;

    /// Writes a binary property list from the start of the file. False for null, and when nothing
    /// was written.
    virtual bool writePropertyList(std::string_view path, const platform::PropertyList* list) = 0;

    /// Replaces a file by an XML property list in one step. False for null and on failure.
    virtual bool writeDictionary(std::string_view path,
                                 const platform::PropertyList* dictionary) = 0;

    /// False for a missing path, too.
    [[nodiscard]] virtual bool isSymlink(std::string_view path) = 0;

    /// 0 or an errno value.
    virtual int createSymlink(const char* linkPath, const char* target) = 0;

    [[nodiscard]] virtual bool isDirectory(const char* path) = 0;

    /// Empties the file or makes an empty one.
    virtual bool createEmptyFile(const char* path) = 0;

protected:
    FileSystemInterface() = default;
};
