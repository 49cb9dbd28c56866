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

/// The value as the bytes of a reply; the log tells the two copying routines apart by number. The
/// value goes before the memory for the bytes comes, since each may be large.
kern_return_t SendValue(std::optional<PropertyList> value, int copier, OutOfLineData& reply) {
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
              copier);
    if (code != platform::KERN_SUCCESS) {
        return code;
    }
    std::memcpy(region, bytes->data(), bytes->size());
    reply = {.address = region, .count = static_cast<std::uint32_t>(bytes->size())};
    return platform::KERN_SUCCESS;
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
    value = {};
    if (!AreTexts(domain, key)) {
        return platform::KERN_FAILURE;
    }
    // First, so that what other processes wrote is seen.
    (void)platform::PreferencesSynchronize(domain.view());
    return SendValue(platform::PreferencesCopyValue(key.view(), domain.view()), 1, value);
}

kern_return_t server_LFMobileHelperCopyAppPreferenceValue(mach_port_t /*port*/,
                                                          String256& domain,
                                                          String256& key,
                                                          OutOfLineData& value) {
    value = {};
    if (!AreTexts(domain, key)) {
        return platform::KERN_FAILURE;
    }
    (void)platform::PreferencesAppSynchronize(domain.view());
    return SendValue(platform::PreferencesCopyAppValue(key.view(), domain.view()), 2, value);
}
