#!/usr/bin/env bash
# The package as Debian's tools see it, before anything installs it:
# lintian finds no error and no warning that packaging/deb/lintian-overrides
# does not explain, and the control data says what the service needs.
#
#   check-package.sh PACKAGE_DIR SOURCE_DIR
#
# Skips (77) without lintian, unless CI=true.
set -euo pipefail
package_dir=$1 source_dir=$2

fail() {
    echo "check-package: $*" >&2
    exit 1
}

packages=("$package_dir"/veltotouch_*.deb)
deb=${packages[0]}
[ ${#packages[@]} -eq 1 ] && [ -f "$deb" ] || fail "expected one package in $package_dir (the fixture Package.build makes it)"

# The control fields and the files that make the service work.
field() { dpkg-deb --field "$deb" "$1"; }
depends=$(field Depends)
depended=$(tr ',|' '\n\n' <<<"$depends" | sed 's/^ *//; s/ .*//')
for needed in libsystemd0 libudev1 libevdev2 libstdc++6 acl dbus udev procps systemd; do
    grep -qxF "$needed" <<<"$depended" || fail "Depends lacks $needed: $depends"
done
changelog_version=$(dpkg-parsechangelog -l "$source_dir/packaging/deb/changelog" -S Version)
[ "$(field Version)" = "$changelog_version" ] \
    || fail "the package is version $(field Version), packaging/deb/changelog's newest entry $changelog_version"
[ "$(field Package)_$(field Version)_$(field Architecture).deb" = "$(basename "$deb")" ] \
    || fail "the file is named $(basename "$deb"), not after its control fields"

control=$(mktemp -d)
trap 'rm -rf "$control"' EXIT
dpkg-deb --control "$deb" "$control"
[ "$(cat "$control/conffiles")" = /etc/veltotouch/veltotouch.toml ] \
    || fail "conffiles holds: $(cat "$control/conffiles")"
for script in postinst prerm postrm; do
    [ -x "$control/$script" ] || fail "no executable $script"
done

contents=$(dpkg-deb --contents "$deb" | awk '{ print $6 }')
for file in ./etc/veltotouch/veltotouch.toml ./usr/bin/veltotouch \
            ./usr/lib/systemd/system/veltotouch.service ./usr/lib/sysusers.d/veltotouch.conf \
            ./usr/lib/udev/rules.d/70-veltotouch.rules ./usr/share/dbus-1/system.d/org.veltotouch.VeltoTouch1.conf \
            ./usr/share/dbus-1/interfaces/org.veltotouch.VeltoTouch1.Manager.xml \
            ./usr/share/dbus-1/interfaces/org.veltotouch.VeltoTouch1.Device.xml \
            ./usr/share/man/man1/veltotouch.1.gz ./usr/share/doc/veltotouch/copyright \
            ./usr/share/doc/veltotouch/changelog.gz; do
    grep -qxF "$file" <<<"$contents" || fail "the package lacks $file"
done
# The unit starts the program where the package puts it, with the conffile.
unit=$(dpkg-deb --fsys-tarfile "$deb" | tar -xO ./usr/lib/systemd/system/veltotouch.service)
grep -qx 'ExecStart=/usr/bin/veltotouch daemon --config /etc/veltotouch/veltotouch.toml' <<<"$unit" \
    || fail "the unit's ExecStart is: $(grep '^ExecStart=' <<<"$unit")"
# The plug-in module is where the installed tool looks for it first.
grep -Eq '^\./usr/lib/([^/]+/)?veltotouch/libVeltoTouchHIDService\.so$' <<<"$contents" \
    || fail "the plug-in module is not under /usr/lib: $(grep VeltoTouchHIDService <<<"$contents")"
echo "check-package: control data and files as the service needs them"

if ! command -v lintian >/dev/null; then
    [ "${CI:-}" = true ] && fail "lintian is not installed (scripts/install-deps installs it), and CI checks the package"
    echo "check-package: skipped lintian, it is not installed (scripts/install-deps installs it)"
    exit 77
fi
# --fail-on: an error or a warning fails; informational tags are printed.
lintian --fail-on error,warning --display-info "$deb" || fail "lintian: see above"
echo "check-package: lintian reports no error and no warning"
