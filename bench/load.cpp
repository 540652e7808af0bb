#include "bench/load.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "bench/daemon_process.h"
#include "bench/measure.h"

namespace kivd::bench {

namespace {

constexpr char event_prefix[] = "EV com.example.app button_pressed ";
constexpr size_t package_size = sizeof "com.example.app" - 1;
constexpr size_t name_size = sizeof "button_pressed" - 1;
constexpr int64_t wait_limit_ns = 5'000'000'000;
constexpr useconds_t retry_interval_us = 100;

unique_fd connect_to(socket_kind kind, const std::string& directory) {
    unique_fd fd;
    const int64_t deadline = now_ns() + wait_limit_ns;
    while (!(fd = connect_client(kind, directory)).ok()) {
        if (now_ns() > deadline) give_up("nobody listens in %s", directory.c_str());
        (void)usleep(retry_interval_us);
    }
    return fd;
}

// The length of a varint of a value below 2^14.
size_t varint_size(size_t value) { return value < 0x80 ? 1 : 2; }

}  // namespace

unique_fd connect_producer(const std::string& directory) {
    return connect_to(socket_kind::datagram, directory);
}

void send_packet(int fd, std::string_view packet) {
    if (!send_text(fd, packet)) give_up("send: %s", strerror(errno));
}

void wait_until_taken(int fd) {
    if (!wait_taken(fd)) give_up("the receiver takes no packets");
}

unique_fd connect_control(const std::string& directory) {
    return connect_to(socket_kind::packets, directory);
}

void order(int fd, std::string_view request) { send_packet(fd, request); }

std::string ask(int fd, std::string_view request) {
    std::string answer = kivd::ask(fd, request);
    if (answer.empty()) give_up("no answer to %s", std::string(request).c_str());
    return answer;
}

std::string event_packet(size_t payload_size) {
    static constexpr std::string_view text = "screen=main;button=save;duration_ms=183;result=ok;";
    std::string packet = event_prefix;
    for (size_t i = 0; i < payload_size; ++i) packet += text[i % text.size()];
    return packet;
}

std::string increment_packet(unsigned number) {
    char packet[64];
    (void)snprintf(packet, sizeof packet, "CI com.example.app counter_%05u 1", number);
    return packet;
}

size_t event_payload_offset() { return sizeof event_prefix - 1; }

size_t event_head_size(size_t payload_size) {
    // Package and name with key and length, a timestamp of six bytes, the payload's length.
    const size_t head = 2 + package_size + 2 + name_size + 7 + 1 + varint_size(payload_size);
    return 1 + varint_size(head + payload_size) + head;
}

}  // namespace kivd::bench
