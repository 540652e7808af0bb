#include "kivtool/config/config_lint.h"

#include <google/protobuf/stubs/logging.h>
#include <gtest/gtest.h>

#include <span>
#include <sstream>

#include "config.pb.h"

namespace kivd {
namespace {

std::string found_in(std::span<const part_content> parts) {
    const google::protobuf::LogSilencer silencer;
    lint_findings findings;
    lint_config(pack_parts(parts).SerializeAsString(), parts, "all", findings);
    std::ostringstream text;
    findings.print(text);
    return text.str();
}

bool says(const std::string& text, const std::string& part) {
    return text.find(part) != std::string::npos;
}

// An event filter of numbered items, the last of which is given.
std::string numbered_filter(kiv::config::Filter::Type type, int items, const std::string& package,
                            const std::string& name) {
    kiv::config::FilterConfig config;
    auto& filter = *config.mutable_event_filter();
    filter.set_type(type);
    for (int i = 1; i <= items; ++i) {
        auto& item = *filter.add_item();
        item.set_package(i < items ? "numbered" : package);
        item.set_name(i < items ? std::to_string(i) : name);
    }
    return config.SerializeAsString();
}

TEST(config_lint, of_filters_finds_what_does_not_outlive_a_start) {
    constexpr auto include = kiv::config::Filter::INCLUDE, exclude = kiv::config::Filter::EXCLUDE;
    const struct {
        std::string filter, found;  // empty: nothing
    } cases[] = {
        {numbered_filter(include, 19'999, "p", "n"), ""},
        {numbered_filter(exclude, 19'998, "p", "n"), ""},
        {numbered_filter(include, 20'000, "p", "n"), "Too many items in a filter: 20000"},
        {numbered_filter(exclude, 19'999, "p", "n"), "Too many items in a filter: 19999"},
        {numbered_filter(include, 1, std::string(1019, 'p'), "n"), ""},
        {numbered_filter(include, 1, std::string(1020, 'p'), "n"), "Too long filter item <ppp"},
        {numbered_filter(include, 2, "__type", "exclude"), "(numbered 1): from its next start on"},
        {numbered_filter(exclude, 1, "*", "*"), "new probe filter not activated!"},
        {numbered_filter(include, 1, "*", "*"), ""},
    };
    for (const auto& each : cases) {
        const part_content part = {"kivd", "FilterConfig", each.filter, "f", nullptr};
        const std::string found = found_in({&part, 1});
        EXPECT_TRUE(each.found.empty() ? found.empty() : says(found, each.found))
            << found << "\nnot " << each.found;
    }
}

TEST(config_lint, says_where_and_what_the_daemon_does) {
    const std::string filters = "\x0a\x02\x08\x02";  // excludes nothing
    const std::string filter_part = "kivd:FilterConfig", settings = "kivd:Settings";
    const std::string n1006(1006, 'n'), nul(1, '\0');
    const struct {
        std::vector<std::pair<std::string, std::string>> parts;  // "package:name", payload
        std::string found;                                       // empty: nothing
    } cases[] = {
        {{}, ""},
        {{{"p:" + n1006, ""}}, ""},  // 1007 bytes in all
        {{{"p:" + n1006 + "n", ""}}, "...: package and name make a record of up to 1025"},
        {{{"p:" + n1006 + "nnnnnnnnnn", ""}}, "Too long name of part"},
        {{{":n", ""}}, "f: error: :n: its package is empty"},
        {{{"p:n m", ""}}, "f: warning: p:n m: its name holds a blank"},
        {{{"p:n" + nul, ""}}, "f: error: p:n\\x00: its name holds a NUL"},
        {{{"p:n" + nul, ""}, {"p:n", ""}}, "f: error: p:n: is given twice"},
        {{{"kivd:_last_id", ""}}, "all: error: the daemon logs \"kivd-conf: Skipped part with"},
        {{{"kivd:Setings", ""}}, "error: kivd:Setings: the daemon does not know it, is Settings"},
        {{{"kivd:runactionsonce", ""}}, "is RunActionsOnce meant?"},
        {{{settings, "\x08\x80\x80\xc0\x02"}}, ""},  // 5242880, the other's default
        {{{settings, "\x08\x81\x80\xc0\x02"}},
         "f: error: kivd:Settings: the daemon logs \"kivd-settings: Bad settings found"},
        {{{settings, "\x10\xff\xff\x18"}},
         "report_max_size (409600) > output_dir_max_size (409599). Default"},
        {{{settings, "\x08"}},
         "error: kivd:Settings: cannot be decoded as kivd.Settings; the daemon"},
        {{{settings, "\x18\x01"}, {"kivd:RunActionsOnce", "\x08\x01"}},
         "error: kivd:Settings: permanently_disable together with remove_reports"},
        {{{filter_part, ""}}, "all: warning: there is no filter of events that outlives a start"},
        {{{filter_part, "\x0a"}},
         "error: kivd:FilterConfig: cannot be decoded as kiv.config.FilterConfig"},
        {{{filter_part, "\x0a\x02\x08\x03"}},
         "kivd:FilterConfig event_filter: the daemon keeps no events"},
        {{{filter_part, "\x0a" + nul}}, "lacks event_filter.type; the daemon goes on without it"},
        {{{filter_part, filters + "\x12\x02\x08\x01"}},
         "counter_filter: the daemon keeps no counters"},
        {{{filter_part,
           "\x0a\x09\x08\x02\x12\x05\x0a\x03"
           "a\xff\x20"}},
         "lacks event_filter.item[0].name; the daemon goes on"},
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
    EXPECT_TRUE(says(found_in(many), "Too many parts: 20000, of at most 19999"));
    EXPECT_TRUE(says(found_in({}), "all: warning: there is no filter of events"));
}

}  // namespace
}  // namespace kivd
