// The driver registry and one turn of the main loop, over drivers of the
// test's own that note their calls.
#include <cstdio>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "vexorcd/registry.hpp"
#include "vexorcd/vexorcd.hpp"

namespace {

std::string calls;
std::int32_t openA, readA, readB;
std::vector<RcAction> dispatched;

std::int32_t Note(const char* call, std::int32_t result)
{
    calls += call;
    return result;
}

RcDriver a = {"raytac", "/dev/null", -1, [] { return Note("a.open ", openA); },
              [] { return Note("a.read ", readA); }, [] { return Note("a.close ", 0); }};
RcDriver b = {"other", "/dev/null", -1, [] { return Note("b.open ", 0); },
              [] { return Note("b.read ", readB); }, [] { return Note("b.close ", 0); }};
RcDriver* const table[] = {&a, &b, nullptr};

TEST(Registry, OpenPollAndCloseWalkTheTableInOrderAndTheLoopDispatchesOneToTwentyFive)
{
    openA = -1;  // one failure fails the open, and the rest are opened all the same
    EXPECT_EQ(RcDriversOpenAll(table), -1);
    EXPECT_EQ(RcDriversCloseAll(table), 0);
    // b is not read in a turn a gave an action in; an error of a does not end the poll.
    for (const auto& [ra, rb, result] : {std::tuple {6, 9, 6}, {-1, 9, 9}, {0, -7, 0}}) {
        readA = ra;
        readB = rb;
        EXPECT_EQ(RcDriversPoll(table), result);
    }
    EXPECT_EQ(calls, "a.open b.open a.close b.close a.read a.read b.read a.read b.read ");
    for (const std::int32_t v : {0, -1, 26, 0x06000000, 1, 6, 25}) {
        readA = v;
        RcLoopTurn(table, [](RcAction action) {
            dispatched.push_back(action);
            return 0;
        });
    }
    EXPECT_EQ(dispatched, (std::vector<RcAction> {1, 6, 25}));
    char text[64] = {};  // the daemon's own table: the receiver, whose wait paces the loop, first
    std::FILE* f = fmemopen(text, sizeof text, "w");
    RcDriversList(f);
    std::fclose(f);
    EXPECT_STREQ(text, "Supported drivers:\n\traytac\n\tvexoctrl\n");
}

TEST(Registry, HotplugSignalsOpenAndCloseTheReceiverOnlyFromTheLoop)
{
    for (const auto& [signals, called] : {std::pair<std::vector<int>, std::string> {{SIGUSR1}, "a.open "},
                                          {{SIGUSR2}, "a.close "}, {{SIGUSR2, SIGUSR1}, "a.close a.open "},
                                          {{SIGUSR1, SIGUSR2}, "a.close "}, {{SIGHUP}, ""}}) {
        calls.clear();
        for (const int sig : signals)
            RcOnHotplugSignal(sig);
        EXPECT_EQ(calls, "");  // the handler itself touches no driver
        RcDriversServiceHotplug(table);
        RcDriversServiceHotplug(table);  // each request is carried out once
        EXPECT_EQ(calls, called);
    }
}

}  // namespace
