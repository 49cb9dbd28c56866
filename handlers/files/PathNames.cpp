#include "handlers/files/PathNames.h"

#include <sys/stat.h>

namespace {

constexpr std::size_t kPathBytesMax = 1023;
constexpr auto kNone = std::string_view::npos;

}  // namespace

ItemKind KindAt(const platform::PathAccess& path) {
    platform::FileStatus status;
    if (path.stat(&status) != 0) {
        return ItemKind::kNone;
    }
    return S_ISDIR(status.mode) ? ItemKind::kDirectory : ItemKind::kOther;
}

std::string BaseName(std::string_view path) {
    path = path.substr(0, kPathBytesMax);
    if (path.empty()) {
        return ".";
    }
    const auto end = path.find_last_not_of('/');
    if (end == kNone) {
        return "/";
    }
    path = path.substr(0, end + 1);
    const auto slash = path.rfind('/');
    return std::string(slash == kNone ? path : path.substr(slash + 1));
}

std::string DirName(std::string_view path) {
    path = path.substr(0, kPathBytesMax);
    const auto end = path.find_last_not_of('/');
    if (end == kNone) {
        return path.empty() ? "." : "/";
    }
    const auto slash = path.rfind('/', end);
    if (slash == kNone) {
        return ".";
    }
    const auto last = path.find_last_not_of('/', slash);
    return last == kNone ? "/" : std::string(path.substr(0, last + 1));
}
