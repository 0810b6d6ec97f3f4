// The equalizer profile files, which users edit: any content, searched with
// any name and size of buffer; and the default profile, through the audio
// configuration, the system file and the user file, each present or not. The
// buffer is written only on a match, and then with a trimmed value of one of
// the files that fits it.
// Input: a byte that picks the road and the buffer size, then parts of two
// bytes of length (top bit: the file is missing) and the bytes: a name and a
// file, or the configuration, the system file and the user file.
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>

#include "audioctl/ctrl.hpp"
#include "fuzz_util.hpp"
#include "vlibc/audioconf.hpp"

// The next part, written to path (or path removed when it stands for a missing file).
static std::string Part(const std::uint8_t*& data, const std::uint8_t* end, const char* path)
{
    std::size_t len = 0;
    for (int i = 0; i < 2; ++i)
        len = len << 8 | (data < end ? *data++ : 0);
    const std::string text(reinterpret_cast<const char*>(data), std::min(len & 0x7FFF, std::size_t(end - data)));
    data += text.size();
    if (len & 0x8000)
        unlink(path);
    else
        std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
    return text;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    for (const char* dir : {"/var/lib", "/var/lib/vexora", "/var/packages", "/var/packages/Sonarium",
                            "/var/packages/Sonarium/etc", "/var/packages/Sonarium/target",
                            "/var/packages/Sonarium/target/etc"})
        mkdir(dir, 0755);
    const std::uint8_t* end = data + size;
    const std::uint8_t pick = size > 0 ? *data++ : 0;
    const int outSize = (pick & 0x40) != 0 ? 1 + (pick & 0x1F) : 1024;  // sometimes one that cuts the value
    char out[1100];
    std::memset(out, 'Z', sizeof out);
    std::string files;
    int got = 0;
    if ((pick & 0x80) != 0) {
        Part(data, end, VEXO_AUDIO_CONF_PATH);
        files = Part(data, end, AUDIO_EQ_SYSTEM_FILE) + '\n' + Part(data, end, AUDIO_EQ_USER_FILE);
        got = AudioEqGetDefault(out, outSize);
    } else {
        const std::string name = Part(data, end, "/tmp/name").c_str();
        files = Part(data, end, "/tmp/profiles");
        got = AudioEqLookupProfile("/tmp/profiles", name.c_str(), out, outSize);
    }
    const std::string value = got == 1 ? out : "";
    const auto space = [](char c) { return c != '\0' && std::strchr(" \t\n\r\v\f", c) != nullptr; };
    fz::Check(got >= -1 && got <= 1 && files.find(value) != std::string::npos, "a value that is in no file");
    fz::Check(std::all_of(out + (got == 1 ? outSize : 0), std::end(out), [](char c) { return c == 'Z'; }) &&
                  value.size() < static_cast<std::size_t>(outSize), "a buffer written beyond the value");
    fz::Check(value.empty() || (!space(value.front()) && !space(value.back())), "a value not trimmed");
    return 0;
}
