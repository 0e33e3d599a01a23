// A share on which a user works against the superuser who runs the tool there, and what lies
// outside it, which he can neither read nor change by himself.
#ifndef MAVOEA_TESTS_TOOL_HOSTILE_SHARE_H_
#define MAVOEA_TESTS_TOOL_HOSTILE_SHARE_H_

#include <sys/types.h>

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "tests/support/second_volume.h"
#include "tests/tool/tool.h"

namespace mavoea::test {

inline constexpr uid_t kAttacker = 1234;
inline constexpr gid_t kAttackersGroup = 4321;

// Files are made, renamed and removed with the attacker's rights until the end of its scope.
class AsAttacker {
 public:
    AsAttacker();
    ~AsAttacker();
    AsAttacker(const AsAttacker&) = delete;
    AsAttacker& operator=(const AsAttacker&) = delete;
};

// All there is to know about the files in a directory, by their paths, without following links. Of
// when they were read nothing is kept.
using Descriptions = std::map<std::string, std::string>;
Descriptions DescribeTree(const std::string& directory);

// What differs, a line each; empty when nothing does.
std::string ChangesBetween(const Descriptions& before, const Descriptions& after);

// What a tree has besides its objects.
enum TreePart : unsigned {
    kAppleDoubleFiles = 1,
    kEaFiles = 2,        // and, of two objects, an earlier layout
    kWithoutObject = 4,  // metadata of objects that are gone
    kMisplaced = 8,      // attributes in a resource file
    kIncoming = 16,      // an AppleDouble file "incoming"
    kAllParts = 31,
    kLocked = 32,     // nobody may write the files
    kThere = 64,      // the same tree in "to"
    kText = 128,      // beside the tree a text that gives its objects metadata
    kArchived = 256,  // "__MACOSX" with AppleDouble files for what is beside it
    kSingle = 512,    // an AppleSingle file "single", with data
};

// Two volumes, "from" with the directory "tree" in it and "to" with nothing, both the attacker's.
// In "from" he has a file "a.txt" with metadata of the current layout, "b.txt" of the earliest,
// "c.txt" with a "._" file, and "sub/d.txt". Beside them, in "outside", are files of the same
// names and all layouts with the superuser's secrets in them, and they are in the attacker's attics
// too, to which he moves what he takes out of the trees.
class HostileShare {
 public:
    // With `two_volumes` the directories are on two file systems where that can be had.
    HostileShare(int from_type, int to_type, unsigned parts, bool two_volumes = false);

    const std::string& root() const { return root_; }
    std::string From(const std::string& name = {}) const { return Joined(from_, name); }
    std::string To(const std::string& name = {}) const { return Joined(to_, name); }
    Arguments WithVolumes(Arguments arguments) const;

    // Both volumes as they were at first.
    void Renew();

    // Everything on them, and of the attics what the attacker has moved there.
    std::vector<std::string> Entries() const;
    bool IsOnIt(const std::string& path) const;  // nor are the attics
    Descriptions DescribeVolumes() const;

    // What of the superuser's stands for that on a volume; a file or a directory that he has
    // anyway where there is nothing of the name.
    std::string Twin(const std::string& path, bool directory = false) const;

    // The attacker moves away what is at `path`, if there is anything, and puts a link there. False
    // where he cannot.
    bool Swap(const std::string& path, const std::string& target) const;
    void SwapBack(const std::string& path) const;
    // The attacker takes from all files their attributes, or gives them long ones.
    void ChangeAttributes(bool go) const;
    // A link to the twin in the attic, to be exchanged for what is at `path`; its own path.
    std::string PrepareLink(const std::string& path, int number) const;

    // What of the superuser's has changed, and where his secrets can be read; empty: nothing and
    // nowhere. What has changed is restored.
    std::string Damage(const ToolResult& result);

 private:
    static std::string Joined(const std::string& directory, const std::string& name) {
        return name.empty() ? directory : directory + '/' + name;
    }
    std::string VolumeOf(const std::string& path) const;
    std::string Moved(const std::string& path) const { return VolumeOf(path) + "/attic/moved"; }
    void MakeSecrets();
    Descriptions DescribeSecrets() const;

    TempDir dir_;
    std::optional<SecondVolume> second_;
    std::string root_;
    std::string from_;
    std::string to_;
    std::string outside_;
    int from_type_;
    int to_type_;
    unsigned parts_;
    Descriptions secrets_;
};

// Why there can be no such share here; empty where there can.
std::string WhyNoAttacker();

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_HOSTILE_SHARE_H_
