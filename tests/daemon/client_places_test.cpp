#include "daemon/net/client_places.h"

#include <gtest/gtest.h>
#include <sys/resource.h>

namespace kivd {
namespace {

unsigned fill(uid_t uid) {
    unsigned taken = 0;
    for (; has_place(uid); ++taken) EXPECT_TRUE(take_place(uid));
    return taken;
}

TEST(client_places, are_shared_by_users_and_some_are_kept) {
    rlimit limit = {};
    EXPECT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
    limit.rlim_cur = 132;  // 32 are the daemon's own
    EXPECT_EQ(setrlimit(RLIMIT_NOFILE, &limit), 0);
    for (const uid_t uid : {1, 2, 3}) EXPECT_EQ(fill(uid), 25U);
    EXPECT_EQ(fill(4), 100U - 12 - 3 * 25);
    EXPECT_TRUE(has_any_place());
    EXPECT_EQ(fill(0), 12U);
    EXPECT_FALSE(has_any_place());
    leave_place(2);
    EXPECT_EQ(fill(1), 0U);
    EXPECT_EQ(fill(2), 1U);
    for (int i = 0; i < 6; ++i) {
        EXPECT_TRUE(has_waiting_place());
        take_waiting_place();
    }
    EXPECT_FALSE(has_waiting_place());
    leave_place(0);
    leave_waiting_place();
    EXPECT_TRUE(has_waiting_place());
    EXPECT_FALSE(has_any_place());  // those that wait have descriptors, too
}

}  // namespace
}  // namespace kivd
