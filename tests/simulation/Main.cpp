#include <gtest/gtest.h>

#include <cstdlib>
#include <string_view>

#include "tests/simulation/Seed.h"

namespace {

std::uint64_t seedToReplay = 0;

}  // namespace

std::uint64_t SeedToReplay() {
    return seedToReplay;
}

int main(int argc, char** argv) {
    testing::InitGoogleTest(&argc, argv);
    constexpr std::string_view kOption = "--seed=";
    if (const char* const seed = std::getenv("LINEFOLD_SEED"); seed != nullptr) {
        seedToReplay = std::strtoull(seed, nullptr, 10);
    }
    for (int i = 1; i < argc; ++i) {
        const std::string_view argument = argv[i];
        if (argument.starts_with(kOption)) {
            seedToReplay = std::strtoull(argv[i] + kOption.size(), nullptr, 10);
        }
    }
    return RUN_ALL_TESTS();
}
