#include "kivtool/report/report_reader.h"

#include <google/protobuf/descriptor.h>

#include <cstdio>
#include <optional>
#include <span>
#include <utility>

#include "format/varint.h"
#include "kivtool/report/sealed_report.h"
#include "toolkit/unpacked_bytes.h"
#include "util/bytes.h"

namespace kivd {
namespace {

using google::protobuf::FieldDescriptor;
using google::protobuf::Message;
using google::protobuf::MessageFactory;

constexpr unsigned wire_type_length_delimited = 2;
constexpr int key_bytes = 0x80;  // keys of one byte are below

bool is_message(const FieldDescriptor& field) {
    return field.type() == FieldDescriptor::TYPE_MESSAGE;
}

// The field whose records start with `key`; null when there is none.
const FieldDescriptor* find_field(uint8_t key) {
    static const auto fields = [] {
        std::array<const FieldDescriptor*, key_bytes> found{};
        for (unsigned each = wire_type_length_delimited; each < key_bytes; each += 8) {
            found[each] = kiv::Report::descriptor()->FindFieldByNumber(static_cast<int>(each >> 3));
        }
        return found;
    }();
    return key < key_bytes ? fields[key] : nullptr;
}

bool is_part_of_seal(const FieldDescriptor& field) {
    return field.number() == kiv::Report::kEncryptionKeyFieldNumber ||
           field.number() == kiv::Report::kEncryptionIvFieldNumber ||
           field.number() == kiv::Report::kEncryptedCompressedDataFieldNumber;
}

// Whether the record is part of a seal; if so, puts it into `seal`.
bool take_seal(const report_record& record, std::string_view content, kiv::Report& seal) {
    if (!is_part_of_seal(*record.field)) return false;
    seal.GetReflection()->SetString(&seal, record.field, std::string(content));
    return true;
}

}  // namespace

// Cuts the bytes of a file, or of sealed data, into records.
class report_layer {
 public:
    explicit report_layer(const std::string& path) : bytes_(path) {}
    report_layer(std::string_view content, const char* place) : bytes_(content, place) {}

    // Finds the next record. Returns the size of its key and length; 0 at the end and on a problem.
    size_t frame(const reading_limits& limits, report_record& record) {
        const std::string_view start = ahead(1 + max_varint32_size);
        if (start.empty()) return stop(bytes_.problem());
        const auto key = static_cast<uint8_t>(start[0]);
        record.field = find_field(key);
        if (!record.field) return stop_at_key(key);
        std::span<const uint8_t> rest = bytes_of(start.substr(1));
        const std::optional<uint64_t> length = take_varint(rest, max_varint32_size);
        if (!length) {
            if (rest.size() == max_varint32_size) {
                return stop("the record there has no valid length");
            }
            return stop_cut("the record there is cut short in its length");
        }
        const size_t head_size = start.size() - rest.size();
        if (*length > (is_message(*record.field) ? limits.message_size : limits.bytes_size)) {
            return stop("the record there claims a length of " + std::to_string(*length) +
                        " bytes, which is more than a record can have");
        }
        const size_t size = head_size + static_cast<size_t>(*length);
        record.bytes = ahead(size);
        if (record.bytes.size() < size) {
            return stop_cut("the record there is cut short: it has " +
                            std::to_string(record.bytes.size()) + " of its " +
                            std::to_string(size) + " bytes");
        }
        if (offset_ + size > limits.data_size) {
            return stop("the file holds more than " + std::to_string(limits.data_size) + " bytes");
        }
        return head_size;
    }

    // Steps over a record; its bytes stay valid until the next one is looked for.
    void take(size_t size) {
        start_ += size;
        offset_ += size;
    }

    // The next `size` bytes; fewer at the end of the data.
    std::string_view ahead(size_t size) {
        while (data_.size() - start_ < size) {
            data_.erase(0, start_);
            start_ = 0;
            if (!bytes_.read_some(data_)) break;
        }
        return std::string_view(data_).substr(start_, size);
    }

    size_t stop(std::string reason) {
        reason_ = std::move(reason);
        return 0;
    }

