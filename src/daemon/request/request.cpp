#include "daemon/request/request.h"

#include <cstring>
#include <utility>

#include "format/request_words.h"
#include "runtime/log_and_raise.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

const char* or_null(const char* text) { return text != nullptr ? text : "null"; }

}  // namespace

request make_request(const request_sender& sender, std::span<char> packet) {
    request r = {sender, packet, packet.data(), packet.data(), nullptr};
    r.command = next_token(r);
    return r;
}

const char* next_token(request& r) {
    const request_word word = find_word(r.rest);
    r.token_end = r.rest + (word.end - r.rest);
    r.rest = *word.end == '\0' ? r.token_end : r.token_end + 1;
    *r.token_end = '\0';
    return word.empty() ? nullptr : word.start;
}

std::span<const char> raw_rest(const request& r) {
    const char* const packet_end = r.packet.data() + r.packet.size();
    if (r.token_end >= packet_end) return {};
    return {r.token_end + 1, packet_end};
}

const char* text_rest(const request& r) { return r.rest; }

answer answer_with(request& r, std::string_view text) {
    return {text.copy(r.packet.data(), text.size()), unique_fd()};
}

answer answer_with(request& r, unique_fd descriptor) {
    if (r.sender.fd < 0) return no_answer();
    if (!descriptor.ok()) return answer_with(r, "FAIL");
    return {0, std::move(descriptor)};
}

bool take_probe_id(request& r, probe_id& probe) {
    probe.package = next_token(r);
    probe.name = next_token(r);
    if (probe.package == nullptr || probe.name == nullptr) {
        return log_and_raise(tag, "[%s] Null in probe id - dropping. [%s:%s]", r.command,
                             or_null(probe.package), or_null(probe.name));
    }
    const size_t size = strlen(probe.package) + strlen(probe.name);
    if (size > max_probe_id_size) {
        return log_and_raise(tag, "[%s] To large probe id, %zu > %d - dropping. [%s:%s]", r.command,
                             size, static_cast<int>(max_probe_id_size), probe.package, probe.name);
    }
    return true;
}

bool check_probe_value(const request& r, const probe_id& probe, const char* value) {
    if (value != nullptr && *value != '\0') return true;
    return log_and_raise(tag, "[%s] Null in probe value - dropping. [%s:%s]", r.command,
                         probe.package, probe.name);
}

}  // namespace kivd
