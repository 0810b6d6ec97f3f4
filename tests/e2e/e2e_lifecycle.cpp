// The daemon's lifecycle, run as the real binary in the sandbox.
#include <signal.h>

#include <gtest/gtest.h>

#include "harness.hpp"

namespace {

constexpr char kPidFile[] = "/var/run/vexorcd.pid";

TEST(Lifecycle, AnyArgumentPrintsUsageAndTouchesNothing)
{
    vt::SyslogSink log;
    for (const char* arg : {"-h", "start", ""}) {
        std::string out;
        const std::string path = vt::BinPath("vexorcd");
        EXPECT_EQ(vt::RunToEnd({path, arg}, &out), 0) << arg;
        // A banner line, an empty line, then the usage line.
        const size_t first = out.find('\n');
        ASSERT_NE(first, std::string::npos) << out;
        EXPECT_GT(first, 0u);
        EXPECT_EQ(out.substr(first), "\n\n" + path + ":\tVexora remote controller daemon.\n");
        EXPECT_FALSE(vt::PathExists(kPidFile));
    }
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST(Lifecycle, RunsWritesPidFileAndStopsCleanlyOnTermAndInt)
{
    vt::SyslogSink log;
    for (int sig : {SIGTERM, SIGINT}) {
        vt::Daemon d;
        const pid_t pid = d.Start();
        ASSERT_GT(pid, 0);
        // Only the decimal pid, no newline.
        EXPECT_EQ(vt::ReadFile(kPidFile), std::to_string(pid));
        EXPECT_TRUE(d.Alive());
        EXPECT_EQ(d.Stop(sig), 0) << strsignal(sig);
        EXPECT_FALSE(vt::PathExists(kPidFile));
        EXPECT_FALSE(vt::PathExists("/tmp/vexoctrl"));
    }
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST(Lifecycle, RefusesToStartBesideALiveInstanceAndIgnoresSigpipe)
{
    vt::SyslogSink log;
    vt::Daemon d;
    const pid_t pid = d.Start();
    ASSERT_GT(pid, 0);
    d.Signal(SIGPIPE);
    std::string out;
    EXPECT_EQ(vt::RunToEnd({vt::BinPath("vexorcd")}, &out), 0);
    EXPECT_EQ(out, "vexorcd already exists. pid[" + std::to_string(pid) + "]\n");
    EXPECT_EQ(vt::ReadFile(kPidFile), std::to_string(pid));
    EXPECT_TRUE(d.Alive());
    EXPECT_EQ(d.Stop(), 0);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST(Lifecycle, StaleOrGarbagePidFileIsIgnoredAndRewritten)
{
    vt::SyslogSink log;
    // 2^22 + 1 is above the kernel's pid limit, so no process has it.
    for (const char* stale : {"4194305", "", "garbage", "-1", "99999999999999"}) {
        vt::WriteFile(kPidFile, stale);
        vt::Daemon d;
        const pid_t pid = d.Start();
        ASSERT_GT(pid, 0) << stale;
        EXPECT_EQ(vt::ReadFile(kPidFile), std::to_string(pid));
        EXPECT_EQ(d.Stop(), 0);
    }
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

}  // namespace
