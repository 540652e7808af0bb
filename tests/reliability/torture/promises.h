// What the daemon promises whatever happens to it, held against what is on disk. A breach is a
// failure of GoogleTest, outside of any test.
#pragma once

#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "support/daemon_process.h"

namespace kivd {

inline constexpr int ids_of_a_sender = 1000000;  // among which events keep their order

// What was sent to a daemon, and what of it has to be there.
struct journal {
    int last_id = 0;
    int64_t last_value = 0;  // of the counter and the static value
    int64_t saved_value = 0;
    std::set<int> sent;               // may be there, once
    std::set<int> kept;               // acknowledged
    std::set<int> logged;             // acknowledged, in the diagnostics
    std::set<int> seen;               // there before a flush that replaces, or deletes to make room
    size_t plain_reports = SIZE_MAX;  // the first ones, before there was a report key
    bool configured = false;
    std::string device_id;

    bool kills_only = true;    // no call has failed
    bool may_tear = false;     // a full disk may have cut records short
    bool may_prune = false;    // and reports may have been deleted on it
    bool acknowledges = true;  // not behind a torn record
};

// In the current directory, with the keys beside it; `before` goes in front of its command.
daemon_process launch(std::vector<std::string> before = {});
// How many errors it has logged, but for the one that is of the machine.
size_t errors(const daemon_process& daemon);
void wait_children(const daemon_process& daemon);
// Until the last process that a killed daemon left behind has ended.
void wait_orphans();
// Reports are sealed from now on.
void install_report_key(journal& noted);

// Events and values, then a request if there is one, then IA.
struct exchange {
    std::vector<size_t> events;  // sizes of payloads
    std::vector<size_t> logged;  // of those for the diagnostics, too
    bool values;                 // change
    const char* request;         // FS, FL, NC with the configuration beside the keys, or none
};
// Notes what was acknowledged. False when there was no answer.
bool carry_out(const exchange& wanted, const daemon_process& daemon, journal& noted);

// With no process at work; gives the events that are there or were seen.
std::set<int> check_files(const journal& noted);
// Ahead of what may flush: what a failed report has left may be replaced then.
void note_seen(journal& noted);
// That what an ended daemon has left is taken up again.
daemon_process start_again(journal& noted);
// That all it is asked for succeeds, and that it stops without anything temporary left.
void check_service_and_stop(daemon_process& daemon, journal& noted);

// Both.
void check_restart(journal& noted);

}  // namespace kivd
