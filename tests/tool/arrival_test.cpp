// That what arrives, and what is there, is all of it: things that one name, one attribute or one
// directory could be given of two.

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "tests/tool/stopped_tool.h"
#include "tests/tool/tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;

constexpr char kFork[] = "com.apple.ResourceFork";

std::optional<std::string> AttributeOf(const std::string& path, const std::string& name) {
    std::array<char, 256> value;
    const ssize_t size = getxattr(path.c_str(), name.c_str(), value.data(), value.size());
    if (size < 0) return std::nullopt;
    return std::string(value.data(), static_cast<std::size_t>(size));
}

// Two directories on one file system that are declared to be places of two kinds.
class Shares {
 public:
    Shares(std::string from, std::string to) : from_(std::move(from)), to_(std::move(to)) {
        for (const char* name : {"from", "to"}) std::filesystem::create_directory(dir_ / name);
    }

    std::string From(const std::string& name) const { return dir_ / ("from/" + name); }
    std::string To(const std::string& name) const { return dir_ / ("to/" + name); }

    ToolResult Run(Arguments arguments) const {
        arguments.insert(arguments.begin(), {"--volume", dir_ / "from" + "=" + from_, "--volume",
                                             dir_ / "to" + "=" + to_});
        return RunTool(arguments);
    }
    void Set(const std::string& path, const std::string& name, const std::string& value) const {
        ASSERT_EQ(0, Run({"set", path, name, value}).status) << path << ' ' << name;
    }
    std::string Get(const std::string& path, const std::string& name) const {
        return Run({"get", path, name}).out;
    }

 private:
    TempDir dir_;
    std::string from_;
    std::string to_;
};

struct Ends {
    std::string from;
    std::string to;
};

std::string NameOf(const ::testing::TestParamInfo<Ends>& info) {
    std::string name = info.param.from + "_to_" + info.param.to;
    std::replace(name.begin(), name.end(), '-', '_');
    return name;
}

class EndsTest : public ::testing::TestWithParam<Ends> {
 protected:
    void SetUp() override { MAVOEA_SKIP_WITHOUT_ATTRIBUTES(TempDir().path()); }

    Shares shares_{GetParam().from, GetParam().to};
};

// ---- Several names of one file ------------------------------------------------------------------

// The fork is beside each name in one place, and in the file itself in the other.
class ForkOfANameTest : public EndsTest {};

TEST_P(ForkOfANameTest, StaysWhenAnotherNameHasNone) {
    for (const Arguments& command : {Arguments{"cp", "-a"}, Arguments{"mv"}}) {
        SCOPED_TRACE(command.front());
        std::filesystem::remove_all(shares_.From("t"));
        std::filesystem::remove_all(shares_.To("t"));
        std::filesystem::create_directory(shares_.From("t"));
        WriteFile(shares_.From("t/b"), Ascii("data"));
        ASSERT_EQ(0, link(shares_.From("t/b").c_str(), shares_.From("t/a").c_str()));
        shares_.Set(shares_.From("t/a"), kFork, "fork");
        Arguments arguments = command;
        arguments.insert(arguments.end(), {shares_.From("t"), shares_.To("t")});
        const ToolResult result = shares_.Run(arguments);
        EXPECT_EQ(2, result.status);
        EXPECT_THAT(result.err, HasSubstr("being one file with "));
        EXPECT_EQ("fork", shares_.Get(shares_.To("t/a"), kFork));
        EXPECT_EQ("", shares_.Get(shares_.To("t/b"), kFork));
        EXPECT_EQ("fork", shares_.Get(shares_.From("t/a"), kFork));
    }
}

INSTANTIATE_TEST_SUITE_P(Places, ForkOfANameTest,
                         ::testing::Values(Ends{"samba", "linux"}, Ends{"samba-stream", "linux"},
                                           Ends{"netatalk", "samba-all-streams"},
                                           Ends{"appledouble", "linux"},
                                           Ends{"eadir", "samba-all-streams"}),
                         NameOf);

