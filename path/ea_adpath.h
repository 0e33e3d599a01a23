// The name of an object's "._" file, for the units of other folders.
#ifndef MAVOEA_PATH_EA_ADPATH_H_
#define MAVOEA_PATH_EA_ADPATH_H_

#include <cstddef>
#include <string_view>

namespace mavoea {

inline constexpr std::string_view kAppleDoublePrefix = "._";

// Objects of longer names have no "._" file.
inline constexpr std::size_t kAppleDoubleNameMax = 255 - kAppleDoublePrefix.size();

}  // namespace mavoea

#endif  // MAVOEA_PATH_EA_ADPATH_H_
