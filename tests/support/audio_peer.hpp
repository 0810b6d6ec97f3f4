// An in-process stand-in for the audio daemon, for tests: listens on
// "/tmp/vexoaudiod.sock", takes one 8196-byte record per connection, keeps
// it, and answers (or misbehaves) as its mode says.
#pragma once

#include <array>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace vt {

// One record as received, in the byte order of this machine.
struct AudioCommand {
    std::int32_t code = 0;
    std::array<unsigned char, 8192> arg {};
    std::size_t bytes = 0;  // how many bytes arrived on the connection in all
    // The argument as text, up to its first zero byte.
    std::string ArgText() const;
    // True when every byte of the argument area from offset `from` is zero.
    bool ZeroFrom(std::size_t from) const;
};

class AudioPeer {
public:
    enum class Mode {
        Answer,              // answer one byte at once
        AnswerLate,          // answer after delayMs
        NeverAnswer,         // keep the connection open, never answer
        CloseWithoutAnswer,  // read the record, close
        AnswerHuge,          // answer 3 x 8192 bytes
        StopAccepting,       // listen (backlog 4) but never accept
    };

    explicit AudioPeer(Mode mode = Mode::Answer, int delayMs = 0);
    ~AudioPeer();
    AudioPeer(const AudioPeer&) = delete;
    AudioPeer& operator=(const AudioPeer&) = delete;

    // Waits until at least n records have arrived.
    bool WaitForCount(std::size_t n, int timeoutMs = 5000);
    std::vector<AudioCommand> Commands();
    std::vector<std::int32_t> Codes();
    void SetMode(Mode mode, int delayMs = 0);

private:
    void Run();
    void Serve(int fd);
    int listen_ = -1;
    int stopPipe_[2] = {-1, -1};
    std::mutex mu_;
    std::condition_variable cv_;
    Mode mode_;
    int delayMs_;
    std::vector<AudioCommand> commands_;
    std::vector<int> held_;  // connections kept open by NeverAnswer
    std::thread thread_;
};

}  // namespace vt
