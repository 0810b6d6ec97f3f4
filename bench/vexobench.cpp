// Load generator and measuring peer for the daemon's benchmarks. One process
// plays both ends of the daemon: the local program that writes 4-byte actions
// to "/tmp/vexoctrl" and the audio daemon on "/tmp/vexoaudiod.sock" that
// takes the 8196-byte records, so one monotonic clock times the whole road.
// It runs inside tests/sandbox.sh, with the daemon's built-in paths.
//
//   vexobench sink FILE                  syslog receiver on /dev/log, one message a line
//   vexobench latency N [PID]            N actions one after another; with PID, the
//                                        receiver is opened on a FIFO first
//   vexobench baseline N                 the same road through a minimal relay loop
//   vexobench throughput SENDERS N       SENDERS threads send N actions each
//   vexobench exercise PID               every road of the daemon, for the allocation count
//
// Results are printed as "key=value" lines for bench/measure.sh.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <random>
#include <string>
#include <thread>
#include <vector>

namespace {

constexpr char CTRL_PATH[] = "/tmp/vexoctrl";
constexpr char AUDIO_PATH[] = "/tmp/vexoaudiod.sock";
constexpr char RELAY_PATH[] = "/tmp/vexobench-relay.sock";
constexpr char MEDIA_PATH[] = "/tmp/MediaCenter.sock";
constexpr char RECEIVER_PATH[] = "/dev/usb/hiddev5";
constexpr std::size_t RECORD_SIZE = 8196;
constexpr int LAST_ACTION = 25;
// Random waits before each timed action: over several loop turns (one turn
// is the 100 µs pause plus the polls), or over the receiver's 200 ms wait.
constexpr int LOOP_JITTER_US = 1000;
constexpr int RECEIVER_WAIT_US = 200000;

using Clock = std::chrono::steady_clock;

std::int64_t NowNs()
{
    return std::chrono::duration_cast<std::chrono::nanoseconds>(Clock::now().time_since_epoch())
        .count();
}

[[noreturn]] void Die(const char* what)
{
    std::fprintf(stderr, "vexobench: %s: %s\n", what, std::strerror(errno));
    std::exit(1);
}

// ---- What the audio daemon must receive for each action --------------------

struct Expected {
    std::int32_t code;  // 0: the action sends nothing
    char arg;           // the one-digit decimal argument, or 0 for none
};

// Indexed by action; the command and argument that the dispatcher sends.
constexpr std::array<Expected, LAST_ACTION + 1> EXPECTED = {{
    {0, 0},   {0, 0},   {5, 0},   {1, 0},   {2, 0},   {3, 0},   {4, 0},
    {6, 0},   {7, 0},   {12, 0},  {13, 0},  {0, 0},   {0, 0},   {26, 0},
    {30, 0},  {31, 0},  {32, '1'}, {32, '2'}, {32, '3'}, {32, '4'}, {33, 0},
    {34, 0},  {36, '1'}, {36, '2'}, {36, '3'}, {36, '4'},
}};

// The actions that make the daemon send a command, in the order the load cycles through.
std::vector<std::int32_t> CommandedActions()
{
    std::vector<std::int32_t> out;
    for (std::int32_t a = 1; a <= LAST_ACTION; ++a)
        if (EXPECTED[static_cast<std::size_t>(a)].code != 0)
            out.push_back(a);
    return out;
}

// The action whose command this record carries, or -1 when none matches
// (wrong code, wrong argument, or a byte that should be zero is not).
std::int32_t DecodeRecord(const unsigned char* rec)
{
    std::int32_t code;
    std::memcpy(&code, rec, sizeof code);
    const unsigned char* arg = rec + 4;
    std::size_t used = 0;
    while (used < 12 && arg[used] != 0)
        ++used;
    for (std::size_t i = used; i < RECORD_SIZE - 4; ++i)
        if (arg[i] != 0)
            return -1;
    for (std::int32_t a = 1; a <= LAST_ACTION; ++a) {
        const Expected& e = EXPECTED[static_cast<std::size_t>(a)];
        if (e.code != code || e.code == 0)
            continue;
        if (e.arg == 0 ? used == 0 : (used == 1 && arg[0] == static_cast<unsigned char>(e.arg)))
            return a;
    }
    return -1;
}

// ---- Sockets ---------------------------------------------------------------

sockaddr_un Address(const char* path)
{
    sockaddr_un addr {};
    addr.sun_family = AF_UNIX;
    std::snprintf(addr.sun_path, sizeof addr.sun_path, "%s", path);
    return addr;
}

int Listen(const char* path, int type, int backlog)
{
    unlink(path);
    const int fd = socket(AF_UNIX, type | SOCK_CLOEXEC, 0);
    if (fd < 0)
        Die("socket");
    const sockaddr_un addr = Address(path);
    if (bind(fd, reinterpret_cast<const sockaddr*>(&addr), sizeof addr) != 0)
        Die(path);
    if (type == SOCK_STREAM && listen(fd, backlog) != 0)
        Die("listen");
    return fd;
}

// Connects to path and writes the 4 bytes of action; false when either fails.
bool SendAction(const char* path, std::int32_t action)
{
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0)
        return false;
    const sockaddr_un addr = Address(path);
    bool ok = connect(fd, reinterpret_cast<const sockaddr*>(&addr), sizeof addr) == 0 &&
              write(fd, &action, sizeof action) == static_cast<ssize_t>(sizeof action);
    close(fd);
    return ok;
}

