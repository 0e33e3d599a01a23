// Named attributes through the tool, on every kind of volume.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <memory>

#include "tests/support/process.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/terminal.h"
#include "tests/tool/tool.h"

namespace mavoea::test {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

// On type 7 names are those of the file's own attributes, where users have "user." only.
class AttributesTest : public ::testing::TestWithParam<int> {
 protected:
    void SetUp() override {
        if (GetParam() == 7) {
            volume_ = std::make_unique<Volume>(7);
            if (!KeepsUserAttributes(volume_->path())) {
                volume_ = std::make_unique<Volume>(7, std::filesystem::current_path().string());
            }
            if (!KeepsUserAttributes(volume_->path())) {
                GTEST_SKIP() << "no file system at hand keeps attributes of users";
            }
            return;
        }
        if (GetParam() != 0) MAVOEA_SKIP_UNLESS_ROOT();
        volume_ = std::make_unique<Volume>(GetParam());
    }

    std::unique_ptr<Volume> volume_;
};

INSTANTIATE_TEST_SUITE_P(VolumeTypes, AttributesTest,
                         ::testing::ValuesIn(Types({0, 1, 2, 3, 5, 6, 7, 10})),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(AttributesTest, AValueOfAnyBytesComesBackAsItWas) {
    Bytes all;
    for (int i = 0; i < 256; ++i) all.push_back(static_cast<std::uint8_t>(i));
    const Bytes values[] = {all,           {}, Hex("00"), Hex("00 00 41 00"), Ascii("line\n"),
                            Hex("FF*3000")};
    for (std::size_t i = 0; i < std::size(values); ++i) {
        const std::string name = "user.value" + std::to_string(i);
        ASSERT_THAT(volume_->Set(name, values[i]), Succeeded());
    }
    for (std::size_t i = 0; i < std::size(values); ++i) {
        const ToolResult got = volume_->Get("user.value" + std::to_string(i));
        EXPECT_THAT(got, Succeeded());
        EXPECT_EQ(values[i], got.bytes());
    }
}

TEST_P(AttributesTest, ANewValueReplacesALongerAndAShorterOne) {
    const Bytes values[] = {
        Ascii("four"), Ascii("much longer than four"), Ascii("2"), {}, Ascii("again")};
    ASSERT_THAT(volume_->Set("user.other", Ascii("untouched")), Succeeded());
    for (const Bytes& value : values) {
        ASSERT_THAT(volume_->Set("user.a", value), Succeeded());
        EXPECT_EQ(value, volume_->Get("user.a").bytes());
        EXPECT_EQ("untouched", volume_->Get("user.other").out);
    }
}

TEST_P(AttributesTest, NamesMayHoldBlanksAndBytesBeyondAscii) {
    const std::string names[] = {"user.two words",
                                 "user.gr\xC3\xBC\xC3\x9F"
                                 "e",
                                 "user.no UTF-8 \xFF\xFE", "user.[a,b]", "user.-"};
    for (const std::string& name : names) {
        ASSERT_THAT(volume_->Set(name, Ascii(name)), Succeeded());
    }
    const std::string list = volume_->List().out;
    for (const std::string& name : names) {
        EXPECT_EQ(name, volume_->Get(name).out);
        EXPECT_THAT("\n" + list, HasSubstr("\n" + name + "\n"));
        EXPECT_THAT(volume_->Remove(name), Succeeded());
    }
    EXPECT_EQ("", volume_->List().out);
}

TEST_P(AttributesTest, ControlCharactersInANameCannotForgeALine) {
    ASSERT_THAT(volume_->Set("user.a\nuser.b\\\x1B[2J", Ascii("x")), Succeeded());
    EXPECT_EQ("user.a\\x0Auser.b\\\\\\x1B[2J\n", volume_->List().out);
    const auto json = volume_->Run({"--json", "list", volume_->object()}).json();
    EXPECT_EQ("user.a\nuser.b\\\x1B[2J", json["attributes"][0]["name"]);
}

// U+009B is what ESC and '[' are; U+00A0 and U+00DB are letters.
TEST_P(AttributesTest, ControlCharactersOfTwoBytesAreShownAsSuch) {
    const std::string letters = "\xC2\xA0\xC3\x9B";
    const std::string shown = "user.\\xC2\\x9B" + letters;
    ASSERT_THAT(volume_->Set("user.\xC2\x9B" + letters, Ascii("x")), Succeeded());
    EXPECT_EQ(shown + '\n', volume_->List().out);
    EXPECT_EQ("x", volume_->Run({"get", "--escaped", volume_->object(), shown}).out);
}

TEST_P(AttributesTest, ARemovedAttributeIsGoneAndTheOthersStay) {
    ASSERT_THAT(volume_->Set("user.a", Ascii("1")), Succeeded());
    ASSERT_THAT(volume_->Set("user.b", Ascii("22")), Succeeded());
    ASSERT_THAT(volume_->Set("user.c", Ascii("333")), Succeeded());
    EXPECT_THAT(volume_->Remove("user.b"), Succeeded());
    EXPECT_EQ(1, volume_->Get("user.b").status);
    EXPECT_EQ("1", volume_->Get("user.a").out);
    EXPECT_EQ("333", volume_->Get("user.c").out);
}

TEST_P(AttributesTest, AMissingAttributeOrObjectIsNotFound) {
    const std::string message =
        volume_->object() + ": no attribute \"user.none\"; mavoea list PATH has the names";
    EXPECT_THAT(volume_->Get("user.none"), Failed(1, message));
    EXPECT_THAT(volume_->Remove("user.none"), Failed(1, message));
    ASSERT_THAT(volume_->Set("user.other", Ascii("x")), Succeeded());
    EXPECT_THAT(volume_->Get("user.none"), Failed(1, message));
    EXPECT_THAT(volume_->Remove("user.none"), Failed(1, message));

    const std::string missing = volume_->path() + "/missing";
    const std::string no_object = missing + ": No such file or directory; check the path";
    EXPECT_THAT(volume_->Run({"where", missing}), Failed(1, no_object));
    EXPECT_THAT(volume_->Run({"list", missing}), Failed(1, no_object));
    EXPECT_THAT(volume_->Run({"get", missing, "user.a"}), Failed(1, no_object));
    EXPECT_THAT(volume_->Run({"set", missing, "user.a", "x"}), Failed(1, no_object));
    EXPECT_THAT(volume_->Run({"remove", missing, "user.a"}), Failed(1, no_object));
}

TEST_P(AttributesTest, ReadingMakesNoFiles) {
    const std::vector<std::string> before = NamesIn(volume_->path());
    EXPECT_THAT(volume_->List(), Succeeded());
    EXPECT_EQ("", volume_->List().out);
    volume_->Get("user.a");
    volume_->Remove("user.a");
    volume_->Get("com.apple.FinderInfo");
    volume_->Run({"where", volume_->object()});
    EXPECT_EQ(before, NamesIn(volume_->path()));
}

TEST_P(AttributesTest, AValueComesFromTheCommandLineAFileOrStandardInput) {
    const std::string& object = volume_->object();
    EXPECT_THAT(volume_->Run({"set", object, "user.a", "from the line"}, "not this"), Succeeded());
    EXPECT_EQ("from the line", volume_->Get("user.a").out);
    EXPECT_THAT(volume_->Run({"set", object, "user.a", ""}), Succeeded());
    EXPECT_EQ("", volume_->Get("user.a").out);
    EXPECT_THAT(volume_->Run({"set", object, "user.a", "--", "-5"}), Succeeded());
    EXPECT_EQ("-5", volume_->Get("user.a").out);
    EXPECT_THAT(volume_->Run({"set", object, "user.a", "[1,2]"}), Succeeded());
    EXPECT_EQ("[1,2]", volume_->Get("user.a").out);
    EXPECT_THAT(volume_->Run({"set", object, "user.a", "--hex", "00ff 4A"}), Succeeded());
    EXPECT_EQ(Hex("00 FF 4A"), volume_->Get("user.a").bytes());

    const std::string file = volume_->path() + "/value";
    WriteFile(file, Hex("01 00 02"));
    EXPECT_THAT(volume_->Run({"set", object, "user.a", "--file", file}, "not this"), Succeeded());
    EXPECT_EQ(Hex("01 00 02"), volume_->Get("user.a").bytes());
    EXPECT_THAT(volume_->Run({"set", object, "user.a"}, "from input"), Succeeded());
    EXPECT_EQ("from input", volume_->Get("user.a").out);
}

TEST_P(AttributesTest, HexadecimalDigitsMayStandAsOtherProgramsShowThem) {
    for (const char* digits : {"0x00ff4a", "0X00FF4A", "00:ff:4a", "0x00 FF:4a\n"}) {
        ASSERT_THAT(volume_->Set("user.a", Ascii("former")), Succeeded());
        EXPECT_THAT(volume_->Run({"set", volume_->object(), "user.a", "--hex", digits}),
                    Succeeded());
        EXPECT_EQ(Hex("00 FF 4A"), volume_->Get("user.a").bytes()) << digits;
    }
}

TEST_P(AttributesTest, EveryNameThatAListShowsIsTakenBack) {
    std::string all;
    for (int byte = 1; byte < 256; ++byte) all += static_cast<char>(byte);
    const std::string names[] = {"user." + all.substr(0, 127), "user." + all.substr(127),
                                 "user.a\\x41\\"};
    for (const std::string& name : names) {
        ASSERT_THAT(volume_->Run({"set", volume_->object(), name, "blue"}), Succeeded());
        const ToolResult list = volume_->List();
        ASSERT_EQ(1, std::count(list.out.begin(), list.out.end(), '\n')) << list.out;
        const std::string shown = list.out.substr(0, list.out.size() - 1);
        EXPECT_EQ("blue", volume_->Run({"get", "--escaped", volume_->object(), shown}).out);
        EXPECT_THAT(volume_->Run({"set", "--escaped", volume_->object(), shown, "red"}),
                    Succeeded());
        EXPECT_EQ("red", volume_->Get(name).out);
        EXPECT_EQ(list.out, volume_->List().out);
        EXPECT_THAT(volume_->Run({"remove", "--escaped", volume_->object(), shown}), Succeeded());
        EXPECT_EQ("", volume_->List().out);
    }
}

TEST_P(AttributesTest, ABrokenEscapeIsNoName) {
    for (const char* name : {"a\\", "a\\q", "\\x", "\\x0", "\\xg0", "\\x00", "\\X41"}) {
        for (Arguments run : {Arguments{"get"}, {"set"}, {"remove"}}) {
            run.insert(run.end(), {"--escaped", volume_->object(), name});
            const ToolResult result = volume_->Run(run, "value");
            EXPECT_EQ(2, result.status) << name;
            EXPECT_THAT(result.err, HasSubstr("begins no escape; write \"\\x0A\" for a control"));
        }
    }
    EXPECT_EQ("", volume_->List().out);
}

// ---- Terminals ----------------------------------------------------------------------------------

TEST_P(AttributesTest, ATerminalIsGivenTextOnly) {
    const auto get = [&](Arguments options) {
        options.insert(options.begin(),
                       {"--volume", volume_->path() + "=" + std::to_string(GetParam()), "get"});
        options.insert(options.end(), {volume_->object(), "user.a"});
        return RunOnTerminal(options);
    };
    ASSERT_THAT(volume_->Set("user.a", Ascii("na\xC3\xAFve\tblue")), Succeeded());
    if (get({}).status < 0) GTEST_SKIP() << "there are no terminals here";
    EXPECT_EQ("na\xC3\xAFve\tblue", get({}).text);
    // A command of terminals, in one byte too, a Latin-1 letter, and a letter of two bytes cut.
    for (const char* value : {"\x1B[2J", "\xC2\x9B", "na\xEFve", "\xC3", "\r", "\x7F"}) {
        ASSERT_THAT(volume_->Set("user.a", Ascii(value)), Succeeded());
        const Shown refused = get({});
        EXPECT_EQ(2, refused.status);
        EXPECT_THAT(refused.text, HasSubstr("\"user.a\" is not text for a terminal, it has "));
        EXPECT_THAT(refused.text, HasSubstr("--hex, lead the output into a file, or give --raw"));
        if (std::string(value) != "\r") {  // of which a terminal has its own
            EXPECT_THAT(refused.text, Not(HasSubstr(value)));
        }
        EXPECT_EQ(0, get({"--hex"}).status);
        EXPECT_EQ(value, get({"--raw"}).text);
        EXPECT_EQ(Ascii(value), volume_->Get("user.a").bytes());
    }
}

TEST_P(AttributesTest, AHexDumpShowsOffsetsBytesAndText) {
    ASSERT_THAT(volume_->Set("user.a", Hex("00 'abcdefghijklmn' FF 'o'")), Succeeded());
    EXPECT_EQ(
        "00000000  00 61 62 63 64 65 66 67  68 69 6a 6b 6c 6d 6e ff  |.abcdefghijklmn.|\n"
        "00000010  6f                                                |o|\n",
        volume_->Run({"get", "--hex", volume_->object(), "user.a"}).out);
}

TEST_P(AttributesTest, JsonSaysWhatTheCommandsDid) {
    const std::string object = volume_->object();
    const std::string name = "user.\xFFname";
    auto json = volume_->Run({"--json", "set", object, name, "ab"}).json();
    EXPECT_EQ(object, json["path"]);
    EXPECT_EQ("user.\xEF\xBF\xBDname", json["name"]);
    EXPECT_EQ("757365722eff6e616d65", json["nameHex"]);
    EXPECT_EQ(2, json["size"]);

    json = volume_->Run({"get", "--json", object, name}).json();
    EXPECT_EQ("6162", json["hex"]);
    EXPECT_EQ(2, json["size"]);

    json = volume_->Run({"list", object, "--json"}).json();
    EXPECT_EQ(object, json["path"]);
    EXPECT_EQ(GetParam(), json["type"]);
    ASSERT_EQ(1U, json["attributes"].size());
    EXPECT_EQ("757365722eff6e616d65", json["attributes"][0]["nameHex"]);
    EXPECT_EQ(2, json["attributes"][0]["size"]);
    EXPECT_EQ("attribute", json["attributes"][0]["kind"]);
    EXPECT_EQ(GetParam() == 7 ? object : volume_->attribute_file(), json["attributes"][0]["file"]);

    json = volume_->Run({"--json", "remove", object, name}).json();
    EXPECT_EQ(true, json["removed"]);
    EXPECT_EQ("757365722eff6e616d65", json["nameHex"]);
}

TEST_P(AttributesTest, ALongListHasSizesKindsAndFiles) {
    ASSERT_THAT(volume_->Set("user.a", Ascii("12345")), Succeeded());
    const std::string file = GetParam() == 7 ? volume_->object() : volume_->attribute_file();
    EXPECT_EQ("         5  attribute      user.a  " + file + "\n",
              volume_->Run({"list", "-l", volume_->object()}).out);
}

TEST_P(AttributesTest, SeveralPathsAreListedEachUnderItsOwn) {
    ASSERT_THAT(volume_->Set("user.a", Ascii("x")), Succeeded());
    const std::string& object = volume_->object();
    const std::string missing = volume_->path() + "/missing";
    const ToolResult result = volume_->Run({"list", missing, object, volume_->path() + "/."});
    EXPECT_EQ(object + ":\nuser.a\n\n" + volume_->path() + "/.:\n", result.out);
    EXPECT_THAT(result, Failed(1, missing + ": No such file or directory; check the path"));
}

TEST_P(AttributesTest, DirectoriesHaveAttributesToo) {
    const std::string directory = volume_->path() + "/directory";
    std::filesystem::create_directory(directory);
    ASSERT_THAT(volume_->Run({"set", directory + "/", "user.a", "of the directory"}), Succeeded());
    EXPECT_EQ("of the directory", volume_->Run({"get", directory, "user.a"}).out);
    EXPECT_THAT(NamesIn(directory), ::testing::IsEmpty());
}

TEST_P(AttributesTest, ANameOf255BytesIsRefused) {
    const std::string longest = "user." + std::string(249, 'n');
    ASSERT_EQ(254U, longest.size());
    ASSERT_THAT(volume_->Set(longest, Ascii("x")), Succeeded());
    EXPECT_EQ("x", volume_->Get(longest).out);
    const std::string message = volume_->object() +
                                ": the attribute's name has 255 bytes, at most 254 are possible; "
                                "use a shorter name";
    EXPECT_THAT(volume_->Set(longest + "n", Ascii("x")), Failed(2, message));
    EXPECT_THAT(volume_->Get(longest + "n"), Failed(2, message));
    EXPECT_THAT(volume_->Remove(longest + "n"), Failed(2, message));
    EXPECT_THAT(volume_->Get(""),
                Failed(2, volume_->object() + ": the attribute's name is empty; give it a name"));
}

// ---- Type 7 -------------------------------------------------------------------------------------

class OwnAttributesTest : public AttributesTest {};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, OwnAttributesTest, ::testing::Values(7),
                         [](const auto&) { return "Type7"; });

TEST_P(OwnAttributesTest, GetfattrSeesWhatTheToolSets) {
    if (!HasProgram("getfattr")) GTEST_SKIP() << "getfattr is not installed";
    ASSERT_THAT(volume_->Set("user.colour", Hex("'a' 00 FF")), Succeeded());
    EXPECT_EQ("user.colour=0x6100ff\n\n", RunProgram("getfattr --absolute-names -e hex -d " +
                                                     Quoted(volume_->object()) + " | sed 1d")
                                              .output);
}

TEST_P(OwnAttributesTest, TheToolSeesWhatSetfattrSets) {
    if (!HasProgram("setfattr")) GTEST_SKIP() << "setfattr is not installed";
    ASSERT_EQ(
        0, RunProgram("setfattr -n user.colour -v 0x6100ff " + Quoted(volume_->object())).status);
    EXPECT_EQ("user.colour\n", volume_->List().out);
    EXPECT_EQ(Hex("'a' 00 FF"), volume_->Get("user.colour").bytes());
    EXPECT_THAT(volume_->Remove("user.colour"), Succeeded());
    EXPECT_EQ("", RunProgram("getfattr -d " + Quoted(volume_->object())).output);
}

TEST_P(OwnAttributesTest, AFileSystemWithoutForksSaysSo) {
    const std::string name = "com.apple.ResourceFork";
    const int mode = ModeOf(volume_->object());
    EXPECT_EQ(1, volume_->Get(name).status);
    EXPECT_EQ(1, volume_->Remove(name).status);
    EXPECT_THAT(volume_->Set(name, Ascii("x")),
                Failed(2, volume_->object() +
                              ": its file system offers no resource fork for it; only files have "
                              "one, on volumes of Mac file systems"));
    EXPECT_EQ(mode, ModeOf(volume_->object()));
}

TEST_P(OwnAttributesTest, ANameThatTheFileSystemRefusesIsExplained) {
    EXPECT_THAT(volume_->Set("colour", Ascii("x")),
                Failed(2, volume_->object() +
                              ": Operation not supported; the file system takes no attribute of "
                              "that name, try one that begins with \"user.\""));
}

TEST_P(OwnAttributesTest, FinderInfoOfAnotherSizeIsRefusedHereToo) {
    EXPECT_THAT(volume_->Set("com.apple.FinderInfo", Ascii("short")),
                Failed(2, volume_->object() +
                              ": Finder info has 32 bytes, the value has 5; give all of them, as "
                              "with --hex and 64 digits"));
}

// ---- Files beside the object --------------------------------------------------------------------

class AttributeFilesTest : public AttributesTest {};
INSTANTIATE_TEST_SUITE_P(VolumeTypes, AttributeFilesTest, ::testing::Values(0, 1, 2),
                         [](const auto& tested) { return "Type" + std::to_string(tested.param); });

TEST_P(AttributeFilesTest, AStreamHasItsBytesWhereTheLayoutPutsThem) {
    ASSERT_THAT(volume_->Set("a", Ascii("xyz")), Succeeded());
    EXPECT_EQ(Hex("00051607 00020000 'Mac OS X        ' 0002"
                  "00000009 00000032 00000059"
                  "00000002 0000008B 00000000"
                  "00*32 00*2 'ATTR' 00*4 0000008B 00000088 00000003 00*12 0000 0001"
                  "00000088 00000003 0000 02 'a' 00 00*3"
                  "'xyz'"),
              ReadFile(volume_->attribute_file()));
}

TEST_P(AttributeFilesTest, TheOrderIsTheStreams) {
    ASSERT_THAT(volume_->Set("b", Ascii("1")), Succeeded());
    ASSERT_THAT(volume_->Set("a", Ascii("2")), Succeeded());
    ASSERT_THAT(volume_->Set("b", Ascii("3")), Succeeded());
    EXPECT_EQ("a\nb\n", volume_->List().out);
}

TEST_P(AttributeFilesTest, AStreamInUseIsLeftAloneAndToldSo) {
    ASSERT_THAT(volume_->Set("a", Ascii("x")), Succeeded());
    const std::string path = volume_->attribute_file();
    const Bytes before = ReadFile(path);
    const int fd = open(path.c_str(), O_RDWR);
    struct flock64 lock = {};
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    ASSERT_EQ(0, fcntl(fd, F_SETLK64, &lock));
    const std::string message = path + ": in use by another process; try again";
    EXPECT_THAT(volume_->Get("a"), Failed(2, message));
    EXPECT_THAT(volume_->Set("a", Ascii("y")), Failed(2, message));
    EXPECT_THAT(volume_->Remove("a"), Failed(2, message));
    EXPECT_THAT(volume_->List(), Failed(2, message));
    if (GetParam() == 0) {
        EXPECT_THAT(volume_->Set("com.apple.ResourceFork", Ascii("y")), Failed(2, message));
        EXPECT_THAT(volume_->Get("com.apple.FinderInfo"), Failed(2, message));
    }
    close(fd);
    EXPECT_EQ(before, ReadFile(path));
    EXPECT_EQ("x", volume_->Get("a").out);
}

TEST_P(AttributeFilesTest, ADamagedStreamIsToldSoAndNotChanged) {
    ASSERT_THAT(volume_->Set("a", Ascii("xyz")), Succeeded());
    const std::string path = volume_->attribute_file();
    const Bytes whole = ReadFile(path);
    const std::string look = "; look at it with: mavoea dump FILE";
    const std::string not_changed = path + ": damaged, or it could not be read" + look;

    const std::string table = path + ": damaged: its attribute table passes the end of the file";
    Bytes damaged(whole.begin(), whole.begin() + 130);  // ends in the table
    WriteFile(path, damaged);
    EXPECT_THAT(volume_->Get("a"), Failed(2, table + look));
    EXPECT_THAT(volume_->Set("a", Ascii("y")), Failed(2, not_changed));
    EXPECT_THAT(volume_->Remove("a"), Failed(2, not_changed));
    EXPECT_THAT(volume_->List(), Failed(2, table + look));
    EXPECT_EQ(damaged, ReadFile(path));

    const std::string value = path + ": damaged: attribute \"a\" passes the end of the file";
    damaged = whole;
    PutU32(damaged, kTableAt + 4, 0xFFFFFFF0);  // the value's length
    WriteFile(path, damaged);
    // What is declared makes nothing large.
    EXPECT_THAT(
        volume_->Run({"get", volume_->object(), "a"}, {}, {.memory = std::size_t{512} << 20}),
        Failed(2, value + look));
    EXPECT_THAT(volume_->Set("a", Ascii("y")), Failed(2, not_changed));
    EXPECT_THAT(volume_->Remove("a"), Failed(2, not_changed));
    EXPECT_EQ(damaged, ReadFile(path));
}

TEST_P(AttributeFilesTest, AFullDiskLeavesNoHalfAFileBehind) {
    const Limits limits = {.file_size = 64};
    for (const std::string name : {"a", "com.apple.ResourceFork"}) {
        EXPECT_EQ(2, volume_->Run({"set", volume_->object(), name, "value"}, {}, limits).status);
        EXPECT_FALSE(Exists(volume_->attribute_file()));
        EXPECT_FALSE(Exists(volume_->finder_file()));
    }
    // A file that has been there stays as it was.
    ASSERT_THAT(volume_->Set("com.apple.ResourceFork", Ascii("fork")), Succeeded());
    const Bytes before = ReadFile(volume_->finder_file());
    EXPECT_EQ(2, volume_
                     ->Run({"set", volume_->object(), "com.apple.ResourceFork"},
                           std::string(5000, 'x'), {.file_size = 1000})
                     .status);
    EXPECT_EQ(before, ReadFile(volume_->finder_file()));
}

TEST_P(AttributeFilesTest, AnEarlierFailureIsNotTakenForTheCauseOfALaterOne) {
    ASSERT_THAT(volume_->Set("a", Ascii("x")), Succeeded());
    WriteFile(volume_->attribute_file(), Bytes(26) + Ascii("x"));
    const std::string other = volume_->path() + "/other";
    WriteFile(other, {});
    ASSERT_THAT(volume_->Run({"set", other, "a", "x"}), Succeeded());
    std::string file = volume_->attribute_file();
    file.replace(file.find("file.txt"), 8, "other");
    std::filesystem::remove(file);
    std::filesystem::create_symlink(std::filesystem::path(file).filename(), file);
    EXPECT_THAT(volume_->Run({"list", volume_->object(), other}),
                Failed(2, volume_->attribute_file() +
                              ": no AppleDouble file; move it away, or look at it with: mavoea "
                              "dump FILE\nmavoea: " +
                              file +
                              ": a symbolic link in the place of a file; see who put it there, "
                              "and move it away"));
}

TEST_P(AttributeFilesTest, AFileThatIsNoStreamIsToldSoAndNotChanged) {
    ASSERT_THAT(volume_->Set("a", Ascii("xyz")), Succeeded());
    const std::string path = volume_->attribute_file();
    const Bytes text = Ascii("This is a letter. It is not to be taken for metadata of a file.\n");
    WriteFile(path, text);
    const std::string message =
        path + ": no AppleDouble file; move it away, or look at it with: mavoea dump FILE";
    EXPECT_THAT(volume_->List(), Failed(2, message));
    EXPECT_THAT(volume_->Get("a"), Failed(2, message));
    EXPECT_THAT(volume_->Set("a", Ascii("y")), Failed(2, message));
    EXPECT_THAT(volume_->Remove("a"), Failed(2, message));
    EXPECT_EQ(text, ReadFile(path));
}

TEST_P(AttributeFilesTest, EntriesOfOtherSystemsAreNotLost) {
    ASSERT_THAT(volume_->Set("a", Ascii("xyz")), Succeeded());
    const std::string path = volume_->attribute_file();
    // Three entries; the third, of id 4, is a comment of 7 bytes.
    const Bytes other =
        Hex("00051607 00020000 00*16 0003"
            "00000009 0000003E 00000020"
            "00000002 00000065 00000000"
            "00000004 0000005E 00000007"
            "'TEXTttxt' 00*24 'comment'");
    WriteFile(path, other);
    const std::string message = path +
                                ": a change of its attributes would lose its entry \"comment\"; "
                                "move the file away if that is no loss";
    EXPECT_THAT(volume_->Set("a", Ascii("y")), Failed(2, message));
    EXPECT_EQ(other, ReadFile(path));
}

}  // namespace
}  // namespace mavoea::test
