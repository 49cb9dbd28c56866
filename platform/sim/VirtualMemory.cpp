#include "platform/VirtualMemory.h"

#include <map>
#include <memory>

#include "platform/MachMessage.h"
#include "platform/sim/World.h"

namespace {

std::map<void*, std::unique_ptr<std::byte[]>>& Regions() {
    static auto& regions = *new std::map<void*, std::unique_ptr<std::byte[]>>;
    return regions;
}

std::map<void*, std::size_t>& Sizes() {
    static auto& sizes = *new std::map<void*, std::size_t>;
    return sizes;
}

}  // namespace

std::size_t sim::AllocatedMemory() {
    std::size_t total = 0;
    for (const auto& [address, size] : Sizes()) {
        total += size;
    }
    return total;
}

void sim::ResetMemory() {
    Regions().clear();
    Sizes().clear();
}

namespace platform {

kern_return_t vm_allocate(void** address, std::size_t size) {
    if (sim::CallFails("vm_allocate", std::to_string(size)) || size > kMaxReplyData) {
        return KERN_NO_SPACE;
    }
    if (size == 0) {
        *address = nullptr;
        return KERN_SUCCESS;
    }
    auto region = std::make_unique<std::byte[]>(size);
    *address = region.get();
    Sizes().emplace(*address, size);
    Regions().emplace(*address, std::move(region));
    return KERN_SUCCESS;
}

void vm_deallocate(void* address, std::size_t size) {
    sim::NoteCall("vm_deallocate", std::to_string(size));
    if (address == nullptr && size == 0) {
        return;
    }
    const auto region = Sizes().find(address);
    if (region == Sizes().end() || region->second != size) {
        throw sim::ContractBroken("memory is given back that was not given out so");
    }
    Regions().erase(address);
    Sizes().erase(region);
}

}  // namespace platform
