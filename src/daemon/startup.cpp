#include "daemon/startup.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "daemon/debug/debug_interface.h"
#include "daemon/kernel/kernel_bridge.h"
#include "daemon/lock_file.h"
#include "daemon/loop/event_loop.h"
#include "daemon/loop/save_clock.h"
#include "daemon/modules.h"
#include "daemon/net/client_sockets.h"
#include "daemon/options.h"
#include "daemon/readiness.h"
#include "diag/diag_store.h"
#include "intake/config_request.h"
#include "intake/intake.h"
#include "intake/run_actions.h"
#include "platform/android_log.h"
#include "report/report_generation.h"
#include "report/state_file.h"
#include "runtime/child_process.h"
#include "runtime/give_up.h"
#include "runtime/stop.h"
#include "security/crypto_module.h"
#include "security/key_paths.h"
#include "store/counters.h"
#include "store/static_data.h"
#include "util/clock.h"
#include "util/file_io.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

// A data file that became descriptor 0, 1 or 2 would take whatever is printed there.
void open_standard_descriptors() {
    int fd = 0;
    do {
        fd = open("/dev/null", O_RDWR);  // NOLINT(android-cloexec-open): the standard ones stay
    } while (fd >= 0 && fd <= STDERR_FILENO);
    if (fd > STDERR_FILENO) (void)close(fd);
}

void detach() {
    const pid_t pid = fork();
    if (pid < 0 || (pid == 0 && setsid() < 0))
        give_up(tag, "Failed to detach: %s", strerror(errno));
    if (pid > 0) _exit(0);
    (void)close_range(0, ~0U, 0);
    log_to_system();
    if (open("/dev/null", O_RDWR) != 0 || dup(0) != 1 || dup(0) != 2) {  // NOLINT
        give_up(tag, "Failed to detach: %s", strerror(errno));
    }
}

struct signal_action {
    int number;
    void (*handler)(int);
    const char* name;
};
// Beside the two that stop the daemon: those that would end it and that something may send without
// meaning that. SIGALRM only interrupts a call that blocks.
const signal_action signal_actions[] = {
    {SIGINT, [](int) { request_stop(); }, "SIGINT"},
    {SIGTERM, [](int) { request_stop(); }, "SIGTERM"},
    {SIGCHLD, SIG_IGN, "SIGCHLD"},
    {SIGHUP, SIG_IGN, "SIGHUP"},
    {SIGPIPE, SIG_IGN, "SIGPIPE"},
    {SIGQUIT, SIG_IGN, "SIGQUIT"},
    {SIGUSR1, SIG_IGN, "SIGUSR1"},
    {SIGUSR2, SIG_IGN, "SIGUSR2"},
    {SIGIO, SIG_IGN, "SIGIO"},
    {SIGPROF, SIG_IGN, "SIGPROF"},
    {SIGVTALRM, SIG_IGN, "SIGVTALRM"},
    {SIGXCPU, SIG_IGN, "SIGXCPU"},
    {SIGXFSZ, SIG_IGN, "SIGXFSZ"},
    {SIGALRM, [](int) {}, "SIGALRM"},
};

void install_signal_handlers() {
    for (const signal_action& each : signal_actions) {
        struct sigaction action = {};
        action.sa_handler = each.handler;
        sigemptyset(&action.sa_mask);
        if (sigaction(each.number, &action, nullptr) == 0) continue;
        __android_log_print(ANDROID_LOG_ERROR, tag, "Failed to install %s handler: %s", each.name,
                            strerror(errno));
    }
    sigset_t none;  // whoever started us may have blocked some
    sigemptyset(&none);
    (void)sigprocmask(SIG_SETMASK, &none, nullptr);
}

void create_directory(const char* path, mode_t mode, const char* name) {
    if (mkdir(path, mode) == 0 || errno == EEXIST) return;
    give_up(tag, "Failed to create %s directory: %s", name, strerror(errno));
}

void create_directories() {
    umask(0);
    create_directory(paths::private_dir, 0700, "private");
    create_directory(paths::output_dir, 0755, "output");
    create_directory(paths::input_dir, 0755, "input");
    umask(022);
}

// When the marker says that the daemon is disabled, logs that and waits until a stop is requested.
void wait_while_disabled() {
    if (access(paths::disable_marker, F_OK) != 0) return;
    __android_log_print(ANDROID_LOG_ERROR, "kivd-util", "KIV will disable itself.");
    constexpr int day_ms = 86400 * 1000;
    while (!is_stop_requested()) wait_for_stop(day_ms);
}

// With a key there, a missing module is told at the start.
void load_crypto_for_keys() {
    if (is_sealing_on() || is_verification_on()) (void)get_crypto();
}

// Detaches, enters the working directory and makes sure to be the only daemon there.
void enter_working_directory(const options& given) {
    if (given.detach && getppid() != 1) {
        detach();
    } else {
        puts("Will not detach (or already detached)");
        fflush(stdout);
    }
    if (chdir(given.base_directory) != 0) {
        give_up(tag, "Could not chdir(%s), and errno is %s", given.base_directory, strerror(errno));
    }
    take_lock();
    raise_descriptor_limit();
    if (!stop_init()) give_up(tag, "Failed to create stop event: %s", strerror(errno));
}

void shut_down() {
    join_kernel_bridge();
    __android_log_print(ANDROID_LOG_INFO, tag, "Shutting down...");
    finish_datagrams();
    counters_save();
    static_data_save();
    state_save();
    wait_for_compactor();  // a restart must not meet a file half written
    diag_wait_for_compressor();
    // The lock file goes last: as soon as it is gone a new daemon may make sockets of its own.
    remove_client_sockets();
    debug_release();
    event_loop_release();
    (void)unlink(paths::lock_file);
    release_modules();
    __android_log_print(ANDROID_LOG_INFO, tag, "Exiting.");
}

}  // namespace

int run_daemon(int argc, char** argv) {
    open_standard_descriptors();
    set_default_key_paths();
    const options given = parse_options(argc, argv);
    install_signal_handlers();
    enter_working_directory(given);
    wait_while_disabled();

    __android_log_print(ANDROID_LOG_INFO, tag, "Starting up...");
    create_directories();
    load_crypto_for_keys();
    const bool has_filter = start_modules();
    write_config_request();
    if (!has_filter && !is_test_mode()) install_first_configuration();
    (void)take_new_configuration();

    if (!event_loop_init()) exit(1);
    create_client_sockets();
    if (given.debug_interface) {
        __android_log_print(ANDROID_LOG_INFO, tag, "kivddi (kivd debug interface) Enabled.");
        debug_start();
    }
    mark_saved();
    run_actions();
    if (!start_kernel_bridge()) give_up(tag, "Failed to create kivkb thread, bailing.\n");
    __android_log_print(ANDROID_LOG_INFO, tag, "Ready to serve the world.");
    tell_service_manager("READY=1");
    event_loop_run();
    tell_service_manager("STOPPING=1");

    shut_down();
    return 0;
}

}  // namespace kivd
