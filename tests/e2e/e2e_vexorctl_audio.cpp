// vexorctl's audio side: catalogue commands in every argument form and the
// equalizer commands, straight to a stand-in audio daemon, byte-exact; the
// default profile resolved from a configuration and profile files written
// into the sandbox; failures and usage errors with their exit statuses.
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "audio_peer.hpp"
#include "harness.hpp"

namespace {

constexpr char kConf[] = "/var/lib/vexora/audio.conf";
constexpr char kSystem[] = "/var/packages/Sonarium/target/etc/equalizer.system";
constexpr char kUser[] = "/var/packages/Sonarium/etc/equalizer.user";
constexpr std::size_t kRecordSize = 7872;

struct Result {
    int status;
    std::string out;  // standard output and error
};

Result Ctl(std::vector<std::string> args)
{
    Result r {};
    r.status = vt::Vexorctl(std::move(args), &r.out);
    return r;
}

bool Has(const Result& r, const std::string& text)
{
    return r.out.find(text) != std::string::npos;
}

// Runs vexorctl; it must end with status and say text.
void Expect(const std::vector<std::string>& args, int status, const std::string& text)
{
    const Result r = Ctl(args);
    EXPECT_EQ(r.status, status) << args.back() << ": " << r.out;
    EXPECT_TRUE(Has(r, text)) << text << " not in: " << r.out;
}

// A playlist record whose every byte tells its offset apart from its neighbours'.
std::string RecordFile(const std::string& path, std::size_t size = kRecordSize)
{
    std::string bytes(size, '\0');
    for (std::size_t i = 0; i < size; ++i)
        bytes[i] = static_cast<char>((i * 7 + i / 256 + 3) & 0xff);
    vt::WriteFile(path, bytes);
    return bytes;
}

std::string ArgBytes(const vt::AudioCommand& c, std::size_t n)
{
    return std::string(c.arg.begin(), c.arg.begin() + static_cast<std::ptrdiff_t>(n));
}

TEST(VexorctlAudio, EveryArgumentFormReachesTheAudioDaemonByteExact)
{
    vt::SyslogSink log;
    vt::AudioPeer peer;

    // By name in any spelling and by code; none, decimal, lowest integer.
    const Result play = Ctl({"audio", "play"});
    EXPECT_EQ(play.status, 0) << play.out;
    EXPECT_EQ(play.out, "");  // success is silent
    EXPECT_EQ(Ctl({"audio", "AUDIO_CMD_8", "-5"}).status, 0);
    EXPECT_EQ(Ctl({"audio", "Custom_Held", "-2147483648"}).status, 0);
    EXPECT_EQ(Ctl({"audio", "21", "0"}).status, 0);

    // A record, and the record with its integer: the file is sent as it
    // stands, the integer lands at record offset 6832 in this machine's order.
    const std::string record = RecordFile("/tmp/rec");
    EXPECT_EQ(Ctl({"audio", "20", "/tmp/rec"}).status, 0);
    EXPECT_EQ(Ctl({"audio", "audio-cmd-23", "/tmp/rec", "305419896"}).status, 0);
    EXPECT_EQ(vt::ReadFile("/tmp/rec"), record);  // the file itself is left alone

    // Band values, by the eq command and by code 35.
    EXPECT_EQ(Ctl({"eq", "set", "0", "1.5", "-2", "12", "-0.3", "7", "100", "-12.5", "2.26", "1e1"}).status,
              0);
    EXPECT_EQ(Ctl({"audio", "set-eq", "0", "0", "0", "0", "0", "0", "0", "0", "0", "0.04"}).status, 0);

    const Result loud = Ctl({"-v", "audio", "stop"});
    EXPECT_EQ(loud.status, 0);
    EXPECT_EQ(loud.out, "AUDIO_CMD_STOP (5): taken by the audio daemon\n");

    ASSERT_TRUE(peer.WaitForCount(9));
    const auto c = peer.Commands();
    ASSERT_EQ(c.size(), 9u);
    for (const auto& cmd : c)
        EXPECT_EQ(cmd.bytes, 8196u);
    EXPECT_EQ(c[0].code, 4);
    EXPECT_TRUE(c[0].ZeroFrom(0));
    EXPECT_EQ(c[1].code, 8);
    EXPECT_EQ(c[1].ArgText(), "-5");
    EXPECT_TRUE(c[1].ZeroFrom(3));
    EXPECT_EQ(c[2].code, 36);
    EXPECT_EQ(c[2].ArgText(), "-2147483648");
    EXPECT_TRUE(c[2].ZeroFrom(12));
    EXPECT_EQ(c[3].code, 21);
    EXPECT_EQ(c[3].ArgText(), "0");

    EXPECT_EQ(c[4].code, 20);
    EXPECT_EQ(ArgBytes(c[4], kRecordSize), record);
    EXPECT_TRUE(c[4].ZeroFrom(kRecordSize));
    EXPECT_EQ(c[5].code, 23);
    std::string withN = record;
    const std::int32_t n = 305419896;
    std::memcpy(withN.data() + 6832, &n, sizeof n);
    EXPECT_EQ(ArgBytes(c[5], kRecordSize), withN);
    EXPECT_TRUE(c[5].ZeroFrom(kRecordSize));

    EXPECT_EQ(c[6].code, 35);
    EXPECT_EQ(c[6].ArgText(), "0.0 1.5 -2.0 12.0 -0.3 7.0 100.0 -12.5 2.3 10.0");
    EXPECT_TRUE(c[6].ZeroFrom(c[6].ArgText().size()));
    EXPECT_EQ(c[7].code, 35);
    EXPECT_EQ(c[7].ArgText(), "0.0 0.0 0.0 0.0 0.0 0.0 0.0 0.0 0.0 0.0");
    EXPECT_EQ(c[8].code, 5);
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST(VexorctlAudio, TheDefaultProfileIsShownAndAppliedOrTheReasonGiven)
{
    vt::SyslogSink log;
    vt::AudioPeer peer;
    for (const char* file : {kConf, kSystem, kUser})
        vt::MakeParentDirs(file);
    const auto conf = [](const std::string& enable, const std::string& name) {
        vt::WriteFile(kConf, (enable.empty() ? "" : "audio_enable_equalizer=" + enable + "\n") +
                                 (name.empty() ? "" : "audio_default_equalizer=" + name + "\n"));
    };

    // Off, or a key missing: each has its own reason; nothing is logged.
    Expect({"eq", "show"}, 1, "the equalizer is off: audio_enable_equalizer is not set");
    conf("Yes", "Rock Live");
    Expect({"eq", "show"}, 1, "the equalizer is off: audio_enable_equalizer is \"Yes\", not \"yes\"");
    conf("yes", "");
    Expect({"eq", "apply"}, 1, "no default equalizer profile: audio_default_equalizer is not set");
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();

    // No system file: the search fails, and the library logs it.
    conf("yes", "Rock Live");
    Expect({"eq", "show"}, 1, std::string("cannot search the equalizer profiles: ") + kSystem +
                                  ": No such file or directory");
    EXPECT_TRUE(log.WaitFor("ctrl.cpp:603 Failed to open the system EQ profile")) << log.Dump();

    // Rock answers Rock Live; the value alone goes to stdout, and apply sends it.
    vt::WriteFile(kSystem, "Jazz:1 1 1 1 1 1 1 1 1 1\nRock:  0 1.5\t-2 12 0 0 0 0 -1 -1 \nPop\n");
    Result r = Ctl({"eq", "show"});
    EXPECT_EQ(r.status, 0);
    EXPECT_EQ(r.out, "0 1.5\t-2 12 0 0 0 0 -1 -1\n");
    EXPECT_EQ(Ctl({"eq", "apply"}).status, 0);
    ASSERT_TRUE(peer.WaitForCount(1));
    EXPECT_EQ(peer.Commands()[0].ArgText(), "0.0 1.5 -2.0 12.0 0.0 0.0 0.0 0.0 -1.0 -1.0");

    // Only in the user file (the system file has no illegal line before its
    // end then), a value that is not ten numbers, and a profile in neither.
    vt::WriteFile(kSystem, "Jazz:1 1 1 1 1 1 1 1 1 1\n");
    vt::WriteFile(kUser, "Pop:loud\nEleven:1 2 3 4 5 6 7 8 9 10 11\n");
    conf("yes", "Pop");
    r = Ctl({"eq", "show"});
    EXPECT_EQ(r.status, 0);
    EXPECT_EQ(r.out, "loud\n");
    for (const char* name : {"Pop", "Eleven"}) {
        conf("yes", name);
        Expect({"eq", "apply"}, 1, "is not ten numbers separated by white space; nothing was sent");
    }
    conf("yes", "Classic");
    Expect({"eq", "show"}, 1, "the equalizer profile \"Classic\" is in neither");

    // Without a user file the library takes it for a failed search, not for
    // a missing profile; an illegal line ahead of the profile is one too.
    unlink(kUser);
    Expect({"eq", "show"}, 1, std::string(kUser) + ": No such file or directory, and the profile is not in");
    vt::WriteFile(kUser, "");
    vt::WriteFile(kSystem, "\nClassic:1 2 3 4 5 6 7 8 9 10\n");
    Expect({"eq", "apply"}, 1, "a profile file holds a line without ':'");
    EXPECT_EQ(peer.Codes().size(), 1u);
}

TEST(VexorctlAudio, FailuresExitOneAndUsageErrorsTwoWithNothingSent)
{
    vt::SyslogSink log;

    // No audio daemon: each exchange fails, and the library says why.
    for (const std::vector<std::string>& cmd : {std::vector<std::string>{"audio", "play"},
                                                {"eq", "set", "1", "2", "3", "4", "5", "6", "7", "8", "9", "10"}})
        Expect(cmd, 1, "the audio daemon did not take the command");
    const char* noPeer =
        "ctrl.cpp:27 Failed to connect to /tmp/vexoaudiod.sock. [No such file or directory]";
    EXPECT_TRUE(vt::WaitUntil([&] { return log.Count(noPeer) == 2; }, 5000)) << log.Dump();

    // The library refuses a negative argument of code 21 before connecting.
    vt::AudioPeer peer;
    log.Clear();
    Expect({"audio", "21", "-1"}, 1, "refuses the argument -1; nothing was sent");
    ASSERT_TRUE(log.WaitFor("playlist.cpp:55 Bad parameter"));
    EXPECT_EQ(log.Lines().size(), 1u) << log.Dump();

    // Usage errors: exit 2, nothing sent, nothing logged.
    log.Clear();
    RecordFile("/tmp/short", kRecordSize - 1);
    RecordFile("/tmp/long", kRecordSize + 1);
    RecordFile("/tmp/rec");
    mkdir("/tmp/dir", 0755);
    const std::vector<std::string> setNine {"eq", "set", "1", "1", "1", "1", "1", "1", "1", "1", "1"};
    std::vector<std::string> setEleven = setNine;
    setEleven.insert(setEleven.end(), {"1", "1"});
    std::vector<std::vector<std::string>> bad {
        {"audio"}, {"audio", "bogus"}, {"audio", "14"}, {"audio", "37"}, {"audio", "0"},
        {"audio", "play", "1"}, {"audio", "8"}, {"audio", "8", "2147483648"}, {"audio", "8", "5x"},
        {"audio", "8", " 5"}, {"audio", "20"}, {"audio", "20", "/tmp/short"}, {"audio", "20", "/tmp/long"},
        {"audio", "20", "/tmp/none"}, {"audio", "20", "/tmp/dir"}, {"audio", "23", "/tmp/rec"},
        {"audio", "23", "/tmp/rec", "x"}, {"audio", "list", "x"}, {"eq"}, {"eq", "bogus"},
        {"eq", "show", "x"}, setNine, setEleven, {"-v"}};
    for (const char* notFinite : {"nan", "inf", "1e39", "", "1,5"}) {
        bad.push_back(setNine);
        bad.back().push_back(notFinite);
    }
    for (const auto& args : bad) {
        const Result r = Ctl(args);
        std::string line;
        for (const auto& a : args)
            line += a + " ";
        EXPECT_EQ(r.status, 2) << line << "\n" << r.out;
        EXPECT_FALSE(r.out.empty()) << line;
    }
    EXPECT_TRUE(peer.Codes().empty());
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();

    // The catalogue: every code once with its form, the same either way.
    const Result list = Ctl({"audio", "list"});
    EXPECT_EQ(list.status, 0);
    EXPECT_EQ(std::count(list.out.begin(), list.out.end(), '\n'), 29);
    EXPECT_TRUE(Has(list, "\n  4  AUDIO_CMD_PLAY            none\n")) << list.out;
    EXPECT_TRUE(Has(list, "\n 23  AUDIO_CMD_23              record+integer  FILE N\n")) << list.out;
    EXPECT_EQ(Ctl({"audio", "--list"}).out, list.out);
}

}  // namespace
