#include "kivtool/config/config_lint.h"

#include <google/protobuf/stubs/logging.h>

#include <random>
#include <span>
#include <sstream>

#include "config.pb.h"
#include "config/config_parts.h"
#include "config/filters.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

std::string found_in(std::span<const part_content> parts, bool* has_errors = nullptr) {
    const google::protobuf::LogSilencer silencer;
    lint_findings findings;
    lint_config(parts, "all", findings);
    if (has_errors) *has_errors = findings.has_errors();
    std::ostringstream text;
    findings.print(text);
    return text.str();
}

std::string found_in_filters(const std::string& payload, bool* has_errors = nullptr) {
    const part_content part = {"kivd", "FilterConfig", payload, "f", nullptr};
    return found_in({&part, 1}, has_errors);
}

bool says(const std::string& text, const std::string& part) {
    return text.find(part) != std::string::npos;
}

// The daemon judges: its own filters are made of what was looked over.
class config_lint : public scratch_directory {
 protected:
    struct verdict {
        bool is_used;
        bool outlives_restart;  // and is still the same
    };

    static verdict take(const std::string& payload) {
        store_config_part("kivd", "FilterConfig",
                          {reinterpret_cast<const uint8_t*>(payload.data()), payload.size()});
        apply_filter_config();
        const bool is_used = exists("private/filters.txt");
        const std::string before = kept();
        release_filters();
        return {is_used, load_filters() && kept() == before};
    }

    static std::string kept() {
        std::string names;
        for (const std::string& package : packages) {
            for (const std::string& name : names_of_probes) {
                names +=
                    filter_match(filter_kind::events, package.c_str(), name.c_str()) ? '1' : '0';
            }
        }
        return names;
    }

    static inline const std::vector<std::string> packages = {
        "a", "b", "__type", "", "*", "*x", std::string(1019, 'p')};
    static inline const std::vector<std::string> names_of_probes = {"x", "yy", "exclude",
                                                                    "",  "*",  "*z"};
};

TEST_F(config_lint, of_filters_knows_what_the_daemon_refuses_or_forgets) {
    std::mt19937 random;  // the same each time
    const auto one_of = [&random](const std::vector<std::string>& texts) {
        return texts[random() % texts.size()];
    };
    int refused = 0;
    int clean = 0;
    for (int round = 0; round < 4000; ++round) {
        kiv::config::FilterConfig config;
        auto& filter = *config.mutable_event_filter();
        filter.set_type(random() % 2 ? kiv::config::Filter::INCLUDE : kiv::config::Filter::EXCLUDE);
        for (size_t items = random() % 4; items > 0; --items) {
            auto& item = *filter.add_item();
            item.set_package(one_of(packages));
            item.set_name(one_of(names_of_probes));
        }
        SCOPED_TRACE(config.ShortDebugString());
        bool has_errors = false;
        const std::string found = found_in_filters(config.SerializeAsString(), &has_errors);
        const verdict judged = take(config.SerializeAsString());
        EXPECT_EQ(judged.is_used, !says(found, "the daemon refuses the filter")) << found;
        EXPECT_TRUE(has_errors || judged.outlives_restart) << found;
        refused += !judged.is_used;
        clean += !has_errors;
    }
    EXPECT_GT(refused, 500);
    EXPECT_GT(clean, 500);
}

TEST_F(config_lint, of_filters_knows_how_much_the_daemon_reads_back) {
    constexpr auto include = kiv::config::Filter::INCLUDE, exclude = kiv::config::Filter::EXCLUDE;
    const struct {
        kiv::config::Filter::Type type;
        int items;
        size_t package;
        bool is_read_back;
    } cases[] = {
        {include, 19999, 1, true},  {include, 20000, 1, false}, {exclude, 19998, 1, true},
        {exclude, 19999, 1, false}, {include, 1, 1019, true},   {include, 1, 1020, false},
    };
    for (const auto& each : cases) {
        kiv::config::FilterConfig config;
        config.mutable_event_filter()->set_type(each.type);
        for (int i = 0; i < each.items; ++i) {
            auto& item = *config.mutable_event_filter()->add_item();
            item.set_package(std::string(each.package, 'p'));
            item.set_name(std::to_string(i));
        }
        const std::string found = found_in_filters(config.SerializeAsString());
        EXPECT_EQ(found.empty(), each.is_read_back) << each.items << found;
        EXPECT_EQ(take(config.SerializeAsString()).outlives_restart, each.is_read_back);
    }
}

