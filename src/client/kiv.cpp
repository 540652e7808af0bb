#include "kiv.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/uio.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <charconv>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <initializer_list>
#include <limits>
#include <new>
#include <string_view>
#include <utility>

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

namespace {

using std::string_view;

constexpr size_t request_size_max = 31176;
constexpr char blanks[] = " \t\r\n";  // what the daemon splits a request at
constexpr string_view yes = "1";      // the answer to "IA", and to questions
constexpr string_view no = "0";
constexpr char producer_socket[] = "kiv_cl";
constexpr char control_socket[] = "kiv_co";

enum class access { open, privileged };

// One message, gathered where its at most six pieces lie. The casts are for sendmsg, which asks for
// more than it needs: it only reads.
class request {
 public:
    request(std::initializer_list<string_view> pieces) {
        for (const string_view piece : pieces) {
            parts_[count_++] = {const_cast<char*>(piece.data()), piece.size()};
            size_ += piece.size();
        }
    }

    [[nodiscard]] size_t size() const { return size_; }

    // 0, or a negative errno value; never waits.
    [[nodiscard]] int send_to(int fd) const {
        msghdr message{};
        message.msg_iov = const_cast<iovec*>(parts_);
        message.msg_iovlen = count_;
        while (sendmsg(fd, &message, MSG_DONTWAIT | MSG_NOSIGNAL) < 0) {
            if (errno != EINTR) return -errno;
        }
        return 0;
    }

 private:
    iovec parts_[6];
    size_t count_ = 0;
    size_t size_ = 0;
};

// Owns a descriptor, or none.
struct owned_fd {
    explicit owned_fd(int new_fd = -1) : fd(new_fd) {}
    owned_fd(const owned_fd&) = delete;
    owned_fd& operator=(const owned_fd&) = delete;
    ~owned_fd() {
        if (fd >= 0) close(fd);
    }

    int fd;
};

struct reply {
    char text[KIV_DEVICE_ID_MAX];  // the longest there is
    size_t size = 0;
    owned_fd attached;

