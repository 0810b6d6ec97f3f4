#include "remote.hpp"

#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include <gtest/gtest.h>

#include "harness.hpp"

namespace vt {

ReceiverFifo::ReceiverFifo(const std::string& path) : path_(path)
{
    RequireSandbox();
    // With nobody reading, a write must fail, not kill the test.
    signal(SIGPIPE, SIG_IGN);
    unlink(path.c_str());
    if (mkfifo(path.c_str(), 0644) != 0) {
        ADD_FAILURE() << "mkfifo " << path << ": " << std::strerror(errno);
        return;
    }
    // A writer opens without waiting only while a reader exists: hold one
    // for that moment. Nobody reads after that until the daemon opens it.
    const int reader = open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    writer_ = open(path.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC);
    if (writer_ < 0)
        ADD_FAILURE() << "open " << path << ": " << std::strerror(errno);
    if (reader >= 0)
        close(reader);
}

ReceiverFifo::~ReceiverFifo()
{
    if (writer_ >= 0)
        close(writer_);
    unlink(path_.c_str());
}

bool ReceiverFifo::Write(const void* bytes, size_t size) const
{
    return write(writer_, bytes, size) == static_cast<ssize_t>(size);
}

int RemoteSim(const std::vector<std::string>& script, std::string* out, int timeoutMs)
{
    std::vector<std::string> argv {BinPath("remote-sim")};
    argv.insert(argv.end(), script.begin(), script.end());
    return RunToEnd(argv, out, timeoutMs);
}

bool HoldsOpen(pid_t pid, const std::string& path)
{
    const std::string dir = "/proc/" + std::to_string(pid) + "/fd";
    DIR* d = opendir(dir.c_str());
    if (d == nullptr)
        return false;
    bool found = false;
    while (dirent* e = readdir(d)) {
        char target[4096];
        const ssize_t n = readlink((dir + "/" + e->d_name).c_str(), target, sizeof target - 1);
        if (n > 0 && std::string(target, static_cast<size_t>(n)) == path) {
            found = true;
            break;
        }
    }
    closedir(d);
    return found;
}

}  // namespace vt
