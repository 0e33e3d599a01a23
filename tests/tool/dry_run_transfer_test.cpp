// Dry runs of cp, mv and convert: what the real run with --verbose, which comes next, says as well.

#include <optional>

#include "tests/support/stream_builder.h"
#include "tests/tool/holdings.h"
#include "tests/tool/rehearsal.h"
#include "tests/tool/ways.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

// With a tree that has something of all kinds, and a file with metadata.
class TreeRehearsal : public Rehearsal {
 public:
    TreeRehearsal(int from, int to, const std::string& elsewhere) : Rehearsal(from, to, elsewhere) {
        MakeDir(From("tree"));
        MakeDir(From("tree/sub"));
        MakeDir(From("tree/sub/deep"));
        for (const char* const name : {"tree/a", "tree/plain", "tree/sub/b", "tree/sub/deep/c"}) {
            travel().MakeFile(From(name), name);
        }
        for (const char* const name : {"tree/a", "tree/sub", "tree/sub/deep/c"}) {
            travel().GiveMetadata(From(name));
        }
        EXPECT_EQ(0, link(From("tree/sub/b").c_str(), From("tree/second").c_str()));
        EXPECT_EQ(0, link(From("tree/a").c_str(), From("tree/third").c_str()));
        EXPECT_EQ(0, symlink("a", From("tree/link").c_str()));
        EXPECT_EQ(0, mkfifo(From("tree/fifo").c_str(), 0600));
        EXPECT_EQ(0, travel().Run({"lock", From("tree/sub/b")}).status);
        travel().MakeFile(From("file"));
        travel().GiveMetadata(From("file"));
    }
};

// ---- Every pair of kinds ------------------------------------------------------------------------

class DryRunWayTest : public WayTest<TreeRehearsal> {
 protected:
    const Rehearsal& both() const { return places(); }
    std::string From(const std::string& name) const { return both().From(name); }
    std::string To(const std::string& name) const { return both().To(name); }
};
INSTANTIATE_TEST_SUITE_P(EveryWay, DryRunWayTest, ::testing::ValuesIn(Thinned(AllWays())), NameOf);

TEST_P(DryRunWayTest, CopiesAreForeseen) {
    EXPECT_EQ(Arrow(From("file"), To("file")), both().Lines({"cp", From("file"), To("file")}));
    EXPECT_EQ(Arrow(From("file"), To("file")), both().Lines({"cp", From("file"), To("file")}));
    EXPECT_EQ(Arrow(From("file"), To("file")),
              both().Lines({"cp", "--atomic", "-p", From("file"), To("file")}));
    const std::string lines = both().Lines({"cp", "-a", From("tree"), To("copy")});
    EXPECT_THAT(lines, HasSubstr(Arrow(From("tree/sub/deep"), To("copy/sub/deep"))));
    both().Lines({"cp", "-a", "-T", From("tree"), To("copy")});
    both().Lines({"cp", "-r", From("tree"), To("plain copy")});
    both().Lines({"cp", "-r", "--atomic", From("tree"), To("copy")});
}

TEST_P(DryRunWayTest, MovesAreForeseen) {
    both().Lines({"mv", From("file"), To("file")});
    both().Lines({"cp", "-a", To("file"), From("file")});
    both().Lines({"mv", From("file"), To("file")});
    const std::string lines = both().Lines({"mv", From("tree"), To("moved")});
    EXPECT_THAT(lines, HasSubstr(Arrow(From("tree"), To("moved")).substr(0, From("tree").size())));
    both().Lines({"mv", To("moved"), From("back")});
    both().Lines({"mv", "--allow-loss", From("back"), To("moved")});
}

