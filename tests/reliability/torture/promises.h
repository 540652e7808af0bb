// What the daemon promises whatever happens to it, held against what is on disk. A breach is a
// failure of GoogleTest, outside of any test.
#pragma once

#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "bench/daemon_process.h"
#include "bench/traffic.h"

namespace kivd {

inline constexpr size_t first_client = 1000;  // of a torture's own; others have lower numbers
// The diagnostics keep events of such packages.
inline constexpr char diag_package_end[] = "devicemonitor.powerstat";
inline constexpr char event_name[] = "ShutDown";

// What was sent to a daemon, and what of it has to be there.
struct journal {
    uint64_t last_number = 0;
    int64_t last_value = 0;  // of the counter and the static value
    int64_t saved_value = 0;
    std::set<event_id> sent;          // may be there, once
    std::set<event_id> kept;          // acknowledged
    std::set<event_id> logged;        // acknowledged, in the diagnostics
    std::set<event_id> seen;          // there before a flush that replaces, or deletes to make room
    size_t plain_reports = SIZE_MAX;  // the first ones, before there was a report key
    bool configured = false;
    std::string device_id;

    bool kills_only = true;    // no call has failed
    bool may_prune = false;    // the first reports may have been deleted to make room
    bool acknowledges = true;  // diagnostics are kept
};

// In the current directory, with the keys beside it; `before` goes in front of its command.
daemon_process launch(std::vector<std::string> before = {});
void wait_children(const daemon_process& daemon);
// Until the last process that a killed daemon left behind has ended.
void wait_orphans();
// Does what is said in words, then asks IA: "e20" and "l20" send an event with a payload of 20
// bytes, "l" one that the diagnostics keep, too; "values" changes the counter and the static value;
// the last may be "NC", with the configuration beside the keys, "FL" or "FS".
// Notes what was acknowledged. False when there was no answer.
bool carry_out(const std::string& words, const daemon_process& daemon, journal& noted);

// Reports are sealed from now on.
void install_report_key(journal& noted);

// With no process at work; gives the events that are there or were seen.
std::set<event_id> check_files(const journal& noted);
// Ahead of what may flush: what a failed report has left may be replaced then.
void note_seen(journal& noted);
// That what an ended daemon has left is taken up again.
daemon_process start_again(journal& noted);
// That all it is asked for succeeds, and that it stops without anything temporary left.
void check_service_and_stop(daemon_process& daemon, journal& noted);

}  // namespace kivd
