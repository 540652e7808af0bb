#include "bench/measure.h"

#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdarg>
#include <cstdio>
#include <ctime>

namespace kivd::bench {

namespace {

// Three or four digits, whatever the size.
void format_value(char* text, size_t size, double value) {
    const double magnitude = std::fabs(value);
    const int decimals = magnitude >= 100 ? 0 : magnitude >= 10 ? 1 : magnitude >= 1 ? 2 : 3;
    (void)snprintf(text, size, "%.*f", decimals, value);
}

void print_goal(double value, goal wanted) {
    const bool at_most = wanted.kind == bound::at_most;
    const bool met = at_most ? value <= wanted.limit : value >= wanted.limit;
    char ratio[32] = "-";
    if (wanted.limit != 0) (void)snprintf(ratio, sizeof ratio, "%.2f", value / wanted.limit);
    printf("   %2s %6g %6s  %s", at_most ? "<=" : ">=", wanted.limit, ratio,
           met ? "met" : "MISSED");
}

}  // namespace

int64_t now_ns() {
    timespec now{};
    (void)clock_gettime(CLOCK_MONOTONIC, &now);
    return int64_t{now.tv_sec} * 1'000'000'000 + now.tv_nsec;
}

double median(std::vector<double> values) {
    if (values.empty()) return 0;
    std::ranges::sort(values);
    const size_t middle = values.size() / 2;
    if (values.size() % 2 == 1) return values[middle];
    return (values[middle - 1] + values[middle]) / 2;
}

double percentile(std::vector<double> values, double percent) {
    if (values.empty()) return 0;
    std::ranges::sort(values);
    const double rank = std::ceil(percent / 100 * static_cast<double>(values.size()));
    const size_t position = rank < 1 ? 0 : static_cast<size_t>(rank) - 1;
    return values[std::min(position, values.size() - 1)];
}

std::vector<double> ratios(const std::vector<double>& of, const std::vector<double>& to) {
    std::vector<double> result;
    for (size_t i = 0; i < of.size() && i < to.size(); ++i) result.push_back(of[i] / to[i]);
    return result;
}

void print_section(const char* title) {
    printf("\n%s\n%-52s %10s %-6s %21s %10s %6s\n", title, "measure", "median", "", "(min .. max)",
           "goal", "ratio");
    (void)fflush(stdout);
}

void print_row(const char* measure, const std::vector<double>& samples, const char* unit,
               goal wanted) {
    if (samples.empty()) {
        printf("%-52s %10s\n", measure, "not taken");
        return;
    }
    const double value = median(samples);
    char middle[32];
    char low[32];
    char high[32];
    format_value(middle, sizeof middle, value);
    format_value(low, sizeof low, std::ranges::min(samples));
    format_value(high, sizeof high, std::ranges::max(samples));
    printf("%-52s %10s %-6s %8s .. %9s", measure, middle, unit, low, high);
    if (wanted.kind != bound::none) print_goal(value, wanted);
    printf("\n");
    (void)fflush(stdout);
}

void print_note(const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    printf("  ");
    vprintf(format, arguments);
    printf("\n");
    va_end(arguments);
    (void)fflush(stdout);
}

void give_up(const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    fprintf(stderr, "kivd_bench: ");
    vfprintf(stderr, format, arguments);
    fprintf(stderr, "\n");
    va_end(arguments);
    (void)fflush(stdout);
    _exit(1);
}

}  // namespace kivd::bench
