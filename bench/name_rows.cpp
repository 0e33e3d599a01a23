// Hidden-name tests, as a listing of a large directory makes them.

#include <benchmark/benchmark.h>

#include <span>
#include <string>

#include "bench/floor.h"
#include "bench/rows.h"
#include "include/mavoea.h"

namespace mavoea::bench {
namespace {

constexpr double kAim = 2.5;
constexpr int kCount = 10000;

// A directory's names: 1 in 100 is the EA directory's, 1 in 100 ".DS_Store", 1 in 50 a "._" file,
// 1 in 50 another name that begins with '.' or '@'.
constexpr int kHiddenDirs = kCount / 100;
constexpr int kHiddenFiles = 4 * kCount / 100;
constexpr int kLegacyNames = kCount / 100;  // with a ':'

class Names {
 public:
    Names() {
        for (int i = 0; i < kCount; ++i) texts_.push_back(Name(i));
        for (const std::string& text : texts_) names_.push_back(text.c_str());
    }
    Names(const Names&) = delete;
    Names& operator=(const Names&) = delete;

    std::span<const char* const> all() const { return names_; }

 private:
    static std::string Name(int i) {
        const std::string photo = "Holiday photo " + std::to_string(i) + ".jpeg";
        switch (i * 37 % 100) {
            case 0:
                return "@EADIR";
            case 1:
                return ".DS_Store";
            case 2:
            case 3:
                return "._" + photo;
            case 4:
                return ".profile " + std::to_string(i);
            case 5:
                return "@home " + std::to_string(i);
            case 6:
                return "MAVO:Resource";
            default:
                return photo;
        }
    }

    std::vector<std::string> texts_;
    std::vector<const char*> names_;
};

template <class Count>
Prepare Counting(Count count, int result) {
    return [count, result] {
        const auto names = std::make_shared<Names>();
        Require(count(names->all()) == result, "not the number of hidden names that is due");
        return Repeat([count, names] { benchmark::DoNotOptimize(count(names->all())); });
    };
}

}  // namespace

void AddNameRows(std::vector<Row>* rows) {
    rows->push_back({.work = "10,000 names: hidden directory or not",
                     .where = "memory",
                     .aim = kAim,
                     .library = Counting(
                         [](std::span<const char* const> names) {
                             int count = 0;
                             for (const char* name : names) count += MAVOEAIsHiddenDirName(name);
                             return count;
                         },
                         kHiddenDirs),
                     .floor = Counting(floor::CountHiddenDirNames, kHiddenDirs)});
    rows->push_back({.work = "10,000 names: hidden file or not",
                     .where = "memory",
                     .aim = kAim,
                     .library = Counting(
                         [](std::span<const char* const> names) {
                             int count = 0;
                             for (const char* name : names) count += MAVOEAIsHiddenFile(name);
                             return count;
                         },
                         kHiddenFiles),
                     .floor = Counting(floor::CountHiddenFiles, kHiddenFiles)});
    rows->push_back({.work = "10,000 names: legacy metadata or not",
                     .where = "memory",
                     .aim = 1.5,
                     .library = Counting(
                         [](std::span<const char* const> names) {
                             int count = 0;
                             for (const char* name : names) count += MAVOEAIsHiddenName(name);
                             return count;
                         },
                         kLegacyNames),
                     .floor = Counting(floor::CountNamesWithColon, kLegacyNames)});
}

}  // namespace mavoea::bench
