// The files people edit: the equalizer profiles, the audio configuration
// store and the pid file, with any content, read with any name or key and
// size of buffer; and the default profile, through the store, the system file
// and the user file, each present or not. A buffer is written only when a
// lookup succeeds, and then with a value from the file that fits it (a
// profile's trimmed); a pid read is one that stands in the file.
// Input: a byte that picks the road and the buffer size, then parts of two
// bytes of length (top bit: the file is missing) and the bytes: a name and a
// file, or the configuration, the system file and the user file.
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>

#include "audioctl/ctrl.hpp"
#include "fuzz_util.hpp"
#include "vlibc/audioconf.hpp"
#include "vlibc/vlibc.hpp"

namespace {

// The next part written to path, or path removed when the part stands for a missing file.
std::string Part(const std::uint8_t*& data, const std::uint8_t* end, const char* path)
{
    std::size_t len = 0;
    for (int i = 0; i < 2; ++i)
        len = len << 8 | (data < end ? *data++ : 0);
    const std::string text(reinterpret_cast<const char*>(data), std::min(len & 0x7FFF, static_cast<std::size_t>(end - data)));
    data += text.size();
    if (len & 0x8000)
        unlink(path);
    else
        std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
    return text;
}

// Checks a lookup's result and its buffer, all 'Z' before the call.
void CheckOut(int got, char (&out)[1100], int outSize, const std::string& files, bool trimmed = true)
{
    const std::string value = got == 1 ? out : "";
    const auto space = [](char c) { return c != '\0' && std::strchr(" \t\n\r\v\f", c) != nullptr; };
    fz::Check(got >= -1 && got <= 1 && files.find(value) != std::string::npos, "a result that is not in the file");
    fz::Check(std::all_of(out + (got == 1 ? outSize : 0), std::end(out), [](char c) { return c == 'Z'; }) &&
                  value.size() < static_cast<std::size_t>(outSize), "a buffer written beyond the value");
    fz::Check(!trimmed || value.empty() || (!space(value.front()) && !space(value.back())), "a value not trimmed");
    std::memset(out, 'Z', sizeof out);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    for (const char* dir : {"/var/lib", "/var/lib/vexora", "/var/packages", "/var/packages/Sonarium", "/var/packages/Sonarium/etc",
                            "/var/packages/Sonarium/target", "/var/packages/Sonarium/target/etc"})
        mkdir(dir, 0755);
    const std::uint8_t* end = data + size;
    const std::uint8_t pick = size > 0 ? *data++ : 0;
    const int outSize = (pick & 0x40) != 0 ? 1 + (pick & 0x1F) : 1024;  // sometimes one that cuts the value
    char out[1100];
    std::memset(out, 'Z', sizeof out);
    if ((pick & 0x80) != 0) {
        std::string files = Part(data, end, VEXO_AUDIO_CONF_PATH);
        files += '\n' + Part(data, end, AUDIO_EQ_SYSTEM_FILE) + '\n' + Part(data, end, AUDIO_EQ_USER_FILE);
        CheckOut(AudioEqGetDefault(out, outSize), out, outSize, files);
        return 0;
    }
    const std::string name = Part(data, end, "/tmp/name").c_str(), file = Part(data, end, "/tmp/profiles");
    CheckOut(AudioEqLookupProfile("/tmp/profiles", name.c_str(), out, outSize), out, outSize, file);
    // The same text as the configuration store (a quoted value keeps its white space) and as a pid file.
    std::ofstream(VEXO_AUDIO_CONF_PATH, std::ios::binary | std::ios::trunc) << file;
    CheckOut(VEXOAudioConfGet(name.c_str(), out, outSize), out, outSize, file, false);
    std::ofstream(RC_PID_FILE, std::ios::binary | std::ios::trunc) << file;
    const int pid = VLIBCReadPidFile(RC_PID_FILE);
    fz::Check(pid == 0 || (pid > 0 && file.find(std::to_string(pid)) != std::string::npos), "a pid not in the file");
    return 0;
}
