// The operators new and delete of the daemon, which only asks for memory that it can do without.
// The library's own bring all of its exceptions into the program.
#include <cstddef>
#include <cstdlib>
#include <new>

// NOLINTBEGIN(cppcoreguidelines-no-malloc)
void* operator new(size_t size, const std::nothrow_t& /*tag*/) noexcept { return malloc(size); }

void* operator new(size_t size, std::align_val_t alignment,
                   const std::nothrow_t& /*tag*/) noexcept {
    return aligned_alloc(static_cast<size_t>(alignment), size);
}

void operator delete(void* memory) noexcept { free(memory); }
void operator delete(void* memory, size_t /*size*/) noexcept { free(memory); }
void operator delete(void* memory, std::align_val_t /*alignment*/) noexcept { free(memory); }
void operator delete(void* memory, size_t /*size*/, std::align_val_t /*alignment*/) noexcept {
    free(memory);
}
// NOLINTEND(cppcoreguidelines-no-malloc)
