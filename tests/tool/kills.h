// Runs of the tool that are killed, one after the other, and what they leave.
#ifndef MAVOEA_TESTS_TOOL_KILLS_H_
#define MAVOEA_TESTS_TOOL_KILLS_H_

#include <signal.h>

#include <filesystem>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "tests/support/mac_files.h"
#include "tests/support/object_files.h"
#include "tests/support/stream_builder.h"
#include "tests/tool/holdings.h"
#include "tests/tool/stopped_tool.h"
#include "tests/tool/travel.h"

namespace mavoea::test {

inline constexpr char kServiceKind[] = "Thumbnail";
inline constexpr char kLegacyName[] = "MAVOPHOTO:SIZES";

inline Bytes AppleDoubleOfColour(const std::string& colour) {
    return StreamImage{.attributes = {{Colour(), Ascii(colour)}}}.Build();
}

// Metadata in each place that volumes of the type have, written without the tool.
enum class Extent { kAll, kOwnOnly };  // or without what earlier versions and services keep
inline void GiveAll(int type, const std::string& object, const std::string& colour,
                    Extent extent = Extent::kAll) {
    if (UsesAppleDouble(type) || UsesEaDirectory(type)) {
        PutAppleDouble(object, AppleDoubleOfColour(colour));
    }
    if (UsesEaDirectory(type)) {
        PutStream(object, AppleDoubleOfColour(colour));
        PutResource(object, PlainAppleDouble(Pattern(32, 0x40), Ascii("fork of " + colour)));
    }
    if (type == kFileEa) {
        SetFileAttribute(object, kRecordAttribute, RecordOf({.comment = Ascii(colour)}));
    }
    if (type == kXattr) SetFileAttribute(object, Colour(), Ascii(colour));
    if (extent == Extent::kOwnOnly) return;
    const std::filesystem::path path(object);
    PutKind(path.parent_path() / ShortenedName(path.filename()), kServiceKind,
            Ascii("thumbnail of " + colour));
    PutLegacy(object, kLegacyName, Ascii("sizes of " + colour));
}

// Everything in a directory, by path: what files hold, and their attributes; but for EA directories
// that are empty, which say nothing of any object, and marks, which say only that something was
// done.
inline std::map<std::string, Bytes> Everything(const std::string& directory) {
    std::map<std::string, Bytes> all;
    for (const std::string& path : Tree(directory)) {
        const std::string full = directory + '/' + path;
        if (path.ends_with('/')) {
            if (!path.ends_with("@eaDir/") || !NamesIn(full).empty()) all[path] = {};
            continue;
        }
        all[path] =
            ReadFile(full) + FileAttribute(full, kRecordAttribute) + FileAttribute(full, Colour());
    }
    return all;
}

// What is not as it should be, by path.
inline std::vector<std::string> Differences(const std::map<std::string, Bytes>& wanted,
                                            const std::map<std::string, Bytes>& found) {
    std::vector<std::string> all;
    for (const auto& [path, bytes] : wanted) {
        const auto there = found.find(path);
        if (there == found.end()) {
            all.push_back("missing: " + path);
        } else if (there->second != bytes) {
            all.push_back("another: " + path);
        }
    }
    for (const auto& [path, bytes] : found) {
        if (!wanted.contains(path)) all.push_back("left: " + path);
    }
    return all;
}

// What a run that is not killed may say on standard error: nothing, or notes.
enum class Says { kNothing, kNotes };

// Runs the tool on what `make` has made, again and again, and calls `go_on` after each run that was
// killed.
inline void KillAtEachChange(const Arguments& arguments, const std::string& root,
                             const std::function<void()>& make, const std::function<void()>& go_on,
                             const std::string& shown = {}, Says says = Says::kNothing) {
    int nth = 1;
    for (bool killed = true; killed && !::testing::Test::HasFailure(); ++nth) {
        SCOPED_TRACE("killed before change " + std::to_string(nth));
        make();
        const StoppedRun run = RunKilledAt(arguments, root, nth);
        killed = run.status == 128 + SIGKILL;
        if (!killed) {
            EXPECT_EQ(0, run.status) << run.err;
            if (says == Says::kNothing) {
                EXPECT_EQ("", run.err);
            }
        }
        const auto left = Tree(shown.empty() ? root : shown);
        go_on();
        if (::testing::Test::HasFailure()) {
            ADD_FAILURE() << "left: " << ::testing::PrintToString(left);
        }
    }
    EXPECT_LT(2, nth) << "no run takes fewer calls";
}

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_KILLS_H_