// Reads exactly n bytes within timeoutMs; false on end of stream, error or time-out.
bool ReadFull(int fd, unsigned char* buf, std::size_t n, int timeoutMs)
{
    const std::int64_t deadline = NowNs() + std::int64_t {timeoutMs} * 1000000;
    std::size_t got = 0;
    while (got < n) {
        const std::int64_t left = (deadline - NowNs()) / 1000000;
        pollfd pfd {fd, POLLIN, 0};
        if (left < 0 || poll(&pfd, 1, static_cast<int>(left) + 1) <= 0)
            return false;
        const ssize_t r = read(fd, buf + got, n - got);
        if (r <= 0)
            return false;
        got += static_cast<std::size_t>(r);
    }
    return true;
}

// ---- The audio daemon's stand-in -------------------------------------------

// Takes one record per connection, notes when its last byte arrived and which
// action it carries, and answers one byte (unless told to stay silent).
class AudioPeer {
public:
    enum class Mode { Answer, NeverAnswer, CloseWithoutAnswer };

    AudioPeer() : listen_(Listen(AUDIO_PATH, SOCK_STREAM, 16))
    {
        if (pipe2(stop_, O_CLOEXEC) != 0)
            Die("pipe");
        counts_.fill(0);
        thread_ = std::thread([this] { Run(); });
    }
    ~AudioPeer()
    {
        const char c = 'q';
        (void)!write(stop_[1], &c, 1);
        thread_.join();
        for (int fd : held_)
            close(fd);
        close(listen_);
        close(stop_[0]);
        close(stop_[1]);
        unlink(AUDIO_PATH);
    }
    AudioPeer(const AudioPeer&) = delete;
    AudioPeer& operator=(const AudioPeer&) = delete;

    void SetMode(Mode mode)
    {
        std::lock_guard<std::mutex> lock(mu_);
        mode_ = mode;
    }

    // Waits until `total` records have arrived; the arrival time of the last
    // one in *atNs. False after timeoutMs without it.
    bool WaitFor(std::uint64_t total, int timeoutMs, std::int64_t* atNs = nullptr)
    {
        std::unique_lock<std::mutex> lock(mu_);
        const bool ok = cv_.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                                     [&] { return received_ >= total; });
        if (atNs != nullptr)
            *atNs = lastAtNs_;
        return ok;
    }

    std::uint64_t Received()
    {
        std::lock_guard<std::mutex> lock(mu_);
        return received_;
    }
    std::int32_t LastAction()
    {
        std::lock_guard<std::mutex> lock(mu_);
        return lastAction_;
    }
    std::array<std::uint64_t, LAST_ACTION + 2> Counts()
    {
        std::lock_guard<std::mutex> lock(mu_);
        return counts_;  // the last index counts records that match no action
    }

