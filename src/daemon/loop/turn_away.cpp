#include "daemon/loop/turn_away.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <utility>

#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr useconds_t accept_pause_us = 10000;

constinit int placeholder = -1;

}  // namespace

void turn_away_init() { placeholder = open("/dev/null", O_RDONLY | O_CLOEXEC); }

void turn_away_release() {
    if (placeholder >= 0) (void)close(std::exchange(placeholder, -1));
}

void turn_away_client(int listening_fd) {
    turn_away_release();
    const unique_fd refused(accept4(listening_fd, nullptr, nullptr, SOCK_CLOEXEC));
    if (!refused.ok()) usleep(accept_pause_us);
    turn_away_init();
}

}  // namespace kivd
