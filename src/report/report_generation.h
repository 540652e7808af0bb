// Making a report. The flush is short and runs in the caller: it moves the event file away, appends
// the counters and static data that changed, and moves last-flush forward. The compactor, a child
// process, compresses the result, seals it when a report key is installed, and leaves it in output/
// as the next numbered report.
#pragma once

namespace kivd {

// Waits for an earlier compactor, flushes and starts one. False when there was nothing to report or
// the flush failed, which has been logged and raised. So has a failed fork, after which the next
// flush replaces the flushed data.
bool generate_report();

// Whether anything has been collected since the last flush.
[[nodiscard]] bool has_data_to_report();

// The body of the compactor: turns the flushed data into a report. On failure, logged and raised,
// the files are left as they are.
[[nodiscard]] bool compact_report();

// Waits until no compactor runs.
void wait_for_compactor();

// Switches compression off (gzip framing around stored data) or on again.
void set_output_compression(bool enabled);

// Waits until no compactor runs, and switches compression on.
void report_generation_release();

}  // namespace kivd
