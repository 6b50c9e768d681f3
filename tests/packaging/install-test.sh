#!/usr/bin/env bash
# The package installed as a user installs it, on a machine with systemd as
# PID 1, udev and the system bus (tests/system/vm --systemd):
#
# - dpkg -i runs the maintainer scripts: systemd-sysusers makes the user, udev
#   gives it /dev/uinput, the unit is enabled and started (and, with the
#   shipped configuration naming no device, says why it stops, as an error);
# - with the configuration and an /etc/udev/rules.d override naming the
#   emulated surface's ids, the unit becomes active through its readiness
#   notification, runs as the user "veltotouch" inside its sandbox, and the
#   taps of examples/taps.json come out as keys on "VeltoTouch keys";
# - on the system bus, under the shipped policy, changing a setting, saving a
#   recording and reading the Recording key are refused to a user outside the
#   group "veltotouch" and allowed to a member, other reads to both; the
#   installed introspection data is what the service answers;
# - the journal holds the service's messages with their priorities;
# - systemctl stop ends it in order while a key is held: the key is released
#   by the daemon itself before its keyboard goes.
#
# Run on the host with the folder holding the package; the VM runs this file
# again with --inside. Skips (77) where no VM can be booted, unless CI=true.
set -euo pipefail
here=$(cd "$(dirname "$0")" && pwd)
source_dir=$(cd "$here/../.." && pwd)

fail() {
    echo "install-test: $*" >&2
    exit 1
}
pass() {
    echo "install-test: ok: $* [$(cut -d ' ' -f 1 /proc/uptime 2>/dev/null)s]"
}

# Runs `$@` every 0.2 s until it succeeds or `limit` seconds have passed:
# what is waited for happens in well under that; the limit only bounds a
# failure (the VM runs under emulation, several times slower than a PC).
wait_for() {
    local deadline=$((SECONDS + $1))
    shift
    until "$@"; do
        [ $SECONDS -lt $deadline ] || return 1
        sleep 0.2
    done
}

# The evdev node of the service's virtual keyboard.
keyboard_node() {
    local name
    for name in /sys/class/input/event*/device/name; do
        if [ "$(cat "$name" 2>/dev/null)" = "VeltoTouch keys" ]; then
            echo "/dev/input/$(basename "$(dirname "$(dirname "$name")")")"
            return 0
        fi
    done
    return 1
}

# Key events of a raw evdev capture (struct input_event, 24 bytes on x86-64),
# one "TYPE CODE VALUE" line per event, in decimal.
evdev_events() {
    od -An -v -w24 -t u2 "$1" | awk '{ print $9, $10, $11 + 65536 * $12 }'
}

# The <interface> element named $2 of a D-Bus introspection in $1.
interface_element() {
    awk -v name="$2" '
        $0 ~ "^ *<interface name=\"" name "\">" { inside = 1 }
        inside { print }
        inside && /^ *<\/interface>/ { exit }
    ' "$1"
}

unit_property() {
    systemctl show -p "$1" --value veltotouch.service
}

