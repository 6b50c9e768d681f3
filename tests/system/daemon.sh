#!/usr/bin/env bash
# The daemon on a real kernel, the way the surface reaches it on a machine:
# virtual surfaces made through /dev/uhid (`veltotouch emulate`), found by
# udev, read through hidraw by `veltotouch daemon`, whose keys come out of
# the uinput keyboard "VeltoTouch keys" and are read back from its evdev node
# (tests/system/key_events) and through libinput, as a desktop sees them.
# Gestures are watched on the daemon's bus with `veltotouch ctl events`.
#
#   tests/system/daemon.sh TOOL EXPECTED_KEYS KEY_EVENTS
#
# TOOL is the built veltotouch; EXPECTED_KEYS and KEY_EVENTS are the helpers
# of this folder. Everything runs in one VM boot without systemd: udevd, a
# private bus and the daemon are started here, in that order. The cases:
#   1. every example recording gives, on evdev, exactly the keys its expected
#      gestures give through the daemon's own key map, and on the bus exactly
#      those gestures (device resets included)
#   2. the feature reports reach ctl through the real feature-report path
#   3. an unplug in the middle of a held key releases it and is announced on
#      the bus; a surface plugged in again is taken and keys flow again
#   4. two surfaces of two configured models at once: two devices, each with
#      its own gestures (ctl events -d N) and its own keys
#   5. a surface whose ids the configuration does not name is left alone
#   6. malformed reports among valid ones change nothing
#   7. a flood of 1000 reports a second for 10 s loses no frame
#   8. libinput sees the same keys as the evdev reader
#   9. `veltotouch record` captures every report of a surface byte for byte,
#      alone or beside the daemon serving it (found by the daemon's
#      [[match]] ids), ends at an unplug, at --duration, and at SIGINT at
#      any moment with a file that reads back
# Each case says PASS or FAIL with what went wrong; the logs of a failed run
# are printed at its end. The whole run takes about two minutes on this
# 2-core machine, twice that while it is busy compiling.
#
# Skips (77) where no VM can be booted, unless CI=true. For work on the test:
# VELTO_SYSTEM_CASES="examples flood" runs only those cases (the names of the
# case_ functions below), VELTO_SYSTEM_KEEP=DIR keeps every log in DIR.
set -euo pipefail
here=$(cd "$(dirname "$0")" && pwd)
root=$(cd "$here/../.." && pwd)
vm=$here/vm
me=$here/$(basename "$0")

fail_setup() {
    echo "daemon.sh: $*" >&2
    exit 1
}

if [ "${1:-}" != --inside ]; then
    [ $# -eq 3 ] || { echo "usage: $0 TOOL EXPECTED_KEYS KEY_EVENTS" >&2; exit 2; }
    for program in "$@"; do
        [ -x "$program" ] || fail_setup "$program is not an executable (build it first)"
    done
    set -- "$(realpath -- "$1")" "$(realpath -- "$2")" "$(realpath -- "$3")"
    if ! why=$("$vm" --check 2>&1); then
        echo "$why"
        [ "${CI:-}" = true ] && fail_setup "no VM can be booted here, and CI runs the system tests"
        echo "daemon.sh: skipped, no VM can be booted here"
        exit 77
    fi
    for program in dbus-daemon dbus-monitor libinput; do
        command -v $program >/dev/null || fail_setup "$program is not installed (scripts/install-deps installs it)"
    done

    if [ -n "${VELTO_SYSTEM_KEEP:-}" ]; then
        mkdir -p "$VELTO_SYSTEM_KEEP"
        results=$(cd "$VELTO_SYSTEM_KEEP" && pwd)
    else
        results=$(mktemp -d)
        trap 'rm -rf "$results"' EXIT
    fi
    shares=(--share "$results")
    # The VM sees the host's root but not its /tmp or /run: from the source
    # root, the tree (recordings, this script) is seen inside even when it is
    # checked out there, and a build tree there that is not inside it is
    # shared on its own.
    cd "$root"
    build=$(dirname "$1")
    while [ "$build" != / ] && [ ! -e "$build/CMakeCache.txt" ]; do build=$(dirname "$build"); done
    [ "$build" != / ] || build=$(dirname "$1")
    case "$build/" in
        "$root"/*) ;;
        /tmp/* | /run/*) shares+=(--share "$build") ;;
    esac

    status=0
    "$vm" --timeout 540 "${shares[@]}" -- "$me" --inside "$results" "$@" "${VELTO_SYSTEM_CASES:-all}" || status=$?
    if [ $status -ne 0 ]; then
        for log in "$results"/*.log; do
            [ -s "$log" ] || continue
            # A surface that only said it was made has nothing to tell.
            [[ $log != */emulate-* ]] || grep -qv ' made; playing ' "$log" || continue
            echo "----- $(basename "$log") (last 40 lines)" >&2
            tail -n 40 "$log" >&2
        done
        [ $status -eq 125 ] && echo "daemon.sh: the VM failed (see above)" >&2
        exit 1
    fi
    exit 0
fi

# ---------------------------------------------------------------- inside the VM
shift
results=$1 tool=$2 expected_keys=$3 key_events=$4 cases=$5
# Each case says what failed and the next one runs: no errexit from here on.
set +e -u
cd "$root"
work=/tmp/velto-system
mkdir -p "$work"
address=unix:path=/run/velto-system-bus
# The example recordings play at 4 times the surface's 100 reports a second
# (the recogniser reads time from the reports, so the pace changes nothing
# but the time taken), well below the 1000 of case 7.
speed=4
# The daemon and every surface run on the VM's first processor. Emulated, a
# processor of the VM is a thread of this machine, which a busy machine may
# leave waiting for a few hundred milliseconds: were the surface on the
# other, it would go on sending meanwhile, past the 64 reports hidraw keeps
# for a reader, and the reports lost would be the machine's doing, not the
# daemon's. On one processor both wait together, while the daemon's
# real-time input thread still takes each report before the surface sends
# the next one, unless something holds it up.
on_cpu0=(taskset -c 0)
failed=()

