// Archives that a careless expansion would be hurt by, and what a careful one makes of each.
#pragma once

#include <string>
#include <vector>

namespace zip {

struct HostileArchive {
    std::string name;
    std::string bytes;
    /// A line for each thing in the destination afterwards ("TYPE MODE PATH CONTENTS", by path),
    /// then for each call of a handler in its order ("left out ERRNO NAME", "fatal ERRNO").
    std::vector<std::string> outcome;
};

[[nodiscard]] std::vector<HostileArchive> HostileArchives();

}  // namespace zip
