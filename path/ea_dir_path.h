// The EA directory of a path, for the units of this folder.
#ifndef MAVOEA_PATH_EA_DIR_PATH_H_
#define MAVOEA_PATH_EA_DIR_PATH_H_

#include <string_view>

namespace mavoea {

inline constexpr std::string_view kEADirName = "@eaDir";

// MAVOEADirPath() for a path that does not lie in szBuf. Returns where the result ends, at its NUL,
// or nullptr after recording a failure.
char* DeriveDirPath(int form, std::string_view path, char* szBuf, int cbBuf);

}  // namespace mavoea

#endif  // MAVOEA_PATH_EA_DIR_PATH_H_
