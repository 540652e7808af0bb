// In place of the one door to fork: a system that has no room for another process. To copy a
// process with sanitizers takes longer than most inputs do, and no input may start a program.
#include <cerrno>

#include "fuzz/harness.h"
#include "runtime/child_process.h"

namespace kivd {

void set_inherited_descriptor(int /*fd*/) {}

pid_t fork_child(child_kind /*kind*/) {
    errno = EAGAIN;
    return -1;
}

void exec_program(const char* const* /*arguments*/) { require(false, "a program is started"); }

void wait_for_child(pid_t& pid) { require(pid < 0, "a child is waited for that never was"); }

}  // namespace kivd
