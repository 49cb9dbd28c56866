#include "Helper/Shared/Server/SortedTable.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>

namespace {

TEST(SortedTable, GivesADefaultForAKeyThatIsNotThere) {
    const SortedTable<int, std::string> table;
    EXPECT_EQ(table.get(1), "");
    EXPECT_TRUE(table.empty());
}

TEST(SortedTable, FindsWhatWasSetInAnyOrder) {
    SortedTable<int, std::string> table;
    for (const int key : {5, 1, 9, 3, 7}) {
        table.set(key, std::to_string(key));
    }
    for (const int key : {1, 3, 5, 7, 9}) {
        EXPECT_EQ(table.get(key), std::to_string(key));
        EXPECT_EQ(table.get(key + 1), "");
    }
    EXPECT_EQ(table.front().first, 1);
}

TEST(SortedTable, ReplacesTheValueOfAKey) {
    SortedTable<int, int> table;
    table.set(4, 1);
    table.set(4, 2);
    EXPECT_EQ(table.get(4), 2);
    EXPECT_EQ(table.size(), 1U);
}

TEST(SortedTable, ErasesOneKeyOnce) {
    SortedTable<int, int> table;
    table.set(1, 10);
    table.set(2, 20);
    EXPECT_TRUE(table.erase(1));
    EXPECT_FALSE(table.erase(1));
    EXPECT_EQ(table.get(1), 0);
    EXPECT_EQ(table.get(2), 20);
}

TEST(SortedTable, FindsAnObjectByItsAddress) {
    SortedTable<std::shared_ptr<int>, int> table;
    const auto first = std::make_shared<int>();
    const auto second = std::make_shared<int>();
    table.set(first, 1);
    table.set(second, 2);
    EXPECT_EQ(table.get(second.get()), 2);
    EXPECT_TRUE(table.erase(first.get()));
    EXPECT_EQ(table.get(first), 0);
    EXPECT_EQ(table.size(), 1U);
}

/// Looks at its table while it goes.
struct Witness {
    SortedTable<int, std::shared_ptr<Witness>>* table = nullptr;
    std::size_t* sizeSeen = nullptr;

    ~Witness() { *sizeSeen = table->size(); }
};

TEST(SortedTable, LetsAnEntryLeaveBeforeWhatItHoldsIsReleased) {
    SortedTable<int, std::shared_ptr<Witness>> table;
    std::size_t sizeSeen = 99;
    table.set(1, std::shared_ptr<Witness>(new Witness{.table = &table, .sizeSeen = &sizeSeen}));
    EXPECT_TRUE(table.erase(1));
    EXPECT_EQ(sizeSeen, 0U);
}

}  // namespace
