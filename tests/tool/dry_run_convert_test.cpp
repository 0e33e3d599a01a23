// Dry runs of convert: into what is not there, partly there or in the way, and what would differ
// then.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <optional>
#include <tuple>

#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/holdings.h"
#include "tests/tool/rehearsal.h"

namespace mavoea::test {
namespace {

using ::testing::EndsWith;
using ::testing::HasSubstr;

class DryRunConvertTest : public ::testing::TestWithParam<std::tuple<int, int>> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
        both_.emplace(from(), to());
    }

    static int from() { return std::get<0>(GetParam()); }
    static int to() { return std::get<1>(GetParam()); }

    const Rehearsal& both() const { return *both_; }
    std::string From(const std::string& name) const { return both_->From(name); }
    std::string To(const std::string& name) const { return both_->To(name); }
    std::string ArrowOf(const std::string& name) const { return Arrow(From(name), To(name)); }

    static Arguments Words(const std::string& source, const std::string& copy,
                           const Arguments& options = {"-r"}) {
        Arguments words = {"convert", "--to", WordOfType(to())};
        words.insert(words.end(), options.begin(), options.end());
        words.insert(words.end(), {source, copy});
        return words;
    }
    ToolResult Expect(const std::string& name, const Arguments& options = {"-r"}) const {
        return both_->Expect(Words(From(name), To(name), options));
    }

    void Make(const std::string& path, const std::string& data = "data") const {
        both_->travel().MakeFile(path, data);
    }
    void Colour(const std::string& path, const std::string& colour = "blue") const {
        ASSERT_EQ(0, both_->travel().Run({"set", path, test::Colour(), colour}).status) << path;
    }
    void MakeTree() const {
        for (const char* const name : {"tree", "tree/sub", "tree/sub/deep"}) MakeDir(From(name));
        for (const char* const name : {"tree/a", "tree/sub/b", "tree/sub/deep/c"}) {
            Make(From(name));
            Colour(From(name));
        }
        ASSERT_EQ(0, symlink("a", From("tree/link").c_str()));
        ASSERT_EQ(0, mkfifo(From("tree/pipe").c_str(), 0600));
        Colour(From("tree/sub"), "white");
    }

 private:
    std::optional<Rehearsal> both_;
};

std::vector<std::tuple<int, int>> SomePairs() {
    std::vector<std::tuple<int, int>> pairs = {{kEaDirectory, kAppleDouble},
                                               {kAppleDouble, kEaDirectory}};
    if (Tested().emulated()) return pairs;
    for (const int to : {kEaDirectory, kXattr}) pairs.emplace_back(kFileEa, to);
    pairs.emplace_back(kXattr, kFileEa);
    pairs.emplace_back(kSamba, kSamba);
    return pairs;
}
INSTANTIATE_TEST_SUITE_P(SomePairs, DryRunConvertTest, ::testing::ValuesIn(SomePairs()),
                         [](const auto& tested) {
                             return "From" + std::to_string(std::get<0>(tested.param)) + "To" +
                                    std::to_string(std::get<1>(tested.param));
                         });

TEST_P(DryRunConvertTest, EachObjectIsSaidBeforeAllAreCounted) {
    MakeTree();
    const std::string lines = ArrowOf("tree") + ArrowOf("tree/a") + ArrowOf("tree/link") +
                              ArrowOf("tree/pipe") + ArrowOf("tree/sub") + ArrowOf("tree/sub/b") +
                              ArrowOf("tree/sub/deep") + ArrowOf("tree/sub/deep/c") +
                              "8 converted, 8 compared, 0 differences, 0 failed\n";
    const Arguments words = Words(From("tree"), To("tree"));
    const ToolResult first = both().Look(words);
    EXPECT_THAT(first, Succeeded());
    EXPECT_EQ(lines, first.out);
    EXPECT_FALSE(Exists(To("tree")));
    Arguments briefly = words;
    briefly[0] = "convert";
    briefly.insert(briefly.begin() + 1, "-n");
    EXPECT_EQ(lines, both().travel().Run(briefly).out);
    EXPECT_EQ(lines, both().Expect(words).out);
    // Into what is all there.
    EXPECT_EQ(lines, both().Expect(words).out);
    // No lines in JSON.
    const ToolResult json = both().Expect(Words(From("tree"), To("json"), {"-r", "--json"}));
    EXPECT_EQ(8, json.json()["converted"]);
    EXPECT_EQ(0, json.json()["failed"]);
}

