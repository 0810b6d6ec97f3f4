#include "harness.hpp"

#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>

#include <gtest/gtest.h>

#include "unix_client.hpp"

namespace vt {

namespace {

constexpr const char SANITIZER_LOG[] = "/tmp/vexo-sanitizer";

std::vector<std::string> SplitWords(const std::string& text)
{
    std::vector<std::string> words;
    std::istringstream in(text);
    for (std::string w; in >> w;)
        words.push_back(w);
    return words;
}

// Makes every descendant that loses its parent (the daemon after daemon())
// our child, so that we can wait for it by pid.
void BecomeSubreaper()
{
    static bool done = false;
    if (!done) {
        prctl(PR_SET_CHILD_SUBREAPER, 1, 0, 0, 0);
        done = true;
    }
}

// Milliseconds from now until end, or 0 once it has passed.
int MsLeft(std::chrono::steady_clock::time_point end)
{
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        end - std::chrono::steady_clock::now()).count();
    return left > 0 ? static_cast<int>(left) : 0;
}

std::chrono::steady_clock::time_point Deadline(int timeoutMs)
{
    return std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
}

}  // namespace

void RequireSandbox()
{
    const char* in = std::getenv("VEXO_IN_SANDBOX");
    if (in == nullptr || std::strcmp(in, "1") != 0) {
        std::fprintf(stderr, "refusing to run outside tests/sandbox.sh: it would touch the host\n");
        std::abort();
    }
}

std::string BinPath(const std::string& program)
{
    return std::string(VEXO_BIN_DIR) + "/" + program;
}