# Under emulation a process takes a few hundred milliseconds to start on a
# busy machine, so what runs often (waits, reading logs, comparing) runs in
# the shell itself. pause is a sleep without a process.
mkfifo "$work/never"
exec {never}<>"$work/never"
pause() { read -r -t "$1" -u "$never" _; }
note() { echo "daemon.sh: $*" >&2; }
# Where the time goes, in trace.log.
trace() { echo "$EPOCHREALTIME $*" >>"$results/trace.log"; }
ctl() { "$tool" ctl --bus "$address" "$@"; }

# wait_until SECONDS WHAT COMMAND...: polls COMMAND; the limit only ends a hang.
wait_until() {
    local limit=$1 what=$2 end
    shift 2
    end=$((SECONDS + limit))
    until "$@"; do
        if [ $SECONDS -ge $end ]; then
            note "gave up after ${limit}s waiting for $what"
            return 1
        fi
        pause 0.05
    done
    return 0
}

# A line of FILE contains TEXT.
log_has() {
    local line
    [ -e "$1" ] || return 1
    while IFS= read -r line; do [[ $line == *"$2"* ]] && return 0; done <"$1"
    return 1
}

# Two files hold the same lines.
same_lines() {
    local -a a b
    mapfile -t a <"$1"
    mapfile -t b <"$2"
    local IFS=$'\n'
    [ ${#a[@]} -eq ${#b[@]} ] && [ "${a[*]}" = "${b[*]}" ]
}

# The gesture lines of a file (replay --jsonl, ctl events --jsonl -d N, a
# .expected file) without their time stamps, on standard output.
gestures_in() {
    local line
    while IFS= read -r line; do
        [[ $line == *'"gesture"'* ]] || continue
        [[ $line == *',"timestamp":'* ]] && line="${line%,\"timestamp\":*}}"
        printf '%s\n' "$line"
    done <"$1"
}

# ---- recordings, in the form `veltotouch` writes them

# The input reports of a recording, "TIMESTAMP<TAB>HEX" per line (state frames
# left out, as emulate leaves them out).
frames_of() {
    awk '/"Type": / { type = $0; sub(/.*"Type": "/, "", type); sub(/".*/, "", type) }
         /"Timestamp": / { ts = $0; sub(/.*"Timestamp": /, "", ts); sub(/[,}].*/, "", ts) }
         /"Report": / && type == "InputReport" { r = $0; sub(/.*"Report": "/, "", r); sub(/".*/, "", r); print ts "\t" r }' "$1"
}

# A recording of the "TIMESTAMP<TAB>HEX" lines on standard input.
write_recording() {
    awk -F '\t' 'BEGIN { printf "{\"Version\": 1, \"Frames\": [" }
                 { printf "%s\n{\"Type\": \"InputReport\", \"Timestamp\": %s, \"Report\": \"%s\"}", (NR > 1 ? "," : ""), $1, $2 }
                 END { print "\n]}" }'
}

# Those lines, then after a long gap one more report, which emulate waits for
# with the device attached (--max-gap): the device can be asked once all
# before it has been played. The case ends it with SIGTERM.
with_pause_at_end() {
    awk -F '\t' '{ print } END { printf "%.0f\t%s\n", $1 + 1e12, $2 }'
}

# The frame numbers of the whole Image reports (73 bytes: ID 01, the frame
# number in the next 4, little-endian) in a recording file, or in
# "TIMESTAMP<TAB>HEX" lines, one a line.
frames_in() {
    awk 'function hex(text,   i, value) {
             value = 0
             for (i = 1; i <= length(text); i++) value = value * 16 + index("0123456789abcdef", substr(text, i, 1)) - 1
             return value
         }
         {
             report = $0
             if (sub(/.*"Report": "/, "", report)) sub(/".*/, "", report)
             else if (sub(/^[0-9]*\t/, "", report) == 0) next
             if (length(report) != 73 * 3 || substr(report, 1, 3) != "01 ") next
             printf "%.0f\n", hex(substr(report, 13, 2) substr(report, 10, 2) substr(report, 7, 2) substr(report, 4, 2))
         }' "$1"
}

# ---- the bus: DeviceAdded and DeviceRemoved, as dbus-monitor saw them

# Sets bus_events to "added N" and "removed N" lines.
read_bus_events() {
    local line what="" n
    bus_events=""
    while IFS= read -r line; do
        case $line in
            *member=DeviceAdded*) what=added ;;
            *member=DeviceRemoved*) what=removed ;;
            *'object path "/org/veltotouch/VeltoTouch1/device/'*)
                [ -n "$what" ] || continue
                n=${line##*/device/}
                bus_events+="$what ${n%\"*}"$'\n'
                what="" ;;
        esac
    done <"$results/monitor.log"
}
bus_saw() { read_bus_events; [[ $'\n'$bus_events == *$'\n'"$1 $2"$'\n'* ]]; }
# Sets n to the number the daemon gives its next device: it counts them from
# 0 as it adds them.
next_device() {
    local line
    read_bus_events
    n=0
    while IFS= read -r line; do
        if [[ $line == added* ]]; then n=$((n + 1)); fi
    done <<<"$bus_events"
}
wait_added() { wait_until 60 "device $1 on the bus (DeviceAdded)" bus_saw added "$1"; }
wait_removed() { wait_until 60 "device $1 to be removed (DeviceRemoved)" bus_saw removed "$1"; }

# ---- keys

