// The order in which trees are copied: a directory is made before what is in it is copied, and
// finished afterwards.
#ifndef MAVOEA_TOOLS_TRANSFER_TREE_COPY_H_
#define MAVOEA_TOOLS_TRANSFER_TREE_COPY_H_

#include <string>
#include <vector>

#include "tools/place/directory.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

class TreeCopy {
 public:
    virtual ~TreeCopy() = default;

    // Copies an object with all that is below it, and goes on after what the members below throw.
    void CopyTree(const Place& from, const Place& to);

 protected:
    // A directory that is being copied.
    struct Level {
        Place from;
        Place to;
        DirectoryRef inside;                         // the source
        DirectoryRef made;                           // its copy
        bool is_new = true;                          // nothing was there before
        struct stat info = {};                       // of the source
        std::vector<Directory::Entry> entries = {};  // candidates in it; objects are copied
        std::size_t next = 0;
    };

    // Whether nothing more is to be begun. What was begun is finished all the same.
    virtual bool Stopped() const = 0;

    // Copies what is no directory; or makes one: all of *level is set then, but for the entries
    // that are not to be copied. What has no `made` is not entered.
    virtual void Begin(const Place& from, const Place& to, Level* level) = 0;
    virtual void Finish(const Level& level) = 0;
    virtual void Fail(const Place& from, const Failure& failure) = 0;

    // Those around the object in hand, the outermost first; none for what was named.
    const std::vector<Level>& levels() const { return levels_; }

 private:
    void Try(const Place& from, const Place& to);
    void TryNext(Level* level);

    std::vector<Level> levels_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_TREE_COPY_H_
