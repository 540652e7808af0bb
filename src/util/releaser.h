// Owners that call a function of somebody else's to release what they own.
#pragma once

#include <cstdlib>
#include <memory>

namespace kivd {

// The deleter that calls `release`, for std::unique_ptr.
template <auto release>
struct releaser {
    void operator()(auto* object) const noexcept { release(object); }
};

// Owns a block of malloc.
template <class type>
using unique_malloc = std::unique_ptr<type, releaser<free>>;

}  // namespace kivd
