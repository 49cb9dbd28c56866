#include "platform/linux/ArchiveReader.h"

#include <archive.h>
#include <archive_entry.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <string_view>

namespace platform {
namespace {

/// All that is read, with what is read twice: an archive of 1 GiB and a directory to it fit.
constexpr std::uint64_t kMostRead = std::uint64_t{2} << 30;

/// The library keeps the whole central directory in memory. It would do so for any number of
/// records, so they are counted on the way to it: twice the entries that are expanded at most.
constexpr std::size_t kMostRecords = 200'000;
constexpr std::string_view kRecordMark{"PK\1\2", 4};

struct FreeArchive {
    void operator()(archive* reader) const { archive_read_free(reader); }
};

using OwnedArchive = std::unique_ptr<archive, FreeArchive>;

/// The bytes of the file, as the library asks for them.
class Source {
public:
    explicit Source(int file) : file_(file) {}

    la_ssize_t read(archive* reader, const void** bytes) {
        const ssize_t size = pread(file_, buffer_.data(), buffer_.size(), offset_);
        if (size < 0) {
            archive_set_error(reader, errno, "%s", std::strerror(errno));
            return -1;
        }
        offset_ += size;
        readInAll_ += static_cast<std::uint64_t>(size);
        count({buffer_.data(), static_cast<std::size_t>(size)});
        if (readInAll_ > kMostRead || records_ > kMostRecords) {
            archive_set_error(reader, EFBIG, "more to read than an archive may have");
            return -1;
        }
        *bytes = buffer_.data();
        return size;
    }

    la_int64_t seek(la_int64_t offset, int whence) {
        struct stat status {};

        if (whence == SEEK_END && fstat(file_, &status) != 0) {
            return ARCHIVE_FATAL;
        }
        const la_int64_t from = whence == SEEK_SET   ? 0
                                : whence == SEEK_CUR ? la_int64_t{offset_}
                                                     : la_int64_t{status.st_size};
        la_int64_t place = 0;
        if (__builtin_add_overflow(from, offset, &place) || place < 0) {
            return ARCHIVE_FATAL;
        }
        offset_ = place;
        return place;
    }

    /// The central directory has been read.
    void endDirectory() { isInDirectory_ = false; }

private:
    void count(std::string_view bytes) {
        if (!isInDirectory_) {
            return;
        }
        for (auto at = bytes.find(kRecordMark); at != std::string_view::npos;
             at = bytes.find(kRecordMark, at + 1)) {
            ++records_;
        }
    }

    const int file_;
    off_t offset_ = 0;
    std::uint64_t readInAll_ = 0;
    std::size_t records_ = 0;
    bool isInDirectory_ = true;
    std::array<char, 64 << 10> buffer_;
};

Source& SourceOf(void* data) {
    return *static_cast<Source*>(data);
}

la_ssize_t Read(archive* reader, void* data, const void** bytes) {
    return SourceOf(data).read(reader, bytes);
}

la_int64_t Seek(archive* /*reader*/, void* data, la_int64_t offset, int whence) {
    return SourceOf(data).seek(offset, whence);
}

/// The library's own numbers for what is no errno value are below 1.
int CodeOf(archive* reader) {
    const int code = archive_errno(reader);
    return code > 0 ? code : EILSEQ;
}

/// Told in the name of the format alone.
bool HasKnownMethod(archive* reader) {
    const char* const name = archive_format_name(reader);
    const std::string_view format = name == nullptr ? "" : name;
    return format.ends_with("(uncompressed)") || format.ends_with("(deflation)");
}

/// An archive without entries is the end of a directory alone, which the library does not know.
bool IsEmptyArchive(int file) {
    constexpr std::string_view kStart("PK\5\6\0\0\0\0\0\0\0\0", 12);
    constexpr std::size_t kSize = 22;
    std::array<char, kSize> bytes{};
    return pread(file, bytes.data(), bytes.size(), 0) == ssize_t{kSize} &&
           std::string_view(bytes.data(), bytes.size()).starts_with(kStart);
}

void Fill(archive_entry* raw, ArchiveEntry* entry) {
    const char* const target = archive_entry_symlink(raw);
    entry->mode = archive_entry_mode(raw);
    entry->linkTarget = target == nullptr ? "" : target;
    entry->isHardLink = archive_entry_hardlink(raw) != nullptr;
    const la_int64_t size = archive_entry_size_is_set(raw) != 0 ? archive_entry_size(raw) : 0;
    entry->size = static_cast<std::uint64_t>(size);
    if (archive_entry_mtime_is_set(raw) != 0) {
        entry->modified = {.tv_sec = archive_entry_mtime(raw),
                           .tv_nsec = archive_entry_mtime_nsec(raw)};
    }
}

}  // namespace

struct ArchiveReader::State {
    explicit State(int file) : source(file), archive(archive_read_new()) {}

