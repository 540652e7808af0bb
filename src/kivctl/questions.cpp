#include "kivctl/questions.h"

#include <cerrno>
#include <utility>

#include "util/file_io.h"
#include "util/unique_fd.h"

namespace kivd {
daemon_questions::daemon_questions(unsigned timeout_ms)
    : end_(timeout_ms), daemon_(kiv_create_from_path("./")) {
    if (!daemon_) last_ = -errno;
}

int daemon_questions::is_alive() {
    if (kiv_handle* daemon = next()) last_ = kiv_is_alive(daemon);
    return last_;
}

std::optional<bool> daemon_questions::is_wanted(const char* package, const char* name) {
    kiv_handle* daemon = next();
    const int result = daemon != nullptr ? kiv_is_probe_active(daemon, package, name) : -1;
    return result < 0 ? std::nullopt : std::optional(result == 1);
}

config_part_answer daemon_questions::own_part(const char* name) {
    kiv_handle* daemon = next();
    if (daemon == nullptr) return {};
    unique_fd part(kiv_get_config(daemon, "kivd", name));
    if (part.get() == -ENOENT) return {true, std::nullopt};
    const auto file = part.ok() ? read_whole_fd(std::move(part)) : std::nullopt;
    if (!file) return {};
    const auto bytes = file->view();
    return {true, std::string(bytes.begin(), bytes.end())};
}

kiv_handle* daemon_questions::next() {
    if (last_ < 0) return nullptr;
    kiv_set_timeout(daemon_.get(), end_.left_ms());
    return daemon_.get();
}

}  // namespace kivd
