// Dry runs of cp where later steps meet what earlier ones would have made, where something is in
// the way, and where not everything arrives.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <optional>

#include "tests/support/process.h"
#include "tests/tool/habits.h"
#include "tests/tool/holdings.h"
#include "tests/tool/rehearsal.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;

// A lock of a whole file by another process, which no descriptor that this one closes ends.
class ServiceLock {
 public:
    explicit ServiceLock(const std::string& path) {
        int ready[2];
        int end[2];
        if (pipe(ready) != 0 || pipe(end) != 0) abort();
        child_ = fork();
        if (child_ == 0) {
            close(end[1]);
            const HeldLock lock(path);
            char c = ::testing::Test::HasFailure() ? 'n' : 'y';
            if (write(ready[1], &c, 1) == 1) (void)!read(end[0], &c, 1);
            _exit(0);
        }
        for (const int fd : {ready[1], end[0]}) close(fd);
        char c = 'n';
        EXPECT_EQ(1, read(ready[0], &c, 1));
        EXPECT_EQ('y', c) << path;
        close(ready[0]);
        end_ = end[1];
    }
    ~ServiceLock() {
        close(end_);
        waitpid(child_, nullptr, 0);
    }
    ServiceLock(const ServiceLock&) = delete;
    ServiceLock& operator=(const ServiceLock&) = delete;

 private:
    pid_t child_;
    int end_ = -1;
};

// Nothing at the destination, and a source with next to nothing in it.
class DryRunCopyTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        MAVOEA_SKIP_UNLESS_ROOT();
        MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
        both_.emplace(GetParam(), GetParam());
    }

    Rehearsal& both() { return *both_; }
    std::string From(const std::string& name) const { return both_->From(name); }
    std::string To(const std::string& name) const { return both_->To(name); }
    ToolResult Expect(const Arguments& arguments) const { return both_->Expect(arguments); }
    std::string Lines(const Arguments& arguments) const { return both_->Lines(arguments); }
    std::string ArrowOf(const std::string& name) const { return Arrow(From(name), To(name)); }

    void Make(const std::string& path, const std::string& data = "data") const {
        both_->travel().MakeFile(path, data);
    }
    void MakeWithMetadata(const std::string& path, const std::string& colour = "blue") const {
        Make(path);
        both_->travel().GiveMetadata(path, colour);
    }

    static void SetTime(const std::string& path, time_t time) {
        const timespec times[2] = {{time, 0}, {time, 0}};
        ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW)) << path;
    }

    static bool HasEaDirectory() { return UsesEaDirectory(GetParam()); }

 private:
    std::optional<Rehearsal> both_;
};
INSTANTIATE_TEST_SUITE_P(
    VolumeTypes, DryRunCopyTest,
    ::testing::ValuesIn(Types({kAppleDouble, kEaDirectory, kFileEa, kXattr, kSamba})), TypeName);

// ---- What has come before -----------------------------------------------------------------------

TEST_P(DryRunCopyTest, TwoOfOneNameAreNotForeseenToArriveInOnePlace) {
    for (const char* const one : {"one", "two"}) {
        MakeDir(From(one));
        MakeWithMetadata(From(one) + "/x", one);
    }
    MakeDir(To("d"));
    const ToolResult said = Expect({"cp", From("one/x"), From("two/x"), To("d")});
    EXPECT_EQ(Arrow(From("one/x"), To("d/x")) + "1 copied (4 bytes), 1 failed\n", said.out);
    EXPECT_EQ("mavoea: will not overwrite just-created '" + To("d/x") + "' with '" + From("two/x") +
                  "'; give it another name\n",
              said.err);
    EXPECT_EQ(1, said.status);
    // The same source twice.
    EXPECT_EQ(0, Expect({"cp", "-r", From("one"), From("one"), To("d")}).status);
    // Below a directory that comes first, and of the source's own path.
    Expect({"cp", "-r", "--parents", From("one"), From("one/x"), To("d")});
    Expect({"cp", "-b", From("one/x"), From("two/x"), To("d")});
    Expect({"cp", "--remove-destination", From("one/x"), From("two/x"), To("d")});
    Expect({"cp", "--atomic", From("one/x"), From("two/x"), To("d")});
    Expect({"cp", "-l", From("one/x"), From("two/x"), To("d")});
    Expect({"cp", "-f", "-l", From("one/x"), From("two/x"), To("d")});
    Expect({"cp", "-n", From("one/x"), From("two/x"), To("d")});
    Expect({"cp", "-u", From("one/x"), From("two/x"), To("d")});
}

