// What the client and the daemon read from files people edit: the equalizer
// profiles, the audio configuration store, the pid file.
#include <sys/stat.h>

#include "audioctl/ctrl.hpp"
#include "harness.hpp"
#include "vlibc/audioconf.hpp"
#include "vlibc/vlibc.hpp"

namespace {

// Writes text at path (making its directories), or removes path when text is null.
void Place(const std::string& path, const char* text)
{
    for (auto slash = path.find('/', 1); slash != std::string::npos; slash = path.find('/', slash + 1))
        mkdir(path.substr(0, slash).c_str(), 0755);
    if (text != nullptr)
        vt::WriteFile(path, text);
    else
        unlink(path.c_str());
}

// "<result><out>" of a call that fills out, which starts as "-".
template <typename Call>
std::string Got(Call call)
{
    char out[1100] = "-";
    return std::to_string(call(out)) + out;
}

TEST(EqProfile, TheFirstLineWhoseNameBeginsTheRequestAnswersSplitAtItsLastColon)
{
    vt::Logged();
    const std::string rock = "Rock: 1 2 3 \nRock Live:4 5 6\nJazz:Club:7 8\n";
    const std::string piece = "Long:" + std::string(1018, 'a');  // lines are read in pieces of 1023
    for (const auto& [text, name, outSize, result] :
         {std::tuple {rock, "Rock Live", 64, "11 2 3"}, {rock, "Jazz:Club", 64, "17 8"}, {rock, "Jazz", 64, "0-"},
          {rock, "rock", 64, "0-"}, {"", "Rock", 64, "0-"}, {rock, "Rock", 4, "11"},  // cut to " 1 ", trimmed
          {"Rock:1\n\nPop:2\n", "Rock", 64, "11"},                                    // ends at the match
          {"Rock:1\nPop", "Pop", 64, "-1-"},  // a line without ':' ends it
          {piece + "Tail:b\n", "Tail", 64, "1b"}, {piece + "\nQ:y\n", "Q", 64, "-1-"}}) {
        Place("/tmp/profiles", text.c_str());
        EXPECT_EQ(Got([&](char* out) { return AudioEqLookupProfile("/tmp/profiles", name, out, outSize); }),
                  result) << name;
    }
    EXPECT_EQ(Got([](char* out) { return AudioEqLookupProfile("/tmp/none", "Rock", out, 8); }), "-1-");
    EXPECT_EQ(vt::Logged(), (std::vector<std::string> {"ctrl.cpp:546 The EQ profile [Pop] is illegal.",
                                                       "ctrl.cpp:546 The EQ profile [", "] is illegal."}));
}

TEST(EqProfile, TheDefaultNeedsExactlyYesAndComesFromTheSystemFileBeforeTheUsers)
{
    vt::Logged();
    const auto conf = [](const char* enable, const char* name) {
        return std::string("audio_enable_equalizer=") + enable + "\naudio_default_equalizer=" + name + "\n";
    };
    const std::string on = conf("yes", "Rock Live");
    using Row = std::tuple<std::string, const char*, const char*, const char*>;
    for (const auto& [text, system, user, result] : {  // null: the file is missing
             Row {conf("Yes", "Rock"), "R:s\n", "", "0-"},
             {conf("\"yes \"", "Rock"), "R:s\n", "", "0-"}, {"", "R:s\n", "", "0-"},
             {on, "Pop:1\nRock:system\n", "Rock:user\n", "1system"}, {on, "Pop:1\n", "Rock:user\n", "1user"},
             {on, "Pop:1\n", "", "0-"}, {on, "Pop:1\n", nullptr, "-1-"},  // silently
             {on, "Pop\nRock:system\n", "Rock:user\n", "-1-"}, {on, nullptr, "Rock:user\n", "-1-"}}) {
        Place(VEXO_AUDIO_CONF_PATH, text.c_str());
        Place(AUDIO_EQ_SYSTEM_FILE, system);
        Place(AUDIO_EQ_USER_FILE, user);
        EXPECT_EQ(Got([](char* out) { return AudioEqGetDefault(out, 256); }), result) << text;
    }
    const std::string failed = "ctrl.cpp:603 Failed to open the system EQ profile [" +
                               std::string(AUDIO_EQ_SYSTEM_FILE) + "].";
    EXPECT_EQ(vt::Logged(),
              (std::vector<std::string> {"ctrl.cpp:546 The EQ profile [Pop", "] is illegal.", failed, failed}));
}

TEST(Vlibc, TheConfigurationStoreThePidFileAndLiveness)
{
    const std::string store = "# on=no\n  on = yes \t\nname=\" Rock Live \"\nmixed=\"a'\ncrlf=value\r\nx=1\nx=2\n"
                              "equals=a=b\nCase=upper\nlong=" + std::string(1200, 'v') + "\nlast=no newline";
    Place(VEXO_AUDIO_CONF_PATH, store.c_str());
    for (const auto& [key, size, result] :
         {std::tuple {"on", 1024, "1yes"}, {"name", 1024, "1 Rock Live "}, {"mixed", 1024, "1\"a'"},
          {"crlf", 1024, "1value"}, {"x", 1024, "12"}, {"equals", 1024, "1a=b"}, {"last", 1024, "1no newline"},
          {"case", 1024, "0-"}, {"# on", 1024, "0-"}, {"on", 4, "1yes"}, {"on", 3, "-1-"}, {"long", 1024, "-1-"}})
        EXPECT_EQ(Got([&](char* out) { return VEXOAudioConfGet(key, out, size); }), result) << key << " " << size;
    for (const auto& [text, pid] : {std::pair {"1234", 1234}, {" 77 \n", 77}, {"2147483648", 0}, {"12ab", 0},
                                    {"-5", 0}, {"0", 0}, {"000000000000000000000000000000001", 0}}) {
        vt::WriteFile("/tmp/pid", text);
        EXPECT_EQ(VLIBCReadPidFile("/tmp/pid"), pid) << '"' << text << '"';
    }
    EXPECT_EQ(VLIBCProcAlive(getpid()), 1);
    for (const int pid : {4194305, 0, -1})  // above the kernel's limit, and process groups
        EXPECT_EQ(VLIBCProcAlive(pid), 0) << pid;
}

}  // namespace
