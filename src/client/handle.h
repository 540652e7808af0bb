// What stands behind the handle of kiv.h.
#pragma once

#include <sys/un.h>

#include <atomic>
#include <cstdint>

// The handle holds no lock, so that a fork at any moment leaves the child one it can use. The
// producing socket is made once; connecting it again turns it to a new daemon in one step of the
// kernel's, under the feet of whichever thread or forked process sends on it.
struct kiv_handle {
    int producer_fd;
    sockaddr_un producer_address;
    sockaddr_un control_address;
    std::atomic<unsigned> wait_ms{0};
    std::atomic<unsigned> timeout_ms{2000};
    std::atomic<uint64_t> dropped{0};
};
