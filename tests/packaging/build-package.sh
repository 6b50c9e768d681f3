#!/usr/bin/env bash
# Makes the Debian package the other package tests check, into OUT_DIR:
#
#   build-package.sh SOURCE_DIR BUILD_DIR GENERATOR OUT_DIR
#
# A build tree configured with the prefix /usr (the default) is packaged as
# it is: its programs are built already, and CPack strips their debugging
# data. Any other prefix would put wrong paths into the package (the unit's
# ExecStart, the configuration's place), so then the programs are built again
# in OUT_DIR/build with the prefix /usr, as `make package` does.
set -euo pipefail
if [ $# -ne 4 ]; then
    echo "usage: $0 SOURCE_DIR BUILD_DIR GENERATOR OUT_DIR" >&2
    exit 2
fi
source_dir=$1 build_dir=$2 generator=$3 out_dir=$4

prefix=$(sed -n 's/^CMAKE_INSTALL_PREFIX:PATH=//p' "$build_dir/CMakeCache.txt")
if [ "$prefix" != /usr ]; then
    echo "build-package: $build_dir installs into $prefix; building the package's programs with the prefix /usr in $out_dir/build"
    cmake -S "$source_dir" -B "$out_dir/build" -G "$generator" -DCMAKE_BUILD_TYPE=Release \
        -DCMAKE_INSTALL_PREFIX=/usr -DVELTO_BUILD_BENCH=OFF >/dev/null
    cmake --build "$out_dir/build" --target veltotouch VeltoTouchHIDService veltotouch_dbus_interfaces \
        veltotouch_manpage veltotouch_deb_changelog
    build_dir=$out_dir/build
fi

rm -f "$out_dir"/*.deb
cpack -G DEB --config "$build_dir/CPackConfig.cmake" -B "$out_dir"
packages=("$out_dir"/*.deb)
if [ ${#packages[@]} -ne 1 ] || [ ! -f "${packages[0]}" ]; then
    echo "build-package: expected one package in $out_dir, found: ${packages[*]}" >&2
    exit 1
fi
echo "build-package: ${packages[0]}"
