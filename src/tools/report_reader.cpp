#include "tools/report_reader.h"

#include <google/protobuf/descriptor.h>

#include <cstdio>

#include "tools/length_varint.h"
#include "tools/unpacked_bytes.h"

namespace kivd {
namespace {

using google::protobuf::FieldDescriptor;

constexpr unsigned wire_type_length_delimited = 2;

// The part of the file behind the last record taken.
class data_window {
 public:
    explicit data_window(unpacked_bytes& bytes) : bytes_(bytes) {}

    // Tries to have `size` bytes there and gives what there is: fewer at the end of the data.
    std::string_view ahead(size_t size) {
        while (data_.size() - start_ < size) {
            data_.erase(0, start_);
            start_ = 0;
            if (!bytes_.read_some(data_)) break;
        }
        return std::string_view(data_).substr(start_, size);
    }

    void take(size_t size) {
        start_ += size;
        offset_ += size;
    }

    [[nodiscard]] uint64_t offset() const { return offset_; }

 private:
    unpacked_bytes& bytes_;
    std::string data_;
    size_t start_ = 0;
    uint64_t offset_ = 0;
};

struct record {
    const FieldDescriptor* field = nullptr;
    std::string_view bytes;  // key and length included
    std::string problem;
    bool is_cut = false;  // the problem is that the data ends
};

const FieldDescriptor* find_field(uint8_t key) {
    if ((key & 7) != wire_type_length_delimited) return nullptr;
    return kiv::Report::descriptor()->FindFieldByNumber(key >> 3);
}

record next_record(data_window& window, const reading_limits& limits) {
    record next;
    const std::string_view start = window.ahead(1 + longest_length_varint);
    const auto key = static_cast<uint8_t>(start[0]);
    next.field = key < 0x80 ? find_field(key) : nullptr;
    if (!next.field) {
        char text[64];
        snprintf(text, sizeof text, "no record starts with the byte 0x%02X", key);
        next.problem = text;
        return next;
    }

    const length_varint length = read_length(start.substr(1));
    if (length.size == 0) {
        next.is_cut = start.size() <= longest_length_varint;
        next.problem = next.is_cut ? "the record there is cut short in its length"
                                   : "the record there has no valid length";
        return next;
    }
    const bool is_message = next.field->type() == FieldDescriptor::TYPE_MESSAGE;
    if (length.value > (is_message ? limits.message_size : limits.memory_size)) {
        next.problem = "the record there claims a length of " + std::to_string(length.value) +
                       " bytes, which is more than a record can have";
        return next;
    }

    const size_t size = 1 + length.size + static_cast<size_t>(length.value);
    next.bytes = window.ahead(size);
    next.is_cut = next.bytes.size() < size;
    if (next.is_cut) {
        next.problem = "the record there is cut short: it has " +
                       std::to_string(next.bytes.size()) + " of its " + std::to_string(size) +
                       " bytes";
    }
    return next;
}

bool decode(const record& whole, kiv::Report& piece) {
    piece.Clear();
    const auto size = static_cast<int>(whole.bytes.size());
    if (!piece.ParsePartialFromArray(whole.bytes.data(), size)) return false;
    if (whole.field->type() != FieldDescriptor::TYPE_MESSAGE) return true;
    const auto* reflection = piece.GetReflection();
    const auto& message = whole.field->is_repeated()
                              ? reflection->GetRepeatedMessage(piece, whole.field, 0)
                              : reflection->GetMessage(piece, whole.field);
    return message.IsInitialized();
}

// Gives why reading stopped, empty at a good end.
std::string read_records(data_window& window, unpacked_bytes& bytes, const reading_limits& limits,
                         kiv::Report& report) {
    kiv::Report piece;
    size_t memory_size = 0;
    while (!window.ahead(1).empty()) {
        const record next = next_record(window, limits);
        if (next.is_cut && !bytes.problem().empty()) return bytes.problem();
        if (!next.problem.empty()) return next.problem;
        if (window.offset() + next.bytes.size() > limits.data_size) {
            return "the file holds more than " + std::to_string(limits.data_size) + " bytes";
        }
        if (!decode(next, piece)) {
            return "the record there cannot be decoded as " + next.field->name();
        }
        memory_size += piece.SpaceUsedLong() - sizeof piece;
        if (memory_size > limits.memory_size) {
            return "the report takes more than " + std::to_string(limits.memory_size) +
                   " bytes of memory";
        }
        report.MergeFrom(piece);
        window.take(next.bytes.size());
    }
    return bytes.problem();
}

report_file read_all(unpacked_bytes& bytes, const reading_limits& limits) {
    report_file file;
    data_window window(bytes);
    const std::string reason = read_records(window, bytes, limits, file.report);
    file.is_gzip = bytes.is_gzip();
    file.file_size = bytes.offset();
    file.data_size = window.offset();
    if (reason.empty() && file.data_size > 0) return file;
    if (reason.empty()) {
        file.problem = file.is_gzip ? "the gzip data is empty" : "the file is empty";
    } else if (bytes.offset() == 0) {
        file.problem = reason;  // not even opened
    } else {
        file.problem = "stopped at byte " + std::to_string(file.data_size) +
                       (file.is_gzip ? " of the decompressed data: " : ": ") + reason;
    }
    return file;
}

}  // namespace

report_file read_report(const std::string& path, const reading_limits& limits) {
    unpacked_bytes bytes(path);
    return read_all(bytes, limits);
}

report_file read_report_bytes(std::string_view content, const char* place,
                              const reading_limits& limits) {
    unpacked_bytes bytes(content, place);
    return read_all(bytes, limits);
}

}  // namespace kivd
