#include "fault_kit.hpp"

#include <poll.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <cstring>

#include <gtest/gtest.h>

#include "unix_client.hpp"

namespace vt {

namespace {
constexpr char MEDIA_CENTER[] = "/tmp/MediaCenter.sock";
}

bool InjectAction(std::int32_t action, int timeoutMs)
{
    const int fd = ConnectUnix("/tmp/vexoctrl");
    if (fd < 0)
        return false;
    bool taken = send(fd, &action, sizeof action, MSG_NOSIGNAL) == static_cast<ssize_t>(sizeof action);
    if (taken) {
        char c;
        taken = Readable(fd, timeoutMs) && read(fd, &c, 1) == 0;
    }
    close(fd);
    return taken;
}

std::array<unsigned char, 72> KeyReport(std::uint32_t usage, std::int32_t value)
{
    std::array<unsigned char, 72> r {};
    for (int i = 0; i < 8; ++i) {
        const std::uint32_t other = 0x000700E0u + static_cast<std::uint32_t>(i);
        std::memcpy(r.data() + 8 * i, &other, 4);
    }
    std::memcpy(r.data() + 64, &usage, 4);
    std::memcpy(r.data() + 68, &value, 4);
    return r;
}

bool WriteReport(const ReceiverFifo& fifo, std::uint32_t usage, std::int32_t value, int timeoutMs)
{
    const auto report = KeyReport(usage, value);
    const bool written = WaitUntil([&] { return fifo.Write(report.data(), report.size()); },
                                   timeoutMs);
    return written && WaitUntil([&] {
        int left = 0;
        return ioctl(fifo.WriterFd(), FIONREAD, &left) == 0 && left == 0;
    }, timeoutMs);
}

std::vector<std::string> LinesOtherThan(const SyslogSink& log,
                                        const std::vector<std::string>& prefixes)
{
    std::vector<std::string> other;
    for (const auto& line : log.Lines()) {
        bool known = false;
        for (const auto& p : prefixes)
            known = known || line.rfind(p, 0) == 0;
        if (!known)
            other.push_back(line);
    }
    return other;
}

std::vector<std::string> DescriptorTargets(pid_t pid)
{
    std::vector<std::string> targets;
    const std::string dir = "/proc/" + std::to_string(pid) + "/fd/";
    for (int fd = 0; fd < 1024; ++fd) {
        char target[512];
        const ssize_t n = readlink((dir + std::to_string(fd)).c_str(), target, sizeof target);
        if (n > 0)
            targets.emplace_back(target, static_cast<std::size_t>(n));
    }
    return targets;
}

HotplugStorm::HotplugStorm(pid_t pid)
    : thread_([this, pid] {
          while (!stop_) {
              kill(pid, SIGUSR2);
              std::this_thread::sleep_for(std::chrono::microseconds(600));
              kill(pid, SIGUSR1);
              std::this_thread::sleep_for(std::chrono::microseconds(1400));
          }
      })
{
}

HotplugStorm::~HotplugStorm()
{
    stop_ = true;
    thread_.join();
}

ThreadSignalStorm::ThreadSignalStorm()
{
    struct sigaction sa {};
    sa.sa_handler = [](int) {};
    sa.sa_flags = SA_RESTART;
    sigaction(SIGUSR1, &sa, &saved_);
    const pthread_t target = pthread_self();
    thread_ = std::thread([this, target] {
        while (!stop_) {
            pthread_kill(target, SIGUSR1);
            std::this_thread::sleep_for(std::chrono::microseconds(2000));
        }
    });
}

ThreadSignalStorm::~ThreadSignalStorm()
{
    stop_ = true;
    thread_.join();
    sigaction(SIGUSR1, &saved_, nullptr);
}

MediaCenterUi::MediaCenterUi(bool reading) : fd_(BindUnix(MEDIA_CENTER, SOCK_DGRAM))
{
    EXPECT_GE(fd_, 0) << "cannot bind " << MEDIA_CENTER;
    if (reading)
        thread_ = std::thread([this] { Run(); });
}

MediaCenterUi::~MediaCenterUi()
{
    stop_ = true;
    if (thread_.joinable())
        thread_.join();
    if (fd_ >= 0)
        close(fd_);
    unlink(MEDIA_CENTER);
}

void MediaCenterUi::Thaw()
{
    if (!thread_.joinable())
        thread_ = std::thread([this] { Run(); });
}

std::vector<std::uint32_t> MediaCenterUi::Codes()
{
    std::lock_guard<std::mutex> lock(mu_);
    return codes_;
}

void MediaCenterUi::Run()
{
    while (!stop_) {
        if (!Readable(fd_, 10))
            continue;
        std::uint32_t code = 0;
        if (recv(fd_, &code, sizeof code, MSG_DONTWAIT) == static_cast<ssize_t>(sizeof code)) {
            std::lock_guard<std::mutex> lock(mu_);
            codes_.push_back(code);
        }
    }
}

}  // namespace vt
