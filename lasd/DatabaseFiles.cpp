#include "lasd/DatabaseFiles.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstring>

#include "platform/Log.h"
#include "platform/PathAccess.h"

using platform::FileStatus;
using platform::Log;
using platform::LogLevel;
using platform::PathAccess;

namespace {

constexpr std::uint32_t kFolderMode = 0755;

bool RemovePrevious(const std::string& path) {
    FileStatus status;
    const PathAccess previous(path);
    if (previous.stat(&status) != 0) {
        return true;
    }
    if (previous.remove() != 0) {
        Log(LogLevel::kError,
            "Failed to remove the previous download at location %s",
            path.c_str());
        return false;
    }
    Log(LogLevel::kInfo, "Removed old database %s", path.c_str());
    return true;
}

bool Move(const std::string& from, const std::string& to) {
    Log(LogLevel::kInfo, "Moving %s to %s", from.c_str(), to.c_str());
    const int error = PathAccess(from).moveOnto(PathAccess(to));
    if (error != 0) {
        Log(LogLevel::kError,
            "Could not rename %s to %s: %s",
            from.c_str(),
            to.c_str(),
            std::strerror(error));
    }
    return error == 0;
}

}  // namespace

bool MakeDatabaseFolder() {
    FileStatus status;
    const PathAccess folder(kDatabaseFolder);
    const int found = folder.stat(&status);
    const bool isMissing = found == ENOENT || (found == 0 && !S_ISDIR(status.mode));
    const int error = isMissing ? folder.makeDirectory(kFolderMode) : 0;
    if (error != 0) {
        Log(LogLevel::kError,
            "Cannot create %s errno set to %s",
            kDatabaseFolder,
            std::strerror(error));
    }
    return error == 0;
}

std::optional<std::string> DatabaseFileName(std::string_view url) {
    const auto slash = url.rfind('/');
    if (slash == std::string_view::npos) {
        return std::nullopt;
    }
    const auto component = url.substr(slash + 1);
    return std::string(component.substr(0, component.find(".gz")));
}

bool InstallDatabaseFile(const HttpFetcher& fetched, std::string_view name) {
    // With a name that is empty, or dots, this is a folder that cannot be removed, and the
    // installation ends there.
    const std::string path = std::string(kDatabaseFolder) + "/" + std::string(name);
    const std::string temporary = path + ".tmp";
    Log(LogLevel::kInfo, "uncompressing to %s", temporary.c_str());
    if (!fetched.writeUncompressed(temporary)) {
        Log(LogLevel::kError, "Failed to commit the data to file for %s", temporary.c_str());
        return false;
    }
    // What is recorded as installed must be there whatever happens, so the record comes after this.
    return RemovePrevious(path) && Move(temporary, path) && PathAccess(path).synchronize() == 0;
}
