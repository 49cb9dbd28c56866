#include <gtest/gtest.h>

#include <limits>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimRadioManager.h"

using platform::SystemLogPriority;
using Requests = std::vector<bool>;

namespace {

class RadioLogging : public testing::Test {
protected:
    RadioLogging() { sim::Reset(); }

    static kern_return_t set(std::int32_t isEnabled) {
        return server_LFMobileHelperSetRadioManagerLogging(7, isEnabled);
    }
};

TEST_F(RadioLogging, IsSwitchedOnAndOff) {
    EXPECT_EQ(set(1), 0);
    EXPECT_EQ(set(0), 0);
    EXPECT_EQ(sim::RadioManagerRequests(), (Requests{true, false}));
}

TEST_F(RadioLogging, IsSwitchedOnByEveryNumberButZero) {
    for (const std::int32_t number : {7, -1, 256, std::numeric_limits<std::int32_t>::min()}) {
        EXPECT_EQ(set(number), 0);
        EXPECT_EQ(sim::RadioManagerRequests(), Requests{true}) << number;
        sim::Reset();
    }
}

TEST_F(RadioLogging, LogsTheNumberAsItCame) {
    EXPECT_EQ(set(7), 0);
    EXPECT_EQ(set(-2'000'000'000), 0);
    EXPECT_EQ(set(0), 0);
    const std::vector<sim::SystemLogLine> expected{
        {SystemLogPriority::kError, "Enabling wireless radio manager logs: 7"},
        {SystemLogPriority::kError, "Enabling wireless radio manager logs: -2000000000"},
        {SystemLogPriority::kError, "Enabling wireless radio manager logs: 0"}};
    EXPECT_EQ(sim::SystemLogLines(), expected);
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

TEST_F(RadioLogging, AsksTheRadioManagerBeforeItLogs) {
    EXPECT_EQ(set(1), 0);
    EXPECT_TRUE(
        sim::JournalHasInOrder({"RadioManagerSetLogToFile on",
                                "SystemLog error Enabling wireless radio manager logs: 1"}));
}

TEST_F(RadioLogging, LogsAndSucceedsWithoutARadioManager) {
    sim::FailCall("RadioManagerSetLogToFile", 1);
    EXPECT_EQ(set(1), 0);
    EXPECT_TRUE(sim::RadioManagerRequests().empty());
    EXPECT_EQ(sim::SystemLogLines().size(), 1U);
}

}  // namespace
