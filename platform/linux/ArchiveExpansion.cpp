// The library reads; what is written is written here. Its own writer works by path texts that it
// checks before it uses them, which is no check where somebody else can rename folders meanwhile.
#include "platform/linux/ArchiveExpansion.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <optional>
#include <vector>

#include "platform/FileManager.h"
#include "platform/linux/ArchiveNames.h"
#include "platform/linux/ExpandedTree.h"

namespace platform {
namespace {

constexpr std::size_t kMostItems = 100'000;
constexpr std::uint64_t kMostBytes = std::uint64_t{1} << 30;
/// What is left of an entry's mode: set-id and sticky bits do not come from outside, nor does the
/// right of others to write.
constexpr mode_t kModeMask = 0755;

class Expansion {
public:
    Expansion(int archive, int folder, const ArchiveHandlers& handlers)
        : reader_(archive), tree_(folder), handlers_(handlers), buffer_(kBufferSize) {}

    [[nodiscard]] int run();

private:
    static constexpr std::size_t kBufferSize = 64 << 10;

    [[nodiscard]] ArchiveResult expand(const ArchiveEntry& entry);
    [[nodiscard]] ArchiveResult expandFile(const ArchiveEntry& entry,
                                           const ExpandedTree::Steps& steps);
    [[nodiscard]] ArchiveResult writeAll(const ArchiveEntry& entry, UnfinishedFile* file);

    [[nodiscard]] ArchiveResult refuse(ArchiveError error);
    [[nodiscard]] ArchiveResult end(ArchiveError error);
    [[nodiscard]] ArchiveResult outcomeOf(int error);
    [[nodiscard]] ArchiveResult outcomeOfReading(ArchiveResult result);

    ArchiveReader reader_;
    ExpandedTree tree_;
    const ArchiveHandlers& handlers_;
    std::vector<std::byte> buffer_;
    std::size_t entries_ = 0;
    std::uint64_t bytesLeft_ = kMostBytes;
    ArchiveError error_;
};

ArchiveResult Expansion::refuse(ArchiveError error) {
    error_ = std::move(error);
    return ArchiveResult::kEntryFailed;
}

ArchiveResult Expansion::end(ArchiveError error) {
    error_ = std::move(error);
    return ArchiveResult::kArchiveFailed;
}

ArchiveResult Expansion::outcomeOf(int error) {
    if (error == 0) {
        return ArchiveResult::kSuccess;
    }
    // A link in the way is as little a folder as a file is.
    ArchiveError told{error, error == ENOTDIR ? "a file or link is in the way" : strerror(error)};
    return ConcernsAllItems(error) ? end(std::move(told)) : refuse(std::move(told));
}

ArchiveResult Expansion::outcomeOfReading(ArchiveResult result) {
    if (result == ArchiveResult::kEntryFailed || result == ArchiveResult::kArchiveFailed) {
        error_ = reader_.error();
    }
    return result;
}

int Expansion::run() {
    while (true) {
        ArchiveEntry entry;
        ArchiveResult result = outcomeOfReading(reader_.next(&entry));
        if (result == ArchiveResult::kEnd) {
            return 0;
        }
        // Folders that names imply count as entries: each would otherwise be good for many.
        if (result != ArchiveResult::kArchiveFailed &&
            ++entries_ + tree_.impliedFolders() > kMostItems) {
            result = end({EFBIG, "more than 100,000 entries"});
        }
        if (result == ArchiveResult::kSuccess) {
            result = expand(entry);
        }
        if (result == ArchiveResult::kArchiveFailed) {
            handlers_.archiveFailed(error_);
            return error_.code;
        }
        if (result == ArchiveResult::kEntryFailed && !handlers_.entryFailed(entry.name, error_)) {
            return error_.code;
        }
    }
}

ArchiveResult Expansion::expand(const ArchiveEntry& entry) {
    ArchivePath path = ParseArchiveName(entry.name);
    if (path.error) {
        return refuse(std::move(*path.error));
    }
    if (entry.isHardLink) {
        return refuse({EPERM, "a hard link"});
    }
    switch (entry.mode & S_IFMT) {
        case S_IFDIR:
            return outcomeOf(tree_.makeFolder(path.steps, entry.mode & kModeMask));
        case S_IFLNK:
            if (auto error = CheckLinkTarget(entry.linkTarget, path.steps.size() - 1)) {
                return refuse(std::move(*error));
            }
            return outcomeOf(tree_.makeLink(path.steps, entry.linkTarget));
        case S_IFREG:
            return expandFile(entry, path.steps);
        default:
            return refuse({EOPNOTSUPP, "neither file, folder nor link"});
    }
}

ArchiveResult Expansion::expandFile(const ArchiveEntry& entry, const ExpandedTree::Steps& steps) {
    if (entry.size > bytesLeft_) {
        return end({EFBIG, "more than 1 GiB"});
    }
    UnfinishedFile file;
    if (const int error = file.create(tree_, steps, entry.mode & kModeMask); error != 0) {
        return outcomeOf(error);
    }
    const ArchiveResult result = writeAll(entry, &file);
    return result == ArchiveResult::kSuccess ? outcomeOf(file.finish(entry.modified)) : result;
}

/// Its size was announced, and is held against what comes while it comes: what has been written
/// cannot be taken back from the time and the room that it cost.
ArchiveResult Expansion::writeAll(const ArchiveEntry& entry, UnfinishedFile* file) {
    std::uint64_t written = 0;
    while (true) {
        std::size_t size = 0;
        const ArchiveResult result = outcomeOfReading(reader_.read(buffer_, &size));
        if (result == ArchiveResult::kEnd) {
            return written == entry.size ? ArchiveResult::kSuccess
                                         : refuse({EILSEQ, "less data than announced"});
        }
        if (result != ArchiveResult::kSuccess) {
            return result;
        }
        written += size;
        if (written > entry.size) {
            return refuse({EILSEQ, "more data than announced"});
        }
        bytesLeft_ -= size;
        if (const int error = file->write(std::span(buffer_).first(size)); error != 0) {
            return outcomeOf(error);
        }
    }
}

}  // namespace

int ExpandArchive(int archive, int folder, const ArchiveHandlers& handlers) {
    return Expansion(archive, folder, handlers).run();
}

}  // namespace platform