inside() {
    local deb=$1 work=$2 state uid pid node member outsider devices device key
    cd "$source_dir"
    state=$(systemctl is-system-running --wait) || fail "the system is $state: $(systemctl --failed --no-legend)"
    echo "install-test: booted, $(cut -d ' ' -f 1 /proc/uptime)s after the kernel started"

    # This machine's root is a container's: its policy-rc.d forbids starting
    # services, and man-db would rebuild its index on every install, minutes
    # under emulation. A user's machine has neither.
    rm -f /usr/sbin/policy-rc.d /var/lib/man-db/auto-update

    dpkg -i "$deb" >"$work/dpkg.log" 2>&1 || { cat "$work/dpkg.log"; fail "dpkg -i failed"; }
    dpkg-query -W -f='${Status}' veltotouch | grep -qx 'install ok installed' || fail "not installed: $(dpkg -l veltotouch)"
    getent passwd veltotouch | grep -q ':/var/lib/veltotouch:/usr/sbin/nologin$' \
        || fail "systemd-sysusers did not make the user: $(getent passwd veltotouch || echo none)"
    getent group veltotouch >/dev/null || fail "no group veltotouch"
    uid=$(id -u veltotouch)
    pass "dpkg -i: user veltotouch ($uid) made by systemd-sysusers"
    getfacl -p /dev/uinput 2>/dev/null | grep -qx 'user:veltotouch:rw-' \
        || fail "udev did not give the user /dev/uinput: $(getfacl -p /dev/uinput 2>&1)"
    pass "postinst: udev rule applied, /dev/uinput has the ACL entry user:veltotouch:rw-"
    [ "$(systemctl is-enabled veltotouch.service)" = enabled ] || fail "the unit is not enabled"
    # The shipped configuration names no device, so the started daemon ends
    # at once saying so: proof that postinst started it, and that its last
    # word reaches the journal as an error.
    wait_for 30 journal_has_message 3 'no device to serve' \
        || fail "no error 'no device to serve' from the unit started by postinst: $(journalctl -u veltotouch --no-pager -o cat)"
    pass "postinst enabled and started the unit; with no [[match]] it stopped with an error (priority 3) in the journal"
    # ... and stays stopped (exit 78, RestartPreventExitStatus=), instead of
    # restarting every two seconds until the configuration changes.
    sleep 3
    [ "$(unit_property ExecMainStatus)/$(unit_property NRestarts)" = 78/0 ] \
        || fail "with nothing to serve: exit $(unit_property ExecMainStatus), $(unit_property NRestarts) restarts; expected 78, none"
    pass "with nothing to serve the unit is not restarted (exit 78)"

    # Configuration and udev rule for the emulated surface (0x1234:0x5678).
    local config=/etc/veltotouch/veltotouch.toml
    sed -i -e '0,/^#\[\[match\]\]$/s//[[match]]/' -e '0,/^#vendor = 0x1234$/s//vendor = 0x1234/' \
        -e '0,/^#product = 0x5678$/s//product = 0x5678/' -e 's/^#log_level = "default"$/log_level = "default"/' "$config"
    [ "$(grep -cE '^(\[\[match\]\]|vendor = 0x1234|product = 0x5678|log_level = "default")$' "$config")" -eq 4 ] \
        || fail "could not edit $config: $(grep -vE '^(#|$)' "$config")"
    sed 's/^#\(SUBSYSTEM=="hidraw", KERNELS=="000\[35\]:1234:5678\.\*"\)/\1/' \
        /usr/lib/udev/rules.d/70-veltotouch.rules >/etc/udev/rules.d/70-veltotouch.rules
    grep -q '^SUBSYSTEM=="hidraw", KERNELS=="000\[35\]:1234:5678' /etc/udev/rules.d/70-veltotouch.rules \
        || fail "could not make the udev rule override"
    udevadm control --reload
    # Type=notify: restart returns once the daemon says it is ready.
    systemctl reset-failed veltotouch.service 2>/dev/null || true
    systemctl restart veltotouch.service || fail "restart failed: $(journalctl -u veltotouch --no-pager -o cat | tail -n 20)"
    [ "$(systemctl is-active veltotouch.service)" = active ] || fail "not active after restart"
    [ "$(unit_property Type)" = notify ] || fail "Type=$(unit_property Type)"
    [ "$(unit_property ActiveState)/$(unit_property SubState)" = active/running ] \
        || fail "state $(unit_property ActiveState)/$(unit_property SubState)"
    pid=$(unit_property MainPID)
    [ "$pid" -gt 0 ] || fail "no main process"
    pass "active through its readiness notification (Type=notify, active/running, MainPID $pid)"

    # The sandbox as the kernel sees it.
    local status
    status=$(cat "/proc/$pid/status")
    grep -qx "Uid:	$uid	$uid	$uid	$uid" <<<"$status" || fail "runs as $(grep '^Uid:' <<<"$status"), not $uid"
    grep -qx "Gid:	$(id -g veltotouch)	.*" <<<"$status" || fail "group: $(grep '^Gid:' <<<"$status")"
    grep -qx 'CapEff:	0000000000000000' <<<"$status" || fail "capabilities: $(grep '^Cap' <<<"$status")"
    grep -qx 'CapBnd:	0000000000000000' <<<"$status" || fail "bounding set: $(grep '^CapBnd:' <<<"$status")"
    grep -qx 'NoNewPrivs:	1' <<<"$status" || fail "NoNewPrivs is not set"
    grep -qx 'Seccomp:	2' <<<"$status" || fail "no system-call filter: $(grep '^Seccomp:' <<<"$status")"
    pass "runs as veltotouch ($uid) with no capabilities, NoNewPrivs and a seccomp filter"

    # Taps on an emulated surface come out as keys, as a desktop reads them.
    wait_for 20 keyboard_node >/dev/null || fail "no \"VeltoTouch keys\" input device: $(journalctl -u veltotouch --no-pager -o cat | tail)"
    node=$(keyboard_node)
    stdbuf -oL libinput debug-events --device "$node" --show-keycodes >"$work/taps.libinput" 2>&1 &
    local reader=$!
    wait_for 20 grep -q DEVICE_ADDED "$work/taps.libinput" || fail "libinput did not open $node: $(cat "$work/taps.libinput")"
    veltotouch emulate examples/taps.json >"$work/emulate-taps.log" 2>&1 || fail "emulate: $(cat "$work/emulate-taps.log")"
    # The keys each tap sends with the shipped bindings, in the order of the
    # taps the recogniser finds in the recording (its expected output).
    local expected=() region
    for region in $(sed -n 's/.*"gesture":"tap","region":"\([a-z]*\)".*/\1/p' examples/taps.expected); do
        case $region in
            top) key=KEY_VOLUMEUP ;; middle) key=KEY_PLAYPAUSE ;; bottom) key=KEY_VOLUMEDOWN ;;
        esac
        expected+=("$key pressed" "$key released")
    done
    [ ${#expected[@]} -eq 6 ] || fail "examples/taps.json should hold three taps: ${expected[*]}"
    keys_seen() { grep -o 'KEY_[A-Z0-9_]* ([0-9]*) \(pressed\|released\)' "$work/taps.libinput" | sed 's/ ([0-9]*)//'; }
    wait_for 30 test "$(keys_seen | wc -l)" -ge ${#expected[@]} || true
    kill -INT $reader 2>/dev/null || true
    wait $reader 2>/dev/null || true
    [ "$(keys_seen)" = "$(printf '%s\n' "${expected[@]}")" ] \
        || fail "keys on $node: $(keys_seen | tr '\n' ',') expected $(printf '%s,' "${expected[@]}") (daemon: $(journalctl -u veltotouch --no-pager -o cat | tail -n 5))"
    pass "the three taps of examples/taps.json came out as $(keys_seen | grep -c pressed) key presses on $node (libinput)"

    # Messages with their priorities: the daemon's notices (5), tagged with
    # their category. Then back to logging errors only, through the unit's
    # reload (SIGHUP): at "default" the plug-in notes every event, more than
    # the long hold below needs.
    journal_has_message 5 'serving [0-9]+ devices' Daemon || fail "no notice 'serving N devices' in the journal"
    journal_has_message 5 '/dev/hidraw[0-9]+ attached' Daemon || fail "no notice '/dev/hidrawN attached' in the journal"
    pass "journalctl -u veltotouch: the daemon's notices at priority 5 (VELTOTOUCH_CATEGORY=Daemon), the start failure at 3"
    sed -i 's/^log_level = "default"$/#log_level = "default"/' "$config"
    systemctl reload veltotouch.service || fail "systemctl reload failed"
    [ "$(unit_property MainPID)" = "$pid" ] && [ "$(systemctl is-active veltotouch.service)" = active ] \
        || fail "the reload did not leave the same daemon running"

    # A finger resting on the middle for long: its key stays down. The
    # keyboard is read raw from here on, to see which SYN_REPORT ends an event.
    cat "$node" >"$work/hold.evdev" 2>/dev/null &
    reader=$!
    veltotouch emulate "$work/long-hold.json" >"$work/emulate-hold.log" 2>&1 &
    local emulator=$!
    # KEY_VOICECOMMAND is 0x246.
    voice_down() { evdev_events "$work/hold.evdev" | grep -x '1 582 1' >/dev/null; }
    wait_for 60 voice_down || fail "the hold brought no KEY_VOICECOMMAND press: $(evdev_events "$work/hold.evdev" | tr '\n' ',')"
    pass "a middle hold holds KEY_VOICECOMMAND down"

    # The input report thread runs at the real-time priority the unit allows.
    ps -L -o cls=,rtprio= -p "$pid" | grep -Eq '^ *RR +63$' \
        || fail "no thread of the daemon at SCHED_RR 63: $(ps -L -o tid=,cls=,rtprio=,comm= -p "$pid" | tr '\n' ';')"
    pass "the input report thread runs at SCHED_RR 63 (LimitRTPRIO=63, system-call filter allows it)"

    # The bus policy, with two users made here.
    member=velto-member outsider=velto-outsider
    useradd --create-home --groups veltotouch "$member"
    useradd --create-home "$outsider"
    as() { local user=$1; shift; (cd "/home/$user" && runuser -u "$user" -- "$@"); }
    devices=$(as "$outsider" veltotouch ctl devices) || fail "ctl devices refused to $outsider"
    device=$(awk '{ print $1; exit }' <<<"$devices")
    [ -n "$device" ] || fail "ctl devices listed nothing"
    # (Every program start costs seconds under emulation: one read each way.)
    [ "$(as "$outsider" veltotouch ctl get -d "$device" FactoryResetHoldDuration)" = 5000 ] \
        || fail "ctl get FactoryResetHoldDuration refused to $outsider"
    as "$member" veltotouch ctl get -d "$device" Pipeline.Algs.HoldTimeoutMilliseconds >/dev/null \
        || fail "ctl get Pipeline.Algs.HoldTimeoutMilliseconds refused to $member"
    pass "ctl devices and ctl get of settings allowed to a member and to an outsider"
    refused() {  # user, what, command...
        local user=$1 what=$2 out
        shift 2
        if out=$(as "$user" "$@" 2>&1 >/dev/null); then
            fail "$what was allowed to $user"
        fi
        # Refused by the bus's policy ("Rejected send message") or by the
        # daemon itself (the raw touch data), not failed for another reason.
        grep -qE 'Rejected send message|AccessDenied|kept to root and the group veltotouch' <<<"$out" \
            || fail "$what as $user failed otherwise than refused: $out"
    }
    refused "$outsider" "ctl set" veltotouch ctl set -d "$device" Pipeline.Algs.HoldTimeoutMilliseconds=500
    refused "$outsider" "ctl save-recording" veltotouch ctl save-recording -d "$device" saved.json
    [ ! -e "/home/$outsider/saved.json" ] || fail "a refused save-recording left saved.json behind"
    refused "$outsider" "ctl get Recording" veltotouch ctl get -d "$device" Recording
    pass "ctl set, save-recording and get Recording refused to $outsider (not in group veltotouch)"
    as "$member" veltotouch ctl set -d "$device" Pipeline.Algs.HoldTimeoutMilliseconds=500 \
        || fail "ctl set refused to $member"
    as "$member" veltotouch ctl save-recording -d "$device" saved.json || fail "ctl save-recording refused to $member"
    # Replayed on the host afterwards: it must be a whole recording.
    cp "/home/$member/saved.json" "$work/saved.json"
    [ "$(stat -c %U "/home/$member/saved.json")" = "$member" ] || fail "the saved recording is not the member's file"
    as "$member" veltotouch ctl get -d "$device" Recording >"$work/recording.json" \
        || fail "ctl get Recording refused to $member"
    [ "$(head -c 1 "$work/recording.json")" = '"' ] || fail "ctl get Recording is not a JSON string"
    pass "ctl set, save-recording (a file of the member's own) and get Recording allowed to $member"

    # The installed introspection data is what the service answers.
    local interface path
    for interface in Manager Device; do
        path=/org/veltotouch/VeltoTouch1
        [ $interface = Device ] && path=$path/device/$device
        busctl introspect --xml-interface org.veltotouch.VeltoTouch1 "$path" >"$work/live.xml"
        interface_element "$work/live.xml" "org.veltotouch.VeltoTouch1.$interface" >"$work/live-element.xml"
        interface_element "/usr/share/dbus-1/interfaces/org.veltotouch.VeltoTouch1.$interface.xml" \
            "org.veltotouch.VeltoTouch1.$interface" >"$work/installed-element.xml"
        [ -s "$work/live-element.xml" ] || fail "the service does not introspect $interface"
        cmp -s "$work/live-element.xml" "$work/installed-element.xml" \
            || fail "installed $interface interface differs: $(diff "$work/installed-element.xml" "$work/live-element.xml")"
    done
    pass "/usr/share/dbus-1/interfaces/org.veltotouch.VeltoTouch1.{Manager,Device}.xml match the service's introspection"

    # Stopped mid-hold: in order, and the daemon releases the key itself. The
    # kernel releases keys still down when a virtual keyboard is destroyed,
    # but marks that SYN_REPORT with the value 1; the daemon's own release is
    # followed by an ordinary SYN_REPORT (0).
    evdev_events "$work/hold.evdev" | grep -E '^1 582 ' | tail -n 1 | grep -qx '1 582 1' \
        || fail "KEY_VOICECOMMAND was released before the stop (the hold is too short here)"
    systemctl stop veltotouch.service || fail "systemctl stop failed"
    [ "$(unit_property ActiveState)" = inactive ] || fail "after stop: $(unit_property ActiveState)"
    [ "$(unit_property Result)" = success ] || fail "stop result: $(unit_property Result)"
    [ "$(unit_property ExecMainStatus)" = 0 ] || fail "the daemon exited with $(unit_property ExecMainStatus)"
    wait_for 20 test ! -e "$node" || fail "the keyboard did not go away with the service"
    wait $reader 2>/dev/null || true
    kill "$emulator" 2>/dev/null || true
    wait "$emulator" 2>/dev/null || true
    # The last KEY_VOICECOMMAND event and the SYN_REPORT that ends it.
    local after
    after=$(evdev_events "$work/hold.evdev" | awk '
        $1 == 1 && $2 == 582 { key = $0; syn = ""; waiting = 1; next }
        waiting && $1 == 0 && $2 == 0 { syn = $0; waiting = 0 }
        END { print key; print syn }')
    [ "$(head -n 1 <<<"$after")" = "1 582 0" ] || fail "the last KEY_VOICECOMMAND event is not a release: $(evdev_events "$work/hold.evdev" | tail -n 4 | tr '\n' ',')"
    [ "$(sed -n 2p <<<"$after")" = "0 0 0" ] \
        || fail "KEY_VOICECOMMAND was released by the kernel when the keyboard went, not by the daemon: $(tr '\n' ',' <<<"$after")"
    pass "systemctl stop mid-hold: inactive, result success, exit 0; the daemon released KEY_VOICECOMMAND itself"
}

# Whether the service's journal holds a message at priority $1 matching the
# extended regular expression $2, of category $3 when given (a field the
# journal indexes, so that the daemon's notices are found without reading
# through the plug-in's).
journal_has_message() {
    journalctl -u veltotouch -o json --no-pager ${3:+VELTOTOUCH_CATEGORY=$3} \
        | grep -E "\"MESSAGE\":\"[^\"]*$2" | grep "\"PRIORITY\":\"$1\"" >/dev/null
}

case "${1:-}" in
    --inside) inside "$2" "$3"; exit 0 ;;
esac

[ $# -eq 1 ] || { echo "usage: $0 PACKAGE_DIR" >&2; exit 2; }
packages=("$1"/veltotouch_*.deb)
[ ${#packages[@]} -eq 1 ] && [ -f "${packages[0]}" ] || fail "expected one package in $1 (the fixture Package.build makes it)"

vm=$source_dir/tests/system/vm
if ! why=$("$vm" --check 2>&1); then
    echo "$why"
    [ "${CI:-}" = true ] && fail "no VM can be booted here, and CI runs the system tests"
    echo "install-test: skipped, no VM can be booted here"
    exit 77
fi

# The VM sees the host's root, but of /tmp only what is shared: the package
# travels in a shared folder (which also brings the logs back), and the
# command runs from the source tree so that this file and examples/ are seen
# even when the tree is under /tmp.
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cp "${packages[0]}" "$work/"
# The packaged tool, unpacked here, makes the long hold the VM plays (quicker
# than under emulation) and replays what the VM saved.
dpkg-deb -x "${packages[0]}" "$work/root"
tool=$work/root/usr/bin/veltotouch
"$tool" synth "hold middle 300s" -o "$work/long-hold.json" >/dev/null
cd "$source_dir"
status=0
"$vm" --systemd --timeout 540 --share "$work" -- "$here/install-test.sh" --inside "$work/$(basename "${packages[0]}")" "$work" \
    || status=$?
if [ $status -ne 0 ]; then
    for log in "$work"/*.log; do
        [ -s "$log" ] && sed "s|^|$(basename "$log"): |" "$log" >&2
    done
    fail "the install in the VM failed (status $status), see above"
fi
"$tool" replay "$work/saved.json" >/dev/null || fail "the recording the member saved does not replay"
echo "install-test: ok: the recording the member saved replays"
echo "install-test: the package installs and runs as a user would install it (VM ${SECONDS}s)"
