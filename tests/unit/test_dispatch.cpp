// Remote actions to audio commands, against a peer on the daemon's socket.
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "audio_peer.hpp"
#include "harness.hpp"
#include "vexorcd/dispatch.hpp"

namespace {

TEST(Dispatch, EveryActionSendsItsCommandOnce)
{
    vt::SyslogSink log;
    vt::AudioPeer peer;
    for (RcAction a = 1; a <= 25; ++a)
        EXPECT_EQ(RcDispatchAction(a), 0) << a;
    // Actions 1, 11 and 12 send nothing; the custom keys carry "1" to "4".
    const std::vector<std::pair<std::int32_t, std::string>> want = {
        {5, ""},   {1, ""},   {2, ""},   {3, ""},   {4, ""},   {6, ""},   {7, ""},
        {12, ""},  {13, ""},  {26, ""},  {30, ""},  {31, ""},  {32, "1"}, {32, "2"},
        {32, "3"}, {32, "4"}, {33, ""},  {34, ""},  {36, "1"}, {36, "2"}, {36, "3"},
        {36, "4"},
    };
    ASSERT_TRUE(peer.WaitForCount(want.size()));
    EXPECT_FALSE(peer.WaitForCount(want.size() + 1, 300));
    std::vector<std::pair<std::int32_t, std::string>> got;
    for (const auto& cmd : peer.Commands()) {
        got.emplace_back(cmd.code, cmd.ArgText());
        EXPECT_TRUE(cmd.ZeroFrom(cmd.ArgText().size())) << cmd.code;
    }
    EXPECT_EQ(got, want);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

}  // namespace
