// The audio configuration store of the system library stand-in.
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>

#include "harness.hpp"
#include "vlibc/audioconf.hpp"

namespace {

// "<result>value" for a key, the buffer as the call left it.
std::string Get(const char* key, int size = 1024)
{
    char buffer[1024] = "-";
    std::string got = std::to_string(VEXOAudioConfGet(key, buffer, size));
    got += buffer;
    return got;
}

TEST(AudioConf, LinesKeysQuotesAndWhiteSpace)
{
    vt::RequireSandbox();
    mkdir("/var/lib/vexora", 0755);
    EXPECT_EQ(Get("audio_enable_equalizer"), "0-");  // no file yet
    std::string conf = "# audio_enable_equalizer=no\n\n"
                       "  audio_enable_equalizer = yes \t\n"
                       "audio_default_equalizer=\" Rock Live \"\n"
                       "single='x y'\nlonequote=\"abc\ninner=a \"b\" c\nempty=\ncrlf=value\r\n"
                       "twice=first\ntwice=second\nequals=a=b\nnoequals\nCase=upper\nlong=";
    conf.append(1200, 'v').append("\nother=").append(1200, 'o').append("\nlast=no newline");
    vt::WriteFile(VEXO_AUDIO_CONF_PATH, conf);
    EXPECT_EQ(Get("audio_enable_equalizer"), "1yes");
    EXPECT_EQ(Get("audio_default_equalizer"), "1 Rock Live ");  // quotes keep the spaces
    EXPECT_EQ(Get("single"), "1x y");
    EXPECT_EQ(Get("lonequote"), "1\"abc");
    EXPECT_EQ(Get("inner"), "1a \"b\" c");
    EXPECT_EQ(Get("empty"), "1");
    EXPECT_EQ(Get("crlf"), "1value");
    EXPECT_EQ(Get("twice"), "1second");
    EXPECT_EQ(Get("equals"), "1a=b");
    EXPECT_EQ(Get("last"), "1no newline");  // after a long line that is skipped
    for (const char* missing : {"noequals", "case", "# audio_enable_equalizer", "audio", "x y"})
        EXPECT_EQ(Get(missing), "0-") << missing;
    // A value must fit the buffer with its zero byte, and a line 1023 characters.
    EXPECT_EQ(Get("single", 4), "1x y");
    EXPECT_EQ(Get("single", 3), "-1-");
    EXPECT_EQ(Get("long"), "-1-");
    EXPECT_EQ(Get(""), "-1-");
    EXPECT_EQ(Get("single", 0), "-1-");
    vt::WriteFile(VEXO_AUDIO_CONF_PATH, std::string("k=").append(1021, 'v'));
    EXPECT_EQ(Get("k"), std::string("1").append(1021, 'v'));
}

}  // namespace
