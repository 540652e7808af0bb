#include "kivctl/watch_line.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>

#include "format/request_table.h"
#include "format/request_words.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {

using std::string_view;

constexpr size_t text_characters = 120;  // shown of any part of a packet
constexpr size_t hex_bytes = 32;

string_view until_nul(string_view bytes) { return bytes.substr(0, bytes.find('\0')); }

// Takes the next word off `left`, which ends in a NUL; what ended the word stays.
string_view take_word(string_view& left) {
    const request_word word = find_word(left.data());
    left.remove_prefix(static_cast<size_t>(word.end - left.data()));
    return {word.start, word.end};
}

// A packet as the daemon understands it.
struct parts {
    const request_row* shape = nullptr;  // null: no known command
    string_view package, name;
    string_view left;  // what follows; the whole packet when there is no command
};

// The parts are views of `packet`.
parts take_apart(const std::string& packet) {
    parts found;
    found.left = packet;
    const string_view command = take_word(found.left);
    found.shape = find_request(command);
    if (found.shape == nullptr) return {nullptr, {}, {}, packet};
    if (found.shape->target == request_target::none) return found;
    found.package = take_word(found.left);
    found.name = take_word(found.left);
    return found;
}

std::string quoted(string_view text) { return '"' + printable(text, text_characters) + '"'; }

std::string hex(string_view bytes) {
    std::string digits;
    for (const char byte : bytes.substr(0, hex_bytes)) {
        char text[4];
        snprintf(text, sizeof text, " %02X", static_cast<uint8_t>(byte));
        digits += digits.empty() ? text + 1 : text;
    }
    return bytes.size() > hex_bytes ? digits + " ..." : digits;
}

std::string with_size(string_view bytes) {
    std::string text = std::to_string(bytes.size()) + " bytes";
    if (!bytes.empty()) text += ": " + (is_text(bytes) ? quoted(bytes) : hex(bytes));
    return text;
}

std::string describe_rest(const parts& p) {
    if (p.shape == nullptr) return with_size(p.left);
    const bool is_binary = p.shape->rest == request_rest::bytes;
    string_view left = is_binary ? p.left : until_nul(p.left);
    if (p.shape->rest == request_rest::words) {
        while (!left.empty() && is_blank(left[0])) left.remove_prefix(1);
        return printable(left, text_characters);
    }
    left.remove_prefix(
        std::min<size_t>(1, left.size()));  // one delimiter; further ones belong to the text
    return with_size(left);
}

// Two blanks and the text, nothing when there is none.
std::string column(const std::string& text) { return text.empty() ? "" : "  " + text; }

}  // namespace

std::string describe_request(string_view packet) {
    const std::string copy(packet);
    const parts p = take_apart(copy);
    const std::string size = std::to_string(packet.size());
    std::string line(size.size() < 5 ? 5 - size.size() : 0, ' ');
    line += size + "  ";
    line += p.shape == nullptr ? "??" : p.shape->name;
    line += column(printable(p.package, text_characters));
    if (!p.name.empty()) line += ' ' + printable(p.name, text_characters);
    return line + column(describe_rest(p));
}

std::string package_of(string_view packet) {
    const std::string copy(packet);
    return std::string(take_apart(copy).package);
}

}  // namespace kivd
