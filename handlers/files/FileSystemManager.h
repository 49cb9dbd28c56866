// FileSystemManager: the file operations on this system's file manager and POSIX calls.
#pragma once

#include "handlers/files/FileSystemInterface.h"

/// One is made for the span of one request or job, on the stack; it keeps nothing.
class FileSystemManager final : public FileSystemInterface {
public:
    FileSystemManager() = default;

    int moveItem(const char* source, const char* destination) override;
    int moveItemWithOwner(const char* source,
                          const char* destination,
                          std::uint32_t uid,
                          std::uint32_t gid) override;
    int moveFile(const char* source, const char* destination) override;
    int copyItem(const char* source, const char* destination) override;
    int copyNamedItem(std::string_view sourceDirectory,
                      std::string_view destinationDirectory,
                      std::string_view name) override;
    int setPermissions(const char* path, std::uint32_t mode, Recursive recursive) override;
    int setOwner(const char* path,
                 std::uint32_t uid,
                 std::uint32_t gid,
                 Recursive recursive) override;
    int createDirectory(std::string_view path,
                        std::uint32_t mode,
                        Intermediates intermediates) override;
    int createDirectoryWithOwner(std::string_view path,
                                 std::uint32_t mode,
                                 std::string_view ownerName,
                                 std::string_view groupName,
                                 Intermediates intermediates) override;
    [[nodiscard]] bool exists(std::string_view path) override;
    std::int32_t listDirectory(std::string_view directory,
                               std::list<std::string>* entries,
                               Paths paths) override;
    int moveEntriesWithPrefix(std::string_view prefix,
                              std::string_view sourceDirectory,
                              std::string_view destinationDirectory) override;
    int remove(std::string_view path) override;
    [[nodiscard]] std::string baseName(std::string_view path) override;
    [[nodiscard]] std::string dirName(std::string_view path) override;
    [[nodiscard]] std::string realPath(std::string_view path) override;
    [[nodiscard]] std::string readLink(std::string_view path) override;
    [[nodiscard]] std::optional<platform::PropertyList> loadDictionary(
        std::string_view path) override;
    [[nodiscard]] std::optional<std::vector<std::byte>> loadData(std::string_view path) override;
    bool writeData(std::string_view path, const std::vector<std::byte>* data) override;
    bool writePropertyList(std::string_view path, const platform::PropertyList* list) override;
    bool writeDictionary(std::string_view path, const platform::PropertyList* dictionary) override;
    [[nodiscard]] bool isSymlink(std::string_view path) override;
    int createSymlink(const char* linkPath, const char* target) override;
    [[nodiscard]] bool isDirectory(const char* path) override;
    bool createEmptyFile(const char* path) override;
};
