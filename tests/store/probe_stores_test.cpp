// The stores of counters and static data, which have most of their ways in common.
#include <algorithm>

#include "config/limits.h"
#include "report/state_file.h"
#include "store/counters.h"
#include "store/static_data.h"
#include "support/scratch_directory.h"
#include "util/clock.h"
#include "util/paths.h"

namespace kivd {
namespace {

class probe_stores : public scratch_directory {
 protected:
    void save_and_restart() {
        counters_save();
        static_data_save();
        restart();
    }
    // What a report since then holds.
    std::string reported(int64_t since_ms) {
        set_last_flush(since_ms);
        return contents(next_report());
    }
};

TEST_F(probe_stores, numbers_wrap_at_64_bits_and_keep_their_sign) {
    write_file(paths::counters,
               "p\0max\0001\0001\0009223372036854775807\0\0\n"s
               "p\0min\0001\0001\000-9223372036854775808\0\0\n"s
               "p\0odd\0\0\xFF\0004x\0\0\n"s
               "p\0z\0001\0001\000999999999999999999999999999999\0\0\n"s);
    restart();
    counters_update("p", "max", 1, counter_mode::increment, 0);
    counters_update("p", "min", -1, counter_mode::increment, 0);
    counters_update("p", "odd", 0, counter_mode::increment, 0);
    counters_update("p", "z", 0, counter_mode::increment, 0);
    counters_update("p", "a", 5, counter_mode::increment, 0);
    counters_update("p", "a", INT32_MIN, counter_mode::set, 0);
    save_and_restart();
    EXPECT_EQ(reported(0),
              "P1; a=-2147483648; max=-9223372036854775808; "
              "min=9223372036854775807; odd=112; z=5076944270305263615; ");
}

TEST_F(probe_stores, any_number_of_probes_is_found_again_in_order) {
    lines names(3000);
    for (size_t i = 0; i < 3000; ++i) names[i] = std::string(i % 7, '\xE4') + std::to_string(i);
    for (const char* sum : {"=1; ", "=2; "}) {
        for (const auto& n : names) counters_update("p", n.c_str(), 1, counter_mode::increment, 0);
        std::ranges::sort(names);
        std::string all = "P1; ";
        for (const auto& n : names) all += n + sum;
        EXPECT_EQ(reported(0), all);
        save_and_restart();
    }
}

// 1,100 names whose hashes have so many last bits in common that an index cannot tell them apart.
lines colliding_names() {
    lines names;
    for (size_t i = 0; names.size() < 1100; ++i) {
        std::string name = std::to_string(i);
        if (std::hash<std::string_view>()(name) % 2048 == 0) names.push_back(std::move(name));
    }
    return names;
}

TEST_F(probe_stores, names_that_collide_are_found_too) {
    for (int round = 0; round < 2; ++round) {
        for (const auto& n : colliding_names()) {
            counters_update("p", n.c_str(), 1, counter_mode::increment, 0);
        }
    }
    EXPECT_EQ(take_log(), lines());
    const std::string report = reported(0);
    EXPECT_EQ(std::ranges::count(report, '='), 1100);
    EXPECT_EQ(report.find("=1;"), std::string::npos);
}

TEST_F(probe_stores, no_user_takes_the_places_of_all) {
    int next = 0;
    const auto add = [&next](uid_t user, int names) {
        for (int i = 0; i < names; ++i) {
            const std::string name = std::to_string(next++);
            counters_update("p", name.c_str(), 1, counter_mode::increment, user);
            static_data_set("p", name.c_str(), "x", user);
        }
        return take_log().size();
    };
    EXPECT_EQ(add(getuid() + 1, 10000), 0U);
    EXPECT_EQ(add(getuid() + 1, 3), 6U);  // each of them is told
    EXPECT_EQ(add(getuid() + 2, 9984), 0U);
    EXPECT_EQ(add(getuid() + 2, 3), 6U);
    EXPECT_EQ(add(getuid(), 16), 0U);
    counters_update("p", "0", 1, counter_mode::increment, getuid() + 2);  // has its place
    save_and_restart();
    const std::string report = reported(0);
    EXPECT_EQ(std::ranges::count(report, ';'), 40001);
    EXPECT_NE(report.find(" 0=2;"), std::string::npos);
    (void)take_log();

    get_limits().expire_counters_age = get_limits().expire_sdata_age = 100;
    enable_test_mode();
    set_test_clock(now_ms() / 1000 + 1000000);
    EXPECT_EQ(add(getuid() + 1, 10000), 0U);  // all others have expired
    EXPECT_EQ(add(getuid() + 1, 1), 2U);
}

TEST_F(probe_stores, the_expired_are_left_out_of_the_files_only) {
    enable_test_mode();
    get_limits().expire_counters_age = get_limits().expire_sdata_age = 100;
    set_test_clock(1000);
    for (const char* name : {"c1", "c2"}) counters_update("p", name, 1, counter_mode::set, 0);
    for (const char* name : {"s1", "s2"}) static_data_set("p", name, "x", 0);
    static_data_set("p", "s1", "x", 0);  // at 1005
    set_test_clock(1100);
    counters_save();  // what is from 1001 or before
    set_test_clock(1103);
    static_data_save();  // from 1004
    EXPECT_EQ(reported(0), "P1; c1=1; c2=1; s1: x; s2: x; ");
    EXPECT_EQ(reported(1002000), "P1; c2=1; s1: x; s2: x; ");
    EXPECT_EQ(reported(1003001), "P1; s2: x; ");  // what was set again to the same has not changed
    restart();
    EXPECT_EQ(reported(0), "test_id; c2=1; s1: x; ");

    get_limits().expire_counters_age = 0;  // never
    set_test_clock(1000000);
    counters_update("p", "c3", 1, counter_mode::set, 0);
    counters_save();
    restart();
    EXPECT_EQ(reported(0), "test_id; c2=1; c3=1; s1: x; ");
}

TEST_F(probe_stores, malformed_records_cost_no_others) {
    const std::string good = "p\0n\0001\0002\0003\0\0\n"s;
    const std::string bad = "p\0\0\n"s + "p\0n\0001\0002\0\0\n"s + "p\0n\0001\0002\0003\0x\0\0\n"s +
                            "p\0n\0001\0002\0\0\0\n"s;
    for (const char* path : {paths::counters, paths::static_data})
        write_file(path, good + bad + good);
    restart();
    EXPECT_EQ(take_log().size(), 8U);
    int packets = 0;
    while (!next_packet().empty()) ++packets;
    EXPECT_EQ(packets, 8);  // an event and an increment each; those of static data are not raised
    EXPECT_EQ(reported(0), "P1; n=3; n=3; n: 3; n: 3; ");
}

TEST_F(probe_stores, a_change_is_saved_once_and_after_a_failure_again) {
    fs::create_symlink("/dev/full", "private/counters.txt_");
    fs::create_symlink("/dev/full", "private/sdata.txt_");
    counters_update("p", "n", 1, counter_mode::set, 0);
    static_data_set("p", "n", "x", 0);
    for (const bool saved : {false, true, false}) {
        counters_save();
        static_data_save();
        EXPECT_EQ(fs::remove(paths::counters), saved);
        EXPECT_EQ(fs::remove(paths::static_data), saved);
        static_data_set("p", "n", "x", 0);  // no change
    }
    const std::string value(493, 'v');  // 19 bytes short of a record of 512
    static_data_set("p", "long", (value + "v").c_str(), 0);
    static_data_set("p", "n", value.c_str(), 0);
    EXPECT_EQ(reported(0), "P1; n=1; n: " + value + "; ");
    save_and_restart();
    EXPECT_EQ(reported(0),
              "P1; long: " + value.substr(0, 256) + "; n: " + value.substr(0, 256) + "; ");
}

}  // namespace
}  // namespace kivd
