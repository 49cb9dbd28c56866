// What the tests of the file routines share: fields of requests, and what the logs should hold.
#pragma once

#include <gtest/gtest.h>

#include <array>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"

inline constexpr const char* kBundles = "/private/var/mobile/Library/Carrier Bundles";
inline constexpr std::uint32_t kMobileUser = 501;

/// A field of 256 bytes as it came in a message.
inline String256 Field256(std::string_view text) {
    std::array<std::byte, 256> field{};
    if (!text.empty()) {
        std::memcpy(field.data(), text.data(), text.size());
    }
    return String256(std::span<const std::byte, 256>(field));
}

inline sim::SystemLogLine Notice(const std::string& text) {
    return {platform::SystemLogPriority::kNotice, text};
}

inline sim::SystemLogLine Error(const std::string& text) {
    return {platform::SystemLogPriority::kError, text};
}

/// A phone with a file and a folder to be put somewhere.
class FileRoutine : public testing::Test {
protected:
    using SystemLines = std::vector<sim::SystemLogLine>;

    FileRoutine() { makePhone(); }

    static void makePhone() {
        sim::Reset();
        sim::MakeDirectory("/logs", kMobileUser);
        sim::MakeFile("/logs/file", {.mode = sim::kRegular | 0640, .owner = 7, .contents = "new"});
        sim::MakeDirectory("/logs/folder", 7);
        sim::MakeFile("/logs/folder/inner", {.mode = sim::kRegular | 0644, .contents = "in"});
        for (const char* path : {"", "/Logs", "/Logs/CrashReporter"}) {
            sim::MakeDirectory(std::string("/private/var/mobile/Library") + path, kMobileUser);
        }
        sim::ClearLogs();
    }

    static std::string contentsAt(std::string_view path) {
        const auto node = sim::FileAt(path);
        return node ? node->contents : "nothing";
    }

    static bool isDirectory(std::string_view path) {
        const auto node = sim::FileAt(path);
        return node && node->is(sim::kDirectory);
    }

    /// What the policy says of a path that it refuses; nothing else may stand in the unified log.
    static void expectRefusal(const std::string& path) {
        using platform::LogLevel;
        const std::vector<sim::LogLine> expected{
            {LogLevel::kError,
             "NOT Allowing path " + path + " as it isn't within the wild card directories:"},
            {LogLevel::kError, "/var/mobile/Library/Carrier Bundles/"},
            {LogLevel::kError, kBundles}};
        EXPECT_EQ(sim::UnifiedLog(), expected);
    }
};

/// The n-th platform call fails, for all n until none does: whatever happens, the routine answers
/// 0, and its flag is set only if it holds that it did it.
template <typename Prepare, typename Call, typename Holds>
void ExpectTrueFlagAtEveryFailure(const Prepare& prepare,
                                  const Call& call,
                                  std::int32_t& isDone,
                                  const Holds& holds) {
    for (unsigned n = 1;; ++n) {
        prepare();
        sim::FailCall(n);
        isDone = 7;
        ASSERT_EQ(call(), 0);
        if (sim::FailedCall().empty()) {
            EXPECT_GT(n, 3U);
            EXPECT_EQ(isDone, 1);
            return;
        }
        EXPECT_TRUE(isDone == 0 || isDone == 1) << sim::FailedCall();
        EXPECT_TRUE(isDone == 0 || holds()) << sim::FailedCall();
    }
}