TEST_P(DryRunWayTest, ConversionsAreForeseen) {
    const std::string type = std::to_string(GetParam().to);
    const Arguments words = {"convert", "-r", "--to", type, From("tree"), To("tree")};
    const ToolResult said = both().Expect(words);
    EXPECT_THAT(said.out, HasSubstr(Arrow(From("tree/sub"), To("tree/sub")) +
                                    Arrow(From("tree/sub/b"), To("tree/sub/b")) +
                                    Arrow(From("tree/sub/deep"), To("tree/sub/deep")) +
                                    Arrow(From("tree/sub/deep/c"), To("tree/sub/deep/c"))));
    both().Expect(words);
    // What is there besides, and what is there otherwise.
    both().travel().MakeFile(To("tree/extra"));
    MakeDir(To("tree/sub/more"));
    both().travel().MakeFile(To("tree/plain"), "of another length");
    ASSERT_EQ(0, remove(To("tree/sub/deep/c").c_str()));
    const ToolResult again = both().Expect(words);
    EXPECT_THAT(again.out, HasSubstr(To("tree/extra") + ": extra\n"));
    EXPECT_THAT(again.out, HasSubstr(To("tree/sub/more") + ": extra\n"));
    EXPECT_EQ(2, again.status);
    Arguments json = words;
    json.emplace_back("--json");
    both().Expect(json);
    both().Expect({"convert", "--to", type, From("file"), To("file")});
}

TEST_P(DryRunWayTest, ServicesFilesAndOrphansAreForeseen) {
    if (!UsesEaDirectory(GetParam().from)) return;
    WriteFile(From("tree/@eaDir/a@MAVOPHOTO"), Ascii("of another service"));
    WriteFile(From("tree/@eaDir/gone@MAVOPHOTO"), Ascii("of no object"));
    // Metadata of nobody, in the way of what comes.
    MakeDir(To("copy"));
    PutAppleDouble(To("copy/a"), AppleDoubleOf({{kFinderInfoEntry, Repeat(1, 32)}}));
    WriteFile(To("copy/._plain"), Ascii("no AppleDouble file"));
    both().Expect({"cp", "-a", "-T", From("tree"), To("copy")});
    both().Expect({"mv", From("tree/a"), To("elsewhere")});
    both().Expect({"mv", From("tree"), To("moved")});
}

// ---- What comes before counts -------------------------------------------------------------------

class DryRunTransferTest : public ::testing::Test {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
        rehearsal_.emplace(kEaDirectory, kEaDirectory, std::string());
        for (const char* const one : {"one", "two"}) {
            MakeDir(From(one));
            MakeDir(From(one) + "/sub");
            both().travel().MakeFile(From(one) + "/x", one);
            both().travel().MakeFile(From(one) + "/sub/y", one);
        }
        both().travel().MakeFile(From("two/sub/z"));
        SetTime(From("two/x"), 2000);
        MakeDir(To("d"));
    }

    static void SetTime(const std::string& path, time_t time) {
        const timespec times[2] = {{time, 0}, {time, 0}};
        ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), times, 0));
    }

    Rehearsal& both() { return *rehearsal_; }
    std::string From(const std::string& name) const { return rehearsal_->From(name); }
    std::string To(const std::string& name) const { return rehearsal_->To(name); }

 private:
    std::optional<TreeRehearsal> rehearsal_;
};

TEST_F(DryRunTransferTest, NothingComesOverWhatHasJustCome) {
    for (const char* const command : {"cp", "mv"}) {
        const ToolResult said = both().Expect({command, From("one/x"), From("two/x"), To("d")});
        EXPECT_EQ(1, said.status);
        EXPECT_EQ("mavoea: will not overwrite just-created '" + To("d/x") + "' with '" +
                      From("two/x") + "'; give it another name\n",
                  said.err);
    }
}

TEST_F(DryRunTransferTest, DirectoriesAreMergedWithWhatHasJustCome) {
    for (const Arguments& options : std::vector<Arguments>{{}, {"-u"}, {"-n"}, {"-p"}, {"-a"}}) {
        Arguments words = {"cp", "-r", From("one/."), From("two/."), To("d")};
        words.insert(words.begin() + 2, options.begin(), options.end());
        words.back() = To("merged" + (options.empty() ? "" : options[0]));
        MakeDir(words.back());
        EXPECT_THAT(both().Lines(words),
                    HasSubstr(Arrow(From("two/./sub/z"), words.back() + "/sub/z")));
    }
}

