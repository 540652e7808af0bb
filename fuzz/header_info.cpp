// The identity that is given by hand, in private/header_info.conf.
#include "format/protobuf_message.h"
#include "fuzz/harness.h"
#include "record/header_record.h"
#include "report.pb-c.h"
#include "report/identity.h"
#include "report/state_file.h"
#include "util/paths.h"

namespace kivd {
namespace {

// The report header with that file in force.
std::string updated_header() {
    update_header_info();
    const auto header = get_report_header();
    const auto report = unpack_message<Kiv__Report>(kiv__report__descriptor, header);
    require(report && report->header != nullptr, "the report header cannot be decoded");
    return {header.begin(), header.end()};
}

}  // namespace
}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using namespace kivd;
    clear_files();
    write_file(paths::header_info, {data, size});
    std::string header;
    {
        const started_modules modules;
        header = updated_header();
        require(updated_header() == header, "a second look at the same file changes the header");
        state_save();
    }
    const started_modules modules;
    require(updated_header() == header, "a restart changes the header");
    return 0;
}
