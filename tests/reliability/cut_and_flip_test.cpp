// Every file that the daemon reads back, as the daemon itself wrote it, but cut before each of its
// bytes and with each of them changed. What was not hit is still there, and what has been read can
// be added to, saved and read once more.
#include <algorithm>
#include <climits>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <map>
#include <numeric>
#include <set>

#include "config/config_parts.h"
#include "config/filters.h"
#include "config/limits.h"
#include "diag/diag_store.h"
#include "diag/file_export.h"
#include "intake/intake.h"
#include "record/header_record.h"
#include "record/record_file.h"
#include "report/header_sources.h"
#include "report/state_file.h"
#include "runtime/daemon_error.h"
#include "security/key_paths.h"
#include "security/seal.h"
#include "settings.pb.h"
#include "store/counters.h"
#include "store/events.h"
#include "store/static_data.h"
#include "support/config_package.h"
#include "support/scratch_directory.h"
#include "util/clock.h"
#include "util/paths.h"

namespace kivd {
namespace {

constexpr char diag_file[] = "private/qz/qz_2";
constexpr size_t terminator_size = 3;  // of a record in a list file

// A file in its pieces: records, lines, or all of it in one.
using pieces = std::vector<std::string>;

std::string join(const pieces& all, size_t count) {
    return std::accumulate(all.begin(), all.begin() + static_cast<ptrdiff_t>(count), ""s);
}

pieces split(const std::string& bytes, const std::string& end) {
    pieces all;
    for (size_t start = 0; start < bytes.size(); start += all.back().size()) {
        all.push_back(bytes.substr(start, bytes.find(end, start) + end.size() - start));
    }
    return all;
}

// A file that ends before byte `at` of one of its pieces, or has another byte there.
struct damage {
    const pieces& whole;
    size_t piece;
    size_t at;
    bool is_cut;
    std::string bytes;