    // Why there is no more, as the end of a sentence; empty at a good end.
    [[nodiscard]] std::string problem() const {
        if (reason_.empty() && offset_ > 0) return "";
        if (reason_.empty()) {
            return bytes_.is_gzip() ? "the gzip data is empty" : "the file is empty";
        }
        if (bytes_.offset() == 0) return reason_;  // not even opened
        return "stopped at byte " + std::to_string(offset_) +
               (bytes_.is_gzip() ? " of the decompressed data: " : ": ") + reason_;
    }

    [[nodiscard]] uint64_t offset() const { return offset_; }
    [[nodiscard]] const unpacked_bytes& bytes() const { return bytes_; }

 private:
    size_t stop_at_key(uint8_t key) {
        char text[64];
        snprintf(text, sizeof text, "no record starts with the byte 0x%02X", key);
        return stop(text);
    }

    // When the data ends within a record, the reason is whatever ended the data.
    size_t stop_cut(const std::string& reason) {
        return stop(bytes_.problem().empty() ? reason : bytes_.problem());
    }

    unpacked_bytes bytes_;
    std::string data_;
    size_t start_ = 0;
    uint64_t offset_ = 0;
    std::string reason_;
};

report_reader::report_reader(const std::string& path, EVP_PKEY* key, const reading_limits& limits)
    : limits_(limits), key_(key), layer_(std::make_unique<report_layer>(path)) {}

report_reader::~report_reader() = default;

const report_record* report_reader::next() {
    while (layer_) {
        const size_t head_size = layer_->frame(limits_, record_);
        if (head_size == 0 || !decode(head_size)) {
            end_layer();
            continue;
        }
        const std::string_view content = record_.bytes.substr(head_size);
        const bool is_left_out = take_seal(record_, content, seal_) || stands_before_seal();
        layer_->take(record_.bytes.size());
        if (!is_left_out) return &record_;
    }
    return nullptr;
}

bool report_reader::decode(size_t head_size) {
    record_.message = nullptr;
    if (!is_message(*record_.field)) return true;
    auto& message = messages_[static_cast<size_t>(record_.field->number())];
    if (!message) {
        message.reset(MessageFactory::generated_factory()
                          ->GetPrototype(record_.field->message_type())
                          ->New());
    }
    record_.message = message.get();
    const auto size = static_cast<int>(record_.bytes.size() - head_size);
    if (message->ParsePartialFromArray(record_.bytes.data() + head_size, size) &&
        message->IsInitialized()) {
        return true;
    }
    layer_->stop("the record there cannot be decoded as " + record_.field->name());
    return false;
}

// Whether the record is a header and a seal follows it.
bool report_reader::stands_before_seal() {
    if (record_.field->number() != kiv::Report::kHeaderFieldNumber) return false;
    const size_t size = record_.bytes.size();
    const std::string_view both = layer_->ahead(size + 1);
    record_.bytes = both.substr(0, size);  // ahead() may have moved it
    if (both.size() == size) return false;
    const FieldDescriptor* next = find_field(static_cast<uint8_t>(both[size]));
    return next && is_part_of_seal(*next);
}

void report_reader::end_layer() {
    problem_ = layer_->problem();
    is_gzip_ = layer_->bytes().is_gzip();
    file_size_ = layer_->bytes().offset();
    data_size_ = layer_->offset();
    layer_.reset();
    if (is_sealed(seal_) && open_seal()) return;
    if (problem_.empty()) problem_ = std::exchange(seal_problem_, "");
}

// Goes on with the sealed data. False when that is not possible.
bool report_reader::open_seal() {
    std::string reason;
    if (in_seal_) {
        reason = "the report is sealed twice";
    } else if (!key_) {
        reason = "the report is sealed, give the private key that opens it with --key";
    } else {
        reason = open_sealed(seal_, *key_, content_);
    }
    seal_ = kiv::Report();  // it may be large
    if (!reason.empty()) {
        problem_ = problem_.empty() ? reason : reason + "; " + problem_;
        return false;
    }
    in_seal_ = true;
    seal_problem_ = std::exchange(problem_, "");
    layer_ = std::make_unique<report_layer>(content_, "the sealed data");
    return true;
}

}  // namespace kivd
