#include "handlers/files/FileSystemManager.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "handlers/files/PathNames.h"
#include "handlers/files/RecursiveAttributes.h"
#include "handlers/files/Transfer.h"
#include "platform/DirectoryAccess.h"
#include "platform/FileManager.h"
#include "platform/OutputFile.h"
#include "platform/PathAccess.h"
#include "platform/Process.h"
#include "platform/PropertyListLimits.h"
#include "platform/UserDatabase.h"

using platform::FileAttributes;
using platform::PathAccess;
using platform::PropertyList;

namespace {

/// What a failed POSIX call gives.
constexpr int kCallFailed = -1;
constexpr std::uint32_t kNewDirectoryMode = 0755;
constexpr std::size_t kLinkBytesMax = 1023;
constexpr std::size_t kFileBytesMax = platform::kPropertyListLimits.bytes;

int AsPosixResult(int error) {
    return error == 0 ? 0 : kCallFailed;
}

std::string Joined(std::string_view directory, std::string_view name) {
    return std::string(directory).append("/").append(name);
}

bool IsAscii(std::string_view text) {
    return std::ranges::all_of(text, [](char byte) { return (byte & 0x80) == 0; });
}

/// The attributes of a new directory. EINVAL for a user or a group that nobody knows.
int AttributesFor(std::uint32_t mode,
                  std::string_view ownerName,
                  std::string_view groupName,
                  FileAttributes* attributes) {
    attributes->permissions = mode;
    if (!ownerName.empty()) {
        const auto owner = platform::UserRecordByName(std::string(ownerName).c_str());
        if (!owner) {
            return EINVAL;
        }
        attributes->owner = owner->uid;
    }
    if (!groupName.empty()) {
        attributes->group = platform::GroupIdByName(std::string(groupName).c_str());
    }
    return groupName.empty() || attributes->group ? 0 : EINVAL;
}

bool Replace(std::string_view path, const std::vector<std::byte>& contents) {
    return FileManagerReplaceContents(PathAccess(path), contents) == 0;
}

}  // namespace

int FileSystemManager::moveItem(const char* source, const char* destination) {
    return moveItemWithOwner(
        source, destination, platform::ProcessUserId(), platform::ProcessGroupId());
}

int FileSystemManager::moveItemWithOwner(const char* source,
                                         const char* destination,
                                         std::uint32_t uid,
                                         std::uint32_t gid) {
    return PerformTransfer({.source = source,
                            .destination = destination,
                            .uid = uid,
                            .gid = gid,
                            .mode = TransferMode::kMove});
}

int FileSystemManager::moveFile(const char* source, const char* destination) {
    const PathAccess item(source);
    platform::FileStatus status;
    if (item.stat(&status) != 0) {
        return kCallFailed;
    }
    (void)setOwner(source, platform::ProcessUserId(), platform::ProcessGroupId(), Recursive::kYes);
    return FileManagerMoveItem(item, PathAccess(destination));
}

int FileSystemManager::copyItem(const char* source, const char* destination) {
    return PerformTransfer({.source = source,
                            .destination = destination,
                            .uid = platform::ProcessUserId(),
                            .gid = platform::ProcessGroupId(),
                            .mode = TransferMode::kCopy});
}

int FileSystemManager::copyNamedItem(std::string_view sourceDirectory,
                                     std::string_view destinationDirectory,
                                     std::string_view name) {
    if (!exists(destinationDirectory) &&
        createDirectory(destinationDirectory, kNewDirectoryMode, Intermediates::kCreate) != 0) {
        return kCallFailed;
    }
    return copyItem(Joined(sourceDirectory, name).c_str(),
                    Joined(destinationDirectory, name).c_str());
}

int FileSystemManager::setPermissions(const char* path, std::uint32_t mode, Recursive recursive) {
    return recursive == Recursive::kYes ? SetAttributesRecursively(path, {.permissions = mode})
                                        : AsPosixResult(PathAccess(path).setMode(mode));
}

int FileSystemManager::setOwner(const char* path,
                                std::uint32_t uid,
                                std::uint32_t gid,
                                Recursive recursive) {
    return recursive == Recursive::kYes
               ? SetAttributesRecursively(path, {.owner = uid, .group = gid})
               : AsPosixResult(PathAccess(path).setOwner(uid, gid));
}

int FileSystemManager::createDirectory(std::string_view path,
                                       std::uint32_t mode,
                                       Intermediates intermediates) {
    return createDirectoryWithOwner(path, mode, {}, {}, intermediates);
}

