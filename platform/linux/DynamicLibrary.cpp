#include "platform/DynamicLibrary.h"

#include <dlfcn.h>
#include <sys/stat.h>

#include <cerrno>

#include "platform/linux/PlatformLog.h"

namespace platform {
namespace {

bool IsRootsOwn(const std::string& path, mode_t type) {
    struct stat status {};

    return lstat(path.c_str(), &status) == 0 && (status.st_mode & S_IFMT) == type &&
           status.st_uid == 0 && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

}  // namespace

DynamicLibrary DynamicLibrary::open(const std::string& path) {
    DynamicLibrary library;

    struct stat status {};

    if (lstat(path.c_str(), &status) != 0 && errno == ENOENT) {
        return library;
    }
    if (!IsRootsOwn(path.substr(0, path.rfind('/')), S_IFDIR) || !IsRootsOwn(path, S_IFREG)) {
        PlatformLog(
            LogLevel::kError, "not loading %s: file and folder must be root's own", path.c_str());
        return library;
    }
    library.handle_ = dlopen(path.c_str(), RTLD_LAZY | RTLD_LOCAL);
    if (library.handle_ == nullptr) {
        PlatformLog(LogLevel::kError, "not loading %s: %s", path.c_str(), dlerror());
    }
    return library;
}

void* DynamicLibrary::symbol(const char* name) const {
    return handle_ == nullptr ? nullptr : dlsym(handle_, name);
}

}  // namespace platform