# The keys key_events printed since the previous call, into FILE. The daemon
# has sent all of a device's keys once the device is off the bus (its session
# releases a held key before it goes), and uinput hands each to the evdev
# reader as it is written: a mark asked for after that comes after them.
marks=0
marks_seen() {
    local line count=0
    while IFS= read -r line; do [ "$line" = -- ] && count=$((count + 1)); done <"$results/keys.log"
    [ $count -ge $marks ]
}
key_segment() {
    local line k=0
    marks=$((marks + 1))
    kill -USR1 "$keys_pid"
    wait_until 30 "the key reader's mark" marks_seen || return 1
    : >"$1"
    while IFS= read -r line; do
        if [ "$line" = -- ]; then
            k=$((k + 1))
            [ $k -ge $marks ] && break
        elif [ $k -eq $((marks - 1)) ]; then
            printf '%s\n' "$line" >>"$1"
        fi
    done <"$results/keys.log"
    return 0
}

# The last line key_events printed is this.
last_key_is() {
    local line last=""
    while IFS= read -r line; do last=$line; done <"$results/keys.log"
    [ "$last" = "$1" ]
}

# Compares the expected keys with those seen; says what differs.
same_keys() {
    local what=$1 expected=$2 got=$3
    same_lines "$expected" "$got" && return 0
    note "$what: the keys on \"VeltoTouch keys\" differ from those its gestures give through the key map (< expected, > got):"
    diff "$expected" "$got" | head -n 20 >&2
    return 1
}

# ---- surfaces

# Expected gestures of each device, checked once the daemon has stopped and
# ctl events has printed all it received: "N FILE" lines (FILE as gestures_in reads).
expect_gestures() { echo "$1 $2" >>"$work/gestures.expected"; }

emulate_pids=()
# emulate FILE [OPTIONS] in the background; sets emulate_pid.
start_emulate() {
    "${on_cpu0[@]}" "$tool" emulate "$@" >"$results/emulate-$((${#emulate_pids[@]} + 1))-${1##*/}.log" 2>&1 &
    emulate_pid=$!
    emulate_pids+=("$emulate_pid")
}
stop_emulates() {
    local pid
    for pid in "${emulate_pids[@]}"; do
        kill "$pid" 2>/dev/null
        wait "$pid" 2>/dev/null
    done
    emulate_pids=()
}
# How many writes a surface has made (its device, each report, each answer):
# a surface whose count has reached its reports is done with them, found
# without asking the daemon anything while it floods. Sets writes.
writes_of() {
    local key value
    writes=0
    while read -r key value; do
        if [ "$key" = syscw: ]; then writes=$value; fi
    done <"/proc/$1/io"
}
wrote_at_least() { writes_of "$1" && [ "$writes" -ge "$2" ]; }

# Sets node to the hidraw node of the uhid device 1234:PRODUCT ("9999"), if any.
find_hidraw() {
    local uevent line
    node=""
    for uevent in /sys/class/hidraw/hidraw*/device/uevent; do
        [ -e "$uevent" ] || continue
        while IFS= read -r line; do
            if [ "$line" = "HID_ID=0003:00001234:0000$1" ]; then
                uevent=${uevent%/device/uevent}
                node=/dev/${uevent##*/}
            fi
        done <"$uevent"
    done
    [ -n "$node" ]
}
# udev has handled the node, and told its listeners, once its database entry exists.
udev_has() {
    local numbers
    read -r numbers <"/sys/class/hidraw/${1##*/}/dev" || return 1
    [ -e "/run/udev/data/c$numbers" ]
}

# The device's recording, saved into FILE, ends with frame LAST. Asked once a
# second: each answer is half a megabyte of JSON.
processed_up_to() {
    pause 1
    ctl save-recording -d "$1" "$3" 2>/dev/null && [ "$(frames_in "$3" | tail -n 1)" = "$2" ]
}

# ------------------------------------------------------------------- the cases

case_examples() {
    local recording name expected n ok=0 with_settings
    with_settings=" $(grep -l '"Type": "State"' examples/*.json | tr '\n' ' ') "
    for recording in examples/*.json; do
        name=${recording##*/}
        name=${name%.json}
        [ -e "examples/$name.expected" ] || continue
        expected=examples/$name.expected
        if [[ $with_settings == *" $recording "* ]]; then
            # emulate plays only the input reports (settings are the plug-in's,
            # not the device's): the recogniser's gestures for those alone.
            frames_of "$recording" | write_recording >"$work/$name.reports.json"
            "$tool" replay "$work/$name.reports.json" --jsonl >"$work/$name.gestures"
            expected=$work/$name.gestures
        fi
        "$expected_keys" "$expected" >"$work/$name.keys.expected" || return 1
        trace "$name: expected"
        next_device
        trace "$name: emulate"
        "${on_cpu0[@]}" "$tool" emulate "$recording" --speed $speed >"$results/emulate-$name.log" 2>&1 \
            || { note "$recording: emulate failed"; ok=1; continue; }
        trace "$name: played"
        wait_removed "$n" || return 1
        trace "$name: removed"
        key_segment "$work/$name.keys" || return 1
        trace "$name: keys"
        same_keys "$recording" "$work/$name.keys.expected" "$work/$name.keys" || ok=1
        expect_gestures "$n" "$expected"
    done
    return $ok
}

