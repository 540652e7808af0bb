// Memory that forked children don't get: the parent writes to it all the time, and after a fork
// each page that it writes would have to be copied. A child that touches it dies of SIGSEGV.
#pragma once

#include <sys/mman.h>

#include <memory>
#include <type_traits>

namespace kivd {

struct memory_unmapper {
    template <typename T>
    void operator()(T* mapped) const {
        (void)munmap(mapped, sizeof(T));
    }
};

template <typename T>
using parent_memory = std::unique_ptr<T, memory_unmapper>;

// A T of zero bytes in a mapping of its own; null, with errno set, when that is not possible.
template <typename T>
[[nodiscard]] parent_memory<T> map_parent_memory() {
    static_assert(std::is_trivially_destructible_v<T>);
    void* const mapping =
        mmap(nullptr, sizeof(T), PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (mapping == MAP_FAILED) return nullptr;
    (void)madvise(mapping, sizeof(T), MADV_DONTFORK);
    return parent_memory<T>(static_cast<T*>(mapping));
}

}  // namespace kivd
