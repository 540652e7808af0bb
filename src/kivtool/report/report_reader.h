// Reads a report file record by record, so that a file of any size takes little memory and faults
// can be located. A record is one field of kiv.Report: a key byte, the length, the content.
#pragma once

#include <google/protobuf/message.h>
#include <openssl/evp.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "report.pb.h"

namespace kivd {

// Where reading stops, since a small gzip file can expand to any amount of data.
struct reading_limits {
    uint64_t data_size = uint64_t{1} << 30;  // bytes, decompressed
    size_t message_size = size_t{1} << 20;   // bytes of a record that is a message
    size_t bytes_size = size_t{256} << 20;   // of any other record, such as ciphertext
};

struct report_record {
    const google::protobuf::FieldDescriptor* field;  // of kiv.Report
    const google::protobuf::Message* message;        // null when the field holds bytes
    std::string_view bytes;                          // the whole record
};

// The message of a record whose type is known.
template <class message>
const message& get(const report_record& record) {
    return static_cast<const message&>(*record.message);
}

class report_layer;

class report_reader {
 public:
    // `key` opens sealed reports; without one they stay closed.
    report_reader(const std::string& path, EVP_PKEY* key, const reading_limits& limits = {});
    ~report_reader();
    report_reader(const report_reader&) = delete;
    report_reader& operator=(const report_reader&) = delete;

    // The next complete record, null at the end; valid until the next call. A sealed report gives
    // the records that were sealed, without the empty header in front of the seal.
    [[nodiscard]] const report_record* next();

    // At the end: why there is no more, as the end of a sentence; empty at a good end.
    [[nodiscard]] const std::string& problem() const { return problem_; }
    // For a report that was opened, the following describe the sealed data.
    [[nodiscard]] bool is_gzip() const { return is_gzip_; }
    [[nodiscard]] uint64_t file_size() const { return file_size_; }  // bytes read
    [[nodiscard]] uint64_t data_size() const {
        return data_size_;
    }  // bytes of all complete records

 private:
    static constexpr int fields = 16;  // fits into a key byte

    bool decode(size_t head_size);
    bool stands_before_seal();
    void end_layer();
    bool open_seal();

    reading_limits limits_;
    EVP_PKEY* key_;
    std::unique_ptr<report_layer> layer_;
    std::array<std::unique_ptr<google::protobuf::Message>, fields>
        messages_;  // reused for each record
    report_record record_{};
    kiv::Report seal_;     // what is needed to open it, as far as it has been read
    std::string content_;  // of the seal that was opened
    bool in_seal_ = false;
    std::string seal_problem_;
    std::string problem_;
    bool is_gzip_ = false;
    uint64_t file_size_ = 0;
    uint64_t data_size_ = 0;
};

}  // namespace kivd
