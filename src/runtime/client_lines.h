// The lines of the log that clients cause, such as refusals. Anybody may cause any number of them,
// so there are at most 200 a second, and then one that tells how many more there were.
//
// Safe to use from any thread.
#pragma once

namespace kivd {

enum class line_cause : bool {
    daemon,  // and those who may control it; also at the beginning
    client,
};

// While it lives, what this thread logs has that cause.
class line_cause_scope {
 public:
    explicit line_cause_scope(line_cause cause);
    ~line_cause_scope();
    line_cause_scope(const line_cause_scope&) = delete;
    line_cause_scope& operator=(const line_cause_scope&) = delete;

 private:
    line_cause before_;
};

// Whether one more line may be logged: always, unless it is a client's and this second has enough
// of these.
[[nodiscard]] bool take_line();

// Whether lines were left out that have not been told.
[[nodiscard]] bool are_lines_left_out();

// Tells how many, if the second is over in which they were.
void tell_lines_left_out();

// In a forked child: what it does, no client has caused.
void line_cause_forget();

}  // namespace kivd
