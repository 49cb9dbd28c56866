// Location requests in random worlds, beside a model of the one flag that all of them share.
#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <vector>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "location/LocationWaitFlag.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimLocation.h"
#include "tests/simulation/Seed.h"

using namespace platform;

namespace {

constexpr std::uint64_t kRounds = 1500;
constexpr double kScriptEnd = 40.0;
constexpr double kSecondsToAnswer = 5.0;

double Seconds(double most) {
    return most * static_cast<double>(sim::Random(1'000'001)) / 1'000'000.0;
}

bool Chance(unsigned percent) {
    return sim::Random(100) < percent;
}

struct Report {
    double time = 0;
    std::string text{};

    bool operator==(const Report&) const = default;
};

std::ostream& operator<<(std::ostream& stream, const Report& report) {
    return stream << report.time << " " << report.text;
}

/// What has to happen, by time: the events of each request as its description tells them.
class Model {
public:
    void request(double time, const std::string& fallback) {
        happen(time, [this] { isWaiting_ = true; });
        happen(time + kSecondsToAnswer,
               [this, fallback, time] { report(time + kSecondsToAnswer, fallback); });
    }

    void answer(double time, const std::string& text) {
        happen(time, [this, text, time] { dropped += report(time, text) ? 0 : 1; });
    }

    void zeroCoordinates(double time, const std::string& text) {
        happen(time, [this, text, time] { reports.push_back({time, text}); });
    }

    void run() {
        for (const auto& [time, event] : events_) {
            event();
        }
    }

    std::vector<Report> reports;
    std::size_t dropped = 0;

private:
    void happen(double time, std::function<void()> event) { events_.emplace(time, event); }

    bool report(double time, const std::string& text) {
        const bool wasWaiting = std::exchange(isWaiting_, false);
        if (wasWaiting) {
            reports.push_back({time, text});
        }
        return wasWaiting;
    }

    std::multimap<double, std::function<void()>> events_;
    bool isWaiting_ = false;
};

class World {
public:
    explicit World(std::uint64_t seed) {
        sim::Reset(seed);
        (void)LocationWaitFlagTake();
        const std::uint64_t requests = 1 + sim::Random(25);
        for (std::uint64_t i = 0; i < requests; ++i) {
            script(Seconds(kScriptEnd), std::to_string(i));
        }
    }

    World(const World&) = delete;
    World& operator=(const World&) = delete;
    ~World() = default;

    void live() {
        sim::RunFor(kScriptEnd + 20);
        model_.run();
        EXPECT_EQ(reportsMade(), model_.reports);
        EXPECT_EQ(dropped(), model_.dropped);
        EXPECT_FALSE(LocationWaitFlagTake());
    }

private:
    void script(double time, const std::string& name) {
        const double delay = Chance(80) ? Seconds(8) : -1;
        const bool hasTicket = Chance(95);
        const bool isError = Chance(20);
        if (Chance(40)) {
            scriptWanIp(time, delay, hasTicket, isError ? "" : "192.0.2." + name, isError);
        } else if (Chance(10)) {
            model_.zeroCoordinates(time, "civic US");
            sim::At(time,
                    [] { (void)server_LFMobileHelperRequestCountryCodeFromLocation(7, 0, 0); });
        } else {
            scriptCivic(time, delay, hasTicket, isError ? "US" : "C" + name, isError);
        }
    }

    void scriptCivic(
        double time, double delay, bool hasTicket, const std::string& country, bool isError) {
        model_.request(time, "civic US");
        if (delay >= 0 && hasTicket) {
            model_.answer(time + delay, "civic " + country);
        }
        sim::At(time, [=] {
            sim::GeocodeAnswer answer{.delay = delay, .isNever = delay < 0};
            if (isError) {
                answer.error = ORBError{"scripted"};
            } else {
                answer.items = sim::MapItemsOf({.countryCode = country});
            }
            sim::AnswerReverseGeocode(answer);
            sim::FailCall("ORBMapService.ticketForReverseGeocodeCoordinate", hasTicket ? 0 : 1);
            (void)server_LFMobileHelperRequestCountryCodeFromLocation(7, 1, 1);
        });
    }

    void scriptWanIp(
        double time, double delay, bool hasTicket, const std::string& address, bool isError) {
        model_.request(time, "address ");
        if (delay >= 0 && hasTicket) {
            model_.answer(time + delay, "address " + address);
        }
        sim::At(time, [=] {
            sim::IpAnswer answer{.delay = delay, .isNever = delay < 0};
            if (isError) {
                answer.error = ORBError{"scripted"};
            } else {
                answer.result = OrbIpLookupResult{.ipAddress = address};
            }
            sim::AnswerIpLookup(answer);
            sim::FailCall("ORBMapService.ticketForOrbIpLookupForIpAddr", hasTicket ? 0 : 1);
            (void)server_LFMobileHelperRequestWanIPFromLocation(7);
        });
    }

    [[nodiscard]] static std::vector<Report> reportsMade() {
        std::vector<Report> reports;
        for (const auto& report : sim::TelephonyReports()) {
            reports.push_back({report.time, report.call + " " + report.texts.front().value()});
        }
        return reports;
    }

    [[nodiscard]] static std::size_t dropped() {
        const auto isDropped = [](const auto& line) {
            return line.text.ends_with("wasn't waiting for response from ORB");
        };
        return static_cast<std::size_t>(std::ranges::count_if(sim::SystemLogLines(), isDropped) +
                                        std::ranges::count_if(sim::UnifiedLog(), isDropped));
    }

    Model model_;
};

TEST(LocationLife, GoesAsTheOneFlagLetsIt) {
    ForEachSeed(kRounds, [](std::uint64_t seed) { World(seed).live(); });
}

// Time does not stand still while a report is made: the two queues wait for the telephony daemon
// each by itself. What remains true is that an answer is reported or dropped, and nothing twice.
TEST(LocationLife, LosesNoAnswerWhileTheTelephonyDaemonIsSlow) {
    std::size_t reportsOfAll = 0;
    ForEachSeed(kRounds, [&reportsOfAll](std::uint64_t seed) {
        sim::Reset(seed);
        (void)LocationWaitFlagTake();
        sim::SetTelephony({.delay = Seconds(3)});
        const std::uint64_t requests = 1 + sim::Random(40);
        for (std::uint64_t i = 0; i < requests; ++i) {
            sim::At(Seconds(kScriptEnd), [] {
                sim::AnswerIpLookup({.delay = Seconds(8)});
                (void)server_LFMobileHelperRequestWanIPFromLocation(7);
            });
        }
        sim::RunFor(kScriptEnd + 200);
        const auto lines = [](std::string_view text) {
            return static_cast<std::size_t>(std::ranges::count_if(
                sim::UnifiedLog(), [text](const auto& line) { return line.text == text; }));
        };
        const std::size_t answered = lines("_RequestWanIPFromLocation WAN IP: ");
        const std::size_t reports = sim::TelephonyReports().size();
        EXPECT_EQ(
            answered + lines("_RequestWanIPFromLocation wasn't waiting for response from ORB"),
            requests);
        EXPECT_GE(reports, answered);
        EXPECT_LE(reports, requests);
        EXPECT_GE(reports, 1U);
        EXPECT_EQ(sim::TelephonyConnections(), 0U);
        reportsOfAll += reports;
    });
    if (SeedToReplay() == 0) {
        EXPECT_GT(reportsOfAll, kRounds);
    }
}

}  // namespace
