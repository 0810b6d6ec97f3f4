// remote-sim: a stand-in for the radio receiver and its remote control.
//
// Makes a FIFO at the receiver's device path (or uses the FIFO that stands
// there) and writes hiddev key reports into it as a script says: 72 bytes
// each, nine events {usage, value} in this machine's byte order, the key in
// the ninth. The writer stays open for the whole script, and with --stay
// until SIGTERM or SIGINT, because a FIFO whose last writer closes reads as
// end of file. Before each report it waits (at most --drain-ms) until the
// reader has taken the previous one, so that every read sees exactly one
// report; it also waits so after the last one before it exits.
//
// With --gadget PATH it drives a real receiver instead: a USB HID gadget
// (Linux f_hid, /dev/hidgN) whose 2-byte report {modifiers, key} the host
// reads through hiddev as nine events, the key's change in the ninth.
//
// Run "remote-sim --help" for the script language.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "common/paths.hpp"
#include "lib/quit.hpp"
#include "lib/receiver_fifo.hpp"

namespace {

const char USAGE[] =
    "usage: %s [--device PATH | --gadget PATH] [--stay] [--drain-ms MS] STEP...\n"
    "Writes receiver key reports into a FIFO at PATH (default %s),\n"
    "making the FIFO if nothing stands there.\n"
    "Steps:\n"
    "  press KEY          the key goes down (event value 1)\n"
    "  release KEY        the key goes up (event value 0)\n"
    "  tap KEY            press, then release once the press has been read\n"
    "  hold KEY MS        press, wait MS milliseconds, release\n"
    "  event KEY VALUE    one report whose key event carries VALUE\n"
    "  sleep MS           wait MS milliseconds\n"
    "  raw-size N [KEY]   one malformed write of N bytes (1 to 4096): press\n"
    "                     reports of KEY (default Play) cut or repeated to N bytes\n"
    "  keys               list the keys and exit\n"
    "KEY is a label (\"Play\", \"Volume Plus\"; case, blanks, '-' and '_' do not\n"
    "matter), an alias (vol+, vol-, prev, shuffle, repeat, random, c1 to c4),\n"
    "or a HID usage code such as 0x0007002C.\n"
    "Options:\n"
    "  --stay          keep the writer open after the script until SIGTERM/SIGINT\n"
    "  --drain-ms MS   longest wait for the reader before each report (default 5000)\n"
    "  --gadget PATH   write 2-byte HID reports {0, key} to a USB HID gadget's device\n"
    "                  (release: {0, 0}), 30 ms apart, instead of FIFO reports\n"
    "Prints \"ready PATH\" once the writer is open and one line per report written.\n"
    "Exit status: 0, 1 when a report could not be written, 2 on a usage error.\n";

constexpr int RAW_SIZE_MAX = 4096;
constexpr std::uint32_t PLAY_USAGE = 0x0007002C;
// The gadget's report descriptor carries Keyboard-page keys 0x04 to 0x65.
constexpr std::uint32_t GADGET_FIRST_KEY = 0x00070004;
constexpr std::uint32_t GADGET_LAST_KEY = 0x00070065;
constexpr int GADGET_GAP_MS = 30;

// The USB HID gadget's device when --gadget names one, else -1.
int gadgetFd = -1;

struct Alias {
    const char* name;
    const char* label;
};
const Alias ALIASES[] = {
    {"vol+", "volumeplus"}, {"volup", "volumeplus"},     {"vol-", "volumeminus"},
    {"voldown", "volumeminus"}, {"prev", "previous"},    {"shuffle", "toggleshuffle"},
    {"repeat", "togglerepeat"}, {"random", "random100"}, {"c1", "custom1"},
    {"c2", "custom2"},          {"c3", "custom3"},       {"c4", "custom4"},
};

enum class Op { Event, Tap, Hold, Sleep, Raw };

struct Step {
    Op op;
    std::uint32_t usage = 0;
    std::int32_t value = 0;  // Event: the event value; Hold, Sleep: ms; Raw: bytes
};

std::string Normalize(const std::string& text)
{
    std::string out;
    for (const char c : text)
        if (c != ' ' && c != '-' && c != '_')
            out += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return out;
}

bool ParseNumber(const std::string& text, long long lo, long long hi, long long& out)
{
    if (text.empty())
        return false;
    char* end = nullptr;
    errno = 0;
    const long long v = std::strtoll(text.c_str(), &end, 0);
    if (errno != 0 || *end != '\0' || v < lo || v > hi)
        return false;
    out = v;
    return true;
}

bool ParseKey(const std::string& text, std::uint32_t& usage)
{
    long long code = 0;
    if (!text.empty() && std::isdigit(static_cast<unsigned char>(text[0])) &&
        ParseNumber(text, 0, 0xFFFFFFFFLL, code)) {
        usage = static_cast<std::uint32_t>(code);
        return true;
    }
    std::string name = Normalize(text);
    std::string lower;
    for (const char c : text)
        lower += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    for (const Alias& a : ALIASES)
        if (lower == a.name)
            name = a.label;
    for (int i = 0; i < RAYTAC_KEY_COUNT; ++i)
        if (Normalize(RaytacKeyMap[i].label) == name) {
            usage = RaytacKeyMap[i].code;
            return true;
        }
    return false;
}

std::string KeyName(std::uint32_t usage)
{
    char code[16];
    std::snprintf(code, sizeof code, "0x%08X", static_cast<unsigned>(usage));
    const RcKeyEntry* e = RaytacKeyFind(usage);
    return e != nullptr ? std::string(e->label) + " " + code : std::string("unmapped ") + code;
}

void ListKeys()
{
    for (int i = 0; i < RAYTAC_KEY_COUNT; ++i)
        std::printf("0x%08X  %s\n", static_cast<unsigned>(RaytacKeyMap[i].code),
                    RaytacKeyMap[i].label);
    for (const Alias& a : ALIASES)
        std::printf("alias %s = %s\n", a.name, a.label);
}

// Parses the script; false (with a message) on the first bad word.
bool ParseScript(const std::vector<std::string>& words, std::vector<Step>& steps)
{
    for (std::size_t i = 0; i < words.size(); ++i) {
        const std::string& w = words[i];
        const std::size_t left = words.size() - i - 1;
        Step s {};
        long long n = 0;
        const auto need = [&](std::size_t count) {
            if (left >= count)
                return true;
            std::fprintf(stderr, "remote-sim: %s needs %zu argument(s)\n", w.c_str(), count);
            return false;
        };
        const auto key = [&](const std::string& text) {
            if (ParseKey(text, s.usage))
                return true;
            std::fprintf(stderr, "remote-sim: unknown key: %s\n", text.c_str());
            return false;
        };
        const auto number = [&](const std::string& text, long long lo, long long hi) {
            if (ParseNumber(text, lo, hi, n))
                return true;
            std::fprintf(stderr, "remote-sim: %s: not a number from %lld to %lld: %s\n",
                         w.c_str(), lo, hi, text.c_str());
            return false;
        };
        if (w == "press" || w == "release" || w == "tap") {
            if (!need(1) || !key(words[++i]))
                return false;
            s.op = w == "tap" ? Op::Tap : Op::Event;
            s.value = w == "release" ? 0 : RAYTAC_PRESSED;
        } else if (w == "hold" || w == "event") {
            const bool hold = w == "hold";
            if (!need(2) || !key(words[i + 1]) ||
                !number(words[i + 2], hold ? 0 : INT32_MIN, hold ? 3600000 : INT32_MAX))
                return false;
            i += 2;
            s.op = hold ? Op::Hold : Op::Event;
            s.value = static_cast<std::int32_t>(n);
        } else if (w == "sleep") {
            if (!need(1) || !number(words[++i], 0, 3600000))
                return false;
            s.op = Op::Sleep;
            s.value = static_cast<std::int32_t>(n);
        } else if (w == "raw-size") {
            if (!need(1) || !number(words[++i], 1, RAW_SIZE_MAX))
                return false;
            s.op = Op::Raw;
            s.value = static_cast<std::int32_t>(n);
            s.usage = PLAY_USAGE;
            // The key is optional: take the next word only when it names one.
            if (left >= 2 && ParseKey(words[i + 1], s.usage))
                ++i;
        } else {
            std::fprintf(stderr, "remote-sim: unknown step: %s\n", w.c_str());
            return false;
        }
        steps.push_back(s);
    }
    return true;
}

// Writes bytes in one piece after the previous write has been read, and
// says so on standard output (or why not on standard error).
bool Write(const ReceiverFifo& fifo, const void* bytes, std::size_t size, const std::string& what)
{
    // A gadget's reader cannot be seen from here: leave it a moment instead.
    if (gadgetFd >= 0)
        std::this_thread::sleep_for(std::chrono::milliseconds(GADGET_GAP_MS));
    const long n = gadgetFd >= 0 ? static_cast<long>(write(gadgetFd, bytes, size))
                                 : fifo.Write(bytes, size);
    if (n == static_cast<long>(size)) {
        std::printf("sent %s\n", what.c_str());
        std::fflush(stdout);
        return true;
    }
    std::fprintf(stderr, "remote-sim: %s not written: %s\n", what.c_str(),
                 n < 0 ? (errno == EPIPE ? "nobody reads the device" : std::strerror(errno))
                       : "cut short");
    return false;
}

bool Report(const ReceiverFifo& fifo, std::uint32_t usage, std::int32_t value)
{
    const RaytacReport r = ReceiverReport(usage, value);
    const char* verb = value == RAYTAC_PRESSED ? "press" : value == 0 ? "release" : "event";
    std::string what = std::string(verb) + " " + KeyName(usage);
    if (value != RAYTAC_PRESSED && value != 0)
        what += " value " + std::to_string(value);
    if (gadgetFd < 0)
        return Write(fifo, &r, sizeof r, what);
    if (usage < GADGET_FIRST_KEY || usage > GADGET_LAST_KEY) {
        std::fprintf(stderr, "remote-sim: the gadget cannot send %s\n", KeyName(usage).c_str());
        return false;
    }
    const unsigned char report[2] = {0, static_cast<unsigned char>(value == RAYTAC_PRESSED ? usage & 0xFF : 0)};
    return Write(fifo, report, sizeof report, what);
}

void SleepMs(std::int32_t ms) { std::this_thread::sleep_for(std::chrono::milliseconds(ms)); }

bool Run(const ReceiverFifo& fifo, const Step& s)
{
    switch (s.op) {
    case Op::Event:
        return Report(fifo, s.usage, s.value);
    case Op::Tap: {
        const bool pressed = Report(fifo, s.usage, RAYTAC_PRESSED);
        return Report(fifo, s.usage, 0) && pressed;
    }
    case Op::Hold: {
        const bool pressed = Report(fifo, s.usage, RAYTAC_PRESSED);
        SleepMs(s.value);
        return Report(fifo, s.usage, 0) && pressed;
    }
    case Op::Sleep:
        SleepMs(s.value);
        return true;
    case Op::Raw: {
        if (gadgetFd >= 0) {
            std::fprintf(stderr, "remote-sim: raw-size needs a FIFO\n");
            return false;
        }
        const RaytacReport r = ReceiverReport(s.usage, RAYTAC_PRESSED);
        std::vector<unsigned char> bytes(static_cast<std::size_t>(s.value));
        for (std::size_t i = 0; i < bytes.size(); ++i)
            bytes[i] = reinterpret_cast<const unsigned char*>(&r)[i % sizeof r];
        return Write(fifo, bytes.data(), bytes.size(),
                     "raw " + std::to_string(s.value) + " bytes of " + KeyName(s.usage));
    }
    }
    return false;
}

// Keeps the writer open until SIGTERM or SIGINT, which end the program normally.
bool Stay()
{
    if (!QuitInstall()) {
        std::fprintf(stderr, "remote-sim: signals: %s\n", std::strerror(errno));
        return false;
    }
    pollfd quit {QuitFd(), POLLIN, 0};
    while (poll(&quit, 1, -1) != 1)
        continue;
    return true;
}

}  // namespace

