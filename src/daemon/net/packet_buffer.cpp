#include "daemon/net/packet_buffer.h"

#include <sys/mman.h>

namespace kivd {
namespace {

constinit packet_buffers* buffers = nullptr;

}  // namespace

bool packet_buffers_init() {
    void* const mapping = mmap(nullptr, sizeof(packet_buffers), PROT_READ | PROT_WRITE,
                               MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (mapping == MAP_FAILED) return false;
    (void)madvise(mapping, sizeof(packet_buffers), MADV_DONTFORK);
    buffers = static_cast<packet_buffers*>(mapping);
    return true;
}

packet_buffers& get_packet_buffers() { return *buffers; }

void packet_buffers_release() {
    if (buffers != nullptr) (void)munmap(buffers, sizeof(packet_buffers));
    buffers = nullptr;
}

}  // namespace kivd
