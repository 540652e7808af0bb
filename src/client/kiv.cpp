// What kiv.h declares is all that the shared library shows. That is said here, so that the header
// has nothing of one compiler in it.
#pragma GCC visibility push(default)
#include "kiv.h"
#pragma GCC visibility pop

#include <poll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <initializer_list>
#include <limits>
#include <new>
#include <string_view>
#include <utility>

#include "conversation.h"
#include "handle.h"
#include "transport.h"

namespace {

using libkiv::access;
using libkiv::answers;
using libkiv::converse;
using libkiv::request;
using std::string_view;

constexpr char blanks[] = " \t\r\n";  // what the daemon splits a request at
constexpr string_view yes = "1";      // the answer to "IA", and to questions
constexpr string_view no = "0";
constexpr char producer_socket[] = "kiv_cl";
constexpr char control_socket[] = "kiv_co";
constexpr char diagnostics_files[] = "750";  // the set of files that they are for the daemon

static_assert(KIV_DEVICE_ID_MAX == libkiv::answer_size_max);

// A number in decimal, with zeros before it up to `digits_min` digits.
class decimal {
 public:
    explicit decimal(int32_t value, int digits_min = 1) {
        const int size = snprintf(text_, sizeof text_, "%0*d", digits_min, value);
        size_ = static_cast<size_t>(size);
    }
    [[nodiscard]] string_view view() const { return {text_, size_}; }

 private:
    char text_[16];
    size_t size_;
};

// Fills a new handle and connects it: 0 or a negative errno value.
int open_handle(kiv_handle& handle, const char* directory) {
    handle.producer_fd = -1;
    int result = libkiv::make_address(directory, producer_socket, handle.producer_address);
    if (result < 0) return result;
    result = libkiv::make_address(directory, control_socket, handle.control_address);
    if (result < 0) return result;
    handle.producer_fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (handle.producer_fd < 0) return -errno;
    return libkiv::connect_to(handle.producer_fd, handle.producer_address);
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
    if (packet.size() > libkiv::request_size_max) return -EMSGSIZE;
    int64_t deadline_ms = 0;  // set when there is something to wait for
    bool connected_anew = false;
    for (;;) {
        const int result = packet.send_to(handle.producer_fd);
        if (result == -EAGAIN) {
            const unsigned wait_ms = handle.wait_ms.load(std::memory_order_relaxed);
            if (deadline_ms == 0) deadline_ms = libkiv::now_ms() + wait_ms;
            if (wait_ms > 0 && libkiv::await(handle.producer_fd, POLLOUT, deadline_ms) == 0)
                continue;
            handle.dropped.fetch_add(1, std::memory_order_relaxed);
            return -EAGAIN;
        }
        if (!libkiv::is_peer_gone(result)) return result;
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
    const decimal text(static_cast<int32_t>(value));
    return produce(handle, {command, package, " ", name, " ", text.view()});
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

// converse() where -ENOENT is to say that the daemon has no such thing: that there is no daemon is
// -ECONNREFUSED alone.
int look_up(const kiv_handle& handle, access needed, const request& question, string_view refusal,
            answers& got) {
    const int result = converse(handle, needed, {&question}, refusal, got);
    return result == -ENOENT ? -ECONNREFUSED : result;
}

// Requests that are answered with a descriptor: that, or a negative errno value; -ENOENT when the
// daemon has none to give.
int fetch(const kiv_handle& handle, access needed, const request& question) {
    constexpr string_view no_descriptor = "FAIL";
    answers got;
    const int result = look_up(handle, needed, question, no_descriptor, got);
    if (result < 0) return result;
    if (got.last.view() == no_descriptor) return -ENOENT;
    if (got.last.view() != "OK" || got.last.attached.fd < 0) return -EPROTO;
    return std::exchange(got.last.attached.fd, -1);
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
    return control(*handle, access::privileged, {"RM ", decimal(number).view()});
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
    return fetch(*handle, access::open, {"GC ", package, " ", name});
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

int kiv_next_file(kiv_handle* handle, int32_t number) {
    constexpr string_view none = "-1";
    constexpr int digits_max = 10;  // written out, since the daemon's answer is no longer than that
    if (number < 0) return -EINVAL;
    const decimal text(number, digits_max);
    const request question{"FN ", diagnostics_files, " ", text.view()};
    answers got;
    const int result = look_up(*handle, access::privileged, question, none, got);
    if (result < 0) return result;
    const string_view answer = got.last.view();
    if (answer == none) return -ENOENT;
    const char* const end = answer.data() + answer.size();
    int32_t next = 0;
    const auto parsed = std::from_chars(answer.data(), end, next);
    const bool is_next = parsed.ec == std::errc() && parsed.ptr == end && next > number;
    return is_next ? next : -EPROTO;
}

int kiv_get_file(kiv_handle* handle, int32_t number) {
    if (number < 0) return -EINVAL;
    const decimal text(number);
    return fetch(*handle, access::privileged, {"FG ", diagnostics_files, " ", text.view()});
}
