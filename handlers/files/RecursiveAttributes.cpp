#include "handlers/files/RecursiveAttributes.h"

#include <string>
#include <vector>

#include "handlers/files/PathNames.h"
#include "platform/DirectoryAccess.h"

namespace {

constexpr int kNothingThere = 5;

int SetBelow(const platform::PathAccess& path, const platform::FileAttributes& attributes) {
    const platform::DirectoryAccess folder(path);
    std::vector<std::string> subpaths;
    (void)folder.subpaths(&subpaths);  // a folder that cannot be listed has nothing to set below it
    int lastFailure = 0;
    for (const auto& subpath : subpaths) {
        const int error = FileManagerSetAttributes(attributes, folder.item(subpath));
        lastFailure = error != 0 ? error : lastFailure;
    }
    return lastFailure;
}

}  // namespace

int SetAttributesRecursively(std::string_view path, const platform::FileAttributes& attributes) {
    const platform::PathAccess item(path);
    const ItemKind kind = KindAt(item);
    if (kind == ItemKind::kNone) {
        return kNothingThere;
    }
    const int below = kind == ItemKind::kDirectory ? SetBelow(item, attributes) : 0;
    const int own = FileManagerSetAttributes(attributes, item);
    return own != 0 ? own : below;
}