private:
    void Run()
    {
        std::vector<unsigned char> rec(RECORD_SIZE);
        for (;;) {
            pollfd fds[2] = {{listen_, POLLIN, 0}, {stop_[0], POLLIN, 0}};
            if (poll(fds, 2, -1) < 0 && errno != EINTR)
                return;
            if (fds[1].revents != 0)
                return;
            if ((fds[0].revents & POLLIN) == 0)
                continue;
            const int fd = accept4(listen_, nullptr, nullptr, SOCK_CLOEXEC);
            if (fd < 0)
                continue;
            const bool whole = ReadFull(fd, rec.data(), RECORD_SIZE, 2000);
            const std::int64_t at = NowNs();
            Mode mode;
            {
                std::lock_guard<std::mutex> lock(mu_);
                mode = mode_;
            }
            if (mode == Mode::Answer) {
                const char reply = 'k';
                (void)!write(fd, &reply, 1);
            }
            if (mode == Mode::NeverAnswer)
                held_.push_back(fd);
            else
                close(fd);
            const std::int32_t action = whole ? DecodeRecord(rec.data()) : -1;
            {
                std::lock_guard<std::mutex> lock(mu_);
                ++received_;
                lastAtNs_ = at;
                lastAction_ = action;
                ++counts_[action > 0 ? static_cast<std::size_t>(action) : LAST_ACTION + 1];
            }
            cv_.notify_all();
        }
    }

    int listen_;
    int stop_[2] = {-1, -1};
    std::mutex mu_;
    std::condition_variable cv_;
    Mode mode_ = Mode::Answer;
    std::uint64_t received_ = 0;
    std::int64_t lastAtNs_ = 0;
    std::int32_t lastAction_ = 0;
    std::array<std::uint64_t, LAST_ACTION + 2> counts_ {};
    std::vector<int> held_;
    std::thread thread_;
};

// ---- The receiver on a FIFO ------------------------------------------------

// True once the daemon holds RECEIVER_PATH open (or no longer does, if !open).
bool WaitReceiver(pid_t pid, bool open, int timeoutMs)
{
    const std::int64_t deadline = NowNs() + std::int64_t {timeoutMs} * 1000000;
    const std::string dir = "/proc/" + std::to_string(pid) + "/fd/";
    do {
        bool found = false;
        for (int fd = 0; fd < 64 && !found; ++fd) {
            char target[64] = {};
            const ssize_t n = readlink((dir + std::to_string(fd)).c_str(), target, sizeof target - 1);
            found = n > 0 && std::strcmp(target, RECEIVER_PATH) == 0;
        }
        if (found == open)
            return true;
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    } while (NowNs() < deadline);
    return false;
}

// A FIFO at the receiver's path with a writer held open, so that the
// daemon's wait on it runs its whole 200 ms; opened by SIGUSR1, closed by
// SIGUSR2 when the object goes.
class Receiver {
public:
    explicit Receiver(pid_t pid) : pid_(pid)
    {
        unlink(RECEIVER_PATH);
        if (mkfifo(RECEIVER_PATH, 0600) != 0)
            Die("mkfifo");
        writer_ = open(RECEIVER_PATH, O_RDWR | O_CLOEXEC);
        if (writer_ < 0)
            Die(RECEIVER_PATH);
        kill(pid_, SIGUSR1);
        if (!WaitReceiver(pid_, true, 5000)) {
            std::fprintf(stderr, "vexobench: the daemon did not open the receiver\n");
            std::exit(1);
        }
    }
    ~Receiver()
    {
        kill(pid_, SIGUSR2);
        WaitReceiver(pid_, false, 5000);
        close(writer_);
        unlink(RECEIVER_PATH);
    }
    Receiver(const Receiver&) = delete;
    Receiver& operator=(const Receiver&) = delete;

    // Writes one 72-byte report whose ninth event is (usage, value), and
    // waits until the daemon has read it: two reports in the pipe at once
    // would be read as one of the wrong size.
    void Report(std::uint32_t usage, std::int32_t value, std::size_t length = 72) const
    {
        unsigned char report[80] = {};
        std::memcpy(report + 64, &usage, sizeof usage);
        std::memcpy(report + 68, &value, sizeof value);
        (void)!write(writer_, report, std::min(length, sizeof report));
        int pending = 1;
        for (int i = 0; i < 200 && ioctl(writer_, FIONREAD, &pending) == 0 && pending > 0; ++i)
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }

private:
    pid_t pid_;
    int writer_ = -1;
};

// ---- Figures ---------------------------------------------------------------

struct Summary {
    double medianUs;
    double p99Us;
    double maxUs;
};

Summary Summarise(std::vector<std::int64_t> ns)
{
    std::sort(ns.begin(), ns.end());
    const std::size_t n = ns.size();
    const std::size_t p99 = (n * 99 + 99) / 100 - 1;
    return {static_cast<double>(ns[n / 2]) / 1000.0, static_cast<double>(ns[p99]) / 1000.0,
            static_cast<double>(ns[n - 1]) / 1000.0};
}

