// Test support. Tests run inside tests/sandbox.sh, so the code under test and
// the build's programs (the daemon, the stand-in peers, vexorctl) use their
// built-in paths; the programs run as they are (on the PowerPC build through
// the emulator) and are read line by line. Only our own children are signalled.
#pragma once

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <fstream>
#include <iterator>
#include <set>
#include <sstream>

#include <gtest/gtest.h>

#include "common/paths.hpp"
#include "lib/unix_socket.hpp"

namespace vt {

// Outside the sandbox the built-in paths are the machine's own: refuse to run.
inline const bool inSandbox = [] {
    if (std::getenv("VEXO_IN_SANDBOX") == nullptr)
        std::abort();
    return prctl(PR_SET_CHILD_SUBREAPER, 1, 0, 0, 0) == 0;  // the detached daemon stays our child
}();

// Polls cond every 5 ms until it holds, for at most ms.
template <typename Cond>
bool WaitUntil(Cond cond, int ms = 5000)
{
    const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(ms);
    for (; !cond(); usleep(5000))
        if (std::chrono::steady_clock::now() > end)
            return false;
    return true;
}

inline std::string ReadFile(const std::string& path)
{
    std::ostringstream text;
    text << std::ifstream(path).rdbuf();
    return text.str();
}
inline void WriteFile(const std::string& path, const std::string& text) { std::ofstream(path) << text; }
inline std::string Bin(const std::string& name) { return VEXO_BIN_DIR "/" + name; }

inline std::set<pid_t> started;  // programs not yet reaped: never taken for the daemon

// A program of the build (argv[0] is its name), its output and errors on a
// pipe; killed at the end if it still runs.
class Program {
    int out_ = -1, status_ = -1;
    std::string buffer_;

public:
    explicit Program(std::vector<std::string> argv)
    {
        std::istringstream emulator(VEXO_EMULATOR);
        std::vector<std::string> all {std::istream_iterator<std::string>(emulator), {}};
        argv[0] = Bin(argv[0]);
        all.insert(all.end(), argv.begin(), argv.end());
        std::vector<char*> args;
        for (std::string& a : all)
            args.push_back(a.data());
        args.push_back(nullptr);
        int pipefd[2];
        EXPECT_EQ(pipe2(pipefd, O_CLOEXEC), 0);
        if ((pid = fork()) == 0) {
            dup2(pipefd[1], 1);
            dup2(pipefd[1], 2);
            _exit(execvp(args[0], args.data()));
        }
        close(pipefd[1]);
        out_ = pipefd[0];
        started.insert(pid);
    }
    ~Program()
    {
        Wait(0);
        close(out_);
    }
    Program(const Program&) = delete;
    Program& operator=(const Program&) = delete;

    // The next line of output, if one comes within about ms.
    bool Line(std::string& line, int ms = 5000)
    {
        for (char chunk[4096]; buffer_.find('\n') == std::string::npos;) {
            pollfd ready {out_, POLLIN, 0};
            const ssize_t n = poll(&ready, 1, ms) > 0 ? read(out_, chunk, sizeof chunk) : 0;
            if (n <= 0)
                return false;
            buffer_.append(chunk, static_cast<std::size_t>(n));
        }
        line = buffer_.substr(0, buffer_.find('\n'));
        buffer_.erase(0, line.size() + 1);
        return true;
    }
    // Reads lines until one is text.
    bool Expect(const std::string& text)
    {
        std::string line;
        while (Line(line) && line != text) {
        }
        return line == text;
    }
    // The exit code once it has ended, or -1 after a signal or ms (it is then killed).
    int Wait(int ms = 20000)
    {
        if (started.erase(pid) != 0 && !WaitUntil([&] { return waitpid(pid, &status_, WNOHANG) == pid; }, ms)) {
            kill(pid, SIGKILL);
            waitpid(pid, &status_, 0);
        }
        return WIFEXITED(status_) ? WEXITSTATUS(status_) : -1;
    }
    pid_t pid = -1;
};

// Runs a program to its end: its exit code, its output in *out.
inline int Run(const std::vector<std::string>& argv, std::string* out = nullptr)
{
    Program program(argv);
    const int code = program.Wait();
    for (std::string line; out != nullptr && program.Line(line, 0);)
        *out += line + "\n";
    return code;
}

// The messages logged since the last call: tools/syslog-sink on /dev/log
// prints them, and a marker the test logs itself shows where they end.
inline std::vector<std::string> Logged()
{
    static Program sink({"syslog-sink"});
    static const bool ready = sink.Expect("syslog-sink: listening on /dev/log");
    static int marks = 0;
    const std::string mark = "vexo-test-mark " + std::to_string(++marks);
    syslog(LOG_ERR, "%s", mark.c_str());
    std::vector<std::string> lines;
    std::string line;
    while (ready && sink.Line(line) && line != mark)
        lines.push_back(line);
    EXPECT_EQ(line, mark) << "no system logger";
    return lines;
}

// A child of ours that we did not start (other than other): a daemon that
// has detached, its parent gone. 0 when there is none.
inline pid_t Adopted(pid_t other = 0)
{
    const std::string self = std::to_string(getpid());
    std::istringstream children(ReadFile("/proc/" + self + "/task/" + self + "/children"));
    pid_t found = 0;
    for (pid_t child = 0; children >> child;)
        found = started.count(child) == 0 && child != other ? child : found;
    return found;
}

// The real vexorcd, started with its built-in paths (or one of ours that
// started already); ready once its loop serves a client (its signal handlers
// are then in place). Else pid stays 0 and the test fails. Killed at the end
// if it still runs.
struct Daemon {
    explicit Daemon(pid_t adopted) : pid(adopted) {}
    Daemon()
    {
        EXPECT_EQ(Run({"vexorcd"}), 0);
        pid = Adopted();
        if (pid <= 0 || !WaitUntil([] { return Run({"vexorctl", "0"}) == 0; }, 10000)) {
            ADD_FAILURE() << "vexorcd did not start";
            Stop(SIGKILL);
        }
    }
    ~Daemon() { Stop(SIGKILL); }
    // Sends sig and waits for the exit: the exit code, or -1 after a signal or ms.
    int Stop(int sig = SIGTERM, int ms = 5000)
    {
        int status = -1;
        const auto ended = [&] { return waitpid(pid, &status, WNOHANG) == pid; };
        if (pid > 0 && kill(pid, sig) == 0 && !WaitUntil(ended, ms)) {
            ADD_FAILURE() << "vexorcd did not stop within " << ms << " ms";
            kill(pid, SIGKILL);
            waitpid(pid, &status, 0);
        }
        pid = 0;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    pid_t pid = 0;
};

}  // namespace vt
