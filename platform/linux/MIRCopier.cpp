#include "platform/MIRCopier.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <string>

#include "platform/BuildConstants.h"
#include "platform/DynamicLibrary.h"
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
    [[nodiscard]] bool skips(const char* name, int error, const char* reason);
    int end(const char* path, int error, const char* reason);

    MIRCopier* const copier_;
    const char* const source_;
    const char* const destination_;
    int skipped_ = 0;
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

/// Makes a folder with those above it. What stands there already is told by the walk to it.
void MakeFolders(std::string_view path) {
    if (path.empty() || PathAccess(path).makeDirectory(kFolderMode) != ENOENT) {
        return;
    }
    MakeFolders(Split(path).parent);
    (void)PathAccess(path).makeDirectory(kFolderMode);
}

Opened OpenDestination(const char* path) {
    Opened folder = PathWalk().follow(path, AT_FDCWD);
    if (folder.error == ENOENT && *path != '\0') {
        MakeFolders(path);
        folder = PathWalk().follow(path, AT_FDCWD);
    }

    struct stat status {};

    if (folder.error == 0 && fstat(folder.file.get(), &status) != 0) {
        folder.error = errno;
    } else if (folder.error == 0 && !S_ISDIR(status.st_mode)) {
        folder.error = ENOTDIR;
    }
    return folder;
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
    return copier_->fileError != nullptr &&
           copier_->fileError(copier_, name, error) == kMIRCopierSkipFile;
}

int Copy::end(const char* path, int error, const char* reason) {
    PlatformLog(LogLevel::kError, "archive copier: %s: %s", path, reason);
    if (copier_->fatalError != nullptr) {
        copier_->fatalError(copier_, path, error);
    }
    return error;
}

int Copy::run(const PropertyList& options) {
    const Opened found = PathWalk().follow(source_, AT_FDCWD);
    if (found.error != 0) {
        return end(source_, found.error, std::strerror(found.error));
    }
    const OwnedFd file = OpenForReading(found);
    if (file.isOpen() && IsSet(options, kMIRCopierExtractPKZip) && IsPKZip(file)) {
        return expand(file);
    }
    return end(source_, ENOSYS, std::strerror(ENOSYS));
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