// Sends n actions to path one after another, each once the previous record
// has arrived, and times each from the connect to the record's last byte.
// Before each send it waits a random time below maxJitterUs, so that actions
// land at every point of the daemon's loop rather than right after its
// previous exchange.
int MeasureLatency(const char* label, const char* path, int n, int maxJitterUs)
{
    AudioPeer peer;
    const std::vector<std::int32_t> actions = CommandedActions();
    std::vector<std::int64_t> samples;
    samples.reserve(static_cast<std::size_t>(n));
    std::mt19937 rng(12345);
    std::uniform_int_distribution<int> jitter(0, std::max(0, maxJitterUs - 1));
    int wrong = 0;
    int lost = 0;
    for (int i = 0; i < n; ++i) {
        const std::int32_t action = actions[static_cast<std::size_t>(i) % actions.size()];
        std::this_thread::sleep_for(std::chrono::microseconds(jitter(rng)));
        const std::uint64_t before = peer.Received();
        const std::int64_t t0 = NowNs();
        if (!SendAction(path, action)) {
            ++lost;
            continue;
        }
        std::int64_t t1 = 0;
        if (!peer.WaitFor(before + 1, 2000, &t1)) {
            ++lost;
            continue;
        }
        if (peer.LastAction() != action)
            ++wrong;
        samples.push_back(t1 - t0);
    }
    if (samples.empty()) {
        std::printf("%s.n=0\n%s.lost=%d\n", label, label, lost);
        return 1;
    }
    const Summary s = Summarise(samples);
    std::printf("%s.n=%zu\n%s.median_us=%.1f\n%s.p99_us=%.1f\n%s.max_us=%.1f\n"
                "%s.lost=%d\n%s.wrong=%d\n",
                label, samples.size(), label, s.medianUs, label, s.p99Us, label, s.maxUs, label,
                lost, label, wrong);
    return lost == 0 && wrong == 0 ? 0 : 1;
}

// The least a relay must do for one action: a blocking accept on a stream
// socket, one read of 4 bytes, then one exchange of a zeroed 8196-byte
// record with the audio daemon. No pause, no polling.
[[noreturn]] void RunRelay(int listenFd)
{
    static unsigned char rec[RECORD_SIZE];
    static char reply[8192];
    for (;;) {
        const int client = accept(listenFd, nullptr, nullptr);
        if (client < 0)
            continue;
        std::int32_t action = 0;
        const ssize_t r = read(client, &action, sizeof action);
        close(client);
        if (r != static_cast<ssize_t>(sizeof action) || action < 1 || action > LAST_ACTION)
            continue;
        const Expected& e = EXPECTED[static_cast<std::size_t>(action)];
        std::memset(rec, 0, sizeof rec);
        std::memcpy(rec, &e.code, sizeof e.code);
        rec[4] = static_cast<unsigned char>(e.arg);
        const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        const sockaddr_un addr = Address(AUDIO_PATH);
        if (fd >= 0 && connect(fd, reinterpret_cast<const sockaddr*>(&addr), sizeof addr) == 0 &&
            write(fd, rec, sizeof rec) == static_cast<ssize_t>(sizeof rec)) {
            pollfd pfd {fd, POLLIN, 0};
            if (poll(&pfd, 1, 500) > 0)
                (void)!read(fd, reply, sizeof reply);
        }
        if (fd >= 0)
            close(fd);
    }
}

int Baseline(int n)
{
    const int listenFd = Listen(RELAY_PATH, SOCK_STREAM, 4);
    const pid_t relay = fork();
    if (relay < 0)
        Die("fork");
    if (relay == 0)
        RunRelay(listenFd);
    close(listenFd);
    const int rc = MeasureLatency("baseline", RELAY_PATH, n, LOOP_JITTER_US);
    kill(relay, SIGKILL);
    waitpid(relay, nullptr, 0);
    unlink(RELAY_PATH);
    return rc;
}

