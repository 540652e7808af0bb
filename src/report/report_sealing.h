// Sealing a report: its gzip file becomes the ciphertext in a report of its own, which says with
// which key it opens and shows nothing of the device. Format: docs/report-format.md.
#pragma once

namespace kivd {

// Replaces the compacted data by its sealed form. After a failure, logged and raised, the data is
// as it was: a report is sealed whole or not at all.
[[nodiscard]] bool seal_compacted_data();

}  // namespace kivd
