#include "vexorctl/ctl_names.hpp"

#include <cctype>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>

namespace {

// Case and '_' versus '-' do not matter in names typed by people.
char Fold(char c)
{
    return c == '_' ? '-' : static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
}

// A decimal code, or a hexadecimal bit pattern "0x..." of up to 32 bits.
bool ParseNumber(const char* text, RcAction& out)
{
    if (text[0] != '0' || (text[1] != 'x' && text[1] != 'X'))
        return CtlParseDecimal(text, out);
    const char* hex = text + 2;
    if (!std::isxdigit(static_cast<unsigned char>(*hex)))
        return false;
    char* end = nullptr;
    errno = 0;
    const unsigned long long v = std::strtoull(hex, &end, 16);
    if (errno != 0 || *end != '\0' || v > UINT32_MAX)
        return false;
    const std::uint32_t bits = static_cast<std::uint32_t>(v);
    std::memcpy(&out, &bits, sizeof out);
    return true;
}

}  // namespace

void CtlNameSlug(const char* name, const char* prefix, char (&out)[CTL_NAME_MAX])
{
    const std::size_t skip = std::strlen(prefix);
    if (std::strncmp(name, prefix, skip) == 0)
        name += skip;
    std::size_t i = 0;
    for (; name[i] != '\0' && i + 1 < sizeof out; ++i)
        out[i] = Fold(name[i]);
    out[i] = '\0';
}

bool CtlNameMatches(const char* typed, const char* slug)
{
    for (; *typed != '\0' && *slug != '\0'; ++typed, ++slug)
        if (Fold(*typed) != *slug)
            return false;
    return *typed == *slug;
}

bool CtlActionName(RcAction action, char (&out)[CTL_NAME_MAX])
{
    const char* name = RcActionName(action);
    if (name == nullptr)
        return false;
    CtlNameSlug(name, "RC_ACT_", out);
    return true;
}

bool CtlParseAction(const char* text, RcAction& out)
{
    char slug[CTL_NAME_MAX];
    for (RcAction a = RC_ACT_NONE; CtlActionName(a, slug); ++a) {
        if (CtlNameMatches(text, slug)) {
            out = a;
            return true;
        }
    }
    return ParseNumber(text, out);
}

bool CtlLooksNumeric(const char* text)
{
    const char* digits = text + (text[0] == '-' || text[0] == '+');
    return std::isdigit(static_cast<unsigned char>(*digits)) != 0;
}

bool CtlParseDecimal(const char* text, std::int32_t& out)
{
    if (*text == '\0' || std::isspace(static_cast<unsigned char>(*text)))
        return false;
    char* end = nullptr;
    errno = 0;
    const long long v = std::strtoll(text, &end, 10);
    if (errno != 0 || *end != '\0' || v < INT32_MIN || v > INT32_MAX)
        return false;
    out = static_cast<std::int32_t>(v);
    return true;
}
