#include "platform/MIRCopier.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "platform/BuildConstants.h"
#include "platform/DirectoryAccess.h"
#include "platform/DynamicLibrary.h"
#include "platform/FileManager.h"
#include "platform/PathAccess.h"
#include "platform/linux/ArchiveModule.h"
#include "platform/linux/OwnedFd.h"
#include "platform/linux/PathWalk.h"
#include "platform/linux/PlatformLog.h"

namespace platform {

struct MIRCopier {
    MIRCopierFileErrorHandler fileError = nullptr;
    MIRCopierFatalErrorHandler fatalError = nullptr;
};

namespace {

/// Lines about single files, so that a hostile archive does not fill the log.
constexpr int kMostLines = 16;
constexpr std::uint32_t kFolderMode = 0755;
/// Of paths that are remembered while folders are merged.
constexpr std::size_t kMostEntryBytes = 64U << 20;
constexpr std::size_t kEntryOverhead = 64;
/// Where a copy grows that is to replace something.
constexpr const char* kUnfinishedName = ".linefold-unfinished";

struct Module {
    DynamicLibrary library =
        DynamicLibrary::open(std::string(kLibraryDirectory) + "/libLinefoldArchive.so");
    decltype(&LinefoldArchiveExpand) expand =
        library.function<int(int, int, const LinefoldArchiveHandlers*) noexcept>(
            "LinefoldArchiveExpand");
};

/// Loaded at the first need, and kept.
const Module& TheModule() {
    static const Module module;
    return module;
}

/// One copy: its paths, and who is asked about what goes wrong.
class Copy {
public:
    Copy(MIRCopier* copier, const char* source, const char* destination)
        : copier_(copier), source_(source), destination_(destination) {}

    ~Copy();
    Copy(const Copy&) = delete;
    Copy& operator=(const Copy&) = delete;

    [[nodiscard]] int run(const PropertyList& options);

private:
    [[nodiscard]] int expand(const OwnedFd& archive);
    [[nodiscard]] int copyContents();
    [[nodiscard]] int copyFile();
    [[nodiscard]] int copyEntry(const DirectoryAccess& from,
                                const DirectoryAccess& to,
                                const std::string& path);
    [[nodiscard]] int copyOver(const PathAccess& source,
                               const DirectoryAccess& to,
                               const std::string& path);
    [[nodiscard]] int addEntries(const DirectoryAccess& from, const std::string& path);
    [[nodiscard]] int outcomeOf(const std::string& path, int error);
    [[nodiscard]] bool skips(const char* name, int error, const char* reason);
    int end(const char* path, int error, const char* reason);

