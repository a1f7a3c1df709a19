# The Debian package: `cpack -G DEB` in a build configured with -DCMAKE_INSTALL_PREFIX=/usr
# -DCMAKE_INSTALL_SYSCONFDIR=/etc makes glyphwell_<version>_<arch>.deb of everything the project
# installs, every install component included (the agent, the tool, the client library and its
# development files, the user units, the desktop entry, icon, manual page and documents): one
# package.
#
# The version comes from the top entry of resources/debian/changelog, which must name the
# project's version; its Debian revision is the part after the last "-".
set(glyphwell_debian_dir ${PROJECT_SOURCE_DIR}/resources/debian)
file(STRINGS ${glyphwell_debian_dir}/changelog glyphwell_changelog_top LIMIT_COUNT 1)
if(NOT glyphwell_changelog_top MATCHES "^glyphwell \\(([^)-]+)-([^)-]+)\\) ")
    message(FATAL_ERROR "resources/debian/changelog: the first line is not "
                        "\"glyphwell (VERSION-REVISION) ...\": ${glyphwell_changelog_top}")
endif()
if(NOT CMAKE_MATCH_1 STREQUAL PROJECT_VERSION)
    message(FATAL_ERROR "resources/debian/changelog names version ${CMAKE_MATCH_1}, the project "
                        "is ${PROJECT_VERSION}: add a changelog entry for ${PROJECT_VERSION}")
endif()
set(CPACK_DEBIAN_PACKAGE_RELEASE ${CMAKE_MATCH_2})

if(NOT CMAKE_INSTALL_PREFIX STREQUAL "/usr" OR NOT CMAKE_INSTALL_SYSCONFDIR STREQUAL "/etc")
    message(STATUS "Packaging: the install prefix is ${CMAKE_INSTALL_PREFIX} and the "
                   "configuration directory ${CMAKE_INSTALL_SYSCONFDIR}; a Debian package needs "
                   "-DCMAKE_INSTALL_PREFIX=/usr -DCMAKE_INSTALL_SYSCONFDIR=/etc")
endif()

set(GLYPHWELL_PACKAGE_MAINTAINER "Glyphwell developers <developers@glyphwell.org>"
    CACHE STRING "The Maintainer field of the Debian package")

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME glyphwell)
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_PACKAGE_VENDOR "Glyphwell developers")
set(CPACK_PACKAGE_CONTACT ${GLYPHWELL_PACKAGE_MAINTAINER})
# The package installs where the build was configured to install, so that the paths written into
# the service's ExecStart and the desktop entry's Exec are those of the files in the package.
set(CPACK_PACKAGING_INSTALL_PREFIX ${CMAKE_INSTALL_PREFIX})
# Absolute destinations (CMAKE_INSTALL_SYSCONFDIR=/etc) land in the package too.
set(CPACK_SET_DESTDIR ON)
set(CPACK_STRIP_FILES ON)
set(CPACK_DEB_COMPONENT_INSTALL OFF)

set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION utils)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "font consent agent for desktop applications")
# The summary is the Description's first line; this is the text below it.
set(CPACK_DEBIAN_PACKAGE_DESCRIPTION
    "Glyphwell is the user-interface agent of a font registry: when an application
asks for a font that is not installed but was found in a file on disk, or for
fonts that can be downloaded, the agent asks the user, shows the progress of
the download, and answers. It is started on demand through a systemd user
socket, enabled for every user by this package, and exits when idle.
.
This package also holds the glyphwell command-line tool, which sends requests
to the agent, converts its messages to and from JSON and publishes catalogs of
downloadable fonts.")

# Shared libraries come from dpkg-shlibdeps; the Qt platform plugins are loaded at run time, so
# they are named here: X11 (xcb) and Wayland sessions both need theirs.
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
if(GLYPHWELL_AGENT)
    set(CPACK_DEBIAN_PACKAGE_DEPENDS "qt6-qpa-plugins, qt6-wayland")
endif()
# The bus bridge answers GTK applications only when their font-install module is loaded; "Get
# Missing Fonts" shows its result in a zenity alert where no notification service runs.
set(glyphwell_recommends)
if(TARGET glyphwell-bus-bridge)
    list(APPEND glyphwell_recommends packagekit-gtk3-module)
endif()
if(GLYPHWELL_AGENT)
    list(APPEND glyphwell_recommends zenity)
endif()
list(JOIN glyphwell_recommends ", " CPACK_DEBIAN_PACKAGE_RECOMMENDS)

# The maintainer scripts enable the agent's user socket: only a package with the agent has them.
set(glyphwell_control_extra)
if(GLYPHWELL_AGENT)
    list(APPEND glyphwell_control_extra
         ${glyphwell_debian_dir}/postinst ${glyphwell_debian_dir}/postrm)
endif()
# A shared library of ours (the client library) needs a shlibs file, so that packages built
# against it depend on this one, and the ldconfig trigger, so that its links are made.
if(TARGET glyphwell_client)
    get_target_property(glyphwell_client_type glyphwell_client TYPE)
    if(glyphwell_client_type STREQUAL "SHARED_LIBRARY")
        set(glyphwell_shared_library ON)
    endif()
endif()
if(glyphwell_shared_library)
    set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
    set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY ">=")
    # The tool links the package's own library: dpkg-shlibdeps finds it in the staging tree.
    set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS .${CMAKE_INSTALL_FULL_LIBDIR})
    file(WRITE ${PROJECT_BINARY_DIR}/debian/triggers "activate-noawait ldconfig\n")
    list(APPEND glyphwell_control_extra ${PROJECT_BINARY_DIR}/debian/triggers)
endif()
# The bridge's files in /etc are the administrator's to change: conffiles.
if(TARGET glyphwell-bus-bridge)
    file(WRITE ${PROJECT_BINARY_DIR}/debian/conffiles
         "${CMAKE_INSTALL_FULL_SYSCONFDIR}/xdg/autostart/glyphwell-bus-bridge.desktop\n"
         "${CMAKE_INSTALL_FULL_SYSCONFDIR}/X11/Xsession.d/90glyphwell-gtk-module\n")
    list(APPEND glyphwell_control_extra ${PROJECT_BINARY_DIR}/debian/conffiles)
endif()
set(CPACK_DEBIAN_PACKAGE_CONTROL_EXTRA ${glyphwell_control_extra})
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)

include(CPack)
