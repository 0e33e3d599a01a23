// Path derivation.

#include <benchmark/benchmark.h>

#include <string>

#include "bench/floor.h"
#include "bench/rows.h"
#include "include/mavoea.h"

namespace mavoea::bench {
namespace {

using benchmark::ClobberMemory;
using benchmark::DoNotOptimize;

constexpr double kAim = 1.8;      // beside copying by hand
constexpr double kFormatAim = 1;  // beside one snprintf

constexpr char kShortParent[] = "/volume1/projects/2024";
constexpr char kShortName[] = "final report 2.txt";

// Derives into a buffer and checks the result once.
template <class Derive>
Prepare Deriving(Derive derive, std::string result) {
    return [derive, result] {
        const auto buffer = std::make_shared<std::string>(MAVOEA_PATH_SIZE + 1, '\0');
        derive(buffer->data());
        Require(result == buffer->c_str(), "not the path that is due: " + *buffer);
        return Repeat([derive, buffer] {
            char* to = buffer->data();
            DoNotOptimize(to);
            derive(to);
            ClobberMemory();
        });
    };
}

void AddStreamPathRows(const std::string& title, const std::string& parent, const std::string& name,
                       const std::string& kept, std::vector<Row>* rows) {
    const std::string path = parent + "/" + name;
    const std::string result = parent + "/@eaDir/" + kept + "@" MAVOEA_KIND_STREAM;
    const Prepare library = Deriving(
        [path](char* to) {
            MAVOEAPath(EA_FORM_FILE, path.c_str(), MAVOEA_KIND_STREAM, to, MAVOEA_PATH_SIZE,
                       EA_PLACE_EADIR);
        },
        result);
    rows->push_back(
        {.work = title,
         .where = "memory",
         .aim = kAim,
         .library = library,
         .floor =
             Deriving([path](char* to) { floor::StreamPath(path.c_str(), MAVOEA_KIND_STREAM, to); },
                      result)});
    rows->push_back({.work = title + ", beside one snprintf",
                     .where = "memory",
                     .aim = kFormatAim,
                     .library = library,
                     .floor = Deriving(
                         [parent, kept](char* to) {
                             floor::FormatStreamPath(parent.c_str(), kept.c_str(),
                                                     MAVOEA_KIND_STREAM, to);
                         },
                         result)});
}

}  // namespace

void AddPathRows(std::vector<Row>* rows) {
    const std::string parent = kShortParent;
    const std::string path = parent + "/" + kShortName;
    Require(path.size() == 41, "the short path is not 41 bytes");
    AddStreamPathRows("path of 41 bytes to its stream", parent, kShortName, kShortName, rows);

    // The check character: 55 times 'n' and ".txt" add up to 6448, and 6448 % 60 is 28, 's'.
    const std::string stem(296, 'n');
    AddStreamPathRows("name of 300 bytes, shortened", parent, stem + ".txt",
                      stem.substr(0, 237) + "s.txt", rows);

    rows->push_back(
        {.work = "path of 41 bytes to its EA directory",
         .where = "memory",
         .aim = kAim,
         .library = Deriving(
             [path](char* to) { MAVOEADirPath(EA_FORM_FILE, path.c_str(), to, MAVOEA_PATH_SIZE); },
             parent + "/@eaDir"),
         .floor =
             Deriving([path](char* to) { floor::DirPath(path.c_str(), to); }, parent + "/@eaDir")});
    rows->push_back(
        {.work = "path of 41 bytes to its \"._\" file",
         .where = "memory",
         .aim = kAim,
         .library = Deriving([path](char* to) { MAVOEAADPath(path.c_str(), to, MAVOEA_PATH_SIZE); },
                             parent + "/._" + kShortName),
         .floor = Deriving([path](char* to) { floor::AppleDoublePath(path.c_str(), to); },
                           parent + "/._" + kShortName)});
}

}  // namespace mavoea::bench
