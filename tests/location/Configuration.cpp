#include "tests/location/Configuration.h"

#include <filesystem>
#include <fstream>

#include "platform/PropertyList.h"

namespace configuration {

using platform::PropertyList;

void WriteText(std::string_view text) {
    // Beside it first: a daemon reads it whenever it likes.
    const std::string made = std::string(kPath) + ".new";
    std::ofstream(made, std::ios::binary) << text;
    std::filesystem::rename(made, kPath);
}

void Write(const std::map<std::string, std::string>& entries) {
    PropertyList::Dictionary dictionary;
    for (const auto& [key, value] : entries) {
        dictionary.emplace_back(key, PropertyList(value));
    }
    const auto bytes = platform::PropertyListCreateXmlData(PropertyList(std::move(dictionary)));
    WriteText({reinterpret_cast<const char*>(bytes->data()), bytes->size()});
}

void Remove() {
    std::filesystem::remove(kPath);
}

}  // namespace configuration
