// The shared libraries as built: they export what their headers declare and nothing else, and need
// what a C daemon has.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <regex>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "tests/support/process.h"

namespace {

using ::mavoea::test::Quoted;
using ::testing::Contains;
using ::testing::Each;
using ::testing::IsEmpty;
using ::testing::MatchesRegex;
using ::testing::Not;

std::vector<std::string> LinesOf(const std::string& command) {
    std::vector<std::string> lines;
    const mavoea::test::ProgramResult result = mavoea::test::RunProgram(command);
    EXPECT_EQ(0, result.status) << command;
    std::istringstream in(result.output);
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
}

std::set<std::string> ExportedBy(const std::string& library) {
    std::set<std::string> names;
    for (const std::string& line : LinesOf("nm -D --defined-only " + Quoted(library))) {
        std::smatch match;
        if (std::regex_match(line, std::regex("[0-9a-f]+ A LIB\\w+"))) continue;  // the version
        EXPECT_TRUE(std::regex_match(line, match, std::regex("[0-9a-f]+ T (\\w+)(@@\\w+)?")))
            << line;
        names.insert(match[1]);
    }
    return names;
}

std::set<std::string> DeclaredIn(const std::string& header, const std::string& mark) {
    std::ifstream in(header);
    const std::string text(std::istreambuf_iterator<char>(in), {});
    std::set<std::string> names;
    const std::regex declaration("\n" + mark + " [\\w *]*?\\b(\\w+)\\(");
    for (std::sregex_iterator at(text.begin(), text.end(), declaration), end; at != end; ++at) {
        names.insert((*at)[1]);
    }
    return names;
}

std::vector<std::string> Tagged(const std::string& library, const std::string& tag) {
    std::vector<std::string> values;
    for (const std::string& line : LinesOf("LC_ALL=C readelf -dW " + Quoted(library))) {
        std::smatch match;
        if (std::regex_search(line, match, std::regex("\\(" + tag + "\\).*\\[(.*)\\]"))) {
            values.push_back(match[1]);
        }
    }
    return values;
}

// Symbols that would come from the C++ run-time library.
[[maybe_unused]] std::vector<std::string> CxxSymbolsNeededBy(const std::string& library) {
    std::vector<std::string> names;
    for (const std::string& line : LinesOf("nm -D --undefined-only " + Quoted(library))) {
        if (std::regex_search(line, std::regex("GLIBCXX|CXXABI| _Z"))) names.push_back(line);
    }
    return names;
}

TEST(PlatformLibrariesTest, MavocoreExportsWhatItsHeaderDeclares) {
    const std::set<std::string> kNames = {"MLIBCErrSetEx",        "MLIBCErrGet",
                                          "MLIBCErrorGetFile",    "MLIBCErrorGetLine",
                                          "MLIBCSzListAlloc",     "MLIBCSzListPush",
                                          "MLIBCSzListGet",       "MLIBCSzListRemoveAll",
                                          "MLIBCSzListFree",      "MLIBCExec",
                                          "MLIBCFileStat",        "MAVOGetFSType",
                                          "MLIBMavoFileIndexAdd", "MLIBMavoIndexAddEx",
                                          "MAVOVolumeDeclare",    "MAVOStrReplaceFATReservedChar",
                                          "MAVOIndexObserverSet", "MAVOVolumeTypeFromName",
                                          "MAVOVolumeFind",       "MAVOVolumeTableCheck",
                                          "MAVOErrorText",        "MAVOErrorAdvice"};
    EXPECT_EQ(kNames, DeclaredIn(MAVOCORE_HEADER, "MAVOCORE_API"));
    EXPECT_EQ(kNames, ExportedBy(MAVOCORE_FILE));
}

TEST(PlatformLibrariesTest, MavoaclExportsWhatItsHeaderDeclares) {
    const std::set<std::string> kNames = {"MAVOACLSetEADirACL"};
    EXPECT_EQ(kNames, DeclaredIn(MAVOACL_HEADER, "MAVOACL_API"));
    EXPECT_EQ(kNames, ExportedBy(MAVOACL_FILE));
}

TEST(PlatformLibrariesTest, SonamesCarryVersion1) {
    EXPECT_THAT(Tagged(MAVOCORE_FILE, "SONAME"), ::testing::ElementsAre("libmavocore.so.1"));
    EXPECT_THAT(Tagged(MAVOACL_FILE, "SONAME"), ::testing::ElementsAre("libmavoacl.so.1"));
}

// Sanitizers bring libraries of their own.
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
constexpr char kCLibrary[] = "(libc|libpthread|ld-linux.*|ld64|ld)\\.so\\.[0-9]+";

TEST(PlatformLibrariesTest, MavocoreNeedsTheCLibraryOnly) {
    EXPECT_THAT(Tagged(MAVOCORE_FILE, "NEEDED"), Each(MatchesRegex(kCLibrary)));
    EXPECT_THAT(Tagged(MAVOCORE_FILE, "NEEDED"), Contains(MatchesRegex("libc\\.so.*")));
    EXPECT_THAT(CxxSymbolsNeededBy(MAVOCORE_FILE), IsEmpty());
}

TEST(PlatformLibrariesTest, MavoaclNeedsLibaclAndTheCLibraryOnly) {
    std::vector<std::string> needed = Tagged(MAVOACL_FILE, "NEEDED");
    EXPECT_THAT(needed, Contains("libacl.so.1"));
    std::erase(needed, "libacl.so.1");
    EXPECT_THAT(needed, Each(MatchesRegex(kCLibrary)));
    EXPECT_THAT(needed, Not(IsEmpty()));
    EXPECT_THAT(CxxSymbolsNeededBy(MAVOACL_FILE), IsEmpty());
}
#endif

}  // namespace