TEST_F(DryRunTransferTest, BackupsHaveTheNamesThatTheyWillHave) {
    both().travel().MakeFile(To("d/x"), "old");
    const std::string numbered =
        both().Lines({"cp", "--backup=numbered", From("one/x"), From("two/x"), To("d")});
    EXPECT_THAT(numbered, HasSubstr("(backup: '" + To("d/x.~1~") + "')\n"));
    EXPECT_THAT(numbered, HasSubstr("(backup: '" + To("d/x.~2~") + "')\n"));
    both().travel().GiveMetadata(To("d/x"));
    EXPECT_THAT(both().Lines({"cp", "-b", From("one/x"), To("d")}), HasSubstr("(backup: '"));
    EXPECT_THAT(both().Lines({"mv", "-b", From("one/x"), To("d")}), HasSubstr("(backup: '"));
    EXPECT_THAT(both().Lines({"mv", "-b", "-T", From("one"), To("d")}), HasSubstr("(backup: '"));
}

TEST_F(DryRunTransferTest, LinksAreMadeAsForeseen) {
    const std::string link = To("d/link");
    ASSERT_EQ(0, symlink("x", link.c_str()));
    ASSERT_EQ(0, symlink("nowhere", To("d/dangling").c_str()));
    both().travel().MakeFile(To("d/x"));
    both().Lines({"cp", "-l", From("tree/a"), From("one/x"), To("d")});
    both().Lines({"cp", "-l", From("tree/a"), To("d")});
    both().Lines({"cp", "-s", From("tree/a"), From("tree/plain"), To("d")});
    both().Lines({"cp", "-sf", From("tree/a"), From("tree/plain"), To("d")});
    both().Lines({"cp", "-P", From("tree/link"), To("d")});
    both().Lines({"cp", "-r", "-P", From("tree/link"), From("tree/a"), To("d")});
    both().Lines({"cp", From("file"), link});
    both().Lines({"cp", From("file"), To("d/dangling")});
    both().Lines({"cp", "--remove-destination", From("file"), link});
    both().Lines({"cp", "-a", From("tree/a"), From("tree/third"), To("d")});
    both().Lines({"mv", From("tree/a"), From("tree/third")});
    both().Lines({"mv", From("tree/link"), To("d/dangling")});
}

TEST_F(DryRunTransferTest, OptionsCountAsTheyDo) {
    both().Lines({"cp", "--parents", From("tree/sub/b"), From("tree/sub/deep/c"), To("d")});
    both().Lines({"cp", "-a", "--parents", From("tree/sub/b"), From("tree/sub/deep/c"), To("d")});
    both().Lines({"cp", "--attributes-only", From("file"), To("d/new")});
    both().Lines({"cp", "--attributes-only", From("file"), To("d/new")});
    both().Lines({"cp", "-u", From("one/x"), To("d/new")});
    both().Lines({"cp", "-n", From("one/x"), To("d/new")});
    both().Lines({"cp", "-r", "-x", From("one"), To("d")});
    both().Lines({"mv", "-u", From("two/x"), To("d/new")});
    both().Lines({"mv", "-n", From("two/x"), To("d/new")});
    both().Lines({"mv", "-t", To("d"), From("one"), From("two")});
}

TEST_F(DryRunTransferTest, HolesAreNoBytes) {
    const std::string sparse = From("one/sparse");
    both().travel().MakeFile(sparse);
    ASSERT_EQ(0, truncate(sparse.c_str(), 3 << 20));
    for (const char* const option : {"--sparse=auto", "--sparse=always", "--sparse=never"}) {
        both().Lines({"cp", "-r", option, From("one"), To(option)});
    }
}

