#!/usr/bin/env bash
# The first system test: the VM harness (tests/system/vm) boots both ways and
# hands back what ran inside, and the VM has what the daemon relies on. A
# surface made through /dev/uhid gets a hidraw node with its ids, /dev/uinput
# is there, and under systemd, udev and the system bus are running and udev
# takes the surface in.
#
# Run without arguments on the host; the VM runs this file again with one.
# Skips (77) where no VM can be booted, unless CI=true.
set -euo pipefail
here=$(cd "$(dirname "$0")" && pwd)
vm=$here/vm
# The VM sees the host's root but not its /tmp, apart from the current
# directory: run from here, so that this file is there inside too when the
# tree is checked out under /tmp.
cd "$here"

fail() {
    echo "smoke: $*" >&2
    exit 1
}

# Little-endian integers, as struct uhid_event wants them.
u16() { printf "\\x$(printf %02x $(($1 & 255)))\\x$(printf %02x $(($1 >> 8)))"; }
u32() { u16 $(($1 & 65535)); u16 $(($1 >> 16)); }
# A fixed-size string field, padded with NULs.
field() { printf '%s' "$2"; head -c $(($1 - ${#2})) /dev/zero; }

# A surface as the daemon finds one: a vendor-defined device (usage page
# 0xFF60, usage 2, 16-byte input reports) with the ids of the example
# configuration. It lives as long as fd 3 stays open; sets surface_node.
create_surface() {
    local descriptor='\x06\x60\xff\x09\x02\xa1\x01\x15\x00\x26\xff\x00\x75\x08\x95\x10\x09\x01\x81\x02\xc0'
    local event=/tmp/uhid-create2 uevent attempt
    {
        u32 11                          # UHID_CREATE2
        field 128 "VeltoTouch smoke surface"
        field 64 ""                     # phys
        field 64 ""                     # uniq
        u16 21                          # descriptor size
        u16 3                           # bus: USB
        u32 0x1234; u32 0x5678          # vendor, product
        u32 1; u32 0                    # version, country
        printf "$descriptor"
    } >"$event"
    exec 3<>/dev/uhid
    # uhid takes one event per write; cat writes this small file at once.
    cat "$event" >&3
    # The kernel adds the device asynchronously.
    for attempt in $(seq 50); do
        for uevent in /sys/class/hidraw/hidraw*/device/uevent; do
            if grep -qx 'HID_ID=0003:00001234:00005678' "$uevent" 2>/dev/null; then
                surface_node=/dev/$(basename "$(dirname "$(dirname "$uevent")")")
                [ -c "$surface_node" ] && return 0
            fi
        done
        sleep 0.1
    done
    fail "the uhid device got no hidraw node"
}

inside_default() {
    local results=$1 module
    [ -c /dev/uhid ] || fail "no /dev/uhid"
    [ -c /dev/uinput ] || fail "no /dev/uinput"
    for module in uhid hid_generic uinput evdev; do
        grep -q "^$module " /proc/modules || fail "module $module is not loaded"
    done
    create_surface
    echo "$surface_node $(cat "/sys/class/hidraw/${surface_node#/dev/}/device/uevent" | grep '^HID_NAME=')" \
        >"$results/surface"
}

inside_systemd() {
    local state
    state=$(systemctl is-system-running --wait) || fail "the system is $state: $(systemctl --failed --no-legend)"
    systemctl is-active --quiet systemd-udevd.service || fail "systemd-udevd is not running"
    systemctl is-active --quiet dbus.service || fail "the system bus is not running"
    busctl --system status >/dev/null || fail "the system bus does not answer"
    create_surface
    udevadm wait --timeout=10 "$surface_node" || fail "udev did not take in $surface_node"
}

case "${1:-}" in
    --inside-default) inside_default "$2"; exit 0 ;;
    --inside-systemd) inside_systemd; exit 0 ;;
esac

if ! why=$("$vm" --check 2>&1); then
    echo "$why"
    [ "${CI:-}" = true ] && fail "no VM can be booted here, and CI runs the system tests"
    echo "smoke: skipped, no VM can be booted here"
    exit 77
fi

results=$(mktemp -d)
trap 'rm -rf "$results"' EXIT

status=0
"$vm" --timeout 60 -- sh -c 'echo from the VM; exit 3' >"$results/out" || status=$?
[ $status -eq 3 ] || fail "the command's exit status 3 came back as $status"
[ "$(cat "$results/out")" = "from the VM" ] || fail "the command's output came back as: $(cat "$results/out")"

"$vm" --timeout 60 --share "$results" -- "$0" --inside-default "$results" || fail "default boot: see above"
grep -qx '/dev/hidraw[0-9]* HID_NAME=VeltoTouch smoke surface' "$results/surface" \
    || fail "the shared folder holds: $(cat "$results/surface" 2>&1)"

"$vm" --timeout 90 --systemd -- "$0" --inside-systemd || fail "systemd boot: see above"
echo "smoke: both boots passed"
