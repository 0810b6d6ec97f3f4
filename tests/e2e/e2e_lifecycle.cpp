// The daemon's lifecycle as only the real binary shows it: the usage text,
// the pid file and the single-instance guard, signals, a clean stop. Each test
// fails on a system log line it does not expect.
#include <sys/stat.h>

#include "harness.hpp"

namespace {

bool Exists(const char* path) { return access(path, F_OK) == 0; }

TEST(Lifecycle, AnyArgumentPrintsTheUsageAndTouchesNothing)
{
    for (const char* arg : {"-h", "start"}) {
        std::string out;
        EXPECT_EQ(vt::Run({"vexorcd", arg}, &out), 0);
        const auto banner = std::min(out.find('\n'), out.size());  // a banner, an empty line, the usage
        EXPECT_EQ(out.substr(banner), "\n\n" + vt::Bin("vexorcd") + ":\tVexora remote controller daemon.\n");
        EXPECT_FALSE(Exists(RC_PID_FILE));
    }
    EXPECT_TRUE(vt::Logged().empty());
}

TEST(Lifecycle, OneInstanceWithItsPidFileStopsCleanlyOnTermAndInt)
{
    for (const int sig : {SIGTERM, SIGINT}) {
        vt::Daemon daemon;
        ASSERT_GT(daemon.pid, 0);
        const std::string pid = std::to_string(daemon.pid);
        EXPECT_EQ(vt::ReadFile(RC_PID_FILE), pid);  // decimal, no newline
        std::string out;
        EXPECT_EQ(vt::Run({"vexorcd"}, &out), 0);
        EXPECT_EQ(out, "vexorcd already exists. pid[" + pid + "]\n");
        kill(daemon.pid, SIGPIPE);
        EXPECT_EQ(vt::Run({"vexorctl", "0"}), 0) << "SIGPIPE stopped the daemon";
        EXPECT_EQ(daemon.Stop(sig), 0);
        EXPECT_FALSE(Exists(RC_PID_FILE));
        EXPECT_FALSE(Exists(RC_CTRL_SOCKET_PATH));
    }
    EXPECT_TRUE(vt::Logged().empty());
}

TEST(Lifecycle, APidFileOfNoLiveProcessIsReplacedAndOneThatCannotBeWrittenIsLogged)
{
    for (const char* stale : {"4194305", "garbage"}) {  // above the kernel's pid limit; no pid at all
        vt::WriteFile(RC_PID_FILE, stale);
        vt::Daemon daemon;
        ASSERT_GT(daemon.pid, 0);
        EXPECT_EQ(vt::ReadFile(RC_PID_FILE), std::to_string(daemon.pid));
        EXPECT_EQ(daemon.Stop(), 0);
    }
    EXPECT_TRUE(vt::Logged().empty());
    ASSERT_EQ(mkdir(RC_PID_FILE, 0755), 0);
    vt::Daemon daemon;  // it serves all the same
    EXPECT_GT(daemon.pid, 0);
    EXPECT_EQ(daemon.Stop(), 0);
    EXPECT_EQ(vt::Logged(), std::vector<std::string> {"vexorcd.cpp (119) Failed to write vexorcd pid "
                                                      "[/var/run/vexorcd.pid]. (Is a directory)"});
    rmdir(RC_PID_FILE);
}

}  // namespace