int main(int argc, char** argv)
{
    std::string device = RC_RAYTAC_DEVICE_PATH;
    bool stay = false;
    bool gadget = false;
    long long drainMs = 5000;
    std::vector<std::string> words;
    for (int i = 1; i < argc; ++i) {
        const std::string arg = argv[i];
        if (arg == "--help" || arg == "-h") {
            std::printf(USAGE, argv[0], RC_RAYTAC_DEVICE_PATH);
            return 0;
        }
        if (arg == "keys") {
            ListKeys();
            return 0;
        }
        if (arg == "--stay") {
            stay = true;
        } else if ((arg == "--device" || arg == "--gadget") && i + 1 < argc) {
            gadget = arg == "--gadget";
            device = argv[++i];
        } else if (arg == "--drain-ms" && i + 1 < argc) {
            if (!ParseNumber(argv[++i], 0, 600000, drainMs)) {
                std::fprintf(stderr, USAGE, argv[0], RC_RAYTAC_DEVICE_PATH);
                return 2;
            }
        } else {
            words.push_back(arg);
        }
    }
    std::vector<Step> steps;
    if (!ParseScript(words, steps)) {
        std::fprintf(stderr, USAGE, argv[0], RC_RAYTAC_DEVICE_PATH);
        return 2;
    }

    // A reader that goes away makes writes fail with EPIPE, not kill us.
    signal(SIGPIPE, SIG_IGN);
    ReceiverFifo fifo(static_cast<int>(drainMs));
    std::string error;
    if (gadget) {
        gadgetFd = open(device.c_str(), O_WRONLY | O_CLOEXEC);
        if (gadgetFd < 0)
            error = "open " + device + ": " + std::strerror(errno);
    }
    if (gadget ? gadgetFd < 0 : !fifo.Open(device, &error)) {
        std::fprintf(stderr, "remote-sim: %s\n", error.c_str());
        return 1;
    }
    std::printf("ready %s\n", device.c_str());
    std::fflush(stdout);

    bool ok = true;
    for (const Step& s : steps)
        ok = Run(fifo, s) && ok;
    fifo.Drain();
    if (stay && !Stay())
        return 1;
    return ok ? 0 : 1;
}
