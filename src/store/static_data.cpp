#include "store/static_data.h"

#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <string_view>

#include "config/filters.h"
#include "format/record_format.h"
#include "platform/android_log.h"
#include "runtime/log_and_raise.h"
#include "store/probe_store.h"
#include "util/clock.h"
#include "util/numbers.h"
#include "util/paths.h"
#include "util/releaser.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-sdata";
constexpr size_t saved_value_size = 256;

const char* or_null(const char* text) { return text != nullptr ? text : "NULL"; }

// What is needed of a value. No report has more of it than fits into a record, so the rest is only
// there to be compared.
struct kept_value {
    static constexpr size_t size_max = 512;

    // Without a text when there is no memory.
    explicit kept_value(const char* value) : text(strndup(value, size_max)), hash(hash_of(value)) {}

    [[nodiscard]] bool equals(const char* value) const {
        return hash == hash_of(value) && strncmp(text.get(), value, size_max) == 0;
    }

    unique_malloc<char> text;  // its first bytes
    uint64_t hash;             // of all of it

 private:
    static uint64_t hash_of(const char* value) { return std::hash<std::string_view>()(value); }
};

struct static_entry : probe_key {
    int64_t timestamp;  // when the value last changed, in ms
    int64_t last_seen;  // when it was last set, in ms
    kept_value value;

    static constexpr size_t report_record_size = kept_value::size_max;

    static unique_entry<static_entry> parse(std::string_view record) {
        std::array<const char*, 5> fields;
        if (!split_list_record(record, fields)) {
            __android_log_print(ANDROID_LOG_ERROR, tag, "Failed to parse sdata line <%s::%s>",
                                or_null(fields[0]), or_null(fields[1]));
            return nullptr;
        }
        return make({fields[0], fields[1]}, parse_int64(fields[2]), parse_int64(fields[3]),
                    fields[4]);
    }
    // Null when there is no memory.
    static unique_entry<static_entry> make(const probe_key& key, int64_t timestamp,
                                           int64_t last_seen, const char* value) {
        kept_value kept(value);
        if (!kept.text) return nullptr;
        return make_entry<static_entry>(key, timestamp, last_seen, std::move(kept));
    }
    [[nodiscard]] bool write(list_writer& writer) const {
        writer.text(package);
        writer.text(name);
        writer.number(timestamp);
        writer.number(last_seen);
        writer.text({value.text.get(), strnlen(value.text.get(), saved_value_size)});
        if (writer.end_record()) return true;
        return log_and_raise(tag, "Failed to write to sdata file: %s", strerror(errno));
    }
    [[nodiscard]] size_t pack(std::span<uint8_t> record) const {
        return pack_static_record(record, package, name, timestamp, value.text.get());
    }
    [[nodiscard]] int64_t changed_ms() const { return timestamp; }
    [[nodiscard]] int64_t seen_ms() const { return last_seen; }
};

constinit probe_store<static_entry> store(tag, paths::static_data, &limits::expire_sdata_age);

void change_value(static_entry& item, const char* value, int64_t now) {
    kept_value kept(value);
    if (!kept.text) return;
    item.value = std::move(kept);
    item.timestamp = now;
    store.mark_changed();
}

}  // namespace

void static_data_init() { store.load(); }

void static_data_set(const char* package, const char* name, const char* value, uid_t user) {
    if (!filter_match(filter_kind::static_data, package, name)) return;
    const probe_key key = {package, name};
    const int64_t now = now_ms();
    if (static_entry* const item = store.find(key)) {
        item->last_seen = now;
        if (!item->value.equals(value)) change_value(*item, value, now);
        return;
    }
    if (!store.make_room(key, user)) return;
    unique_entry<static_entry> added = static_entry::make(key, now, now, value);
    if (added && !store.add(std::move(added), user))
        log_and_raise(tag, "Failed to add new static data.");
}

void static_data_save() { store.save(); }

void static_data_write_report(record_appender& report, int64_t since_ms) {
    store.write_report(report, since_ms);
}

bool static_data_pending(int64_t since_ms) { return store.is_pending(since_ms); }

void static_data_release() { store.release(); }

}  // namespace kivd