    [[nodiscard]] std::string before() const { return join(whole, piece); }
    // How many bytes there are from `at` to the end of the piece.
    [[nodiscard]] size_t left() const { return whole[piece].size() - at; }
    // Whether the piece is as it was; one whose predecessor has lost its end goes with that.
    [[nodiscard]] bool spares(size_t other, size_t end_size) const {
        if (is_cut) return other < piece;
        return other != piece && (other != piece + 1 || left() > end_size);
    }
};

// The same moment each time, so that the same call gives the same bytes.
void set_clock() { set_test_clock(2000000000); }

// Record files: all records before the damage stay, and of the others what still is a record.

void expect_whole_records(const damage& d, const std::string& kept) {
    const std::string& hit = d.whole[d.piece];
    const size_t content = (static_cast<uint8_t>(hit[1]) & 0x80U) != 0 ? 3 : 2;
    if (d.is_cut || d.at == 0) {
        EXPECT_EQ(kept, d.before());
    } else if (d.at < content) {  // another length
        EXPECT_TRUE(kept.starts_with(d.before()) && d.bytes.starts_with(kept));
    } else {
        EXPECT_EQ(kept, d.bytes);
    }
}

const std::string payloads[] = {"", "\x12\x02\x12\0"s, std::string(300, '\x12'), "last"};

// Appends what each call adds to the file.
void grow(pieces& all, const char* path, void (*add)(const std::string& payload)) {
    for (const std::string& payload : payloads) {
        const size_t size = join(all, all.size()).size();
        add(payload);
        all.push_back(read_file(path).substr(size));
    }
}

void add_event(const std::string& payload) {
    set_clock();
    (void)events_add("app", "start", payload);
}

pieces make_events() {
    events_open();
    pieces all = {read_file(paths::events)};  // the header
    grow(all, paths::events, add_event);
    EXPECT_TRUE(events_flush());
    return all;
}

void expect_events(const damage& d) {
    rescue_event_file(paths::events, record_header::expected);
    std::string kept = exists(paths::events) ? read_file(paths::events) : "";
    expect_whole_records(d, kept);
    if (kept.empty()) kept = d.whole.front();  // begun anew
    add_event("last");
    EXPECT_TRUE(events_flush());
    rescue_event_file(paths::flushed_data, record_header::expected);
    EXPECT_EQ(read_file(paths::flushed_data), kept + d.whole.back());
}

void add_shutdown(const std::string& payload) {
    set_clock();
    diag_add_event("devicemonitor.powerstat", "ShutDown", payload);
}

pieces make_diagnostics() {
    diag_set_active(1);
    for (int i = 0; i < 7; ++i) add_shutdown(std::string(30000, 'x'));  // the first file is full
    pieces all;
    grow(all, diag_file, add_shutdown);
    diag_wait_for_compressor();
    return all;
}

void expect_diagnostics(const damage& d) {
    diag_set_active(1);
    const std::string kept = read_file(diag_file);
    expect_whole_records(d, kept);
    add_shutdown("last");
    diag_set_active(1);
    EXPECT_EQ(read_file(diag_file), kept + d.whole.back());
    EXPECT_EQ(next_exported_file("750", "1"), 2);
    EXPECT_EQ(next_exported_file("750", "2"), -1);
}

// List files. What a start reads, the next save writes. The last record of a sample is there after
// every save, since it is always made anew.

void expect_list(const damage& d, std::string (*load_and_save)()) {
    const std::string saved = load_and_save();
    const lines log = take_log();
    for (size_t i = 0; i + 1 < d.whole.size(); ++i) {
        const std::string& record = d.whole[i];
        if (!d.spares(i, terminator_size) || saved.find(record) != std::string::npos) continue;
        // A part whose id or name the one that was hit has now.
        const std::string key = record.c_str() + "::"s + (record.c_str() + record.find('\0') + 1);
        EXPECT_NE(std::ranges::find(log, "E kivd-conf: Dropped config line <" + key + ">."),
                  log.end());
    }
    if (d.is_cut) {
        EXPECT_TRUE(saved == d.before() + d.whole.back() || (saved + d.before()).empty());
        // So few stray bytes don't matter.
        EXPECT_EQ(log, d.at < terminator_size
                           ? lines()
                           : lines{"E kivd-list: Corrupt data when reading list"});
    }
    EXPECT_EQ(load_and_save(), saved);
}

std::string load_and_save_counters() {
    counters_release();
    counters_init();
    set_clock();
    counters_update("z", "last", 0, counter_mode::increment);
    set_clock();
    counters_save();
    return read_file(paths::counters);
}

pieces make_counters() {
    set_clock();
    counters_update("app", "starts", INT32_MAX, counter_mode::set);
    counters_update("app", "starts \xE4\xFF", INT32_MIN, counter_mode::set);
    counters_update("app2", "a", -1, counter_mode::set);
    for (const char* name : {"", "*", "clicks", "\n"})
        counters_update("b", name, 7, counter_mode::set);
    counters_save();
    return split(load_and_save_counters(), "\0\0\n"s);
}

std::string load_and_save_values() {
    static_data_release();
    static_data_init();
    static_data_set("z", "last", "no");
    set_clock();
    static_data_set("z", "last", "yes");
    set_clock();
    static_data_save();
    return read_file(paths::static_data);
}

pieces make_values() {
    set_clock();
    static_data_set("app", "mode", "night, auto");
    static_data_set("app", "text", "two\nlines\n");
    static_data_set("app", "long", std::string(300, '\xC3').c_str());
    static_data_set("b", "n", "1");
    static_data_save();
    return split(load_and_save_values(), "\0\0\n"s);
}

// Configurations.

const std::string filter_text =
    "event_filter { type: EXCLUDE item { package: 'app' name: 'debug' } item { package: 'test' "
    "name: '*' } item { package: 'a' name: 'b' } } counter_filter { type: INCLUDE item { package: "
    "'app' name: '*' } item { package: 'shop' name: 'orders' } item { package: 'shop' name: 'x' } }"
    "staticdata_filter { type: EXCLUDE item { package: 'app' name: 'mode' } item { package: 'b' "
    "name: 'long name' } }";

// Its items stand in the list in another order than they were given their ids.
std::vector<config_part> sample_parts() {
    return {own_part<kiv::config::FilterConfig>("FilterConfig", filter_text),
            {"car", "menu", std::string(100, 's')},
            own_part<Settings>("Settings", "max_report_size: 300000 expire_sdata_age: 86400"),
            {"car", "empty", ""},
            {"app", "newest", "\0\xFF\n"s}};
}

bool take(const std::string& file) {
    write_file(paths::config_file, file);
    const bool taken = take_new_configuration();
    EXPECT_TRUE(fs::is_empty(paths::input_dir));
    return taken;
}

std::string part(const config_part& wanted) {
    const auto bytes = read_whole_fd(get_config_fd(wanted.package.c_str(), wanted.name.c_str()));
    return bytes ? std::string(bytes->data.get(), bytes->data.get() + bytes->size) : "none";
}

std::string load_and_save_config_list() {
    release_config_list();
    load_config_list();
    EXPECT_TRUE(save_config_list());
    return read_file(paths::config_list);
}

pieces make_config_list() {
    EXPECT_TRUE(take(config_file({{"bus", "left", ""}})));
    EXPECT_TRUE(take(config_file(sample_parts())));
    return split(read_file(paths::config_list), "\0\0\n"s);
}

void expect_config_list(const damage& d) {
    expect_list(d, load_and_save_config_list);
    // Whatever ids have got lost, each part of the next configuration has its own.
    auto parts = sample_parts();
    parts.push_back({"app", "another", "more"});
    EXPECT_TRUE(take(config_file(parts)));
    for (const config_part& each : parts) EXPECT_EQ(part(each), each.payload) << each.name;
}

template <filter_kind kind>
bool keeps(const std::string& record) {
    return filter_match(kind, record.c_str(), record.c_str() + record.find('\0') + 1);
}

constexpr const char* filter_paths[] = {paths::counter_filter, paths::static_data_filter,
                                        paths::event_filter};

template <filter_kind kind>
pieces make_filter() {
    EXPECT_TRUE(take(config_file(sample_parts())));
    return split(read_file(filter_paths[static_cast<size_t>(kind)]), "\0\0\n"s);
}

// A file that could not be read to its end excludes what it holds, whatever it was to do.
template <filter_kind kind>
void expect_filter(const damage& d) {
    release_filters();
    (void)load_filters();
    const std::string marker = "__type\0exclude\0\0\n"s;
    const auto& all = d.whole;
    const size_t marked = static_cast<size_t>(std::ranges::find(all, marker) - all.begin());
    const bool is_marker_hit = marked < all.size() && !d.spares(marked, terminator_size);
    const bool is_incomplete = d.is_cut ? d.at >= terminator_size
                                        : d.piece + 1 == all.size() && d.left() <= terminator_size;
    if (d.is_cut || !is_marker_hit) {
        const bool excludes = is_incomplete || (marked < all.size() && !is_marker_hit);
        EXPECT_EQ(keeps<kind>("nobody\0asks\0"s), excludes);
        for (size_t i = 0; d.is_cut && i < all.size(); ++i) {
            EXPECT_EQ(keeps<kind>(all[i]), (i < d.piece) != excludes) << i;
        }
    }
    apply_filter_config();  // as the next configuration does
    EXPECT_EQ(read_file(filter_paths[static_cast<size_t>(kind)]), join(all, all.size()));
}

// All that a configuration decides.
using decisions = std::map<std::string, std::string>;
decisions in_force() {
    decisions all;
    for (const auto& entry : fs::directory_iterator(paths::private_dir)) {
        all[entry.path()] = read_file(entry.path());
    }
    all["checksum"] = text_of_checksum(get_config_checksum()).data();
    all["limits"] = std::to_string(get_limits().max_report_size);
    all["part"] = part({"app", "old", ""});
    return all;
}

// The configuration in force while others are offered.
struct {
    std::string file;
    decisions before;
    void put_in_force() {
        clear_config_key_path();
        EXPECT_TRUE(take(file));
        before = in_force();
    }
} old;

pieces offer(const std::string& signature_key) {
    const std::string data = gzip(pack(sample_parts()));
    EXPECT_TRUE(take(config_file(sample_parts())));  // so that all parts have got their ids
    old.file = config_file({sample_parts()[0], {"app", "old", "kept"}});
    old.put_in_force();
    if (signature_key.empty()) return {config_file(data)};
    for (const char* name : {"config", "other"}) make_keys(name);
    set_config_key_dir("./");
    return {config_file(data, sign(data, signature_key))};
}

pieces make_unsigned() { return offer(""); }
pieces make_signed() { return offer("config"); }
pieces make_package() {
    (void)offer("");
    return {gzip(pack(sample_parts()))};
}

// Refused, or taken with all that is in it: when the damage is in what gzip says of time and
// system, or when the data means the same. No data at all is a configuration too, one of no parts.
void expect_refused_or_whole(const damage& d, bool taken, size_t gzip_start, bool is_empty) {
    const size_t in_gzip = d.at - gzip_start;
    if (!taken) {
        EXPECT_FALSE(is_empty || (!d.is_cut && in_gzip >= 4 && in_gzip < 10));
        EXPECT_EQ(in_force(), old.before);
        return;
    }
    EXPECT_TRUE(is_empty || !d.is_cut);
    for (const config_part& each : sample_parts()) {
        EXPECT_EQ(part(each), is_empty ? "none" : each.payload);
    }
    EXPECT_EQ(get_limits().max_report_size, is_empty ? default_limits.max_report_size : 300000);
    old.put_in_force();
}

void expect_unsigned(const damage& d) {  // a key, a length of two bytes, data
    expect_refused_or_whole(d, take_new_configuration(), 3, !d.is_cut && d.bytes[1] == '\0');
}

void expect_package(const damage& d) {
    expect_refused_or_whole(d, take(config_file(d.bytes)), 0, d.bytes.empty());
}

void expect_refused(const damage& /*d*/) {
    EXPECT_FALSE(take_new_configuration());
    EXPECT_EQ(in_force(), old.before);
}

// The configuration key; what is offered has been signed with another one.
std::string wrongly_signed;
pieces make_config_key() {
    wrongly_signed = offer("other").front();
    return {read_file("kiv_config.pem")};
}

void expect_no_way_in(const damage& /*d*/) {
    EXPECT_FALSE(take(wrongly_signed));
    EXPECT_EQ(in_force(), old.before);
}

pieces make_report_key() {
    make_keys("report");
    set_report_key_dir("./");
    return {read_file("kiv_report.pem")};
}

// Whatever number has become of it: a seal, or none.
void expect_seal_or_none(const damage& /*d*/) {
    const std::optional<sealing> started = start_sealing();
    if (!started) return;
    EXPECT_TRUE(started->cipher != nullptr && started->key_bits > 0);
    EXPECT_LE(started->key_bits, max_report_key_bits);
}

// Lines of text.

// The file as the next stop would leave it, but for the line that tells the time.
std::string load_and_save_state() {
    limits_release();
    release_header();
    set_config_checksum({});
    set_last_flush(0);
    set_data_collection(false);
    set_error_nr(0);
    set_error_time(0);
    state_load();
    state_save();
    std::string saved = read_file(paths::state);
    const size_t start = saved.find("shutdown-time:");
    return saved.erase(start, saved.find('\n', start) + 1 - start);
}

pieces make_state() {
    write_file(paths::state, doc_example("files.md", "text", "state-file") + "group_id: second\n");
    set_config_checksum({1, 2, 3});
    get_limits().expire_sdata_age = UINT32_MAX;
    state_load();
    state_save();
    return split(read_file(paths::state), "\n");
}

void expect_state(const damage& d) {
    const std::string saved = load_and_save_state();
    for (size_t i = 0; i < d.whole.size(); ++i) {
        if (!d.spares(i, 1) || d.whole[i].starts_with("shutdown-time")) continue;
        EXPECT_NE(("\n" + saved).find("\n" + d.whole[i]), std::string::npos) << d.whole[i];
    }
    EXPECT_EQ(load_and_save_state(), saved);
}

// The last one is what is left of some others when they are torn in two.
pieces make_header_info() {
    return split(
        "revision: 1.4.2\nvariant: european\ntype: user\ntimezone: -5400\n"
        "device id: 2543c433-e716\ncdf_id: 1234_R6D\nserial num: ABCD\n"
        "device imei: 1234567890\ngroup id: field-a\ngroup id: lab\nid: P100\n",
        "\n");
}

std::string load_header_info() {
    gather_header(get_header_record());
    pack_report_header();
    return {get_report_header().begin(), get_report_header().end()};
}

void expect_header_info(const damage& d) {
    const std::string header = load_header_info();
    for (size_t i = 0; i < d.whole.size(); ++i) {
        std::string value = d.whole[i].substr(d.whole[i].find(": ") + 2);
        value.pop_back();
        if (value == "-5400") value = "\x48\xAF\x54";  // the field with its key
        EXPECT_TRUE(!d.spares(i, 1) || header.find(value) != std::string::npos) << value;
    }
    EXPECT_EQ(load_header_info(), header);
}

const struct kept_file {
    const char* path;
    pieces (*make)();                 // what is in the sound file
    void (*expect)(const damage& d);  // loads the damaged one
} files[] = {
    {paths::events, make_events, expect_events},
    {diag_file, make_diagnostics, expect_diagnostics},
    {paths::counters, make_counters, [](auto& d) { expect_list(d, load_and_save_counters); }},
    {paths::static_data, make_values, [](auto& d) { expect_list(d, load_and_save_values); }},
    {paths::config_list, make_config_list, expect_config_list},
    {paths::counter_filter, make_filter<filter_kind::counters>,
     expect_filter<filter_kind::counters>},
    {paths::static_data_filter, make_filter<filter_kind::static_data>,
     expect_filter<filter_kind::static_data>},
    {paths::event_filter, make_filter<filter_kind::events>, expect_filter<filter_kind::events>},
    {paths::state, make_state, expect_state},
    {paths::header_info, make_header_info, expect_header_info},
    {paths::config_file, make_unsigned, expect_unsigned},
    {"package.gz", make_package, expect_package},  // in a file that is whole
    {paths::config_file, make_signed, expect_refused},
    {paths::config_key_name, make_config_key, expect_no_way_in},
    {paths::report_key_name, make_report_key, expect_seal_or_none},
};

class cut_and_flip : directory_in_memory, public scratch_directory {
 protected:
    cut_and_flip() {
        enable_test_mode();
        restart();
    }
    ~cut_and_flip() override { begin_anew(); }

