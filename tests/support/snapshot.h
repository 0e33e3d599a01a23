// All that can be seen of a tree, taken without leaving a trace in it: two snapshots tell whether
// what ran between them has changed anything.
#ifndef MAVOEA_TESTS_SUPPORT_SNAPSHOT_H_
#define MAVOEA_TESTS_SUPPORT_SNAPSHOT_H_

#include <map>
#include <ostream>
#include <set>
#include <string>
#include <vector>

namespace mavoea::test {

// Aspects of an entry and how they are: "type", "mode", "owner", "inode", "links", "bytes" (of a
// regular file), "target" (of a symbolic link), "xattr NAME" (ACLs are attributes of "system."),
// "mtime", "ctime" and, but for symbolic links, "atime".
using Aspects = std::map<std::string, std::string>;

// By path below the top; "." is the top itself.
using Snapshot = std::map<std::string, Aspects>;

// Takes one; it is empty where there is no top. Access times stay as they are where this process
// may keep them: it owns the entries or is the superuser. The target of a link cannot be read
// without that, so links have no "atime".
Snapshot TakeSnapshot(const std::string& top);

// What tells them apart, an aspect a line: "a/@eaDir/b: mtime: 5 -> 7". An ignored "mtime of
// directories" leaves theirs out.
std::vector<std::string> Differences(const Snapshot& before, const Snapshot& after,
                                     const std::set<std::string>& ignored = {});

// Gives everything below `top`, and itself, access times in 2001 and modification times in 2002, so
// that any look at it shows where a file system renews an access time only when it is older than
// the modification.
void SetOldTimes(const std::string& top);

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_SNAPSHOT_H_
