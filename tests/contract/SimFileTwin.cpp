#include "platform/sim/FileTree.h"
#include "tests/contract/FileTwin.h"

namespace twin {
namespace {

void AddTree(const sim::Node& node, const std::string& name, std::map<std::string, Item>& tree) {
    const sim::FileNode& file = node.file;
    tree[name] = {.mode = file.mode,
                  .contents = file.contents,
                  .attributes = file.attributes,
                  .modified = file.modified,
                  .owner = file.owner,
                  .group = file.groupId()};
    for (const auto& [child, below] : node.children) {
        AddTree(*below, name.empty() ? child : name + "/" + child, tree);
    }
}

}  // namespace

std::string FreshFolder() {
    sim::MakeDirectory("/tmp/files");
    return "/tmp/files";
}

void Put(const std::string& path, const Item& item) {
    sim::MakeFile(path,
                  {.mode = item.mode,
                   .contents = item.contents,
                   .attributes = item.attributes,
                   .modified = item.modified});
}

void PutName(const std::string& path, const std::string& secondPath) {
    sim::LinkFile(path, secondPath);
}

bool AreOneFile(const std::string& path, const std::string& other) {
    return sim::AreOneFile(path, other);
}

std::map<std::string, Item> Tree(const std::string& path) {
    sim::Place place;
    std::map<std::string, Item> tree;
    if (Resolve(path, sim::Links::kAll, &place) == 0 && NodeAt(place) != nullptr) {
        AddTree(*NodeAt(place), "", tree);
    }
    return tree;
}

}  // namespace twin