TEST_P(DryRunCopyTest, TreesAreMergedWithWhatHasJustComeAndWhatWasThere) {
    for (const char* const one : {"one", "two"}) {
        MakeDir(From(one));
        MakeDir(From(one) + "/sub");
        MakeWithMetadata(From(one) + "/sub/y", one);
        both().travel().GiveMetadata(From(one) + "/sub", one);
    }
    Make(From("two/sub/z"));
    MakeDir(To("new"));
    for (const Arguments& options : std::vector<Arguments>{{"-r"},
                                                           {"-r", "-u"},
                                                           {"-r", "-n"},
                                                           {"-a"},
                                                           {"-r", "-b"},
                                                           {"-a", "--backup=numbered"},
                                                           {"-r", "-l"},
                                                           {"-r", "--attributes-only"},
                                                           {"-r", "--remove-destination"},
                                                           {"-a", "--atomic", "-u"},
                                                           {"-r", "-s"}}) {
        ASSERT_EQ(0, both().travel().Run({"rm", "-r", "-f", To("new/sub")}).status);
        Arguments words = {"cp"};
        words.insert(words.end(), options.begin(), options.end());
        words.insert(words.end(), {From("one/."), From("two/."), To("new")});
        const ToolResult said = Expect(words);
        EXPECT_THAT(said.out, HasSubstr("'" + From("two/./sub/z") + "' -> '"));
        EXPECT_EQ(std::filesystem::exists(To("new/sub/z")), true);
        // What is there now is met by the next one.
        Expect(words);
    }
}

// A copy is as old as its source only where times are kept.
TEST_P(DryRunCopyTest, WhatIsNewerIsForeseenByTheTimesThatCopiesWillHave) {
    both().keeps_times = true;
    const auto make = [&](const std::string& path, time_t time) {
        Make(path);
        SetTime(path, time);
    };
    for (const char* const one : {"one", "two"}) MakeDir(From(one));
    make(From("one/older"), 1000);
    make(From("two/older"), 2000);
    make(From("one/newer"), 2000);
    make(From("two/newer"), 1000);
    const auto lines = [&](const Arguments& options, const std::string& to) {
        MakeDir(to);
        make(to + "/older", 1500);
        make(to + "/newer", 1500);
        Arguments words = {"cp", "-r", "-u"};
        words.insert(words.end(), options.begin(), options.end());
        words.insert(words.end(), {From("one/."), From("two/."), to});
        return Lines(words);
    };
    const std::string first = Arrow(From("one/./newer"), To("d/newer"));
    const std::string second = Arrow(From("two/./older"), To("d/older"));
    EXPECT_THAT(lines({"-p"}, To("d")), HasSubstr(first + second));
    EXPECT_THAT(lines({"-p", "--backup=numbered"}, To("d")), HasSubstr("older.~1~"));
    lines({"-a"}, To("d"));
    lines({}, To("d"));
    lines({"-b"}, To("d"));
    lines({"--atomic"}, To("d"));
    lines({"--attributes-only"}, To("d"));
}

