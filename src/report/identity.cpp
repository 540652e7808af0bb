#include "report/identity.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "record/header_record.h"
#include "report/header_sources.h"
#include "report/report_generation.h"
#include "report/state_file.h"
#include "runtime/daemon_error.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-util";

void add_group_ids(group_id_list& to, const group_id_list& from) {
    for (size_t i = 0; i < from.count; ++i) add_group_id(to, from.ids[i].get());
}

bool same_group_ids(const group_id_list& a, const group_id_list& b) {
    if (a.count != b.count) return false;
    for (size_t i = 0; i < a.count; ++i) {
        if (strncmp(a.ids[i].get(), b.ids[i].get(), group_id_compared) != 0) return false;
    }
    return true;
}

// A value that is no longer known is no change.
bool is_changed(const header_record& candidate, const header_record& previous) {
    const bool is_text_changed = std::ranges::any_of(header_fields, [&](const auto& field) {
        return field.is_known(candidate) && !(candidate.*field.text == previous.*field.text);
    });
    return is_text_changed || !(candidate.config_checksum == previous.config_checksum) ||
           !same_group_ids(candidate.groups, previous.groups);
}

// Values that no source has stay as they are remembered.
void rebuild_header(header_record& record) {
    header_record candidate;
    gather_header(candidate);
    add_group_ids(candidate.groups, record.groups);
    add_group_id_property(candidate);
    candidate.config_checksum.set(text_of_checksum(get_config_checksum()).data());
    header_record previous = record;
    previous.groups = {};
    add_group_ids(previous.groups, record.groups);  // one that was replaced may stand there twice

    copy_known_values(record, candidate);
    add_group_ids(record.groups, candidate.groups);
    pack_report_header();

    if (!is_changed(candidate, previous)) return;
    if (previous.product_id != unknown_value && previous.device_id != unknown_value) {
        (void)generate_report();
    }
    state_save();
}

void announce_group_ids() {
    state_save();
    update_header_info();
}

}  // namespace

void update_header_info() {
    header_record& record = get_header_record();
    if (is_test_mode()) {
        set_test_identity(record);
        pack_report_header();
    } else {
        rebuild_header(record);
    }
    if (get_report_header().empty()) fatal_error("OOM: header_buf_p");
}

void ensure_device_id() {
    header_record& record = get_header_record();
    if (record.device_id != unknown_value) return;
    const unique_file file(fopen(paths::random_uuid, "re"));
    if (!file) {
        log_and_raise(tag, "Failed to open uuid file: %s", strerror(errno));
        return;
    }
    char line[40];
    if (fgets(line, sizeof line, file.get()) == nullptr) return;
    line[std::max(strlen(line), size_t{1}) - 1] = '\0';  // the line end
    record.device_id.set(line);
    state_save();
}

void get_device_id(device_id_buffer& buffer) {
    const std::string_view id = get_header_record().device_id.get();
    buffer = {};
    (void)id.copy(buffer.data(), buffer.size());
}

void set_group_id(const char* id) {
    if (add_group_id(get_header_record().groups, id)) announce_group_ids();
}

void delete_group_id(const char* id) {
    group_id_list& groups = get_header_record().groups;
    const size_t position = find_group_id(groups, id);
    if (position == max_group_ids) return;
    std::shift_left(groups.ids.begin() + position, groups.ids.begin() + groups.count, 1);
    --groups.count;
    announce_group_ids();
}

void replace_group_id(const char* new_id, const char* old_id) {
    group_id_list& groups = get_header_record().groups;
    const size_t position = find_group_id(groups, old_id);
    if (position == max_group_ids) return;
    groups.ids[position].set(new_id);
    announce_group_ids();
}

}  // namespace kivd
