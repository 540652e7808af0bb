// What sealing adds to a report's compaction, against the same cipher over the same bytes.
#include <fcntl.h>
#include <openssl/evp.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <memory>
#include <random>
#include <span>
#include <string>
#include <vector>

#include "bench/keys.h"
#include "bench/measure.h"
#include "bench/plain_file.h"
#include "bench/sections.h"
#include "record/header_record.h"
#include "report/report_sealing.h"
#include "security/key_paths.h"
#include "security/seal.h"
#include "toolkit/unique_openssl.h"
#include "util/file_io.h"

namespace kivd::bench {

namespace {

constexpr char report_key_name[] = "kiv_report.pem";
constexpr char cipher_key[] = "00112233445566778899aabbccddeeff";
constexpr size_t loop_chunk_size = 8192;  // what `openssl enc` takes at a time

// Compressed data as far as a cipher is concerned.
std::string make_data(size_t size) {
    std::mt19937 random(1);
    std::string data;
    for (size_t i = 0; i < size; ++i) data += static_cast<char>(random());
    return data;
}

double milliseconds_of(const auto& work) {
    const int64_t start = now_ns();
    work();
    return static_cast<double>(now_ns() - start) / 1e6;
}

struct sealing_times {
    std::vector<double> enc_process_ms;
    std::vector<double> kivd_process_ms;
    std::vector<double> compactor_ms;
    std::vector<double> loop_ms;
    std::vector<double> encrypt_ms;
    std::vector<double> open_ms;
};

// Emptying a file that is there and closing it writes out, on some file systems, what the next one
// only keeps in memory; so the outputs of the round before go first.
void remove_files(const std::vector<std::string>& paths) {
    for (const std::string& path : paths) (void)unlink(path.c_str());
}

// As the compactor does it: in a fresh child of a process that has not used the library.
double seal_in_child(const std::string& directory, const std::string& key_directory,
                     const std::string& data) {
    write_file(directory + "/private/flushed_data.compacted", data);
    double milliseconds = 0;
    run_in_child({&milliseconds, 1}, [&](std::span<double> figures) {
        if (chdir(directory.c_str()) == -1) give_up("chdir failed");
        set_report_key_dir(key_directory.c_str());
        figures[0] = milliseconds_of([] {
            if (!seal_compacted_data()) give_up("seal_compacted_data failed");
        });
    });
    return milliseconds;
}

// The least that encrypts a file.
void encrypt_plainly(const std::string& source, const std::string& destination,
                     EVP_CIPHER_CTX* cipher) {
    const unique_fd input(open(source.c_str(), O_RDONLY | O_CLOEXEC));
    const unique_fd output = create_file(destination.c_str());
    std::array<uint8_t, loop_chunk_size> plain;
    std::array<uint8_t, loop_chunk_size + EVP_MAX_BLOCK_LENGTH> sealed;
    int size = 0;
    bool good = input.ok() && output.ok();
    while (good) {
        const ssize_t n = read(input.get(), plain.data(), plain.size());
        if (n <= 0) break;
        good = EVP_EncryptUpdate(cipher, sealed.data(), &size, plain.data(), static_cast<int>(n)) ==
                   1 &&
               write(output.get(), sealed.data(), static_cast<size_t>(size)) == size;
    }
    good = good && EVP_EncryptFinal_ex(cipher, sealed.data(), &size) == 1 &&
           write(output.get(), sealed.data(), static_cast<size_t>(size)) == size;
    if (!good) give_up("EVP_EncryptUpdate failed");
}

void encrypt_as_daemon(const std::string& source, const std::string& destination,
                       sealing& started) {
    const unique_fd input(open(source.c_str(), O_RDONLY | O_CLOEXEC));
    const unique_fd output = create_file(destination.c_str());
    if (!input.ok() || !output.ok() || !encrypt_file(input.get(), output.get(), started))
        give_up("encrypt_file failed");
}

// File to file in one process that knows the library, so without what its start costs. Either goes
// first in every other round.
void run_in_process(const setup& s, const std::string& directory, const std::string& key_directory,
                    const std::string& source, sealing_times& into) {
    const unsigned rounds = amount(s, 45, 15);
    std::vector<double> figures(size_t{3} * rounds);
    run_in_child(figures, [&](std::span<double> times) {
        set_report_key_dir(key_directory.c_str());
        const std::string theirs = directory + "/theirs";
        const std::string ours = directory + "/ours";
        const uint8_t key[16] = {1, 2, 3};
        const auto run_loop = [&] {
            remove_files({theirs});
            const unique_cipher cipher(EVP_CIPHER_CTX_new());
            if (EVP_EncryptInit_ex(cipher.get(), EVP_aes_128_cbc(), nullptr, key, key) != 1)
                give_up("EVP_EncryptInit_ex failed");
            return milliseconds_of([&] { encrypt_plainly(source, theirs, cipher.get()); });
        };
        const auto run_daemon = [&](double& open_ms) {
            remove_files({ours});
            std::optional<sealing> started;
            open_ms = milliseconds_of([&] {
                started = start_sealing();
                if (!started) give_up("start_sealing failed");
            });
            return milliseconds_of([&] { encrypt_as_daemon(source, ours, *started); });
        };
        double unused = 0;
        (void)run_loop();
        (void)run_daemon(unused);
        for (unsigned i = 0; i < rounds; ++i) {
            double* const round = &times[size_t{3} * i];
            if (i % 2 == 0) round[0] = run_loop();
            round[1] = run_daemon(round[2]);
            if (i % 2 == 1) round[0] = run_loop();
        }
    });
    for (unsigned i = 0; i < rounds; ++i) {
        into.loop_ms.push_back(figures[size_t{3} * i]);
        into.encrypt_ms.push_back(figures[size_t{3} * i + 1]);
        into.open_ms.push_back(figures[size_t{3} * i + 2]);
    }
}

void measure_size(const setup& s, const std::string& key_directory, const char* title,
                  size_t size) {
    const scratch_directory directory(s.scratch);
    std::filesystem::create_directory(directory.path() + "/private");
    const std::string source = directory.path() + "/report";
    const std::string data = make_data(size);
    write_file(source, data);
    sealing_times times;
    for (unsigned i = 0; i < amount(s, 25, 7) + 1; ++i) {
        remove_files({source + ".theirs", source + ".enc", source + ".key", source + ".iv"});
        const auto enc_ns = run_program({"openssl", "enc", "-aes-128-cbc", "-K", cipher_key, "-iv",
                                         cipher_key, "-in", source, "-out", source + ".theirs"});
        const auto kivd_ns =
            run_program({s.kivd, "-c", key_directory, "-b", directory.path(), "--encrypt", source});
        const double compactor_ms = seal_in_child(directory.path(), key_directory, data);
        if (i == 0) continue;
        times.enc_process_ms.push_back(static_cast<double>(enc_ns) / 1e6);
        times.kivd_process_ms.push_back(static_cast<double>(kivd_ns) / 1e6);
        times.compactor_ms.push_back(compactor_ms);
    }
    if (std::filesystem::file_size(source + ".enc") != sealed_size(static_cast<uint32_t>(size)))
        give_up("kivd --encrypt has not sealed the file");
    run_in_process(s, directory.path(), key_directory, source, times);

    print_note("%s", title);
    print_row("openssl enc -aes-128-cbc, a process", times.enc_process_ms, "ms");
    print_row("kivd --encrypt, a process", times.kivd_process_ms, "ms");
    print_row("sealing in a fresh compactor", times.compactor_ms, "ms");
    print_row("kivd --encrypt : openssl enc", ratios(times.kivd_process_ms, times.enc_process_ms),
              "x", {bound::at_most, 1.1});
    print_row("sealing in a compactor : openssl enc",
              ratios(times.compactor_ms, times.enc_process_ms), "x", {bound::at_most, 1.1});
    print_row("file to file in process, plain EVP loop", times.loop_ms, "ms");
    print_row("file to file in process, encrypt_file", times.encrypt_ms, "ms");
    print_row("encrypt_file : EVP loop", ratios(times.encrypt_ms, times.loop_ms), "x",
              {bound::at_most, 1.1});
    print_row("open_report_seal in process", times.open_ms, "ms");
}

}  // namespace

void measure_sealing(const setup& s) {
    print_section("Sealing");
    const scratch_directory keys(s.scratch);
    const std::string key_directory = keys.path() + "/";
    child_process maker = fork_child([&] { make_keys(keys.path(), report_key_name); });
    join(maker);
    measure_size(s, key_directory, "50 KB", 50'000);
    measure_size(s, key_directory, "400 KB", 400'000);
    measure_size(s, key_directory, "5 MB", 5'000'000);
}

}  // namespace kivd::bench