TEST_P(DryRunConvertTest, WhatIsPartlyThereIsForeseenToBecomeEqual) {
    MakeTree();
    const Arguments words = Words(From("tree"), To("tree"));
    ASSERT_EQ(0, both().travel().Run(words).status);
    Make(To("tree/a"), "of another length");
    Colour(To("tree/a"), "red");
    ASSERT_EQ(0, unlink(To("tree/link").c_str()));
    ASSERT_EQ(0, symlink("elsewhere", To("tree/link").c_str()));
    ASSERT_EQ(0, both().travel().Run({"rm", "-r", To("tree/sub/deep")}).status);
    ASSERT_EQ(0, both().travel().Run({"set", To("tree/sub"), "user.more", "1"}).status);
    ASSERT_EQ(0, both().travel().Run({"lock", To("tree/sub/b")}).status);
    const ToolResult said = both().Expect(words);
    EXPECT_EQ(0, said.status) << said.err;
    EXPECT_THAT(said.out, EndsWith("8 converted, 8 compared, 0 differences, 0 failed\n"));
}

TEST_P(DryRunConvertTest, WhatIsThereBesidesIsSaidToBeExtra) {
    MakeTree();
    MakeDir(To("tree"));
    MakeDir(To("tree/extra"));
    Make(To("tree/extra/inner"));
    Make(To("tree/more"));
    Colour(To("tree/more"));
    ASSERT_EQ(0, symlink("more", To("tree/other").c_str()));
    const ToolResult said = Expect("tree");
    EXPECT_EQ(2, said.status);
    for (const char* const name : {"tree/extra", "tree/more", "tree/other"}) {
        EXPECT_THAT(said.out, HasSubstr(To(name) + ": extra\n"));
    }
    EXPECT_THAT(said.out, EndsWith(" 3 differences, 0 failed\n"));
    Expect("tree", {"-r", "--json"});
    Expect("tree", {});
}

TEST_P(DryRunConvertTest, WhatIsOfAnotherTypeIsForeseenToStay) {
    MakeTree();
    MakeDir(To("tree"));
    for (const char* const name : {"tree/a", "tree/link", "tree/pipe"}) MakeDir(To(name));
    Make(To("tree/sub"));
    const ToolResult said = Expect("tree");
    EXPECT_EQ(2, said.status);
    EXPECT_THAT(said.err, HasSubstr(To("tree/a") + "': Is a directory"));
    EXPECT_THAT(said.err, HasSubstr(To("tree/sub")));
    EXPECT_THAT(said.out, HasSubstr(From("tree/a") + ": type: different\n"));
    Expect("tree", {"-r", "--json"});
    Expect("tree/a", {});
    Expect("tree/sub", {});
    // A file, a link and a pipe of each other's names.
    MakeDir(To("other"));
    Make(To("other/link"));
    Make(To("other/pipe"));
    ASSERT_EQ(0, symlink("pipe", To("other/a").c_str()));
    both().Expect(Words(From("tree"), To("other")));
    // The destination itself.
    both().Expect(Words(From("tree/a"), To(""), {}));
    both().Expect(Words(From("tree"), To("other/link")));
    both().Expect(Words(From("tree"), To("other/a")));
    both().Expect(Words(From("tree"), To("none/tree")));
    both().Expect(Words(From("none"), To("new")));
    both().Expect(Words(From("tree"), From("tree")));
    both().Expect(Words(From("tree"), From("tree/sub/new")));
}