    [[nodiscard]] string_view view() const { return {text, size}; }
};

int64_t now_ms() {
    timespec now;
    clock_gettime(CLOCK_MONOTONIC, &now);
    return int64_t{now.tv_sec} * 1000 + now.tv_nsec / 1'000'000;
}

// 0 once one of `events` or an error is there, -ETIMEDOUT, or another negative errno value.
int await(int fd, short events, int64_t deadline_ms) {
    for (;;) {
        const int64_t left_ms = deadline_ms - now_ms();
        if (left_ms <= 0) return -ETIMEDOUT;
        pollfd entry = {fd, events, 0};
        const int ready = poll(&entry, 1, static_cast<int>(std::min<int64_t>(left_ms, INT_MAX)));
        if (ready > 0) return 0;
        if (ready < 0 && errno != EINTR) return -errno;
    }
}

bool is_peer_gone(int error) {
    // a send that meets a dead daemon also cuts the connection, and the next sender finds it cut
    return error == -ECONNREFUSED || error == -ENOTCONN || error == -ECONNRESET || error == -EPIPE;
}

// 0, -ENAMETOOLONG or -EINVAL.
int make_address(const char* directory, const char* name, sockaddr_un& address) {
    address = {};
    address.sun_family = AF_UNIX;
    const size_t directory_size = strnlen(directory, sizeof address.sun_path);
    if (directory_size == 0) return -EINVAL;
    const size_t slash_size = directory[directory_size - 1] == '/' ? 0 : 1;
    const size_t name_size = strlen(name) + 1;  // with its NUL
    if (directory_size + slash_size + name_size > sizeof address.sun_path) return -ENAMETOOLONG;
    memcpy(address.sun_path, directory, directory_size);
    memcpy(address.sun_path + directory_size, "/", slash_size);
    memcpy(address.sun_path + directory_size + slash_size, name, name_size);
    return 0;
}

// 0 or a negative errno value.
int connect_to(int fd, const sockaddr_un& address) {
    const auto* generic = reinterpret_cast<const sockaddr*>(&address);
    return connect(fd, generic, sizeof address) == 0 ? 0 : -errno;
}

// Fills a new handle and connects it: 0 or a negative errno value.
int open_handle(kiv_handle& handle, const char* directory) {
    handle.producer_fd = -1;
    int result = make_address(directory, producer_socket, handle.producer_address);
    if (result == 0) result = make_address(directory, control_socket, handle.control_address);
    if (result < 0) return result;
    handle.producer_fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (handle.producer_fd < 0) return -errno;
    return connect_to(handle.producer_fd, handle.producer_address);
}

// Turns the producing socket to the daemon that is there now. The bare system call: other threads
// may send on the socket meanwhile, and thread sanitizers take connect() and that for a race.
int connect_anew(const kiv_handle& handle) {
    const sockaddr_un& address = handle.producer_address;
    return syscall(SYS_connect, handle.producer_fd, &address, sizeof address) == 0 ? 0 : -errno;
}

// Whether `text` can travel as one word.
bool is_word(const char* text) {
    return text != nullptr && *text != '\0' && text[strcspn(text, blanks)] == '\0';
}

// 0, -EINVAL or -EMSGSIZE.
int check_probe_id(const char* package, const char* name) {
    if (!is_word(package) || !is_word(name)) return -EINVAL;
    return strlen(package) + strlen(name) > KIV_PROBE_ID_MAX ? -EMSGSIZE : 0;
}

// Puts a request into the daemon's queue, as the producing calls promise.
int produce(kiv_handle& handle, const request& packet) {
    if (packet.size() > request_size_max) return -EMSGSIZE;
    int64_t deadline_ms = 0;  // set when there is something to wait for
    bool connected_anew = false;
    for (;;) {
        const int result = packet.send_to(handle.producer_fd);
        if (result == -EAGAIN) {
            const unsigned wait_ms = handle.wait_ms.load(std::memory_order_relaxed);
            if (deadline_ms == 0) deadline_ms = now_ms() + wait_ms;
            if (wait_ms > 0 && await(handle.producer_fd, POLLOUT, deadline_ms) == 0) continue;
            handle.dropped.fetch_add(1, std::memory_order_relaxed);
            return -EAGAIN;
        }
        if (!is_peer_gone(result)) return result;
        if (connected_anew) return -ECONNREFUSED;
        connected_anew = true;
        const int connected = connect_anew(handle);
        if (connected < 0) return connected;
    }
}

int produce_counter(kiv_handle& handle, string_view command, const char* package, const char* name,
                    int64_t value) {
    const int id_result = check_probe_id(package, name);
    if (id_result < 0) return id_result;
    using range = std::numeric_limits<int32_t>;
    if (value < range::min() || value > range::max()) return -ERANGE;
    char digits[16];
    const auto written = std::to_chars(digits, digits + sizeof digits, value);
    const string_view text(digits, static_cast<size_t>(written.ptr - digits));
    return produce(handle, {command, package, " ", name, " ", text});
}

// A descriptor, or a negative errno value.
int connect_control(const kiv_handle& handle, int64_t deadline_ms) {
    const int fd = socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
    if (fd < 0) return -errno;
    int result;
    do {
        // bounds the wait for a place in the daemon's backlog; zero would mean for ever
        const int64_t left_ms = std::max<int64_t>(deadline_ms - now_ms(), 1);
        const timeval limit = {static_cast<time_t>(left_ms / 1000),
                               static_cast<suseconds_t>(left_ms % 1000 * 1000)};
        (void)setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
        result = connect_to(fd, handle.control_address);
    } while (result == -EINTR);
    if (result == 0) return fd;
    close(fd);
    return result == -EAGAIN ? -ETIMEDOUT : result;
}

// 0 or a negative errno value.
int send_before(int fd, const request& packet, int64_t deadline_ms) {
    if (packet.size() > request_size_max) return -EMSGSIZE;
    for (;;) {
        int result = packet.send_to(fd);
        if (result == -EAGAIN) {
            result = await(fd, POLLOUT, deadline_ms);
            if (result == 0) continue;
        }
        return is_peer_gone(result) ? -ECONNRESET : result;
    }
}

// The descriptor that came with a message for whose control part there was room for one; or -1.
int find_attached(msghdr& message) {
    const cmsghdr* header = CMSG_FIRSTHDR(&message);
    if (header == nullptr || header->cmsg_level != SOL_SOCKET || header->cmsg_type != SCM_RIGHTS ||
        header->cmsg_len != CMSG_LEN(sizeof(int))) {
        return -1;
    }
    int fd;
    memcpy(&fd, CMSG_DATA(header), sizeof fd);
    return fd;
}

// 1 when there was a reply, 0 when the daemon has closed the connection, or a negative errno value.
int receive_before(int fd, reply& answer, int64_t deadline_ms) {
    for (;;) {
        const int result = await(fd, POLLIN, deadline_ms);
        if (result < 0) return result;
        iovec text = {answer.text, sizeof answer.text};
        alignas(cmsghdr) char control_part[CMSG_SPACE(sizeof(int))];
        msghdr message{};
        message.msg_iov = &text;
        message.msg_iovlen = 1;
        message.msg_control = control_part;
        message.msg_controllen = CMSG_LEN(sizeof(int));  // its padding would let a second one in
        const ssize_t size = recvmsg(fd, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
        if (size < 0 && (errno == EINTR || errno == EAGAIN)) continue;
        if (size < 0) return -errno;
        answer.attached.fd = find_attached(message);
        if (size == 0) return 0;
        answer.size = static_cast<size_t>(size);
        if ((message.msg_flags & MSG_TRUNC) != 0) return -EPROTO;
        if ((message.msg_flags & MSG_CTRUNC) == 0) return 1;
        // the kernel drops the descriptors that don't fit, and all of them when we have too many
        return answer.attached.fd >= 0 ? -EPROTO : -EMFILE;
    }
}

// What comes back from the daemon.
struct answers {
    reply device_id;  // of privileged requests
    reply last;
};

// Has the daemon carry out `requests` (null for none) and waits until it has. The last one is
// answered whoever asks, with `refusal` when the caller has no permission. "GD" goes before
// privileged requests and tells how the daemon sees the caller: answered with the device id, or not
// answered. A device id might look like a refusal, so a single answer only counts as one when
// nothing follows it; the daemon closes its end once it has read everything from a caller that will
// send no more.
int converse(const kiv_handle& handle, access needed,
             std::initializer_list<const request*> requests, string_view refusal, answers& got) {
    const int64_t deadline_ms = now_ms() + handle.timeout_ms.load(std::memory_order_relaxed);
    const owned_fd daemon(connect_control(handle, deadline_ms));
    if (daemon.fd < 0) return daemon.fd;

    int result = 0;
    if (needed == access::privileged) result = send_before(daemon.fd, {"GD"}, deadline_ms);
    for (const request* packet : requests) {
        if (result == 0 && packet) result = send_before(daemon.fd, *packet, deadline_ms);
    }
    if (result < 0) return result;
    (void)shutdown(daemon.fd, SHUT_WR);

    if (needed == access::privileged) {
        result = receive_before(daemon.fd, got.device_id, deadline_ms);
        if (result <= 0) return result < 0 ? result : -ECONNRESET;
    }
    result = receive_before(daemon.fd, got.last, deadline_ms);
    if (result != 0) return std::min(result, 0);
    const bool is_refused = needed == access::privileged && got.device_id.view() == refusal;
    return is_refused ? -EPERM : -ECONNRESET;
}

// Requests without an answer: "IA" follows, whose answer says that what came before is handled.
int control(const kiv_handle& handle, access needed, const request* command,
            char* device_id = nullptr) {
    const request is_alive{"IA"};
    answers got;
    const int result = converse(handle, needed, {command, &is_alive}, yes, got);
    if (result < 0) return result;
    if (got.last.view() != yes) return -EPROTO;
    if (device_id != nullptr) {
        memcpy(device_id, got.device_id.text, got.device_id.size);
        device_id[got.device_id.size] = '\0';
    }
    return 0;
}

int control(const kiv_handle& handle, access needed, const request& command) {
    return control(handle, needed, &command);
}

// Requests of which the last is answered with yes or no: 1, 0, or a negative errno value.
int ask(const kiv_handle& handle, access needed, std::initializer_list<const request*> requests) {
    answers got;
    const int result = converse(handle, needed, requests, no, got);
    if (result < 0) return result;
    if (got.last.view() == yes) return 1;
    return got.last.view() == no ? 0 : -EPROTO;
}

}  // namespace

kiv_handle* kiv_create_from_path(const char* directory) {
    if (directory == nullptr) {
        errno = EINVAL;
        return nullptr;
    }
    // malloc: producers in C link this library without the C++ one
    void* memory = malloc(sizeof(kiv_handle));
    if (memory == nullptr) return nullptr;
    auto* handle = new (memory) kiv_handle;
    const int result = open_handle(*handle, directory);
    if (result == 0) return handle;
    kiv_destroy(handle);
    errno = -result;
    return nullptr;
}

kiv_handle* kiv_create(void) { return kiv_create_from_path(KIV_DEFAULT_DIRECTORY); }

void kiv_destroy(kiv_handle* handle) {
    if (handle == nullptr) return;
    if (handle->producer_fd >= 0) close(handle->producer_fd);
    handle->~kiv_handle();
    free(handle);
}

void kiv_set_wait(kiv_handle* handle, unsigned milliseconds) {
    handle->wait_ms.store(milliseconds, std::memory_order_relaxed);
}

void kiv_set_timeout(kiv_handle* handle, unsigned milliseconds) {
    handle->timeout_ms.store(milliseconds, std::memory_order_relaxed);
}

uint64_t kiv_dropped(const kiv_handle* handle) {
    return handle->dropped.load(std::memory_order_relaxed);
}

int kiv_add_event(kiv_handle* handle, const char* package, const char* name, const void* payload,
                  size_t payload_size) {
    const int id_result = check_probe_id(package, name);
    if (id_result < 0) return id_result;
    if (payload == nullptr && payload_size > 0) return -EINVAL;
    if (payload_size > KIV_PAYLOAD_MAX) return -EMSGSIZE;
    const string_view bytes(static_cast<const char*>(payload), payload_size);
    return produce(*handle, {"EV ", package, " ", name, " ", bytes});
}

int kiv_set_counter(kiv_handle* handle, const char* package, const char* name, int64_t value) {
    return produce_counter(*handle, "CS ", package, name, value);
}

int kiv_inc_counter(kiv_handle* handle, const char* package, const char* name, int64_t amount) {
    return produce_counter(*handle, "CI ", package, name, amount);
}

int kiv_set_static_data(kiv_handle* handle, const char* package, const char* name,
                        const char* value) {
    const int id_result = check_probe_id(package, name);
    if (id_result < 0) return id_result;
    if (value == nullptr || *value == '\0') return -EINVAL;
    return produce(*handle, {"SD ", package, " ", name, " ", value});
}

int kiv_is_alive(kiv_handle* handle) { return control(*handle, access::open, nullptr); }

int kiv_get_device_id(kiv_handle* handle, char* device_id) {
    return control(*handle, access::privileged, nullptr, device_id);
}

int kiv_flush(kiv_handle* handle) { return control(*handle, access::privileged, {"FL"}); }

int kiv_save(kiv_handle* handle) { return control(*handle, access::privileged, {"FS"}); }

int kiv_set_data_collection(kiv_handle* handle, int on) {
    return control(*handle, access::privileged, {"DC ", on != 0 ? "1" : "0"});
}

int kiv_remove_reports(kiv_handle* handle, int32_t number) {
    if (number < 0) return -EINVAL;
    char digits[16];
    const auto written = std::to_chars(digits, digits + sizeof digits, number);
    const string_view text(digits, static_cast<size_t>(written.ptr - digits));
    return control(*handle, access::privileged, {"RM ", text});
}

int kiv_set_group_id(kiv_handle* handle, const char* id) {
    if (!is_word(id)) return -EINVAL;
    return control(*handle, access::open, {"SG ", id});
}

int kiv_delete_group_id(kiv_handle* handle, const char* id) {
    if (!is_word(id)) return -EINVAL;
    return control(*handle, access::open, {"DG ", id});
}

int kiv_replace_group_id(kiv_handle* handle, const char* new_id, const char* old_id) {
    if (!is_word(new_id) || !is_word(old_id)) return -EINVAL;
    return control(*handle, access::open, {"RG ", new_id, " ", old_id});
}

int kiv_is_probe_active(kiv_handle* handle, const char* package, const char* name) {
    const int id_result = check_probe_id(package, name);
    if (id_result < 0) return id_result;
    const request question{"PA ", package, " ", name};
    return ask(*handle, access::open, {&question});
}

int kiv_get_config(kiv_handle* handle, const char* package, const char* name) {
    const int id_result = check_probe_id(package, name);
    if (id_result < 0) return id_result;
    const request question{"GC ", package, " ", name};
    answers got;
    const int result = converse(*handle, access::open, {&question}, "", got);
    if (result < 0) return result == -ENOENT ? -ECONNREFUSED : result;
    if (got.last.view() == "FAIL") return -ENOENT;
    if (got.last.view() != "OK" || got.last.attached.fd < 0) return -EPROTO;
    return std::exchange(got.last.attached.fd, -1);
}

int kiv_install_config(kiv_handle* handle, const void* bytes, size_t size) {
    if (bytes == nullptr || size == 0) return -EINVAL;
    if (size > KIV_CONFIG_MAX) return -EMSGSIZE;
    const request config{"WC ", string_view(static_cast<const char*>(bytes), size)};
    const request announcement{"NC"};
    return ask(*handle, access::privileged, {&config, &announcement});
}

int kiv_announce_config(kiv_handle* handle) {
    const request announcement{"NC"};
    return ask(*handle, access::privileged, {&announcement});
}