bool WaitUntil(const std::function<bool()>& cond, int timeoutMs)
{
    const auto end = Deadline(timeoutMs);
    for (;;) {
        if (cond())
            return true;
        if (MsLeft(end) == 0)
            return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
}

bool PathExists(const std::string& path)
{
    struct stat st {};
    return lstat(path.c_str(), &st) == 0;
}

std::string ReadFile(const std::string& path)
{
    std::ifstream in(path, std::ios::binary);
    std::ostringstream s;
    s << in.rdbuf();
    return s.str();
}

void WriteFile(const std::string& path, const std::string& content)
{
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out << content;
}

void MakeParentDirs(const std::string& path)
{
    for (size_t slash = path.find('/', 1); slash != std::string::npos; slash = path.find('/', slash + 1))
        mkdir(path.substr(0, slash).c_str(), 0755);
}

// ---- SyslogSink ------------------------------------------------------------

SyslogSink::SyslogSink()
{
    RequireSandbox();
    fd_ = BindUnix("/dev/log", SOCK_DGRAM);
    if (fd_ < 0 || pipe2(stopPipe_, O_CLOEXEC) != 0) {
        ADD_FAILURE() << "cannot bind /dev/log: " << std::strerror(errno);
        return;
    }
    chmod("/dev/log", 0666);
    reader_ = std::thread([this] { Run(); });
}

SyslogSink::~SyslogSink()
{
    if (reader_.joinable()) {
        const char c = 'q';
        (void)!write(stopPipe_[1], &c, 1);
        reader_.join();
    }
    for (int fd : {fd_, stopPipe_[0], stopPipe_[1]})
        if (fd >= 0)
            close(fd);
    unlink("/dev/log");
}

void SyslogSink::Run()
{
    char buf[4096];
    for (;;) {
        pollfd fds[2] = {{fd_, POLLIN, 0}, {stopPipe_[0], POLLIN, 0}};
        if (poll(fds, 2, -1) < 0) {
            if (errno == EINTR)
                continue;
            return;
        }
        if (fds[0].revents & POLLIN) {
            const ssize_t n = recv(fd_, buf, sizeof buf, 0);
            if (n > 0) {
                std::string msg(buf, static_cast<size_t>(n));
                // "<11>Mmm dd hh:mm:ss ident: text" or "<11>Mmm dd hh:mm:ss ident[pid]: text"
                std::string text = msg;
                const size_t gt = msg.find('>');
                if (gt != std::string::npos && msg.size() > gt + 16) {
                    const size_t colon = msg.find(": ", gt + 16);
                    if (colon != std::string::npos)
                        text = msg.substr(colon + 2);
                }
                while (!text.empty() && (text.back() == '\n' || text.back() == '\0'))
                    text.pop_back();
                std::lock_guard<std::mutex> lock(mu_);
                lines_.push_back(text);
            }
            continue;
        }
        if (fds[1].revents != 0)
            return;
    }
}

std::vector<std::string> SyslogSink::Lines() const
{
    std::lock_guard<std::mutex> lock(mu_);
    return lines_;
}

int SyslogSink::Count(const std::string& needle) const
{
    int n = 0;
    for (const auto& l : Lines())
        if (l.find(needle) != std::string::npos)
            ++n;
    return n;
}

bool SyslogSink::WaitFor(const std::string& needle, int timeoutMs) const
{
    return WaitUntil([&] { return Count(needle) > 0; }, timeoutMs);
}

void SyslogSink::Clear()
{
    std::lock_guard<std::mutex> lock(mu_);
    lines_.clear();
}

std::string SyslogSink::Dump() const
{
    std::string all;
    for (const auto& l : Lines())
        all += "  syslog: " + l + "\n";
    return all;
}

// ---- Process -----------------------------------------------------------------

Process::~Process()
{
    if (pid_ > 0 && Running()) {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    if (out_ >= 0)
        close(out_);
}

Process::Process(Process&& other) noexcept { *this = std::move(other); }

Process& Process::operator=(Process&& other) noexcept
{
    std::swap(pid_, other.pid_);
    std::swap(out_, other.out_);
    std::swap(buffer_, other.buffer_);
    std::swap(seen_, other.seen_);
    std::swap(exitStatus_, other.exitStatus_);
    return *this;
}

Process Process::Start(const std::vector<std::string>& argv, bool mergeStderr)
{
    RequireSandbox();
    BecomeSubreaper();
    std::vector<std::string> full = SplitWords(VEXO_EMULATOR);
    full.insert(full.end(), argv.begin(), argv.end());

    int pipefd[2];
    if (pipe2(pipefd, O_CLOEXEC) != 0) {
        ADD_FAILURE() << "pipe: " << std::strerror(errno);
        return {};
    }
    std::vector<char*> args;
    for (auto& a : full)
        args.push_back(a.data());
    args.push_back(nullptr);

    const pid_t pid = fork();
    if (pid == 0) {
        dup2(pipefd[1], 1);
        if (mergeStderr)
            dup2(pipefd[1], 2);
        // Sanitizer reports of the daemon would go to /dev/null once it has
        // detached: send them to files that ExpectNoSanitizerReports checks.
        setenv("ASAN_OPTIONS", "log_path=/tmp/vexo-sanitizer:detect_leaks=1", 1);
        setenv("UBSAN_OPTIONS", "log_path=/tmp/vexo-sanitizer:print_stacktrace=1", 1);
        execvp(args[0], args.data());
        _exit(127);
    }
    close(pipefd[1]);
    Process p;
    p.pid_ = pid;
    p.out_ = pipefd[0];
    if (pid < 0)
        ADD_FAILURE() << "fork: " << std::strerror(errno);
    return p;
}

bool Process::Fill(int timeoutMs)
{
    if (out_ < 0)
        return false;
    pollfd pfd {out_, POLLIN, 0};
    if (poll(&pfd, 1, timeoutMs) <= 0)
        return false;
    char buf[4096];
    const ssize_t n = read(out_, buf, sizeof buf);
    if (n <= 0) {
        close(out_);
        out_ = -1;
        return false;
    }
    buffer_.append(buf, static_cast<size_t>(n));
    return true;
}

bool Process::ReadLine(std::string& line, int timeoutMs)
{
    const auto end = Deadline(timeoutMs);
    for (;;) {
        const size_t nl = buffer_.find('\n');
        if (nl != std::string::npos) {
            line = buffer_.substr(0, nl);
            buffer_.erase(0, nl + 1);
            seen_ += line + "\n";
            return true;
        }
        const int left = MsLeft(end);
        if (left == 0 || (!Fill(left) && out_ < 0))
            return false;
    }
}

bool Process::WaitForOutput(const std::string& needle, int timeoutMs)
{
    const auto end = Deadline(timeoutMs);
    std::string line;
    for (;;) {
        const int left = MsLeft(end);
        if (left == 0 || !ReadLine(line, left))
            return false;
        if (line.find(needle) != std::string::npos)
            return true;
    }
}

std::string Process::Output()
{
    if (!Running())
        while (Fill(100)) {
        }
    return seen_ + buffer_;
}

void Process::Signal(int sig) const
{
    if (pid_ > 0)
        kill(pid_, sig);
}

bool Process::Running()
{
    if (pid_ <= 0)
        return false;
    int status = 0;
    const pid_t r = waitpid(pid_, &status, WNOHANG);
    if (r == pid_) {
        exitStatus_ = status;
        pid_ = -pid_;
        return false;
    }
    return r == 0;
}

int Process::Wait(int timeoutMs)
{
    if (pid_ < 0)
        return exitStatus_;
    if (pid_ == 0)
        return -1;
    const bool ended = WaitUntil([&] { return !Running(); }, timeoutMs);
    if (!ended) {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
        pid_ = -pid_;
        exitStatus_ = -1;
    }
    return exitStatus_;
}

namespace {

int RunAll(const std::vector<std::string>& argv, std::string* out, int timeoutMs, bool mergeStderr)
{
    Process p = Process::Start(argv, mergeStderr);
    const auto end = Deadline(timeoutMs);
    // Drain the output while waiting, so that a chatty program never blocks.
    for (std::string line; p.Running() && MsLeft(end) > 0;)
        p.ReadLine(line, 50);
    const int status = p.Wait(0);
    if (out != nullptr)
        *out = p.Output();
    return status >= 0 && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

}  // namespace

int RunToEnd(const std::vector<std::string>& argv, std::string* out, int timeoutMs)
{
    return RunAll(argv, out, timeoutMs, false);
}

int Vexorctl(std::vector<std::string> args, std::string* out)
{
    args.insert(args.begin(), {BinPath("vexorctl")});
    return RunAll(args, out, 30000, true);
}

// ---- Daemon ------------------------------------------------------------------

Daemon::Daemon()
{
    RequireSandbox();
    BecomeSubreaper();
}

Daemon::~Daemon()
{
    if (pid_ > 0 && Alive()) {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
}

pid_t FindAdoptedChild(pid_t exclude)
{
    DIR* dir = opendir("/proc");
    if (dir == nullptr)
        return 0;
    pid_t found = 0;
    while (dirent* e = readdir(dir)) {
        const int pid = std::atoi(e->d_name);
        if (pid <= 0 || pid == exclude)
            continue;
        const std::string stat = ReadFile("/proc/" + std::string(e->d_name) + "/stat");
        const size_t paren = stat.rfind(')');
        if (paren == std::string::npos)
            continue;
        char state = 0;
        int ppid = 0;
        if (std::sscanf(stat.c_str() + paren + 1, " %c %d", &state, &ppid) == 2 &&
            ppid == getpid() && state != 'Z') {
            found = pid;
            break;
        }
    }
    closedir(dir);
    return found;
}

bool ProbeControlSocket(int timeoutMs)
{
    // A file left at the path by an earlier run refuses connections until
    // the daemon has replaced it: try again until the time is up. One probe:
    // connect, send action 0, wait for the daemon to hang up.
    const auto end = Deadline(timeoutMs);
    for (;;) {
        const int left = MsLeft(end);
        if (left == 0)
            return false;
        const int fd = SendAction(0);
        char c;
        const bool served = fd >= 0 && Readable(fd, left) && read(fd, &c, 1) == 0;
        if (fd >= 0)
            close(fd);
        if (served)
            return true;
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
}

pid_t Daemon::Start(bool waitForControlSocket, bool expectPidFile)
{
    std::string out;
    // The launcher returns once daemon() has forked the real daemon.
    const int code = RunToEnd({BinPath("vexorcd")}, &out, 20000);
    EXPECT_EQ(code, 0) << out;
    int pid = 0;
    // The detached daemon is the orphan we adopt; with a pid file, it must
    // also have recorded itself there.
    const bool written = WaitUntil([&] {
        pid = FindAdoptedChild(0);
        if (pid <= 0)
            return false;
        return !expectPidFile || ReadFile("/var/run/vexorcd.pid") == std::to_string(pid);
    }, 10000);
    EXPECT_TRUE(written) << "the daemon did not start";
    if (!written)
        return 0;
    pid_ = pid;
    if (waitForControlSocket) {
        EXPECT_TRUE(WaitUntil([] { return PathExists("/tmp/vexoctrl"); }, 10000))
            << "the daemon does not listen on /tmp/vexoctrl";
        // The signal handlers are installed after the drivers open: only once
        // the loop serves a client is it safe to signal the daemon. Action 0
        // is served and does nothing.
        EXPECT_TRUE(ProbeControlSocket(10000)) << "the daemon's loop does not serve clients";
    } else {
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
    }
    return pid_;
}

bool Daemon::Alive() const
{
    if (pid_ <= 0)
        return false;
    int status = 0;
    // A zombie child of ours counts as gone; reap it only through Stop.
    if (waitpid(pid_, &status, WNOHANG | WNOWAIT | WEXITED) == pid_)
        return false;
    return kill(pid_, 0) == 0;
}

void Daemon::Signal(int sig) const
{
    if (pid_ > 0)
        kill(pid_, sig);
}

int Daemon::Stop(int sig, int timeoutMs)
{
    if (pid_ <= 0)
        return -1;
    kill(pid_, sig);
    int status = 0;
    pid_t r = 0;
    const bool ended = WaitUntil([&] {
        r = waitpid(pid_, &status, WNOHANG);
        return r == pid_ || (r < 0 && errno == ECHILD && kill(pid_, 0) != 0);
    }, timeoutMs);
    const pid_t pid = pid_;
    pid_ = 0;
    if (!ended) {
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
        ADD_FAILURE() << "the daemon did not stop within " << timeoutMs << " ms";
        return -1;
    }
    ExpectNoSanitizerReports();
    if (r != pid)  // not our child: the exit status is unknown, but it is gone
        return 0;
    if (!WIFEXITED(status))
        return -1;
    return WEXITSTATUS(status);
}

void ExpectNoSanitizerReports()
{
    // Reports are named /tmp/vexo-sanitizer.PID.
    DIR* dir = opendir("/tmp");
    if (dir == nullptr)
        return;
    const std::string prefix = std::string(SANITIZER_LOG).substr(5) + ".";
    while (dirent* e = readdir(dir)) {
        if (std::strncmp(e->d_name, prefix.c_str(), prefix.size()) != 0)
            continue;
        const std::string file = std::string("/tmp/") + e->d_name;
        ADD_FAILURE() << "sanitizer report " << file << ":\n" << ReadFile(file);
        unlink(file.c_str());
    }
    closedir(dir);
}

}  // namespace vt