// Several senders at once, as fast as the daemon takes them; then every
// action is checked to have arrived exactly once.
int Throughput(int senders, int perSender)
{
    AudioPeer peer;
    const std::vector<std::int32_t> actions = CommandedActions();
    std::array<std::atomic<std::uint64_t>, LAST_ACTION + 1> sent {};
    std::atomic<std::uint64_t> failed {0};
    const std::int64_t t0 = NowNs();
    std::vector<std::thread> threads;
    for (int s = 0; s < senders; ++s)
        threads.emplace_back([&, s] {
            for (int i = 0; i < perSender; ++i) {
                const std::int32_t a = actions[static_cast<std::size_t>(s + i) % actions.size()];
                if (SendAction(CTRL_PATH, a))
                    ++sent[static_cast<std::size_t>(a)];
                else
                    ++failed;
            }
        });
    for (std::thread& t : threads)
        t.join();
    std::uint64_t total = 0;
    for (const auto& c : sent)
        total += c.load();
    // Everything sent has been taken by the daemon's socket; wait for the
    // last records, giving up once nothing has arrived for two seconds.
    std::uint64_t seen = peer.Received();
    while (!peer.WaitFor(total, 2000)) {
        const std::uint64_t now = peer.Received();
        if (now == seen)
            break;
        seen = now;
    }
    std::int64_t lastAt = 0;
    peer.WaitFor(0, 0, &lastAt);
    const double seconds = static_cast<double>(lastAt - t0) / 1e9;
    const auto got = peer.Counts();
    std::uint64_t lost = 0;
    std::uint64_t dup = 0;
    std::uint64_t received = 0;
    for (std::size_t a = 1; a <= LAST_ACTION; ++a) {
        const std::uint64_t want = sent[a].load();
        received += got[a];
        if (got[a] < want)
            lost += want - got[a];
        else
            dup += got[a] - want;
    }
    const std::uint64_t garbled = got[LAST_ACTION + 1];
    std::printf("throughput.senders=%d\nthroughput.sent=%llu\nthroughput.send_failed=%llu\n"
                "throughput.received=%llu\nthroughput.lost=%llu\nthroughput.duplicated=%llu\n"
                "throughput.garbled=%llu\nthroughput.seconds=%.3f\nthroughput.per_second=%.0f\n",
                senders, static_cast<unsigned long long>(total),
                static_cast<unsigned long long>(failed.load()),
                static_cast<unsigned long long>(received), static_cast<unsigned long long>(lost),
                static_cast<unsigned long long>(dup), static_cast<unsigned long long>(garbled),
                seconds, static_cast<double>(received) / seconds);
    return lost == 0 && dup == 0 && garbled == 0 && failed.load() == 0 ? 0 : 1;
}

// ---- Every road, for the allocation count ----------------------------------

// Sends action and waits until the audio peer has count records in all.
bool Deliver(AudioPeer& peer, std::int32_t action, std::uint64_t count)
{
    return SendAction(CTRL_PATH, action) && peer.WaitFor(count, 3000);
}

// Waits until no record has arrived for 300 ms; returns how many came in all.
std::uint64_t Settle(AudioPeer& peer)
{
    std::uint64_t seen = peer.Received();
    while (peer.WaitFor(seen + 1, 300))
        seen = peer.Received();
    return seen;
}

// Connects to the control socket and writes bytes (possibly none) of data.
void SendRaw(const void* data, std::size_t bytes)
{
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    const sockaddr_un addr = Address(CTRL_PATH);
    if (fd >= 0 && connect(fd, reinterpret_cast<const sockaddr*>(&addr), sizeof addr) == 0 &&
        bytes > 0)
        (void)!write(fd, data, bytes);
    if (fd >= 0)
        close(fd);
}

