#include "kivtool/report/event_plot.h"

#include <algorithm>
#include <cinttypes>
#include <cstdarg>
#include <cstdio>
#include <functional>
#include <string_view>
#include <utility>

#include "kivtool/report/time_text.h"
#include "toolkit/text_escape.h"

namespace kivd {
namespace {

constexpr size_t max_steps = 400;
constexpr size_t max_packages = 1000;  // told apart while counting
constexpr size_t shown_packages = 8;
constexpr size_t shown_name = 28;  // characters
constexpr int64_t ms_per_minute = 60'000;
constexpr int64_t minutes_per_day = 1440;
constexpr int64_t year_2000_ms = 946684800000;
constexpr int64_t year_2100_ms = 4102444800000;

// The picture, in pixels.
constexpr int width = 1000;
constexpr int height = 420;
constexpr int left = 70;
constexpr int right = 770;
constexpr int top = 50;
constexpr int bottom = 360;
constexpr int legend_left = 790;
constexpr int line_height = 22;

// Told apart also by those who do not see all colours; the last one is for "other".
constexpr const char* colours[shown_packages + 1] = {"#0072b2", "#e69f00", "#009e73",
                                                     "#cc79a7", "#56b4e9", "#d55e00",
                                                     "#f0e442", "#332288", "#999999"};

// Text for between tags or in quotes. What XML cannot hold in any form becomes \xHH.
std::string xml_text(std::string_view text, size_t max_characters = 200) {
    std::string escaped;
    const std::string shown = printable(text, max_characters);
    for (size_t i = 0; i < shown.size(); ++i) {
        const std::string_view rest = std::string_view(shown).substr(i);
        if (rest.starts_with("\xef\xbf\xbe") || rest.starts_with("\xef\xbf\xbf")) {
            escaped += rest[2] == '\xbe' ? "\\xEF\\xBF\\xBE" : "\\xEF\\xBF\\xBF";
            i += 2;
        } else if (shown[i] == '&') {
            escaped += "&amp;";
        } else if (shown[i] == '<') {
            escaped += "&lt;";
        } else if (shown[i] == '>') {
            escaped += "&gt;";
        } else if (shown[i] == '"') {
            escaped += "&quot;";
        } else {
            escaped += shown[i];
        }
    }
    return escaped;
}

[[gnu::format(printf, 2, 3)]] void append(std::string& to, const char* format, ...) {
    va_list arguments, again;
    va_start(arguments, format);
    va_copy(again, arguments);
    const int size = vsnprintf(nullptr, 0, format, again);
    va_end(again);
    if (size > 0) {
        const size_t old_size = to.size();
        to.resize(old_size + static_cast<size_t>(size) + 1);
        vsnprintf(to.data() + old_size, static_cast<size_t>(size) + 1, format, arguments);
        to.pop_back();  // the NUL
    }
    va_end(arguments);
}

void append_label(std::string& svg, double x, double y, const char* anchor,
                  const std::string& escaped) {
    append(svg, "<text x=\"%.1f\" y=\"%.1f\" text-anchor=\"%s\">%s</text>\n", x, y, anchor,
           escaped.c_str());
}

void append_line(std::string& svg, double x1, double y1, double x2, double y2, const char* colour) {
    append(svg, "<line x1=\"%.1f\" y1=\"%.1f\" x2=\"%.1f\" y2=\"%.1f\" stroke=\"%s\"/>\n", x1, y1,
           x2, y2, colour);
}

// The smallest of 1, 2, 5 times a power of ten that is no smaller than `least`.
double round_up(double least) {
    double power = 1e-6;
    while (power * 10 <= least) power *= 10;
    for (const double factor : {1.0, 2.0, 5.0}) {
        if (factor * power >= least) return factor * power;
    }
    return 10 * power;
}

// From numbers of events and steps to the places where they are drawn.
struct scale {
    int64_t first;  // step
    size_t steps;
    int64_t minutes_per_step;
    double largest;  // events per minute at the top