TEST_F(DryRunTransferTest, WhatIsRefusedIsRefused) {
    for (const char* const command : {"cp", "mv"}) {
        EXPECT_EQ(1, both().Expect({command, From("missing"), To("d")}).status);
        EXPECT_EQ(1, both().Expect({command, From("file"), From("file")}).status);
        EXPECT_EQ(1, both().Expect({command, From("file"), To("missing/file")}).status);
        EXPECT_EQ(1, both().Expect({command, "-T", From("file"), To("d")}).status);
        EXPECT_EQ(1, both().Expect({command, From("file"), From("file") + "/x"}).status);
    }
    EXPECT_EQ(1, both().Expect({"cp", From("tree"), To("d")}).status);
    EXPECT_EQ(1, both().Expect({"cp", "-r", From("tree"), From("tree/sub")}).status);
    EXPECT_EQ(1, both().Expect({"cp", "-r", From("tree"), From("file")}).status);
    EXPECT_EQ(1, both().Expect({"mv", From("tree"), From("tree/sub")}).status);
    EXPECT_EQ(1, both().Expect({"mv", From("tree"), From("file")}).status);
    EXPECT_EQ(1, both().Expect({"mv", "-T", From("one"), From("two")}).status);
}

TEST_F(DryRunTransferTest, AnEmptyDirectoryMayBeReplaced) {
    EXPECT_EQ("renamed " + Arrow(From("one"), To("d")),
              both().Lines({"mv", "-T", From("one"), To("d")}));
}

// Whose metadata would have the names of another one's.
TEST_F(DryRunTransferTest, LongNamesAreRefusedAlike) {
    const std::string name(246, 'n');
    both().travel().MakeFile(To("d/") + name + "1");
    ASSERT_EQ(0, both().travel().Run({"set", To("d/") + name + "1", Colour(), "red"}).status);
    both().Expect({"cp", From("file"), To("d/") + name + "2"});
    both().Expect({"mv", From("file"), To("d/") + name + "3"});
}

TEST_F(DryRunTransferTest, NothingIsAsked) {
    both().travel().MakeFile(To("d/x"));
    both().Expect({"cp", "-i", From("one/x"), To("d")}, "y\n");
    both().Expect({"mv", "-i", From("one/x"), To("d")}, "y\n");
}

// Who opens the one end of a pipe waits for the other; what is written to a terminal is seen.
TEST_F(DryRunTransferTest, WhatIsNoFileIsNotOpened) {
    const std::string fifo = From("tree/fifo");
    EXPECT_EQ(Arrow(fifo, To("d/fifo")), both().Look({"cp", fifo, To("d")}).out);
    EXPECT_EQ(Arrow(From("file"), fifo), both().Look({"cp", From("file"), fifo}).out);
    EXPECT_EQ(Arrow("/dev/zero", To("d/zero")), both().Look({"cp", "/dev/zero", To("d")}).out);
    both().Lines({"cp", From("file"), "/dev/null"});
    both().Lines({"cp", "-r", fifo, "/dev/null", To("d")});
    both().Lines({"mv", fifo, To("d")});
}

TEST_F(DryRunTransferTest, WhatAnotherUserMayNotDoIsForeseen) {
    chmod(From("").c_str(), 0755);
    chmod(std::filesystem::path(From("")).parent_path().parent_path().c_str(), 0755);
    chmod(To("").c_str(), 0755);
    chmod(From("two/x").c_str(), 0600);
    for (Arguments words : std::vector<Arguments>{{"cp", From("file"), To("d")},
                                                  {"cp", From("file"), From("one/x")},
                                                  {"cp", "-r", From("one"), To("d")},
                                                  {"cp", From("two/x"), "/dev/null"},
                                                  {"mv", From("file"), From("other")},
                                                  {"mv", From("file"), From("one/x")},
                                                  {"mv", From("one"), To("d")}}) {
        SCOPED_TRACE(::testing::PrintToString(words));
        const ToolResult dry = both().Look(words, {.user = 54321});
        words.insert(words.begin() + 1, "--verbose");
        const ToolResult real = RunTool(both().travel().WithVolumes(words), {}, {.user = 54321});
        EXPECT_EQ(1, dry.status);
        EXPECT_EQ(real.status, dry.status);
        EXPECT_EQ(real.out, dry.out);
        EXPECT_EQ(real.err, dry.err);
    }
}

