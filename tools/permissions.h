// What an inode has beside data and Mac metadata: owner, mode, ACL, extended attributes, times.
#ifndef MAVOEA_TOOLS_PERMISSIONS_H_
#define MAVOEA_TOOLS_PERMISSIONS_H_

#include <sys/stat.h>

#include <functional>
#include <optional>
#include <string>

namespace mavoea::tool {

// Gives `to` owner, extended attributes, mode and ACL of `from`, whose status is `info`, as far as
// user and file system allow: what may not be kept is left out, without a word for owner and
// attributes, and is returned for mode and ACL. `wanted` is asked for each attribute by its name;
// /etc/xattr.conf has its say as well. Symbolic links are not followed. Throws Failure when the
// file system is full or broken.
std::optional<std::string> CopyPermissions(const std::string& from, const struct stat& info,
                                           const std::string& to,
                                           const std::function<bool(const std::string&)>& wanted);

// Of access and modification, to the nanosecond.
void CopyTimes(const struct stat& info, const std::string& to);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PERMISSIONS_H_
