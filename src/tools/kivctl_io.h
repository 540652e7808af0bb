// The files that kivctl reads, and its standard output. What fails is thrown as one sentence.
#pragma once

#include <cstddef>
#include <stdexcept>
#include <string>

namespace kivd {

// A command that couldn't be carried out, in one sentence.
struct failure : std::runtime_error {
    using std::runtime_error::runtime_error;
};

// What to call the file of that path in messages: "-" is standard input.
std::string name_source(const std::string& path);

// The content of the file, at most `size_max` bytes; `kind` says what it is to be.
std::string read_source(const std::string& path, size_t size_max, const char* kind);

// To standard output: a line, or all that can be read from `fd`.
void print_line(const char* text);
void print_content(int fd);

}  // namespace kivd
