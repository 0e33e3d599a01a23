// The table of ratios.
#ifndef MAVOEA_BENCH_RATIOS_H_
#define MAVOEA_BENCH_RATIOS_H_

#include <vector>

#include "bench/rows.h"

namespace mavoea::bench {

// Measures the rows and prints a line for each: both times, their ratio and whether it meets its
// aim. Library and floor take turns, and the ratio is the median of those of the pairs: what else
// the machine does meets both.
void PrintRatios(const std::vector<Row>& rows);

}  // namespace mavoea::bench

#endif  // MAVOEA_BENCH_RATIOS_H_
