// The driver registry and the loop turn, over drivers of the test's own.
#include <csignal>
#include <cstdio>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "vexorcd/registry.hpp"
#include "vexorcd/vexorcd.hpp"

namespace {

// Calls made to the fake drivers, in order: "a.open", "b.read", ...
std::vector<std::string> calls;
std::int32_t resultA = 0, resultB = 0, openA = 0, openB = 0;
std::vector<RcAction> dispatched;

std::int32_t Call(const char* what, std::int32_t result) { calls.push_back(what); return result; }
std::int32_t OpenA() { return Call("a.open", openA); }
std::int32_t ReadA() { return Call("a.read", resultA); }
std::int32_t CloseA() { return Call("a.close", 0); }
std::int32_t OpenB() { return Call("b.open", openB); }
std::int32_t ReadB() { return Call("b.read", resultB); }
std::int32_t CloseB() { return Call("b.close", 0); }
std::int32_t Dispatch(RcAction a) { dispatched.push_back(a); return 0; }

RcDriver driverA = {"raytac", "/dev/null", -1, OpenA, ReadA, CloseA};
RcDriver driverB = {"other", "/dev/null", -1, OpenB, ReadB, CloseB};
RcDriver* const table[] = {&driverA, &driverB, nullptr};
RcDriver* const onlyOther[] = {&driverB, nullptr};
RcDriver* const empty[] = {nullptr};

class Registry : public ::testing::Test {
protected:
    void SetUp() override
    {
        calls.clear();
        dispatched.clear();
        resultA = resultB = openA = openB = 0;
        RcDriversServiceHotplug(empty);  // drop requests left by other tests
    }
};

TEST_F(Registry, OpenAndCloseWalkEveryDriverAndReportAnyFailure)
{
    EXPECT_EQ(RcDriversOpenAll(table), 0);
    openA = -1;
    EXPECT_EQ(RcDriversOpenAll(table), -1);
    openA = 0;
    openB = 3;  // any non-zero result counts as failure
    EXPECT_EQ(RcDriversOpenAll(table), -1);
    EXPECT_EQ(RcDriversCloseAll(table), 0);
    EXPECT_EQ(calls, (std::vector<std::string>{"a.open", "b.open", "a.open", "b.open", "a.open",
                                               "b.open", "a.close", "b.close"}));
    EXPECT_EQ(RcDriversOpenAll(empty), 0);
    EXPECT_EQ(RcDriversPoll(empty), 0);

    // The product's table: the receiver first, whose wait paces the loop.
    char text[64] = {};
    std::FILE* f = fmemopen(text, sizeof text, "w");
    ASSERT_NE(f, nullptr);
    RcDriversList(f);
    std::fclose(f);
    EXPECT_STREQ(text, "Supported drivers:\n\traytac\n\tvexoctrl\n");
}

TEST_F(Registry, PollReturnsTheFirstPositiveResultInTableOrder)
{
    resultA = 6;
    resultB = 9;
    EXPECT_EQ(RcDriversPoll(table), 6);
    EXPECT_EQ(calls, (std::vector<std::string>{"a.read"}));  // b is not read this cycle

    calls.clear();
    resultA = -1;  // an error from one driver does not stop the poll
    EXPECT_EQ(RcDriversPoll(table), 9);
    EXPECT_EQ(calls, (std::vector<std::string>{"a.read", "b.read"}));

    resultA = 0;
    resultB = -7;
    EXPECT_EQ(RcDriversPoll(table), 0);
}

TEST_F(Registry, LoopTurnDispatchesOnlyActionsOneToTwentyFive)
{
    for (std::int32_t v : {0, -1, -25, 26, 100, 0x06000000, 1, 6, 25}) {
        resultA = v;
        EXPECT_EQ(RcLoopTurn(table, Dispatch), v > 0 ? v : 0);
    }
    EXPECT_EQ(dispatched, (std::vector<RcAction>{1, 6, 25}));
}

TEST_F(Registry, HotplugSignalsReachOnlyTheReceiverAndOnlyFromTheLoop)
{
    RcOnHotplugSignal(SIGUSR1);
    EXPECT_TRUE(calls.empty());  // the handler itself touches no driver
    RcDriversServiceHotplug(table);
    EXPECT_EQ(calls, (std::vector<std::string>{"a.open"}));

    calls.clear();
    RcOnHotplugSignal(SIGUSR2);
    RcDriversServiceHotplug(table);
    RcDriversServiceHotplug(table);  // served once only
    EXPECT_EQ(calls, (std::vector<std::string>{"a.close"}));

    // Unplug then replug before the loop comes round: close, then open anew.
    calls.clear();
    RcOnHotplugSignal(SIGUSR2);
    RcOnHotplugSignal(SIGUSR1);
    RcDriversServiceHotplug(table);
    EXPECT_EQ(calls, (std::vector<std::string>{"a.close", "a.open"}));

    // Replug then unplug: it ends closed.
    calls.clear();
    RcOnHotplugSignal(SIGUSR1);
    RcOnHotplugSignal(SIGUSR2);
    RcDriversServiceHotplug(table);
    EXPECT_EQ(calls, (std::vector<std::string>{"a.close"}));

    // Other signals, and tables without a driver named "raytac", do nothing.
    calls.clear();
    RcOnHotplugSignal(SIGHUP);
    RcDriversServiceHotplug(table);
    RcOnHotplugSignal(SIGUSR1);
    RcDriversServiceHotplug(onlyOther);
    EXPECT_TRUE(calls.empty());
}

}  // namespace
