// Opening metadata files, for the units of other folders.
#ifndef MAVOEA_PATH_EA_OPEN_H_
#define MAVOEA_PATH_EA_OPEN_H_

namespace mavoea {

// MAVOEAOpen() of a file in the EA directory, with O_RDWR and O_CREAT, which also tells whether it
// has made the file.
int OpenOrMakeMetadata(const char* szPath, const char* szName, bool* made);

// MAVOEAUpgrade(), which stands above this folder, for who has just missed the file that it would
// make: it looks for that one again only before it would replace it. With `nowhere`, that is told
// whether the object has no metadata of the kind in any layout, whoever may be converting it, so
// that the file need not be looked for again; errno is ENOENT then.
int UpgradeMissed(const char* szPath, const char* szName, bool* nowhere);

}  // namespace mavoea

#endif  // MAVOEA_PATH_EA_OPEN_H_