case_unmatched_and_feature_reports() {
    local n node ok=0 devices
    # Case 5: ids that no [[match]] names. Nobody opens it, so it waits.
    start_emulate "$work/idle.json" --product 0x9999
    wait_until 60 "the unmatched surface's hidraw node" find_hidraw 9999 || return 1
    wait_until 60 "udev to take in $node" udev_has "$node" || return 1
    # Case 2: a configured surface, paused before its last report. udev told
    # of the unmatched one first: once this one is attached, the daemon has
    # had its chance at both.
    next_device
    with_pause_at_end <"$work/idle.reports" | write_recording >"$work/idle-paused.json"
    start_emulate "$work/idle-paused.json" --hold-duration 4321 --max-gap 2000
    wait_added "$n" || return 1
    devices=$(ctl devices)
    if [ "$devices" != "$n  $(find_hidraw 5678 && echo "$node")" ]; then
        note "case 5: ctl devices should list only device $n, the configured surface; it lists: $devices"
        ok=1
    fi

    local hold
    hold=$(ctl get -d "$n" FactoryResetHoldDuration)
    [ "$hold" = 4321 ] || { note "case 2: FactoryResetHoldDuration read $hold, emulate answers 4321"; ok=1; }
    # emulate answers each debug report with its ID over all 128 bytes.
    local id expected_reports="{" separator="" i
    for id in 04 10 11 12 13 1d 32 3b 3c 3f; do
        expected_reports+="$separator\"0x$id\":\""
        for ((i = 0; i < 128; i++)); do expected_reports+="$id "; done
        expected_reports+="\""
        separator=,
    done
    expected_reports+="}"
    local reports
    reports=$(ctl get -d "$n" FirmwareDebugReports)
    if [ "$reports" != "$expected_reports" ]; then
        note "case 2: FirmwareDebugReports differ from the bytes emulate answers with; got: ${reports:0:300}..."
        ok=1
    fi
    stop_emulates
    wait_removed "$n" || return 1
    expect_gestures "$n" "$work/idle.gestures"
    key_segment "$work/idle.keys" || return 1
    [ ! -s "$work/idle.keys" ] || { note "case 2: an untouched surface sent keys: $(<"$work/idle.keys")"; ok=1; }
    return $ok
}

case_malformed() {
    local n ok=0 lines info reached frames
    # After every tenth report come malformed ones with its time stamp:
    # empty, of an ID the device does not have, an image one byte short, a
    # firmware event cut short, a bare image ID.
    frames_of "$work/malformed-base.json" >"$work/malformed-base.reports"
    awk -F '\t' '{ print }
        NR % 10 == 0 { print $1 "\t"; print $1 "\t05 01 "; print $1 "\t" substr($2, 1, 72 * 3)
                       print $1 "\t02 00 "; print $1 "\t01 " }' "$work/malformed-base.reports" |
        with_pause_at_end | write_recording >"$work/malformed.json"
    "$tool" replay "$work/malformed-base.json" --jsonl >"$work/malformed.gestures"
    "$expected_keys" "$work/malformed.gestures" >"$work/malformed.keys.expected" || return 1
    frames_in "$work/malformed-base.reports" >"$work/malformed.frames.expected"
    mapfile -t frames <"$work/malformed.frames.expected"
    local last=${frames[-1]}
    lines=$(grep -c . "$work/malformed.json")
    next_device
    start_emulate "$work/malformed.json" --speed $speed --max-gap 2000
    local surface=$emulate_pid
    wait_added "$n" || return 1
    # Written: the device, then every report but the last (a line each, but
    # for the two lines of the brackets).
    wait_until 120 "the malformed reports to be played" wrote_at_least "$surface" $((1 + lines - 3)) || return 1
    wait_until 60 "the plug-in to take frame $last" processed_up_to "$n" "$last" "$results/malformed.saved.json"
    # Every valid report reached the plug-in (its recording keeps them all)...
    frames_in "$results/malformed.saved.json" >"$work/malformed.frames"
    same_lines "$work/malformed.frames.expected" "$work/malformed.frames" \
        || { note "case 6: the plug-in did not get every valid report among the malformed ones, in order"; ok=1; }
    # ...and what else it got was taken for neither a reset nor a frame.
    info=$(ctl get -d "$n" Pipeline.DebugInfo)
    [ "$info" = '{"ResetCount":0,"DisjointImageCount":0}' ] \
        || { note "case 6: malformed reports were taken for resets or frames: DebugInfo $info"; ok=1; }
    reached=$(($(grep -o '"Report": ' "$results/malformed.saved.json" | wc -l) - $(wc -l <"$work/malformed.frames")))
    echo "  case 6: $reached of the $((5 * (${#frames[@]} / 10))) malformed reports reached the plug-in" \
        "(a kernel drops those its device does not declare, and may drop short ones)" >&2
    stop_emulates
    wait_removed "$n" || return 1
    key_segment "$work/malformed.keys" || return 1
    same_keys "case 6" "$work/malformed.keys.expected" "$work/malformed.keys" || ok=1
    expect_gestures "$n" "$work/malformed.gestures"
    return $ok
}

case_flood() {
    local n ok=0 lead=50 count=10000 info
    # 50 reports 10 ms apart, then 10000 1 ms apart; readings all zero: no touch.
    awk -v lead=$lead -v count=$count '
        function le(n,   i, s) { s = ""; for (i = 0; i < 4; i++) { s = s sprintf("%02x ", n % 256); n = int(n / 256) } return s }
        BEGIN {
            zeros = ""; for (i = 0; i < 64; i++) zeros = zeros "00 "
            ms = 1000
            for (f = 1; f <= lead + count; f++) {
                printf "%.0f\t01 %s%s%s\n", ms * 1e6, le(f), le(ms), zeros
                ms += (f < lead ? 10 : 1)
            }
        }' | with_pause_at_end | write_recording >"$work/flood.json"
    local last=$((lead + count))
    trace "flood: written"
    next_device
    start_emulate "$work/flood.json" --speed 1 --max-gap 2000
    local surface=$emulate_pid
    wait_added "$n" || return 1
    # Nothing asks the daemon anything while the reports flood in.
    wait_until 120 "the flood to be played" wrote_at_least "$surface" $((1 + last)) || return 1
    trace "flood: played"
    if ! wait_until 60 "the plug-in to take frame $last" processed_up_to "$n" "$last" "$results/flood.saved.json"; then
        note "case 7: the plug-in's recording ends at frame $(frames_in "$results/flood.saved.json" | tail -n 1), not $last"
        ok=1
    fi
    info=$(ctl get -d "$n" Pipeline.DebugInfo)
    [ "$info" = '{"ResetCount":0,"DisjointImageCount":0}' ] \
        || { note "case 7: frames were lost at 1000 reports a second: DebugInfo $info"; ok=1; }
    trace "flood: checked"
    # The newest 1350 reports, as the plug-in kept them: all there, in order.
    frames_in "$results/flood.saved.json" >"$work/flood.frames"
    seq $((last - 1349)) $last >"$work/flood.frames.expected"
    same_lines "$work/flood.frames.expected" "$work/flood.frames" \
        || { note "case 7: the plug-in's newest 1350 frames are not $((last - 1349)) to $last in order"; ok=1; }
    stop_emulates
    wait_removed "$n" || return 1
    key_segment "$work/flood.keys" || return 1
    [ ! -s "$work/flood.keys" ] || { note "case 7: an untouched surface sent keys: $(head -n 3 "$work/flood.keys")"; ok=1; }
    return $ok
}

