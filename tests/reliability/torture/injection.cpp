#include "reliability/torture/injection.h"

#include <csignal>
#include <fstream>
#include <regex>
#include <sstream>

#include "support/scratch_directory.h"

namespace kivd {
namespace {

constexpr char trace_file[] = "../trace";
constexpr char traced_names[] =
    "trace=creat,open,openat,write,writev,pwrite64,pwritev,pwritev2,rename,renameat,renameat2,"
    "unlink,unlinkat,mkdir,mkdirat,rmdir,link,linkat,symlink,truncate,ftruncate,fallocate,"
    "copy_file_range,sendfile,chmod,fchmod,fchmodat,close,clone,statfs";

// "12 writev(5</directory/private/events>, ..." or "12 rename("private/events", ..."
const std::regex call_line(
    R"re(^(\d+) +(\w+)\((?:AT_FDCWD<[^>]*>, )?(?:"([^"]*)"|\d+<(/[^>]*)>|child_stack))re");

bool has_path(const std::string& name) { return name != "clone" && name != "statfs"; }

bool changes_file(const traced_call& call) {
    return has_path(call.name) && call.name != "close" && !call.reads;
}

std::string absolute(const std::string& path) { return fs::current_path().string() + "/" + path; }

std::vector<traced_call> read_trace() {
    std::vector<traced_call> calls;
    std::ifstream file(trace_file);
    for (std::string line; std::getline(file, line);) {
        std::smatch match;
        if (!std::regex_search(line, match, call_line)) continue;
        std::string path = match[3].matched ? match[3] : match[4];
        if (path.starts_with(absolute(""))) path.erase(0, absolute("").size());
        if (path.starts_with('/')) continue;
        if (!has_path(match[2])) path.clear();
        const bool by_child = !calls.empty() && match[1] != calls.front().process;
        const bool reads = line.find("O_RDONLY") != std::string::npos;
        calls.push_back({match[1], by_child, match[2], path, reads, 0, {}});
    }
    return calls;
}

std::vector<std::string> strace(const std::vector<std::string>& more) {
    std::vector<std::string> all = {strace_path, "-D", "-qqq",      "-o",
                                    trace_file,  "-e", traced_names};
    all.insert(all.end(), more.begin(), more.end());
    return all;
}

}  // namespace

std::vector<std::string> record_arguments() { return strace({"-f", "-y", "-s", "0"}); }

std::vector<std::string> inject_arguments(const recording& all, const traced_call& hit,
                                          const fault& injected) {
    std::vector<std::string> arguments = strace({});
    if (hit.by_child) arguments.emplace_back("-f");
    // It knows the paths that a call is given as they are, those of descriptors from the root on.
    for (const auto& path : injected.lasting ? all.paths[hit.by_child] : std::set{hit.path}) {
        if (path.empty()) continue;
        arguments.insert(arguments.end(), {"-P", path, "-P", absolute(path)});
    }
    std::map<std::string, std::string> when;  // by name; it counts for each process anew
    for (const traced_call& call : all.calls) {
        if (!injected.lasting || call.by_child != hit.by_child || !changes_file(call)) continue;
        const auto made = hit.before.find(call.name);
        when[call.name] = std::to_string(made != hit.before.end() ? made->second + 1 : 1) + "+";
    }
    if (!injected.lasting) when[hit.name] = std::to_string(hit.number);
    for (const auto& [name, numbers] : when) {
        std::string what = "inject=";
        what.append(name).append(":").append(injected.what).append(":when=").append(numbers);
        arguments.insert(arguments.end(), {"-e", what});
    }
    return arguments;
}

recording read_recording() {
    recording all;
    const std::vector<traced_call> trace = read_trace();
    for (const traced_call& call : trace) {
        if (changes_file(call)) all.paths[call.by_child].insert(call.path);
    }
    for (const std::string& path : all.paths[0]) all.paths[1].erase(path);
    std::map<std::string, int> made;                                // by process, name and path
    std::map<std::string, std::map<std::string, int>> made_in_all;  // by process, then name
    std::set<std::string> children;  // what two children do alike counts once
    for (traced_call call : trace) {
        call.number = ++made[call.process + " " + call.name + " " + call.path];
        call.before = made_in_all[call.process];
        if (all.paths[call.by_child].contains(call.path)) ++made_in_all[call.process][call.name];
        const std::string key = call.name + " " + call.path + " " + std::to_string(call.number);
        const bool again = call.by_child && !children.insert(key).second;
        if (!again && !call.reads) all.calls.push_back(call);
    }
    return all;
}

bool was_injected() {
    constexpr int tracer_limit_ms = 2000;  // it writes when the daemon may have ended already
    return wait_until(
        [] {
            const std::string trace = read_file(trace_file);
            return trace.find("INJECTED") != std::string::npos ||
                   trace.find("killed by SIGKILL") != std::string::npos;
        },
        tracer_limit_ms);
}

void end_injection(const daemon_process& daemon) {
    std::istringstream status(read_file("/proc/" + std::to_string(daemon.pid()) + "/status"));
    for (std::string key; status >> key;) {
        pid_t tracer = 0;
        // It would pass any other signal on to the daemon.
        if (key == "TracerPid:" && status >> tracer && tracer > 0) (void)kill(tracer, SIGKILL);
    }
}

}  // namespace kivd
