// What the source files of the copy share; for the operations only. All of them are one unit,
// "ea_copy.c", in error records and log lines.
#ifndef MAVOEA_OPS_EA_COPY_H_
#define MAVOEA_OPS_EA_COPY_H_

#include "util/unit.h"

namespace mavoea {

inline constexpr Unit copy_unit("ea_copy.c");

// Copies one file for the caller. Negative on failure.
using CopyFn = int (*)(const char* from, const char* to);

// Results of the routines below that are none of 0 and -1. kUnsupported is no failure for the
// driver; the others it hands on.
inline constexpr int kCopyUnsupported = -4;  // there is no copy to that type of volume
inline constexpr int kCopyNameTooLong = -3;  // the name is too long for a "._" file

// All routines carry the metadata of the object at `src` to `dst` and return 0 or a negative value,
// logged. With `move` non-zero what was carried is removed from src.

// ---- Between EA directories ---------------------------------------------------------------------

// The path of dst's EA directory (mode as the form of MAVOEADirPath()) into szBuf, and the
// directory made. One that exists is kept with mode 1, otherwise removed with all that is in it and
// made again. With `made`, that is told whether it was made here.
int EAPrepareEADir(int mode, const char* szPath, char* szBuf, int cbBuf, bool* made = nullptr);

// The metadata file of kind `name`, if there is one: by copyFn, or by /bin/cp without one.
int EACopySidecar(const char* src, const char* dst, const char* name, int move, CopyFn copyFn);

// Resource file, then stream.
int EACopyEADirFSToEADirFS(const char* src, const char* dst, int move, CopyFn copyFn);

// The same to a file-EA volume: the resource file is rewritten, and Finder info and flush time are
// stored in the destination's attributes. Nothing without a resource file.
int EACopyEADirFSToFileEAFS(const char* src, const char* dst, int move, CopyFn copyFn);

// Removes the source's resource file; a missing one is as good.
int EARemoveSrcResource(const char* src);

// Removes the source's netatalk record, an extended attribute; a missing one is as good.
int RemoveSrcRecord(const char* src);

// ---- To and from real extended attributes -------------------------------------------------------

// Attributes of the stream, resource fork and Finder info of src, in `place` (EA_PLACE_...), as
// dst's extended attributes. 0; -1 or less: -1 less the attributes that failed.
int EACopyEAStreamToXattr(const char* src, const char* dst, int move, int place);
int EACopyToXattrFS(const char* src, const char* dst, int move);

// src's extended attributes into dst's resource file and stream in `place`.
int EACopyXattrToEAStream(const char* src, const char* dst, int place);

// The same into the EA directory. Only a move of exactly 1 removes src's resource file.
int EACopyXattrToEADirFS(const char* src, const char* dst, int move);

// src's extended attributes as dst's. -1 when any of them failed.
int CopyXattrs(const char* src, const char* dst);

// ---- To and from "._" files ---------------------------------------------------------------------

int EACopyFromADFS(const char* src, const char* dst, int move, int dstFSType);
int EACopyADFStoADFS(const char* src, const char* dst, int move);
int EACopyADFSToEADirFS(const char* src, const char* dst, int move);
int EACopyToADFS(const char* src, const char* dst, int move);
int EACopyFileEAFSToADFS(const char* src, const char* dst, int move);

// ---- Behind the copy ----------------------------------------------------------------------------

// One call of MAVOEACopyEx(), its types known.
struct CopyRequest {
    const char* src;
    char* dst;
    int move;
    int copy_eadir;
    int src_type;
    int dst_type;
    int update_file_index;
    int update_index;
    CopyFn copy_fn;
};

// Removes what is left at the source of a move, carries the EA directory's other files over, sets
// the archive bit. What fails is logged and ends it.
void FinishCopy(CopyRequest request);

// Runs "/bin/rm" "-rf" path; a failure is logged.
void RemoveTree(const char* path, int line = __builtin_LINE());

}  // namespace mavoea

#endif  // MAVOEA_OPS_EA_COPY_H_
