#include "daemon/net/packet_buffer.h"

#include "util/parent_memory.h"

namespace kivd {
namespace {

constinit parent_memory<packet_buffers> buffers;

}  // namespace

bool packet_buffers_init() {
    buffers = map_parent_memory<packet_buffers>();
    return buffers != nullptr;
}

packet_buffers& get_packet_buffers() { return *buffers; }

void packet_buffers_release() { buffers.reset(); }

}  // namespace kivd
