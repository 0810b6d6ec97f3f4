// The equalizer profile files under the audio player's package, which the
// appliance's users edit: any content, searched with any name and any size of
// result buffer; and the default profile resolved through the configuration
// store, the system file and the user file, each present or not. Checked
// against the documented rules of the profile files.
//
// Input: a byte that picks the road and the buffer size, then length-prefixed
// parts: the name and the file (first road), or the configuration, the
// system file and the user file, each of which may be missing (second road).
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "audioctl/ctrl.hpp"
#include "fuzz_util.hpp"
#include "models.hpp"
#include "vlibc/audioconf.hpp"

namespace {

constexpr char kScratch[] = "/tmp/equalizer.profile";
constexpr unsigned char kUntouched = 0x5A;

// A part of the input: two bytes of length, then the bytes. A length with the
// top bit set stands for a file that does not exist.
bool Part(fz::Reader& in, std::string* text)
{
    const std::size_t len = static_cast<std::size_t>(in.Byte()) << 8 | in.Byte();
    std::size_t n = len & 0x7FFF;
    const std::uint8_t* bytes = in.Take(n, &n);
    text->assign(reinterpret_cast<const char*>(bytes), n);
    return (len & 0x8000) == 0;
}

void Place(const char* path, const std::string& text, bool present)
{
    if (present)
        fz::WriteWholeFile(path, reinterpret_cast<const std::uint8_t*>(text.data()), text.size());
    else
        unlink(path);
}

void CheckOut(const char* out, std::size_t size, int result, const std::string& want)
{
    if (result == 1) {
        if (want != out)
            fz::Fail("profile value differs from the file rules");
        return;
    }
    for (std::size_t i = 0; i < size; ++i)
        if (static_cast<unsigned char>(out[i]) != kUntouched)
            fz::Fail("the result buffer was written although nothing matched");
}

void Lookup(fz::Reader& in, int outSize)
{
    std::string name;
    std::string file;
    Part(in, &name);
    name = fz::CText(name);
    Part(in, &file);
    fz::WriteWholeFile(kScratch, reinterpret_cast<const std::uint8_t*>(file.data()), file.size());
    char out[1100];
    std::memset(out, kUntouched, sizeof out);
    std::string want;
    const int expected = fz::ProfileModel(file, name, outSize, &want);
    const int got = AudioEqLookupProfile(kScratch, name.c_str(), out, outSize);
    if (got != expected)
        fz::Fail("profile search result differs from the file rules");
    CheckOut(out, sizeof out, got, want);
}

void Default(fz::Reader& in, int outSize)
{
    std::string conf, system, user;
    const bool haveConf = Part(in, &conf);
    const bool haveSystem = Part(in, &system);
    const bool haveUser = Part(in, &user);
    Place(VEXO_AUDIO_CONF_PATH, conf, haveConf);
    Place(AUDIO_EQ_SYSTEM_FILE, system, haveSystem);
    Place(AUDIO_EQ_USER_FILE, user, haveUser);

    // The equalizer is on only for exactly "yes"; the name is used as it is.
    std::string enabled, name, want;
    int expected = 0;
    if (haveConf && fz::ConfModel(conf, AUDIO_CONF_EQ_ENABLE, 1024, &enabled) == 1 &&
        enabled == "yes" && fz::ConfModel(conf, AUDIO_CONF_EQ_DEFAULT, 1024, &name) == 1) {
        expected = haveSystem ? fz::ProfileModel(system, name, outSize, &want) : -1;
        if (expected == 0)
            expected = haveUser ? fz::ProfileModel(user, name, outSize, &want) : -1;
    }
    char out[1100];
    std::memset(out, kUntouched, sizeof out);
    const int got = AudioEqGetDefault(out, outSize);
    if (got != expected)
        fz::Fail("default profile result differs from the rules");
    CheckOut(out, sizeof out, got, want);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***)
{
    fz::RequireSandbox();
    for (const char* dir : {"/var/lib", "/var/lib/vexora", "/var/packages", "/var/packages/Sonarium",
                            "/var/packages/Sonarium/target", "/var/packages/Sonarium/target/etc",
                            "/var/packages/Sonarium/etc"})
        mkdir(dir, 0755);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    fz::Reader in(data, size);
    const std::uint8_t pick = in.Byte();
    // Mostly a buffer as large as a line, sometimes one that cuts the value.
    const int outSize = (pick & 0x40) != 0 ? 1 + (pick & 0x1F) : 1024;
    if ((pick & 0x80) == 0)
        Lookup(in, outSize);
    else
        Default(in, outSize);
    return 0;
}