// Where each name has one of its own, they may differ.
class ForksOfNamesTest : public EndsTest {};

TEST_P(ForksOfNamesTest, AreKeptAndTheFileStaysOne) {
    std::filesystem::create_directory(shares_.From("t"));
    WriteFile(shares_.From("t/b"), Ascii("data"));
    ASSERT_EQ(0, link(shares_.From("t/b").c_str(), shares_.From("t/a").c_str()));
    shares_.Set(shares_.From("t/a"), kFork, "one");
    shares_.Set(shares_.From("t/b"), kFork, "another");
    EXPECT_THAT(shares_.Run({"cp", "-a", shares_.From("t"), shares_.To("t")}), Succeeded());
    EXPECT_TRUE(std::filesystem::equivalent(shares_.To("t/a"), shares_.To("t/b")));
    EXPECT_EQ("one", shares_.Get(shares_.To("t/a"), kFork));
    EXPECT_EQ("another", shares_.Get(shares_.To("t/b"), kFork));
}

INSTANTIATE_TEST_SUITE_P(Places, ForksOfNamesTest,
                         ::testing::Values(Ends{"samba", "netatalk"}, Ends{"eadir", "samba"},
                                           Ends{"netatalk", "appledouble"}),
                         NameOf);

// ---- Further names of a file --------------------------------------------------------------------

class LinkAcrossKindsTest : public EndsTest {};

TEST_P(LinkAcrossKindsTest, IsRefusedWhereItWouldChangeTheSource) {
    WriteFile(shares_.From("a"), Ascii("data"));
    EXPECT_THAT(shares_.Run({"cp", "-l", shares_.From("a"), shares_.To("bare")}), Succeeded());
    shares_.Set(shares_.From("a"), "user.colour", "blue");
    const auto names = [&] {
        std::array<char, 512> list;
        const ssize_t size = listxattr(shares_.From("a").c_str(), list.data(), list.size());
        return std::string(list.data(), static_cast<std::size_t>(std::max<ssize_t>(0, size)));
    };
    const std::string before = names();
    for (const bool dry : {true, false}) {
        Arguments arguments = {"cp", "-l", shares_.From("a"), shares_.To("b")};
        if (dry) arguments.insert(arguments.begin() + 1, "--dry-run");
        const ToolResult result = shares_.Run(arguments);
        EXPECT_EQ(1, result.status);
        EXPECT_THAT(result.err, HasSubstr("would keep its metadata in the file itself"));
    }
    EXPECT_EQ(before, names());
    EXPECT_FALSE(std::filesystem::exists(shares_.To("b")));
    EXPECT_EQ("blue", shares_.Get(shares_.From("a"), "user.colour"));
}

INSTANTIATE_TEST_SUITE_P(Places, LinkAcrossKindsTest,
                         ::testing::Values(Ends{"eadir", "linux"}, Ends{"samba", "linux"},
                                           Ends{"linux", "samba"}, Ends{"appledouble", "7"}),
                         NameOf);

// An attribute of the file's own may be metadata where it goes: all its names have that.
TEST(NamesOfOneFileTest, StayOneWithWhatBecomesMetadata) {
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
    const Shares shares("samba-all-streams", "netatalk");
    std::filesystem::create_directory(shares.From("d"));
    WriteFile(shares.From("d/one"), Ascii("data"));
    ASSERT_EQ(0, setxattr(shares.From("d/one").c_str(), "user.own", "value", 5, 0));
    ASSERT_EQ(0, link(shares.From("d/one").c_str(), shares.From("d/two").c_str()));
    EXPECT_THAT(shares.Run({"cp", "-a", shares.From("d"), shares.To("d")}), Succeeded());
    EXPECT_TRUE(std::filesystem::equivalent(shares.To("d/one"), shares.To("d/two")));
    EXPECT_EQ("value", AttributeOf(shares.To("d/one"), "user.own"));
}

