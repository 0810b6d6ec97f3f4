// The control socket: up to five local clients at once, each sending any
// bytes (none, a short code, a code and more), in one piece or two, and
// hanging up or not, read through the driver's own read on "/tmp/vexoctrl".
// Checked against a model of the socket's rules: one connection accepted per
// read into the lowest free of four slots, the lowest ready slot read, the
// first four bytes taken (the rest zero), the connection then closed; a client
// that neither sends nor hangs up holds its slot.
//
// Input: a byte for the number of clients, then per client a byte of flags
// (length 0 to 8, split, hang up) and its bytes.
#include <sys/socket.h>
#include <sys/un.h>

#include <deque>
#include <vector>

#include "drivers/hw_vexoctrl.hpp"
#include "fuzz_util.hpp"

namespace {

struct Client {
    int fd = -1;
    std::vector<std::uint8_t> data;
    bool hungUp = false;
};

// The driver's slots and queue as the rules say they must be.
struct Model {
    std::vector<Client>* clients;
    std::deque<int> pending;
    int slot[CTRL_SOCK_SLOTS] = {-1, -1, -1, -1};

    RcAction Read()
    {
        for (int& s : slot) {
            if (s == -1 && !pending.empty()) {
                s = pending.front();
                pending.pop_front();
                break;
            }
        }
        for (int& s : slot) {
            if (s == -1)
                continue;
            Client& c = (*clients)[static_cast<std::size_t>(s)];
            if (c.data.empty() && !c.hungUp)
                continue;
            std::uint8_t bytes[4] = {};
            for (std::size_t i = 0; i < c.data.size() && i < 4; ++i)
                bytes[i] = c.data[i];
            RcAction value;
            std::memcpy(&value, bytes, sizeof value);
            s = -1;
            return value;
        }
        return 0;
    }

    bool Idle() const
    {
        return pending.empty() && slot[0] == -1 && slot[1] == -1 && slot[2] == -1 && slot[3] == -1;
    }
};

int Connect()
{
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    sockaddr_un addr {};
    addr.sun_family = AF_UNIX;
    std::memcpy(addr.sun_path, "/tmp/vexoctrl", sizeof "/tmp/vexoctrl");
    if (fd < 0 || connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0)
        std::abort();  // five pending connections always fit the queue
    return fd;
}

void Send(int fd, const std::uint8_t* bytes, std::size_t n)
{
    if (n > 0 && send(fd, bytes, n, MSG_NOSIGNAL) != static_cast<ssize_t>(n))
        std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***)
{
    fz::RequireSandbox();
    if (CtrlSockOpen() != 0)
        std::abort();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    fz::Reader in(data, size);
    std::vector<Client> clients(1 + in.Byte() % 5);
    Model model {&clients, {}, {-1, -1, -1, -1}};
    for (std::size_t i = 0; i < clients.size(); ++i) {
        Client& c = clients[i];
        const std::uint8_t flags = in.Byte();
        std::size_t n = flags % 9;
        const std::uint8_t* bytes = in.Take(n, &n);
        c.data.assign(bytes, bytes + n);
        c.fd = Connect();
        model.pending.push_back(static_cast<int>(i));
        // In two pieces, both sent before the daemon looks.
        const std::size_t first = (flags & 0x10) != 0 ? n / 2 : n;
        Send(c.fd, bytes, first);
        Send(c.fd, bytes + first, n - first);
        if ((flags & 0x20) != 0) {
            close(c.fd);
            c.fd = -1;
            c.hungUp = true;
        }
    }

    for (std::size_t round = 0; round < 2 * clients.size() + 2; ++round) {
        if (CtrlSockRead() != model.Read())
            fz::Fail("control socket read differs from the slot rules");
    }
    // The silent clients give up; every slot must come free.
    for (Client& c : clients) {
        if (c.fd >= 0) {
            close(c.fd);
            c.fd = -1;
            c.hungUp = true;
        }
    }
    for (int round = 0; round < 12 && !model.Idle(); ++round) {
        if (CtrlSockRead() != model.Read())
            fz::Fail("control socket read differs from the slot rules");
    }
    for (const std::int32_t s : CtrlSockClients)
        if (s != -1)
            fz::Fail("a slot stays held after its client hung up");
    return 0;
}
