#include "support/scratch_directory.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <fstream>
#include <sstream>

#include "bench/daemon_process.h"
#include "daemon/modules.h"
#include "report.pb.h"
#include "report/report_generation.h"
#include "util/clock.h"

namespace kivd {
scratch_directory::scratch_directory() {
    directory = testing::TempDir() + "kivd-XXXXXX";
    EXPECT_NE(mkdtemp(directory.data()), nullptr);
    fs::current_path(directory);
    for (const char* name : {"private", "output", "input"}) fs::create_directory(name);

    const sockaddr_un address = {AF_UNIX, "kiv_cl"};
    receiver.reset(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    EXPECT_EQ(bind(receiver.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    properties = {{"ro.qeli.version.sw", "P1"}};
    restart();
}

scratch_directory::~scratch_directory() {
    release_modules();
    fs::current_path("/");
    fs::remove_all(directory);
}

void scratch_directory::restart() {
    const bool in_test_mode = is_test_mode();
    release_modules();
    if (in_test_mode) enable_test_mode();
    start_modules();
}

std::string scratch_directory::next_report() {
    EXPECT_TRUE(generate_report());
    wait_for_compactor();
    return gunzip_file("output/kiv_" + std::to_string(++reports_));
}

std::string scratch_directory::next_packet() {
    std::string packet(32768, '\0');
    const ssize_t size = recv(receiver.get(), packet.data(), packet.size(), MSG_DONTWAIT);
    packet.resize(size > 0 ? static_cast<size_t>(size) : 0);
    return packet;
}

void limit_file_size(rlim_t size) {
    (void)signal(SIGXFSZ, SIG_IGN);
    const rlimit limit = {size, RLIM_INFINITY};
    EXPECT_EQ(setrlimit(RLIMIT_FSIZE, &limit), 0);
}

void write_file(const std::string& path, std::string_view bytes) {
    std::ofstream file(path, std::ios::binary);
    EXPECT_TRUE(file.write(bytes.data(), std::ssize(bytes)).flush()) << path;
}

std::string read_file(const std::string& path) {
    std::ostringstream bytes;
    bytes << std::ifstream(path, std::ios::binary).rdbuf();
    return bytes.str();
}

bool exists(const std::string& path) { return fs::exists(fs::symlink_status(path)); }

size_t open_descriptors(const std::string& path) {
    size_t count = 0;
    for (const auto& entry : fs::directory_iterator("/proc/self/fd")) {
        std::error_code gone;
        const fs::path target = fs::read_symlink(entry.path(), gone);
        if (!gone && (path.empty() || target == path)) ++count;
    }
    return count;
}

std::string doc_example(const std::string& file, const std::string& kind, const std::string& name) {
    const std::string text = read_file(SOURCE_DIRECTORY "/docs/" + file);
    const std::string opening = "```" + kind + " " + name + "\n";
    const size_t start = text.find(opening) + opening.size();
    EXPECT_GE(start, opening.size()) << "no example " << name << " in " << file;
    const std::string example = text.substr(start, text.find("```", start) - start);
    if (kind != "hex") return example;

    std::istringstream digits(example);
    std::string bytes;
    for (std::string byte; digits >> byte;) {
        bytes += static_cast<char>(std::stoi(byte, nullptr, 16));
    }
    return bytes;
}

std::string contents(const std::string& report) {
    kiv::Report decoded;
    if (!decoded.ParseFromString(report)) return "no report";
    std::string all = decoded.header().product_id();
    for (const auto& id : decoded.header().group_id()) all += " " + id;
    all += "; ";
    for (const auto& event : decoded.events()) all += event.name() + " " + event.payload() + "; ";
    for (const auto& counter : decoded.counters()) {
        all += counter.name() + "=" + std::to_string(counter.value()) + "; ";
    }
    for (const auto& item : decoded.statics()) all += item.name() + ": " + item.value() + "; ";
    return all;
}

}  // namespace kivd