TEST_P(DryRunCopyTest, WhatIsNotThereYetIsMadeWithAllBelowIt) {
    MakeDir(From("tree"));
    MakeDir(From("tree/sub"));
    MakeWithMetadata(From("tree/sub/a"));
    MakeWithMetadata(From("b"));
    both().travel().GiveMetadata(From("tree"));
    const std::string all = "3 copied (4 bytes), 0 failed\n";
    const auto file = [&](const std::string& to) {
        return Arrow(From("tree/sub/a"), to + "/sub/a") + all;
    };
    const auto below = [&](const std::string& to) {
        return Arrow(From("tree/sub"), to + "/sub") + file(to);
    };
    EXPECT_EQ(Arrow(From("tree"), To("new")) + below(To("new")),
              Lines({"cp", "-r", From("tree"), To("new")}));
    EXPECT_EQ(Arrow(From("tree"), To("new/tree")) + below(To("new/tree")),
              Lines({"cp", "-r", From("tree"), To("new")}));
    EXPECT_EQ(Arrow(From("tree"), To("third/")) + below(To("third")),
              Lines({"cp", "-r", From("tree"), To("third/")}));
    // Of directories that are there nothing is said.
    EXPECT_EQ(file(To("new")), Lines({"cp", "-rT", From("tree"), To("new")}));
    ASSERT_EQ(0, both().travel().Run({"rm", "-r", To("new/sub")}).status);
    EXPECT_EQ(below(To("new")), Lines({"cp", "-a", "-T", From("tree"), To("new")}));
    EXPECT_EQ(1, Expect({"cp", "-r", From("tree"), To("none/new")}).status);
    EXPECT_EQ(1, Expect({"cp", From("b"), To("none/")}).status);
    EXPECT_EQ(1, Expect({"cp", "-r", From("tree"), From("b"), To("none")}).status);
    EXPECT_EQ(1, Expect({"cp", "-t", To("none"), From("b")}).status);
    Expect({"cp", "-r", "-t", To("new"), From("b"), From("tree/sub"), From("tree")});
    Expect({"cp", "--parents", From("tree/sub/a"), From("b"), To("new")});
    Expect({"cp", "-a", "--parents", From("tree/sub"), From("tree/sub/a"), To("new")});
}

// The first name of a file may come in a directory that is done when the second one comes.
TEST_P(DryRunCopyTest, NamesOfOneFileBecomeNamesOfOneFile) {
    MakeDir(From("tree"));
    MakeDir(From("tree/a"));
    MakeDir(From("tree/a/deep"));
    MakeWithMetadata(From("tree/a/deep/first"), "red");
    for (const char* const name : {"tree/a/second", "tree/third", "fourth"}) {
        ASSERT_EQ(0, link(From("tree/a/deep/first").c_str(), From(name).c_str()));
    }
    both().travel().GiveMetadata(From("tree/third"), "green");
    const std::string made = Arrow(From("tree"), To("copy")) + Arrow(From("tree/a"), To("copy/a")) +
                             Arrow(From("tree/a/deep"), To("copy/a/deep")) +
                             Arrow(From("tree/a/deep/first"), To("copy/a/deep/first")) +
                             Arrow(From("tree/a/second"), To("copy/a/second")) +
                             Arrow(From("tree/third"), To("copy/third"));
    // On others the names of one file have one metadata, and these have their own.
    const bool stays_one = GetParam() == kAppleDouble || GetParam() == kEaDirectory;
    const std::string lines = Lines({"cp", "-a", From("tree"), To("copy")});
    if (stays_one) {
        EXPECT_EQ(made, lines.substr(0, made.size()));
        EXPECT_EQ(3U, StatusOf(To("copy/third")).st_nlink);
        EXPECT_EQ(StatusOf(To("copy/a/deep/first")).st_ino, StatusOf(To("copy/third")).st_ino);
    }
    Expect({"cp", "-a", "-T", From("tree"), To("copy")});
    MakeDir(To("d"));
    Expect({"cp", "-a", From("tree"), From("fourth"), To("d")});
    if (stays_one) {
        EXPECT_EQ(4U, StatusOf(To("d/fourth")).st_nlink);
    }
    Expect({"cp", "-r", "--preserve=links", From("fourth"), From("tree"), To("d")});
    Expect({"cp", "-rd", "-b", From("fourth"), From("tree"), To("d")});
    Expect({"cp", "-a", "--remove-destination", From("fourth"), From("tree"), To("d")});
    // What has been one file there comes apart.
    Expect({"cp", "-r", "-T", From("tree"), To("d/tree")});
    Make(From("tree/a/deep/own"));
    Expect({"cp", From("tree/a/deep/own"), To("d/fourth")});
    Expect({"cp", "-l", From("tree/a/deep/own"), To("d/linked")});
    Expect({"cp", "-al", From("tree"), To("links")});
}

