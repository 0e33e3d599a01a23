// What a conversion would meet, said before it is begun, and conversions as they were planned.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <filesystem>
#include <nlohmann/json.hpp>
#include <set>
#include <sstream>
#include <tuple>

#include "tests/support/process.h"
#include "tests/support/snapshot.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class PlanTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES(share_.path());
        fs::create_directory(source_);
    }

    std::string In(const std::string& name) const { return source_ + '/' + name; }
    ToolResult Plan(const std::string& type, Arguments options = {}) const {
        options.insert(options.begin(), {"plan", "-r", "--to", type});
        options.insert(options.end(), {source_, copy_});
        return share_.Run(options);
    }
    ToolResult ConvertAsPlanned() const { return share_.Run({"convert", "--plan", plan_}); }

    void Make(const std::string& name) const {
        WriteFile(In(name), Ascii("data"));
        ASSERT_THAT(share_.Run({"set", In(name), Colour(), "blue"}), Succeeded());
    }

    const Volume share_{kEaDirectory};
    const std::string source_ = share_.path() + "/source";
    const std::string copy_ = share_.path() + "/copy";
    const std::string plan_ = share_.path() + "/plan";
};

struct Matter {
    std::string path;
    std::string kind;
    std::string detail;

    bool operator<(const Matter& other) const {
        return std::tie(path, kind, detail) < std::tie(other.path, other.kind, other.detail);
    }
};

// The lines of a plan in JSON but for the last one, which has what there is in all.
std::set<Matter> MattersOf(const ToolResult& plan, nlohmann::json* all = nullptr) {
    std::istringstream lines(plan.out);
    std::set<Matter> matters;
    for (std::string line; std::getline(lines, line);) {
        const auto json = nlohmann::json::parse(line);
        if (json.contains("source")) {
            EXPECT_EQ(EOF, lines.peek());
            if (all != nullptr) *all = json;
            break;
        }
        matters.insert({json["path"], json["kind"], json["detail"]});
    }
    return matters;
}

TEST_F(PlanTest, AllThatThereIsIsCounted) {
    Make("a");
    Make("b");
    ASSERT_THAT(share_.Run({"set", In("a"), "com.apple.ResourceFork", "a fork"}), Succeeded());
    ASSERT_THAT(share_.Run({"set", In("a"), "com.apple.FinderInfo", "--hex", FinderInfoDigits()}),
                Succeeded());
    ASSERT_THAT(share_.Run({"set-info", "--comment", "hello", In("b")}), Succeeded());
    ASSERT_THAT(share_.Run({"lock", In("b")}), Succeeded());
    fs::create_directory(In("inner"));
    WriteFile(In("inner/c"), Pattern(1000));
    fs::create_hard_link(In("inner/c"), In("inner/d"));
    fs::create_symlink("a", In("link"));
    ASSERT_EQ(0, mkfifo(In("pipe").c_str(), 0644));
    WriteFile(source_ + "/@eaDir/a@OtherService", Pattern(20));

    // A comment is an attribute for those who look into a file of the library, too.
    const auto attributes = nlohmann::json::parse(share_.Run({"list", "--json", In("b")}).out);
    const std::size_t of_b = attributes["attributes"].size() - 1;  // the lock
    const ToolResult result = Plan("appledouble", {"--json"});
    nlohmann::json all;
    EXPECT_THAT(MattersOf(result, &all), testing::SizeIs(1));
    EXPECT_EQ(1, result.status);
    EXPECT_EQ(source_, all["source"]);
    EXPECT_EQ(copy_, all["destination"]);
    EXPECT_EQ(0, all["type"]);
    EXPECT_EQ(4, all["files"]["count"]);
    EXPECT_EQ(1008, all["files"]["bytes"]);  // of two names of one file once
    EXPECT_EQ(2, all["directories"]);
    EXPECT_EQ(1, all["links"]);
    EXPECT_EQ(1, all["specialFiles"]);
    EXPECT_EQ(1 + of_b, all["attributes"]["count"]);
    EXPECT_EQ((nlohmann::json{{"count", 1}, {"bytes", 6}}), all["resourceForks"]);
    EXPECT_EQ((nlohmann::json{{"count", 1}, {"bytes", 32}}), all["finderInfo"]);
    EXPECT_EQ((nlohmann::json{{"count", 1}, {"bytes", 5}}), all["entries"]["comment"]);
    EXPECT_EQ((nlohmann::json{{"count", 1}, {"bytes", 20}}), all["serviceFiles"]);
    EXPECT_EQ(1, all["locked"]);
    EXPECT_EQ(1, all["toDecide"]["lost"]);
}