    Source source;
    OwnedArchive archive;
    int openResult = ARCHIVE_OK;
    bool isEmpty = false;
    bool hasEntries = false;
};

ArchiveReader::ArchiveReader(int file) : state_(std::make_unique<State>(file)) {
    archive* const reader = state_->archive.get();
    // By its central directory and in no other way: streamed archives can hide entries from it.
    archive_read_support_format_zip_seekable(reader);
    archive_read_set_read_callback(reader, Read);
    archive_read_set_seek_callback(reader, Seek);
    archive_read_set_callback_data(reader, &state_->source);
    state_->isEmpty = IsEmptyArchive(file);
    state_->openResult = archive_read_open1(reader);
}

ArchiveReader::~ArchiveReader() = default;

ArchiveResult ArchiveReader::fail(ArchiveResult result, int code, std::string reason) {
    error_ = {.code = code, .reason = std::move(reason)};
    return result;
}

ArchiveResult ArchiveReader::failed(int result) {
    archive* const reader = state_->archive.get();
    const char* const text = archive_error_string(reader);
    return fail(
        result == ARCHIVE_FATAL ? ArchiveResult::kArchiveFailed : ArchiveResult::kEntryFailed,
        CodeOf(reader),
        text == nullptr ? "damaged" : text);
}

/// The library takes an archive whose directory is not where it should be for one without entries.
ArchiveResult ArchiveReader::end() {
    return state_->hasEntries
               ? ArchiveResult::kEnd
               : fail(ArchiveResult::kArchiveFailed, EILSEQ, "the directory is not in its place");
}

ArchiveResult ArchiveReader::next(ArchiveEntry* entry) {
    if (state_->isEmpty) {
        return ArchiveResult::kEnd;
    }
    if (state_->openResult != ARCHIVE_OK) {
        return failed(ARCHIVE_FATAL);
    }
    archive* const reader = state_->archive.get();
    archive_entry* raw = nullptr;
    const int result = archive_read_next_header(reader, &raw);
    state_->source.endDirectory();
    *entry = {};
    if (result == ARCHIVE_EOF) {
        return end();
    }
    state_->hasEntries = true;
    const char* const name = raw == nullptr ? nullptr : archive_entry_pathname(raw);
    entry->name = name == nullptr ? "" : name;
    if (result != ARCHIVE_OK && result != ARCHIVE_WARN) {
        return failed(result);
    }
    Fill(raw, entry);
    if (name == nullptr) {
        return fail(ArchiveResult::kEntryFailed, EILSEQ, "the name is not UTF-8");
    }
    if (!HasKnownMethod(reader)) {
        return fail(ArchiveResult::kEntryFailed, EOPNOTSUPP, "neither stored nor deflated");
    }
    return ArchiveResult::kSuccess;
}

ArchiveResult ArchiveReader::read(std::span<std::byte> buffer, std::size_t* size) {
    const la_ssize_t result =
        archive_read_data(state_->archive.get(), buffer.data(), buffer.size());
    if (result < 0) {
        return failed(static_cast<int>(result));
    }
    *size = static_cast<std::size_t>(result);
    return result == 0 ? ArchiveResult::kEnd : ArchiveResult::kSuccess;
}

}  // namespace platform
