#include "vexorcd/vexorcd.hpp"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>

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

// The pid file is locked for the daemon's whole life: a second start that
// passed the liveness check at the same moment finds it taken. flock belongs
// to the open file, so the lock survives daemon()'s fork where a record lock
// would go with the parent.
constexpr int PID_FILE_TAKEN = -2;
constexpr int PID_FILE_TRIES = 5;
constexpr mode_t PID_FILE_MODE = 0644;

// Opens and locks the pid file and empties it. Returns its descriptor,
// PID_FILE_TAKEN when another daemon holds it, or -1 with errno set (a
// symlink at the path is not followed: ELOOP).
int LockPidFile()
{
    for (int attempt = 0; attempt < PID_FILE_TRIES; ++attempt) {
        // O_NONBLOCK: a FIFO at the path must not hold the start up.
        const int fd = open(RC_PID_FILE, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK,
                            PID_FILE_MODE);
        if (fd < 0)
            return -1;
        if (flock(fd, LOCK_EX | LOCK_NB) != 0) {
            const int error = errno;
            close(fd);
            if (error == EWOULDBLOCK)
                return PID_FILE_TAKEN;
            errno = error;
            return -1;
        }
        // A daemon that was leaving may have removed the file between our
        // open and our lock: the lock must be on the file at the path.
        struct stat held {};
        struct stat named {};
        if (fstat(fd, &held) != 0 || lstat(RC_PID_FILE, &named) != 0 ||
            held.st_dev != named.st_dev || held.st_ino != named.st_ino) {
            close(fd);
            continue;
        }
        int error = EINVAL;  // not a regular file
        if (S_ISREG(held.st_mode)) {
            // The mode does not depend on the umask of whoever started us.
            if (fchmod(fd, PID_FILE_MODE) == 0 && ftruncate(fd, 0) == 0)
                return fd;
            error = errno;
        }
        close(fd);
        errno = error;
        return -1;
    }
    errno = EAGAIN;
    return -1;
}

// The pid of the daemon that holds the pid file, or 0 if it has none. It
// may have locked the file and not written its pid yet: give it a second.
int PidOfHolder()
{
    for (int i = 0; i < 100; ++i) {
        const int pid = VLIBCReadPidFile(RC_PID_FILE);
        if (pid > 0 && VLIBCProcAlive(pid) != 0)
            return pid;
        usleep(10000);
    }
    return 0;
}

// Records our pid through the locked descriptor; a daemon without a pid file
// still runs. openError is the errno of a pid file that could not be opened.
void WritePidFile(int fd, int openError)
{
    if (fd < 0) {
        LogError(__FILE_NAME__, 119, "Failed to write vexorcd pid [%s]. (%s)", RC_PID_FILE,
                 std::strerror(openError));
        return;
    }
    char text[16];
    const int length = std::snprintf(text, sizeof text, "%d", static_cast<int>(getpid()));
    const ssize_t written = pwrite(fd, text, static_cast<std::size_t>(length), 0);
    if (written != length) {
        if (written >= 0)
            errno = ENOSPC;
        LogError(__FILE_NAME__, 119, "Failed to write vexorcd pid [%s]. (%s)", RC_PID_FILE,
                 std::strerror(errno));
        // Part of a pid would name another process. The file stays, empty
        // and locked, so that a second start is still refused.
        (void)!ftruncate(fd, 0);
    }
}

// The signals that would kill the daemon, or stop it half started, before
// its handlers are in place: held back from before the pid file names it.
constexpr int START_SIGNALS[] = {SIGTERM, SIGINT, SIGUSR1, SIGUSR2};
constexpr int HOTPLUG_SIGNALS[] = {SIGUSR1, SIGUSR2};

sigset_t StartSignals()
{
    sigset_t set;
    sigemptyset(&set);
    for (const int sig : START_SIGNALS)
        sigaddset(&set, sig);
    return set;
}

// Installs a handler that stays installed; interrupted blocking socket calls
// restart, while select and usleep return early. False (logged) on failure.
bool InstallHandler(int sig, void (*handler)(int))
{
    struct sigaction sa {};
    sa.sa_handler = handler;
    sigemptyset(&sa.sa_mask);
    sa.sa_flags = SA_RESTART;
    if (sigaction(sig, &sa, nullptr) == 0)
        return true;
    LogError(__FILE_NAME__, 131, "Failed to install the handler of signal %d. (%s)", sig,
             std::strerror(errno));
    return false;
}

// Installs the handlers in their order, then lets the held-back signals in.
// A hot-plug signal whose handler could not be installed stays held back
// (its default action would kill the daemon); a quit signal is let in
// anyway, its default action still stops the daemon.
void InstallHandlers()
{
    sigset_t release = StartSignals();
    InstallHandler(SIGPIPE, SIG_IGN);
    InstallHandler(SIGTERM, RcOnQuitSignal);
    InstallHandler(SIGINT, RcOnQuitSignal);
    for (const int sig : HOTPLUG_SIGNALS)
        if (!InstallHandler(sig, RcOnHotplugSignal))
            sigdelset(&release, sig);
    if (sigprocmask(SIG_UNBLOCK, &release, nullptr) != 0)
        LogError(__FILE_NAME__, 136, "Failed to release the signals held back during start-up. (%s)",
                 std::strerror(errno));
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
    const int pidFile = LockPidFile();
    if (pidFile == PID_FILE_TAKEN) {
        std::printf("vexorcd already exists. pid[%d]\n", PidOfHolder());
        return 0;
    }
    const int pidFileError = errno;

    const sigset_t startSignals = StartSignals();
    if (sigprocmask(SIG_BLOCK, &startSignals, nullptr) != 0)
        LogError(__FILE_NAME__, 126, "Failed to hold back signals during start-up. (%s)",
                 std::strerror(errno));

    if (daemon(0, 0) != 0) {
        std::printf("Failed to become daemon.\n");
        if (pidFile >= 0) {
            unlink(RC_PID_FILE);
            close(pidFile);
        }
        return 1;
    }

    // The loop must not allocate. The C library does so lazily on first use:
    // the time zone at the first syslog message, the stdout buffer at the
    // first device line of a receiver opened by SIGUSR1. Take the one now
    // and do without the other (stdout is the null device from here on).
    tzset();
    std::setvbuf(stdout, nullptr, _IONBF, 0);

    WritePidFile(pidFile, pidFileError);
    RcDriversOpenAll();
    HiddevStopWaiting = QuitPending;
    InstallHandlers();

    while (RcQuitRequested == 0) {
        usleep(RC_LOOP_PAUSE_US);
        RcLoopTurn(RcDriverTable, RcDispatchAction);
    }

    RcDriversCloseAll();
    // Only a pid file we hold is ours to remove (never a symlink at its path).
    if (pidFile >= 0) {
        unlink(RC_PID_FILE);
        close(pidFile);
    }
    return 0;
}