TEST(SpecialFileTest, KeepsTheBitsOfItsMode) {
    MAVOEA_SKIP_UNLESS_ROOT();
    const Shares shares("eadir", "appledouble");
    for (const mode_t mode : {mode_t{02644}, mode_t{04755}, mode_t{0444}}) {
        std::filesystem::remove(shares.From("fifo"));
        ASSERT_EQ(0, mkfifo(shares.From("fifo").c_str(), 0600));
        ASSERT_EQ(0, chown(shares.From("fifo").c_str(), 65534, 65534));
        ASSERT_EQ(0, chmod(shares.From("fifo").c_str(), mode));
        for (const std::string command : {"cp", "mv"}) {
            std::filesystem::remove(shares.To("fifo"));
            Arguments arguments = {command, shares.From("fifo"), shares.To("fifo")};
            if (command == "cp") arguments.insert(arguments.begin() + 1, "-a");
            EXPECT_THAT(shares.Run(arguments), Succeeded());
            EXPECT_EQ(mode, StatusOf(shares.To("fifo")).st_mode & 07777) << command;
        }
    }
}

// A name of more than 242 bytes is shortened where its metadata is, and then is no longer the name
// of an object, but may begin with another one's.
TEST(LikeNamesTest, AnObjectKeepsWhatAnotherOnesNameBegins) {
    const std::string begin(240, 'n');
    const std::string check(241, 'n');
    for (const auto& [other, name] :
         {std::pair(begin, begin + "@MavoEAStream"), std::pair(check, check + "123456789012V")}) {
        for (const std::string type : {"eadir", "fileea"}) {
            SCOPED_TRACE(type + ' ' + name.substr(240));
            const Shares shares(type, type);
            WriteFile(shares.From(other), Ascii("other"));
            WriteFile(shares.From(name), Ascii("data"));
            shares.Set(shares.From(name), "user.colour", "blue");
            const std::vector<std::string> files = NamesIn(shares.From("@eaDir"));
            EXPECT_THAT(shares.Run({"mv", shares.From(other), shares.To("")}), Succeeded());
            EXPECT_EQ(files, NamesIn(shares.From("@eaDir")));
            EXPECT_EQ("blue", shares.Get(shares.From(name), "user.colour"));
            EXPECT_THAT(shares.Run({"mv", shares.From(name), shares.To("")}), Succeeded());
            EXPECT_EQ("blue", shares.Get(shares.To(name), "user.colour"));
            EXPECT_THAT(shares.Run({"rm", shares.To(other)}), Succeeded());
            EXPECT_EQ("blue", shares.Get(shares.To(name), "user.colour"));
        }
    }
}

TEST(ReadOnlySourceTest, ACopyHasItsAttributesToo) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    const Shares shares("appledouble", "netatalk");
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES(shares.From(""));
    for (const char* name : {"f", "d"}) {
        if (*name == 'd') {
            std::filesystem::create_directory(shares.From(name));
        } else {
            WriteFile(shares.From(name), Ascii("data"));
        }
        ASSERT_EQ(0, setxattr(shares.From(name).c_str(), "user.own", "own", 3, 0));
        ASSERT_EQ(0, chown(shares.From(name).c_str(), 1234, 1234));
        ASSERT_EQ(0, chmod(shares.From(name).c_str(), *name == 'd' ? 0555 : 0444));
    }
    ASSERT_EQ(0, chmod(shares.To("").c_str(), 0777));
    AsUser(1234, Root::kGivenUp, [&] {
        EXPECT_THAT(shares.Run({"cp", "-r", shares.From("f"), shares.From("d"), shares.To("")}),
                    Succeeded());
    });
    for (const char* name : {"f", "d"}) {
        EXPECT_EQ("own", AttributeOf(shares.To(name), "user.own")) << name;
    }
    EXPECT_EQ(0444u, StatusOf(shares.To("f")).st_mode & 07777);
    EXPECT_EQ(0555u, StatusOf(shares.To("d")).st_mode & 07777);
}

