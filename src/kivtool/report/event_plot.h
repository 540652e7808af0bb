// A picture of how many events came when, by package.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <unordered_map>
#include <vector>

#include "report.pb.h"

namespace kivd {

// Counts events in steps of time, at first minutes. Steps become longer, twice as long each time,
// as the events span more time, so that the picture stays readable and what is kept stays small.
class event_plot {
 public:
    void add(const kiv::Event& event);

    // The picture as SVG: stacked steps in events per minute, the packages with the most events
    // each in a colour, all others as "other"; a legend with names and numbers; times in UTC.
    // Events whose clock was not set (before 2000, or from 2100 on) are only counted.
    [[nodiscard]] std::string svg() const;

 private:
    // Events of a package, or of all others, in each step from the first one kept on.
    struct series {
        std::string package;
        uint64_t events = 0;
        std::vector<uint32_t> steps;
    };

    series& find_series(const std::string& package);
    size_t make_room(int64_t minute);
    void halve();
    std::vector<const series*> largest(series& rest) const;

    std::unordered_map<std::string, size_t> by_package_;
    std::vector<series> all_;
    series others_;  // of packages beyond the first that came
    int64_t minutes_per_step_ = 1;
    int64_t first_ = 0;  // step, counted from 1970
    size_t steps_ = 0;   // in use; 0: no event yet
    uint64_t not_drawn_ = 0;
};

}  // namespace kivd
