// Who may read and change an object's metadata: those who may read and change the object.
#ifndef MAVOEA_TOOLS_STORE_RIGHTS_H_
#define MAVOEA_TOOLS_STORE_RIGHTS_H_

#include <sys/acl.h>

#include <memory>
#include <optional>
#include <string>
#include <type_traits>

#include "tools/place/directory.h"

namespace mavoea::tool {

// Owner, group, the read and write bits of the mode, and an ACL without what is to be executed.
class Rights {
 public:
    static Rights Of(const Inode& object);
    // Those that it will have with another mode.
    static Rights Of(const Inode& object, mode_t mode);

    // Gives them to a file that nobody but this process may use yet. Where the owner or group may
    // not be given away nobody gets more than the object gives him. Throws Failure.
    void Give(const File& file) const;
    // The same to one that others may use: an ACL that it has, and its object has not, goes.
    void GiveAgain(const File& file) const;

    // What of them a file does not have, in words; none when it has all. Throws Failure.
    std::optional<std::string> Missing(const File& file) const;

    mode_t mode() const { return mode_; }

 private:
    struct FreeAcl {
        void operator()(std::remove_pointer_t<acl_t>* acl) const { acl_free(acl); }
    };

    using Acl = std::unique_ptr<std::remove_pointer_t<acl_t>, FreeAcl>;

    uid_t owner_ = 0;
    gid_t group_ = 0;
    mode_t mode_ = 0;
    mode_t may_have_ =
        0;              // the object's bits of execution: Samba gives its "._" files the same mode
    bool cut_ = false;  // the mode has the last word
    Acl acl_;           // null where the mode says all
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_RIGHTS_H_
