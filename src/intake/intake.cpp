#include "intake/intake.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>
#include <optional>
#include <utility>

#include "config.pb-c.h"
#include "config/config_parts.h"
#include "config/filters.h"
#include "config/settings.h"
#include "format/config_file.h"
#include "format/probe_key.h"
#include "intake/config_file.h"
#include "intake/config_request.h"
#include "intake/run_actions.h"
#include "platform/android_log.h"
#include "report/identity.h"
#include "report/state_file.h"
#include "runtime/log_and_raise.h"
#include "security/crypto_module.h"
#include "security/key_paths.h"
#include "security/signature.h"
#include "util/directory.h"
#include "util/file_io.h"
#include "util/file_replacement.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-conf";

void clean_input_dir() {
    (void)for_each_entry(paths::input_dir, [](std::string_view name) {
        char path[sizeof paths::input_dir + NAME_MAX];
        snprintf(path, sizeof path, "%s%s", paths::input_dir, name.data());
        if (unlink(path) == 0) return;
        __android_log_print(ANDROID_LOG_WARN, tag, "Failed to delete %s.", path);
    });
}

bool refuse(const char* reason) { return log_and_raise(tag, "%s", reason); }

bool checksum_of(std::span<const uint8_t> file, config_checksum& checksum) {
    const crypto_functions* const crypto = get_crypto();
    return crypto != nullptr && crypto->sha1(file, checksum);
}

bool is_filter_part(const Kiv__Config__ConfigPart& part) {
    return compare_probes({part.package, part.name}, {own_package, filter_part_name}) == 0;
}

// Whether all of it can be read back at the next start.
bool can_hold(new_parts parts) {
    return can_hold_parts(parts) &&
           std::ranges::all_of(parts, [](const Kiv__Config__ConfigPart* part) {
               return !is_filter_part(*part) ||
                      can_hold_filters({part->payload.data, part->payload.len});
           });
}

bool store_package(std::span<const uint8_t> bytes) {
    const ProtobufCMessageDescriptor& type = kiv__config__config_package__descriptor;
    if (measure_message(type, bytes) == message_size::too_large) {
        return refuse("Too many fields in the configuration");
    }
    const auto package = unpack_message<Kiv__Config__ConfigPackage>(type, bytes);
    if (!package) return false;
    const new_parts parts(package->parts, package->n_parts);
    if (!can_hold(parts)) return false;
    // From here on the next start goes on with it.
    (void)rename(paths::tried_config_file, paths::config_file);
    retire_config_parts(parts);
    for (const Kiv__Config__ConfigPart* part : parts) {
        store_config_part(part->package, part->name, {part->payload.data, part->payload.len});
    }
    return save_config_list();
}

void put_in_force(const config_checksum& checksum) {
    delete_retired_parts();
    set_config_checksum(checksum);
    write_config_request();
    apply_settings();
    update_header_info();
    apply_filter_config();
    run_actions();
    run_actions_once();
}

bool take_config_file(std::span<const uint8_t> file) {
    config_checksum checksum;
    if (!checksum_of(file, checksum) || !store_configuration(file)) return false;
    put_in_force(checksum);
    return true;
}

bool take_input() {
    // Doesn't wait for a writer: a pipe in its place counts as an empty file.
    unique_fd fd(open(paths::config_file, O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    struct stat status = {};
    if (!fd.ok() || fstat(fd.get(), &status) != 0 || S_ISDIR(status.st_mode)) return false;
    if (std::cmp_greater(status.st_size, max_config_file_size)) {
        return refuse("Failed to unpack configuration");
    }
    const std::optional<file_bytes> file = read_whole_fd(std::move(fd));
    // Should it end the daemon while it is decoded, the next start does without.
    (void)rename(paths::config_file, paths::tried_config_file);
    return file && take_config_file(file->view());
}

}  // namespace

void replace_config_file(std::span<const char> bytes) {
    file_replacement file(paths::config_file, paths::new_config_file);
    const bool created = file.ok();
    if (created && (!write_all(file.fd(), bytes.data(), bytes.size()) || !file.close())) {
        log_and_raise(tag, "Failed to write configuration file: %s", strerror(errno));
    } else if (!created || !file.put_into_place()) {
        log_and_raise(tag, "Failed to create configuration file: %s", strerror(errno));
    }
}

void install_first_configuration() {
    if (access(paths::config_file, F_OK) == 0) return;
    const unique_fd source(open(paths::first_config_file, O_RDONLY | O_CLOEXEC));
    if (!source.ok()) {
        __android_log_print(ANDROID_LOG_ERROR, tag, "Failed to open %s. %s",
                            paths::first_config_file, strerror(errno));
        return;
    }
    file_replacement copy(paths::config_file, paths::new_config_file);
    if (copy.ok() && copy_all(source.get(), copy.fd()) && copy.close() && copy.put_into_place()) {
        return;
    }
    __android_log_print(ANDROID_LOG_ERROR, tag, "Failed to open input configuration: %s",
                        strerror(errno));
}

bool store_configuration(std::span<const uint8_t> file) {
    if (!extract_config_fields(file)) return refuse("Failed to unpack configuration");
    if (is_verification_on() && !verify_file(paths::new_config_data, paths::new_config_signature)) {
        return refuse("Failed to verify configuration");
    }
    const std::optional<file_bytes> package = read_config_package();
    if (!package) return refuse("Failed to read configuration");
    if (!store_package(package->view())) return refuse("Failed to parse configuration");
    return true;
}

bool take_new_configuration() {
    const bool taken = take_input();
    (void)unlink(paths::new_config_data);
    (void)unlink(paths::new_config_signature);
    clean_input_dir();  // input/config with all else
    return taken;
}

}  // namespace kivd