TEST_F(PlanTest, PeopleAreToldInLines) {
    Make("a");
    EXPECT_EQ(source_ + " to " + copy_ +
                  ", AppleDouble:\n  files: 1, 4 bytes\n  directories: 1\n"
                  "  attributes: 1, 4 bytes\n    at most 4 bytes of one object\n"
                  "everything would arrive\n",
              Plan("appledouble").out);
    WriteFile(source_ + "/@eaDir/a@OtherService", Ascii("x"));
    const ToolResult result = Plan("linux");
    EXPECT_EQ(1, result.status);
    EXPECT_THAT(result.out, testing::StartsWith(In("a") + ": lost: \"@OtherService\" of another "));
    EXPECT_THAT(result.out, EndsWith("  lost: 1\n"));
    EXPECT_THAT(result.err, IsEmpty());
}

TEST_F(PlanTest, NothingChangesByIt) {
    Make("a");
    Make("b");
    fs::create_directory(In("inner"));
    Make("inner/c");
    const auto before = TakeSnapshot(share_.path());
    for (const char* type : {"appledouble", "eadir", "fileea", "xattr", "samba", "linux"}) {
        EXPECT_EQ(0, Plan(type).status) << type;
        EXPECT_EQ(0, Plan(type, {"--json"}).status) << type;
    }
    EXPECT_EQ(before, TakeSnapshot(share_.path()));
}

// What was planned to be lost is what the conversion then names, and nothing else.
class PlanPairTest : public PlanTest,
                     public ::testing::WithParamInterface<std::tuple<const char*, bool>> {};

TEST_P(PlanPairTest, WhatIsSaidIsWhatBecomesOfIt) {
    const auto& [type, damaged] = GetParam();
    Make("rich");
    ASSERT_THAT(share_.Run({"set", In("rich"), "com.apple.ResourceFork", "a fork"}), Succeeded());
    ASSERT_THAT(share_.Run({"set-info", "--comment", "hello", "--created", "2001-02-03T04:05:06Z",
                            In("rich")}),
                Succeeded());
    WriteFile(source_ + "/@eaDir/rich@OtherService", Ascii("x"));
    Make("plain");
    Make(std::string(254, 'n'));
    if (damaged) {
        Bytes stream = ReadFile(source_ + "/@eaDir/plain@MavoEAStream");
        stream.resize(stream.size() - 1);
        WriteFile(source_ + "/@eaDir/plain@MavoEAStream", stream);
    }
    const ToolResult plan = Plan(type, {"--json"});
    const std::set<Matter> matters = MattersOf(plan);
    const ToolResult result = share_.Run({"convert", "-r", "--json", "--to", type, source_, copy_});
    const auto failures = nlohmann::json::parse(result.out)["failures"];
    std::set<std::string> planned;
    for (const Matter& matter : matters) planned.insert(matter.path);
    std::set<std::string> failed;
    for (const auto& failure : failures) {
        failed.insert(failure["path"].get<std::string>());
        for (const Matter& matter : matters) {
            if (matter.path != failure["path"] || matter.kind != "lost") continue;
            const std::size_t colon = matter.detail.find(": ");
            EXPECT_THAT(failure["message"].get<std::string>(),
                        HasSubstr(matter.detail.substr(0, colon) + " (" +
                                  matter.detail.substr(colon + 2) + ')'));
        }
    }
    EXPECT_EQ(failed, planned);
    EXPECT_EQ(planned.empty() ? 0 : 1, plan.status);
    EXPECT_EQ(planned.empty() ? 0 : 2, result.status);
}

