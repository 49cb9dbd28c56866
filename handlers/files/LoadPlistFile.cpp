// A property-list file read back as data.
#include <cstring>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "handlers/files/FileSystemManager.h"
#include "platform/Log.h"
#include "platform/PropertyList.h"
#include "platform/VirtualMemory.h"

using platform::Log;
using platform::LogLevel;

namespace {

/// The code of a file without a dictionary.
constexpr kern_return_t kNoDictionary = 9;

/// The dictionary goes before the memory for its bytes comes, since each may be large.
std::optional<std::vector<std::byte>> SerializedDictionary(std::string_view path) {
    const auto dictionary = FileSystemManager().loadDictionary(path);
    return dictionary ? platform::PropertyListCreateXmlData(*dictionary) : std::nullopt;
}

}  // namespace

// The path is not policed.
kern_return_t server_LFMobileHelperLoadPlistFile(mach_port_t /*port*/,
                                                 String256& path,
                                                 OutOfLineData& data) {
    data = {};
    Log(LogLevel::kInfo, "Loading %s as plist", path.cString());
    const auto bytes = SerializedDictionary(path.view());
    if (!bytes) {
        Log(LogLevel::kError, "Could not create data representation of dictionary");
        return kNoDictionary;
    }
    void* region = nullptr;
    if (const auto code = platform::vm_allocate(&region, bytes->size());
        code != platform::KERN_SUCCESS) {
        Log(LogLevel::kError,
            "Could not allocate %d bytes for payload",
            static_cast<int>(bytes->size()));
        return code;
    }
    std::memcpy(region, bytes->data(), bytes->size());
    data = {.address = region, .count = static_cast<std::uint32_t>(bytes->size())};
    return platform::KERN_SUCCESS;
}
