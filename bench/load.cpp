#include "bench/load.h"

#include <linux/sockios.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "bench/measure.h"

namespace kivd::bench {

namespace {

constexpr char event_prefix[] = "EV com.example.app button_pressed ";
constexpr size_t package_size = sizeof "com.example.app" - 1;
constexpr size_t name_size = sizeof "button_pressed" - 1;
constexpr int64_t wait_limit_ns = 5'000'000'000;
constexpr useconds_t retry_interval_us = 100;

unique_fd connect_to(int type, const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path) give_up("%s: path too long", path.c_str());
    memcpy(address.sun_path, path.data(), path.size());
    unique_fd fd(socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
    const timeval limit{.tv_sec = wait_limit_ns / 1'000'000'000, .tv_usec = 0};
    (void)setsockopt(fd.get(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
    (void)setsockopt(fd.get(), SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
    const int64_t deadline = now_ns() + wait_limit_ns;
    while (connect(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == -1) {
        if (now_ns() > deadline) give_up("connect %s: %s", path.c_str(), strerror(errno));
        (void)usleep(retry_interval_us);
    }
    return fd;
}

// The length of a varint of a value below 2^14.
size_t varint_size(size_t value) { return value < 0x80 ? 1 : 2; }

}  // namespace

unique_fd connect_producer(const std::string& directory) {
    return connect_to(SOCK_DGRAM, directory + "/kiv_cl");
}

void send_packet(int fd, std::string_view packet) {
    if (send(fd, packet.data(), packet.size(), MSG_NOSIGNAL) == -1)
        give_up("send: %s", strerror(errno));
}

void wait_until_taken(int fd) {
    const int64_t deadline = now_ns() + wait_limit_ns;
    int unread = 0;
    while (ioctl(fd, SIOCOUTQ, &unread) == 0 && unread > 0) {
        if (now_ns() > deadline) give_up("the receiver takes no packets");
        (void)usleep(10);
    }
}

unique_fd connect_control(const std::string& directory) {
    return connect_to(SOCK_SEQPACKET, directory + "/kiv_co");
}

void order(int fd, std::string_view request) { send_packet(fd, request); }

std::string ask(int fd, std::string_view request) {
    send_packet(fd, request);
    char answer[1024];
    const ssize_t size = recv(fd, answer, sizeof answer, 0);
    if (size <= 0) give_up("no answer to %.*s", static_cast<int>(request.size()), request.data());
    return {answer, static_cast<size_t>(size)};
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
