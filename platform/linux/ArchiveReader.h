// The entries of a ZIP archive, read one after the other.
#pragma once

#include <sys/stat.h>

#include <cstddef>
#include <cstdint>
#include <ctime>
#include <memory>
#include <span>
#include <string>

namespace platform {

/// What went wrong with an entry or with the whole archive.
struct ArchiveError {
    int code = 0;  ///< an errno value
    std::string reason{};
};

struct ArchiveEntry {
    std::string name;
    mode_t mode = 0;
    std::string linkTarget{};  ///< of a symbolic link
    bool isHardLink = false;
    std::uint64_t size = 0;  ///< as the archive announces it
    timespec modified{.tv_sec = 0, .tv_nsec = UTIME_OMIT};
};

/// What came of asking for the next entry, or for bytes of one.
enum class ArchiveResult : std::uint8_t { kSuccess, kEnd, kEntryFailed, kArchiveFailed };

/// Reads through a descriptor that stays its owner's. The archive is a stranger's: the memory that
/// reading takes is bounded, whatever it says, and so is what is read in all. Methods other than
/// stored and deflated are failures of the entry: their memory would be the archive's choice.
class ArchiveReader {
public:
    explicit ArchiveReader(int file);
    ~ArchiveReader();
    ArchiveReader(const ArchiveReader&) = delete;
    ArchiveReader& operator=(const ArchiveReader&) = delete;

    /// The name is given for an entry that failed, too, as far as it is known.
    [[nodiscard]] ArchiveResult next(ArchiveEntry* entry);

    /// The next bytes of the entry; kEnd when there are no more, all of them as announced.
    [[nodiscard]] ArchiveResult read(std::span<std::byte> buffer, std::size_t* size);

    /// Why the last call failed.
    [[nodiscard]] const ArchiveError& error() const { return error_; }

private:
    struct State;

    [[nodiscard]] ArchiveResult fail(ArchiveResult result, int code, std::string reason);
    [[nodiscard]] ArchiveResult failed(int result);
    [[nodiscard]] ArchiveResult end();

    std::unique_ptr<State> state_;
    ArchiveError error_;
};

}  // namespace platform
