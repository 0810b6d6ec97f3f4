// Unix-domain socket helpers shared by the input drivers: a listening stream
// socket at a path, a never-waiting accept into a caller's slot table, and the
// key datagram offered to a media-center user interface.
#pragma once

#include <sys/socket.h>
#include <sys/un.h>

#include <cstdint>

#include "common/paths.hpp"

// The length every address is handed over with: family and the whole path.
inline constexpr socklen_t SOCKET_ADDRESS_LENGTH = sizeof(sockaddr_un);

// Fills addr with the family and path, zeroing every other byte. False, with
// nothing copied, when the path is null or does not fit with its terminating zero.
bool SocketFillAddress(sockaddr_un& addr, const char* path);

// Marks a free entry of a slot table.
inline constexpr std::int32_t SOCKET_SLOT_FREE = -1;

// Creates a blocking stream socket listening at path (whatever stood there is
// removed first); returns its descriptor, or -1 (logged) on failure.
std::int32_t SocketListenUnix(const char* path, std::int32_t backlog);

// Accepts at most one waiting connection into the lowest free slot, as a
// non-blocking socket, without ever waiting; 0, or -1 (logged) if accept failed
// or the client could not be made non-blocking (it is closed, its slot stays free).
std::int32_t SocketAcceptClient(std::int32_t listenFd, std::int32_t* slots, std::int32_t slotCount);

// Offers a key code as one 4-byte native-order datagram to the media-center
// socket without blocking; 0 when delivered, negative when not.
std::int32_t MediaCenterSendKey(std::uint32_t code);