TEST(config_lint_findings, say_where_and_what_the_daemon_does) {
    const std::string filters = "\x0a\x02\x08\x02";  // excludes nothing
    const std::string filter_part = "kivd:FilterConfig", settings = "kivd:Settings";
    const std::string n1006(1006, 'n'), nul(1, '\0');
    const struct {
        std::vector<std::pair<std::string, std::string>> parts;  // "package:name", payload
        std::string found;                                       // empty: nothing
    } cases[] = {
        {{}, ""},
        {{{"p:n", ""}}, ""},
        {{{"p:" + n1006, ""}}, ""},  // 1007 bytes in all
        {{{"p:" + n1006 + "n", ""}}, "...: package and name make a record of up to 1025"},
        {{{"p:" + n1006 + "nnnnnnnnnn", ""}}, "make a record of 1025 bytes; the daemon"},
        {{{"p:", ""}}, "f: error: p:: its name is empty"},
        {{{":n", ""}}, "f: error: :n: its package is empty"},
        {{{"p:n m", ""}}, "f: warning: p:n m: its name holds a blank"},
        {{{"p:n" + nul, ""}}, "f: error: p:n\\x00: its name holds a NUL"},
        {{{"p:n" + nul, ""}, {"p:n", ""}}, "f: error: p:n: is given twice"},
        {{{"kivd:_last_id", ""}}, "error: kivd:_last_id: is the daemon's own name"},
        {{{"shop:_last_id", ""}}, ""},
        {{{"kivd:Setings", ""}}, "error: kivd:Setings: the daemon does not know it, is Settings"},
        {{{"kivd:runactionsonce", ""}}, "is RunActionsOnce meant?"},
        {{{"kivd:Menu", ""}}, "warning: kivd:Menu: the daemon does not know it"},
        {{{settings, "\x08\x80\x80\xc0\x02"}}, ""},  // 5242880, the other's default
        {{{settings, "\x08\x81\x80\xc0\x02"}},
         "max_report_size, 5242881, is above max_output_dir_size, 5242880 unless given; the "
         "daemon"},
        {{{settings, "\x10\xff\xff\x18"}},
         "409600 unless given, is above max_output_dir_size, 409599;"},
        {{{settings, "\x08"}}, "error: kivd:Settings: cannot be decoded; the daemon returns"},
        {{{"kivd:RunActions", "\x08"}}, "kivd:RunActions: cannot be decoded; the daemon leaves"},
        {{{settings, "\x18\x01"}, {"kivd:RunActionsOnce", "\x08\x01"}},
         "error: kivd:Settings: permanently_disable together with remove_reports"},
        {{{settings, "\x18\x01"}, {"kivd:RunActionsOnce", "\x08" + nul}}, ""},
        {{{filter_part, ""}},
         "f: warning: kivd:FilterConfig: has no event_filter; the daemon keeps"},
        {{{filter_part, "\x0a"}},
         "cannot decode the part, resets all filters and keeps everything"},
        {{{filter_part, "\x0a\x02\x08\x03"}},
         "event_filter: its type, 3, is neither INCLUDE nor EXCLUDE; the daemon"},
        {{{filter_part, "\x0a" + nul}}, "event_filter: lacks its type; the daemon cannot decode"},
        {{{filter_part, filters + "\x12\x02\x08\x01"}},
         "counter_filter: includes nothing; the daemon keeps no counters"},
        {{{filter_part,
           "\x0a\x09\x08\x02\x12\x05\x0a\x03"
           "a\xff\x20"}},
         "item 1 (a\\xFF  ): lacks its name; the daemon cannot"},
        {{{filter_part,
           "\x0a\x0c\x08\x02\x12\x08\x0a\x03"
           "a b\x12\x01n"}},
         "warning: kivd:FilterConfig event_filter item 1 (a b n)"},
    };
    for (const auto& each : cases) {
        std::vector<part_content> parts;
        for (const auto& [id, payload] : each.parts) {
            const size_t colon = id.find(':');
            parts.push_back({id.substr(0, colon), id.substr(colon + 1), payload, "f", nullptr});
        }
        if (each.parts.empty() || each.parts[0].first != filter_part) {
            parts.push_back({"kivd", "FilterConfig", filters, "f", nullptr});
        }
        const std::string found = found_in(parts);
        EXPECT_TRUE(each.found.empty() ? found.empty() : says(found, each.found))
            << found << "\nnot " << each.found;
    }

    std::vector<part_content> many;
    many.push_back({"kivd", "FilterConfig", filters, "f", nullptr});
    while (many.size() < 19'999) {
        many.push_back({"p", std::to_string(many.size()), "", "f", nullptr});
    }
    EXPECT_EQ(found_in(many), "");
    many.push_back({"p", "last", "", "f", nullptr});
    EXPECT_TRUE(says(found_in(many), "all: error: there are 20000 parts"));
    EXPECT_TRUE(
        says(found_in({}), "all: warning: there is no kivd:FilterConfig; the daemon keeps"));
}

}  // namespace
}  // namespace kivd
