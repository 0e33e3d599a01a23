// What an inode has beside data and Mac metadata: owner, mode, ACL, extended attributes, times.
#ifndef MAVOEA_TOOLS_TRANSFER_PERMISSIONS_H_
#define MAVOEA_TOOLS_TRANSFER_PERMISSIONS_H_

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "tools/place/directory.h"
#include "tools/transfer/manner.h"

namespace mavoea::tool {

// A file that permissions are copied from or to.
struct Subject {
    std::shared_ptr<const Inode> inode;
    int fd = -1;  // open, for what holds contents
};

// Gives `to` what `manner` keeps of owner, extended attributes, mode and ACL of `from`, as far as
// user and file system allow: what may not be kept is left out, without a word for owner and
// attributes, unless the manner insists on them, and is returned for mode and ACL. Users'
// attributes come along in any manner. `wanted` is asked for each attribute by its name;
// /etc/xattr.conf has its say as well. Symbolic links are not followed. Throws Failure when the
// file system is full or broken.
std::optional<std::string> CopyPermissions(const Subject& from, const Subject& to,
                                           const Manner& manner,
                                           const std::function<bool(const std::string&)>& wanted);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_PERMISSIONS_H_
