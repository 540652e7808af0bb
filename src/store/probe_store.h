// What the stores of counters and of static data have in common: a sorted list of named values that
// is loaded at the start, saved when something changed, and reported by what changed.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "config/limits.h"
#include "list/list_file.h"
#include "list/sorted_list.h"
#include "record/record_file.h"

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
        list_.clear();
        dirty_ = false;
        list_.use_index();
        (void)list_load(list_, path_, entry::parse);
    }

    [[nodiscard]] entry* find(const probe_key& key) const { return list_.find(key); }

    // False when the entry could not be added; it is then gone.
    [[nodiscard]] bool add(unique_entry<entry> added) {
        if (list_.add(std::move(added)) == nullptr) return false;
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
            uint8_t record[entry::report_record_size];
            report.append({record, each.pack(record)}, tag_);
        });
        report.flush(tag_);
    }

    // Whether there is any such entry.
    [[nodiscard]] bool is_pending(int64_t since_ms) const {
        return list_.any_of(
            [since_ms](const entry& each) { return each.changed_ms() >= since_ms; });
    }

    void release() { list_.clear(); }

 private:
    const char* tag_;
    const char* path_;
    uint32_t limits::*expire_age_;
    sorted_list<entry> list_;
    bool dirty_ = false;
};

}  // namespace kivd
