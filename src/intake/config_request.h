// output/config_request: tells collectors who the device is and which configuration it runs, so
// that they can decide whether to send it another. Format: docs/report-format.md.
#pragma once

namespace kivd {

// Writes it anew with the report header and the configuration checksum in force. Failures have been
// logged and raised.
void write_config_request();

}  // namespace kivd
