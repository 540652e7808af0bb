// The state file: what is read from it, whatever it holds, survives being saved and read again.
#include "report/state_file.h"

#include "daemon/modules.h"
#include "fuzz/harness.h"
#include "util/paths.h"

namespace kivd {
namespace {

// The file as the next stop would leave it, but for the line that tells the time.
std::string load_and_save() {
    release_modules();
    state_load();
    state_save();
    std::string saved = read_file(paths::state);
    const size_t start = saved.find("shutdown-time:");
    require(start != std::string::npos, "nothing was saved");
    return saved.erase(start, saved.find('\n', start) + 1 - start);
}

}  // namespace
}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    kivd::clear_files();
    kivd::write_file(kivd::paths::state, {data, size});
    const std::string saved = kivd::load_and_save();
    kivd::require(kivd::load_and_save() == saved, "a restart changes what is remembered");
    return 0;
}