int Exercise(pid_t pid)
{
    int failures = 0;
    auto check = [&](bool ok, const char* what) {
        if (!ok) {
            std::fprintf(stderr, "vexobench: exercise: %s\n", what);
            ++failures;
        }
    };
    // Nobody on the audio socket: every dispatch fails at the connect and logs.
    unlink(AUDIO_PATH);
    for (std::int32_t a : {2, 6, 16})
        SendAction(CTRL_PATH, a);
    std::this_thread::sleep_for(std::chrono::milliseconds(100));

    AudioPeer peer;
    std::uint64_t count = 0;
    for (int round = 0; round < 20; ++round)
        for (std::int32_t a : CommandedActions())
            check(Deliver(peer, a, ++count), "action not delivered");
    // Odd clients: codes outside 1..25 or without a command, nothing sent,
    // one byte, eight bytes, and five at once (one more than the client slots).
    for (std::int32_t a : {0, -1, 26, 1000, 1, 11, 12})
        SendAction(CTRL_PATH, a);
    SendRaw(nullptr, 0);
    const unsigned char one = 6;
    SendRaw(&one, 1);
    const std::int32_t two[2] = {6, 6};
    SendRaw(two, sizeof two);
    std::vector<std::thread> burst;
    for (int i = 0; i < 5; ++i)
        burst.emplace_back([] { SendAction(CTRL_PATH, 6); });
    for (std::thread& t : burst)
        t.join();
    count += 6;  // the eight-byte client and the five; the one byte is 6 only on little-endian
    check(Settle(peer) >= count, "burst not delivered");
    count = peer.Received();
    // A peer that never answers (the 500 ms budget runs out) and one that
    // closes without answering.
    peer.SetMode(AudioPeer::Mode::NeverAnswer);
    check(Deliver(peer, 6, ++count), "silent peer not reached");
    std::this_thread::sleep_for(std::chrono::milliseconds(700));
    peer.SetMode(AudioPeer::Mode::CloseWithoutAnswer);
    check(Deliver(peer, 6, ++count), "closing peer not reached");
    peer.SetMode(AudioPeer::Mode::Answer);

    {
        // The receiver: a short press, a volume key held over idle waits, a
        // long and a short press of Next, an unmapped key, a short and an
        // oversized report, then a media-center interface that takes a key.
        Receiver rx(pid);
        rx.Report(0x0007002C, 1);  // Play
        check(peer.WaitFor(++count, 3000), "receiver key not delivered");
        rx.Report(0x0007002C, 0);
        rx.Report(0x00070057, 1);  // Volume Plus, repeated while held
        check(peer.WaitFor(count + 3, 3000), "volume repeat not delivered");
        rx.Report(0x00070057, 0);
        count = Settle(peer);
        rx.Report(0x00070011, 1);  // Next, held past the long press
        check(peer.WaitFor(++count, 3000), "held Next not delivered");
        rx.Report(0x00070011, 0);
        rx.Report(0x00070011, 1);  // Next, short press
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        rx.Report(0x00070011, 0);
        check(peer.WaitFor(++count, 3000), "short Next not delivered");
        rx.Report(0x00070001, 1);
        rx.Report(0x00070001, 0);
        rx.Report(0, 0, 4);
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
        rx.Report(0, 0, 80);
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
        const int media = Listen(MEDIA_PATH, SOCK_DGRAM, 0);
        rx.Report(0x0007002C, 1);
        pollfd pfd {media, POLLIN, 0};
        check(poll(&pfd, 1, 3000) == 1, "media-center key not offered");
        rx.Report(0x0007002C, 0);
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
        close(media);
        unlink(MEDIA_PATH);
        // SIGUSR1 while the receiver is open changes nothing.
        kill(pid, SIGUSR1);
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
        check(Settle(peer) == count, "a key given to the media center was dispatched");
    }
    kill(pid, SIGUSR2);  // closed already: changes nothing
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    check(Deliver(peer, 6, ++count), "action after the receiver not delivered");
    std::printf("exercise.records=%llu\nexercise.failures=%d\n",
                static_cast<unsigned long long>(peer.Received()), failures);
    return failures == 0 ? 0 : 1;
}

// ---- Syslog ---------------------------------------------------------------

[[noreturn]] void Sink(const char* file)
{
    const int fd = Listen("/dev/log", SOCK_DGRAM, 0);
    std::FILE* out = std::fopen(file, "a");
    if (out == nullptr)
        Die(file);
    char buf[4096];
    for (;;) {
        const ssize_t n = recv(fd, buf, sizeof buf - 1, 0);
        if (n <= 0)
            continue;
        buf[n] = 0;
        std::fprintf(out, "%s\n", buf);
        std::fflush(out);
    }
}

int Usage()
{
    std::fprintf(stderr,
                 "usage: vexobench sink FILE | latency N [PID] | baseline N |\n"
                 "       throughput SENDERS N | exercise PID\n");
    return 2;
}

}  // namespace

int main(int argc, char** argv)
{
    signal(SIGPIPE, SIG_IGN);
    setvbuf(stdout, nullptr, _IOLBF, 0);
    if (argc < 3)
        return Usage();
    const std::string cmd = argv[1];
    const int n = std::atoi(argv[2]);
    if (cmd == "sink")
        Sink(argv[2]);
    if (cmd == "latency" && argc == 3)
        return MeasureLatency("closed", CTRL_PATH, n, LOOP_JITTER_US);
    if (cmd == "latency" && argc == 4) {
        Receiver rx(static_cast<pid_t>(std::atoi(argv[3])));
        return MeasureLatency("open", CTRL_PATH, n, RECEIVER_WAIT_US);
    }
    if (cmd == "baseline")
        return Baseline(n);
    if (cmd == "throughput" && argc == 4)
        return Throughput(n, std::atoi(argv[3]));
    if (cmd == "exercise")
        return Exercise(static_cast<pid_t>(n));
    return Usage();
}
