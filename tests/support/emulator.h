// Tests of a cross-compiled build run in an emulator, which does not show everything.
#ifndef MAVOEA_TESTS_SUPPORT_EMULATOR_H_
#define MAVOEA_TESTS_SUPPORT_EMULATOR_H_

#include <gtest/gtest.h>
#include <stdlib.h>

namespace mavoea::test {

// Whether the programs of this build are started with another one: MAVOEA_EMULATOR is its name and
// arguments, and empty where they run by themselves.
inline constexpr bool kEmulated = sizeof MAVOEA_EMULATOR > 1;

// Of the longest series only each seventh step is taken in an emulator, which takes some thirty
// times as long; 7 has no factor in common with the sizes of fields.
inline constexpr int kEmulatedSeriesStep = 7;
inline constexpr int kSeriesStep = kEmulated ? kEmulatedSeriesStep : 1;

// How many rounds two processes race; the environment may ask for more.
inline int RaceRounds(int usual) {
    const char* const asked = getenv("MAVOEA_RACE_ROUNDS");
    if (asked != nullptr) return atoi(asked);
    return kEmulated ? usual / 10 : usual;
}

// qemu makes a fork of what is to share its parent's memory.
inline constexpr char kNoSpawnErrors[] =
    "the emulator does not bring back from posix_spawn() why a program cannot be started";

}  // namespace mavoea::test

#define MAVOEA_SKIP_IN_EMULATOR(why) \
    if (::mavoea::test::kEmulated) GTEST_SKIP() << "not in an emulator: " << (why)

#endif  // MAVOEA_TESTS_SUPPORT_EMULATOR_H_
