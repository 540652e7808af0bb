// The daemon's own errors as it reports them: counted, and ended when they come in floods.
#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>

#include "daemon_error.pb.h"
#include "daemon_test.h"
#include "util/file_io.h"

namespace kivd {
namespace {

class daemon_errors : public daemon_test {
 protected:
    // One error a time, since the queue in which they travel is short.
    static void raise_errors(int count) {
        for (int i = 0; i < count; ++i) request({"XY"});
    }
    static bool floods(const kiv::Event& event) {
        kiv::DaemonError error;
        EXPECT_TRUE(error.ParseFromString(event.payload()));
        EXPECT_EQ(error.log(), "kivd: Bad command: 88/89 - dropping");
        return error.flooding();
    }
    static constexpr char notice[] =
        "E kivd-error: KIV daemon error event will not be created until ";
};

TEST_F(daemon_errors, end_with_the_hundredth_of_a_period_even_over_a_restart) {
    daemon_process daemon = start();
    raise_errors(99);
    EXPECT_TRUE(daemon.wait_idle());  // it has received the last one too
    EXPECT_EQ(daemon.stop(), 0);
    EXPECT_NE(read_file("private/kivd.state").find("error_nr: 99\n"), std::string::npos);

    daemon = start();
    raise_errors(1);
    EXPECT_EQ(daemon.count_in_log(notice), 0U);
    raise_errors(2);
    EXPECT_TRUE(daemon.wait_idle());
    EXPECT_EQ(daemon.count_in_log(notice), 1U);
    request({"FL"});
    const kiv::Report report = wait_report(1);
    ASSERT_EQ(report.events_size(), 100);
    for (int i = 0; i < 100; ++i) EXPECT_EQ(floods(report.events(i)), i == 99) << i;
    EXPECT_EQ(report.counters(0).name(), "Cnt_DaemonError");
    EXPECT_EQ(report.counters(0).value(), 100);
    EXPECT_EQ(daemon.stop(), 0);
    EXPECT_NE(read_file("private/kivd.state").find("error_nr: 102\n"), std::string::npos);
}

// An error that cannot be stored is one more error.
TEST_F(daemon_errors, of_a_full_disk_end_and_what_comes_after_them_is_kept) {
    if (unshare(CLONE_NEWNS) != 0 ||
        mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
        mount("tmpfs", directory.c_str(), "tmpfs", 0, "size=8m") != 0 ||
        chdir(directory.c_str()) != 0) {
        GTEST_SKIP() << "cannot have mounts of its own";
    }
    daemon_process daemon = start();
    request({"CI p counter 1", "SD p static 1", "EV p before x", "FS"});
    const std::string counters = read_file("private/counters.txt");
    const std::string values = read_file("private/sdata.txt");
    ASSERT_NE(counters, "");
    {
        const unique_fd filler(open("filler", O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
        const std::string page(4096, 'x');
        while (write_all(filler.get(), page.data(), page.size())) {
        }
        ASSERT_EQ(errno, ENOSPC);
    }

    request({"CI p counter 1", "SD p static 2", "FS"});
    EXPECT_EQ(read_file("private/counters.txt"), counters);
    EXPECT_EQ(read_file("private/sdata.txt"), values);
    EXPECT_FALSE(exists("private/counters.txt_") || exists("private/sdata.txt_"));

    request({"EV p lost " + std::string(20000, 'x')});
    EXPECT_TRUE(daemon.wait_log("E kivd-events: Failed to write event p::lost with 20000 bytes"));
    EXPECT_TRUE(daemon.wait_idle());
    EXPECT_GE(daemon.count_in_log("E kivd-events: Failed to write event kiv::DaemonError"), 50U);
    EXPECT_EQ(daemon.count_in_log(notice), 1U);
    request({"FL"});
    EXPECT_TRUE(
        daemon.wait_log("E kivd-compactor: Corrupt output directory - will not do anything."));
    EXPECT_EQ(report_paths().size(), 0U);
    EXPECT_TRUE(exists("private/flushed_data"));

    ASSERT_TRUE(std::filesystem::remove("filler"));
    request({"CI p counter 1", "FS", "EV p after x", "FL"});
    EXPECT_NE(read_file("private/counters.txt"), counters);
    EXPECT_NE(read_file("private/sdata.txt"), values);
    const kiv::Report report = wait_report(1);
    ASSERT_GT(report.events_size(), 0);
    EXPECT_EQ(report.events(report.events_size() - 1).name(), "after");
    EXPECT_EQ(daemon.stop(), 0);
    EXPECT_EQ(chdir("/"), 0);
    EXPECT_EQ(umount2(directory.c_str(), MNT_DETACH), 0);
}

}  // namespace
}  // namespace kivd
