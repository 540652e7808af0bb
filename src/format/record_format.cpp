#include "format/record_format.h"

#include <cstring>
#include <string_view>

#include "format/varint.h"

namespace kivd {
namespace {

enum wire_type : uint8_t { varint = 0, length_delimited = 2 };

constexpr uint8_t key_of(uint8_t field, wire_type type) {
    return static_cast<uint8_t>(field << 3U | type);
}

std::string_view view_of(const char* text) { return text != nullptr ? text : ""; }

// Sizes of whole fields, key byte included.
size_t size_of_text(std::string_view text) {
    return 1 + varint32_size(static_cast<uint32_t>(text.size())) + text.size();
}

size_t size_of_number(int64_t value) { return 1 + varint64_size(static_cast<uint64_t>(value)); }

// Size of a whole record whose message has `size` bytes.
size_t size_of_record(size_t size) { return 1 + varint32_size(static_cast<uint32_t>(size)) + size; }

// Writes fields one behind the other. The caller has made sure that they fit.
class field_writer {
 public:
    explicit field_writer(std::span<uint8_t> buffer) : start_(buffer.data()), next_(start_) {}

    void head(uint8_t field, size_t size) {
        *next_++ = key_of(field, length_delimited);
        next_ += pack_varint32(next_, static_cast<uint32_t>(size));
    }
    void bytes(uint8_t field, const void* data, size_t size) {
        head(field, size);
        if (size > 0) memcpy(next_, data, size);
        next_ += size;
    }
    void text(uint8_t field, std::string_view text) { bytes(field, text.data(), text.size()); }
    void number(uint8_t field, int64_t value) {
        *next_++ = key_of(field, varint);
        next_ += pack_varint64(next_, static_cast<uint64_t>(value));
    }
    [[nodiscard]] size_t size() const { return static_cast<size_t>(next_ - start_); }

 private:
    uint8_t* start_;
    uint8_t* next_;
};

}  // namespace

size_t pack_event_record(std::span<uint8_t> buffer, const char* package, const char* name,
                         int64_t timestamp, size_t payload_size) {
    const std::string_view package_text = view_of(package);
    const std::string_view name_text = view_of(name);
    const size_t payload_head = 1 + varint32_size(static_cast<uint32_t>(payload_size));
    const size_t size = size_of_text(package_text) + size_of_text(name_text) +
                        size_of_number(timestamp) + payload_head + payload_size;
    if (size_of_record(size) - payload_size > buffer.size()) return 0;

    field_writer writer(buffer);
    writer.head(2, size);
    writer.text(1, package_text);
    writer.text(2, name_text);
    writer.number(3, timestamp);
    writer.head(4, payload_size);
    return writer.size();
}

size_t pack_counter_record(std::span<uint8_t> buffer, const char* package, const char* name,
                           int64_t from_timestamp, int64_t to_timestamp, int64_t value) {
    const std::string_view package_text = view_of(package);
    const std::string_view name_text = view_of(name);
    const size_t size = size_of_text(package_text) + size_of_text(name_text) +
                        size_of_number(value) + size_of_number(from_timestamp) +
                        size_of_number(to_timestamp);
    if (size_of_record(size) > buffer.size()) return 0;

    field_writer writer(buffer);
    writer.head(3, size);
    writer.text(1, package_text);
    writer.text(2, name_text);
    writer.number(3, value);
    writer.number(4, from_timestamp);
    writer.number(5, to_timestamp);
    return writer.size();
}

size_t pack_static_record(std::span<uint8_t> buffer, const char* package, const char* name,
                          int64_t timestamp, const char* value) {
    const std::string_view package_text = view_of(package);
    const std::string_view name_text = view_of(name);
    const std::string_view value_text = view_of(value);
    const size_t size = size_of_text(package_text) + size_of_text(name_text) +
                        size_of_text(value_text) + size_of_number(timestamp);
    if (size_of_record(size) > buffer.size()) return 0;

    field_writer writer(buffer);
    writer.head(4, size);
    writer.text(1, package_text);
    writer.text(2, name_text);
    writer.text(3, value_text);
    writer.number(4, timestamp);
    return writer.size();
}

size_t pack_crypto_fields(std::span<uint8_t> buffer, const uint8_t* encrypted_key,
                          uint32_t key_bits, std::span<const uint8_t> iv,
                          uint32_t ciphertext_size) {
    const size_t key_size = key_bits / 8;
    const size_t size =
        size_of_record(key_size) + size_of_record(iv.size()) + 1 + varint32_size(ciphertext_size);
    if (size > buffer.size()) return 0;

    field_writer writer(buffer);
    writer.bytes(6, encrypted_key, key_size);
    writer.bytes(7, iv.data(), iv.size());
    writer.head(8, ciphertext_size);
    return writer.size();
}

size_t pack_checksum_field(std::span<uint8_t> buffer, const uint8_t* data, uint32_t size) {
    const size_t full_size = size_of_record(size);
    if (full_size > buffer.size()) return 0;

    field_writer writer(buffer);
    if (data != nullptr) {
        writer.bytes(2, data, size);
    } else {
        writer.head(2, size);
    }
    return full_size;
}

size_t pack_debug_frame(std::span<uint8_t> buffer, const uint8_t* data, uint32_t size) {
    const size_t field_size = size_of_record(size);
    if (4 + field_size > buffer.size()) return 0;

    for (size_t i = 0; i < 4; ++i) {
        buffer[i] = static_cast<uint8_t>(field_size >> (24 - 8 * i));
    }
    field_writer writer(buffer.subspan(4));
    writer.bytes(1, data, size);
    return 4 + writer.size();
}

}  // namespace kivd
