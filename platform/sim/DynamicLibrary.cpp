// Shared libraries that a test made up.
#include "platform/DynamicLibrary.h"

#include <memory>
#include <vector>

#include "platform/sim/SimLibraries.h"
#include "platform/sim/World.h"

namespace sim {
namespace {

/// What is loaded stays, as the functions that were looked up do.
struct Libraries {
    std::map<std::string, std::shared_ptr<LibraryFunctions>, std::less<>> byPath;
    std::vector<std::shared_ptr<LibraryFunctions>> loaded;
};

Libraries& TheLibraries() {
    static Libraries& libraries = *new Libraries;
    return libraries;
}

}  // namespace

void MakeLibrary(std::string_view path, LibraryFunctions functions) {
    TheLibraries().byPath.insert_or_assign(
        std::string(path), std::make_shared<LibraryFunctions>(std::move(functions)));
}

void ResetLibraries() {
    TheLibraries().byPath.clear();
}

}  // namespace sim

namespace platform {

DynamicLibrary DynamicLibrary::open(const std::string& path) {
    DynamicLibrary library;
    auto& libraries = sim::TheLibraries();
    const auto found = libraries.byPath.find(path);
    if (!sim::CallFails("DynamicLibrary.open", path) && found != libraries.byPath.end()) {
        library.handle_ = libraries.loaded.emplace_back(found->second).get();
    }
    return library;
}

void* DynamicLibrary::symbol(const char* name) const {
    if (handle_ == nullptr || sim::CallFails("DynamicLibrary.function", name)) {
        return nullptr;
    }
    const auto& functions = *static_cast<const sim::LibraryFunctions*>(handle_);
    const auto found = functions.find(name);
    return found == functions.end() ? nullptr : found->second;
}

}  // namespace platform
