# What `cmake --install` puts where, in four components: daemon, library (what programs need to
# run), development (what they need to be built) and tools.
include(CMakePackageConfigHelpers)

set(packaging ${PROJECT_SOURCE_DIR}/packaging)
set(adapted ${PROJECT_BINARY_DIR}/packaging)

# systemd makes directories below /var/lib/; any other has to be there.
if(KIV_DEFAULT_DIRECTORY MATCHES "^/var/lib/(.+)/$")
    set(state_directory "StateDirectory=${CMAKE_MATCH_1}")
else()
    set(state_directory "ReadWritePaths=${KIV_DEFAULT_DIRECTORY}")
endif()

# Installs a text that has the prefix as "=/usr", with the prefix that there is, which is only known
# while installing; and with the directory that this build's daemon works in.
function(install_with_prefix file destination component)
    get_filename_component(name ${file} NAME)
    install(CODE "
        file(READ \"${file}\" text)
        string(REPLACE \"=/usr\" \"=\${CMAKE_INSTALL_PREFIX}\" text \"\${text}\")
        string(REPLACE /sbin/kivd \"/${CMAKE_INSTALL_SBINDIR}/kivd\" text \"\${text}\")
        string(REPLACE \"\\nStateDirectory=kivd\\n\" \"\\n${state_directory}\\n\" text \"\${text}\")
        file(WRITE \"${adapted}/installed/${name}\" \"\${text}\")
        " COMPONENT ${component})
    install(FILES ${adapted}/installed/${name} DESTINATION ${destination} COMPONENT ${component})
endfunction()

# daemon
set(daemon_doc_dir ${CMAKE_INSTALL_DATAROOTDIR}/doc/kivd)
install(TARGETS kivd RUNTIME DESTINATION ${CMAKE_INSTALL_SBINDIR} COMPONENT daemon)
install(TARGETS kivd_crypto LIBRARY DESTINATION ${KIV_MODULE_INSTALL_DIRECTORY} COMPONENT daemon)
install_with_prefix(${packaging}/kivd.service lib/systemd/system daemon)
install(FILES ${packaging}/sysusers.conf DESTINATION lib/sysusers.d RENAME kivd.conf
    COMPONENT daemon)
install_with_prefix(${packaging}/examples/debug.conf ${daemon_doc_dir}/examples daemon)
install(FILES README.md ARCHITECTURE.md DESTINATION ${daemon_doc_dir} COMPONENT daemon)
install(DIRECTORY docs DESTINATION ${daemon_doc_dir} COMPONENT daemon)

# tools
install(TARGETS kivctl kivtool RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT tools)
install(DIRECTORY proto DESTINATION ${CMAKE_INSTALL_DATAROOTDIR}/kivtool COMPONENT tools
    FILES_MATCHING PATTERN *.proto)

# library and development
set(cmake_dir ${CMAKE_INSTALL_LIBDIR}/cmake/kiv)
install(TARGETS kiv_shared EXPORT kivTargets
    LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT library NAMELINK_COMPONENT development
    INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(TARGETS kiv EXPORT kivTargets
    ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT development
    INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(FILES src/client/kiv.h DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} COMPONENT development)
configure_file(${packaging}/kiv.pc.in ${adapted}/kiv.pc @ONLY)
install_with_prefix(${adapted}/kiv.pc ${CMAKE_INSTALL_LIBDIR}/pkgconfig development)
install(EXPORT kivTargets NAMESPACE kiv:: DESTINATION ${cmake_dir} COMPONENT development)
write_basic_package_version_file(${adapted}/kivConfigVersion.cmake
    COMPATIBILITY SameMajorVersion)
install(FILES ${packaging}/kivConfig.cmake ${adapted}/kivConfigVersion.cmake
    DESTINATION ${cmake_dir} COMPONENT development)
install(FILES examples/machine_probe.c
    DESTINATION ${CMAKE_INSTALL_DATAROOTDIR}/doc/libkiv-dev/examples COMPONENT development)
