#include "handlers/carrier/PathPolicy.h"

#include <array>
#include <cstddef>
#include <cstring>
#include <string>

#include "handlers/carrier/MobileUser.h"
#include "platform/Log.h"
#include "platform/PathAccess.h"

using platform::Log;
using platform::LogLevel;

namespace {

constexpr std::size_t kPathLimit = 1024;
constexpr const char* kPrivateCarrierBundlesDir = "/private/var/mobile/Library/Carrier Bundles";

std::string LibraryDirectory() {
    return MobileUserHome + "/Library/";
}

std::string BundlePath(const char* name) {
    return LibraryDirectory() + name;
}

std::string PreferencePath(std::string_view domain) {
    return LibraryDirectory() + "Preferences/" + std::string(domain) + kPlistExtension;
}

/// Strings first: the pointers of the table's first half point into them.
struct AllowedLinkPathTable {
    std::string carrier = PreferencePath(kCarrierBundleId);
    std::string carrier1 = PreferencePath(kCarrier1BundleId);
    std::string carrier2 = PreferencePath(kCarrier2BundleId);
    std::string operator0 = PreferencePath(kOperatorBundleId);
    std::string operator1 = PreferencePath(kOperator1BundleId);
    std::string operator2 = PreferencePath(kOperator2BundleId);
    std::string carrierDefault = PreferencePath(kDefaultBundleId);
    std::string carrierBootstrap = PreferencePath(kBootstrapBundleId);
    std::string carrierBundle = BundlePath("Carrier Bundle.bundle");
    std::string carrier1Bundle = BundlePath("Carrier1Bundle.bundle");
    std::string carrier2Bundle = BundlePath("Carrier2Bundle.bundle");
    std::string operatorBundle = BundlePath("Operator Bundle.bundle");
    std::string operator1Bundle = BundlePath("Operator1Bundle.bundle");
    std::string operator2Bundle = BundlePath("Operator2Bundle.bundle");
    std::string defaultBundle = BundlePath("CarrierDefault.bundle");
    std::string bootstrapBundle = BundlePath("CarrierBootstrap.bundle");

    // clang-format off
    std::array<const char*, 32> entries{
        carrier.c_str(),
        carrier1.c_str(),
        carrier2.c_str(),
        operator0.c_str(),
        operator1.c_str(),
        operator2.c_str(),
        carrierDefault.c_str(),
        carrierBootstrap.c_str(),
        carrierBundle.c_str(),
        carrier1Bundle.c_str(),
        carrier2Bundle.c_str(),
        operatorBundle.c_str(),
        operator1Bundle.c_str(),
        operator2Bundle.c_str(),
        defaultBundle.c_str(),
        bootstrapBundle.c_str(),
        "/private/var/mobile/Library/Preferences/com.vendra.carrier.plist",
        "/private/var/mobile/Library/Preferences/com.vendra.carrier_1.plist",
        "/private/var/mobile/Library/Preferences/com.vendra.carrier_2.plist",
        "/private/var/mobile/Library/Preferences/com.vendra.operator.plist",
        "/private/var/mobile/Library/Preferences/com.vendra.operator_1.plist",
        "/private/var/mobile/Library/Preferences/com.vendra.operator_2.plist",
        "/private/var/mobile/Library/Preferences/com.vendra.carrier.default.plist",
        "/private/var/mobile/Library/Preferences/com.vendra.carrier.bootstrap.plist",
        "/private/var/mobile/Library/Carrier Bundle.bundle",
        "/private/var/mobile/Library/Carrier1Bundle.bundle",
        "/private/var/mobile/Library/Carrier2Bundle.bundle",
        "/private/var/mobile/Library/Operator Bundle.bundle",
        "/private/var/mobile/Library/Operator1Bundle.bundle",
        "/private/var/mobile/Library/Operator2Bundle.bundle",
        "/private/var/mobile/Library/CarrierDefault.bundle",
        "/private/var/mobile/Library/CarrierBootstrap.bundle",
    };
    // clang-format on
};

const AllowedLinkPathTable& AllowedLinkPaths() {
    static const AllowedLinkPathTable table;
    return table;
}

const std::string& CarrierBundlesDir() {
    static const std::string directory = MobileUserHome + kUserCBDir;
    return directory;
}

/// Where the needle first occurs within the first 1024 bytes of the path, or npos.
std::size_t FindWithinLimit(std::string_view path, std::string_view needle) {
    return path.substr(0, kPathLimit).find(needle);
}

bool IsWithin(const char* path, const char* directory) {
    if (FindWithinLimit(path, directory) != 0) {
        return false;
    }
    Log(LogLevel::kInfo, "Allowing path %s within %s", path, directory);
    return true;
}

/// The name ends in ".crbn" and has it nowhere earlier. "/tmp" is a prefix of bytes, so a sibling
/// such as "/tmpx" counts as well.
bool IsTemporaryArchive(std::string_view path) {
    constexpr std::string_view kExtension = ".crbn";
    return FindWithinLimit(path, "/tmp") == 0 && path.size() >= kExtension.size() &&
           FindWithinLimit(path, kExtension) == path.size() - kExtension.size();
}

/// The mode is tested for the bits of a link's type, on purpose, and not compared with it: a
/// directory and a FIFO have neither bit, all else that may stand at a link path has one.
bool IsDirectoryOrFifo(const char* path) {
    constexpr std::uint32_t kLinkTypeBits = 0xA000;
    platform::FileStatus status;
    return platform::PathAccess(path).lstat(&status) == 0 && (status.mode & kLinkTypeBits) == 0;
}

}  // namespace

bool IsAllowedLinkPath(const char* path) {
    const AllowedLinkPathTable& table = AllowedLinkPaths();
    if (IsDirectoryOrFifo(path)) {
        return false;
    }
    for (const char* entry : table.entries) {
        if (std::strncmp(path, entry, kPathLimit) == 0) {
            Log(LogLevel::kInfo, "%s is within allowed path %s", path, entry);
            return true;
        }
    }
    return false;
}

bool IsAllowedCarrierPath(const char* path) {
    const std::string& bundlesDir = CarrierBundlesDir();
    // The second directory has no trailing slash, on purpose: names that merely go on pass too.
    if (IsWithin(path, bundlesDir.c_str()) || IsWithin(path, kPrivateCarrierBundlesDir) ||
        IsAllowedLinkPath(path)) {
        return true;
    }
    // An archive that is admitted below leaves these lines as well, on purpose.
    Log(LogLevel::kError,
        "NOT Allowing path %s as it isn't within the wild card directories:",
        path);
    Log(LogLevel::kError, "%s", bundlesDir.c_str());
    Log(LogLevel::kError, "%s", kPrivateCarrierBundlesDir);
    return IsTemporaryArchive(path);
}
