#include "kivtool/config/lint_findings.h"

#include <algorithm>
#include <iterator>
#include <utility>

#include "toolkit/text_escape.h"

namespace kivd {

void lint_findings::add(bool is_error, const lint_place& place, const std::string& text) {
    std::string line = printable(place.path);
    if (place.line > 0) line.append(1, ':').append(std::to_string(place.line));
    line += is_error ? ": error: " : ": warning: ";
    if (!place.subject.empty()) line += place.subject + ": ";
    line += text;
    all_.push_back({is_error, std::move(line)});
}

void lint_findings::append(lint_findings&& others) {
    std::ranges::move(others.all_, std::back_inserter(all_));
}

bool lint_findings::has_errors() const {
    return std::ranges::any_of(all_, &lint_finding::is_error);
}

void lint_findings::print(std::ostream& out) const {
    for (const lint_finding& each : all_) out << each.text << '\n';
}

std::string id_of(const part_content& part) {
    return printable(part.package) + ":" + printable(part.name);
}

int line_of(const google::protobuf::TextFormat::ParseInfoTree* places,
            const google::protobuf::FieldDescriptor& field, int index) {
    return places ? places->GetLocation(&field, index).line + 1 : 0;
}

}  // namespace kivd
