// Backups of what is about to be overwritten.
#ifndef MAVOEA_TOOLS_MOVE_BACKUP_H_
#define MAVOEA_TOOLS_MOVE_BACKUP_H_

#include <optional>
#include <string>

#include "tools/place/directory.h"

namespace mavoea::tool {

enum class Backup {
    kNone,
    kSimple,    // "NAME~"
    kExisting,  // numbered where there are numbered ones, otherwise simple
    kNumbered   // "NAME.~1~", and so on
};

// "none", "off", "simple", "never", "existing", "nil", "numbered", "t", or the beginning of one
// that is the beginning of no other meaning; none for anything else.
std::optional<Backup> BackupFromName(const std::string& name);

// The name under which an object is to be kept. Throws Failure.
std::string BackupName(const Place& object, Backup backup, const std::string& suffix);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_BACKUP_H_
