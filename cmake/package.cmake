# `cpack -G DEB` makes the packages kivd, libkiv1, libkiv-dev and kiv-tools of the four components.
set(KIV_PACKAGE_CONTACT "kivd maintainers <maintainers@kivd.example>" CACHE STRING
    "Maintainer of the packages")

# The changelog's first entry is the version that is packaged.
set(changelog ${packaging}/changelog)
set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${changelog})
file(STRINGS ${changelog} newest LIMIT_COUNT 1)
if(NOT newest MATCHES "^kivd \\(${PROJECT_VERSION}\\) ")
    message(FATAL_ERROR "packaging/changelog has no entry for ${PROJECT_VERSION}")
endif()
execute_process(COMMAND gzip -9nc ${changelog} OUTPUT_FILE ${adapted}/changelog.gz
    COMMAND_ERROR_IS_FATAL ANY)

# What only packages hold, and `cmake --install` leaves out.
function(package_files component package)
    install(FILES ${adapted}/changelog.gz ${packaging}/copyright
        DESTINATION ${CMAKE_INSTALL_DATAROOTDIR}/doc/${package}
        COMPONENT ${component} EXCLUDE_FROM_ALL)
    if(EXISTS ${packaging}/lintian-overrides/${package})
        install(FILES ${packaging}/lintian-overrides/${package}
            DESTINATION ${CMAKE_INSTALL_DATAROOTDIR}/lintian/overrides
            COMPONENT ${component} EXCLUDE_FROM_ALL)
    endif()
    string(TOUPPER ${component} key)
    set(CPACK_DEBIAN_${key}_PACKAGE_NAME ${package} PARENT_SCOPE)
endfunction()
package_files(daemon kivd)
package_files(library libkiv1)
package_files(development libkiv-dev)
package_files(tools kiv-tools)
install(DIRECTORY DESTINATION /etc/kivd/keys COMPONENT daemon EXCLUDE_FROM_ALL)

set(CPACK_PACKAGE_NAME kivd)
set(CPACK_PACKAGE_CONTACT ${KIV_PACKAGE_CONTACT})
set(CPACK_PACKAGE_DIRECTORY ${PROJECT_BINARY_DIR}/packages)
set(CPACK_GENERATOR DEB)
set(CPACK_COMPONENTS_ALL daemon library development tools)
set(CPACK_COMPONENTS_GROUPING IGNORE)
set(CPACK_SET_DESTDIR ON)  # so that what is installed learns the prefix, not a scratch directory
set(CPACK_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_INSTALL_DEFAULT_DIRECTORY_PERMISSIONS
    OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE WORLD_READ WORLD_EXECUTE)
set(CPACK_KIV_DEFAULT_DIRECTORY ${KIV_DEFAULT_DIRECTORY})
set(CPACK_PROJECT_CONFIG_FILE ${PROJECT_SOURCE_DIR}/cmake/package_build.cmake)

set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)

set(CPACK_DEBIAN_DAEMON_PACKAGE_SECTION admin)
set(CPACK_DEBIAN_DAEMON_PACKAGE_DEPENDS
    "systemd | systemd-standalone-sysusers | systemd-sysusers")
if(KIV_PACKS_RELOCATIONS)
    string(APPEND CPACK_DEBIAN_DAEMON_PACKAGE_DEPENDS ", libc6 (>= 2.36)")  # no symbol tells
endif()
set(CPACK_DEBIAN_DAEMON_PACKAGE_RECOMMENDS kiv-tools)
set(CPACK_DEBIAN_DAEMON_PACKAGE_CONTROL_EXTRA
    ${packaging}/deb/kivd/postinst ${packaging}/deb/kivd/prerm ${packaging}/deb/kivd/postrm)
set(CPACK_COMPONENT_DAEMON_DESCRIPTION "daemon that collects probe data
Programs of this machine send events, counters and static data to it over
local sockets. It keeps them through restarts and makes numbered, compressed
report files of them; with keys in place it seals these for their collectors,
and takes signed configurations that say which probes are kept.")

set(CPACK_DEBIAN_LIBRARY_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_LIBRARY_PACKAGE_SUGGESTS kivd)
set(CPACK_DEBIAN_LIBRARY_PACKAGE_CONTROL_EXTRA
    ${packaging}/deb/libkiv1/shlibs ${packaging}/deb/libkiv1/triggers)
set(CPACK_COMPONENT_LIBRARY_DESCRIPTION "client library of the probe data daemon kivd
Programs send events, counters and static data to the daemon with it. Sending
is one datagram and no waiting; the library may be used from many threads and
on both sides of a fork.")

set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS "libkiv1 (= ${PROJECT_VERSION})")
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SUGGESTS "kivd, pkg-config | cmake")
set(CPACK_COMPONENT_DEVELOPMENT_DESCRIPTION "client library of the probe data daemon kivd - development files
What is needed to build programs that send data to the daemon: a header for C
and C++, the static library, and files for pkg-config and CMake.")

set(CPACK_DEBIAN_TOOLS_PACKAGE_SECTION admin)
set(CPACK_DEBIAN_TOOLS_PACKAGE_SUGGESTS kivd)
set(CPACK_COMPONENT_TOOLS_DESCRIPTION "tools for the probe data daemon kivd
kivctl sends data and requests to the daemon and shows its traffic. kivtool
reads reports, also sealed ones, and builds and signs configurations.")

include(CPack)
