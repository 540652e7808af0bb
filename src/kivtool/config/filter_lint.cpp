#include "kivtool/config/filter_lint.h"

#include <cstdint>
#include <optional>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "config.pb.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {

using google::protobuf::FieldDescriptor;
using google::protobuf::TextFormat;
using kiv::config::Filter;
using kiv::config::FilterConfig;
using kiv::config::FilterItem;

constexpr size_t max_item_findings = 10;  // of one filter
constexpr size_t shown_name = 60;         // characters
constexpr size_t record_overhead = 4;     // NULs and a line feed around package and name

// What a daemon adds to a filter that excludes, so that it knows its type after a restart.
constexpr std::string_view marker_package = "__type";
constexpr std::string_view marker_name = "exclude";

constexpr char keeps_all[] =
    "the daemon cannot decode the part, resets all filters and keeps everything";

struct filter_kind {
    int field;  // of FilterConfig
    const char* things;
    bool is_of_events;  // without its file the daemon takes the system's first configuration
};
constexpr filter_kind kinds[] = {
    {FilterConfig::kEventFilterFieldNumber, "events", true},
    {FilterConfig::kCounterFilterFieldNumber, "counters", false},
    {FilterConfig::kStaticdataFilterFieldNumber, "static data", false},
};

// A text as the daemon sees it.
std::string_view up_to_nul(const std::string& text) { return text.c_str(); }

bool is_wildcard(std::string_view text) { return text.starts_with('*'); }

// Finds items that stand for the same probe as one before them.
class item_clashes {
 public:
    // The index of the first item that clashes with this, the next one.
    std::optional<int> add(std::string_view package, std::string_view name) {
        const int index = count_++;
        const std::optional<int> found = find(package, name);
        if (is_wildcard(package)) {
            if (!package_wildcard_) package_wildcard_ = index;
            return found;
        }
        package_items& items = packages_.try_emplace(package, package_items{index}).first->second;
        if (is_wildcard(name) && !items.wildcard) items.wildcard = index;
        items.names.try_emplace(name, index);
        return found;
    }

 private:
    struct package_items {
        int first;
        std::optional<int> wildcard = std::nullopt;
        std::unordered_map<std::string_view, int> names = {};
    };

    [[nodiscard]] std::optional<int> find(std::string_view package, std::string_view name) const {
        if (package_wildcard_) return package_wildcard_;
        if (is_wildcard(package)) return count_ > 1 ? std::optional(0) : std::nullopt;
        const auto items = packages_.find(package);
        if (items == packages_.end()) return std::nullopt;
        if (items->second.wildcard) return items->second.wildcard;
        if (is_wildcard(name)) return items->second.first;
        const auto same = items->second.names.find(name);
        return same == items->second.names.end() ? std::nullopt : std::optional(same->second);
    }

    int count_ = 0;
    std::optional<int> package_wildcard_;
    std::unordered_map<std::string_view, package_items> packages_;
};

class filter_linter {
 public:
    filter_linter(const part_content& part, const filter_kind& kind, const Filter& filter,
                  lint_findings& findings)
        : part_(part), kind_(kind), filter_(filter), findings_(findings) {
        const FieldDescriptor* field = FilterConfig::descriptor()->FindFieldByNumber(kind.field);
        filter_place_ = {part.path, line_of(part.places.get(), *field),
                         id_of(part) + " " + field->name()};
        if (part.places) places_ = part.places->GetTreeForNested(field, -1);
    }

    void lint() {
        lint_type();
        item_clashes clashes;
        for (int i = 0; i < filter_.item_size(); ++i) {
            const FilterItem& item = filter_.item(i);
            if (!item.has_package() || !item.has_name()) {
                add(i, std::string("lacks its ") + (item.has_package() ? "name" : "package") +
                           "; " + keeps_all);
                continue;
            }
            lint_texts(i);
            lint_marker(i);
            const std::optional<int> clash =
                clashes.add(up_to_nul(item.package()), up_to_nul(item.name()));
            if (!clash) continue;
            add(i, "stands for the same as item " + std::to_string(*clash + 1) + " (" +
                       text_of(*clash) + "); " + refused());
        }
        if (items_found_ > max_item_findings) {
            findings_.error(filter_place_, std::to_string(items_found_ - max_item_findings) +
                                               " more faults of items are not listed");
        }
        const size_t records = static_cast<size_t>(filter_.item_size()) + (excludes() ? 1 : 0);
        if (records >= max_list_records) {
            findings_.error(filter_place_,
                            "has " + std::to_string(records) +
                                " records; the daemon's list files have fewer than " +
                                std::to_string(max_list_records) + ", and " + lost_at_restart());
        }
    }

 private:
    [[nodiscard]] bool excludes() const {
        return filter_.has_type() && filter_.type() == Filter::EXCLUDE;
    }

