// How long the daemon is busy with a new configuration, from the announcement to its answer.
#include <unistd.h>

#include <filesystem>
#include <random>
#include <span>
#include <string>

#include "bench/configuration.h"
#include "bench/keys.h"
#include "bench/load.h"
#include "bench/measure.h"
#include "bench/plain_file.h"
#include "bench/sections.h"
#include "format/config_file.h"
#include "intake/config_file.h"

namespace kivd::bench {

namespace {

constexpr unsigned part_count = 200;
constexpr size_t signature_room = 260;

// Items of a filter: those that differ, and with the repetitions of the last one.
struct item_counts {
    unsigned distinct;
    unsigned all;
};
constexpr item_counts only_distinct = {19'900, 19'900};
constexpr item_counts repeating = {10'000, 19'900};
constexpr item_counts whole_package = {90'000, 838'000};

constexpr useconds_t settle_us = 10'000;
constexpr char config_key_name[] = "kiv_config.pem";

std::string random_bytes(std::mt19937& random, size_t size) {
    std::string bytes;
    for (size_t i = 0; i < size; ++i) bytes += static_cast<char>(random());
    return bytes;
}

kiv::config::ConfigPackage make_package(size_t payload_size) {
    std::mt19937 random(1);
    kiv::config::ConfigPackage package;
    for (unsigned i = 0; i < part_count; ++i) {
        kiv::config::ConfigPart& part = *package.add_parts();
        part.set_package("com.example.app" + std::to_string(i / 10));
        part.set_name("settings_" + std::to_string(i));
        part.set_payload(random_bytes(random, payload_size));
    }
    return package;
}

// The largest that still fits into a signed file.
kiv::config::ConfigPackage make_full_package() {
    for (size_t payload_size = max_config_file_size / part_count;; --payload_size) {
        kiv::config::ConfigPackage package = make_package(payload_size);
        if (make_config_file(compress(package), std::string(signature_room, 's')).size() <=
            max_config_file_size)
            return package;
    }
}

// Directories that stay until all rounds are over: a file system may be slow to give away anew what
// has just been deleted.
class round_directories {
 public:
    explicit round_directories(const setup& s) : parent_(s.scratch) {}
    [[nodiscard]] std::string next() {
        const std::string path = parent_.path() + "/" + std::to_string(++count_);
        std::filesystem::create_directory(path);
        return path;
    }

 private:
    scratch_directory parent_;
    unsigned count_ = 0;
};

// What has to be done at least: the parts in files, and the signature held against the data.
double take_plainly(const std::string& directory, const kiv::config::ConfigPackage& package,
                    const std::string& key_directory, std::string_view data,
                    std::string_view signature) {
    double milliseconds = 0;
    run_in_child({&milliseconds, 1}, [&](std::span<double> figures) {
        const std::string key = key_directory + config_key_name;
        (void)verify(key, data, signature);  // brings in the library
        const int64_t start = now_ns();
        if (!verify(key, data, signature)) give_up("the signature does not hold");
        int number = 0;
        for (const kiv::config::ConfigPart& part : package.parts())
            write_file(directory + "/" + std::to_string(++number), part.payload());
        figures[0] = static_cast<double>(now_ns() - start) / 1e6;
    });
    return milliseconds;
}

class announced_daemon {
 public:
    announced_daemon(const setup& s, const std::string& directory, const std::string& key_directory)
        : directory_(directory),
          daemon_(start_daemon(s, directory, compression::off, key_directory)),
          control_(connect_control(directory)) {
        if (ask(control_.get(), "IA") != "1") give_up("no answer to IA");
    }
    ~announced_daemon() { stop(daemon_); }

    // Puts the file into its place and gives the time from NC to `answer`, in ms.
    [[nodiscard]] double take(std::string_view file, std::string_view answer = "1") {
        write_file(directory_ + "/input/config", file);
        (void)usleep(settle_us);
        const int64_t start = now_ns();
        if (ask(control_.get(), "NC") != answer) give_up("another answer to NC than expected");
        return static_cast<double>(now_ns() - start) / 1e6;
    }
    [[nodiscard]] bool filters_events() const {
        return std::filesystem::exists(directory_ + "/private/filters.txt");
    }

