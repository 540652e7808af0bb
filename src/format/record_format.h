// Encoders for the records of a report. A record is one top-level field of the message kiv.Report
// (key byte, length, encoded message), so a file of whole records is a valid kiv.Report and
// appending a record adds an element. Formats: docs/report-format.md.
//
// Each encoder writes into the caller's buffer and gives the number of bytes, or 0 when the record
// does not fit; none allocates. Null texts count as empty.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

namespace kivd {

// The key bytes that records begin with.
inline constexpr uint8_t header_record_key = 0x0A;
inline constexpr uint8_t event_record_key = 0x12;

// The head of an event record, up to and including the payload's length: the caller writes the
// payload right behind it. Timestamps are milliseconds since the epoch.
[[nodiscard]] size_t pack_event_record(std::span<uint8_t> buffer, const char* package,
                                       const char* name, int64_t timestamp, size_t payload_size);

[[nodiscard]] size_t pack_counter_record(std::span<uint8_t> buffer, const char* package,
                                         const char* name, int64_t from_timestamp,
                                         int64_t to_timestamp, int64_t value);

[[nodiscard]] size_t pack_static_record(std::span<uint8_t> buffer, const char* package,
                                        const char* name, int64_t timestamp, const char* value);

// The encryption fields of a sealed report, up to and including the ciphertext's length. The key is
// as long as the RSA modulus, `key_bits` / 8 bytes.
[[nodiscard]] size_t pack_crypto_fields(std::span<uint8_t> buffer, const uint8_t* encrypted_key,
                                        uint32_t key_bits, std::span<const uint8_t> iv,
                                        uint32_t ciphertext_size);

// A configuration checksum behind a header record. With null `data` only the head is written and
// the same full size given, so that the caller can write the data itself.
[[nodiscard]] size_t pack_checksum_field(std::span<uint8_t> buffer, const uint8_t* data,
                                         uint32_t size);

// One frame of the debug interface: a big-endian length of what follows, then `data` as a field.
[[nodiscard]] size_t pack_debug_frame(std::span<uint8_t> buffer, const uint8_t* data,
                                      uint32_t size);

}  // namespace kivd
