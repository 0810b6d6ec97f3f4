#include "vexorcd/vexorcd.hpp"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <unistd.h>

#include "common/log.hpp"
#include "drivers/hiddev.hpp"
#include "vexorcd/dispatch.hpp"
#include "vexorcd/registry.hpp"
#include "vlibc/vlibc.hpp"

volatile std::sig_atomic_t RcQuitRequested = 0;

void RcOnQuitSignal(int /*sig*/)
{
    RcQuitRequested = 1;
}

std::int32_t RcLoopTurn(RcDriver* const* table, std::int32_t (*dispatch)(RcAction))
{
    RcDriversServiceHotplug(table);
    const std::int32_t action = RcDriversPoll(table);
    if (RcActionIsDispatchable(action))
        dispatch(action);
    return action;
}

namespace {

void PrintUsage(const char* argv0)
{
    std::printf("vexorcd %s, remote controller daemon of the Vexora audio appliance\n\n",
                VEXORCD_VERSION);
    std::printf("%s:\tVexora remote controller daemon.\n", argv0);
}

// Records our pid; a daemon without a pid file still runs.
void WritePidFile()
{
    std::FILE* f = std::fopen(RC_PID_FILE, "w");
    if (f == nullptr) {
        LogError(__FILE_NAME__, 119, "Failed to write vexorcd pid [%s]. (%s)", RC_PID_FILE,
                 std::strerror(errno));
        return;
    }
    // The pid reaches the file only when the stream is flushed: on a full
    // file system the open succeeds and the close fails. An empty pid file
    // would let a second instance start beside this one, so it goes.
    const bool printed = std::fprintf(f, "%d", static_cast<int>(getpid())) > 0;
    if (std::fclose(f) != 0 || !printed) {
        LogError(__FILE_NAME__, 119, "Failed to write vexorcd pid [%s]. (%s)", RC_PID_FILE,
                 std::strerror(errno));
        unlink(RC_PID_FILE);
    }
}

// Installs a handler that stays installed; interrupted blocking socket calls
// restart, while select and usleep return early.
void InstallHandler(int sig, void (*handler)(int))
{
    struct sigaction sa {};
    sa.sa_handler = handler;
    sigemptyset(&sa.sa_mask);
    sa.sa_flags = SA_RESTART;
    sigaction(sig, &sa, nullptr);
}

// Asked by the receiver when a signal cuts its wait short.
bool QuitPending()
{
    return RcQuitRequested != 0;
}

}  // namespace

int RcDaemonMain(int argc, char** argv)
{
    if (argc > 1) {
        PrintUsage(argv[0]);
        return 0;
    }

    const int running = VLIBCReadPidFile(RC_PID_FILE);
    if (running > 0 && VLIBCProcAlive(running) != 0) {
        std::printf("vexorcd already exists. pid[%d]\n", running);
        return 0;
    }

    if (daemon(0, 0) != 0) {
        std::printf("Failed to become daemon.\n");
        return 0;
    }

    // The loop must not allocate. The C library does so lazily on first use:
    // the time zone at the first syslog message, the stdout buffer at the
    // first device line of a receiver opened by SIGUSR1. Take the one now
    // and do without the other (stdout is the null device from here on).
    tzset();
    std::setvbuf(stdout, nullptr, _IONBF, 0);

    WritePidFile();
    RcDriversOpenAll();
    HiddevStopWaiting = QuitPending;

    InstallHandler(SIGPIPE, SIG_IGN);
    InstallHandler(SIGTERM, RcOnQuitSignal);
    InstallHandler(SIGINT, RcOnQuitSignal);
    InstallHandler(SIGUSR1, RcOnHotplugSignal);
    InstallHandler(SIGUSR2, RcOnHotplugSignal);

    while (RcQuitRequested == 0) {
        usleep(RC_LOOP_PAUSE_US);
        RcLoopTurn(RcDriverTable, RcDispatchAction);
    }

    RcDriversCloseAll();
    unlink(RC_PID_FILE);
    return 0;
}
