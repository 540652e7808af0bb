#include "reliability/torture/kept_data.h"

#include <google/protobuf/io/coded_stream.h>
#include <openssl/evp.h>
#include <openssl/pem.h>

#include <memory>
#include <optional>
#include <sstream>
#include <utility>

#include "report.pb.h"
#include "support/daemon_process.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

constexpr uint32_t event_key = 0x12;

// "12 3 xxx": the id, how many x there are, and those.
std::string payload_of(int id, size_t size) {
    return std::to_string(id) + " " + std::to_string(size) + " " + std::string(size, 'x');
}

// 0 for an event of the daemon itself, nothing for one that isn't as it was sent.
std::optional<int> id_of(const kiv::Event& event) {
    if (event.package() == "kiv") return 0;
    std::istringstream payload(event.payload());
    int id = 0;
    size_t size = 0;
    payload >> id >> size;
    return event.payload() == payload_of(id, size) ? std::optional(id) : std::nullopt;
}

records read_records(const std::string& bytes) {
    records read;
    google::protobuf::io::CodedInputStream input(reinterpret_cast<const uint8_t*>(bytes.data()),
                                                 static_cast<int>(bytes.size()));
    uint32_t key = 0;
    uint32_t size = 0;
    for (std::string record; std::cmp_less(input.CurrentPosition(), bytes.size());) {
        read.whole = input.ReadVarint32(&key) && input.ReadVarint32(&size) &&
                     input.ReadString(&record, static_cast<int>(size));
        if (read.whole && key != event_key) continue;
        kiv::Event event;
        std::optional<int> id;
        if (read.whole && event.ParseFromString(record)) id = id_of(event);
        read.whole = id.has_value();
        if (!id) break;
        if (*id != 0) read.ids.push_back(*id);
    }
    return read;
}

std::string unseal(const kiv::Report& sealed) {
    const std::unique_ptr<FILE, int (*)(FILE*)> file(fopen("../../report.key", "re"), fclose);
    const std::unique_ptr<EVP_PKEY, void (*)(EVP_PKEY*)> key(
        PEM_read_PrivateKey(file.get(), nullptr, nullptr, nullptr), EVP_PKEY_free);
    const std::unique_ptr<EVP_CIPHER_CTX, void (*)(EVP_CIPHER_CTX*)> cipher(EVP_CIPHER_CTX_new(),
                                                                            EVP_CIPHER_CTX_free);
    const auto bytes = [](const std::string& text) {
        return reinterpret_cast<const unsigned char*>(text.data());
    };
    const std::string& text = sealed.encrypted_compressed_data();
    std::vector<unsigned char> plain(text.size() + EVP_MAX_BLOCK_LENGTH);
    int size = 0;
    int last = 0;
    const bool opened =
        EVP_OpenInit(cipher.get(), EVP_aes_128_cbc(), bytes(sealed.encryption_key()),
                     static_cast<int>(sealed.encryption_key().size()),
                     bytes(sealed.encryption_iv()), key.get()) > 0 &&
        EVP_OpenUpdate(cipher.get(), plain.data(), &size, bytes(text),
                       static_cast<int>(text.size())) > 0 &&
        EVP_OpenFinal(cipher.get(), plain.data() + size, &last) > 0;
    return opened ? std::string(plain.begin(), plain.begin() + size + last) : std::string();
}

records read_compressed(const std::string& path) { return read_records(gunzip_file(path)); }

records read_report(const std::string& path) {
    kiv::Report report;
    const bool sealed = report.ParseFromString(read_file(path));
    if (sealed) write_file("../unsealed", unseal(report));
    const std::string bytes = gunzip_file(sealed ? "../unsealed" : path);
    records read = read_records(bytes);
    read.whole = read.whole && report.ParseFromString(bytes);
    read.sealed = sealed;
    return read;
}

records read_plain(const std::string& path) { return read_records(read_file(path)); }

std::map<int, records> read_numbered(const char* directory, const std::string& beginning,
                                     records (*read)(const std::string& path)) {
    std::map<int, records> files;
    std::error_code none;
    for (const auto& entry : fs::directory_iterator(directory, none)) {
        const std::string name = entry.path().filename();
        if (!name.starts_with(beginning)) continue;
        files[std::stoi(name.substr(beginning.size()))] = read(entry.path());
    }
    return files;
}

}  // namespace

std::string event_request(const char* package, int id, size_t size) {
    return std::string("EV ") + package + " ShutDown " + payload_of(id, size);
}

std::string event_record(const char* package, int id, size_t size) {
    kiv::Report report;
    kiv::Event& event = *report.add_events();
    event.set_package(package);
    event.set_name("ShutDown");
    event.set_timestamp(1);
    event.set_payload(payload_of(id, size));
    return report.SerializePartialAsString();
}

kept_data read_kept_data() {
    kept_data kept = {read_numbered("output", "kiv_", read_report),
                      read_plain("private/flushed_data"), read_plain("private/events"),
                      read_numbered("private/qz", "qy_", read_compressed)};
    kept.diagnostics.merge(read_numbered("private/qz", "qz_", read_plain));
    return kept;
}

int64_t read_value(const std::string& path, const std::string& name) {
    std::istringstream file(read_file(path));
    for (std::string record; std::getline(file, record);) {
        if (record.find('\0' + name + '\0') == std::string::npos) continue;
        record.erase(record.find_last_not_of('\0') + 1);
        return std::stoll(record.substr(record.rfind('\0') + 1));
    }
    return 0;
}

}  // namespace kivd