// ---- A user's attribute of the name that some of the metadata has -------------------------------

class NameOfTwoTest : public EndsTest {
 protected:
    // As the volume of the destination spells it in an attribute of the file.
    std::string name() const { return GetParam().to == "7" ? "user.com.x" : "com.x"; }

    // Samba writes a NUL behind a value of netatalk's.
    std::string stored() const {
        return GetParam().to == "netatalk-samba" ? std::string("metadata\0", 9) : "metadata";
    }

    void MakeSource(const std::string& users) const {
        WriteFile(shares_.From("f"), Ascii("data"));
        for (const auto& [attribute, value] :
             {std::pair<const char*, std::string>{"user.com.x", users}, {"user.other", "other"}}) {
            ASSERT_EQ(
                0, setxattr(shares_.From("f").c_str(), attribute, value.data(), value.size(), 0));
        }
        shares_.Set(shares_.From("f"), name(), "metadata");
    }
};

TEST_P(NameOfTwoTest, OneOfThemIsMissedByName) {
    MakeSource("the user's");
    for (const Arguments& command : {Arguments{"cp"}, Arguments{"cp", "-a"}, Arguments{"mv"}}) {
        SCOPED_TRACE(::testing::PrintToString(command));
        std::filesystem::remove(shares_.To("f"));
        const std::string words =
            "extended attribute \"user.com.x\" (its \"" + name() + "\" has that name there)";
        for (const bool dry : {true, false}) {
            Arguments arguments = command;
            arguments.insert(arguments.end(), {shares_.From("f"), shares_.To("f")});
            if (dry) arguments.insert(arguments.begin() + 1, "--dry-run");
            const ToolResult result = shares_.Run(arguments);
            EXPECT_EQ(2, result.status);
            EXPECT_THAT(result.err, HasSubstr(words));
        }
        EXPECT_EQ(stored(), AttributeOf(shares_.To("f"), "user.com.x"));
        EXPECT_EQ("other", AttributeOf(shares_.To("f"), "user.other"));
        EXPECT_EQ("the user's", AttributeOf(shares_.From("f"), "user.com.x"));
    }
}

TEST_P(NameOfTwoTest, ACarriedOneIsMissedAsWellAndTheCopysOwnOnesStay) {
    MakeSource("the user's");
    WriteFile(shares_.To("f"), Ascii("data"));
    for (const char* attribute : {"user.com.x", "user.other"}) {
        const std::string value = *AttributeOf(shares_.From("f"), attribute);
        ASSERT_EQ(0, setxattr(shares_.To("f").c_str(), attribute, value.data(), value.size(), 0));
    }
    const ToolResult result = shares_.Run({"carry", shares_.From("f"), shares_.To("f")});
    EXPECT_EQ(2, result.status);
    EXPECT_THAT(result.err, HasSubstr("extended attribute \"user.com.x\""));
    EXPECT_EQ("other", AttributeOf(shares_.To("f"), "user.other"));
}

TEST_P(NameOfTwoTest, APlanSaysSo) {
    MakeSource("the user's");
    const ToolResult plan =
        shares_.Run({"plan", "-r", "--to", GetParam().to, shares_.From("."), shares_.To("new")});
    EXPECT_EQ(1, plan.status) << plan.err;
    EXPECT_THAT(plan.out, HasSubstr("extended attribute \"user.com.x\""));
}

TEST_P(NameOfTwoTest, TwoThatSayTheSameAreOne) {
    MakeSource(stored());
    EXPECT_THAT(shares_.Run({"mv", shares_.From("f"), shares_.To("f")}), Succeeded());
    EXPECT_EQ("metadata", shares_.Get(shares_.To("f"), name()));
}

