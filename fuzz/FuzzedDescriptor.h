// What comes beside a fuzzed message, and the invariant check of the fuzz targets.
#pragma once

#include <array>
#include <cstddef>
#include <cstdlib>
#include <memory>
#include <utility>
#include <vector>

#include "platform/sim/SimClient.h"

/// A broken invariant is a finding: a target that returned instead would find nothing.
inline void Require(bool holds) {
    if (!holds) {
        std::abort();
    }
}

/// Descriptors for one message, and the ends that their sender keeps.
struct FuzzedDescriptors {
    std::vector<sim::Descriptor> passed;
    std::vector<sim::Peer> kept;

    /// None, a port, a dead port, sealed or unsealed memory, a file, or two ports.
    explicit FuzzedDescriptors(std::byte choice) {
        static constexpr std::array<std::byte, 4096> kContents{};
        switch (std::to_integer<unsigned>(choice) % 7) {
            case 1:
                addPort();
                break;
            case 2:
                addPort();
                kept.clear();
                break;
            case 3:
                passed.push_back(std::make_shared<sim::MemoryFile>(kContents, true));
                break;
            case 4:
                passed.push_back(std::make_shared<sim::MemoryFile>(kContents, false));
                break;
            case 5:
                passed.push_back(std::make_shared<sim::OtherFile>());
                break;
            case 6:
                addPort();
                addPort();
                break;
            default:
                break;
        }
    }

private:
    void addPort() {
        auto pair = sim::MakeWatchPair();
        passed.push_back(std::move(pair.passed));
        kept.push_back(std::move(pair.kept));
    }
};
