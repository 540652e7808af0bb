// Two million requests, or hours of them, from 508 clients at once: nothing is lost, and in the end
// the daemon holds what it held early on.
#include <CLI/CLI.hpp>
#include <optional>

#include "bench/flood.h"
#include "collector.h"
#include "settings.pb.h"
#include "support/config_package.h"

namespace kivd::soak {
namespace {

constexpr size_t connections = 500;
constexpr size_t producers = 8;
constexpr double requests_per_flush = 20000;
constexpr double requests_per_save = 50000;
constexpr double warm_up = 0.1;  // of the whole
constexpr int64_t growth_limit_kib = 256;
constexpr size_t working_descriptors = 16;  // that it has for a moment, at most

double wanted_requests = 2e6;
double wanted_hours = 0;  // 0: until the requests are sent

double seconds() {
    const auto now = std::chrono::steady_clock::now().time_since_epoch();
    return std::chrono::duration<double>(now).count();
}

// Whether a figure has reached `next`, which then is `step` further on.
bool is_due(double figure, double& next, double step) {
    if (figure < next) return false;
    next = figure + step;
    return true;
}

class soak : public daemon_test {
 protected:
    struct holding {
        size_t descriptors;
        int64_t anonymous_kib;
    };

    soak() {
        // However long its reports lie there, none is deleted to make room.
        const auto settings = own_part<Settings>("Settings", "max_output_dir_size: 1000000000");
        std::filesystem::create_directory("input");
        write_file("input/config", config_file({settings}));
        daemon_ = start();
    }

    // Has it use its buffers as far as they go.
    static void fill_buffers() {
        const unique_fd producer = connect_client(socket_kind::datagram);
        const std::string packet = "EV full buffers " + std::string(largest_payload, 'x');
        for (int i = 0; i < 500; ++i) EXPECT_TRUE(send_text(producer.get(), packet));
    }

    // What it has when it does nothing and the event file is open.
    holding at_rest() const {
        request({"FL", "EV rest event x"});
        EXPECT_TRUE(daemon_.wait_idle());
        return {daemon_.descriptors(), daemon_.anonymous_kib()};
    }

    void print_progress(const flood& clients) const {
        const std::string used = read_file("/proc/" + std::to_string(daemon_.pid()) + "/schedstat");
        const auto requests = static_cast<double>(clients.total());
        const double taken = seconds() - started_;
        printf(
            "%6.1f min: %.0f requests, %.0f a second, %.1f us of CPU each; %ld KiB, "
            "%zu descriptors\n",
            taken / 60, requests, requests / taken, std::stod(used) / 1e3 / requests,
            daemon_.anonymous_kib(), daemon_.descriptors());
        (void)fflush(stdout);
    }

    // Until that part of the whole is done, with a line a minute.
    void keep_busy(flood& clients, double part, size_t descriptor_limit) {
        const unique_fd control = connect_client(socket_kind::packets);
        auto flush = static_cast<double>(clients.total());
        double save = flush;
        double look = seconds();
        double line = look + 60;
        EXPECT_TRUE(clients.send([&] {
            const auto sent = static_cast<double>(clients.total());
            if (is_due(sent, flush, requests_per_flush)) send_text(control.get(), "FL");
            if (is_due(sent, save, requests_per_save)) send_text(control.get(), "FS");
            EXPECT_TRUE(!is_due(seconds(), look, 1) || daemon_.descriptors() <= descriptor_limit);
            if (is_due(seconds(), line, 60)) print_progress(clients);
            const double hours = (seconds() - started_) / 3600;
            const double done = wanted_hours > 0 ? hours / wanted_hours : sent / wanted_requests;
            return done >= part || HasFailure();
        })) << "not answered as it should be";
        print_progress(clients);
    }

    daemon_process daemon_;
    const double started_ = seconds();
};

TEST_F(soak, loses_nothing_and_holds_on_to_nothing) {
    collector collecting(connections + producers);
    fill_buffers();
    const holding alone = at_rest();
    std::optional<flood> clients(std::in_place, directory, connections, producers);
    const size_t descriptor_limit = at_rest().descriptors + working_descriptors;
    keep_busy(*clients, warm_up, descriptor_limit);
    const holding early = at_rest();
    keep_busy(*clients, 1, descriptor_limit);
    const holding late = at_rest();
    printf("at rest: %zu descriptors and %ld KiB early, %zu and %ld in the end\n",
           early.descriptors, early.anonymous_kib, late.descriptors, late.anonymous_kib);
    EXPECT_EQ(late.descriptors, early.descriptors);
    EXPECT_LE(late.anonymous_kib, early.anonymous_kib + growth_limit_kib);

    const std::vector<uint64_t> sent = clients->counts();
    clients.reset();
    EXPECT_TRUE(wait_until([&] { return daemon_.descriptors() == alone.descriptors; }))
        << daemon_.descriptors() << " instead of " << alone.descriptors;
    EXPECT_EQ(daemon_.stop(), 0);
    EXPECT_EQ(daemon_.count_in_log(" E "), 0U)
        << daemon_.log().substr(daemon_.log().find(" E "), 200);
    collecting.finish(sent);
}

}  // namespace
}  // namespace kivd::soak

int main(int argc, char** argv) {
    CLI::App app("Keeps a daemon under load and checks what becomes of every request.");
    app.add_option("--requests", kivd::soak::wanted_requests, "End after so many requests");
    app.add_option("--hours", kivd::soak::wanted_hours, "End after so many hours instead");
    CLI11_PARSE(app, argc, argv);
    testing::InitGoogleTest();
    return RUN_ALL_TESTS();
}