    void lint_type() {
        const auto& unknown = filter_.GetReflection()->GetUnknownFields(filter_);
        for (int i = 0; i < unknown.field_count(); ++i) {
            const auto& field = unknown.field(i);
            if (field.number() != Filter::kTypeFieldNumber ||
                field.type() != google::protobuf::UnknownField::TYPE_VARINT) {
                continue;
            }
            findings_.error(filter_place_,
                            "its type, " + std::to_string(static_cast<int32_t>(field.varint())) +
                                ", is neither INCLUDE nor EXCLUDE; the daemon keeps no " +
                                kind_.things);
            return;
        }
        if (!filter_.has_type()) {
            findings_.error(filter_place_, std::string("lacks its type; ") + keeps_all);
        } else if (!excludes() && filter_.item_size() == 0) {
            findings_.warning(filter_place_,
                              std::string("includes nothing; the daemon keeps no ") + kind_.things);
        }
    }

    void lint_texts(int index) {
        const FilterItem& item = filter_.item(index);
        for (const auto& [what, text] :
             {std::pair("package", &item.package()), std::pair("name", &item.name())}) {
            if (up_to_nul(*text).size() < text->size()) {
                add(index, std::string("its ") + what +
                               " holds a NUL; the daemon reads it up to there only");
            } else if (text->empty()) {
                add(index, std::string("its ") + what +
                               " is empty; no probe has such a one, and at its next start the "
                               "daemon may skip the item");
            } else if (text->find(' ') != std::string::npos) {
                findings_.warning(place_of(index), std::string("its ") + what +
                                                       " holds a blank; no probe has such a one");
            }
        }
        const size_t size = item.package().size() + item.name().size() + record_overhead;
        if (size > max_list_record) {
            add(index, "makes a record of " + std::to_string(size) + " bytes; the daemon reads " +
                           std::to_string(max_list_record) + " at most, and " + lost_at_restart());
        }
    }

    void lint_marker(int index) {
        const std::string_view package = up_to_nul(filter_.item(index).package());
        const std::string_view name = up_to_nul(filter_.item(index).name());
        const bool is_marker = package == marker_package && name == marker_name;
        if (!excludes()) {
            if (is_marker) {
                add(index,
                    "is the daemon's mark of an EXCLUDE filter; at its next start the "
                    "daemon takes the filter for one");
            }
            return;
        }
        if (is_wildcard(package) || is_marker || (package == marker_package && is_wildcard(name))) {
            add(index, std::string("stands for __type exclude too, the daemon's mark of an EXCLUDE "
                                   "filter; ") +
                           refused());
        }
    }

    [[nodiscard]] std::string refused() const {
        return std::string("the daemon refuses the filter and keeps all ") + kind_.things +
               first_configuration();
    }

    [[nodiscard]] std::string lost_at_restart() const {
        return "at its next start it reads the filter up to there only and takes it for EXCLUDE" +
               first_configuration();
    }

    [[nodiscard]] std::string first_configuration() const {
        if (!kind_.is_of_events) return "";
        return "; at its next start it takes the system's first configuration, if there is one";
    }

    [[nodiscard]] std::string text_of(int index) const {
        const FilterItem& item = filter_.item(index);
        return printable(item.package(), shown_name) + " " + printable(item.name(), shown_name);
    }

    [[nodiscard]] lint_place place_of(int index) const {
        const FieldDescriptor* field =
            Filter::descriptor()->FindFieldByNumber(Filter::kItemFieldNumber);
        const int line = line_of(places_, *field, index);
        return {part_.path, line > 0 ? line : filter_place_.line,
                filter_place_.subject + " item " + std::to_string(index + 1) + " (" +
                    text_of(index) + ")"};
    }

    void add(int index, const std::string& text) {
        if (++items_found_ <= max_item_findings) findings_.error(place_of(index), text);
    }

    const part_content& part_;
    const filter_kind& kind_;
    const Filter& filter_;
    lint_findings& findings_;
    lint_place filter_place_;
    const TextFormat::ParseInfoTree* places_ = nullptr;
    size_t items_found_ = 0;
};

}  // namespace

void lint_filters(const part_content& part, lint_findings& findings) {
    FilterConfig config;
    if (!config.ParsePartialFromString(part.payload)) {
        findings.error({part.path, 0, id_of(part)}, keeps_all);
        return;
    }
    if (!config.has_event_filter()) {
        findings.warning({part.path, 0, id_of(part)},
                         "has no event_filter; the daemon keeps all events, and at its next start "
                         "it takes the system's first configuration, if there is one");
    }
    for (const filter_kind& kind : kinds) {
        const FieldDescriptor* field = FilterConfig::descriptor()->FindFieldByNumber(kind.field);
        if (!config.GetReflection()->HasField(config, field)) continue;
        const auto& filter =
            static_cast<const Filter&>(config.GetReflection()->GetMessage(config, field));
        filter_linter(part, kind, filter, findings).lint();
    }
}

}  // namespace kivd
