#include "vlibc/audioconf.hpp"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "vlibc/vlibc.hpp"

namespace {

// A line and its terminator.
constexpr int LINE_SIZE = 1024;

// The search for one key over the lines of the store.
struct ConfSearch {
    const char* key;
    int state;  // 0 not seen, 1 value holds the key's value, -1 the key's line is too long
    char value[LINE_SIZE];
};

// Takes one line (cut to 1023 characters when tooLong) into the search.
void TakeLine(char* line, bool tooLong, ConfSearch& search)
{
    char* const eq = std::strchr(line, '=');
    if (eq == nullptr)
        return;
    *eq = '\0';
    VLIBCStrTrimSpace(line, 0);
    if (line[0] == '#' || std::strcmp(line, search.key) != 0)
        return;
    if (tooLong) {
        search.state = -1;
        return;
    }
    char* value = eq + 1;
    int n = VLIBCStrTrimSpace(value, 0);
    if (n >= 2 && (value[0] == '"' || value[0] == '\'') && value[n - 1] == value[0]) {
        value[n - 1] = '\0';
        ++value;
        n -= 2;
    }
    std::memcpy(search.value, value, static_cast<std::size_t>(n) + 1);
    search.state = 1;
}

}  // namespace

int VEXOAudioConfGet(const char* key, char* buffer, int size)
{
    if (key == nullptr || key[0] == '\0' || buffer == nullptr || size < 1)
        return -1;
    const int fd = open(VEXO_AUDIO_CONF_PATH, O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return errno == ENOENT ? 0 : -1;

    ConfSearch search {key, 0, {}};
    char chunk[256];
    char line[LINE_SIZE];
    int len = 0;
    bool tooLong = false;
    for (;;) {
        const ssize_t got = read(fd, chunk, sizeof chunk);
        if (got < 0 && errno == EINTR)
            continue;
        if (got < 0) {
            close(fd);
            return -1;
        }
        for (ssize_t i = 0; i < got; ++i) {
            if (chunk[i] == '\n') {
                line[len] = '\0';
                TakeLine(line, tooLong, search);
                len = 0;
                tooLong = false;
            } else if (len < LINE_SIZE - 1) {
                line[len++] = chunk[i];
            } else {
                tooLong = true;
            }
        }
        if (got == 0)
            break;
    }
    close(fd);
    if (len > 0 || tooLong) {
        line[len] = '\0';
        TakeLine(line, tooLong, search);
    }

    if (search.state <= 0)
        return search.state;
    const std::size_t n = std::strlen(search.value);
    if (n >= static_cast<std::size_t>(size))
        return -1;
    std::memcpy(buffer, search.value, n + 1);
    return 1;
}
