// Shared libraries that are loaded when first used.
#pragma once

#include <string>

namespace platform {

/// A loaded library; it stays for the life of the process, since what it started may still run.
class DynamicLibrary {
public:
    /// Loads the file by its absolute path. Nothing is loaded unless file and folder are root's own
    /// and nobody else can write them: whoever can put code there is root already. A library that
    /// is there and cannot be loaded is told in one error line; an absent one is normal.
    [[nodiscard]] static DynamicLibrary open(const std::string& path);

    [[nodiscard]] bool isLoaded() const { return handle_ != nullptr; }

    /// A function of the library, or null.
    template <typename Function>
    [[nodiscard]] Function* function(const char* name) const {
        return reinterpret_cast<Function*>(symbol(name));
    }

private:
    [[nodiscard]] void* symbol(const char* name) const;

    void* handle_ = nullptr;
};

}  // namespace platform