    [[nodiscard]] double x(size_t step) const {
        return left + (right - left) * static_cast<double>(step) / static_cast<double>(steps);
    }
    [[nodiscard]] double x_of_minute(int64_t minute) const {
        const auto from_start = static_cast<double>(minute - first * minutes_per_step);
        return left + (right - left) * from_start /
                          (static_cast<double>(steps) * static_cast<double>(minutes_per_step));
    }
    [[nodiscard]] double y(double events_per_minute) const {
        return bottom - (bottom - top) * events_per_minute / largest;
    }
    [[nodiscard]] double y_of_events(uint64_t events) const {
        return y(static_cast<double>(events) / static_cast<double>(minutes_per_step));
    }
};

// In minutes, between the labels of the time axis.
constexpr int64_t label_steps[] = {
    1,
    2,
    5,
    10,
    15,
    30,
    60,
    120,
    180,
    360,
    720,
    minutes_per_day,
    2 * minutes_per_day,
    7 * minutes_per_day,
    14 * minutes_per_day,
    28 * minutes_per_day,
};

void append_time_axis(std::string& svg, const scale& to) {
    constexpr int64_t max_labels = 7;
    const int64_t start = to.first * to.minutes_per_step;
    const int64_t all = static_cast<int64_t>(to.steps) * to.minutes_per_step;
    int64_t step = label_steps[0];
    for (const int64_t each : label_steps) {
        step = each;
        if (all / step < max_labels) break;
    }
    while (all / step >= max_labels) step *= 2;

    int64_t day = -1;
    for (int64_t at = (start + step - 1) / step * step; at <= start + all; at += step) {
        const double x = to.x_of_minute(at);
        append_line(svg, x, bottom, x, bottom + 5, "#444");
        const bool has_hours = step < minutes_per_day;
        if (has_hours) {
            append_label(svg, x, bottom + 20, "middle", time_text(at * ms_per_minute, "%H:%M"));
        }
        if (at / minutes_per_day == day) continue;
        day = at / minutes_per_day;
        append_label(svg, x, bottom + (has_hours ? 37 : 20), "middle",
                     time_text(at * ms_per_minute, "%Y-%m-%d"));
    }
}

void append_rate_axis(std::string& svg, const scale& to) {
    const double step = round_up(to.largest / 5.5);
    for (int i = 0; i * step <= to.largest; ++i) {
        const double y = to.y(i * step);
        append_line(svg, left, y, right, y, i == 0 ? "#444" : "#ddd");
        append(svg, "<text x=\"%d\" y=\"%.1f\" text-anchor=\"end\">%g</text>\n", left - 8, y + 4,
               i * step);
    }
}

// The area between two rows of steps.
void append_area(std::string& svg, const scale& to, const std::vector<uint64_t>& lower,
                 const std::vector<uint64_t>& upper, const char* colour) {
    append(svg, "<path fill=\"%s\" d=\"M%.1f %.1f", colour, to.x(0), to.y_of_events(lower[0]));
    for (size_t i = 0; i < to.steps; ++i) {
        append(svg, "V%.1fH%.1f", to.y_of_events(upper[i]), to.x(i + 1));
    }
    for (size_t i = to.steps; i-- > 0;) {
        append(svg, "V%.1fH%.1f", to.y_of_events(lower[i]), to.x(i));
    }
    svg += "Z\">";
}

void append_legend_entry(std::string& svg, size_t index, const char* colour,
                         const std::string& escaped) {
    const int y = top + static_cast<int>(index) * line_height;
    append(svg, "<rect x=\"%d\" y=\"%d\" width=\"12\" height=\"12\" fill=\"%s\"/>\n", legend_left,
           y, colour);
    append_label(svg, legend_left + 18, y + 11, "start", escaped);
}

}  // namespace

event_plot::series& event_plot::find_series(const std::string& package) {
    const auto found = by_package_.find(package);
    if (found != by_package_.end()) return all_[found->second];
    if (all_.size() == max_packages) return others_;
    by_package_.emplace(package, all_.size());
    all_.push_back({package, 0, std::vector<uint32_t>(max_steps)});
    return all_.back();
}

// Two steps become one.
void event_plot::halve() {
    const bool is_odd = first_ % 2 != 0;
    const auto merge = [&](series& each) {
        if (each.steps.empty()) return;
        std::vector<uint32_t> merged(max_steps);
        for (size_t i = 0; i < steps_; ++i) merged[(i + (is_odd ? 1 : 0)) / 2] += each.steps[i];
        each.steps = std::move(merged);
    };
    std::ranges::for_each(all_, merge);
    merge(others_);
    steps_ = (steps_ + (is_odd ? 1 : 0) + 1) / 2;
    first_ /= 2;
    minutes_per_step_ *= 2;
}

// Gives the index of the step for a minute, which is none before 1970.
size_t event_plot::make_room(int64_t minute) {
    if (steps_ == 0) {
        first_ = minute;
        steps_ = 1;
    }
    int64_t step = minute / minutes_per_step_;
    const auto span = [&] {
        return std::max(step, first_ + static_cast<int64_t>(steps_) - 1) - std::min(step, first_) +
               1;
    };
    while (span() > static_cast<int64_t>(max_steps)) {
        halve();
        step = minute / minutes_per_step_;
    }
    const auto all_steps = static_cast<size_t>(span());
    if (step < first_) {
        const auto shift = static_cast<std::ptrdiff_t>(all_steps - steps_);
        const auto move = [shift](series& each) {
            std::shift_right(each.steps.begin(), each.steps.end(), shift);
            std::fill_n(each.steps.begin(), std::min<std::ptrdiff_t>(shift, std::ssize(each.steps)),
                        0u);
        };
        std::ranges::for_each(all_, move);
        move(others_);
        first_ = step;
    }
    steps_ = all_steps;
    return static_cast<size_t>(step - first_);
}

void event_plot::add(const kiv::Event& event) {
    if (event.timestamp() < year_2000_ms || event.timestamp() >= year_2100_ms) {
        ++not_drawn_;
        return;
    }
    const size_t step = make_room(event.timestamp() / ms_per_minute);
    series& its = find_series(event.package());
    if (its.steps.empty()) its.steps.resize(max_steps);
    ++its.events;
    ++its.steps[step];
}

// The packages with the most events; the events of the others go to `rest`.
std::vector<const event_plot::series*> event_plot::largest(series& rest) const {
    std::vector<const series*> sorted;
    for (const series& each : all_) sorted.push_back(&each);
    std::ranges::stable_sort(sorted, std::greater{}, &series::events);
    rest = others_;
    rest.steps.resize(max_steps);
    const auto add = [&rest](const series& each) {
        rest.events += each.events;
        for (size_t i = 0; i < each.steps.size(); ++i) rest.steps[i] += each.steps[i];
    };
    const size_t shown = std::min(sorted.size(), shown_packages);
    for (size_t i = shown; i < sorted.size(); ++i) add(*sorted[i]);
    sorted.resize(shown);
    return sorted;
}

std::string event_plot::svg() const {
    series rest;
    std::vector<const series*> shown = largest(rest);
    const size_t named = shown.size();
    if (rest.events > 0) shown.push_back(&rest);

    uint64_t events = 0;
    std::vector<uint64_t> upper(max_steps);
    for (const series* each : shown) {
        events += each->events;
        for (size_t i = 0; i < max_steps; ++i) upper[i] += each->steps[i];
    }
    const auto most = static_cast<double>(*std::ranges::max_element(upper));
    const scale to = {first_, std::max<size_t>(steps_, 1), minutes_per_step_,
                      most > 0 ? most / static_cast<double>(minutes_per_step_) * 1.05 : 1};

    std::string svg;
    append(svg,
           "<svg xmlns=\"http://www.w3.org/2000/svg\" viewBox=\"0 0 %d %d\""
           " font-family=\"sans-serif\" font-size=\"12\">\n"
           "<rect width=\"100%%\" height=\"100%%\" fill=\"white\"/>\n"
           "<text x=\"%d\" y=\"22\" font-size=\"16\">Events per minute by package</text>\n",
           width, height, left);
    append(svg, "<text x=\"%d\" y=\"40\">%" PRIu64 " events, times in UTC", left, events);
    if (minutes_per_step_ > 1) append(svg, ", steps of %" PRId64 " minutes", minutes_per_step_);
    if (not_drawn_ > 0) {
        append(svg, "; %" PRIu64 " with times before 2000 or after 2099 are not drawn", not_drawn_);
    }
    svg += "</text>\n";
    append_rate_axis(svg, to);
    if (events > 0) append_time_axis(svg, to);

    // From the top of the pile to its ground, so that the legend stands in the same order.
    for (size_t i = shown.size(); i-- > 0;) {
        const bool is_named = i < named;
        const char* colour = colours[is_named ? i : shown_packages];
        const std::string number = std::to_string(shown[i]->events);
        std::vector<uint64_t> lower = upper;
        for (size_t k = 0; k < max_steps; ++k) lower[k] -= shown[i]->steps[k];
        append_area(svg, to, lower, upper, colour);
        append(svg, "<title>%s: %s events</title></path>\n",
               is_named ? xml_text(shown[i]->package).c_str() : "other", number.c_str());
        append_legend_entry(
            svg, shown.size() - 1 - i, colour,
            (is_named ? xml_text(shown[i]->package, shown_name) : "other") + " (" + number + ")");
        upper = std::move(lower);
    }
    svg += "</svg>\n";
    return svg;
}

}  // namespace kivd