TEST_F(DryRunTransferTest, WhatIsImmutableStaysAsForeseen) {
    const Immutable file(From("file"));
    if (!file.ok()) GTEST_SKIP() << "no immutable files here";
    both().keeps_times = true;
    EXPECT_EQ(1, both().Expect({"cp", From("one/x"), From("file")}).status);
    EXPECT_EQ(1, both().Expect({"mv", From("file"), To("d")}).status);
    EXPECT_EQ(1, both().Expect({"mv", From("one/x"), From("file")}).status);
    const Immutable directory(To("d"));
    EXPECT_EQ(1, both().Expect({"cp", From("one/x"), To("d")}).status);
    EXPECT_EQ(1, both().Expect({"cp", "-r", From("one"), To("d")}).status);
    EXPECT_EQ(1, both().Expect({"mv", From("one/x"), To("d")}).status);
}

// ---- Large trees --------------------------------------------------------------------------------

TEST_F(DryRunTransferTest, DeepTreesAreForeseen) {
    std::string path = From("deep");
    MakeDir(path);
    for (int level = 0; level < 200; ++level) {
        path += "/d";
        MakeDir(path);
    }
    both().Lines({"cp", "-r", From("deep"), To("d")});
    const auto second = std::make_unique<SecondVolume>();
    MAVOEA_SKIP_WITHOUT_SECOND(*second);
    both().Lines({"mv", From("deep"), second->path()});
}

// ---- Usage --------------------------------------------------------------------------------------

TEST_F(DryRunTransferTest, ALogHasNothingOfADryRun) {
    for (const char* const option : {"--log", "--resume"}) {
        const ToolResult said = both().travel().Run(
            {"convert", "-n", option, To("log"), "--to", "1", From("file"), To("d/file")});
        EXPECT_EQ(2, said.status);
        EXPECT_THAT(said.err, HasSubstr(std::string("--dry-run excludes ") + option));
    }
    EXPECT_THAT(NamesIn(To("d")), ElementsAre());
}

TEST_F(DryRunTransferTest, APlanIsForeseen) {
    const std::string plan = To("plan");
    ASSERT_EQ(0, both()
                     .travel()
                     .Run({"plan", "-r", "--to", "7", "--output", plan, From("one"), To("d/one")})
                     .status);
    both().keeps_times = true;
    const ToolResult said = both().Expect({"convert", "--plan", plan});
    EXPECT_EQ(0, said.status);
    EXPECT_THAT(said.out, HasSubstr(Arrow(From("one/sub/y"), To("d/one/sub/y"))));
}

TEST_F(DryRunTransferTest, ConversionsSayTheSameWithAnyNumberOfWorkers) {
    for (int i = 0; i < 300; ++i) both().travel().MakeFile(From("two/f" + std::to_string(i)));
    const auto lines = [&](const char* jobs) {
        const std::string copy = To(std::string("two") + jobs);
        const ToolResult said = both().travel().Run(
            {"convert", "-v", "-r", "-j", jobs, "--to", "1", From("two"), copy});
        EXPECT_THAT(said, Succeeded());
        EXPECT_THAT(said.out, HasSubstr(Arrow(From("two/f299"), copy + "/f299")));
        std::string out = said.out;
        for (std::size_t at; (at = out.find(copy)) != std::string::npos;) {
            out.erase(at, copy.size());
        }
        return out;
    };
    EXPECT_EQ(lines("1"), lines("2"));
}

}  // namespace
}  // namespace mavoea::test
