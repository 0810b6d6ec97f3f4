// End-to-end harness: runs the real daemon and the tools inside the private
// mount namespace that tests/sandbox.sh makes for every test, captures
// syslog from /dev/log, and stops only the processes it started, by pid.
// Under the PowerPC build every program is launched through the emulator.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace vt {

// Fails the test at once unless it runs inside tests/sandbox.sh.
void RequireSandbox();

// Full path of one of the project's programs in the build tree.
std::string BinPath(const std::string& program);

// Polls cond every few milliseconds until it holds or timeoutMs pass.
bool WaitUntil(const std::function<bool()>& cond, int timeoutMs);

bool PathExists(const std::string& path);
std::string ReadFile(const std::string& path);
void WriteFile(const std::string& path, const std::string& content);
// Makes every directory that leads to path ("/a/b" for "/a/b/file").
void MakeParentDirs(const std::string& path);

// A syslog daemon of our own: binds a datagram socket at /dev/log and keeps
// the text of every message (the part after "ident: ").
class SyslogSink {
public:
    SyslogSink();
    ~SyslogSink();
    SyslogSink(const SyslogSink&) = delete;
    SyslogSink& operator=(const SyslogSink&) = delete;

    std::vector<std::string> Lines() const;
    // Waits until some message contains needle.
    bool WaitFor(const std::string& needle, int timeoutMs = 5000) const;
    // Number of messages that contain needle.
    int Count(const std::string& needle) const;
    void Clear();
    // All messages, one per line, for failure output.
    std::string Dump() const;

private:
    void Run();
    int fd_ = -1;
    int stopPipe_[2] = {-1, -1};
    mutable std::mutex mu_;
    std::vector<std::string> lines_;
    std::thread reader_;
};

// A program started by the harness; its stdout (and stderr, if asked) comes
// through a pipe.
class Process {
public:
    Process() = default;
    ~Process();
    Process(Process&& other) noexcept;
    Process& operator=(Process&& other) noexcept;
    Process(const Process&) = delete;
    Process& operator=(const Process&) = delete;

    // Starts argv[0] (a path) with the emulator in front when the build has
    // one; stdout is captured, stderr too when mergeStderr.
    static Process Start(const std::vector<std::string>& argv, bool mergeStderr = false);

    pid_t Pid() const { return pid_; }
    // Reads one line of output (without the newline) within timeoutMs.
    bool ReadLine(std::string& line, int timeoutMs = 5000);
    // Reads output lines until one contains needle; the lines read are kept.
    bool WaitForOutput(const std::string& needle, int timeoutMs = 5000);
    // Everything read so far, and whatever is left once the process has ended.
    std::string Output();
    void Signal(int sig) const;
    // Waits for the exit and returns the status as waitpid gives it, or -1
    // on time-out (the process is then killed).
    int Wait(int timeoutMs = 10000);
    bool Running();

private:
    bool Fill(int timeoutMs);
    pid_t pid_ = -1;  // negated once reaped
    int exitStatus_ = -1;
    int out_ = -1;
    std::string buffer_;
    std::string seen_;
};

// Runs a program to its end and returns its exit code (or -1); output in *out.
int RunToEnd(const std::vector<std::string>& argv, std::string* out = nullptr,
             int timeoutMs = 20000);

// Runs vexorctl with args to its end and returns its exit code (or -1); its
// standard output and error together in *out.
int Vexorctl(std::vector<std::string> args, std::string* out = nullptr);

// Sends action 0 (nothing to do) on "/tmp/vexoctrl" and waits until the
// daemon has read it and closed the connection: proof that its loop runs.
bool ProbeControlSocket(int timeoutMs = 10000);

// The first live process other than exclude whose parent is this one: once
// the programs it started have ended, a daemon it adopted (0 when none).
pid_t FindAdoptedChild(pid_t exclude = 0);

// The real vexorcd binary with its built-in paths.
class Daemon {
public:
    Daemon();
    ~Daemon();  // stops the daemon if it still runs

    // Starts the daemon, waits for it to detach, to write its pid file and,
    // if waitForControlSocket, to listen on "/tmp/vexoctrl". Returns its pid
    // (0 on failure, with a test failure recorded). Without a pid file
    // (expectPidFile false) the daemon is found as the orphan it leaves
    // behind, which the harness, a child subreaper, adopts.
    pid_t Start(bool waitForControlSocket = true, bool expectPidFile = true);
    pid_t Pid() const { return pid_; }
    bool Alive() const;
    void Signal(int sig) const;
    // Sends sig and waits for the exit; returns the exit code (-1 on a crash
    // or time-out). Fails the test if a sanitizer reported anything.
    int Stop(int sig = 15, int timeoutMs = 10000);

private:
    pid_t pid_ = 0;
};

// Fails the test if a sanitizer of any program wrote a report.
void ExpectNoSanitizerReports();

}  // namespace vt
