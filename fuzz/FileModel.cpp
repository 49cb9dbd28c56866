#include "fuzz/FileModel.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>

namespace fuzz {
namespace {

using Kind = Item::Kind;

Item* Add(Item* folder, const std::string& name, Kind kind, unsigned mode, std::string text) {
    auto item = std::make_unique<Item>();
    item->kind = kind;
    item->mode = mode;
    item->text = std::move(text);
    item->parent = folder;
    return (folder->below[name] = std::move(item)).get();
}

std::unique_ptr<Item> Clone(const Item& item, Item* parent) {
    auto clone = std::make_unique<Item>();
    clone->kind = item.kind;
    clone->mode = item.mode;
    clone->text = item.text;
    clone->parent = parent;
    for (const auto& [name, child] : item.below) {
        clone->below[name] = Clone(*child, clone.get());
    }
    return clone;
}

bool IsWithin(const Item* item, const Item* folder) {
    while (item != nullptr && item != folder) {
        item = item->parent;
    }
    return item != nullptr;
}

bool HasLinks(const Item& item) {
    bool found = item.kind == Kind::kLink;
    for (const auto& [name, child] : item.below) {
        found = found || HasLinks(*child);
    }
    return found;
}

void AddPaths(const Item& folder, const std::string& prefix, std::vector<std::string>& paths) {
    for (const auto& [name, child] : folder.below) {
        paths.push_back(prefix + name);
        AddPaths(*child, prefix + name + "/", paths);
    }
}

std::string LastStep(const std::string& path) {
    return path.substr(path.rfind('/') + 1);
}

}  // namespace

FileModel::FileModel() : top_(std::make_unique<Item>()) {}

int FileModel::walk(Item* from, const std::string& path, int* links, Item** end) const {
    std::size_t start = 0;
    Item* at = from;
    while (start < path.size()) {
        const std::size_t slash = std::min(path.find('/', start), path.size());
        const std::string name = path.substr(start, slash - start);
        start = slash + 1;
        if (!at->isFolder()) {
            return ENOTDIR;
        }
        if (name == "..") {
            at = at->parent;
            continue;
        }
        if (name == ".") {
            continue;
        }
        const auto found = at->below.find(name);
        if (found == at->below.end()) {
            return ENOENT;
        }
        Item* next = found->second.get();
        if (next->kind == Kind::kLink) {
            if (++*links > 40) {
                return ELOOP;
            }
            if (const int error = walk(at, next->text, links, &next); error != 0) {
                return error;
            }
        }
        at = next;
    }
    *end = at;
    return 0;
}

Spot FileModel::spot(const std::string& path) const {
    Spot spot;
    int links = 0;
    const std::size_t slash = path.rfind('/');
    spot.name = LastStep(path);
    spot.error = walk(
        top_.get(), slash == std::string::npos ? "" : path.substr(0, slash), &links, &spot.folder);
    if (spot.error == 0 && !spot.folder->isFolder()) {
        spot.error = ENOTDIR;
    }
    if (spot.error == 0) {
        const auto found = spot.folder->below.find(spot.name);
        spot.item = found == spot.folder->below.end() ? nullptr : found->second.get();
    }
    return spot;
}

Item* FileModel::followed(const std::string& path) const {
    int links = 0;
    Item* item = nullptr;
    const Spot place = spot(path);
    return place.error == 0 && walk(place.folder, place.name, &links, &item) == 0 ? item : nullptr;
}

Item* FileModel::at(const std::string& path) const {
    return spot(path).item;
}

int FileModel::list(const std::string& path, std::vector<std::string>* names) const {
    int links = 0;
    Item* item = nullptr;
    const Spot place = spot(path);
    const int error =
        place.error != 0 ? place.error : walk(place.folder, place.name, &links, &item);
    if (error != 0 || !item->isFolder()) {
        return error != 0 ? error : ENOTDIR;
    }
    for (const auto& [name, child] : item->below) {
        names->push_back(name);
    }
    return 0;
}

int FileModel::createDirectory(const std::string& path, unsigned mode, bool intermediates) {
    if (!intermediates) {
        const Spot place = spot(path);
        if (place.error != 0 || place.item != nullptr) {
            return place.error != 0 ? place.error : EEXIST;
        }
        Add(place.folder, place.name, Kind::kFolder, mode, "");
        return 0;
    }
    Item* at = top_.get();
    int links = 0;
    for (std::size_t start = 0; start < path.size();) {
        const std::size_t slash = std::min(path.find('/', start), path.size());
        const std::string name = path.substr(start, slash - start);
        start = slash + 1;
        Item* next = nullptr;
        int error = walk(at, name, &links, &next);
        if (error == ENOENT && !at->below.contains(name)) {
            next = Add(at, name, Kind::kFolder, mode, "");
            error = 0;
        }
        if (error != 0) {
            return error;
        }
        at = next;
    }
    return at->isFolder() ? 0 : EEXIST;
}

bool FileModel::createEmptyFile(const std::string& path) {
    const Spot place = spot(path);
    if (place.error != 0 || (place.item != nullptr && place.item->kind != Kind::kFile)) {
        return false;
    }
    if (place.item != nullptr) {
        place.item->text.clear();
    } else {
        Add(place.folder, place.name, Kind::kFile, 0644, "");
    }
    return true;
}

bool FileModel::writeData(const std::string& path, const std::string& text) {
    const Spot place = spot(path);
    if (place.error != 0 || (place.item != nullptr && place.item->isFolder())) {
        return false;
    }
    const bool wasFile = place.item != nullptr && place.item->kind == Kind::kFile;
    Add(place.folder, place.name, Kind::kFile, wasFile ? place.item->mode : 0644, text);
    return true;
}

int FileModel::createSymlink(const std::string& path, const std::string& target) {
    const Spot place = spot(path);
    if (place.error != 0 || place.item != nullptr) {
        return place.error != 0 ? place.error : EEXIST;
    }
    Add(place.folder, place.name, Kind::kLink, 0777, target);
    return 0;
}

int FileModel::put(const Spot& from, const Spot& to, Mode mode) {
    if (from.error != 0 || from.item == nullptr) {
        return from.error != 0 ? from.error : ENOENT;
    }
    if (to.error != 0 || to.item != nullptr) {
        return to.error != 0 ? to.error : EEXIST;
    }
    if (IsWithin(to.folder, from.item)) {
        return EINVAL;
    }
    if (mode == Mode::kCopy) {
        to.folder->below[to.name] = Clone(*from.item, to.folder);
        return 0;
    }
    auto moved = std::move(from.folder->below.at(from.name));
    from.folder->below.erase(from.name);
    moved->parent = to.folder;
    to.folder->below[to.name] = std::move(moved);
    return 0;
}

int FileModel::transfer(const std::string& source, const std::string& destination, Mode mode) {
    const Item* const from = followed(source);
    if (from == nullptr) {
        return -1;
    }
    const Item* const to = followed(destination);
    if (to == nullptr) {
        return put(spot(source), spot(destination), mode);
    }
    if (!to->isFolder()) {
        if (from->isFolder()) {
            return EEXIST;
        }
        (void)remove(destination);
        merge(source, destination, mode);
        return 0;
    }
    const std::string inside = destination + "/" + LastStep(source);
    if (const Item* const old = followed(inside); old != nullptr && !old->isFolder()) {
        (void)remove(inside);
    }
    merge(source, inside, mode);
    return 0;
}

void FileModel::merge(const std::string& source, const std::string& destination, Mode mode) {
    if (put(spot(source), spot(destination), mode) == 0) {
        return;
    }
    const Item* const from = followed(source);
    if (from != nullptr && from->isFolder()) {
        std::vector<std::string> paths;
        AddPaths(*from, "", paths);
        if (!paths.empty()) {
            (void)createDirectory(destination, 0755, true);
        }
        for (const auto& path : paths) {
            mergeItem(source + "/" + path, destination + "/" + path, mode);
        }
    }
    const Spot place = spot(source);
    if (place.item != nullptr && place.item->isFolder() && place.item->below.empty()) {
        place.folder->below.erase(place.name);
    }
}

/// No link inside either tree was followed so far, or the order would matter: in the destination
/// there may be some.
void FileModel::mergeItem(const std::string& source, const std::string& destination, Mode mode) {
    const Item* const from = followed(source);
    const Item* const old = followed(destination);
    if (from != nullptr && old != nullptr && !from->isFolder() && !old->isFolder()) {
        (void)remove(destination);
    }
    (void)createDirectory(destination.substr(0, destination.rfind('/')), 0755, true);
    (void)put(spot(source), spot(destination), mode);
}

int FileModel::moveFile(const std::string& source, const std::string& destination) {
    return followed(source) == nullptr ? -1 : put(spot(source), spot(destination), Mode::kMove);
}

int FileModel::copyNamedItem(const std::string& source,
                             const std::string& destination,
                             const std::string& name) {
    if (followed(destination) == nullptr && createDirectory(destination, 0755, true) != 0) {
        return -1;
    }
    return transfer(source + "/" + name, destination + "/" + name, Mode::kCopy);
}

int FileModel::remove(const std::string& path) {
    const Spot place = spot(path);
    if (place.error != 0 || place.item == nullptr) {
        return place.error != 0 ? place.error : ENOENT;
    }
    place.folder->below.erase(place.name);
    return 0;
}

int FileModel::setPermissions(const std::string& path, unsigned mode, bool recursive) {
    Item* const item = at(path);
    Item* const end = followed(path);
    if (!recursive) {
        if (item == nullptr || item->kind == Kind::kLink) {
            return -1;
        }
        item->mode = mode;
        return 0;
    }
    if (end == nullptr) {
        return 5;
    }
    std::vector<Item*> items{end};
    for (std::size_t i = 0; i < items.size(); ++i) {
        for (const auto& [name, child] : items[i]->below) {
            items.push_back(child.get());
        }
    }
    items[0] = item;  // a link at the top is not followed for itself
    for (Item* const each : items) {
        each->mode = each->kind == Kind::kLink ? each->mode : mode;
    }
    return 0;
}

bool FileModel::dependsOnOrder(const std::string& source, const std::string& destination) const {
    const Item* const from = followed(source);
    const Item* const to = followed(destination);
    if (from == nullptr || !from->isFolder() || to == nullptr || !to->isFolder()) {
        return false;
    }
    const Item* const inside = followed(destination + "/" + LastStep(source));
    const bool isMerged = inside != nullptr && inside->isFolder();
    return IsWithin(to, from) || (isMerged && (HasLinks(*from) || HasLinks(*inside)));
}

std::vector<std::string> FileModel::lines() const {
    std::vector<std::string> paths;
    AddPaths(*top_, "", paths);
    for (auto& path : paths) {
        const Item& item = *at(path);
        std::array<char, 16> mode{};
        (void)std::snprintf(mode.data(), mode.size(), "%o ", item.mode);  // always fits
        path =
            "dfl"[static_cast<int>(item.kind)] + std::string(mode.data()) + path + " " + item.text;
    }
    return paths;
}

}  // namespace fuzz
