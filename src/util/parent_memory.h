// Memory that forked children don't get: the parent writes to it all the time, and after a fork
// each page that it writes would have to be copied. A child that touches it dies of SIGSEGV.
#pragma once

#include <sys/mman.h>

#include <memory>
#include <type_traits>

namespace kivd {

struct memory_unmapper {
    template <typename type>
    void operator()(type* mapped) const {
        (void)munmap(mapped, sizeof(type));
    }
};

template <typename type>
using parent_memory = std::unique_ptr<type, memory_unmapper>;

// A value of zero bytes in a mapping of its own; null, with errno set, when that is not possible.
template <typename type>
[[nodiscard]] parent_memory<type> map_parent_memory() {
    static_assert(std::is_trivially_destructible_v<type>);
    void* const mapping =
        mmap(nullptr, sizeof(type), PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (mapping == MAP_FAILED) return nullptr;
    (void)madvise(mapping, sizeof(type), MADV_DONTFORK);
    return parent_memory<type>(static_cast<type*>(mapping));
}

}  // namespace kivd
