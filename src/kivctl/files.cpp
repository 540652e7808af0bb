#include "kivctl/files.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstring>

#include "kivctl/io.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

// The daemon counts from its lowest number to its highest, gaps included.
constexpr int missing_files_max = 1000;

void print_file(int32_t number, int fd) {
    struct stat status {};
    if (fstat(fd, &status) != 0) {
        throw failure(std::string("cannot tell the size of a file: ") + strerror(errno));
    }
    print_line((std::to_string(number) + "  " + std::to_string(status.st_size) + " bytes").c_str());
}

}  // namespace

int list_files(kiv_handle* daemon, unsigned timeout_ms) {
    const deadline end(timeout_ms);
    int missing = 0;
    int number = 0;
    while ((number = kiv_next_file(daemon, number)) >= 0) {
        kiv_set_timeout(daemon, end.left_ms());
        const unique_fd file(kiv_get_file(daemon, number));
        kiv_set_timeout(daemon, end.left_ms());
        if (file.ok()) {
            missing = 0;
            print_file(number, file.get());
        } else if (file.get() != -ENOENT) {
            return file.get();
        } else if (++missing == missing_files_max) {
            throw failure("gave up at number " + std::to_string(number) + ": none of the last " +
                          std::to_string(missing) + " files is there");
        }
    }
    return number == -ENOENT ? status_done : number;
}

int get_file(kiv_handle* daemon, int32_t number, const std::string& path) {
    const unique_fd file(kiv_get_file(daemon, number));
    if (file.get() == -ENOENT) {
        throw failure("there is no diagnostics file " + std::to_string(number));
    }
    if (!file.ok()) return file.get();
    if (path.empty()) {
        print_content(file.get());
    } else {
        save_content(file.get(), path);
    }
    return status_done;
}

}  // namespace kivd