TEST_P(DryRunCopyTest, BackupsOfBackupsHaveTheNamesThatTheyWillHave) {
    for (const char* const one : {"one", "two", "three"}) {
        MakeDir(From(one));
        MakeWithMetadata(From(one) + "/x", one);
    }
    MakeDir(To("d"));
    MakeWithMetadata(To("d/x"), "old");
    const Arguments all = {From("one/x"), From("two/x"), From("three/x"), To("d")};
    const auto copy = [&](Arguments options) {
        options.insert(options.begin(), "cp");
        options.insert(options.end(), all.begin(), all.end());
        return Lines(options);
    };
    const auto line = [&](const char* from, const std::string& suffix) {
        std::string arrow = Arrow(From(std::string(from) + "/x"), To("d/x"));
        arrow.pop_back();
        return arrow + " (backup: '" + To("d/x") + suffix + "')\n";
    };
    EXPECT_THAT(copy({"--backup=numbered"}),
                HasSubstr(line("one", ".~1~") + line("two", ".~2~") + line("three", ".~3~")));
    // Numbered as there are such; but only who asks for it may overwrite what has just come.
    EXPECT_EQ(line("one", ".~4~") + "1 copied (4 bytes), 2 failed\n", copy({"-b"}));
    Expect({"cp", "--backup=simple", From("one/x"), To("d")});
    Expect({"cp", "--backup=simple", "-S", ".old", From("two/x"), To("d")});
    Expect({"cp", "--backup=simple", "-S", ".old", From("three/x"), To("d")});
    Expect({"cp", "--backup=numbered", "--atomic", From("three/x"), To("d")});
    Expect({"cp", "-r", "--backup=numbered", From("one/."), From("two/."), To("d")});
    Expect({"cp", "-f", "-b", From("one/x"), From("one/x")});
}

// ---- Links and what is no file ------------------------------------------------------------------

TEST_P(DryRunCopyTest, LinksAreFollowedOrNotAsForeseen) {
    MakeDir(From("tree"));
    MakeDir(From("tree/dir"));
    MakeWithMetadata(From("tree/dir/a"));
    ASSERT_EQ(0, symlink("dir/a", From("tree/to_file").c_str()));
    ASSERT_EQ(0, symlink("dir", From("tree/to_dir").c_str()));
    ASSERT_EQ(0, symlink("nowhere", From("tree/dangling").c_str()));
    ASSERT_EQ(0, symlink("..", From("tree/dir/up").c_str()));
    int copy = 0;
    for (const char* const option : {"-P", "-L", "-H", "-d", "-a"}) {
        const std::string to = To("copy" + std::to_string(++copy));
        Expect({"cp", "-r", option, From("tree"), to});
        Expect({"cp", "-r", option, "-T", From("tree"), to});
        MakeDir(to + "/d");
        Expect({"cp", "-r", option, From("tree/to_file"), From("tree/to_dir"),
                From("tree/dangling"), to + "/d"});
        Expect({"cp", option, "-f", From("tree/dir/a"), From("tree/to_file"), to + "/d"});
    }
    MakeDir(To("d"));
    Expect({"cp", "-r", From("tree/to_dir/"), To("d")});
    Expect({"cp", From("tree/dangling"), To("d")});
    ASSERT_EQ(0, symlink("../copy1", To("d/elsewhere").c_str()));
    Expect({"cp", From("tree/dir/a"), To("d/elsewhere")});
    Expect({"cp", "-T", From("tree/dir/a"), To("d/elsewhere")});
    Expect({"cp", "-rT", From("tree/dir"), To("d/elsewhere")});
}

TEST_P(DryRunCopyTest, SpecialFilesAreNeitherOpenedNorWritten) {
    MakeDir(From("tree"));
    const std::string fifo = From("tree/fifo");
    ASSERT_EQ(0, mkfifo(fifo.c_str(), 0600));
    Make(From("tree/plain"));
    MakeDir(To("d"));
    ASSERT_EQ(0, mkfifo(To("d/pipe").c_str(), 0600));
    // Whoever opens one of these would wait, and the alarm would end the child.
    WithoutWaiting([&] {
        EXPECT_EQ(Arrow(fifo, To("d/pipe")), both().Look({"cp", fifo, To("d/pipe")}).out);
        EXPECT_EQ(Arrow(From("tree/plain"), To("d/pipe")),
                  both().Look({"cp", From("tree/plain"), To("d/pipe")}).out);
        EXPECT_EQ(Arrow(fifo, To("d/new")), both().Look({"cp", fifo, To("d/new")}).out);
        EXPECT_EQ(0, both().Look({"cp", "-r", "--copy-contents", From("tree"), To("d")}).status);
        EXPECT_EQ(0, both().Look({"cp", "-l", fifo, To("d/new")}).status);
    });
    EXPECT_EQ(Arrow(From("tree/plain"), "/dev/null"),
              Lines({"cp", From("tree/plain"), "/dev/null"}));
    Expect({"cp", "-r", From("tree"), To("d")});
    Expect({"cp", "-r", From("tree"), To("d")});
    Expect({"cp", "-a", "-T", From("tree"), To("d/tree")});
    Expect({"cp", "-l", fifo, To("d/linked")});
    Expect({"cp", "--remove-destination", From("tree/plain"), To("d/pipe")});
}

