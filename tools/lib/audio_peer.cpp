#include "lib/audio_peer.hpp"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>

#include "audioctl/playlist.hpp"
#include "lib/unix_socket.hpp"

namespace {

constexpr std::size_t RECORD_SIZE = sizeof(AudioCmdRecord);

// Waits up to timeoutMs (-1: no limit) for events on fds; false when stopFd
// (always fds[0]) became readable, true otherwise (events, time-out, signal).
bool WaitUnlessStopped(std::vector<pollfd>& fds, int timeoutMs)
{
    if (poll(fds.data(), fds.size(), timeoutMs) <= 0)
        return true;
    return fds[0].revents == 0;
}

void SendAnswer(int fd, const char* data, std::size_t size)
{
    // Never blocks: an answer that does not fit is cut, as a busy daemon's would be.
    (void)send(fd, data, size, MSG_NOSIGNAL | MSG_DONTWAIT);
}

// The argument text up to its first zero byte, quoted, with unprintable
// characters escaped. *end receives the offset after the zero byte.
std::string QuotedText(const char* arg, std::size_t* end)
{
    const char* zero = static_cast<const char*>(std::memchr(arg, 0, AUDIO_ARG_SIZE));
    const std::size_t n = zero == nullptr ? AUDIO_ARG_SIZE : static_cast<std::size_t>(zero - arg);
    std::string out = "\"";
    for (std::size_t i = 0; i < n; ++i) {
        const auto c = static_cast<unsigned char>(arg[i]);
        if (c == '"' || c == '\\') {
            out += '\\';
            out += static_cast<char>(c);
        } else if (c >= 0x20 && c < 0x7f) {
            out += static_cast<char>(c);
        } else {
            char hex[8];
            std::snprintf(hex, sizeof hex, "\\x%02x", c);
            out += hex;
        }
    }
    *end = zero == nullptr ? AUDIO_ARG_SIZE : n + 1;
    out += '"';
    return out;
}

}  // namespace