int FileSystemManager::createDirectoryWithOwner(std::string_view path,
                                                std::uint32_t mode,
                                                std::string_view ownerName,
                                                std::string_view groupName,
                                                Intermediates intermediates) {
    FileAttributes attributes;
    if (const int error = AttributesFor(mode, ownerName, groupName, &attributes); error != 0) {
        return error;
    }
    return FileManagerCreateDirectory(path,
                                      intermediates == Intermediates::kCreate
                                          ? platform::IntermediateDirectories::kAreMade
                                          : platform::IntermediateDirectories::kMustExist,
                                      attributes);
}

bool FileSystemManager::exists(std::string_view path) {
    return KindAt(PathAccess(path)) != ItemKind::kNone;
}

std::int32_t FileSystemManager::listDirectory(std::string_view directory,
                                              std::list<std::string>* entries,
                                              Paths paths) {
    entries->clear();
    std::vector<std::string> names;
    const int error = platform::DirectoryAccess(PathAccess(directory)).list(&names);
    for (auto& name : names) {
        entries->push_back(paths == Paths::kFull ? Joined(directory, name) : std::move(name));
    }
    return error;
}

int FileSystemManager::moveEntriesWithPrefix(std::string_view prefix,
                                             std::string_view sourceDirectory,
                                             std::string_view destinationDirectory) {
    std::list<std::string> names;
    if (const auto error = listDirectory(sourceDirectory, &names, Paths::kNames); error != 0) {
        return error;
    }
    for (const auto& name : names) {
        if (!name.starts_with(prefix)) {
            continue;
        }
        // As they stand: a directory without a slash at its end runs into the name.
        const std::string source = std::string(sourceDirectory) + name;
        const std::string destination = std::string(destinationDirectory) + name;
        if (const int result = moveItem(source.c_str(), destination.c_str()); result != 0) {
            return result;
        }
    }
    return 0;
}

int FileSystemManager::remove(std::string_view path) {
    return FileManagerRemoveItem(PathAccess(path));
}

std::string FileSystemManager::baseName(std::string_view path) {
    return BaseName(path);
}

std::string FileSystemManager::dirName(std::string_view path) {
    return DirName(path);
}

std::string FileSystemManager::realPath(std::string_view path) {
    std::string real;
    (void)PathAccess(path).realPath(&real);  // empty on failure
    return real;
}

std::string FileSystemManager::readLink(std::string_view path) {
    std::string contents;
    (void)PathAccess(path).readLink(&contents);  // empty on failure
    return contents.substr(0, kLinkBytesMax);
}

std::optional<PropertyList> FileSystemManager::loadDictionary(std::string_view path) {
    std::vector<std::byte> contents;
    if (PathAccess(path).read(kFileBytesMax, &contents) != 0) {
        return std::nullopt;
    }
    auto list = platform::PropertyListCreateWithData(contents);
    return list && list->kind() == PropertyList::Kind::kDictionary ? std::move(list) : std::nullopt;
}

std::optional<std::vector<std::byte>> FileSystemManager::loadData(std::string_view path) {
    std::vector<std::byte> contents;
    if (!IsAscii(path) || PathAccess(path).read(kFileBytesMax, &contents) != 0) {
        return std::nullopt;
    }
    return contents;
}

bool FileSystemManager::writeData(std::string_view path, const std::vector<std::byte>* data) {
    return data != nullptr && Replace(path, *data);
}

bool FileSystemManager::writePropertyList(std::string_view path, const PropertyList* list) {
    if (list == nullptr) {
        return false;
    }
    // First of all: what cannot be written leaves the file as it is.
    const auto contents = platform::PropertyListCreateBinaryData(*list);
    platform::OutputFile file;
    if (!contents || file.open(path) != 0) {
        return false;
    }
    const bool isWritten = file.write(*contents) == 0;
    return file.close() == 0 && isWritten;
}

bool FileSystemManager::writeDictionary(std::string_view path, const PropertyList* dictionary) {
    if (dictionary == nullptr || dictionary->kind() != PropertyList::Kind::kDictionary) {
        return false;
    }
    const auto contents = platform::PropertyListCreateXmlData(*dictionary);
    return contents && Replace(path, *contents);
}

bool FileSystemManager::isSymlink(std::string_view path) {
    platform::FileStatus status;
    return PathAccess(path).lstat(&status) == 0 && S_ISLNK(status.mode);
}

int FileSystemManager::createSymlink(const char* linkPath, const char* target) {
    return PathAccess(linkPath).symlink(target);
}

bool FileSystemManager::isDirectory(const char* path) {
    return KindAt(PathAccess(path)) == ItemKind::kDirectory;
}

bool FileSystemManager::createEmptyFile(const char* path) {
    platform::OutputFile file;
    return file.open(path) == 0 && file.close() == 0;
}
