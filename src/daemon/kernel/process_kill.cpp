#include "daemon/kernel/process_kill.h"

#include <cstdlib>
#include <cstring>
#include <utility>

#include "kernel.pb-c.h"
#include "runtime/log_and_raise.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivkb";
constexpr char function_name[] = "translate_event";

// As the kernel writes it, in the machine's byte order.
struct raw_process_kill {
    int32_t pid;
    int32_t rss;
    int32_t oom_score_adj;
    char comm[32];  // text up to the first NUL
    int32_t reason;
    int32_t nr_free_pages;
    int32_t nr_file_pages;
    int32_t nr_file_mapped;
    int32_t nr_free_pages_lo;
};
static_assert(sizeof(raw_process_kill) == 64);

void fill(Kernel__ProcessKill& message, const raw_process_kill& raw, char* comm) {
    const auto set = [](protobuf_c_boolean& present, int32_t& field, int32_t value) {
        present = 1;
        field = value;
    };
    set(message.has_pid, message.pid, raw.pid);
    set(message.has_rss, message.rss, raw.rss);
    set(message.has_oom_score_adj, message.oom_score_adj, raw.oom_score_adj);
    set(message.has_reason, message.reason, raw.reason);
    set(message.has_nr_free_pages, message.nr_free_pages, raw.nr_free_pages);
    set(message.has_nr_file_pages, message.nr_file_pages, raw.nr_file_pages);
    set(message.has_nr_file_mapped, message.nr_file_mapped, raw.nr_file_mapped);
    set(message.has_nr_free_pages_lo, message.nr_free_pages_lo, raw.nr_free_pages_lo);
    message.comm = comm;
}

}  // namespace

std::optional<packed_event> translate_event(std::string_view package, std::string_view name,
                                            std::span<const char> record) {
    if (package != "kernel" || name != "ProcessKill") {
        log_and_raise(tag, "%s [%.*s/%.*s] not supported by translated", function_name,
                      static_cast<int>(package.size()), package.data(),
                      static_cast<int>(name.size()), name.data());
        return std::nullopt;
    }
    raw_process_kill raw;
    if (record.size() < sizeof raw) {
        log_and_raise(tag, "%s got a record of %zu bytes", function_name, record.size());
        return std::nullopt;
    }
    memcpy(&raw, record.data(), sizeof raw);
    char comm[sizeof raw.comm + 1] = {};
    memcpy(comm, raw.comm, sizeof raw.comm);
    Kernel__ProcessKill message = KERNEL__PROCESS_KILL__INIT;
    fill(message, raw, comm);
    unique_malloc<uint8_t> bytes(
        static_cast<uint8_t*>(malloc(kernel__process_kill__get_packed_size(&message))));
    if (!bytes) {
        log_and_raise(tag, "%s failed to allocate buffer", function_name);
        return std::nullopt;
    }
    const size_t size = kernel__process_kill__pack(&message, bytes.get());
    return packed_event{std::move(bytes), size};
}

}  // namespace kivd