std::int64_t AudioPeerNowNs()
{
    return std::chrono::duration_cast<std::chrono::nanoseconds>(
               std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

AudioPeer::~AudioPeer()
{
    Stop();
    for (const int fd : held_)
        close(fd);
    if (listen_ >= 0) {
        close(listen_);
        unlink(path_.c_str());
    }
    for (const int fd : stopPipe_)
        if (fd >= 0)
            close(fd);
}

bool AudioPeer::Listen(std::string* error, int backlog, const char* path)
{
    if (UnixSomeoneListens(path)) {
        *error = std::string("an audio daemon already listens on ") + path;
        return false;
    }
    UnixFailure failed;
    listen_ = UnixBind(path, SOCK_STREAM | SOCK_NONBLOCK, backlog, &failed);
    if (listen_ < 0) {
        *error = failed.step == UnixStep::Socket
                     ? std::string("socket: ") + std::strerror(failed.error)
                     : std::string("cannot listen on ") + path + ": " + std::strerror(failed.error);
        return false;
    }
    path_ = path;
    return true;
}

void AudioPeer::SetMode(AudioPeerMode mode, int delayMs)
{
    const std::lock_guard<std::mutex> lock(mu_);
    mode_ = mode;
    delayMs_ = delayMs;
}

void AudioPeer::SetAcceptLimit(long count)
{
    const std::lock_guard<std::mutex> lock(mu_);
    acceptLimit_ = count;
}

void AudioPeer::SetObserver(Observer observer)
{
    observer_ = std::move(observer);
}

bool AudioPeer::Accepting()
{
    const std::lock_guard<std::mutex> lock(mu_);
    return acceptLimit_ < 0 || accepted_ < acceptLimit_;
}

void AudioPeer::Run(int stopFd)
{
    for (;;) {
        std::vector<pollfd> fds {{stopFd, POLLIN, 0},
                                 {listen_, static_cast<short>(Accepting() ? POLLIN : 0), 0}};
        for (const int fd : held_)
            fds.push_back({fd, POLLIN, 0});
        if (!WaitUnlessStopped(fds, -1))
            return;
        // A held client that went away (or wrote more): drop its connection.
        for (std::size_t i = 2; i < fds.size(); ++i) {
            if (fds[i].revents == 0)
                continue;
            char sink[256];
            if (read(fds[i].fd, sink, sizeof sink) <= 0) {
                close(fds[i].fd);
                held_.erase(std::find(held_.begin(), held_.end(), fds[i].fd));
            }
        }
        if ((fds[1].revents & POLLIN) == 0)
            continue;
        const int fd = accept4(listen_, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
        if (fd < 0)
            continue;
        {
            const std::lock_guard<std::mutex> lock(mu_);
            ++accepted_;
        }
        if (Serve(fd, stopFd))
            held_.push_back(fd);
        else
            close(fd);
    }
}

bool AudioPeer::Start()
{
    if (pipe2(stopPipe_, O_CLOEXEC) != 0)
        return false;
    thread_ = std::thread([this] { Run(stopPipe_[0]); });
    return true;
}

void AudioPeer::Stop()
{
    if (!thread_.joinable())
        return;
    const char byte = 'q';
    [[maybe_unused]] const ssize_t n = write(stopPipe_[1], &byte, 1);
    thread_.join();
}

std::size_t AudioPeer::ReadRecord(int fd, int stopFd, unsigned char* raw) const
{
    const std::int64_t end = AudioPeerNowNs() + std::int64_t {AUDIO_PEER_RECORD_WAIT_MS} * 1000000;
    std::size_t got = 0;
    while (got < RECORD_SIZE) {
        const std::int64_t left = (end - AudioPeerNowNs()) / 1000000;
        if (left <= 0)
            break;
        std::vector<pollfd> fds {{stopFd, POLLIN, 0}, {fd, POLLIN, 0}};
        if (!WaitUnlessStopped(fds, static_cast<int>(left)))
            break;
        if (fds[1].revents == 0)
            continue;
        const ssize_t n = read(fd, raw + got, RECORD_SIZE - got);
        if (n == 0 || (n < 0 && errno != EAGAIN && errno != EINTR))
            break;
        if (n > 0)
            got += static_cast<std::size_t>(n);
    }
    return got;
}

// Serves one connection; true when the connection is to be kept open.
bool AudioPeer::Serve(int fd, int stopFd)
{
    AudioPeerRecord seen {};
    unsigned char raw[RECORD_SIZE];
    seen.bytes = ReadRecord(fd, stopFd, raw);
    seen.atNs = AudioPeerNowNs();
    std::memcpy(&seen.record, raw, seen.bytes);
    if (observer_)
        observer_(seen);
    if (seen.bytes < RECORD_SIZE)
        return false;

    AudioPeerMode mode;
    int delayMs;
    {
        const std::lock_guard<std::mutex> lock(mu_);
        mode = mode_;
        delayMs = delayMs_;
    }
    switch (mode) {
    case AudioPeerMode::Answer:
        SendAnswer(fd, AUDIO_PEER_ANSWER, sizeof AUDIO_PEER_ANSWER - 1);
        return false;
    case AudioPeerMode::AnswerLate: {
        std::vector<pollfd> fds {{stopFd, POLLIN, 0}};
        if (WaitUnlessStopped(fds, delayMs))
            SendAnswer(fd, AUDIO_PEER_ANSWER, sizeof AUDIO_PEER_ANSWER - 1);
        return false;
    }
    case AudioPeerMode::NeverAnswer:
        return true;
    case AudioPeerMode::CloseWithoutAnswer:
        return false;
    case AudioPeerMode::AnswerHuge: {
        const std::string big(AUDIO_PEER_HUGE_ANSWER, 'h');
        SendAnswer(fd, big.data(), big.size());
        return false;
    }
    }
    return false;
}

std::string AudioPeerDescribe(const AudioCmdRecord& record)
{
    const AudioCmdInfo* info = AudioCmdFind(record.code);
    char text[128];
    std::snprintf(text, sizeof text, "%s (%d)", info != nullptr ? info->name : "unknown",
                  static_cast<int>(record.code));
    std::string line = text;
    // Where the argument ends: every byte from there on must be zero.
    std::size_t used = 0;
    switch (info != nullptr ? info->form : AudioArgForm::None) {
    case AudioArgForm::None:
        break;
    case AudioArgForm::Decimal:
    case AudioArgForm::Bands:
        line += ' ';
        line += QuotedText(record.arg, &used);
        break;
    case AudioArgForm::Record:
    case AudioArgForm::RecordInt: {
        AudioPlaylistRecord playlist;
        std::memcpy(&playlist, record.arg, sizeof playlist);
        std::snprintf(text, sizeof text, " record of %zu bytes, int at %d = %d", sizeof playlist,
                      static_cast<int>(AUDIO_PLAYLIST_N_OFFSET), static_cast<int>(playlist.n));
        line += text;
        used = sizeof playlist;
        break;
    }
    }
    const char* const tail = record.arg + used;
    if (std::any_of(tail, record.arg + AUDIO_ARG_SIZE, [](char c) { return c != 0; }))
        line += " [stray bytes after the argument]";
    return line;
}
