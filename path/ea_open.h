// Opening metadata files, for the units of other folders.
#ifndef MAVOEA_PATH_EA_OPEN_H_
#define MAVOEA_PATH_EA_OPEN_H_

namespace mavoea {

// MAVOEAOpen() of a file in the EA directory, with O_RDWR and O_CREAT, which also tells whether it
// has made the file.
int OpenOrMakeMetadata(const char* szPath, const char* szName, bool* made);

}  // namespace mavoea

#endif  // MAVOEA_PATH_EA_OPEN_H_
