#include "platform/VirtualMemory.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <span>

#include "platform/MachMessage.h"
#include "tests/contract/Twin.h"

using namespace platform;

namespace {

class VirtualMemoryContract : public testing::Test {
protected:
    VirtualMemoryContract() { twin::Reset(); }
};

TEST_F(VirtualMemoryContract, GivesZeroedMemory) {
    for (const std::size_t size : {std::size_t{1}, std::size_t{4096}, std::size_t{100'001}}) {
        void* address = nullptr;
        ASSERT_EQ(vm_allocate(&address, size), KERN_SUCCESS);
        const std::span bytes(static_cast<std::byte*>(address), size);
        EXPECT_TRUE(std::ranges::all_of(bytes, [](std::byte byte) { return byte == std::byte{}; }));
        std::ranges::fill(bytes, std::byte{0xFF});
        vm_deallocate(address, size);
    }
}

TEST_F(VirtualMemoryContract, GivesNothingForNothing) {
    int somewhere = 0;
    void* address = &somewhere;
    EXPECT_EQ(vm_allocate(&address, 0), KERN_SUCCESS);
    EXPECT_EQ(address, nullptr);
    vm_deallocate(address, 0);
}

TEST_F(VirtualMemoryContract, GivesNoMoreThanAReplyCarries) {
    int somewhere = 0;
    void* address = &somewhere;
    EXPECT_EQ(vm_allocate(&address, std::size_t{kMaxReplyData} + 1), KERN_NO_SPACE);
    EXPECT_EQ(address, &somewhere);
    ASSERT_EQ(vm_allocate(&address, kMaxReplyData), KERN_SUCCESS);
    vm_deallocate(address, kMaxReplyData);
}

}  // namespace
