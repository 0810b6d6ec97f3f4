#include "audio_peer.hpp"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>

#include <gtest/gtest.h>

#include "harness.hpp"
#include "unix_client.hpp"

namespace vt {

namespace {
constexpr std::size_t RECORD_SIZE = 8196;
}

std::string AudioCommand::ArgText() const
{
    const auto end = std::find(arg.begin(), arg.end(), 0);
    return std::string(arg.begin(), end);
}

bool AudioCommand::ZeroFrom(std::size_t from) const
{
    return std::all_of(arg.begin() + static_cast<std::ptrdiff_t>(std::min(from, arg.size())),
                       arg.end(), [](unsigned char c) { return c == 0; });
}

AudioPeer::AudioPeer(Mode mode, int delayMs) : mode_(mode), delayMs_(delayMs)
{
    RequireSandbox();
    // A short queue of four, so that StopAccepting fills it after a few connects.
    listen_ = BindUnix("/tmp/vexoaudiod.sock");
    if (listen_ < 0 || listen(listen_, 4) != 0 || pipe2(stopPipe_, O_CLOEXEC) != 0) {
        ADD_FAILURE() << "audio peer: " << std::strerror(errno);
        return;
    }
    thread_ = std::thread([this] { Run(); });
}

AudioPeer::~AudioPeer()
{
    if (thread_.joinable()) {
        const char c = 'q';
        (void)!write(stopPipe_[1], &c, 1);
        thread_.join();
    }
    for (int fd : held_)
        close(fd);
    for (int fd : {listen_, stopPipe_[0], stopPipe_[1]})
        if (fd >= 0)
            close(fd);
    unlink("/tmp/vexoaudiod.sock");
}

void AudioPeer::SetMode(Mode mode, int delayMs)
{
    std::lock_guard<std::mutex> lock(mu_);
    mode_ = mode;
    delayMs_ = delayMs;
}

void AudioPeer::Run()
{
    for (;;) {
        Mode mode;
        {
            std::lock_guard<std::mutex> lock(mu_);
            mode = mode_;
        }
        pollfd fds[2] = {{listen_, static_cast<short>(mode == Mode::StopAccepting ? 0 : POLLIN), 0},
                         {stopPipe_[0], POLLIN, 0}};
        const int n = poll(fds, 2, 50);
        if (n < 0 && errno != EINTR)
            return;
        if (fds[1].revents != 0)
            return;
        if (n > 0 && (fds[0].revents & POLLIN)) {
            const int fd = accept4(listen_, nullptr, nullptr, SOCK_CLOEXEC);
            if (fd >= 0)
                Serve(fd);
        }
    }
}

void AudioPeer::Serve(int fd)
{
    Mode mode;
    int delayMs;
    {
        std::lock_guard<std::mutex> lock(mu_);
        mode = mode_;
        delayMs = delayMs_;
    }
    // Take the record: up to 8196 bytes, waiting at most a second for them.
    unsigned char record[RECORD_SIZE + 16] = {};
    std::size_t got = 0;
    while (got < RECORD_SIZE) {
        pollfd pfd {fd, POLLIN, 0};
        if (poll(&pfd, 1, 1000) <= 0)
            break;
        const ssize_t r = read(fd, record + got, sizeof record - got);
        if (r <= 0)
            break;
        got += static_cast<std::size_t>(r);
    }
    AudioCommand cmd;
    cmd.bytes = got;
    std::memcpy(&cmd.code, record, sizeof cmd.code);
    std::memcpy(cmd.arg.data(), record + 4, cmd.arg.size());

    // A client that gave up has closed its end: the answer must fail with
    // EPIPE, never raise SIGPIPE (under the emulator, as the sandbox's pid 1,
    // that signal hangs the whole test instead of being ignored).
    if (mode == Mode::AnswerLate)
        std::this_thread::sleep_for(std::chrono::milliseconds(delayMs));
    if (mode == Mode::Answer || mode == Mode::AnswerLate || mode == Mode::StopAccepting) {
        (void)!send(fd, "k", 1, MSG_NOSIGNAL);
    } else if (mode == Mode::AnswerHuge) {
        static const std::vector<char> big(3 * 8192, 'h');
        (void)!send(fd, big.data(), big.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
    }
    if (mode == Mode::NeverAnswer)
        held_.push_back(fd);
    else
        close(fd);

    std::lock_guard<std::mutex> lock(mu_);
    commands_.push_back(cmd);
    cv_.notify_all();
}

bool AudioPeer::WaitForCount(std::size_t n, int timeoutMs)
{
    std::unique_lock<std::mutex> lock(mu_);
    return cv_.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                        [&] { return commands_.size() >= n; });
}

std::vector<AudioCommand> AudioPeer::Commands()
{
    std::lock_guard<std::mutex> lock(mu_);
    return commands_;
}

std::vector<std::int32_t> AudioPeer::Codes()
{
    std::vector<std::int32_t> codes;
    for (const auto& c : Commands())
        codes.push_back(c.code);
    return codes;
}

}  // namespace vt
