// Independent models of the text rules of the audio configuration store and
// the equalizer profile files, written from their documented rules (not from
// the code), for the fuzz targets to hold the real parsers against.
#pragma once

#include <string>

namespace fz {

// White space of the C locale, as the system library trims it.
inline bool IsTrimSpace(char c)
{
    return c == ' ' || c == '\t' || c == '\n' || c == '\r' || c == '\v' || c == '\f';
}

inline std::string Trimmed(const std::string& s)
{
    std::size_t b = 0;
    std::size_t e = s.size();
    while (b < e && IsTrimSpace(s[b]))
        ++b;
    while (e > b && IsTrimSpace(s[e - 1]))
        --e;
    return s.substr(b, e - b);
}

// Text as C sees it: up to the first zero byte.
inline std::string CText(const std::string& s)
{
    return s.substr(0, s.find('\0'));
}

// The configuration store: key=value lines, '#' keys are comments, the last
// line of a key counts, a line of more than 1023 characters for the key is an
// error, a value wrapped in one kind of quote keeps what lies between them.
// Returns what VEXOAudioConfGet must return for a file of this content.
inline int ConfModel(const std::string& file, const std::string& key, int size, std::string* out)
{
    if (key.empty() || size < 1)
        return -1;
    int state = 0;
    std::string value;
    std::size_t pos = 0;
    while (pos < file.size()) {
        std::size_t nl = file.find('\n', pos);
        const bool last = nl == std::string::npos;
        if (last)
            nl = file.size();
        const std::string line = file.substr(pos, nl - pos);
        pos = nl + 1;
        const bool tooLong = line.size() > 1023;
        const std::string text = CText(line.substr(0, 1023));
        const std::size_t eq = text.find('=');
        if (eq == std::string::npos)
            continue;
        const std::string k = Trimmed(text.substr(0, eq));
        if ((!k.empty() && k[0] == '#') || k != key)
            continue;
        if (tooLong) {
            state = -1;
            continue;
        }
        std::string v = Trimmed(text.substr(eq + 1));
        if (v.size() >= 2 && (v[0] == '"' || v[0] == '\'') && v.back() == v[0])
            v = v.substr(1, v.size() - 2);
        value = v;
        state = 1;
    }
    if (state <= 0)
        return state;
    if (value.size() >= static_cast<std::size_t>(size))
        return -1;
    *out = value;
    return 1;
}

// A profile file: pieces of at most 1023 characters up to and including a
// newline; each must hold a ':'; its last ':' splits name from value; the
// first piece whose name is the requested name or a prefix of it answers,
// with its value cut to outSize - 1 characters and trimmed.
// Returns what AudioEqLookupProfile must return for an existing file.
inline int ProfileModel(const std::string& file, const std::string& name, int outSize,
                        std::string* out)
{
    std::size_t pos = 0;
    while (pos < file.size()) {
        std::size_t n = 0;
        while (pos + n < file.size() && n < 1023) {
            ++n;
            if (file[pos + n - 1] == '\n')
                break;
        }
        const std::string text = CText(file.substr(pos, n));
        pos += n;
        const std::size_t colon = text.rfind(':');
        if (colon == std::string::npos)
            return -1;
        if (name.size() < colon || name.compare(0, colon, text, 0, colon) != 0)
            continue;
        std::string value = text.substr(colon + 1);
        value = value.substr(0, static_cast<std::size_t>(outSize) - 1);
        *out = Trimmed(value);
        return 1;
    }
    return 0;
}

}  // namespace fz
