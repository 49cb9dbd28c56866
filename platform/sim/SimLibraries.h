// Simulated shared libraries.
#pragma once

#include <map>
#include <string>
#include <string_view>

namespace sim {

/// Functions by name.
using LibraryFunctions = std::map<std::string, void*, std::less<>>;

/// Puts a library at a path, from where it is loaded with "DynamicLibrary.open".
void MakeLibrary(std::string_view path, LibraryFunctions functions);

}  // namespace sim
