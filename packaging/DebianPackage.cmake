# The Debian package, made by CPack from what `cmake --install` lays down:
#
#   cpack -G DEB --config BUILD/CPackConfig.cmake   ->  veltotouch_VERSION_ARCH.deb
#
# Only a build configured with the prefix /usr makes a package that works
# (the unit, the D-Bus policy and the plug-in locator carry full paths); the
# default prefix is /usr for that reason.
#
# There is no debhelper here, so what it would add is written out: the
# maintainer scripts in packaging/deb/ (the user, udev, the bus, the unit),
# the conffile list, a changelog and a copyright file in the documentation
# folder. lintian checks the result (tests/packaging/).

if(NOT CMAKE_INSTALL_PREFIX STREQUAL "/usr")
  message(STATUS "Package: the prefix is ${CMAKE_INSTALL_PREFIX}, not /usr; a package made from this build would not work")
endif()

set(velto_deb_dir ${CMAKE_CURRENT_SOURCE_DIR}/packaging/deb)
set(velto_deb_build_dir ${CMAKE_CURRENT_BINARY_DIR}/packaging/deb)

# The configuration is the administrator's: dpkg keeps their changes over
# upgrades and asks before replacing them.
file(WRITE ${velto_deb_build_dir}/conffiles "${CMAKE_INSTALL_FULL_SYSCONFDIR}/veltotouch/veltotouch.toml\n")
# The maintainer scripts.
foreach(script postinst prerm postrm)
  configure_file(${velto_deb_dir}/${script} ${velto_deb_build_dir}/${script} COPYONLY)
endforeach()

# Debian wants the changelog compressed, reproducibly (no name, no time stamp).
add_custom_command(
  OUTPUT ${velto_deb_build_dir}/changelog.gz
  COMMAND gzip -9nc ${velto_deb_dir}/changelog > ${velto_deb_build_dir}/changelog.gz
  DEPENDS ${velto_deb_dir}/changelog
  VERBATIM)
add_custom_target(veltotouch_deb_changelog ALL DEPENDS ${velto_deb_build_dir}/changelog.gz)
install(FILES ${velto_deb_build_dir}/changelog.gz DESTINATION ${VELTO_DOC_DIR})
install(FILES ${velto_deb_dir}/copyright DESTINATION ${VELTO_DOC_DIR})
# What lintian reports and we mean (each entry says why).
install(FILES ${velto_deb_dir}/lintian-overrides DESTINATION ${CMAKE_INSTALL_DATAROOTDIR}/lintian/overrides
        RENAME veltotouch)

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME veltotouch)
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_PACKAGE_CONTACT "VeltoTouch maintainers <maintainers@users.noreply.c-seed-8eeba653.example>")
set(CPACK_PACKAGE_VENDOR "VeltoTouch")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "touch strip service: taps and holds become media keys")
# The extended description: CPack puts the summary before it, indents every
# line and turns an empty one into " .".
set(CPACK_DEBIAN_PACKAGE_DESCRIPTION "The VeltoTouch surface is a strip of 15 capacitive pads. This service finds
the surfaces named in /etc/veltotouch/veltotouch.toml through udev,
recognises taps and holds in the strip's three regions and turns them into
key presses on a virtual keyboard (volume up and down, play/pause, voice
command by default). Every device is served on the system bus as
org.veltotouch.VeltoTouch1, where its settings can be read and changed while
it runs and its recent input saved as a recording.

The veltotouch tool also controls the service (veltotouch ctl), emulates a
surface through uhid, and replays, synthesises and evaluates recordings.")
set(CPACK_DEBIAN_PACKAGE_SECTION utils)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)
set(VELTO_PACKAGE_HOMEPAGE "" CACHE STRING "The package's Homepage field (none when empty)")
if(VELTO_PACKAGE_HOMEPAGE)
  set(CPACK_DEBIAN_PACKAGE_HOMEPAGE ${VELTO_PACKAGE_HOMEPAGE})
endif()
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)

# The libraries the programs link (libsystemd0, libudev1, libevdev2, the C++
# runtime) come from dpkg-shlibdeps, with the versions their symbols need; the
# two of our own live in the package itself. What the service runs or needs
# running is named by hand: the system bus and udev, systemd-sysusers for the
# user, setfacl for the udev rule, /bin/kill for the unit's reload.
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${CMAKE_CURRENT_BINARY_DIR}/src)
set(CPACK_DEBIAN_PACKAGE_DEPENDS
    "dbus, udev, acl, procps, systemd | systemd-standalone-sysusers | systemd-sysusers")
set(CPACK_DEBIAN_PACKAGE_CONTROL_EXTRA
    ${velto_deb_build_dir}/postinst ${velto_deb_build_dir}/prerm ${velto_deb_build_dir}/postrm
    ${velto_deb_build_dir}/conffiles)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
# The install writes into DESTDIR (the package's root), so that the
# configuration's absolute /etc path lands in the package too.
set(CPACK_SET_DESTDIR ON)
set(CPACK_INSTALL_DEFAULT_DIRECTORY_PERMISSIONS
    OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE WORLD_READ WORLD_EXECUTE)
# A RelWithDebInfo tree (the tests') packages without its debugging data.
set(CPACK_STRIP_FILES ON)
set(CPACK_DEBIAN_COMPRESSION_TYPE xz)

include(CPack)
