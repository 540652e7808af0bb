#include "daemon/request/handle_request.h"

#include <algorithm>
#include <string_view>

#include "daemon/debug/debug_interface.h"
#include "daemon/request/caller.h"
#include "daemon/request/control_commands.h"
#include "daemon/request/data_commands.h"
#include "daemon/request/request.h"
#include "platform/android_log.h"
#include "report/state_file.h"
#include "runtime/log_and_raise.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

struct command {
    std::string_view name;
    answer (*run)(request&);
    bool only_while_collecting;      // ignored in silence while data collection is off
    const char* refusal;             // logged when permission is lacking; null: open to all
    std::string_view refusal_reply;  // what a refused caller gets
};
// clang-format off
constexpr command commands[] = {
    {"EV", add_event,              true,  nullptr, ""},
    {"CS", set_counter,            true,  nullptr, ""},
    {"CI", increment_counter,      true,  nullptr, ""},
    {"SD", set_static_data,        true,  nullptr, ""},
    {"IA", is_alive,               false, nullptr, ""},
    {"PA", is_probe_active,        false, nullptr, ""},
    {"GC", get_config_part,        false, nullptr, ""},
    {"FL", flush,                  true,  "flush (FL) request denied due to permission!", ""},
    {"FS", force_save,             false, "forceSave (FS) request denied due to permission!", ""},
    {"NC", announce_configuration, false, "notifyNewConfiguration (NC) request denied due to permission!", "0"},
    {"WC", write_configuration,    false, "writeConfiguration (WC) request denied due to permission!", ""},
    {"GD", read_device_id,         false, "getDeviceId (GD) request denied due to permission!", ""},
    {"DC", switch_data_collection, false, "setDataCollectionEnable (DC) request denied due to permission!", ""},
    {"RM", remove_report,          false, "removeReport (RM) request denied due to permission!", ""},
    {"FN", next_file,              false, "fileIteratorNext (FN) request denied due to permission!", "-1"},
    {"FG", get_file,               false, "fileGet (FG) request denied due to permission!", "FAIL"},
    {"SN", accept_serial_number,   false, "setSerialNumber (SN) request denied due to permission!", ""},
    {"IM", accept_imei,            false, "setImei (IM) request denied due to permission!", ""},
    {"SG", add_group,              false, nullptr, ""},
    {"DG", delete_group,           false, nullptr, ""},
    {"RG", replace_group,          false, nullptr, ""},
};
// clang-format on

}  // namespace

answer handle_request(int fd, std::span<char> packet, const msghdr* message) {
    debug_mirror_request(packet);
    request r = make_request(fd, packet, message);
    const char* const name = next_token(r);
    if (name == nullptr) {
        log_and_raise(tag, "Invalid command: none - dropping.");
        return no_answer();
    }
    const auto* const found = std::ranges::find(commands, std::string_view(name), &command::name);
    if (found == std::end(commands)) {
        log_and_raise(tag, "Bad command: %d/%d - dropping",
                      static_cast<unsigned char>(packet.data()[0]),
                      static_cast<unsigned char>(packet.data()[1]));
        return no_answer();
    }
    if (found->refusal != nullptr && !check_caller_permission(r)) {
        __android_log_print(ANDROID_LOG_WARN, tag, "%s", found->refusal);
        return answer_with(r, found->refusal_reply);
    }
    if (found->only_while_collecting && !is_data_collection_enabled()) return no_answer();
    return found->run(r);
}

}  // namespace kivd
