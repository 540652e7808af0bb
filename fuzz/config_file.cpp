// The intake of a whole configuration file.
#include <algorithm>

#include "config/config_parts.h"
#include "config/limits.h"
#include "fuzz/harness.h"
#include "intake/intake.h"
#include "report/state_file.h"
#include "util/paths.h"

namespace kivd {
namespace {

bool take(input_bytes file) {
    write_file(paths::config_file, file);
    const bool taken = take_new_configuration();
    for (const char* path :
         {paths::config_file, paths::new_config_data, paths::new_config_signature}) {
        require(!exists(path), "a file of the intake is left over");
    }
    return taken;
}

// Whether all of the list can be read again: names may be of any length, and parts of any number.
bool is_readable(std::string_view list) {
    constexpr int max_records = 20000;
    constexpr size_t max_record_size = 1024;
    constexpr std::string_view terminator("\0\0\n", 3);
    for (int records = 0; records < max_records; ++records) {
        if (list.empty()) return true;
        const size_t size = list.find(terminator) + terminator.size();
        if (size > max_record_size) return false;
        list.remove_prefix(size);
    }
    return list.empty();
}

}  // namespace
}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using namespace kivd;
    clear_files();
    const started_modules modules;
    if (!take({data, size})) {
        require(get_config_checksum() == config_checksum{} && !exists(paths::config_list),
                "a refused file has left its traces");
        return 0;
    }
    require(get_limits().max_report_size <= get_limits().max_output_dir_size,
            "a report may be larger than the directory that it goes to");

    const std::string list = read_file(paths::config_list);
    require(take({data, size}) && read_file(paths::config_list) == list,
            "the same file, taken again, gives other parts");
    if (!is_readable(list)) return 0;
    release_config_list();
    load_config_list();
    require(save_config_list() && read_file(paths::config_list) == list,
            "a restart changes the list of parts");
    return 0;
}