case_unplug() {
    local n ok=0
    next_device
    start_emulate "$work/long-hold.json"
    local surface=$emulate_pid
    wait_added "$n" || return 1
    # ctl events for that device, running through the unplug (the recording
    # holds still for 3 s first).
    "$tool" ctl --bus "$address" events -d "$n" --jsonl >"$results/events-unplug.log" 2>&1 &
    local watcher=$!
    wait_until 60 "KEY_VOICECOMMAND down" last_key_is "KEY_VOICECOMMAND 1" || return 1
    # The surface goes as its process dies: the kernel removes the device.
    kill -KILL "$surface"
    wait "$surface" 2>/dev/null
    emulate_pids=()
    wait_removed "$n" || { note "case 3: the daemon did not announce the unplugged device's removal"; return 1; }
    key_segment "$work/unplug.keys" || return 1
    printf 'KEY_VOICECOMMAND 1\nKEY_VOICECOMMAND 0\n' >"$work/unplug.keys.expected"
    same_keys "case 3 (unplug mid-hold)" "$work/unplug.keys.expected" "$work/unplug.keys" || ok=1
    if ctl devices | grep -q "^$n  "; then
        note "case 3: ctl devices still lists the unplugged device $n"
        ok=1
    fi
    kill "$watcher" 2>/dev/null
    wait "$watcher" 2>/dev/null
    grep -q '"gesture":"hold-start","region":"middle"' "$results/events-unplug.log" \
        || { note "case 3: ctl events -d $n did not show the hold that was cut off"; ok=1; }

    # Plugged in again: a new device, listed while it holds still for its
    # first 3 s, and keys again.
    next_device
    "$tool" replay "$work/replug.json" --jsonl >"$work/replug.gestures"
    "$expected_keys" "$work/replug.gestures" >"$work/replug.keys.expected" || return 1
    start_emulate "$work/replug.json"
    local again=$emulate_pid
    wait_added "$n" || { note "case 3: the surface plugged in again was not taken"; return 1; }
    if ! ctl devices | grep -q "^$n  "; then
        note "case 3: ctl devices does not list the surface plugged in again as device $n"
        ok=1
    fi
    wait "$again" || { note "case 3: emulate failed on the second surface"; ok=1; }
    emulate_pids=()
    wait_removed "$n" || return 1
    key_segment "$work/replug.keys" || return 1
    same_keys "case 3 (plugged in again)" "$work/replug.keys.expected" "$work/replug.keys" || ok=1
    expect_gestures "$n" "$work/replug.gestures"
    return $ok
}

case_two_surfaces() {
    local ok=0 n first second node
    # Surface A sends only volume up, B only volume down and the voice key, so
    # that the keys on the one keyboard can be told apart.
    "$tool" replay "$work/two-a.json" --jsonl >"$work/two-a.gestures"
    "$tool" replay "$work/two-b.json" --jsonl >"$work/two-b.gestures"
    "$expected_keys" "$work/two-a.gestures" >"$work/two-a.keys.expected" || return 1
    "$expected_keys" "$work/two-b.gestures" >"$work/two-b.keys.expected" || return 1
    if grep -qv '^KEY_VOLUMEUP ' "$work/two-a.keys.expected" || grep -q '^KEY_VOLUMEUP ' "$work/two-b.keys.expected" \
        || [ ! -s "$work/two-a.keys.expected" ] || [ ! -s "$work/two-b.keys.expected" ]; then
        note "case 4: the recordings do not give the disjoint keys this case needs (a fault of the test)"
        return 1
    fi
    # A, then B while A still holds still: each recording does so for its
    # first 4 s, so that the ctl events -d N started once its device is there
    # listens before the first touch, and the two play at the same time.
    next_device
    first=$n second=$((n + 1))
    start_emulate "$work/two-a.json" --product 0x5678
    local a=$emulate_pid
    wait_added "$first" || return 1
    "$tool" ctl --bus "$address" events -d "$first" --jsonl >"$results/events-$first.log" 2>&1 &
    echo "$first $!" >>"$work/watchers"
    start_emulate "$work/two-b.json" --product 0x5679
    local b=$emulate_pid
    wait_added "$second" || return 1
    "$tool" ctl --bus "$address" events -d "$second" --jsonl >"$results/events-$second.log" 2>&1 &
    echo "$second $!" >>"$work/watchers"
    local devices node_a
    devices=$(ctl devices)
    find_hidraw 5678 && node_a=$node
    find_hidraw 5679
    if [ "$devices" != "$first  $node_a"$'\n'"$second  $node" ]; then
        note "case 4: ctl devices should list device $first ($node_a, surface A) and $second ($node, B): $devices"
        ok=1
    fi
    wait "$a" || { note "case 4: emulate failed on surface A"; ok=1; }
    wait "$b" || { note "case 4: emulate failed on surface B"; ok=1; }
    emulate_pids=()
    wait_removed "$first" || return 1
    wait_removed "$second" || return 1
    # Both were there at once: each was added before the other went.
    read_bus_events
    if [[ $bus_events != *"added $first"$'\n'"added $second"$'\n'* ]]; then
        note "case 4: the two surfaces were not attached at the same time; the bus saw: $(tr '\n' ';' <<<"$bus_events" | tail -c 100)"
        ok=1
    fi
    key_segment "$work/two.keys" || return 1
    grep '^KEY_VOLUMEUP ' "$work/two.keys" >"$work/two-a.keys"
    grep -v '^KEY_VOLUMEUP ' "$work/two.keys" >"$work/two-b.keys"
    same_keys "case 4, surface A" "$work/two-a.keys.expected" "$work/two-a.keys" || ok=1
    same_keys "case 4, surface B" "$work/two-b.keys.expected" "$work/two-b.keys" || ok=1
    expect_gestures "$first" "$work/two-a.gestures"
    expect_gestures "$second" "$work/two-b.gestures"
    return $ok
}

