#include "handlers/files/FileSystemInterface.h"

#include <gtest/gtest.h>

#include <array>
#include <cstring>

namespace {

/// Where a virtual operation stands in the table, as the Itanium C++ ABI tells it: a pointer to it
/// holds the offset in its first word, whose lowest bit is no part of the offset.
template <typename Operation>
std::size_t SlotOf(Operation operation) {
    std::array<std::size_t, 2> words{};
    static_assert(sizeof operation == sizeof words);
    std::memcpy(words.data(), &operation, sizeof operation);
    return (words[0] & ~std::size_t{1}) / sizeof(void*);
}

TEST(FileSystemInterface, HasItsOperationsInOrderBehindTheDestructors) {
    using Interface = FileSystemInterface;
    const std::array slots{SlotOf(&Interface::moveItem),
                           SlotOf(&Interface::moveItemWithOwner),
                           SlotOf(&Interface::moveFile),
                           SlotOf(&Interface::copyItem),
                           SlotOf(&Interface::copyNamedItem),
                           SlotOf(&Interface::setPermissions),
                           SlotOf(&Interface::setOwner),
                           SlotOf(&Interface::createDirectory),
                           SlotOf(&Interface::createDirectoryWithOwner),
                           SlotOf(&Interface::exists),
                           SlotOf(&Interface::listDirectory),
                           SlotOf(&Interface::moveEntriesWithPrefix),
                           SlotOf(&Interface::remove),
                           SlotOf(&Interface::baseName),
                           SlotOf(&Interface::dirName),
                           SlotOf(&Interface::realPath),
                           SlotOf(&Interface::readLink),
                           SlotOf(&Interface::loadDictionary),
                           SlotOf(&Interface::loadData),
                           SlotOf(&Interface::writeData),
                           SlotOf(&Interface::writePropertyList),
                           SlotOf(&Interface::writeDictionary),
                           SlotOf(&Interface::isSymlink),
                           SlotOf(&Interface::createSymlink),
                           SlotOf(&Interface::isDirectory),
                           SlotOf(&Interface::createEmptyFile)};
    constexpr std::size_t kDestructors = 2;
    ASSERT_EQ(slots.size(), 26U);
    for (std::size_t i = 0; i < slots.size(); ++i) {
        EXPECT_EQ(slots[i], kDestructors + i) << "operation " << i + 1;
    }
}

}  // namespace
