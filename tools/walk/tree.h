// Work on many objects: those that were named and, in recursive work, all below them.
#ifndef MAVOEA_TOOLS_WALK_TREE_H_
#define MAVOEA_TOOLS_WALK_TREE_H_

#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/place/paths.h"
#include "tools/place/volume.h"
#include "tools/say/messages.h"
#include "tools/walk/crew.h"
#include "tools/walk/journal.h"
#include "tools/walk/shard.h"
#include "tools/walk/tree_report.h"

namespace mavoea::tool {

// Which objects, and how what became of them is told.
struct TreeOptions {
    NamedPaths paths;
    bool recursive = false;
    bool json = false;
    Shard shard = {};                 // only its objects
    std::optional<LogFile> log = {};  // of what is done
    CrewSize crew = UsualCrew();      // of work that can be shared out
    bool verbose = false;             // what became of each is told
};

// Calls `work` for each object that was named and, in recursive work, for all below it, and goes on
// after what it throws. Directories are objects as well, and come before what is in them. Below a
// directory, symbolic links are left out, hidden directories, and metadata of objects.
//
// Of several shards each walks through all directories and does its own objects only. What goes
// wrong with a directory is told by the shard that it belongs to; others, whose objects may be in
// there, fail with one line for all of those.
struct Visit {
    // `given` is the path as it was given; empty for what was found below one. Tells `hear` what
    // came of it. Whether it is done, so that nobody who goes on with a log has to do it again.
    std::function<bool(const Object&, const std::string& given, const Tell&)> work;
    std::function<void(const std::string& path, const Failure&)> on_failure;

    // False: nothing below it is to be looked at.
    std::function<bool(const Object&)> enters = [](const Object&) { return true; };

    // Called for what was named, and for each directory before what is in it is listed: those who
    // change things bring to its end what others began there.
    std::function<void(const Object&)> on_named = [](const Object&) {};
    std::function<void(const DirectoryRef&)> on_directory = [](const DirectoryRef&) {};

    // With this, the work is shared out to processes, as a crew has it: `work` and these two may
    // change nothing of this one, and call `hear` in it by what they tell. Of what changes objects
    // the first process does those that are not apart from others.
    std::function<void(std::string_view)> hear = {};
    bool changes = false;
    std::function<bool(const Object&, const Tell&)> look_at_named = [](const Object&, const Tell&) {
        return true;
    };
    // Before what is in it.
    std::function<bool(const DirectoryRef&, const Tell&)> look_into = {};
    std::function<void()> clear_progress = [] {};
    std::function<void(const Object&)> show_progress = [](const Object&) {};

    // Called for directories of other shards in place of `work`. Throws Failure for one below which
    // nothing is to be looked at.
    std::function<void(const Object&)> on_other = [](const Object&) {};
};
// `doing` names the work in its log, if it has one.
void VisitObjects(const TreeOptions& options, const Visit& visit, const std::string& doing = {});

// Whether what a directory has is an object of a visit.
bool IsVisited(const Directory::Entry& entry);

// Whether it failed because the object has gone since its directory was listed, with which nothing
// is wrong.
bool HasGone(const Place& place, const Failure& failure);

struct Task {
    // As of a report.
    const char* doing;
    const char* done;
    const char* current;
    const char* nothing;

    // Throws Failure for an object on a volume that does not suit. Nothing below such a directory
    // is looked at.
    std::function<void(const Object&)> check;
    // Throws Failure. Changes nothing of the process that it is in.
    std::function<Outcome(const Object&, Notes*)> work;

    // As of a visit.
    std::function<void(const Object&)> on_named = [](const Object&) {};
    std::function<void(const DirectoryRef&)> on_directory = [](const DirectoryRef&) {};
};

// Does the task to all objects, and goes on after a failure.
//
// Shows how far it is on standard error, when that is a terminal; at the end the counts are on
// standard output, and notes and failures on standard error. kSuccess when nothing failed,
// otherwise the gravest status.
ExitStatus RunOnTree(const TreeOptions& options, const Task& task);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_WALK_TREE_H_
