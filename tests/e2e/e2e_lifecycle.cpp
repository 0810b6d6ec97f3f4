// The daemon's lifecycle as only the real binary shows it: the usage text,
// the pid file and the single-instance guard, signals, a clean stop. Each test
// fails on a system log line it does not expect.
#include <sys/mount.h>
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
    const mode_t umaskBefore = umask(0);  // whoever starts it, only root may write the pid file
    for (const int sig : {SIGTERM, SIGINT}) {
        vt::Daemon daemon;
        ASSERT_GT(daemon.pid, 0);
        const std::string pid = std::to_string(daemon.pid);
        EXPECT_EQ(vt::ReadFile(RC_PID_FILE), pid);  // decimal, no newline
        struct stat st {};
        EXPECT_TRUE(stat(RC_PID_FILE, &st) == 0 && (st.st_mode & 07777) == 0644);
        std::string out;
        EXPECT_EQ(vt::Run({"vexorcd"}, &out), 0);
        EXPECT_EQ(out, "vexorcd already exists. pid[" + pid + "]\n");
        kill(daemon.pid, SIGPIPE);
        EXPECT_EQ(vt::Run({"vexorctl", "0"}), 0) << "SIGPIPE stopped the daemon";
        EXPECT_EQ(daemon.Stop(sig), 0);
        EXPECT_FALSE(Exists(RC_PID_FILE));
        EXPECT_FALSE(Exists(RC_CTRL_SOCKET_PATH));
    }
    umask(umaskBefore);
    EXPECT_TRUE(vt::Logged().empty());
}

// The pid a starting daemon has written, as soon as the file names a child of
// the launcher (or, the launcher gone, of ours): only then is it signalled.
pid_t Starting(pid_t launcher)
{
    for (const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(10);
         std::chrono::steady_clock::now() < end;) {
        const pid_t pid = std::atoi(vt::ReadFile(RC_PID_FILE).c_str());
        const std::string stat = vt::ReadFile("/proc/" + std::to_string(pid) + "/stat");
        const char* state = stat.c_str() + std::min(stat.rfind(')'), stat.size());
        int parent = 0;
        if (pid > 0 && std::sscanf(state, ") %*c %d", &parent) == 1 && (parent == launcher || parent == getpid()))
            return pid;
    }
    ADD_FAILURE() << "no daemon of ours in the pid file";
    return 0;
}

TEST(Lifecycle, ASignalAtStartUpNeverKillsItAndOfTwoStartsOneRuns)
{
    // The udev rule and the init script signal whatever the pid file names, as soon as it appears;
    // a receiver FIFO without a writer holds the start-up there, where the drivers open.
    ASSERT_EQ(mkfifo(RC_RAYTAC_DEVICE_PATH, 0600), 0);
    for (const int sig : {SIGUSR1, SIGTERM}) {
        vt::Program launcher({"vexorcd"});
        vt::Daemon daemon(Starting(launcher.pid));
        ASSERT_GT(daemon.pid, 0);
        kill(daemon.pid, sig);
        int writer = -1;  // lets the start-up go on
        vt::WaitUntil([&] { return (writer = open(RC_RAYTAC_DEVICE_PATH, O_WRONLY | O_NONBLOCK)) >= 0; });
        EXPECT_EQ(launcher.Wait(), 0);
        EXPECT_TRUE(sig == SIGTERM || vt::Run({"vexorctl", "0"}) == 0) << "an early SIGUSR1 killed it";
        EXPECT_EQ(daemon.Stop(), 0);
        EXPECT_FALSE(Exists(RC_PID_FILE));
        close(writer);
    }
    unlink(RC_RAYTAC_DEVICE_PATH);
    for (int round = 0; round < 3; ++round) {
        vt::Program first({"vexorcd"}), second({"vexorcd"});
        EXPECT_EQ(first.Wait() + second.Wait(), 0);
        std::string out, line;
        for (vt::Program* launcher : {&first, &second})
            while (launcher->Line(line, 0))
                out += line + "\n";
        vt::Daemon daemon(vt::Adopted());
        EXPECT_EQ(out, "vexorcd already exists. pid[" + std::to_string(daemon.pid) + "]\n");
        EXPECT_EQ(vt::Adopted(daemon.pid), 0) << "two daemons";
        EXPECT_EQ(daemon.Stop(), 0);
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
    // A symlink, never followed; a full file system, where the file stays empty and locked, so
    // that a second start is still refused.
    vt::WriteFile("/tmp/precious", "keep");
    using Fault = std::pair<std::string, std::string>;
    for (const auto& [fault, reason] : {Fault {"symlink", "Too many levels of symbolic links"},
                                        Fault {"full", "No space left on device"}}) {
        if (fault == "symlink") {
            ASSERT_EQ(symlink("/tmp/precious", RC_PID_FILE), 0);
        } else {
            ASSERT_EQ(mount("vexo-full", "/run", "tmpfs", 0, "size=4k"), 0);
            vt::WriteFile("/run/filler", std::string(4096, 'x'));
        }
        vt::Daemon daemon;  // it serves all the same
        EXPECT_GT(daemon.pid, 0);
        std::string second;
        EXPECT_EQ(fault == "full" ? vt::Run({"vexorcd"}, &second) : 0, 0);
        EXPECT_EQ(second, fault == "full" ? "vexorcd already exists. pid[0]\n" : "");
        EXPECT_EQ(daemon.Stop(), 0);
        EXPECT_EQ(vt::ReadFile("/tmp/precious"), "keep");
        const std::string line = "vexorcd.cpp (119) Failed to write vexorcd pid [/var/run/vexorcd.pid]. (";
        EXPECT_EQ(vt::Logged(), std::vector<std::string> {line + reason + ")"});
        fault == "full" ? umount2("/run", MNT_DETACH) : remove(RC_PID_FILE);
    }
}

}  // namespace
