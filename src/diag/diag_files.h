// The files of the diagnostics store, private/qz/: number N is qz_N while it is written and qy_N
// once it has been compressed.
#pragma once

#include <cstdint>

#include "util/unique_fd.h"

namespace kivd {

// The numbers that are there, whatever the files hold. Without files the lowest is above the
// highest.
struct diag_numbers {
    int32_t highest;
    int32_t lowest;
};

struct diag_path {
    // `letter` is 'z' or 'y'.
    diag_path(char letter, int32_t number);
    char text[32];
};

// False, with errno set and `numbers` unchanged, when the directory cannot be read; without a file
// the numbers are 1 and 2147483647. Foreign entries have been logged.
[[nodiscard]] bool scan_diag_files(diag_numbers& numbers);

// Deletes one file, those numbered `from` to `to`, or every entry of the directory. What could not
// be deleted has been logged and raised; a file that is gone already is fine.
void delete_diag_file(const diag_path& path);
void delete_diag_files(int32_t from, int32_t to);
void delete_all_diag_entries();

// Opens the file of that number, compressed or not, to read; not ok when there is none.
[[nodiscard]] unique_fd open_diag_file(int32_t number);

// The number of the file that follows `number`, which is at least the lowest there is; -1 when
// there is none. Every number between the lowest and the highest counts, whether or not its file
// exists.
[[nodiscard]] int32_t next_diag_file(int32_t number);

// Forgets what next_diag_file last found.
void diag_files_release();

}  // namespace kivd
