// What a daemon goes through while it is tortured.
#pragma once

#include <functional>
#include <random>

#include "reliability/torture/promises.h"

namespace kivd {

// In the current directory: the keys and the configuration of all lives.
void make_materials();
// A place in the current directory, with what an unhappy life may have left. Enters it.
void make_place(journal& noted);

// A short life, always the same, in which the daemon changes files in all of its ways. Goes with it
// from step to step, until the last or until it doesn't answer.
inline constexpr size_t life_steps = 8;
void live(
    daemon_process& daemon, journal& noted,
    const std::function<void(size_t)>& before_step = [](size_t) {});

// Kills at random moments, some of them with the children, while clients of all kinds send and
// flush. Gives the daemon that has taken up what the last one left.
inline constexpr int kills_under_load = 5;
daemon_process kill_under_load(std::minstd_rand random, journal& noted);

}  // namespace kivd
