#include "daemon/request/handle_request.h"

#include "daemon/debug/debug_interface.h"
#include "daemon/request/caller.h"
#include "daemon/request/commands.h"
#include "daemon/request/request.h"
#include "format/request_table.h"
#include "platform/android_log.h"
#include "report/state_file.h"
#include "runtime/client_lines.h"
#include "runtime/log_and_raise.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

// In the order of the table.
constexpr answer (*handlers[])(request&) = {
#define KIV_REQUEST(name, handler, ...) handler,
#include "format/requests.def"
#undef KIV_REQUEST
};

}  // namespace

answer handle_request(const request_sender& sender, std::span<char> packet) {
    debug_mirror_request(packet);
    request r = make_request(sender, packet);
    if (r.command == nullptr) {
        log_and_raise(tag, "Invalid command: none - dropping.");
        return no_answer();
    }
    const request_row* const row = find_request(r.command);
    if (row == nullptr) {
        log_and_raise(tag, "Bad command: %d/%d - dropping",
                      static_cast<unsigned char>(packet.data()[0]),
                      static_cast<unsigned char>(packet.data()[1]));
        return no_answer();
    }
    if (row->access == request_access::permitted && !check_caller_permission(r)) {
        if (take_line()) __android_log_print(ANDROID_LOG_WARN, tag, "%s", row->refusal);
        return answer_with(r, row->refusal_reply);
    }
    if (row->collection == request_collection::while_collecting && !is_data_collection_enabled()) {
        return no_answer();
    }
    const line_cause_scope cause(row->access == request_access::permitted ? line_cause::daemon
                                                                          : line_cause::client);
    return handlers[row - request_table](r);
}

}  // namespace kivd
