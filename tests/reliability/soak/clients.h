// 500 connections, every other one on the stream socket, and 8 producers that use libkiv.
#pragma once

#include <linux/sockios.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <algorithm>
#include <atomic>
#include <numeric>
#include <thread>

#include "client/kiv.h"
#include "end_to_end/daemon_test.h"
#include "traffic.h"

namespace kivd::soak {

class clients {
 public:
    explicit clients(const std::string& directory) {
        for (size_t i = 0; i < connections_.size(); ++i) {
            const bool is_stream = i % 2 == 1;
            connections_[i] = {
                connect_client(is_stream ? socket_kind::stream : socket_kind::packets), is_stream};
        }
        for (size_t i = 0; i < producers_.size(); ++i) {
            producers_[i].reset(kiv_create_from_path(directory.c_str()));
            kiv_set_timeout(producers_[i].get(), patience_ms);
            if (i % 2 == 0) kiv_set_wait(producers_[i].get(), patience_ms);
        }
    }

    // Lets all send as fast as the daemon takes it until `is_enough`, which is asked every few
    // milliseconds; returns when everything has been carried out.
    void send(const std::function<bool()>& is_enough) {
        std::jthread producing([this](const std::stop_token& stop) { produce(stop); });
        while (!is_enough()) send_round();
        producing = std::jthread();
        const unique_fd last = connect_client(socket_kind::datagram);  // behind the producers'
        EXPECT_TRUE(send_text(last.get(), "IA") && wait_taken(last.get()));
        for (connection& each : connections_)
            EXPECT_TRUE(wait_until([&] { return is_done(each); }));
        request({});
    }

    [[nodiscard]] message_counts counts() const {  // of what each has sent
        message_counts copy;
        std::ranges::copy(counts_, copy.begin());
        return copy;
    }
    [[nodiscard]] uint64_t total() const {
        return std::accumulate(counts_.begin(), counts_.end(), uint64_t{0});
    }

 private:
    static constexpr size_t batch_size = 4;
    static constexpr unsigned patience_ms = 60000;

    struct connection {
        unique_fd fd;
        bool is_stream = false;
        size_t awaited = 0;  // bytes of answers, which is as many answers
    };

    // Whether all that it has sent has been read, and answered where there is an answer.
    static bool is_done(connection& client) {
        if (client.awaited > 0) {
            std::array<char, 64> answers;
            const ssize_t n = recv(client.fd.get(), answers.data(), answers.size(), MSG_DONTWAIT);
            if (n > 0) client.awaited -= static_cast<size_t>(n);
        }
        int unread = 0;
        return client.awaited == 0 && ioctl(client.fd.get(), SIOCOUTQ, &unread) == 0 && unread == 0;
    }

    void send_round() {
        std::array<bool, connection_count> is_ready;
        std::ranges::transform(connections_, is_ready.begin(), is_done);
        // The read that has emptied a stream may be going on, and would take what comes now as
        // part of the same packet. An answer to somebody else says that it has ended.
        EXPECT_EQ(ask(barrier_.get(), "IA"), "1");
        for (int i = 0; i < connection_count; ++i) {
            if (is_ready[static_cast<size_t>(i)]) send_batch(i);
        }
    }

    void send_batch(int number) {
        connection& client = connections_[static_cast<size_t>(number)];
        std::atomic<uint64_t>& count = counts_[static_cast<size_t>(number)];
        const unsigned size = client.is_stream ? 1 : batch_size;
        std::array<std::string, batch_size> packets;
        std::array<iovec, batch_size> pieces;
        std::array<mmsghdr, batch_size> headers = {};
        for (unsigned i = 0; i < size; ++i) {
            const message next = make_message(number, count + i);
            packets[i].append(next.kind).append(" soak ").append(next.name).append(" ");
            packets[i].append(next.value);
            if (client.is_stream) packets[i] = framed(packets[i]);
            pieces[i] = {packets[i].data(), packets[i].size()};
            headers[i].msg_hdr.msg_iov = &pieces[i];
            headers[i].msg_hdr.msg_iovlen = 1;
        }
        const int sent = sendmmsg(client.fd.get(), headers.data(), size, MSG_DONTWAIT);
        EXPECT_GT(sent, 0) << strerror(errno);
        for (int i = 0; i < sent; ++i) {
            const auto at = static_cast<size_t>(i);
            EXPECT_EQ(headers[at].msg_len, packets[at].size());
            if (kind_of(number, count++) == "IA") ++client.awaited;
        }
    }

    void produce(const std::stop_token& stop) {
        while (!stop.stop_requested()) {
            for (int i = 0; i < producer_count; ++i) {
                std::atomic<uint64_t>& count = counts_[static_cast<size_t>(connection_count + i)];
                const int result = call_library(producers_[static_cast<size_t>(i)].get(),
                                                make_message(connection_count + i, count));
                if (result == 0) ++count;
                EXPECT_TRUE(result == 0 || result == -EAGAIN) << strerror(-result);
            }
        }
    }

    static int call_library(kiv_handle* kiv, const message& next) {
        const char* const name = next.name.c_str();
        const std::string& value = next.value;
        if (next.kind == "EV") return kiv_add_event(kiv, "soak", name, value.data(), value.size());
        if (next.kind == "CI") return kiv_inc_counter(kiv, "soak", name, std::stoi(value));
        if (next.kind == "CS") return kiv_set_counter(kiv, "soak", name, std::stoi(value));
        if (next.kind == "SD") return kiv_set_static_data(kiv, "soak", name, value.c_str());
        return kiv_is_alive(kiv);
    }

    std::array<connection, connection_count> connections_;
    std::array<std::unique_ptr<kiv_handle, releaser<kiv_destroy>>, producer_count> producers_;
    const unique_fd barrier_ = connect_client(socket_kind::packets);
    std::array<std::atomic<uint64_t>, client_count> counts_ = {};
};

}  // namespace kivd::soak
