// The names that file services must not show.
#ifndef MAVOEA_PATH_NAMES_H_
#define MAVOEA_PATH_NAMES_H_

namespace mavoea {

// In the order in which they are listed and compared.
inline constexpr const char* kHiddenDirNames[] = {"@eaDir", "@tmp", "@sharebin"};

}  // namespace mavoea

#endif  // MAVOEA_PATH_NAMES_H_
