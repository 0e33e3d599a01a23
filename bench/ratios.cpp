#include "bench/ratios.h"

#include <time.h>

#include <algorithm>
#include <cstdio>
#include <iterator>
#include <string>

namespace mavoea::bench {
namespace {

// A go takes at least this long, in seconds, or the clock would be measured.
constexpr double kShortestGo = 0.0003;
// How long a row is measured, in seconds, and the fewest and most pairs that takes.
constexpr double kRowTime = 0.8;
constexpr std::size_t kFewestPairs = 5;
constexpr std::size_t kFewestLongPairs = 3;  // when a pair takes longer than a row should
constexpr std::size_t kMostPairs = 1001;

double Now(clockid_t clock) {
    timespec now;
    clock_gettime(clock, &now);
    return static_cast<double>(now.tv_sec) + 1e-9 * static_cast<double>(now.tv_nsec);
}

// What the work takes, on the clock that the row asks for.
double Time(const Row& row, const Work& work, std::int64_t times) {
    const clockid_t clock = row.waits ? CLOCK_MONOTONIC : CLOCK_THREAD_CPUTIME_ID;
    const double start = Now(clock);
    work(times);
    return Now(clock) - start;
}

struct Pair {
    double library = 0;
    double floor = 0;
};

Pair MeasureConsumed(const Row& row, bool library_first) {
    Pair pair;
    if (library_first) pair.library = Time(row, row.library(), row.batch);
    pair.floor = Time(row, row.floor(), row.batch);
    if (!library_first) pair.library = Time(row, row.library(), row.batch);
    return pair;
}

Pair MeasurePair(const Row& row, const Work& library, const Work& floor, std::int64_t batch,
                 bool library_first) {
    if (row.consumes) return MeasureConsumed(row, library_first);
    Pair pair;
    for (int i = 0; i < row.goes; ++i) {
        if (library_first) pair.library += Time(row, library, batch);
        pair.floor += Time(row, floor, batch);
        if (!library_first) pair.library += Time(row, library, batch);
    }
    return pair;
}

// How often the work fits in a go.
std::int64_t BatchFor(const Row& row, const Work& library, const Work& floor) {
    for (std::int64_t batch = 1;; batch *= 2) {
        if (std::min(Time(row, library, batch), Time(row, floor, batch)) >= kShortestGo) {
            return batch;
        }
    }
}

// `values` must be sorted.
double Quantile(const std::vector<double>& values, double part) {
    return values[static_cast<std::size_t>(part * static_cast<double>(values.size() - 1) + 0.5)];
}

std::vector<double> Sorted(const std::vector<Pair>& pairs, double (*value)(const Pair&)) {
    std::vector<double> values;
    for (const Pair& pair : pairs) values.push_back(value(pair));
    std::sort(values.begin(), values.end());
    return values;
}

std::string TimeText(double seconds) {
    struct {
        double size;
        const char* name;
    } const units[] = {{1, "s"}, {1e-3, "ms"}, {1e-6, "us"}, {1e-9, "ns"}};
    const auto* unit = units;
    while (seconds < unit->size && unit + 1 != std::end(units)) ++unit;
    char text[32];
    snprintf(text, sizeof text, "%.3g %s", seconds / unit->size, unit->name);
    return text;
}

void PrintRow(const Row& row, const std::vector<Pair>& pairs, double times) {
    const auto ratios = Sorted(pairs, [](const Pair& pair) { return pair.library / pair.floor; });
    const auto library = Sorted(pairs, [](const Pair& pair) { return pair.library; });
    const auto floor = Sorted(pairs, [](const Pair& pair) { return pair.floor; });
    const double ratio = Quantile(ratios, 0.5);
    printf("%-48s %-7s %9s %9s %6.2f  %5.2f-%-5.2f %5zu %5.2f  %s\n", row.work.c_str(),
           row.where.c_str(), TimeText(Quantile(library, 0.5) / times).c_str(),
           TimeText(Quantile(floor, 0.5) / times).c_str(), ratio, Quantile(ratios, 0.25),
           Quantile(ratios, 0.75), pairs.size(), row.aim, ratio <= row.aim ? "met" : "MISSED");
    fflush(stdout);
}

void MeasureRow(const Row& row) {
    const Work library = row.consumes ? Work() : row.library();
    const Work floor = row.consumes ? Work() : row.floor();
    const std::int64_t batch = row.batch != 0 ? row.batch : BatchFor(row, library, floor);

    std::vector<Pair> pairs;
    const double start = Now(CLOCK_MONOTONIC);
    while (pairs.size() < kMostPairs) {
        const double spent = Now(CLOCK_MONOTONIC) - start;
        const std::size_t fewest =
            spent > kRowTime * static_cast<double>(pairs.size()) ? kFewestLongPairs : kFewestPairs;
        if (spent >= kRowTime && pairs.size() >= fewest) break;
        pairs.push_back(MeasurePair(row, library, floor, batch, pairs.size() % 2 == 0));
    }
    PrintRow(row, pairs, static_cast<double>(batch) * row.goes);
}

}  // namespace

void PrintRatios(const std::vector<Row>& rows) {
    printf("%-48s %-7s %9s %9s %6s  %-11s %5s %5s\n", "work", "where", "library", "floor", "ratio",
           "middle half", "pairs", "aim");
    for (const Row& row : rows) MeasureRow(row);
}

}  // namespace mavoea::bench
