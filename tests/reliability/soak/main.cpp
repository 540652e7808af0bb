// Two million requests, or hours of them, from 508 clients at once: nothing is lost, and in the end
// the daemon holds what it held early on.
#include <CLI/CLI.hpp>
#include <optional>

#include "answer_times.h"
#include "clients.h"
#include "collector.h"
#include "settings.pb.h"
#include "support/config_package.h"

namespace kivd::soak {
namespace {

constexpr std::chrono::seconds idle_time(2);
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
    struct point {
        double seconds;
        double requests;
        double cpu_seconds;
    };

    soak() {
        // However long its reports lie there, none is deleted to make room.
        const auto settings = own_part<Settings>("Settings", "max_output_dir_size: 1000000000");
        std::filesystem::create_directory("input");
        write_file("input/config", config_file({settings}));
        daemon_ = start();
    }

    // What it has when it does nothing and the event file is open.
    holding at_rest() const {
        request({"FL", "EV rest event x"});
        EXPECT_TRUE(daemon_.wait_idle());
        return {daemon_.descriptors(), daemon_.anonymous_kib()};
    }

    point reached(const clients& sending) const {
        const std::string used = read_file("/proc/" + std::to_string(daemon_.pid()) + "/schedstat");
        return {seconds(), static_cast<double>(sending.total()), std::stod(used) / 1e9};
    }
    void print_stretch(const point& from, const point& to,
                       const std::vector<milliseconds>& times) const {
        const double requests = to.requests - from.requests;
        printf(
            "%6.1f min: %.0f requests, %.0f a second, %.1f us of CPU each, %s; %ld KiB, "
            "%zu descriptors\n",
            (to.seconds - started_) / 60, requests, requests / (to.seconds - from.seconds),
            (to.cpu_seconds - from.cpu_seconds) / requests * 1e6, summary(times).c_str(),
            daemon_.anonymous_kib(), daemon_.descriptors());
        (void)fflush(stdout);
    }

    // Until that part of the whole is done, with a line a minute.
    void flood(clients& sending, double part, size_t descriptor_limit) {
        const unique_fd control = connect_client(socket_kind::packets);
        std::optional<answer_times> asking(std::in_place);
        std::vector<milliseconds> all_times;
        const auto take_times = [&] {
            std::vector<milliseconds> times = asking->finish();
            all_times.insert(all_times.end(), times.begin(), times.end());
            return times;
        };
        const point first = reached(sending);
        point last = first;
        double flush = first.requests;
        double save = first.requests;
        double look = first.seconds;
        double line = first.seconds + 60;
        sending.send([&] {
            const auto sent = static_cast<double>(sending.total());
            if (is_due(sent, flush, requests_per_flush)) send_text(control.get(), "FL");
            if (is_due(sent, save, requests_per_save)) send_text(control.get(), "FS");
            EXPECT_TRUE(!is_due(seconds(), look, 1) || daemon_.descriptors() <= descriptor_limit);
            if (is_due(seconds(), line, 60)) {
                const point now = reached(sending);
                print_stretch(std::exchange(last, now), now, take_times());
                asking.emplace();
            }
            const double hours = (seconds() - started_) / 3600;
            const double done = wanted_hours > 0 ? hours / wanted_hours : sent / wanted_requests;
            return done >= part || HasFailure();
        });
        (void)take_times();
        puts(part < 1 ? "warm-up:" : "all behind it:");
        print_stretch(first, reached(sending), all_times);
    }

    daemon_process daemon_;
    const double started_ = seconds();
};

TEST_F(soak, loses_nothing_and_holds_on_to_nothing) {
    const holding alone = at_rest();
    {
        std::optional<answer_times> idle(std::in_place);
        std::this_thread::sleep_for(idle_time);
        printf("idle: %s\n", summary(idle->finish()).c_str());
    }
    collector collecting;
    std::optional<clients> sending(directory);
    const size_t descriptor_limit = at_rest().descriptors + working_descriptors;
    flood(*sending, warm_up, descriptor_limit);
    const holding early = at_rest();
    flood(*sending, 1, descriptor_limit);
    const holding late = at_rest();
    printf("at rest: %zu descriptors and %ld KiB early, %zu and %ld in the end\n",
           early.descriptors, early.anonymous_kib, late.descriptors, late.anonymous_kib);
    EXPECT_EQ(late.descriptors, early.descriptors);
    EXPECT_LE(late.anonymous_kib, early.anonymous_kib + growth_limit_kib);

    const message_counts sent = sending->counts();
    sending.reset();
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