INSTANTIATE_TEST_SUITE_P(Types, PlanPairTest,
                         ::testing::Combine(::testing::Values("appledouble", "eadir", "fileea",
                                                              "samba", "samba-stream", "netatalk",
                                                              "linux"),
                                            ::testing::Bool()),
                         [](const auto& tested) {
                             std::string name = std::get<0>(tested.param);
                             std::erase(name, '-');
                             return name + (std::get<1>(tested.param) ? "Damaged" : "Sound");
                         });

TEST_F(PlanTest, ANameThatWouldMeanSomethingElseThereIsRefused) {
    const Volume volume(kXattr);
    const std::string source = volume.path() + "/source";
    fs::create_directory(source);
    WriteFile(source + "/a", Ascii("data"));
    WriteFile(source + "/._a", StreamImage{.attributes = {{"user.k", Ascii("v")}}}.Build());
    const std::string copy = volume.path() + "/copy";
    for (const char* type : {"appledouble", "eadir"}) {
        const ToolResult result = volume.Run({"plan", "-r", "--to", type, "--json", source, copy});
        EXPECT_EQ(1, result.status);
        const auto matters = MattersOf(result);
        ASSERT_EQ(1U, matters.size()) << result.out;
        EXPECT_EQ(source + "/._a", matters.begin()->path);
        EXPECT_EQ("refused", matters.begin()->kind);
        EXPECT_EQ(2, volume.Run({"convert", "-r", "--to", type, source, copy}).status);
        fs::remove_all(copy);
    }
    EXPECT_EQ(0, volume.Run({"plan", "-r", "--to", "linux", source, copy}).status);
}

TEST_F(PlanTest, WhatStandsInTheWayIsNamed) {
    Make("a");
    Make("b");
    fs::create_directory(In("c"));
    fs::create_directory(In("d"));
    Make("d/e");
    fs::create_directories(copy_ + "/b");
    fs::create_directory(copy_ + "/d");
    WriteFile(copy_ + "/a", Ascii("x"));
    WriteFile(copy_ + "/c", Ascii("x"));
    WriteFile(copy_ + "/d/e", Ascii("x"));
    const ToolResult result = Plan("appledouble");
    EXPECT_EQ(1, result.status);
    std::istringstream lines(result.out);
    std::vector<std::string> said(4);
    for (std::string& line : said) std::getline(lines, line);
    EXPECT_THAT(said, ElementsAre(In("a") + ": replaced: " + copy_ + "/a is there",
                                  In("b") + ": refused: " + copy_ + "/b is a directory",
                                  In("c") + ": refused: " + copy_ + "/c is no directory",
                                  In("d/e") + ": replaced: " + copy_ + "/d/e is there"));
}

TEST_F(PlanTest, WhatCannotBeLookedAtIsAFailure) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    Make("a");
    fs::create_directory(In("closed"));
    fs::permissions(In("closed"), fs::perms::none);
    fs::permissions(share_.path(), fs::perms::all);
    AsUser(4242, Root::kGivenUp, [&] {
        const ToolResult result = Plan("appledouble");
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.out, HasSubstr(In("closed") + ": unreadable: Permission denied\n"));
        EXPECT_THAT(result.out, HasSubstr("  files: 1, 4 bytes\n"));
    });
}

TEST_F(PlanTest, ThereIsNoPlanOfWhatCannotBe) {
    Make("a");
    EXPECT_EQ(2, Plan("none such").status);
    EXPECT_EQ(2, share_.Run({"plan", "--to", "samba", source_, In("a")}).status);
    EXPECT_EQ(1, share_.Run({"plan", "--to", "samba", In("none"), copy_}).status);
    EXPECT_EQ(2, share_.Run({"plan", source_, copy_}).status);
    EXPECT_EQ(2, share_.Run({"plan", "--to", "samba", source_}).status);
    EXPECT_EQ(2, share_.Run({"plan", "-f", "--to", "samba", source_, copy_}).status);
}

// ---- As it was planned --------------------------------------------------------------------------