 private:
    std::string directory_;
    daemon_process daemon_;
    unique_fd control_;
};

struct intake_times {
    std::vector<double> plain_ms;
    std::vector<double> unsigned_ms;
    std::vector<double> signed_ms;
    std::vector<double> again_ms;
};

void measure_parts(const setup& s, const std::string& key_directory) {
    const kiv::config::ConfigPackage package = make_full_package();
    const std::string data = compress(package);
    std::string signature;
    {
        const std::string path = key_directory + "signature";
        child_process process = fork_child([&] { write_file(path, sign(key_directory, data)); });
        join(process);
        signature = read_file(path);
    }
    const std::string plain_file = make_config_file(data, "");
    const std::string signed_file = make_config_file(data, signature);
    intake_times times;
    round_directories directories(s);
    for (unsigned i = 0; i < amount(s, 25, 7); ++i) {
        times.plain_ms.push_back(
            take_plainly(directories.next(), package, key_directory, data, signature));
        announced_daemon without_key(s, directories.next(), no_keys);
        times.unsigned_ms.push_back(without_key.take(plain_file));
        announced_daemon with_key(s, directories.next(), key_directory);
        times.signed_ms.push_back(with_key.take(signed_file));
        times.again_ms.push_back(with_key.take(signed_file));
    }
    print_note("200 parts in a file of %zu bytes, %zu with the signature", plain_file.size(),
               signed_file.size());
    print_row("the parts written as files, one RSA-2048 verify", times.plain_ms, "ms");
    print_row("kivd, not signed", times.unsigned_ms, "ms", {bound::at_most, 20});
    print_row("kivd, signed", times.signed_ms, "ms", {bound::at_most, 20});
    print_row("kivd, signed, over the same parts", times.again_ms, "ms", {bound::at_most, 20});
    print_row("kivd, signed : plainly", ratios(times.signed_ms, times.plain_ms), "x");
}

// Probes in descending order, with names that compress well for names that differ.
std::vector<probe> make_descending_probes(const item_counts& counts) {
    static constexpr unsigned base = 128;
    const auto letter = [](unsigned digit) { return static_cast<char>(0x80 + digit); };
    std::vector<probe> probes;
    for (unsigned i = counts.distinct; i-- > 0;)
        probes.push_back(
            {"p", {letter(i / base / base), letter(i / base % base), letter(i % base)}});
    probes.resize(counts.all, probes.back());
    return probes;
}

// A filter that repeats itself is left out; one that no list holds has its configuration refused.
enum class outcome { in_force, left_out, refused };

void measure_filter(const setup& s, const item_counts& items, outcome expected,
                    const char* measure) {
    const kiv::config::ConfigPackage package = make_filter_package(
        pack_event_filter(kiv::config::Filter::INCLUDE, make_descending_probes(items)));
    const std::string file = make_config_file(compress(package), "");
    std::vector<double> times;
    round_directories directories(s);
    for (unsigned i = 0; i < amount(s, 7, 3); ++i) {
        announced_daemon daemon(s, directories.next(), no_keys);
        times.push_back(daemon.take(file, expected == outcome::refused ? "0" : "1"));
        if (daemon.filters_events() != (expected == outcome::in_force))
            give_up("the filter is in force, or isn't, against expectation");
    }
    print_note("%u items, %u of them distinct, file of %zu bytes, package of %zu", items.all,
               items.distinct, file.size(), package.ByteSizeLong());
    print_row(measure, times, "ms", {bound::at_most, 2000});
}

}  // namespace

void measure_intake(const setup& s) {
    print_section("Intake of a configuration, NC to its answer");
    const scratch_directory keys(s.scratch);
    const std::string key_directory = keys.path() + "/";
    child_process maker = fork_child([&] { make_keys(keys.path(), config_key_name); });
    join(maker);
    measure_parts(s, key_directory);
    measure_filter(s, only_distinct, outcome::in_force, "a filter in descending order");
    measure_filter(s, repeating, outcome::left_out, "one that is left out for repetitions");
    measure_filter(s, whole_package, outcome::refused, "the largest package, refused");
}

}  // namespace kivd::bench
