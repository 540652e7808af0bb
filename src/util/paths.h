// The names of all files of the working directory, and of those outside it that the daemon reads.
#pragma once

namespace kivd::paths {

inline constexpr char working_dir[] = "./";  // from the start on; all names here are relative to it

inline constexpr char lock_file[] = "kivd.pid";

inline constexpr char datagram_socket[] = "kiv_cl";
inline constexpr char sequenced_packet_socket[] = "kiv_co";
inline constexpr char stream_socket[] = "kiv_co_stream";

inline constexpr char private_dir[] = "private/";
inline constexpr char output_dir[] = "output/";
inline constexpr char input_dir[] = "input/";

inline constexpr char events[] = "private/events";
inline constexpr char counters[] = "private/counters.txt";
inline constexpr char static_data[] = "private/sdata.txt";
inline constexpr char state[] = "private/kivd.state";
inline constexpr char state_new[] = "private/kivd.state_tmp";
inline constexpr char header_info[] = "private/header_info.conf";

inline constexpr char flushed_data[] = "private/flushed_data";
inline constexpr char compacted_data[] = "private/flushed_data.compacted";
inline constexpr char encrypted_data[] = "private/flushed_data.encrypted";

inline constexpr char config_request_name[] = "config_request";  // in output_dir
inline constexpr char config_request[] = "output/config_request";
inline constexpr char new_config_request[] = "output/new_config_request";  // while it is written
inline constexpr char new_report[] = "output/new_report";  // while it is copied there
inline constexpr char disable_marker[] = "output/kiv_disabled";

inline constexpr char config_file[] = "input/config";
inline constexpr char new_config_file[] = "input/new_config";      // while it is written
inline constexpr char tried_config_file[] = "input/tried_config";  // while it is decoded
inline constexpr char first_config_file[] = "/system/etc/kivd.conf";
inline constexpr char new_config_signature[] = "private/new_config.sig";
inline constexpr char new_config_data[] = "private/new_config.gz";
inline constexpr char config_list[] = "private/config_list.txt";
inline constexpr char config_part_format[] = "private/conf_%d.bin";  // with the part's id

inline constexpr char counter_filter[] = "private/filters_cnt.txt";
inline constexpr char static_data_filter[] = "private/filters_sd.txt";
inline constexpr char event_filter[] = "private/filters.txt";

inline constexpr char default_key_dir[] = "/system/etc/security/";
inline constexpr char report_key_name[] = "kiv_report.pem";  // in the directory of the keys
inline constexpr char config_key_name[] = "kiv_config.pem";

inline constexpr char log_reader[] = "/system/bin/kiv-logreader";

inline constexpr char diag_dir[] = "private/qz/";
inline constexpr char diag_compressed[] = "private/qz_compressed";  // while it is being made

inline constexpr char random_uuid[] = "/proc/sys/kernel/random/uuid";

}  // namespace kivd::paths
