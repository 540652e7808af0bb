// The files that kivctl reads and writes, and its standard output. Failures are thrown as one
// sentence.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>

namespace kivd {

enum exit_status : int {
    status_done = 0,
    status_refused = 1,  // or the data is bad
    status_usage = 2,
    status_unreachable = 3,  // or not in time
};

// A command that couldn't be carried out, in one sentence.
struct failure : std::runtime_error {
    explicit failure(const std::string& text, exit_status new_status = status_refused)
        : std::runtime_error(text), status(new_status) {}

    exit_status status;
};

// The name of the file in messages: "-" is standard input.
std::string name_source(const std::string& path);

// The content of the file, at most `size_max` bytes; `kind` says what it should be.
std::string read_source(const std::string& path, size_t size_max, const char* kind);

// The content of a file, also of one in /proc; nothing when it cannot be read or is larger. Never
// waits for a writer.
[[nodiscard]] std::optional<std::string> read_if_possible(const std::string& path, size_t size_max);

// When a command has to be finished.
class deadline {
 public:
    explicit deadline(unsigned milliseconds);
    [[nodiscard]] unsigned left_ms() const;  // 0 when it has passed

 private:
    int64_t end_ms_;
};

// To standard output: a line, or all that can be read from `fd`.
void print_line(const char* text);
void print_content(int fd);

// Writes all that can be read from `fd` to the file of that path, which is created or replaced.
void save_content(int fd, const std::string& path);

// Throws that standard output cannot be written to, with the reason in errno.
[[noreturn]] void fail_output();

}  // namespace kivd
