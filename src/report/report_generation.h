// Making a report. The flush is short and runs in the caller: it moves the event file away, appends
// the counters and static data that changed, and moves last-flush forward. The compactor, a child
// process, compresses the result, seals it when a report key is installed, and leaves it in output/
// as the next numbered report.
#pragma once

namespace kivd {

// 0 when a compactor was started or its fork failed; -1 when there was nothing to report or the
// flush failed, which has been logged and raised. Waits for an earlier compactor first.
int generate_report();

// Whether anything has been collected since the last flush.
[[nodiscard]] bool has_data_to_report();

// The body of the compactor: turns the flushed data into a report. 0, or -1 with the failure logged
// and raised and the files left as they are.
[[nodiscard]] int compact_report();

// Waits until no compactor runs.
void wait_for_compactor();

// Switches compression off (gzip framing around stored data) or on again.
void set_output_compression(bool enabled);

}  // namespace kivd
