#include "kivtool/config/filter_lint.h"

#include <google/protobuf/descriptor.h>

#include <utility>

#include "toolkit/text_escape.h"

namespace kivd {
namespace {

using google::protobuf::FieldDescriptor;
using kiv::config::Filter;
using kiv::config::FilterConfig;

constexpr size_t shown_name = 60;  // characters

constexpr struct {
    int field;  // of FilterConfig
    filter_kind kind;
    const char* things;
} kinds[] = {
    {FilterConfig::kEventFilterFieldNumber, filter_kind::events, "events"},
    {FilterConfig::kCounterFilterFieldNumber, filter_kind::counters, "counters"},
    {FilterConfig::kStaticdataFilterFieldNumber, filter_kind::static_data, "static data"},
};

}  // namespace

lint_place written_filter::place_of_item(int index) const {
    const FieldDescriptor& items =
        *Filter::descriptor()->FindFieldByNumber(Filter::kItemFieldNumber);
    const int line = line_of(places, items, index);
    const auto& item = filter.item(index);
    return {place.path, line > 0 ? line : place.line,
            place.subject + " item " + std::to_string(index + 1) + " (" +
                printable(item.package(), shown_name) + " " + printable(item.name(), shown_name) +
                ")"};
}

std::vector<written_filter> filters_of(const part_content& part) {
    FilterConfig config;
    (void)config.ParsePartialFromString(part.payload);
    std::vector<written_filter> found;
    for (const auto& [number, kind, things] : kinds) {
        const FieldDescriptor& field = *FilterConfig::descriptor()->FindFieldByNumber(number);
        const auto& all = *config.GetReflection();
        if (!all.HasField(config, &field)) continue;
        found.push_back(
            {kind,
             things,
             static_cast<const Filter&>(all.GetMessage(config, &field)),
             {part.path, line_of(part.places.get(), field), id_of(part) + " " + field.name()},
             part.places ? part.places->GetTreeForNested(&field, -1) : nullptr});
    }
    return found;
}

void lint_text(const lint_place& place, const char* what, const std::string& text,
               const char* nobody, lint_findings& findings) {
    const auto its = [what](const char* fault) { return std::string("its ") + what + fault; };
    if (text.find('\0') != std::string::npos) {
        findings.error(place, its(" holds a NUL; the daemon reads it up to there only"));
    } else if (text.empty()) {
        findings.error(place, its(" is empty; ") + nobody);
    } else if (text.find(' ') != std::string::npos) {
        findings.warning(place, its(" holds a blank; ") + nobody);
    }
}

void lint_filter(const written_filter& filter, lint_findings& findings) {
    for (int i = 0; i < filter.filter.item_size(); ++i) {
        const auto& item = filter.filter.item(i);
        const lint_place place = filter.place_of_item(i);
        lint_text(place, "package", item.package(), "no probe has such a one", findings);
        lint_text(place, "name", item.name(), "no probe has such a one", findings);
    }
}

}  // namespace kivd
