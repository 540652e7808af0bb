# What kivctl shows of requests is a library, so that tests can call it.
add_library(kivctl_core STATIC watch_frames.cpp watch_line.cpp)
target_link_libraries(kivctl_core PUBLIC kiv_tool_text PRIVATE kiv_warnings)

add_executable(kivctl
    check_command.cpp daemon_process_facts.cpp daemon_questions.cpp daemon_state.cpp
    directory_faults.cpp json.cpp key_check.cpp kivctl.cpp kivctl_commands.cpp kivctl_files.cpp
    kivctl_io.cpp status_command.cpp watch_command.cpp
    ../util/file_io.cpp ../util/numbers.cpp ../util/text_scan.cpp ../util/unique_fd.cpp)
target_compile_definitions(kivctl PRIVATE KIV_DEFAULT_DIRECTORY="${KIV_DEFAULT_DIRECTORY}")
target_link_libraries(kivctl PRIVATE
    kivctl_core kiv kivd_proto OpenSSL::Crypto CLI11::CLI11 kiv_warnings)
