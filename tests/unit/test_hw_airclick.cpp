// The AirClick remote's decisions: the action of a button, and the press
// filter with the volume throttle, driven without a clock.
#include <vector>

#include <gtest/gtest.h>

#include "drivers/hw_airclick.hpp"

TEST(Airclick, ButtonsAndTheRepeatsThatCount)
{
    // A release matches its entry but gives no action, like an unknown button.
    for (const auto& [code, action] :
         {std::pair {0xFAu, 6}, {0xF3u, 7}, {0xEBu, 8}, {0xF9u, 9}, {0xF7u, 10}, {0xFBu, 0}, {0u, 0}})
        EXPECT_EQ(AirclickKeyLookup(code, nullptr), action) << code;
    // A press counts once, and a release (0) ends a read too; Volume Plus every 50 ms repeats at
    // once, then one time in four; a clock set back repeats at once.
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