// ---- In the way ---------------------------------------------------------------------------------

TEST_P(DryRunCopyTest, WhatIsOfAnotherTypeIsForeseenToStay) {
    MakeDir(From("tree"));
    MakeDir(From("tree/dir"));
    MakeWithMetadata(From("tree/dir/a"));
    MakeWithMetadata(From("tree/file"));
    ASSERT_EQ(0, symlink("file", From("tree/link").c_str()));
    ASSERT_EQ(0, mkfifo(From("tree/pipe").c_str(), 0600));
    MakeDir(To("tree"));
    Make(To("tree/dir"));
    for (const char* const name : {"tree/file", "tree/link", "tree/pipe"}) MakeDir(To(name));
    const ToolResult said = Expect({"cp", "-r", From("tree"), To("")});
    EXPECT_EQ(1, said.status);
    EXPECT_THAT(said.err, HasSubstr("cannot overwrite non-directory"));
    EXPECT_THAT(said.err, HasSubstr("cannot overwrite directory"));
    for (const char* const option :
         {"-n", "-u", "-b", "-f", "--remove-destination", "--atomic", "-l", "-s"}) {
        Expect({"cp", "-r", option, From("tree"), To("")});
    }
    MakeDir(To("d"));
    ASSERT_EQ(0, symlink("../tree/file", To("d/file").c_str()));
    Expect({"cp", From("tree/file"), To("d/file/")});
    Expect({"cp", "-r", From("tree/dir"), To("tree/dir/")});
    Expect({"cp", From("tree/file") + "/", To("d")});
    Expect({"cp", "-r", From("tree"), From("tree")});
    Expect({"cp", "-r", From("tree"), From("tree/dir/new")});
    Expect({"cp", "-r", From("tree/."), From("tree/dir")});
    Expect({"cp", From("tree/file"), From("tree")});
    Expect({"cp", From("tree/link"), From("tree/file")});
    Expect({"cp", "-b", From("tree/link"), From("tree/file")});
}

TEST_P(DryRunCopyTest, MetadataOfNobodyInTheWayIsForeseen) {
    MakeWithMetadata(From("a"));
    Make(From("plain"));
    MakeDir(From("tree"));
    MakeWithMetadata(From("tree/a"), "red");
    MakeDir(To("d"));
    const Bytes orphan = AppleDoubleOf({{kFinderInfoEntry, Repeat(1, 32)}});
    WriteFile(To("d/._a"), orphan);
    WriteFile(To("d/._plain"), orphan);
    PutStream(To("d/tree"), Ascii("not a stream"));
    Expect({"cp", From("a"), To("d")});
    Expect({"cp", From("plain"), To("d")});
    Expect({"cp", "-r", From("tree"), To("d")});
    // Directories and files where its files would be.
    MakeDir(To("e"));
    MakeDir(To("e/._a"));
    WriteFile(To("e/._a/inside"), Ascii("data"));
    MakeDir(To("e/._plain"));
    WriteFile(To("e/@eaDir"), Ascii("no directory"));
    Expect({"cp", From("a"), To("e")});
    Expect({"cp", From("plain"), To("e")});
    Expect({"cp", "-r", From("tree"), To("e")});
    MakeDir(To("f"));
    PutKind(To("f/a"), "MAVOPHOTO", Ascii("of another service"));
    MakeDir(To("f/@eaDir/a@MavoEAStream"));
    MakeDir(To("f/@eaDir/a@MavoResource"));
    Expect({"cp", From("a"), To("f")});
    Expect({"cp", "-a", "--atomic", From("a"), To("f")});
    Expect({"cp", "-r", From("tree/."), To("f")});
}

