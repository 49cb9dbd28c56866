#include "platform/PropertyListEntries.h"

#include <algorithm>
#include <numeric>

namespace platform {

void MergeEqualKeys(PropertyList::Dictionary& entries) {
    std::vector<std::uint32_t> order(entries.size());
    std::iota(order.begin(), order.end(), 0U);
    std::ranges::sort(order, [&entries](std::uint32_t one, std::uint32_t other) {
        const int compared = entries[one].first.compare(entries[other].first);
        return compared != 0 ? compared < 0 : one < other;
    });
    std::vector<bool> isMerged;
    for (std::size_t first = 0; first < order.size();) {
        std::size_t next = first + 1;
        for (; next < order.size() && entries[order[first]].first == entries[order[next]].first;
             ++next) {
            isMerged.resize(entries.size());
            isMerged[order[next]] = true;
        }
        if (next - first > 1) {
            entries[order[first]].second = entries[order[next - 1]].second;
        }
        first = next;
    }
    if (!isMerged.empty()) {
        std::size_t index = 0;
        std::erase_if(entries, [&](const auto& /*entry*/) { return isMerged[index++]; });
    }
}

}  // namespace platform
