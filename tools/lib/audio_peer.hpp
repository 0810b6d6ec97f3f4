// The stand-in audio daemon: listens on the audio daemon's socket, takes one
// 8196-byte command record per connection and answers it, or misbehaves on
// purpose as its mode says. The standin-audiod program runs it on its main
// thread; tests and benchmarks run it on a thread of their own and watch the
// records through an observer. Records are read in this machine's byte order.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "audioctl/ctrl.hpp"
#include "common/paths.hpp"

// How the peer answers a whole record; a short one is never answered.
enum class AudioPeerMode : std::uint8_t {
    Answer,              // answer AUDIO_PEER_ANSWER at once
    AnswerLate,          // answer after the delay
    NeverAnswer,         // keep the connection open without answering
    CloseWithoutAnswer,  // close the connection without answering
    AnswerHuge,          // answer AUDIO_PEER_HUGE_ANSWER bytes, more than a client takes
};

// The normal answer, and the size of the oversized one.
inline constexpr char AUDIO_PEER_ANSWER[] = "ok";
inline constexpr std::size_t AUDIO_PEER_HUGE_ANSWER = 2 * AUDIO_REPLY_SIZE + 1;

// How long a client may take to deliver its record.
inline constexpr int AUDIO_PEER_RECORD_WAIT_MS = 2000;

// The listening queue, where clients wait while the peer does not accept.
inline constexpr int AUDIO_PEER_BACKLOG = 4;

// One connection as the peer saw it.
struct AudioPeerRecord {
    AudioCmdRecord record;  // zero beyond the bytes that arrived
    std::size_t bytes;      // bytes of the record that arrived: sizeof record when whole
    std::int64_t atNs;      // steady clock, when the last of them arrived
};

class AudioPeer {
public:
    // Called on the serving thread for every connection, before it is answered.
    using Observer = std::function<void(const AudioPeerRecord&)>;

    AudioPeer() = default;
    // Stops the serving thread, closes every connection and removes the socket.
    ~AudioPeer();
    AudioPeer(const AudioPeer&) = delete;
    AudioPeer& operator=(const AudioPeer&) = delete;

    // Listens at path, unless someone already answers there. False with the
    // reason in *error ("an audio daemon already listens on PATH",
    // "socket: ...", "cannot listen on PATH: ...").
    bool Listen(std::string* error, int backlog = AUDIO_PEER_BACKLOG,
                const char* path = AUDIO_SOCKET_PATH);

    // Sets how the next records are answered; safe from any thread.
    void SetMode(AudioPeerMode mode, int delayMs = 0);

    // Accepts count connections in all, then no more; -1 for no limit.
    void SetAcceptLimit(long count);

    // Sets the observer; before Run or Start.
    void SetObserver(Observer observer);

    // Serves on the calling thread until stopFd becomes readable.
    void Run(int stopFd);

    // Serves on a thread of its own until Stop; false (errno) if it could not start.
    bool Start();

    // Ends the thread that Start began and waits for it.
    void Stop();

private:
    bool Accepting();
    bool Serve(int fd, int stopFd);
    std::size_t ReadRecord(int fd, int stopFd, unsigned char* raw) const;

    std::string path_;
    int listen_ = -1;
    int stopPipe_[2] = {-1, -1};
    std::thread thread_;
    Observer observer_;
    std::vector<int> held_;  // connections kept open by NeverAnswer
    std::mutex mu_;          // guards what follows
    AudioPeerMode mode_ = AudioPeerMode::Answer;
    int delayMs_ = 0;
    long acceptLimit_ = -1;
    long accepted_ = 0;
};

// One readable line for a record: "AUDIO_CMD_PLAY (4)", then its argument as
// its form carries it (a quoted text, or the playlist record's integer), and
// "[stray bytes after the argument]" when a byte after it is not zero.
std::string AudioPeerDescribe(const AudioCmdRecord& record);

// The steady clock in nanoseconds, as AudioPeerRecord::atNs reads it.
std::int64_t AudioPeerNowNs();