// A "._" file is an object of its own on some volumes; elsewhere it would be another one's
// metadata.
TEST_P(DryRunCopyTest, NamesOfMetadataAreForeseenToClash) {
    MakeDir(From("tree"));
    MakeWithMetadata(From("tree/a"));
    Make(From("tree/._plain"));
    Make(From("tree/plain"));
    Make(From("tree/._gone"));
    MakeDir(To("d"));
    Expect({"cp", "-r", From("tree"), To("d")});
    Expect({"cp", "-r", From("tree"), To("d")});
    Expect({"cp", From("tree/plain"), From("tree/._plain"), To("d")});
    Expect({"cp", From("tree/._gone"), To("d/._a")});
    Expect({"cp", From("tree/a"), To("d/._a")});
    Expect({"cp", From("tree/a"), To("d")});
    Expect({"cp", "-r", From("tree"), To("d/._tree")});
    Expect({"cp", "-r", From("tree"), To("d/@eaDir")});
    Expect({"cp", "-r", From("tree/a"), To("d/@eaDir/x")});
}

TEST_P(DryRunCopyTest, LongNamesAreForeseenToHaveNoRoomForMetadata) {
    MakeWithMetadata(From("a"));
    const std::string whole(255, 'n');
    const std::string longer(256, 'n');
    const std::string first = std::string(246, 'n') + "1";
    const std::string second = std::string(246, 'n') + "2";
    Expect({"cp", From("a"), To(whole)});
    EXPECT_EQ(1, Expect({"cp", From("a"), To(longer)}).status);
    MakeDir(From("tree"));
    for (const std::string& name : {first, second}) Make(From("tree/" + name));
    Expect({"cp", "-r", From("tree"), To("plain")});
    (void)both().travel().Run({"set", From("tree/" + first), Colour(), "red"});
    Expect({"cp", "-r", From("tree"), To("named")});
    Expect({"cp", "-r", From("tree"), To("")});
    Expect({"cp", "-b", From("a"), To(whole)});
    // A name of 254 bytes has room for "~" alone.
    Make(To(std::string(254, 'm')));
    Expect({"cp", "-b", From("a"), To(std::string(254, 'm'))});
    Expect({"cp", "--backup=numbered", From("a"), To(std::string(254, 'm'))});
}

TEST_P(DryRunCopyTest, MetadataThatAServiceHasInHandIsForeseenToBeLeftAlone) {
    if (GetParam() == kXattr || GetParam() == kSamba) return;
    MakeDir(From("tree"));
    MakeWithMetadata(From("tree/a"));
    MakeWithMetadata(From("tree/b"));
    ASSERT_THAT(both().travel().Run({"cp", "-r", From("tree"), To("copy")}), Succeeded());
    const auto file = [](const std::string& object) { return MetadataFileOf(GetParam(), object); };
    {
        const ServiceLock held(file(To("copy/a")));
        const ToolResult said = Expect({"cp", "-r", "-T", From("tree"), To("copy")});
        EXPECT_NE(0, said.status);
        Expect({"cp", From("tree/b"), To("copy/a")});
        Expect({"cp", "--remove-destination", From("tree/b"), To("copy/a")});
        Expect({"cp", "-b", From("tree/b"), To("copy/a")});
    }
    const ServiceLock held(file(From("tree/b")));
    Expect({"cp", "-r", From("tree"), To("second")});
    Expect({"cp", "-a", "-T", From("tree"), To("copy")});
}

// ---- Rights -------------------------------------------------------------------------------------

