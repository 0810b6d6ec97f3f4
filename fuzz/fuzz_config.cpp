// The audio configuration store "/var/lib/vexora/audio.conf", a text file
// that the appliance's scripts and its users edit: any content, looked up
// with the equalizer's keys and with a key and buffer size the input
// chooses, checked against the store's documented rules. The trimming helper
// the store and the profile search share is checked on the same bytes.
//
// Input: a byte for the buffer size, a key up to the first newline, then the
// file's content.
#include <sys/stat.h>

#include <string>

#include "fuzz_util.hpp"
#include "models.hpp"
#include "vlibc/audioconf.hpp"
#include "vlibc/vlibc.hpp"

namespace {

void CheckKey(const std::string& file, const std::string& key, int size)
{
    char buffer[VEXO_AUDIO_CONF_VALUE_MAX + 1];
    std::memset(buffer, 0x5A, sizeof buffer);
    std::string want;
    const int expected = fz::ConfModel(file, key, size, &want);
    const int got = VEXOAudioConfGet(key.c_str(), buffer, size);
    if (got != expected)
        fz::Fail("configuration lookup result differs from the store's rules");
    if (got == 1) {
        if (want != buffer)
            fz::Fail("configuration value differs from the store's rules");
    } else {
        for (char c : buffer)
            if (c != 0x5A)
                fz::Fail("the buffer was written although no value was found");
    }
}

void CheckTrim(const std::uint8_t* data, std::size_t size)
{
    std::string text(reinterpret_cast<const char*>(data), size < 2048 ? size : 2048);
    text = fz::CText(text);
    std::string buffer = text;
    const int n = VLIBCStrTrimSpace(buffer.data(), 0);
    const std::string want = fz::Trimmed(text);
    if (n != static_cast<int>(want.size()) || fz::CText(buffer) != want)
        fz::Fail("trimming differs from C-locale white space at both ends");
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***)
{
    fz::RequireSandbox();
    mkdir("/var/lib", 0755);
    mkdir("/var/lib/vexora", 0755);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    fz::Reader in(data, size);
    const std::uint8_t sizeByte = in.Byte();
    // Mostly the client's own 1024 bytes, sometimes a small buffer.
    const int bufferSize = sizeByte >= 64 ? VEXO_AUDIO_CONF_VALUE_MAX : sizeByte % 16;
    std::string key;
    while (!in.Empty() && key.size() < 64) {
        const char c = static_cast<char>(in.Byte());
        if (c == '\n')
            break;
        key += c;
    }
    key = fz::CText(key);
    std::size_t n = in.Left();
    const std::uint8_t* content = in.Take(n, &n);
    const std::string file(reinterpret_cast<const char*>(content), n);
    fz::WriteWholeFile(VEXO_AUDIO_CONF_PATH, content, n);

    CheckKey(file, "audio_enable_equalizer", VEXO_AUDIO_CONF_VALUE_MAX);
    CheckKey(file, "audio_default_equalizer", bufferSize);
    CheckKey(file, key, bufferSize);
    CheckTrim(data, size);
    return 0;
}
