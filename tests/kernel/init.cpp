// The first process of the PowerPC machine that tests/kernel/run.sh boots.
// It makes a USB HID gadget on the dummy controller the radio receiver (read
// back through hiddev), starts the stand-in peers and vexorcd, drives the
// remote with remote-sim, prints one line per check and "kernel: N passed,
// N failed", and powers off. With vexomode=demo on the kernel command line
// it also shows what each peer received.
#include <fcntl.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/reboot.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <regex>
#include <sstream>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "common/paths.hpp"
#include "drivers/hiddev.hpp"

namespace {

const std::string GADGET = "/sys/kernel/config/usb_gadget/remote";
const char* const AUDIO_LOG = "/tmp/audio.log";

// A report of two bytes: the eight modifier keys as variable fields (an
// event each, on every report), then a one-key array whose change is one
// event more: (key, 1) at a press, (key, 0) at a release, both when a second
// key replaces the first. A vendor-defined application collection leaves the
// device to hiddev rather than the input layer.
const unsigned char REPORT_DESCRIPTOR[] = {
    0x06, 0x00, 0xFF, 0x09, 0x01, 0xA1, 0x01,                    // vendor page, application
    0x05, 0x07, 0x19, 0xE0, 0x29, 0xE7,                          // Keyboard: modifiers
    0x15, 0x00, 0x25, 0x01, 0x75, 0x01, 0x95, 0x08, 0x81, 0x02,  // 8 x 1 bit, variable
    0x19, 0x04, 0x29, 0x65, 0x15, 0x04, 0x25, 0x65,              // keys 0x04 .. 0x65
    0x75, 0x08, 0x95, 0x01, 0x81, 0x00, 0xC0,                    // 1 x 8 bits, array
};

bool demo = false;
int passed = 0;
int failed = 0;

void Check(const std::string& name, bool ok, std::string detail = "")
{
    ++(ok ? passed : failed);
    std::ranges::replace(detail, '\n', ' ');
    detail.erase(detail.find_last_not_of(' ') + 1);
    std::printf("%s %s%s%s\n", ok ? "ok  " : "FAIL", name.c_str(), detail.empty() ? "" : ": ",
                detail.c_str());
}

void SleepMs(int ms) { std::this_thread::sleep_for(std::chrono::milliseconds(ms)); }

// One write, as configfs and sysfs attributes want it.
bool WriteFile(const std::string& path, std::string_view data)
{
    const int fd = open(path.c_str(), O_WRONLY | O_CLOEXEC);
    const bool ok = fd >= 0 && write(fd, data.data(), data.size()) == static_cast<ssize_t>(data.size());
    close(fd);
    return ok;
}

std::string ReadFile(const std::string& path)
{
    std::ostringstream text;
    text << std::ifstream(path).rdbuf();
    return text.str();
}

bool WaitFor(const char* path, int ms)
{
    for (; access(path, F_OK) != 0; ms -= 10) {
        if (ms <= 0)
            return false;
        SleepMs(10);
    }
    return true;
}

// Starts a program, its output appended to a file.
pid_t Spawn(const std::string& command, const char* output)
{
    std::istringstream in(command);
    std::vector<std::string> words {std::istream_iterator<std::string>(in), {}};
    std::vector<char*> argv;
    for (std::string& w : words)
        argv.push_back(w.data());
    argv.push_back(nullptr);
    const pid_t pid = fork();
    if (pid == 0) {
        const int fd = open(output, O_WRONLY | O_CREAT | O_APPEND, 0644);
        dup2(fd, 1);
        dup2(fd, 2);
        execv(argv[0], argv.data());
        _exit(127);
    }
    return pid;
}

int Finish(pid_t pid)
{
    int status = 0;
    return waitpid(pid, &status, 0) == pid && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

void Stop(pid_t& pid)
{
    if (pid > 0 && kill(pid, SIGTERM) == 0)
        Finish(pid);
    pid = -1;
}

// What a peer printed since the last look: the lines that start with the
// prefix, each ended by a newline; of the audio daemon's, the command names
// without the prefix, each ended by a blank.
struct Peer {
    const char* log;
    const char* prefix;
    const char* label;  // how the demo shows the lines
    std::size_t seen = 0;

    std::string Take()
    {
        std::string text;
        std::istringstream in(ReadFile(log));
        std::size_t n = 0;
        for (std::string line; std::getline(in, line); ++n) {
            if (n < seen || !line.starts_with(prefix))
                continue;
            if (demo)
                std::printf("      %-18s %s\n", label, line.c_str());
            text += log == AUDIO_LOG ? line.substr(10, line.find(' ') - 10) + " " : line + "\n";
        }
        seen = n;
        return text;
    }
};
Peer audio {AUDIO_LOG, "AUDIO_CMD_", "audio daemon got"};
Peer media {"/tmp/media.log", "key ", "media center got"};
Peer logged {"/tmp/syslog.log", "hw_", "syslog"};

// Waits until no peer has printed anything for 800 ms (at most 6 s).
void Settle()
{
    std::size_t last = 0;
    for (int quiet = 0, waited = 0; quiet < 800 && waited < 6000; waited += 100) {
        const std::size_t now = ReadFile(audio.log).size() + ReadFile(media.log).size() +
                                ReadFile(logged.log).size();
        quiet = now == last ? quiet + 100 : 0;
        last = now;
        SleepMs(100);
    }
}

// Binds the gadget; the daemon's path leads to the node that appears.
bool Plug()
{
    unlink(RC_RAYTAC_DEVICE_PATH);
    return WriteFile(GADGET + "/UDC", "dummy_udc.0") && WaitFor("/dev/usb/hiddev0", 5000) &&
           symlink("hiddev0", RC_RAYTAC_DEVICE_PATH) == 0;
}

bool MakeGadget()
{
    const std::string hid = GADGET + "/functions/hid.usb0";
    for (const std::string& dir : {GADGET, hid, GADGET + "/configs/c.1"})
        mkdir(dir.c_str(), 0755);
    return WriteFile(GADGET + "/idVendor", "0x1d6b") && WriteFile(GADGET + "/idProduct", "0x0104") &&
           WriteFile(hid + "/report_length", "2") &&
           WriteFile(hid + "/report_desc", {reinterpret_cast<const char*>(REPORT_DESCRIPTOR),
                                            sizeof REPORT_DESCRIPTOR}) &&
           symlink(hid.c_str(), (GADGET + "/configs/c.1/hid.usb0").c_str()) == 0 && Plug();
}

// The receiver's identification as the daemon prints it when it opens the
// device (its own output goes to the null device once it has detached).
std::string Describe()
{
    const int fd = open(RC_RAYTAC_DEVICE_PATH, O_RDONLY | O_CLOEXEC);
    const int file = open("/tmp/describe", O_WRONLY | O_CREAT | O_TRUNC, 0644);
    const int console = dup(1);
    dup2(file, 1);
    HiddevDescribe(fd);
    std::fflush(stdout);
    dup2(console, 1);
    for (const int d : {fd, file, console})
        close(d);
    return ReadFile("/tmp/describe");
}

// CPU ticks (user and system) the process uses in a second.
long TicksOverASecond(pid_t pid)
{
    long ticks[2][2] = {};
    for (auto& t : ticks) {
        const std::string stat = ReadFile("/proc/" + std::to_string(pid) + "/stat");
        std::sscanf(stat.c_str() + stat.rfind(')'),
                    ") %*c %*d %*d %*d %*d %*d %*u %*u %*u %*u %*u %ld %ld", &t[0], &t[1]);
        if (&t == ticks)
            SleepMs(1000);
    }
    return ticks[1][0] + ticks[1][1] - ticks[0][0] - ticks[0][1];
}

// One check: the peers as given, a remote-sim script, then
// what the audio daemon, the log and the media center must have received
// (regular expressions over Peer::Take).
struct Row {
    const char* name;
    const char* audiod;  // options of the stand-in audio daemon
    bool mediaCenter;
    const char* script;
    const char* audio;
    const char* log;
    const char* media;
};

pid_t audiod = -1;
pid_t mediaCenter = -1;
std::string audiodOptions = "none";

void RunRow(const Row& row)
{
    if (audiodOptions != row.audiod) {
        Stop(audiod);
        audiod = Spawn(std::string("/bin/standin-audiod ") + row.audiod, audio.log);
        audiodOptions = row.audiod;
        WaitFor(AUDIO_SOCKET_PATH, 5000);
    }
    if (!row.mediaCenter) {
        Stop(mediaCenter);
    } else if (mediaCenter < 0) {
        mediaCenter = Spawn("/bin/standin-mediacenter", media.log);
        WaitFor(MEDIA_CENTER_SOCKET_PATH, 5000);
    }
    if (demo)
        std::printf("\n== %s\n      %-18s %s\n", row.name, "input", row.script);
    const std::string script = row.script;
    Finish(Spawn("/bin/remote-sim --gadget /dev/hidg0 " + script, "/tmp/remote.log"));
    Settle();
    const std::string got = audio.Take();
    const std::string log = logged.Take();
    const std::string offered = media.Take();
    const bool ok = std::regex_match(got, std::regex(row.audio)) &&
                    std::regex_match(log, std::regex(row.log)) &&
                    std::regex_match(offered, std::regex(row.media));
    Check(row.name, ok, ok ? "" : "audio [" + got + "] log [" + log + "] media [" + offered + "]");
}

const Row ROWS[] = {
    {"Play", "", false, "tap Play", "PLAY ", "", ""},
    {"Next, a short press", "", false, "tap Next", "NEXT ", "", ""},
    {"Next, held 1.2 s: the long press", "", false, "hold Next 1200", "NEXT_HELD ", "", ""},
    {"Volume Plus held 1 s: a step every 200 ms, none after the release", "", false,
     "hold vol+ 1000", "(VOLUME_UP ){4,7}", "", ""},
    {"Custom 3, a short press", "", false, "tap c3", "CUSTOM ", "", ""},
    {"a second key before the first is released: ten events (80 bytes), dropped, the hold ended",
     "", false, "press vol+ sleep 500 press Stop sleep 1000 release Stop", "(VOLUME_UP ){2,4}",
     "hw_raytac.cpp \\(311\\) The hid response is too short\\. ret:80 \\(10\\)\n", ""},
    {"reports queued behind an audio daemon answering after 300 ms: each counted, no runaway",
     "--delay 300", false, "tap vol+ tap vol+ tap Play tap Stop", "VOLUME_UP VOLUME_UP PLAY STOP ",
     "", ""},
    {"the media center takes the key", "", true, "tap Play", "", "", "key 0x0007002C\n"},
};

void RunAll()
{
    Check("gadget bound to dummy_udc.0, /dev/usb/hiddev0 appeared", MakeGadget());
    const std::string id = Describe();
    Check("the receiver's identification (HIDIOCGVERSION, HIDIOCGDEVINFO)",
          std::regex_match(id, std::regex("hiddev driver version is 1\\.0\\.4\n"
                                          "vendor 0x1d6b product 0x0104 version 0x[0-9a-f]{4} "
                                          "has 1 application and is on bus: \\d+ devnum: \\d+ "
                                          "ifnum: 0\n")),
          id);

    pid_t sink = Spawn("/bin/syslog-sink", logged.log);
    WaitFor(SYSLOG_SOCKET_PATH, 5000);
    Finish(Spawn("/bin/vexorcd", "/tmp/vexorcd.out"));
    WaitFor(RC_CTRL_SOCKET_PATH, 5000);
    const pid_t daemon = std::atoi(ReadFile(RC_PID_FILE).c_str());
    Check("vexorcd started", daemon > 0);
    for (const Row& row : ROWS)
        RunRow(row);

    // Unplugged while open: the node goes, select calls it readable and every
    // read fails. The loop may then turn at its 100 us pace, as it does with
    // the receiver closed, but no harder, and without a log message.
    const long open = TicksOverASecond(daemon);
    WriteFile(GADGET + "/UDC", "\n");
    SleepMs(200);
    logged.Take();
    const long unplugged = TicksOverASecond(daemon);
    const auto messages = std::ranges::count(logged.Take(), '\n');
    kill(daemon, SIGUSR2);
    SleepMs(200);
    const long closed = TicksOverASecond(daemon);
    Check("unplugged: no log flood, no harder spin than the closed loop",
          messages == 0 && unplugged * 2 <= closed * 3 + 10,
          "CPU ticks/s open " + std::to_string(open) + ", unplugged " + std::to_string(unplugged) +
              ", closed " + std::to_string(closed) + "; " + std::to_string(messages) + " log lines");

    Check("replugged", Plug());
    kill(daemon, SIGUSR1);
    SleepMs(300);
    RunRow({"after the replug and SIGUSR1, keys work again", "", false, "tap Play", "PLAY ", "", ""});

    kill(daemon, SIGTERM);
    Check("SIGTERM: clean exit, pid file gone",
          Finish(daemon) == 0 && access(RC_PID_FILE, F_OK) != 0);
    Stop(audiod);
    Stop(sink);
    std::printf("kernel: %d passed, %d failed\n", passed, failed);
}

}  // namespace

int main()
{
    std::setvbuf(stdout, nullptr, _IOLBF, 0);
    const char* mode = std::getenv("vexomode");
    demo = mode != nullptr && std::string_view(mode) == "demo";
    mount("proc", "/proc", "proc", 0, nullptr);
    mount("sysfs", "/sys", "sysfs", 0, nullptr);
    mount("devtmpfs", "/dev", "devtmpfs", 0, nullptr);
    mount("configfs", "/sys/kernel/config", "configfs", 0, nullptr);
    for (const char* dir : {"/tmp", "/var", "/var/run"})
        mkdir(dir, 0755);
    const std::string uptime = ReadFile("/proc/uptime");
    std::printf("machine up after %s s\n", uptime.substr(0, uptime.find(' ')).c_str());
    RunAll();
    sync();
    reboot(RB_AUTOBOOT);
}
