// Runs the benchmarks: with --ratios as one table, otherwise as Google Benchmark does.

#include <benchmark/benchmark.h>
#include <linux/magic.h>
#include <sys/vfs.h>

#include <cstdio>
#include <exception>
#include <filesystem>
#include <optional>
#include <regex>
#include <string>
#include <string_view>
#include <vector>

#include "bench/ratios.h"
#include "bench/rows.h"

namespace mavoea::bench {
namespace {

constexpr char kUsage[] =
    "usage: mavoea_bench [--ratios] [--disk=DIR] [--tmpfs=DIR] [--benchmark_filter=REGEX] ...\n"
    "\n"
    "  --ratios      print one table: each piece of work, done by the library and by hand in "
    "turns\n"
    "  --disk=DIR    a directory on a disk; by default that of this program\n"
    "  --tmpfs=DIR   a directory on a tmpfs; by default /dev/shm\n"
    "\n"
    "All other options are Google Benchmark's. Aims that a ratio misses are no failure.\n";

struct Options {
    bool ratios = false;
    std::string disk;
    std::string tmpfs = "/dev/shm";
};

// The value of `argument` when it is the option `name` ("--disk=").
std::optional<std::string> ValueOf(std::string_view argument, std::string_view name) {
    if (!argument.starts_with(name)) return std::nullopt;
    return std::string(argument.substr(name.size()));
}

// Takes this program's own options out of the command line.
Options TakeOptions(int* argc, char** argv) {
    Options options;
    options.disk = std::filesystem::read_symlink("/proc/self/exe").parent_path();
    int kept = 1;
    for (int i = 1; i < *argc; ++i) {
        if (const auto disk = ValueOf(argv[i], "--disk=")) {
            options.disk = *disk;
        } else if (const auto tmpfs = ValueOf(argv[i], "--tmpfs=")) {
            options.tmpfs = *tmpfs;
        } else if (std::string_view(argv[i]) == "--ratios") {
            options.ratios = true;
        } else {
            argv[kept++] = argv[i];
        }
    }
    *argc = kept;
    return options;
}

bool IsOnTmpfs(const std::string& directory) {
    struct statfs info;
    Require(statfs(directory.c_str(), &info) == 0, "cannot look at " + directory);
    return info.f_type == TMPFS_MAGIC;
}

Place MakePlace(const char* name, const std::string& directory, bool durable) {
    Require(IsOnTmpfs(directory) != durable,
            directory + (durable ? " is on a tmpfs: name a directory on a disk with --disk="
                                 : " is not on a tmpfs: name one that is with --tmpfs="));
    return {
        .name = name, .durable = durable, .directory = std::make_shared<test::TempDir>(directory)};
}

std::vector<Row> AllRows(const Options& options) {
    const Place disk = MakePlace("disk", options.disk, true);
    const Place tmpfs = MakePlace("tmpfs", options.tmpfs, false);
    std::vector<Row> rows;
    AddPathRows(&rows);
    AddNameRows(&rows);
    AddListRows(tmpfs, &rows);
    for (const Place& place : {disk, tmpfs}) AddStreamRows(place, tmpfs, &rows);
    for (const Place& place : {disk, tmpfs}) AddForkRows(place, &rows);
    for (const Place& place : {disk, tmpfs}) AddObjectRows(place, &rows);
    return rows;
}

std::vector<Row> Filtered(std::vector<Row> rows, const std::string& filter) {
    if (filter.empty() || filter == "all") return rows;
    const std::regex wanted(filter);
    std::erase_if(rows, [&](const Row& row) {
        return !std::regex_search(row.work + "/" + row.where, wanted);
    });
    return rows;
}

void Register(const std::string& name, const Row& row, const Prepare& prepare) {
    auto* const registered =
        benchmark::RegisterBenchmark(name.c_str(), [&row, prepare](benchmark::State& state) {
            try {
                const Work work = prepare();
                const std::int64_t batch = row.batch == 0 ? 1 : row.batch;
                while (state.KeepRunningBatch(batch)) work(batch);
            } catch (const std::exception& failure) {
                state.SkipWithError(failure.what());
            }
        });
    registered->UseRealTime();
    if (row.batch != 0) registered->Iterations(row.batch * row.goes);
}

int Run(int argc, char** argv) {
    const Options options = TakeOptions(&argc, argv);
    benchmark::Initialize(&argc, argv, [] { fputs(kUsage, stdout); });
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
        fputs(kUsage, stderr);
        return 2;
    }
    const std::vector<Row> rows = AllRows(options);
    if (options.ratios) {
        PrintRatios(Filtered(rows, benchmark::GetBenchmarkFilter()));
        return 0;
    }
    for (const Row& row : rows) {
        const std::string name = row.work + "/" + row.where;
        Register(name + "/library", row, row.library);
        Register(name + "/floor", row, row.floor);
    }
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}

}  // namespace
}  // namespace mavoea::bench

int main(int argc, char** argv) {
    try {
        return mavoea::bench::Run(argc, argv);
    } catch (const std::exception& failure) {
        fprintf(stderr, "mavoea_bench: %s\n", failure.what());
        return 1;
    }
}