TEST_P(DryRunConvertTest, WhatHasNoPlaceIsForeseenToBeMissing) {
    MakeTree();
    for (const char* const name : {"tree/a", "tree/sub/b", "tree/sub"}) {
        (void)both().travel().Run({"set", From(name), "user.large"}, std::string(3000, 'x'));
        (void)both().travel().Run(
            {"set", From(name), kFinderInfoName, "--hex", FinderInfoDigits()});
        (void)both().travel().Run({"set", From(name), kForkName, "the fork"});
        (void)both().travel().Run({"set-info", From(name), "--comment", "hello"});
        (void)both().travel().Run({"lock", From(name)});
    }
    // Files of nobody on the one volume or the other.
    WriteFile(From("tree/._gone"), AppleDoubleOf({{kFinderInfoEntry, Repeat(1, 32)}}));
    WriteFile(From("tree/sub/._b"), AppleDoubleOf({{kForkEntry, Ascii("fork")}}));
    PutKind(From("tree/sub/b"), "MAVOPHOTO", Ascii("of another service"));
    Expect("tree");
    Expect("tree");
    both().Expect(Words(From("tree/sub/b"), To("b"), {}));
    both().Expect(Words(From("tree/sub"), To("sub"), {}));
    // What is in the way of metadata.
    MakeDir(To("way"));
    MakeDir(To("way/._a"));
    Make(To("way/@eaDir"));
    both().Expect(Words(From("tree"), To("way")));
    MakeDir(To("second"));
    MakeDir(To("second/@eaDir"));
    MakeDir(To("second/@eaDir/a@MavoEAStream"));
    both().Expect(Words(From("tree"), To("second")));
}

TEST_P(DryRunConvertTest, NamesAreForeseenToBeTooLongOrAlike) {
    MakeDir(From("tree"));
    for (const std::string& name :
         {std::string(255, 'n'), std::string(246, 'm') + "1", std::string(246, 'm') + "2"}) {
        Make(From("tree/" + name));
        (void)both().travel().Run({"set", From("tree/" + name), test::Colour(), "red"});
    }
    Expect("tree");
    Expect("tree");
}

TEST_P(DryRunConvertTest, NamesOfOneFileAreForeseen) {
    MakeTree();
    ASSERT_EQ(0, link(From("tree/sub/deep/c").c_str(), From("tree/sub/first").c_str()));
    ASSERT_EQ(0, link(From("tree/sub/deep/c").c_str(), From("tree/zweiter").c_str()));
    Colour(From("tree/zweiter"), "green");
    Expect("tree");
    Expect("tree");
}

TEST_P(DryRunConvertTest, WhatAnotherUserMayNotDoIsForeseen) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS("/tmp");
    constexpr uid_t kUser = 54321;
    MakeTree();
    for (const std::string& path : {both().travel().dir().path(), From(""), To(""), From("tree"),
                                    From("tree/sub"), From("tree/sub/deep")}) {
        ASSERT_EQ(0, chmod(path.c_str(), 0755));
    }
    for (const char* const name : {"tree/a", "tree/sub/b"}) chmod(From(name).c_str(), 0644);
    chmod(From("tree/sub/deep/c").c_str(), 0600);
    for (const char* const name : {"own", "partly"}) MakeDir(To(name));
    ASSERT_EQ(0, chown(To("own").c_str(), kUser, kUser));
    ASSERT_EQ(0, chown(To("partly").c_str(), kUser, kUser));
    MakeDir(To("partly/sub"));
    Make(To("partly/a"), "others");
    EXPECT_EQ(2, both().ExpectOf(kUser, Words(From("tree"), To("tree"))).status);
    EXPECT_EQ(2, both().ExpectOf(kUser, Words(From("tree"), To("own/tree"))).status);
    EXPECT_EQ(2, both().ExpectOf(kUser, Words(From("tree"), To("partly"))).status);
    both().ExpectOf(kUser, Words(From("tree/a"), To("partly/a"), {}));
    // With metadata that is there and nobody else's to change.
    Colour(To("partly/a"), "red");
    both().ExpectOf(kUser, Words(From("tree/a"), To("partly/a"), {}));
    both().ExpectOf(kUser, Words(From("tree"), To("partly")));
}

class DryRunConvertOptionsTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
        MakeDir(From("tree"));
        for (int i = 0; i < 40; ++i) both_.travel().MakeFile(From("tree/f" + std::to_string(i)));
        both_.travel().GiveMetadata(From("tree/f7"));
    }
    std::string From(const std::string& name) const { return both_.From(name); }
    std::string To(const std::string& name) const { return both_.To(name); }

    Rehearsal both_{kEaDirectory, kAppleDouble};
};

TEST_F(DryRunConvertOptionsTest, APlanIsForeseenAndRefusedWhereItDoesNotHold) {
    const std::string plan = both_.travel().dir() / "plan";
    ASSERT_EQ(0, both_.travel()
                     .Run({"plan", "-r", "--to", "0", "--output", plan, From("tree"), To("tree")})
                     .status);
    const Bytes before = ReadFile(plan);
    both_.keeps_times = true;
    const ToolResult said = both_.Look({"convert", "--plan", plan});
    EXPECT_THAT(said, Succeeded());
    EXPECT_THAT(said.out, HasSubstr(Arrow(From("tree/f7"), To("tree/f7"))));
    EXPECT_EQ(before, ReadFile(plan));
    both_.travel().MakeFile(From("tree/new"));
    const ToolResult changed = both_.Expect({"convert", "--plan", plan});
    EXPECT_EQ(2, changed.status);
    EXPECT_FALSE(Exists(To("tree")));
}

TEST_F(DryRunConvertOptionsTest, ALogIsNotWrittenAndNotGoneOnWith) {
    const std::string log = both_.travel().dir() / "log";
    const Arguments words = {"convert", "-r", "--to", "0", From("tree"), To("tree")};
    for (const char* const option : {"--log", "--resume"}) {
        for (const char* const dry : {"-n", "--dry-run"}) {
            Arguments all = words;
            all.insert(all.begin() + 1, {dry, option, log});
            EXPECT_THAT(both_.travel().Run(all),
                        Failed(2, std::string("--dry-run excludes ") + option +
                                      "; mavoea --help has the usage"));
        }
    }
    EXPECT_FALSE(Exists(log));
    EXPECT_FALSE(Exists(To("tree")));
}

TEST_F(DryRunConvertOptionsTest, ManyAreSaidInOneOrderByAnyNumberOfWorkers) {
    for (int i = 40; i < 400; ++i) both_.travel().MakeFile(From("tree/f" + std::to_string(i)));
    const auto words = [&](const char* jobs, const std::string& copy) {
        return Arguments{"convert", "-r", "-j", jobs, "--to", "0", From("tree"), copy};
    };
    const std::string first = both_.Look(words("1", To("tree"))).out;
    EXPECT_THAT(first, EndsWith("401 converted, 401 compared, 0 differences, 0 failed\n"));
    EXPECT_EQ(first, both_.Look(words("3", To("tree"))).out);
    EXPECT_EQ(first, both_.Do(words("2", To("tree"))).out);
    EXPECT_EQ(first, both_.Do(words("1", To("tree"))).out);
    std::string path = From("deep");
    MakeDir(path);
    for (int level = 0; level < 300; ++level) MakeDir(path += "/d");
    EXPECT_THAT(both_.Lines({"convert", "-r", "--to", "0", From("deep"), To("deep")}),
                EndsWith("301 converted, 301 compared, 0 differences, 0 failed\n"));
}

TEST_F(DryRunConvertOptionsTest, ToAnotherFileSystemTheSameIsSaid) {
    const SecondVolume second;
    MAVOEA_SKIP_WITHOUT_SECOND(second);
    const Rehearsal both(kEaDirectory, kEaDirectory, second.path());
    MakeDir(both.From("tree"));
    both.travel().MakeFile(both.From("tree/a"));
    both.travel().GiveMetadata(both.From("tree/a"));
    for (int time = 0; time < 2; ++time) {
        EXPECT_EQ(Arrow(both.From("tree"), both.To("tree")) +
                      Arrow(both.From("tree/a"), both.To("tree/a")) +
                      "2 converted, 2 compared, 0 differences, 0 failed\n",
                  both.Lines({"convert", "-r", "--to", "1", both.From("tree"), both.To("tree")}));
    }
}

}  // namespace
}  // namespace mavoea::test