TEST_P(DryRunCopyTest, WhatAnotherUserMayNotDoIsForeseenInATree) {
    MAVOEA_SKIP_WITHOUT_OTHER_USERS();
    MAVOEA_SKIP_UNLESS_ANYONE_OWNS("/tmp");
    constexpr uid_t kUser = 54321;
    const auto open = [](const std::string& path, mode_t mode) {
        ASSERT_EQ(0, chmod(path.c_str(), mode)) << path;
    };
    open(both().travel().dir().path(), 0755);
    MakeDir(From("tree"));
    MakeDir(From("tree/closed"));
    Make(From("tree/closed/inner"));
    Make(From("tree/secret"));
    MakeWithMetadata(From("tree/plain"));
    open(From("tree/closed"), 0700);
    open(From("tree/secret"), 0600);
    open(From("tree"), 0755);
    open(From("tree/plain"), 0644);
    MakeDir(To("own"));
    MakeDir(To("sticky"));
    MakeDir(To("others"));
    ASSERT_EQ(0, chown(To("own").c_str(), kUser, kUser));
    open(To("sticky"), 01777);
    open(To("others"), 0755);
    for (const char* const name : {"sticky/plain", "others/plain"}) Make(To(name));
    open(To("sticky/plain"), 0644);
    open(To("others/plain"), 0666);
    EXPECT_EQ(1, both().ExpectOf(kUser, {"cp", "-r", From("tree"), To("own")}).status);
    both().ExpectOf(kUser, {"cp", "-r", From("tree"), To("own")});
    both().ExpectOf(kUser, {"cp", "-a", "-T", From("tree"), To("own/new")});
    for (const char* const directory : {"sticky", "others"}) {
        both().ExpectOf(kUser, {"cp", From("tree/plain"), To(directory)});
        both().ExpectOf(kUser, {"cp", "-f", From("tree/plain"), To(directory)});
        both().ExpectOf(kUser, {"cp", "--atomic", From("tree/plain"), To(directory)});
        both().ExpectOf(kUser, {"cp", "-b", From("tree/plain"), To(directory)});
        both().ExpectOf(kUser, {"cp", "-l", From("tree/plain"), To(directory)});
        both().ExpectOf(kUser, {"cp", "-s", From("tree/plain"), To(directory)});
        both().ExpectOf(kUser, {"cp", "--remove-destination", From("tree/plain"), To(directory)});
        both().ExpectOf(kUser, {"cp", "-r", From("tree/."), To(directory)});
    }
}

TEST_P(DryRunCopyTest, ImmutableMetadataIsForeseenToStay) {
    if (!HasEaDirectory()) return;
    MakeWithMetadata(From("a"));
    MakeWithMetadata(To("a"), "red");
    const Immutable directory(To("@eaDir"));
    if (!directory.ok()) GTEST_SKIP() << "no immutable files here";
    both().keeps_times = true;
    Expect({"cp", From("a"), To("a")});
    Expect({"cp", From("a"), To("b")});
    Expect({"cp", "--remove-destination", From("a"), To("a")});
    const Immutable stream(MetadataPaths(To("a")).stream);
    Expect({"cp", "-a", From("a"), To("a")});
}

// ---- Many and deep ------------------------------------------------------------------------------

TEST(DryRunLargeTreeTest, ThousandsOfFilesAndHundredsOfLevelsAreForeseen) {
    MAVOEA_SKIP_UNLESS_ROOT();
    MAVOEA_SKIP_WITHOUT_ATTRIBUTES("/tmp");
    const Rehearsal both(kEaDirectory, kAppleDouble);
    MakeDir(both.From("many"));
    for (int i = 0; i < 2000; ++i) {
        const std::string file = both.From("many/f" + std::to_string(i));
        both.travel().MakeFile(file);
        if (i % 50 == 0) PutStream(file, StreamImage{.attributes = {{"a", Ascii("1")}}}.Build());
    }
    EXPECT_THAT(both.Lines({"cp", "-r", both.From("many"), both.To("many")}),
                HasSubstr("2001 copied (8000 bytes), 0 failed\n"));
    // Directories that come one after the other into one.
    MakeDir(both.From("some"));
    for (int i = 0; i < 200; ++i) both.travel().MakeFile(both.From("some/f" + std::to_string(i)));
    both.Lines({"cp", "-r", "-b", both.From("some"), both.From("some/."), both.To("many")});
    std::string path = both.From("deep");
    MakeDir(path);
    for (int level = 0; level < 300; ++level) MakeDir(path += "/d");
    both.travel().MakeFile(path + "/end");
    EXPECT_THAT(both.Lines({"cp", "-a", both.From("deep"), both.To("deep")}),
                HasSubstr("302 copied (4 bytes), 0 failed\n"));
    both.Lines({"cp", "-a", "-T", both.From("deep"), both.To("deep")});
    both.Lines({"cp", "-r", both.From("deep/."), both.From("some/."), both.To("deep")});
}

}  // namespace
}  // namespace mavoea::test
