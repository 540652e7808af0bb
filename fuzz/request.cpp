// Requests, of which one input may hold several: a letter that says who sends them, then packets
// with a line "--" between them.
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <memory>

#include "config/config_parts.h"
#include "daemon/net/packet_buffer.h"
#include "daemon/request/handle_request.h"
#include "fuzz/harness.h"
#include "record/record_file.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr std::string_view separator = "\n--\n";
constexpr uint8_t some_part[] = {'p', 'a', 'r', 't'};

// The control message with its sender's credentials that every datagram comes with.
class datagram_message {
 public:
    explicit datagram_message(uid_t uid) {
        message_.msg_control = control_;
        message_.msg_controllen = sizeof control_;
        cmsghdr& header = *CMSG_FIRSTHDR(&message_);
        header.cmsg_level = SOL_SOCKET;
        header.cmsg_type = SCM_CREDENTIALS;
        header.cmsg_len = CMSG_LEN(sizeof(ucred));
        const ucred sender = {getpid(), uid, 0};
        memcpy(CMSG_DATA(&header), &sender, sizeof sender);
    }
    [[nodiscard]] const msghdr* get() const { return &message_; }

 private:
    alignas(cmsghdr) char control_[CMSG_SPACE(sizeof(ucred))] = {};
    msghdr message_ = {};
};

// In a block of just the size that handle_request asks for, so that a sanitizer sees any byte used
// behind it.
std::string ask(int fd, std::string_view packet, const msghdr* message) {
    const auto block = std::make_unique<char[]>(packet.size() + 1 + max_reply_size);
    packet.copy(block.get(), packet.size());
    const size_t size = handle_request({fd, getuid(), message}, {block.get(), packet.size()}).size;
    require(size <= max_reply_size, "a reply is too long");
    return {block.get(), size};
}

struct client {
    unique_fd daemon_side;  // -1 for datagrams
    unique_fd own_side;

    void discard_received() const {
        char text[64];
        while (own_side.ok() && recv(own_side.get(), text, sizeof text, MSG_DONTWAIT) > 0) {
        }
    }
};

client connect_client() {
    int fds[2];
    require(socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, fds) == 0, "no socket pair");
    return {unique_fd(fds[0]), unique_fd(fds[1])};
}

void send_packets(std::string_view packets, const client& from, const msghdr* message) {
    for (;;) {
        const size_t end = packets.find(separator);
        (void)ask(from.daemon_side.get(), packets.substr(0, end), message);
        from.discard_received();
        if (end == std::string_view::npos) return;
        packets.remove_prefix(end + separator.size());
    }
}

// The event file consists of whole records at any time.
void check_event_file() {
    if (!exists(paths::events)) return;
    const std::string events = read_file(paths::events);
    rescue_event_file(paths::events, record_header::expected);
    require(read_file(paths::events) == events, "a record of the event file is broken");
}

}  // namespace
}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using namespace kivd;
    input_bytes input = {data, size};
    const uint8_t sender = take_choice(input);
    const bool connected = sender == 'c';                     // by the daemon's own user
    const bool stranger = sender == 's';                      // by datagrams of another
    if (!connected && !stranger && sender != 'd') return -1;  // by those of the same user

    clear_files();
    const started_modules modules;
    store_config_part("shop", "prices", some_part);
    const client from = connected ? connect_client() : client{unique_fd(), unique_fd()};
    const datagram_message message(stranger ? getuid() + 1 : getuid());
    send_packets({reinterpret_cast<const char*>(input.data()), input.size()}, from,
                 connected ? nullptr : message.get());
    check_event_file();
    require(ask(-1, "IA", message.get()) == "1", "the daemon is not alive");
    return 0;
}
