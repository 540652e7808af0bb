#include "fuzz/harness.h"

#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "daemon/modules.h"
#include "diag/diag_store.h"
#include "report/state_file.h"
#include "runtime/daemon_error.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr const char* directories[] = {paths::private_dir, paths::output_dir, paths::input_dir};

std::string& scratch_directory() {
    static std::string path;
    return path;
}

// Below TMPDIR. A process that crashes leaves its directory there.
void enter_scratch_directory() {
    scratch_directory() = std::filesystem::temp_directory_path() / "kivd-fuzz-XXXXXX";
    require(mkdtemp(scratch_directory().data()) != nullptr, "no scratch directory");
    std::filesystem::current_path(scratch_directory());
    for (const char* directory : directories) std::filesystem::create_directory(directory);
    (void)atexit([] {
        std::error_code error;
        std::filesystem::current_path("/", error);
        std::filesystem::remove_all(scratch_directory(), error);
    });
}

// Of the first hundred, in one call.
int count_open_descriptors() {
    std::array<pollfd, 100> waits = {};
    for (size_t i = 0; i < waits.size(); ++i) waits[i].fd = static_cast<int>(i);
    (void)poll(waits.data(), waits.size(), 0);
    return static_cast<int>(std::ranges::count_if(
        waits, [](const pollfd& wait) { return (wait.revents & POLLNVAL) == 0; }));
}

void clear_directory(const char* path) {
    const unique_dir directory(opendir(path));
    require(directory != nullptr, "a directory is gone");
    while (const dirent* const entry = readdir(directory.get())) {
        if (strcmp(entry->d_name, ".") == 0 || strcmp(entry->d_name, "..") == 0) continue;
        require(unlinkat(dirfd(directory.get()), entry->d_name, 0) == 0, "something is no file");
    }
}

}  // namespace

uint8_t take_choice(input_bytes& input) {
    if (input.empty()) return 0;
    const uint8_t choice = input.front();
    input = input.subspan(1);
    return choice;
}

void require(bool holds, const char* what_went_wrong) {
    if (holds) return;
    fprintf(stderr, "fuzz: %s\n", what_went_wrong);
    __builtin_trap();
}

void clear_files() {
    diag_set_active(0);  // a directory of its own
    for (const char* directory : directories) clear_directory(directory);
}

void write_file(const char* path, input_bytes bytes) {
    const unique_fd fd(open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666));
    require(write(fd.get(), bytes.data(), bytes.size()) == std::ssize(bytes), "a write failed");
}

std::string read_file(const char* path) {
    std::ostringstream bytes;
    bytes << std::ifstream(path, std::ios::binary).rdbuf();
    return bytes.str();
}

bool exists(const char* path) { return access(path, F_OK) == 0; }

void suppress_errors() {
    set_error_nr(INT_MAX);
    set_error_time(time(nullptr));
}

started_modules::started_modules() : open_descriptors_(count_open_descriptors()) {
    suppress_errors();
    start_modules();
    suppress_errors();  // whatever a state file says
    set_data_collection(true);
}

started_modules::~started_modules() {
    release_modules();
    require(count_open_descriptors() == open_descriptors_, "a descriptor stays open");
}

}  // namespace kivd

int LLVMFuzzerInitialize(int* /*argc*/, char*** /*argv*/) {
    kivd::enter_scratch_directory();
    return 0;
}
