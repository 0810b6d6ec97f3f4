#!/bin/bash
# The main job's scripted session, run as the demo runs it, checked for the
# commands that must reach the audio daemon and for a clean stop.
set -u
src=${VEXO_SOURCE_DIR:?}
out=$(bash "$src/scripts/demo-session.sh" 2>&1)
echo "$out"
fail=0
expect() {  # expect COUNT PATTERN: the session printed COUNT lines matching PATTERN
    local n
    n=$(grep -c -- "$2" <<<"$out")
    if [ "$n" -ne "$1" ]; then echo "FAILED: $1 x '$2' expected, got $n"; fail=1; fi
}
expect_some() {
    grep -q -- "$1" <<<"$out" || { echo "FAILED: no '$1'"; fail=1; }
}
expect 3 "audio daemon got: AUDIO_CMD_PLAY (4)"
expect 1 "audio daemon got: AUDIO_CMD_NEXT (6)"
expect 1 "audio daemon got: AUDIO_CMD_NEXT_HELD (33)"
expect_some "audio daemon got: AUDIO_CMD_VOLUME_UP (12)"
expect 1 'audio daemon got: AUDIO_CMD_CUSTOM (32) "3"'
expect 1 'audio daemon got: AUDIO_CMD_CUSTOM_HELD (36) "3"'
expect 1 "audio daemon got: AUDIO_CMD_TOGGLE_SHUFFLE (26)"
expect 1 "audio daemon got: AUDIO_CMD_STOP (5)"
expect 1 "media center got: key 0x0007002C"
expect 1 "vexorcd has closed /dev/usb/hiddev5"
expect 1 "stopped cleanly"
expect 0 "syslog:"
expect 0 "unexpected"
expect 0 "remote-sim failed"
# A second held for 1 s gives the press and about one repeat per 200 ms.
vol=$(grep -c "AUDIO_CMD_VOLUME_UP" <<<"$out")
if [ "$vol" -lt 3 ] || [ "$vol" -gt 8 ]; then echo "FAILED: $vol volume steps for a 1 s hold"; fail=1; fi
[ $fail -eq 0 ] && echo "demo session: all checks passed"
exit $fail
