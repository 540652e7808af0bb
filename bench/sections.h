// The measurements, one function a section of the table. Each starts what it measures, prints its
// lines and leaves nothing behind.
#pragma once

#include "bench/daemon_runner.h"

namespace kivd::bench {

void measure_events(const setup& s);
void measure_large_events(const setup& s);
void measure_counters(const setup& s);
void measure_flush(const setup& s);
void measure_save(const setup& s);
void measure_compaction(const setup& s);
void measure_filters(const setup& s);
void measure_intake(const setup& s);
void measure_sealing(const setup& s);
void measure_growth(const setup& s);
void measure_latency(const setup& s);
void measure_client(const setup& s);
void measure_footprint(const setup& s);

}  // namespace kivd::bench