    void begin_anew() {
        diag_set_active(0);
        clear_config_key_path();
        for (const char* name : {paths::private_dir, paths::output_dir, paths::input_dir}) {
            fs::remove_all(name);
            fs::create_directory(name);
        }
        restart();
        set_error_nr(INT_MAX);  // to be counted no more
        set_error_time(time(nullptr));
    }

    // Gives how many damaged files were loaded.
    int load_damaged(const kept_file& file) {
        const pieces whole = file.make();
        const std::string sound = join(whole, whole.size());
        EXPECT_FALSE(sound.empty());
        int loads = 0;
        const auto load = [&](const damage& d) {
            SCOPED_TRACE(testing::Message() << file.path << ": piece " << d.piece << " byte "
                                            << d.at << (d.is_cut ? " cut" : " changed"));
            write_file(file.path, d.bytes);
            set_error_nr(0);  // or the first one of a restart says that it is not sent
            (void)take_log();
            file.expect(d);
            ++loads;
            return !HasFailure();
        };
        size_t start = 0;
        for (size_t piece = 0; piece < whole.size(); start += whole[piece++].size()) {
            for (size_t at = 0; at < whole[piece].size(); ++at) {
                const char byte = whole[piece][at];
                if (!load({whole, piece, at, true, sound.substr(0, start + at)})) return loads;
                std::set<char> others = {'\0', '\n'};
                for (const int bits : {0x01, 0x02, 0x10, 0x40, 0x80, 0xFF}) {
                    others.insert(static_cast<char>(byte ^ bits));
                }
                others.erase(byte);
                for (const char other : others) {
                    std::string changed = sound;
                    changed[start + at] = other;
                    if (!load({whole, piece, at, false, changed})) return loads;
                }
            }
        }
        return loads;
    }
};

TEST_F(cut_and_flip, costs_no_more_than_what_was_hit) {
    int loads = 0;
    for (const kept_file& file : files) {
        ASSERT_FALSE(HasFailure());
        begin_anew();
        const int of_this = load_damaged(file);
        printf("%6d loads of a damaged %s\n", of_this, file.path);
        loads += of_this;
    }
    printf("%6d in all\n", loads);
    EXPECT_GE(loads, 30000);
}

}  // namespace
}  // namespace kivd
