// What the stores of counters and of static data have in common: a sorted list of named values that
// is loaded at the start, saved when something changed, and reported by what changed.
//
// A store has at most as many names as a list file, so that a start finds all of them again. Some
// places are kept for the daemon's own user, whose errors are counted too, and of the others a user
// other than root may have taken half. What has been loaded is nobody's.
#pragma once

#include <sys/types.h>
#include <unistd.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "config/limits.h"
#include "list/list_file.h"
#include "list/sorted_list.h"
#include "record/record_file.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"
#include "util/user_counts.h"

namespace kivd {

// An `entry` says how it is stored and reported:
//   static unique_entry<entry> parse(std::string_view record)  null: no such record, or no memory
//   bool write(list_writer&) const                             false: failed, logged and raised
//   size_t pack(std::span<uint8_t> record) const               0: does not fit, and is left out
//   report_record_size           bytes of the largest such record
//   int64_t changed_ms() const   when there was last something to report
//   int64_t seen_ms() const      when it was last set; it expires with that
template <class entry>
class probe_store {
 public:
    // `tag` is what failures are logged under, `expire_age` the limit that holds for its entries.
    constexpr probe_store(const char* tag, const char* path, uint32_t limits::*expire_age)
        : tag_(tag), path_(path), expire_age_(expire_age), list_(128) {}

    // A missing file is fine.
    void load() {
        release();
        dirty_ = false;
        list_.use_index();
        (void)list_load(list_, path_, entry::parse);
    }

    [[nodiscard]] entry* find(const probe_key& key) const { return list_.find(key); }

    // Whether that user may add the name. There may be room once what has expired is gone. If there
    // is none, that has been logged and raised.
    [[nodiscard]] bool make_room(const probe_key& key, uid_t user) {
        if (has_room(user)) return true;
        drop_expired();
        return has_room(user) ||
               log_and_raise(tag_, "Too many names - dropping. [%s:%s] of user %u", key.package,
                             key.name, user);
    }

    // False when the entry could not be added; it is then gone.
    [[nodiscard]] bool add(unique_entry<entry> added, uid_t user) {
        if (!makers_.add(user) || list_.add(std::move(added)) == nullptr) return false;
        dirty_ = true;
        return true;
    }

    // The next save has to write the file.
    void mark_changed() { dirty_ = true; }

    // Replaces the file when something changed since the last good save; what has expired is left
    // out.
    void save() {
        if (!dirty_) return;
        const int64_t cutoff_ms = expiry_cutoff_ms(get_limits().*expire_age_);
        dirty_ = !list_save(list_, path_, [cutoff_ms](list_writer& writer, const entry& each) {
            return each.seen_ms() <= cutoff_ms || each.write(writer);
        });
    }

    // Appends a record for each entry that changed at `since_ms` or later.
    void write_report(record_appender& report, int64_t since_ms) const {
        list_.for_each([&](const entry& each) {
            if (each.changed_ms() < since_ms) return;
            report.append(entry::report_record_size, tag_,
                          [&each](std::span<uint8_t> room) { return each.pack(room); });
        });
        report.flush(tag_);
    }

    // Whether there is any such entry.
    [[nodiscard]] bool is_pending(int64_t since_ms) const {
        return list_.any_of(
            [since_ms](const entry& each) { return each.changed_ms() >= since_ms; });
    }

    void release() {
        list_.clear();
        makers_.clear();
        last_drop_ms_ = 0;
    }

 private:
    static constexpr uint32_t kept_names = 16;
    static constexpr uint32_t most_names = list_records_max - kept_names;
    static constexpr int64_t drop_interval_ms = 60000;  // it looks at every entry

    [[nodiscard]] bool has_room(uid_t user) const {
        if (user == getuid()) return list_.size() < list_records_max;
        return list_.size() < most_names &&
               (is_privileged(user) || makers_.of(user) < list_records_max / 2);
    }

    // The names that are left belong to nobody, as after a start.
    void drop_expired() {
        const int64_t now_ms = monotonic_ms();
        if (last_drop_ms_ != 0 && now_ms - last_drop_ms_ < drop_interval_ms) return;
        last_drop_ms_ = now_ms;
        const int64_t cutoff_ms = expiry_cutoff_ms(get_limits().*expire_age_);
        const uint32_t before = list_.size();
        list_.drop_if([cutoff_ms](const entry& each, const entry* /*next*/) {
            return each.seen_ms() <= cutoff_ms;
        });
        if (list_.size() < before) makers_.clear();
    }

    const char* tag_;
    const char* path_;
    uint32_t limits::*expire_age_;
    sorted_list<entry> list_;
    bool dirty_ = false;
    user_counts makers_;
    int64_t last_drop_ms_ = 0;
};

}  // namespace kivd