    MIRCopier* const copier_;
    const char* const source_;
    const char* const destination_;
    std::vector<std::string> entries_;  ///< that are still to be copied, by path
    std::size_t bytes_ = 0;             ///< that these take
    int skipped_ = 0;
    bool isStopped_ = false;  ///< by the answer of a handler
};

bool IsSet(const PropertyList& options, const char* key) {
    const PropertyList* const value = options.find(key);
    const bool* const flag = value == nullptr ? nullptr : value->as<bool>();
    return flag != nullptr && *flag;
}

/// The first bytes of an archive with entries, and of one without.
bool IsPKZip(const OwnedFd& file) {
    std::array<char, 4> start{};
    return pread(file.get(), start.data(), start.size(), 0) == ssize_t{start.size()} &&
           (std::memcmp(start.data(), "PK\3\4", start.size()) == 0 ||
            std::memcmp(start.data(), "PK\5\6", start.size()) == 0);
}

/// Opens what was found, and not what may stand in its place by now. Only a regular file is opened:
/// a FIFO could block, and opening a device can do things.
OwnedFd OpenForReading(const Opened& found) {
    struct stat status {};

    if (fstat(found.file.get(), &status) != 0 || !S_ISREG(status.st_mode)) {
        return {};
    }
    const std::string path = "/proc/self/fd/" + std::to_string(found.file.get());
    return OwnedFd(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
}

/// Made if it is missing. ENOTDIR when something else stands there.
int MakeDestination(const char* path) {
    const int error = FileManagerCreateDirectory(
        path, IntermediateDirectories::kAreMade, {.permissions = kFolderMode});
    return error == EEXIST ? ENOTDIR : error;
}

Opened OpenDestination(const char* path) {
    const int error = MakeDestination(path);
    return error != 0 ? Opened{.file = {}, .error = error} : PathWalk().follow(path, AT_FDCWD);
}

/// Copies beside the place and moves onto it.
int Replace(const PathAccess& source, const PathAccess& unfinished, const PathAccess& place) {
    (void)FileManagerRemoveItem(unfinished);  // of a process that was killed
    int error = FileManagerCopyItem(source, unfinished);
    if (error == 0) {
        error = unfinished.moveOnto(place);
    }
    if (error != 0) {
        (void)FileManagerRemoveItem(unfinished);
    }
    return error;
}

bool IsDirectory(const OwnedFd& file) {
    struct stat status {};

    return fstat(file.get(), &status) == 0 && S_ISDIR(status.st_mode);
}

bool IsDirectory(const PathAccess& item) {
    FileStatus status;
    return item.lstat(&status) == 0 && S_ISDIR(status.mode);
}

Copy::~Copy() {
    if (skipped_ > kMostLines) {
        PlatformLog(LogLevel::kError,
                    "archive copier: %d more files of %s left out",
                    skipped_ - kMostLines,
                    source_);
    }
}

/// In the log whatever the handler says, which tells nobody: who looks for a missing file must find
/// why.
bool Copy::skips(const char* name, int error, const char* reason) {
    if (++skipped_ <= kMostLines) {
        PlatformLog(
            LogLevel::kError, "archive copier: %s of %s left out: %s", name, source_, reason);
    }
    isStopped_ = copier_->fileError == nullptr ||
                 copier_->fileError(copier_, name, error) != kMIRCopierSkipFile;
    return !isStopped_;
}

int Copy::end(const char* path, int error, const char* reason) {
    PlatformLog(LogLevel::kError, "archive copier: %s: %s", path, reason);
    if (copier_->fatalError != nullptr) {
        copier_->fatalError(copier_, path, error);
    }
    return error;
}

int Copy::run(const PropertyList& options) {
    Opened found = PathWalk().follow(source_, AT_FDCWD);
    if (*source_ == '\0') {
        found.error = ENOENT;  // and not where the process stands
    }
    if (found.error != 0) {
        return end(source_, found.error, std::strerror(found.error));
    }
    const OwnedFd file = OpenForReading(found);
    if (file.isOpen() && IsSet(options, kMIRCopierExtractPKZip) && IsPKZip(file)) {
        return expand(file);
    }
    return IsDirectory(found.file) ? copyContents() : copyFile();
}

int Copy::expand(const OwnedFd& archive) {
    const Opened folder = OpenDestination(destination_);
    if (folder.error != 0) {
        return end(destination_, folder.error, std::strerror(folder.error));
    }
    const LinefoldArchiveHandlers handlers{
        .context = this,
        .entryFailed = [](void* copy, const char* name, int error, const char* reason) -> int {
            return static_cast<Copy*>(copy)->skips(name, error, reason) ? 1 : 0;
        },
        .archiveFailed =
            [](void* context, int error, const char* reason) {
                auto* const copy = static_cast<Copy*>(context);
                (void)copy->end(copy->source_, error, reason);
            }};
    return TheModule().expand(archive.get(), folder.file.get(), &handlers);
}

/// What a directory contains goes into the destination, where folders of one name become one.
int Copy::copyContents() {
    if (const int error = MakeDestination(destination_); error != 0) {
        return end(destination_, error, std::strerror(error));
    }
    const DirectoryAccess from{PathAccess(source_)};
    const DirectoryAccess to{PathAccess(destination_)};
    int error = addEntries(from, "");
    while (error == 0 && !entries_.empty()) {
        const std::string path = std::move(entries_.back());
        entries_.pop_back();
        error = copyEntry(from, to, path);
    }
    // Who stopped it by an answer knows already.
    return error == 0 || isStopped_ ? error : end(source_, error, std::strerror(error));
}

int Copy::addEntries(const DirectoryAccess& from, const std::string& path) {
    std::vector<std::string> names;
    const int error =
        path.empty() ? from.list(&names) : DirectoryAccess(from.item(path)).list(&names);
    for (const std::string& name : names) {
        entries_.push_back(path.empty() ? name : path + "/" + name);
        bytes_ += entries_.back().size() + kEntryOverhead;
    }
    return error == 0 && bytes_ > kMostEntryBytes ? E2BIG : error;
}

/// Whole if nothing is in its place; else by what is in it, or in place of what is there.
int Copy::copyEntry(const DirectoryAccess& from,
                    const DirectoryAccess& to,
                    const std::string& path) {
    bytes_ -= path.size() + kEntryOverhead;
    const PathAccess source = from.item(path);
    if (IsDirectory(source) && IsDirectory(to.item(path))) {
        return outcomeOf(path, addEntries(from, path));
    }
    return outcomeOf(path, copyOver(source, to, path));
}

/// A file that fails is left out if the handler wants it so.
int Copy::outcomeOf(const std::string& path, int error) {
    if (error == 0 || isStopped_ || ConcernsAllItems(error) ||
        !skips(path.c_str(), error, std::strerror(error))) {
        return error;
    }
    return 0;
}

/// A reader sees what was there or the copy. A folder is not replaced, nor does it replace.
int Copy::copyOver(const PathAccess& source, const DirectoryAccess& to, const std::string& path) {
    const PathAccess place = to.item(path);
    const int error =
        FileManagerCopyItem(source, place, [&](const std::string& subpath, int failure) {
            return outcomeOf(path + "/" + subpath, failure) == 0;
        });
    if (error != EEXIST) {
        return error;
    }
    if (IsDirectory(source) || IsDirectory(place)) {
        return IsDirectory(place) ? EISDIR : ENOTDIR;
    }
    return Replace(source, to.item(std::string(Split(path).parent) + kUnfinishedName), place);
}

int Copy::copyFile() {
    const SplitPath split = Split(destination_);
    const PathAccess destination(destination_);
    FileStatus status;
    int error = destination.stat(&status);
    if (error == 0 && S_ISDIR(status.mode)) {
        error = copyOver(
            PathAccess(source_), DirectoryAccess(destination), std::string(Split(source_).last));
    } else if (error == 0 || (error == ENOENT && !split.endsInSlash)) {
        const std::string folder(split.parent.empty() ? "." : split.parent);
        error = copyOver(
            PathAccess(source_), DirectoryAccess(PathAccess(folder)), std::string(split.last));
    }
    return error == 0 ? 0 : end(source_, error, std::strerror(error));
}

}  // namespace

MIRCopier* MIRCopierNew() {
    return TheModule().expand == nullptr ? nullptr : new MIRCopier;
}

void MIRCopierFree(MIRCopier* copier) {
    delete copier;
}

void MIRCopierSetFileErrorHandler(MIRCopier* copier, MIRCopierFileErrorHandler handler) {
    copier->fileError = handler;
}

void MIRCopierSetFatalFileErrorHandler(MIRCopier* copier, MIRCopierFatalErrorHandler handler) {
    copier->fatalError = handler;
}

int MIRCopierCopyWithOptions(MIRCopier* copier,
                             const char* source,
                             const char* destination,
                             const PropertyList& options) {
    return Copy(copier, source, destination).run(options);
}

}  // namespace platform
