#include "diag/file_export.h"

#include "diag/diag_files.h"
#include "runtime/log_and_raise.h"
#include "util/numbers.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-fu";
constexpr int32_t diag_file_set = 750;

}  // namespace

int32_t next_exported_file(const char* set, const char* number) {
    if (set == nullptr || number == nullptr) {
        log_and_raise(tag, "File iterator next, null parameters found.");
        return -1;
    }
    return parse_saturated(set) == diag_file_set ? next_diag_file(parse_saturated(number)) : -1;
}

unique_fd open_exported_file(const char* set, const char* number) {
    if (set == nullptr || number == nullptr) {
        log_and_raise(tag, "File get, null parameters found.");
        return unique_fd();
    }
    if (parse_saturated(set) != diag_file_set) return unique_fd();
    return open_diag_file(parse_saturated(number));
}

}  // namespace kivd
