// The AirClick remote's decisions: the button of a report, its action, and
// the press filter with the volume throttle, driven without a clock.
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "drivers/hiddev.hpp"
#include "drivers/hw_airclick.hpp"

// The button of a report of n events whose usages carry a value (i in event
// i, button in the fifth), but the fifth's when noValue.
static std::uint32_t Button(std::uint32_t button, std::size_t n, bool noValue = false)
{
    std::string report(n * sizeof(hiddev_event), '\0');
    for (std::size_t i = 0; i < n; ++i) {
        const hiddev_event ev {i == 4 && noValue ? 0x000C0100u : 0x000C0001u, static_cast<std::int32_t>(i == 4 ? button : i)};
        std::memcpy(report.data() + i * sizeof ev, &ev, sizeof ev);
    }
    return AirclickReportCode(reinterpret_cast<const unsigned char*>(report.data()), report.size(), nullptr);
}

TEST(Airclick, TheButtonOfAReportItsActionAndTheRepeatsThatCount)
{
    EXPECT_EQ((std::vector<std::uint32_t> {Button(0xFA, 5), Button(0xF3, 7), Button(0xFA, 4), Button(0xFA, 5, true)}),
              (std::vector<std::uint32_t> {0xFA, 0xF3, 0, 0}));
    // A release matches its entry but gives no action, like an unknown button.
    for (const auto& [code, action] : {std::pair {0xFAu, 6}, {0xF3u, 7}, {0xEBu, 8}, {0xF9u, 9}, {0xF7u, 10}, {0xFBu, 0}, {0u, 0}})
        EXPECT_EQ(AirclickKeyLookup(code, nullptr), action) << code;
    // A press counts once, the release (0) ends a read too; Volume Plus every 50 ms
    // repeats at once, then one time in four; a clock set back repeats at once.
    AirclickRepeatState state {0, 0};
    std::vector<RcAction> given;  // -1: dropped, the read waits on
    const auto step = [&](RcAction found, std::int64_t now) {
        const AirclickOutcome o = AirclickStep(state, found, now);
        given.push_back(o.done ? o.action : -1);
    };
    for (const RcAction found : {6, 6, 7, 0, 0})
        step(found, 0);
    for (int i = 0; i < 10; ++i)
        step(RC_ACT_VOLUME_UP, 1'700'000'000'000'000 + i * 50'000);
    const std::int64_t last = state.lastRepeatTime;
    for (const std::int64_t now : {last + 199'999, last + 200'000, last - 1})
        step(RC_ACT_VOLUME_UP, now);
    EXPECT_EQ(given, (std::vector<RcAction> {6, -1, 7, 0, -1, 9, 9, -1, -1, -1, 9, -1, -1, -1, 9, -1, 9, 9}));
}