TEST_F(PlanTest, AConversionDoesWhatWasPlanned) {
    Make("a");
    Make("new\nline \\x");
    ASSERT_EQ(0, Plan("appledouble", {"--output", plan_}).status);
    EXPECT_EQ(0600U, StatusOf(plan_).st_mode & 07777);
    const ToolResult result = ConvertAsPlanned();
    EXPECT_EQ("3 converted, 3 compared, 0 differences, 0 failed\n", result.out);
    EXPECT_THAT(result, Succeeded());
    EXPECT_TRUE(fs::exists(copy_ + "/._a"));
    EXPECT_TRUE(fs::exists(copy_ + "/._new\nline \\x"));
    EXPECT_EQ(0, nlohmann::json::parse(
                     share_.Run({"--json", "convert", "--plan", plan_}).out)["differences"]
                     .size());
}

TEST_F(PlanTest, AnotherPlanIsNotReplacedUnasked) {
    Make("a");
    WriteFile(plan_, Ascii("something"));
    const ToolResult result = Plan("appledouble", {"--output", plan_});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.out, IsEmpty());
    EXPECT_EQ("something", TextOf(plan_));
    EXPECT_EQ(0, Plan("appledouble", {"--force", "--output", plan_}).status);
    EXPECT_THAT(ConvertAsPlanned(), Succeeded());
}

TEST_F(PlanTest, WhatHasChangedSinceIsPlannedAgain) {
    Make("a");
    Make("b");
    fs::create_directory(In("inner"));
    Make("inner/c");
    const std::vector<std::function<void()>> changes = {
        [&] { WriteFile(In("a"), Ascii("other data")); },
        [&] {
            ASSERT_THAT(share_.Run({"set", In("b"), Colour(), "red"}), Succeeded());
        },
        [&] {
            ASSERT_THAT(share_.Run({"remove", In("a"), Colour()}), Succeeded());
        },
        [&] { Make("inner/d"); },
        [&] { fs::rename(In("inner/c"), In("inner/e")); },
        [&] { fs::remove(In("b")); },
        [&] { fs::permissions(In("a"), fs::perms::owner_read); },
        [&] { ASSERT_EQ(0, setxattr(In("a").c_str(), "user.k", "v", 1, 0)); },
        [&] { fs::create_directory(In("another")); },
    };
    for (std::size_t i = 0; i < changes.size(); ++i) {
        SCOPED_TRACE(i);
        ASSERT_EQ(0, Plan("appledouble", {"--force", "--output", plan_}).status);
        changes[i]();
        EXPECT_THAT(ConvertAsPlanned(),
                    Failed(2, source_ + ": it has changed since it was planned; plan it again"));
        EXPECT_FALSE(fs::exists(copy_));
    }
}

TEST_F(PlanTest, WhatIsNoPlanIsRefused) {
    Make("a");
    ASSERT_EQ(0, Plan("appledouble", {"--output", plan_}).status);
    const std::string whole = TextOf(plan_);
    std::vector<std::string> texts = {"", "x", std::string(2000000, 'x')};
    for (std::size_t size = 0; size + 1 < whole.size(); ++size) {
        texts.push_back(whole.substr(0, size));
    }
    for (std::size_t at = 0; (at = whole.find('\n', at)) != std::string::npos; ++at) {
        texts.push_back(whole.substr(0, at + 1) + "x\n" + whole.substr(at + 1));
        texts.back().erase(texts.back().size() - 4);
    }
    for (const std::string& text : texts) {
        WriteFile(plan_, Ascii(text));
        EXPECT_THAT(ConvertAsPlanned(),
                    Failed(2, plan_ + ": it is no plan of a conversion; make one with: mavoea plan "
                                      "--output FILE"));
    }
    EXPECT_FALSE(fs::exists(copy_));
    fs::remove(plan_);
    EXPECT_EQ(1, ConvertAsPlanned().status);
    EXPECT_EQ(2, share_.Run({"convert", "--plan", plan_, source_, copy_}).status);
    EXPECT_EQ(2, share_.Run({"convert", "--plan", plan_, "-r"}).status);
    EXPECT_EQ(2, share_.Run({"convert", source_, copy_}).status);
}

}  // namespace
}  // namespace mavoea::test
