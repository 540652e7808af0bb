// Tests that need the one port of the debug interface.
#pragma once

#include <fcntl.h>
#include <netinet/in.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <unistd.h>

#include "daemon_test.h"

namespace kivd {

inline const sockaddr_in debug_port = {AF_INET, htons(2305), {htonl(INADDR_LOOPBACK)}, {}};
inline const auto* const debug_address = reinterpret_cast<const sockaddr*>(&debug_port);

// One test at a time has the port, whichever build it is of.
inline unique_fd lock_debug_port() {
    unique_fd lock(open("/tmp/kivd-port-2305.lock", O_RDWR | O_CREAT | O_CLOEXEC, 0666));
    EXPECT_EQ(flock(lock.get(), LOCK_EX), 0);
    return lock;
}

// An end of a connection that hung up before the other one keeps the port for a minute.
class debug_port_test : public daemon_test {
 protected:
    void SetUp() override {
        if (!wait_until([] { return listen_there().ok(); }, 70000)) {
            GTEST_SKIP() << "port 2305 is in use";
        }
    }

    // Not ok as long as the port is in use.
    static unique_fd listen_there() {
        unique_fd listener(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        if (bind(listener.get(), debug_address, sizeof debug_port) != 0) return unique_fd();
        EXPECT_EQ(listen(listener.get(), 5), 0);
        return listener;
    }
    // Its end leaves the port free at once.
    static unique_fd connect_debugger() {
        unique_fd fd(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const linger reset = {1, 0};
        EXPECT_EQ(setsockopt(fd.get(), SOL_SOCKET, SO_LINGER, &reset, sizeof reset), 0);
        EXPECT_EQ(connect(fd.get(), debug_address, sizeof debug_port), 0);
        return fd;
    }

 private:
    const unique_fd port_lock_ = lock_debug_port();
};

}  // namespace kivd