# Once the daemon has stopped: each device's gestures on the bus, as the
# ctl events that watched every device printed them.
split_bus_gestures() {
    local line n rest
    declare -gA bus_gestures=()
    while IFS= read -r line; do
        [[ $line == '{"device":'* ]] || continue
        n=${line#'{"device":'}
        n=${n%%,*}
        rest="{${line#*,}"
        bus_gestures[$n]+="${rest%,\"timestamp\":*}}"$'\n'
    done <"$results/events.log"
}

check_gestures() {
    local ok=0 n file
    split_bus_gestures
    while read -r n file; do
        gestures_in "$file" >"$work/device-$n.expected"
        printf '%s' "${bus_gestures[$n]:-}" >"$work/device-$n.bus"
        if ! same_lines "$work/device-$n.expected" "$work/device-$n.bus"; then
            note "device $n: the gestures on the bus differ from the recogniser's for its recording $file (< expected, > got):"
            diff "$work/device-$n.expected" "$work/device-$n.bus" | head -n 20 >&2
            ok=1
        fi
    done <"$work/gestures.expected"
    return $ok
}

# ctl events -d N of case 4 ended with the daemon.
check_watchers() {
    local ok=0 n pid
    while read -r n pid; do
        wait "$pid"
        gestures_in "$results/events-$n.log" >"$work/watcher-$n"
        if ! same_lines "$work/device-$n.bus" "$work/watcher-$n"; then
            note "case 4: ctl events -d $n printed other gestures than the daemon sent for device $n (< all devices' stream, > -d $n):"
            diff "$work/device-$n.bus" "$work/watcher-$n" | head -n 20 >&2
            ok=1
        fi
    done <"$work/watchers"
    return $ok
}

# libinput's view of the keyboard against the evdev reader's, every key of the run.
libinput_keys() {
    local line
    while IFS= read -r line; do
        [[ $line =~ (KEY_[A-Z0-9_]+)\ \([0-9]+\)\ (pressed|released) ]] || continue
        if [ "${BASH_REMATCH[2]}" = pressed ]; then
            printf '%s 1\n' "${BASH_REMATCH[1]}"
        else
            printf '%s 0\n' "${BASH_REMATCH[1]}"
        fi
    done <"$results/libinput.log"
}
evdev_keys() {
    local line
    while IFS= read -r line; do [ "$line" = -- ] || printf '%s\n' "$line"; done <"$results/keys.log"
}
libinput_has_all() {
    libinput_keys >"$work/libinput.keys"
    [ "$(wc -l <"$work/libinput.keys")" -ge "$(wc -l <"$work/all.keys")" ]
}
check_libinput() {
    evdev_keys >"$work/all.keys"
    [ -s "$work/all.keys" ] || { note "case 8: no keys at all"; return 1; }
    # libinput prints what it has read in its own time.
    wait_until 30 "libinput to print every key" libinput_has_all
    same_lines "$work/all.keys" "$work/libinput.keys" && return 0
    note "case 8: libinput debug-events saw other keys than the evdev reader (< evdev, > libinput):"
    diff "$work/all.keys" "$work/libinput.keys" | head -n 20 >&2
    return 1
}

# ---- recordings captured by `veltotouch record`

# The input reports of a recording (container, or hid-recorder text ending in
# .hid), "LENGTH HEX..." per line, without their times.
reports_of() {
    local file=$1
    if [[ $file != *.hid ]]; then
        "$tool" convert "$file" -o "$work/reports-of.hid" --format hid >/dev/null 2>&1 || return 1
        file=$work/reports-of.hid
    fi
    awk '/^E: / { $1 = ""; $2 = ""; sub(/^ +/, ""); print }' "$file"
}

# Compares the reports a capture holds with those of its source; says what differs.
same_reports() {
    local what=$1 expected=$2 got=$3
    same_lines "$expected" "$got" && return 0
    note "$what: the capture's reports differ from its source's (< source, > captured):"
    diff "$expected" "$got" | head -n 10 | cut -c 1-120 >&2
    return 1
}

# A process has ended (it may be a zombie not yet waited for).
exited() {
    local stat
    read -r stat <"/proc/$1/stat" 2>/dev/null || return 0
    [[ $stat == *") Z "* ]]
}
# Where a process is: its state, what it waits in, its system call.
state_of() {
    local stat wchan syscall
    read -r stat <"/proc/$1/stat" 2>/dev/null
    read -r wchan <"/proc/$1/wchan" 2>/dev/null
    read -r syscall <"/proc/$1/syscall" 2>/dev/null
    echo "${stat#*) } | wchan ${wchan:-?} | syscall ${syscall:-?}"
}

case_record() {
    local ok=0 source=examples/taps.json format status pid log delay
    reports_of "$source" >"$work/record.source" || { note "case 9: convert failed"; return 1; }

    # Alone on a surface no [[match]] names: record is the reader emulate
    # waits for, so it sees every report, and the unplug at the end of the
    # recording ends the capture.
    for format in json hid; do
        start_emulate "$source" --product 0x9999 --speed 4
        wait_until 60 "the surface's hidraw node" find_hidraw 9999 || return 1
        wait_until 60 "udev to take in $node" udev_has "$node" || return 1
        log=$results/record-alone-$format.log
        "${on_cpu0[@]}" "$tool" record "$node" -o "$work/alone.$format" >"$log" 2>&1
        status=$?
        [ $status -eq 0 ] || { note "case 9: record ($format) exited with $status: $(<"$log")"; ok=1; }
        log_has "$log" "was removed; the recording ends there" \
            || { note "case 9: record ($format) did not say the surface went: $(<"$log")"; ok=1; }
        reports_of "$work/alone.$format" >"$work/alone.$format.reports"
        same_reports "case 9, alone ($format)" "$work/record.source" "$work/alone.$format.reports" || ok=1
        stop_emulates
    done

    # Beside the daemon, on the surface its configuration names, found by
    # record through the same [[match]] ids. emulate plays once the daemon
    # holds the device open, perhaps before record has it: the first report
    # goes out alone, the others 20 s of recording (5 s at speed 4) later.
    frames_of "$source" | awk -F '\t' 'NR == 1 { print; next } { printf "%.0f\t%s\n", $1 + 20e9, $2 }' \
        | write_recording >"$work/record-beside.json"
    next_device
    start_emulate "$work/record-beside.json" --speed 4 --max-gap 30
    local surface=$emulate_pid
    wait_added "$n" || return 1
    log=$results/record-beside.log
    "${on_cpu0[@]}" "$tool" record --config "$work/veltotouch.toml" -o "$work/beside.hid" >"$log" 2>&1 &
    pid=$!
    wait_until 60 "record to start" log_has "$log" "veltotouch: recording" || return 1
    find_hidraw 5678
    log_has "$log" "recording $node " || { note "case 9: record did not find $node, the daemon's: $(<"$log")"; ok=1; }
    wait "$surface"
    wait "$pid"
    status=$?
    emulate_pids=()
    [ $status -eq 0 ] || { note "case 9: record beside the daemon exited with $status: $(<"$log")"; ok=1; }
    reports_of "$work/beside.hid" >"$work/beside.reports"
    # Without the first report when record opened the device after it.
    if ! same_lines "$work/record.source" "$work/beside.reports"; then
        tail -n +2 "$work/record.source" >"$work/record.source-but-first"
        same_reports "case 9, beside the daemon" "$work/record.source-but-first" "$work/beside.reports" || ok=1
    fi
    wait_removed "$n" || return 1
    # The daemon served the surface all the while.
    expect_gestures "$n" examples/taps.expected

    # Ended by --duration, and by SIGINT at moments drawn at random, each
    # leaving a file that reads back and holds a run of the source's reports.
    start_emulate "$source" --product 0x9999 --speed 10 --loop
    wait_until 60 "the surface's hidraw node" find_hidraw 9999 || return 1
    wait_until 60 "udev to take in $node" udev_has "$node" || return 1
    local round=0
    for format in json hid json hid duration; do
        # A log of its own each round: the wait for its first line must not
        # see an earlier round's, or the SIGINT could come before record
        # takes it (a background command starts with SIGINT ignored).
        round=$((round + 1))
        log=$results/record-cut-$round-$format.log
        if [ $format = duration ]; then
            "${on_cpu0[@]}" "$tool" record "$node" -o "$work/cut.$format.json" --duration 1.5 >"$log" 2>&1 &
        else
            "${on_cpu0[@]}" "$tool" record "$node" -o "$work/cut.$format" >"$log" 2>&1 &
        fi
        pid=$!
        wait_until 60 "record to start" log_has "$log" "veltotouch: recording" || return 1
        delay=$((RANDOM % 1500))
        if [ $format != duration ]; then
            pause "$((delay / 1000)).$(printf %03d $((delay % 1000)))"
            kill -INT "$pid"
        fi
        if ! wait_until 60 "record ($format) to end" exited "$pid"; then
            note "case 9: record ($format) did not end after $delay ms and a SIGINT: state $(state_of "$pid")"
            kill -KILL "$pid"
            wait "$pid"
            return 1
        fi
        wait "$pid"
        status=$?
        local file=$work/cut.$format
        [ $format = duration ] && file=$work/cut.$format.json
        [ $status -eq 0 ] || { note "case 9: record ($format, stopped after $delay ms) exited with $status: $(<"$log")"; ok=1; }
        if ! "$tool" replay "$file" >/dev/null 2>"$work/cut.err"; then
            note "case 9: the capture ($format) stopped after $delay ms does not read back: $(<"$work/cut.err")"
            ok=1
            continue
        fi
        reports_of "$file" >"$work/cut.reports"
        if grep -Fxvq -f "$work/record.source" "$work/cut.reports"; then
            note "case 9: the capture ($format) stopped after $delay ms holds reports the source does not"
            ok=1
        fi
    done
    return $ok
}

run_case() {
    local title=$1 start=$SECONDS
    shift
    if [[ $1 == case_* && $cases != all && " $cases " != *" ${1#case_} "* ]]; then
        return 0
    fi
    trace "$1"
    # Keys left over by a case that failed before it read them are not the next one's.
    [[ $1 == case_* ]] && key_segment "$work/before-$1.keys"
    if "$@"; then
        echo "PASS  $title ($((SECONDS - start)) s)"
    else
        echo "FAIL  $title ($((SECONDS - start)) s)"
        failed+=("$title")
    fi
    stop_emulates
}

# ------------------------------------------------------------------- setup

setup_failed() {
    note "setup: $*"
    exit 1
}

trace setup
/lib/systemd/systemd-udevd --daemon 2>"$results/udevd.log" || setup_failed "systemd-udevd did not start"
dbus-daemon --session --address="$address" --fork --print-address >/dev/null 2>"$results/dbus.log" \
    || setup_failed "dbus-daemon did not start"

# Watchers first, so that they miss nothing: the bus's device signals, and
# every gesture of every device (--follow: from before the daemon's start).
dbus-monitor --address "$address" "type='signal',interface='org.veltotouch.VeltoTouch1.Manager'" \
    >"$results/monitor.log" 2>&1 &
monitor_pid=$!
wait_until 30 "dbus-monitor" log_has "$results/monitor.log" member=NameLost || setup_failed "dbus-monitor did not start"
"$tool" ctl --bus "$address" events --follow --jsonl >"$results/events.log" 2>"$results/events-stderr.log" &
events_pid=$!
trace "setup: watchers"
wait_until 30 "ctl events" log_has "$results/events-stderr.log" 'not running; waiting' \
    || setup_failed "ctl events did not start: $(<"$results/events-stderr.log")"

cat >"$work/veltotouch.toml" <<'EOF'
[[match]]
vendor = 0x1234
product = 0x5678

[[match]]
vendor = 0x1234
product = 0x5679
EOF
"${on_cpu0[@]}" "$tool" daemon --bus "$address" --config "$work/veltotouch.toml" >"$results/daemon.log" 2>&1 &
daemon_pid=$!
"$key_events" --wait 60 >"$results/keys.log" 2>"$results/key-events.log" &
keys_pid=$!
wait_until 60 "the keyboard \"VeltoTouch keys\"" log_has "$results/key-events.log" 'key_events: reading' \
    || setup_failed "no keyboard \"VeltoTouch keys\" to read: $(<"$results/key-events.log")"
keyboard=$(sed -n 's/^key_events: reading //p' "$results/key-events.log")
stdbuf -oL libinput debug-events --device "$keyboard" --show-keycodes >"$results/libinput.log" 2>&1 &
libinput_pid=$!
wait_until 60 "libinput" log_has "$results/libinput.log" 'VeltoTouch keys' \
    || setup_failed "libinput debug-events did not take \"VeltoTouch keys\": $(<"$results/libinput.log")"
trace "setup: readers"
wait_until 60 "the daemon on the bus" eval 'ctl devices >/dev/null 2>&1' || setup_failed "the daemon is not on the bus"
trace "setup: daemon"

# The scripted surfaces. Each starts with 200 ms untouched; those watched by
# a ctl events -d N started once the device is there hold still for longer.
"$tool" synth "idle 1s" -o "$work/idle.json" >/dev/null &&
    frames_of "$work/idle.json" >"$work/idle.reports" &&
    "$tool" replay "$work/idle.json" --jsonl >"$work/idle.gestures" &&
    "$tool" synth "tap top; tap middle; hold bottom 1s; tap top; slide bottom top 800ms" \
        -o "$work/malformed-base.json" >/dev/null &&
    "$tool" synth "idle 3s; hold middle 60s" -o "$work/long-hold.json" >/dev/null &&
    "$tool" synth "idle 3s; tap top; tap middle; hold bottom 1s" -o "$work/replug.json" >/dev/null &&
    "$tool" synth "idle 4s; tap top; hold top 1.2s; tap top" -o "$work/two-a.json" >/dev/null &&
    "$tool" synth "idle 4s; tap bottom; hold middle 1.5s; tap bottom; hold bottom 1s" -o "$work/two-b.json" >/dev/null \
    || setup_failed "synth failed"

echo "daemon.sh: set up in $SECONDS s"
run_case "1. every example recording gives its gestures' keys on evdev" case_examples
run_case "2, 5. feature reports through ctl; unconfigured ids left alone" case_unmatched_and_feature_reports
run_case "6. malformed reports change nothing" case_malformed
run_case "7. 1000 reports a second for 10 s, none lost" case_flood
run_case "3. unplug mid-hold releases the key; plugged in again, taken" case_unplug
run_case "4. two surfaces at once, each its own device, gestures and keys" case_two_surfaces
run_case "9. record captures every report, alone or beside the daemon; a stop leaves a valid file" case_record

# The daemon stops in order; ctl events then has printed all it sent.
trace "stop"
kill -TERM "$daemon_pid"
wait "$daemon_pid"
daemon_status=$?
wait_until 30 "ctl events to see the daemon stop" log_has "$results/events-stderr.log" 'daemon stopped'
kill "$events_pid" "$monitor_pid" 2>/dev/null
wait "$events_pid" "$monitor_pid" 2>/dev/null

: >>"$work/gestures.expected"
: >>"$work/watchers"
run_case "1 to 6. each device's gestures on the bus are the recogniser's" check_gestures
run_case "4. ctl events -d N printed its device's gestures" check_watchers
[ "$cases" = all ] && run_case "8. libinput sees the keys evdev sees" check_libinput
kill "$libinput_pid" "$keys_pid" 2>/dev/null
wait "$libinput_pid" "$keys_pid" 2>/dev/null

if [ "$daemon_status" -ne 0 ]; then
    note "the daemon exited with $daemon_status on SIGTERM"
    failed+=("daemon exit status")
fi
echo "daemon.sh: ${#failed[@]} failed, in $SECONDS s"
[ ${#failed[@]} -eq 0 ]
