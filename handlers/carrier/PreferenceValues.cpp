// Preference values, set and read; they travel as property lists.
#include <cstring>
#include <optional>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/Preferences.h"
#include "platform/PropertyList.h"
#include "platform/SystemLog.h"
#include "platform/Utf8.h"
#include "platform/VirtualMemory.h"

using platform::PropertyList;
using platform::SystemLog;
using platform::SystemLogPriority;

namespace {

bool AreTexts(const String256& domain, const String256& key) {
    return platform::IsUtf8(domain.view()) && platform::IsUtf8(key.view());
}

/// What the two copying routines differ in; the log tells them apart by number.
struct Copier {
    bool (*synchronize)(std::string_view domain);
    std::optional<PropertyList> (*copy)(std::string_view key, std::string_view domain);
    int logNumber;
};

/// The value as the bytes of a reply. The value goes before the memory for the bytes comes, since
/// each may be large.
kern_return_t SendValue(std::optional<PropertyList> value, int logNumber, OutOfLineData& reply) {
    if (!value) {
        return platform::KERN_SUCCESS;  // the empty reply: absence is no error
    }
    const auto bytes = platform::PropertyListCreateXmlData(*value);
    value.reset();
    if (!bytes || bytes->empty()) {
        return platform::KERN_FAILURE;
    }
    void* region = nullptr;
    const kern_return_t code = platform::vm_allocate(&region, bytes->size());
    // The number is followed by a letter l, on purpose: who reads the log knows the line like this.
    SystemLog(SystemLogPriority::kError,
              "VM_ALLOCATE %ul (mhs%d)\n",
              static_cast<unsigned>(bytes->size()),
              logNumber);
    if (code != platform::KERN_SUCCESS) {
        return code;
    }
    std::memcpy(region, bytes->data(), bytes->size());
    reply = {.address = region, .count = static_cast<std::uint32_t>(bytes->size())};
    return platform::KERN_SUCCESS;
}

kern_return_t CopyValue(const Copier& copier,
                        const String256& domain,
                        const String256& key,
                        OutOfLineData& reply) {
    reply = {};
    if (!AreTexts(domain, key)) {
        return platform::KERN_FAILURE;
    }
    // First, so that what other processes wrote is seen.
    (void)copier.synchronize(domain.view());
    return SendValue(copier.copy(key.view(), domain.view()), copier.logNumber, reply);
}

}  // namespace

kern_return_t server_LFMobileHelperSetPreferenceValue(mach_port_t /*port*/,
                                                      String256& domain,
                                                      String256& key,
                                                      std::span<const std::byte> value) {
    if (!AreTexts(domain, key)) {
        return platform::KERN_FAILURE;
    }
    // One byte, whatever it is, asks for the key to be removed: clients rely on it.
    std::optional<PropertyList> list;
    if (value.size() != 1) {
        list = platform::PropertyListCreateWithData(value);
        if (!list) {
            return platform::KERN_FAILURE;
        }
    }
    platform::PreferencesSetValue(key.view(), std::move(list), domain.view());
    (void)platform::PreferencesSynchronize(
        domain.view());  // a failure is in the log, not in the reply
    return platform::KERN_SUCCESS;
}

kern_return_t server_LFMobileHelperCopyPreferenceValue(mach_port_t /*port*/,
                                                       String256& domain,
                                                       String256& key,
                                                       OutOfLineData& value) {
    return CopyValue({.synchronize = platform::PreferencesSynchronize,
                      .copy = platform::PreferencesCopyValue,
                      .logNumber = 1},
                     domain,
                     key,
                     value);
}

kern_return_t server_LFMobileHelperCopyAppPreferenceValue(mach_port_t /*port*/,
                                                          String256& domain,
                                                          String256& key,
                                                          OutOfLineData& value) {
    return CopyValue({.synchronize = platform::PreferencesAppSynchronize,
                      .copy = platform::PreferencesCopyAppValue,
                      .logNumber = 2},
                     domain,
                     key,
                     value);
}