INSTANTIATE_TEST_SUITE_P(Places, NameOfTwoTest,
                         ::testing::Values(Ends{"eadir", "linux"}, Ends{"appledouble", "7"},
                                           Ends{"samba", "linux"}, Ends{"samba-stream", "7"},
                                           Ends{"eadir", "netatalk-samba"}),
                         NameOf);

// ---- Files that change in the middle
// --------------------------------------------------------------

// Another writer puts a whole new file in the place of the stream that has just been opened.
TEST(ReplacedStreamTest, AChangeGoesIntoTheFileThatIsThere) {
    MAVOEA_SKIP_UNLESS_STOPPED();
    const Shares shares("eadir", "eadir");
    WriteFile(shares.From("f"), Ascii("data"));
    shares.Set(shares.From("f"), "user.first", "first");
    const std::string stream = shares.From("@eaDir/f@MavoEAStream");
    const std::string next = shares.From("next");
    std::filesystem::copy_file(stream, next);
    const std::string tree = std::filesystem::path(stream).parent_path().parent_path();
    bool replaced = false;
    const StoppedRun run = RunStopped(
        {"set", shares.From("f"), "user.second", "second"}, tree,
        [&](const FileCall& call) {
            if (replaced || call.open_file != stream) return true;
            std::filesystem::rename(next, stream);
            replaced = true;
            return true;
        },
        Stops::kAtLocksToo);
    EXPECT_TRUE(replaced);
    EXPECT_EQ(0, run.status) << run.err;
    EXPECT_EQ("first", shares.Get(shares.From("f"), "user.first"));
    EXPECT_EQ("second", shares.Get(shares.From("f"), "user.second"));
}

// ---- Objects whose place is that of metadata ----------------------------------------------------

class PlaceOfMetadataTest : public EndsTest {};

