// What people ask of cp, mv and rm.
#ifndef MAVOEA_TOOLS_MOVE_OPTIONS_H_
#define MAVOEA_TOOLS_MOVE_OPTIONS_H_

#include <optional>
#include <string>

#include "tools/move/backup.h"
#include "tools/say/job.h"
#include "tools/transfer/manner.h"

namespace mavoea::tool {

enum class Follow { kUsual, kNever, kNamed, kAlways };  // symbolic links of sources

// Whether something may be overwritten.
enum class Overwrite { kUsual, kAsk, kAlways, kNever };

struct CopyOptions {
    // Sources, unless a list has them, and the destination as the last path when target_directory
    // is unset.
    JobOptions job;
    std::optional<std::string> target_directory;
    bool no_target_directory = false;  // the destination is the new object itself
    bool strip_slashes = false;
    bool parents = false;

    Follow follow = Follow::kUsual;
    Overwrite overwrite = Overwrite::kUsual;
    bool force = false;               // cp: what cannot be opened is removed
    bool remove_destination = false;  // before it is opened
    bool update = false;              // what is no older is left alone
    bool atomic = false;              // what is there is replaced, never written to
    Backup backup = Backup::kNone;
    std::string suffix;  // of simple backups

    bool hard_links = false;  // in place of copies
    bool symbolic_links = false;
    bool copy_contents = false;
    bool one_file_system = false;

    Manner manner;
    bool keeps_links = false;  // names of one file stay so
    bool allow_loss = false;   // mv: what did not arrive has been named, and may go
};

enum class AskToRemove { kUsual, kNever, kOnce, kAlways };

struct RemoveOptions {
    JobOptions job;
    AskToRemove ask = AskToRemove::kUsual;
    bool force = false;        // nothing is wrong with what is not there
    bool directories = false;  // empty ones go as well
    bool one_file_system = false;
    bool presumes_terminal = false;  // standard input is one
    bool preserve_root = true;
    bool preserve_mounts = false;  // what is named on another file system than its parent stays
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_OPTIONS_H_
