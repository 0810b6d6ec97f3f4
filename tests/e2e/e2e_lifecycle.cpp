// The daemon's lifecycle, run as the real binary in the sandbox.
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <chrono>
#include <cstdlib>

#include <gtest/gtest.h>

#include "harness.hpp"
#include "remote.hpp"

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
    // Whoever starts it, the pid file is writable by root only.
    const mode_t umaskBefore = umask(0);
    for (int sig : {SIGTERM, SIGINT}) {
        vt::Daemon d;
        const pid_t pid = d.Start();
        ASSERT_GT(pid, 0);
        // Only the decimal pid, no newline.
        EXPECT_EQ(vt::ReadFile(kPidFile), std::to_string(pid));
        struct stat st {};
        EXPECT_EQ(stat(kPidFile, &st), 0);
        EXPECT_EQ(st.st_mode & 07777, 0644u);
        EXPECT_TRUE(d.Alive());
        EXPECT_EQ(d.Stop(sig), 0) << strsignal(sig);
        EXPECT_FALSE(vt::PathExists(kPidFile));
        EXPECT_FALSE(vt::PathExists("/tmp/vexoctrl"));
    }
    umask(umaskBefore);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

// Waits for a daemon we adopted to end: its status as waitpid gives it, or -1.
int Reap(pid_t pid)
{
    int status = -1;
    if (!vt::WaitUntil([&] { return waitpid(pid, &status, WNOHANG) == pid; }, 10000)) {
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
        return -1;
    }
    return status;
}

TEST(Lifecycle, SignalledAsSoonAsItsPidFileAppearsItSurvivesOrStopsCleanly)
{
    // The udev rule and the init script signal the pid the file names; here
    // that happens the moment it appears, while the drivers still open.
    vt::SyslogSink log;
    vt::ReceiverFifo fifo;
    for (int i = 0; i < 10; ++i) {
        const int sig = i % 2 == 0 ? SIGUSR1 : SIGTERM;
        vt::Process launcher = vt::Process::Start({vt::BinPath("vexorcd")});
        pid_t pid = 0;
        const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(10);
        while (pid <= 0 && std::chrono::steady_clock::now() < until)
            pid = std::atoi(vt::ReadFile(kPidFile).c_str());
        ASSERT_GT(pid, 0) << "no pid file";
        kill(pid, sig);
        EXPECT_EQ(launcher.Wait(), 0);
        if (sig == SIGUSR1) {
            EXPECT_TRUE(vt::ProbeControlSocket()) << "the daemon died of an early SIGUSR1";
            kill(pid, SIGTERM);
        }
        const int status = Reap(pid);
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << strsignal(sig) << " " << status;
        EXPECT_FALSE(vt::PathExists(kPidFile)) << strsignal(sig);
        EXPECT_FALSE(vt::PathExists("/tmp/vexoctrl")) << strsignal(sig);
    }
    vt::ExpectNoSanitizerReports();
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST(Lifecycle, OfTwoSimultaneousStartsOneRunsAndTheOtherNamesIt)
{
    vt::SyslogSink log;
    for (int round = 0; round < 5; ++round) {
        vt::Process a = vt::Process::Start({vt::BinPath("vexorcd")});
        vt::Process b = vt::Process::Start({vt::BinPath("vexorcd")});
        EXPECT_EQ(a.Wait(), 0);
        EXPECT_EQ(b.Wait(), 0);
        pid_t pid = 0;
        ASSERT_TRUE(vt::WaitUntil([&] { return (pid = std::atoi(vt::ReadFile(kPidFile).c_str())) > 0; },
                                  10000));
        EXPECT_EQ(a.Output() + b.Output(), "vexorcd already exists. pid[" + std::to_string(pid) + "]\n");
        const pid_t second = vt::FindAdoptedChild(pid);
        EXPECT_EQ(second, 0) << "two daemons";
        for (const pid_t p : {pid, second}) {
            if (p > 0) {
                kill(p, SIGTERM);
                EXPECT_EQ(Reap(p), 0);
            }
        }
    }
    vt::ExpectNoSanitizerReports();
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
