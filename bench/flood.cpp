#include "bench/flood.h"

#include <linux/sockios.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <numeric>
#include <thread>
#include <utility>

#include "bench/traffic.h"

namespace kivd {
namespace {

constexpr size_t batch_size = 4;
constexpr unsigned patience_ms = 60000;

int call_library(kiv_handle* kiv, const message& next) {
    const char* const package = next.package.c_str();
    const char* const name = next.name.c_str();
    const std::string& value = next.value;
    if (next.kind == "EV") return kiv_add_event(kiv, package, name, value.data(), value.size());
    if (next.kind == "CI") return kiv_inc_counter(kiv, package, name, std::stoi(value));
    if (next.kind == "CS") return kiv_set_counter(kiv, package, name, std::stoi(value));
    if (next.kind == "SD") return kiv_set_static_data(kiv, package, name, value.c_str());
    return kiv_is_alive(kiv);
}

bool is_read(int fd) {
    int unread = 0;
    return ioctl(fd, SIOCOUTQ, &unread) == 0 && unread == 0;
}

}  // namespace

flood::flood(std::string directory, size_t connections, size_t producers)
    : directory_(std::move(directory)),
      connections_(connections),
      producers_(producers),
      counts_(connections + producers) {
    connect();
}

void flood::connect() {
    has_failed_ = false;
    barrier_ = connect_client(socket_kind::packets, directory_);
    for (size_t i = 0; i < connections_.size(); ++i) {
        const bool is_stream = i % 2 == 1;
        const socket_kind kind = is_stream ? socket_kind::stream : socket_kind::packets;
        connections_[i] = {connect_client(kind, directory_), is_stream};
    }
    for (size_t i = 0; i < producers_.size(); ++i) {
        producers_[i].reset(kiv_create_from_path(directory_.c_str()));
        if (producers_[i] == nullptr) has_failed_ = true;
        if (producers_[i] == nullptr) continue;
        kiv_set_timeout(producers_[i].get(), patience_ms);
        if (i % 2 == 0) kiv_set_wait(producers_[i].get(), patience_ms);
    }
}

bool flood::send(const std::function<bool()>& is_enough) {
    {
        const std::jthread producing([this](const std::stop_token& stop) { produce(stop); });
        while (!has_failed_ && !is_enough()) {
            if (!send_round()) has_failed_ = true;
        }
    }
    return !has_failed_ && wait_done();
}

std::vector<uint64_t> flood::counts() const { return {counts_.begin(), counts_.end()}; }

uint64_t flood::total() const {
    return std::accumulate(counts_.begin(), counts_.end(), uint64_t{0});
}

uint64_t flood::acknowledged(size_t client) const {
    return client < connections_.size() ? connections_[client].acknowledged : 0;
}

bool flood::receive_answers(connection& client) {
    if (client.awaited == 0) return true;
    std::array<char, 64> answers;
    const ssize_t n = recv(client.fd.get(), answers.data(), answers.size(), MSG_DONTWAIT);
    if (n < 0) return errno == EAGAIN;
    if (n == 0 || std::cmp_greater(n, client.awaited)) return false;
    client.awaited -= static_cast<size_t>(n);
    if (client.awaited == 0) client.acknowledged = client.asked;
    return std::all_of(answers.begin(), answers.begin() + n, [](char c) { return c == '1'; });
}

bool flood::send_round() {
    for (connection& each : connections_) {
        if (!receive_answers(each)) return false;
        each.is_ready = each.awaited == 0 && is_read(each.fd.get());
    }
    // The read that has emptied a stream may be going on, and would take what comes now as part of
    // the same packet. An answer to somebody else says that it has ended.
    if (ask(barrier_.get(), "IA") != "1") return false;
    for (size_t i = 0; i < connections_.size(); ++i) {
        if (connections_[i].is_ready && !send_batch(i)) return false;
    }
    return true;
}

bool flood::send_batch(size_t number) {
    connection& client = connections_[number];
    std::atomic<uint64_t>& count = counts_[number];
    const unsigned size = client.is_stream ? 1 : batch_size;
    std::array<std::string, batch_size> packets;
    std::array<iovec, batch_size> pieces;
    std::array<mmsghdr, batch_size> headers = {};
    for (unsigned i = 0; i < size; ++i) {
        packets[i] = request_of(make_message({number, count + i}));
        if (client.is_stream) packets[i] = framed(packets[i]);
        pieces[i] = {packets[i].data(), packets[i].size()};
        headers[i].msg_hdr.msg_iov = &pieces[i];
        headers[i].msg_hdr.msg_iovlen = 1;
    }
    const int sent = sendmmsg(client.fd.get(), headers.data(), size, MSG_DONTWAIT | MSG_NOSIGNAL);
    for (int i = 0; i < sent; ++i) {
        const auto at = static_cast<size_t>(i);
        if (headers[at].msg_len != packets[at].size()) return false;
        if (kind_of({number, count++}) != "IA") continue;
        ++client.awaited;
        client.asked = count;
    }
    return sent > 0;
}

bool flood::wait_done() {
    const unique_fd last = connect_client(socket_kind::datagram, directory_);  // behind producers'
    if (!send_text(last.get(), "IA") || !wait_taken(last.get())) return false;
    for (connection& each : connections_) {
        bool is_well = true;
        const bool is_done = wait_until([&] {
            is_well = receive_answers(each);
            return !is_well || (each.awaited == 0 && is_read(each.fd.get()));
        });
        if (!is_well || !is_done) return false;
    }
    return ask(barrier_.get(), "IA") == "1";
}

void flood::produce(const std::stop_token& stop) {
    while (!stop.stop_requested() && !has_failed_) {
        for (size_t i = 0; i < producers_.size(); ++i) {
            const size_t number = connections_.size() + i;
            std::atomic<uint64_t>& count = counts_[number];
            const int result = call_library(producers_[i].get(), make_message({number, count}));
            if (result == 0) ++count;
            if (result != 0 && result != -EAGAIN) has_failed_ = true;
        }
    }
}

}  // namespace kivd
