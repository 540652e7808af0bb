#include "util/user_counts.h"

#include <unistd.h>

#include <algorithm>
#include <cstdlib>

namespace kivd {

bool is_privileged(uid_t uid) { return uid == 0 || uid == getuid(); }

user_counts::count* user_counts::find(uid_t uid) const {
    const auto found = std::ranges::find_if(
        all(), [uid](const count& each) { return each.things > 0 && each.uid == uid; });
    return found != all().end() ? &*found : nullptr;
}

uint32_t user_counts::of(uid_t uid) const {
    const count* const found = find(uid);
    return found != nullptr ? found->things : 0;
}

bool user_counts::add(uid_t uid) {
    if (count* const found = find(uid)) {
        ++found->things;
        return true;
    }
    const auto free_place = std::ranges::find(all(), 0U, &count::things);
    if (free_place != all().end()) {
        *free_place = {uid, 1};
        return true;
    }
    void* const grown = realloc(counts_.get(), (size_ + 1) * sizeof(count));
    if (grown == nullptr) return false;
    (void)counts_.release();
    counts_.reset(static_cast<count*>(grown));
    counts_.get()[size_++] = {uid, 1};
    return true;
}

void user_counts::remove(uid_t uid) {
    if (count* const found = find(uid)) --found->things;
}

void user_counts::clear() {
    counts_.reset();
    size_ = 0;
}

}  // namespace kivd
