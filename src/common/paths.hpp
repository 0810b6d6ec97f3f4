// Every path the system has built in: the daemon, its drivers, the audio
// client, the companion client and the stand-in peers all take them from here.
#pragma once

// The daemon's pid: decimal, no newline.
inline constexpr char RC_PID_FILE[] = "/var/run/vexorcd.pid";

// The control socket on which local programs inject actions.
inline constexpr char RC_CTRL_SOCKET_PATH[] = "/tmp/vexoctrl";

// The hiddev nodes of the radio receiver and of the AirClick remote.
inline constexpr char RC_RAYTAC_DEVICE_PATH[] = "/dev/usb/hiddev5";
inline constexpr char RC_AIRCLICK_DEVICE_PATH[] = "/dev/usb/hiddev1";

// Where a media-center user interface binds its datagram socket.
inline constexpr char MEDIA_CENTER_SOCKET_PATH[] = "/tmp/MediaCenter.sock";

// Where the audio daemon listens.
inline constexpr char AUDIO_SOCKET_PATH[] = "/tmp/vexoaudiod.sock";

// The equalizer profiles: the system's, then the user's.
inline constexpr char AUDIO_EQ_SYSTEM_FILE[] =
    "/var/packages/Sonarium/target/etc/equalizer.system";
inline constexpr char AUDIO_EQ_USER_FILE[] = "/var/packages/Sonarium/etc/equalizer.user";

// The appliance's audio configuration store.
inline constexpr char VEXO_AUDIO_CONF_PATH[] = "/var/lib/vexora/audio.conf";

// The system logger's socket.
inline constexpr char SYSLOG_SOCKET_PATH[] = "/dev/log";
