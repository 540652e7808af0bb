#include "report/state_file.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <optional>
#include <span>
#include <string_view>

#include "config/settings.h"
#include "record/header_record.h"
#include "runtime/daemon_error.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"
#include "util/file_io.h"
#include "util/numbers.h"
#include "util/paths.h"
#include "util/text_scan.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-util";
constexpr size_t line_size = 256;

constinit int64_t last_flush = 0;
constinit bool data_collection = false;
constinit config_checksum checksum_in_force = {};

void read_checksum(const char* text) {
    const std::string_view digits = scan_word(text, 59);
    const std::optional<config_checksum> checksum = parse_checksum(digits);
    if (!checksum) return;
    set_config_checksum(*checksum);
    get_header_record().config_checksum.set(digits);
}

void write_checksum(FILE* file) { fputs(text_of_checksum(checksum_in_force).data(), file); }

void read_last_flush(const char* text) {
    const auto time_ms = scan_number(text);
    if (!time_ms) return;
    set_last_flush(*time_ms);
    set_test_clock(*time_ms / 1000 + 1000);
}

void write_last_flush(FILE* file) {
    fprintf(file, "%lld", static_cast<long long>(get_last_flush()));
}

void read_shutdown_time(const char* text) {
    if (const auto time_ms = scan_number(text)) set_test_clock(*time_ms / 1000);
}

void write_shutdown_time(FILE* file) { fprintf(file, "%lld", static_cast<long long>(now_ms())); }

void read_data_collection(const char* text) {
    if (const auto digit = scan_number(text, 1)) set_data_collection(*digit != 0);
}

void write_data_collection(FILE* file) { fputs(is_data_collection_enabled() ? "1" : "0", file); }

void read_error_nr(const char* text) {
    if (const auto number = scan_number(text)) set_error_nr(saturate_int32(*number));
}

void write_error_nr(FILE* file) { fprintf(file, "%d", get_error_nr()); }

void read_error_time(const char* text) {
    if (const auto number = scan_number(text)) set_error_time(saturate_int32(*number));
}

void write_error_time(FILE* file) { fprintf(file, "%d", saturate_int32(get_error_time())); }

void read_group_id(const char* text) {
    const std::string_view id = scan_word(text, group_id::capacity);
    if (!id.empty()) add_group_id(get_header_record().groups, id);
}

// A line for something other than a header field or a limit.
struct state_value {
    std::string_view state_key;
    void (*read)(const char* text);  // leaves the value as it is when `text` holds none
    void (*write)(FILE* file);
};
// clang-format off
constexpr state_value first_values[] = {
    {"config-checksum:", read_checksum,        write_checksum},
    {"last-flush:",      read_last_flush,      write_last_flush},
    {"shutdown-time:",   read_shutdown_time,   write_shutdown_time},
};
constexpr state_value last_values[] = {
    {"data-collection:", read_data_collection, write_data_collection},
    {"error_nr:",        read_error_nr,        write_error_nr},
    {"error_time:",      read_error_time,      write_error_time},
};
// clang-format on
constexpr std::string_view group_id_key = "group_id:";

// Calls `visit` with the row of each line but those of the group ids, in the order in which they
// are written.
void for_each_line(auto visit) {
    constexpr size_t identity = 1;  // of the header fields
    constexpr size_t sizes = 2;     // of the limits
    for (const state_value& each : first_values) visit(each);
    for (const header_field& each : std::span(header_fields).first(identity)) visit(each);
    for (const setting& each : std::span(settings).first(sizes)) visit(each);
    for (const header_field& each : std::span(header_fields).subspan(identity)) visit(each);
    for (const setting& each : std::span(settings).subspan(sizes)) visit(each);
    for (const state_value& each : last_values) visit(each);
}

void read_value(const state_value& row, const char* text) { row.read(text); }

void read_value(const header_field& row, const char* text) {
    row.set_from_line(get_header_record(), text);
}

// The file holds these unsigned values as signed numbers.
void read_value(const setting& row, const char* text) {
    if (const auto number = scan_number(text)) {
        get_limits().*row.limit = static_cast<uint32_t>(saturate_int32(*number));
    }
}

void write_value(const state_value& row, FILE* file) { row.write(file); }

void write_value(const header_field& row, FILE* file) { fputs(row.get(get_header_record()), file); }

void write_value(const setting& row, FILE* file) {
    fprintf(file, "%d", static_cast<int32_t>(get_limits().*row.limit));
}

void read_line(const char* line) {
    for_each_line([line](const auto& row) {
        if (const char* const text = scan_key(line, row.state_key)) read_value(row, text);
    });
    if (const char* const text = scan_key(line, group_id_key)) read_group_id(text);
}

void write_lines(FILE* file) {
    for_each_line([file](const auto& row) {
        fprintf(file, "%s ", row.state_key.data());
        write_value(row, file);
        fputc('\n', file);
    });
    const group_id_list& groups = get_header_record().groups;
    for (size_t i = 0; i < groups.count; ++i) {
        fprintf(file, "%s %s\n", group_id_key.data(), groups.ids[i].get());
    }
}

}  // namespace

void state_load() {
    const unique_file file = open_to_read(paths::state);
    if (!file) {
        if (errno == ENOENT) return;
        log_and_raise(tag, "Failed to open configuration file %s: %s", paths::state,
                      strerror(errno));
        return;
    }
    char line[line_size];
    while (fgets(line, sizeof line, file.get()) != nullptr) read_line(line);
}

void state_save() {
    unique_file file(fopen(paths::state_new, "we"));
    if (!file) {
        log_and_raise(tag, "Failed to create new configuration file: %s", strerror(errno));
        return;
    }
    write_lines(file.get());
    const bool written = ferror(file.get()) == 0;
    if (fclose(file.release()) != 0 || !written) {  // on a full device the close is what fails
        log_and_raise(tag, "Failed to write new configuration file: %s", strerror(errno));
        (void)unlink(paths::state_new);
        return;
    }
    if (rename(paths::state_new, paths::state) != 0) {
        log_and_raise(tag, "Failed to rename configuration file: %s", strerror(errno));
    }
}

void state_release() {
    last_flush = 0;
    data_collection = false;
    checksum_in_force = {};
}

int64_t get_last_flush() { return last_flush; }

void set_last_flush(int64_t time_ms) { last_flush = time_ms; }

bool is_data_collection_enabled() { return data_collection; }

void set_data_collection(bool enabled) { data_collection = enabled; }

config_checksum get_config_checksum() { return checksum_in_force; }

void set_config_checksum(const config_checksum& checksum) { checksum_in_force = checksum; }

}  // namespace kivd
