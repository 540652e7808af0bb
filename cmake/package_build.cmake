# Read by CPack before it packages. What is packaged works in /var/lib/kivd/: a build for another
# directory is left as it is, and the packages are made of one for that.
if(NOT CPACK_KIV_DEFAULT_DIRECTORY STREQUAL "/var/lib/kivd/")
    get_filename_component(source ${CMAKE_CURRENT_LIST_DIR} DIRECTORY)
    message(STATUS "Building for the packages in build/package")
    foreach(step IN ITEMS "--preset;package" "--build;--preset;package")
        execute_process(COMMAND ${CMAKE_COMMAND} ${step} WORKING_DIRECTORY ${source}
            OUTPUT_QUIET COMMAND_ERROR_IS_FATAL ANY)
    endforeach()
    set(CPACK_INSTALL_CMAKE_PROJECTS ${source}/build/package kivd ALL /)
endif()
