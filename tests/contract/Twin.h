// What the contract suite needs of a twin beyond the interfaces.
#pragma once

#include <functional>

namespace twin {

/// Before each test.
void Reset();

/// Keeps the calling thread busy for so long.
void Spend(double seconds);

/// A descriptor that can be adopted as a port, and what closes the other end of its pair.
struct Pair {
    int descriptor = -1;
    std::function<void()> closeOther;
};

[[nodiscard]] Pair MakePair();

}  // namespace twin