TEST_P(PlaceOfMetadataTest, TakesNoObjectWhateverIsToBecomeOfWhatIsThere) {
    for (const std::string option : {"--no-clobber", "--update", "--backup=simple",
                                     "--backup=numbered", "--force", "--verbose"}) {
        for (const std::string command : {"cp", "mv"}) {
            SCOPED_TRACE(command + ' ' + option);
            for (const char* name : {"t", "._y"}) std::filesystem::remove_all(shares_.From(name));
            for (const char* name : {"t", "d"}) std::filesystem::remove_all(shares_.To(name));
            // Of the same run, and of an object that is there.
            std::filesystem::create_directory(shares_.From("t"));
            WriteFile(shares_.From("t/x"), Ascii("data"));
            shares_.Set(shares_.From("t/x"), kFork, "fork of x");
            WriteFile(shares_.From("t/._x"), Ascii("a file"));
            std::filesystem::create_directory(shares_.To("d"));
            WriteFile(shares_.To("d/y"), Ascii("data"));
            shares_.Set(shares_.To("d/y"), kFork, "fork of y");
            WriteFile(shares_.From("._y"), Ascii("a file"));
            for (const char* name : {"t/._x", "._y"}) {
                const timespec old[] = {{1'000'000'000, 0}, {1'000'000'000, 0}};
                ASSERT_EQ(0, utimensat(AT_FDCWD, shares_.From(name).c_str(), old, 0));
            }
            Arguments arguments = {command, option};
            if (command == "cp") arguments.emplace_back("-r");
            for (const auto& [from, to] : {std::pair("t", "t"), {"._y", "d/._y"}}) {
                Arguments all = arguments;
                all.insert(all.end(), {shares_.From(from), shares_.To(to)});
                const ToolResult result = shares_.Run(all);
                EXPECT_EQ(1, result.status) << from;
                EXPECT_THAT(result.err, HasSubstr("its place is that of metadata")) << from;
            }
            EXPECT_EQ("fork of x", shares_.Get(shares_.To("t/x"), kFork));
            EXPECT_EQ("fork of y", shares_.Get(shares_.To("d/y"), kFork));
            EXPECT_EQ(Ascii("a file"), ReadFile(shares_.From("t/._x")));
            EXPECT_EQ(Ascii("a file"), ReadFile(shares_.From("._y")));
            EXPECT_EQ((std::vector<std::string>{"._y", "y"}), NamesIn(shares_.To("d")));
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Places, PlaceOfMetadataTest,
                         ::testing::Values(Ends{"eadir", "appledouble"}, Ends{"eadir", "samba"}),
                         NameOf);

TEST(PlaceOfAnEaDirectoryTest, TakesNoObjectEither) {
    const Shares shares("eadir", "eadir");
    for (const std::string option :
         {"--no-clobber", "--update", "--backup=simple", "--backup=numbered", "--force"}) {
        for (const std::string command : {"cp", "mv"}) {
            SCOPED_TRACE(command + ' ' + option);
            WriteFile(shares.From("@eaDir"), Ascii("a file"));
            WriteFile(shares.To("y"), Ascii("data"));
            shares.Set(shares.To("y"), "user.colour", "blue");
            const ToolResult result =
                shares.Run({command, option, shares.From("@eaDir"), shares.To("")});
            EXPECT_EQ(1, result.status);
            EXPECT_THAT(result.err, HasSubstr("its place is that of metadata"));
            EXPECT_EQ("blue", shares.Get(shares.To("y"), "user.colour"));
            EXPECT_EQ(Ascii("a file"), ReadFile(shares.From("@eaDir")));
        }
    }
}

// ---- Directories that are there -----------------------------------------------------------------

class MergedDirectoryTest : public EndsTest {
 protected:
    void SetUp() override {
        EndsTest::SetUp();
        for (const std::string& tree : {shares_.From("t"), shares_.To("t")}) {
            std::filesystem::create_directory(tree);
        }
        shares_.Set(shares_.To("t"), "user.own", "own");
        shares_.Set(shares_.To("t"), "user.both", "there");
        shares_.Set(shares_.From("t"), "user.both", "comes");
        shares_.Set(shares_.From("t"), "user.new", "new");
    }

    void ExpectBoth(const std::string& both) const {
        EXPECT_EQ("own", shares_.Get(shares_.To("t"), "user.own"));
        EXPECT_EQ(both, shares_.Get(shares_.To("t"), "user.both"));
        EXPECT_EQ("new", shares_.Get(shares_.To("t"), "user.new"));
    }
};

TEST_P(MergedDirectoryTest, ACopyKeepsWhatTheSourceHasNot) {
    for (const Arguments& options : {Arguments{"-r"}, Arguments{"-a"}, Arguments{"-rb"}}) {
        shares_.Set(shares_.To("t"), "user.both", "there");
        Arguments arguments = {"cp", "-T", shares_.From("t"), shares_.To("t")};
        arguments.insert(arguments.begin() + 1, options.begin(), options.end());
        EXPECT_THAT(shares_.Run(arguments), Succeeded());
        ExpectBoth("comes");
    }
}

TEST_P(MergedDirectoryTest, WhatIsToBeLeftAloneKeepsItsValuesToo) {
    for (const Arguments& options : {Arguments{"-rn"}, Arguments{"-au"}, Arguments{"-an"}}) {
        Arguments arguments = {"cp", "-T", shares_.From("t"), shares_.To("t")};
        arguments.insert(arguments.begin() + 1, options.begin(), options.end());
        EXPECT_THAT(shares_.Run(arguments), Succeeded());
        ExpectBoth("there");
    }
}

TEST_P(MergedDirectoryTest, ADirectoryWithNothingTakesNothingAway) {
    std::filesystem::remove_all(shares_.From(""));
    std::filesystem::create_directories(shares_.From("t"));
    EXPECT_THAT(shares_.Run({"cp", "-r", shares_.From("t/."), shares_.To("t")}), Succeeded());
    EXPECT_EQ("own", shares_.Get(shares_.To("t"), "user.own"));
    EXPECT_EQ("there", shares_.Get(shares_.To("t"), "user.both"));
}

// A conversion that is given again makes the copy the same.
TEST_P(MergedDirectoryTest, AConversionLeavesNothingElse) {
    if (GetParam().from == GetParam().to) GTEST_SKIP() << "there is nothing to convert";
    EXPECT_THAT(
        shares_.Run({"convert", "-r", shares_.From("t"), shares_.To("t"), "--to", GetParam().to}),
        ::testing::Field(&ToolResult::status, 0));
    EXPECT_EQ("", shares_.Get(shares_.To("t"), "user.own"));
    EXPECT_EQ("comes", shares_.Get(shares_.To("t"), "user.both"));
}

INSTANTIATE_TEST_SUITE_P(Places, MergedDirectoryTest,
                         ::testing::Values(Ends{"eadir", "appledouble"}, Ends{"eadir", "eadir"},
                                           Ends{"eadir", "2"}, Ends{"7", "7"},
                                           Ends{"appledouble", "linux"}, Ends{"linux", "samba"},
                                           Ends{"samba", "netatalk"}),
                         NameOf);

// When a directory was made that was there is not for who comes to say.
TEST(MergedDatesTest, AConversionLeavesWhenADirectoryWasMade) {
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
    const Shares shares("samba", "samba");
    for (const std::string& path : {shares.From("d"), shares.To("d")}) {
        std::filesystem::create_directory(path);
    }
    const std::string created = "2020-05-01T09:30:00Z";
    ASSERT_EQ(0, shares.Run({"set-info", "--created", created, shares.To("d")}).status);
    EXPECT_THAT(shares.Run({"convert", "-r", "--to", "samba", shares.From("d"), shares.To("d")}),
                Succeeded());
    EXPECT_THAT(shares.Run({"show", shares.To("d")}).out, HasSubstr(created));
}

TEST(MergedCommentTest, EntriesOfADirectoryStayBesideThoseThatCome) {
    const Shares shares("eadir", "eadir");
    for (const std::string& tree : {shares.From("t"), shares.To("t")}) {
        std::filesystem::create_directory(tree);
    }
    ASSERT_EQ(0, shares.Run({"set-info", shares.To("t"), "--comment", "kept"}).status);
    shares.Set(shares.From("t"), "user.new", "new");
    EXPECT_THAT(shares.Run({"cp", "-rT", shares.From("t"), shares.To("t")}), Succeeded());
    EXPECT_THAT(shares.Run({"show", shares.To("t")}).out, HasSubstr("kept"));
    EXPECT_EQ("new", shares.Get(shares.To("t"), "user.new"));
}

// What is there and cannot be read to its end is not written anew.
TEST(MergedDamageTest, ADamagedDirectoryStaysAsItIs) {
    const Shares shares("eadir", "eadir");
    for (const std::string& tree : {shares.From("t"), shares.To("t")}) {
        std::filesystem::create_directory(tree);
    }
    shares.Set(shares.To("t"), "user.own", "own");
    const std::string stream = shares.To("@eaDir/t@MavoEAStream");
    Bytes bytes = ReadFile(stream);
    ASSERT_LT(4u, bytes.size());
    bytes[0] ^= 0xFF;
    WriteFile(stream, bytes);
    EXPECT_THAT(shares.Run({"cp", "-rT", shares.From("t"), shares.To("t")}), Succeeded());
    ASSERT_TRUE(std::filesystem::exists(stream));
    EXPECT_EQ(bytes, ReadFile(stream));
    shares.Set(shares.From("t"), "user.new", "new");
    EXPECT_EQ(1, shares.Run({"cp", "-rT", shares.From("t"), shares.To("t")}).status);
    ASSERT_TRUE(std::filesystem::exists(stream));
    EXPECT_EQ(bytes, ReadFile(stream));
}

}  // namespace
}  // namespace mavoea::test
