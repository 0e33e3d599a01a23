// From a volume of each kind to one of each, on one file system or on two.
#ifndef MAVOEA_TESTS_TOOL_WAYS_H_
#define MAVOEA_TESTS_TOOL_WAYS_H_

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

#include "tests/support/second_volume.h"
#include "tests/tool/travel.h"

namespace mavoea::test {

struct Way {
    int from;
    int to;
    bool across;  // from one file system to another
};

inline std::string NameOf(const ::testing::TestParamInfo<Way>& info) {
    return "From" + std::to_string(info.param.from) + "To" + std::to_string(info.param.to) +
           (info.param.across ? "Across" : "");
}

inline std::vector<Way> AllWays() {
    std::vector<Way> ways;
    for (const bool across : {false, true}) {
        for (const int from : {kAppleDouble, kEaDirectory, kFileEa, kXattr}) {
            for (const int to : {kAppleDouble, kEaDirectory, kFileEa, kXattr}) {
                ways.push_back({from, to, across});
            }
        }
    }
    return ways;
}

// `Places` is made of the two types, and of where the destination is to be, if that is elsewhere.
template <class Places>
class WayTest : public ::testing::TestWithParam<Way> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
        if (GetParam().across) {
            second_.emplace();
            MAVOEA_SKIP_WITHOUT_SECOND(*second_);
            MAVOEA_SKIP_WITHOUT_ATTRIBUTES(second_->path());
        }
        places_.emplace(GetParam().from, GetParam().to, second_ ? second_->path() : std::string());
    }

    Places& places() { return *places_; }
    const Places& places() const { return *places_; }

 private:
    std::optional<SecondVolume> second_;
    std::optional<Places> places_;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_WAYS_H_
