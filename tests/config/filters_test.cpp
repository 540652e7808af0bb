#include "config/filters.h"

#include "intake/intake.h"
#include "settings.pb.h"
#include "store/counters.h"
#include "store/events.h"
#include "store/static_data.h"
#include "support/config_package.h"
#include "support/scratch_directory.h"

namespace kivd {
namespace {

class filters : public scratch_directory {
 protected:
    void take(const std::vector<config_part>& parts) {
        (void)take_log();
        write_file("input/config", config_file(parts));
        ASSERT_TRUE(take_new_configuration());
    }
    void take_filter(const std::string& text) {
        take({own_part<kiv::config::FilterConfig>("FilterConfig", text)});
    }
};

std::string item(const std::string& package, const std::string& name) {
    return "item { package: '" + package + "' name: '" + name + "' } ";
}

// Which of a few probes the event filter keeps.
std::string kept() {
    std::string names;
    for (const char* package : {"o", "p", "q"}) {
        for (const char* name : {"x", "y"}) {
            if (filter_match(filter_kind::events, package, name)) {
                names += package + std::string(name) + " ";
            }
        }
    }
    return names;
}

constexpr char everything[] = "ox oy px py qx qy ";

TEST_F(filters, lists_and_wildcards_say_what_is_kept_after_a_restart_too) {
    const std::pair<std::string, std::string> cases[] = {
        {"type: INCLUDE " + item("p", "x") + item("q", "y"), "px qy "},
        {"type: EXCLUDE " + item("p", "x") + item("q", "y"), "ox oy py qx "},
        {"type: INCLUDE " + item("q", "x") + item("p", "*all"), "px py qx "},
        {"type: EXCLUDE " + item("p", "*"), "ox oy qx qy "},
        {"type: INCLUDE " + item("*", "none"), everything},
        {"type: INCLUDE", ""},
        {"type: EXCLUDE", everything},
    };
    EXPECT_EQ(kept(), everything);
    for (const auto& [filter, expected] : cases) {
        SCOPED_TRACE(filter);
        take_filter("event_filter { " + filter + " }");
        EXPECT_EQ(kept(), expected);
        restart();
        EXPECT_EQ(kept(), expected);
        EXPECT_EQ(take_log(), lines());
    }
    EXPECT_EQ(read_file("private/filters.txt"), "__type\0exclude\0\0\n"s);
    EXPECT_FALSE(filter_match(filter_kind::events, "__type", "exclude"));

    take_filter(doc_example("configuration.md", "text", "filters"));
    EXPECT_EQ(read_file("private/filters.txt"), doc_example("files.md", "hex", "filters-file"));
}

TEST_F(filters, what_cannot_be_built_accepts_everything) {
    const std::string failed_item = "E kivd-filter: Failed adding probe <p><";
    const std::string not_activated = "> to filter, new probe filter not activated!";
    const std::pair<std::string, lines> cases[] = {
        {"type: INCLUDE " + item("q", "y") + item("p", "x") + item("a", "") + item("p", "x") +
             item("q", "*"),
         {"W kivd-list: list_add: Duplicate found!", failed_item + "x" + not_activated}},
        {"type: INCLUDE " + item("*", "") + item("p", "z") + item("o", "z"),
         {"W kivd-list: list_add: Duplicate found!", failed_item + "z" + not_activated}},
        {"type: EXCLUDE " + item("*", "*"),
         {"W kivd-list: list_add: Duplicate found!",
          "E kivd-filter: Failed adding exclude filter, new probe filter not activated!"}},
    };
    for (const auto& [filter, expected] : cases) {
        SCOPED_TRACE(filter);
        take_filter("event_filter { type: INCLUDE }");
        EXPECT_EQ(kept(), "");
        take_filter("event_filter { " + filter + " }");
        EXPECT_EQ(take_log(), expected);
        EXPECT_EQ(kept(), everything);
        EXPECT_FALSE(exists("private/filters.txt"));
    }
    for (const config_part& part :
         {config_part{"app", "other", ""}, config_part{"kivd", "FilterConfig", "\xff"},
          config_part{"kivd", "FilterConfig", ""}}) {
        take_filter("event_filter { type: INCLUDE }");
        take({part});
        EXPECT_EQ(kept(), everything);
        EXPECT_FALSE(exists("private/filters.txt"));
    }
    take({{"kivd", "FilterConfig", "\x0a\x02\x08\x07"}});  // a type that nobody knows
    EXPECT_EQ(kept(), "");
    take_filter("event_filter { type: INCLUDE }");
    fs::create_directory("private/filters.txt_");
    take_filter("event_filter { type: INCLUDE }");
    EXPECT_EQ(kept(), everything);
}

TEST_F(filters, each_store_asks_its_own) {
    take_filter("event_filter { type: EXCLUDE " + item("p", "e") +
                " } counter_filter { type: EXCLUDE " + item("p", "c") +
                " } staticdata_filter { type: EXCLUDE " + item("p", "s") + " }");
    for (const char* name : {"e", "c", "s"}) {
        (void)events_add("p", name, std::string_view("data"));
        counters_update("p", name, 1, counter_mode::set, 0);
        static_data_set("p", name, "value", 0);
    }
    EXPECT_EQ(contents(next_report()), "P1; c data; s data; e=1; s=1; c: value; e: value; ");

    take_filter("counter_filter { type: INCLUDE " + item("p", "") + " }");
    EXPECT_TRUE(filter_match(filter_kind::events, "p", "e"));
    EXPECT_FALSE(filter_match(filter_kind::counters, "p", "c"));
    EXPECT_TRUE(filter_match(filter_kind::counters, "p", ""));
    (void)take_log();
    restart();  // a record without a name cannot be read back
    EXPECT_EQ(take_log(), lines({"E kivd-filter: Failed to parse config line."}));
    EXPECT_FALSE(filter_match(filter_kind::counters, "p", ""));
}

}  // namespace
}  // namespace kivd
