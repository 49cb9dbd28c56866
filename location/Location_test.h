// What the tests of the location requests share: a world in which nobody waits for an answer.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "location/LocationWaitFlag.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimLocation.h"

class LocationTest : public testing::Test {
protected:
    using Texts = std::vector<std::optional<std::string>>;

    LocationTest() { forget(); }

    ~LocationTest() override { forget(); }

    static void requestCivicAddress(double latitude = 51.5, double longitude = -0.125) {
        EXPECT_EQ(server_LFMobileHelperRequestCountryCodeFromLocation(7, latitude, longitude), 0);
    }

    static void requestWanIp() { EXPECT_EQ(server_LFMobileHelperRequestWanIPFromLocation(7), 0); }

    /// The texts of the only report that the telephony daemon has got.
    static Texts report() {
        EXPECT_EQ(sim::TelephonyReports().size(), 1U);
        return sim::TelephonyReports().empty() ? Texts() : sim::TelephonyReports().front().texts;
    }

    static std::size_t reports() { return sim::TelephonyReports().size(); }

    /// The lines with this text, by channel.
    static std::size_t logged(platform::SystemLogPriority priority, std::string_view text) {
        return static_cast<std::size_t>(std::ranges::count(
            sim::SystemLogLines(), sim::SystemLogLine{priority, std::string(text)}));
    }

    static std::size_t logged(platform::LogLevel level, std::string_view text) {
        return static_cast<std::size_t>(
            std::ranges::count(sim::UnifiedLog(), sim::LogLine{level, std::string(text)}));
    }

    static constexpr auto kError = platform::SystemLogPriority::kError;
    static constexpr auto kNotice = platform::SystemLogPriority::kNotice;

private:
    static void forget() {
        sim::Reset();
        (void)LocationWaitFlagTake();
    }
};

inline constexpr std::string_view kCivicWasNotWaiting =
    "_RequestCivicInfoFromLatitudeLongitude wasn't waiting for response from ORB";
inline constexpr std::string_view kWanIpWasNotWaiting =
    "_RequestWanIPFromLocation wasn't waiting for response from ORB";
