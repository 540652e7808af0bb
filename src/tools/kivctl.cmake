add_executable(kivctl kivctl.cpp kivctl_io.cpp ../util/unique_fd.cpp)
target_include_directories(kivctl PRIVATE ${PROJECT_SOURCE_DIR}/src)
target_compile_definitions(kivctl PRIVATE KIV_DEFAULT_DIRECTORY="${KIV_DEFAULT_DIRECTORY}")
target_link_libraries(kivctl PRIVATE kiv CLI11::CLI11 kiv_warnings)
