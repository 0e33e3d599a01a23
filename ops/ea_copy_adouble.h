// Rewrites AppleDouble files; for the operations only.
#ifndef MAVOEA_OPS_EA_COPY_ADOUBLE_H_
#define MAVOEA_OPS_EA_COPY_ADOUBLE_H_

namespace mavoea {

// What EACopyAdoubleV2() does with src, and whether dst must have a name that every client of an
// AppleDouble volume takes. Names are checked only where dst itself begins with "._": what is
// "Icon\r" behind it is refused with -32, characters that FAT reserves with -33.
enum AdoubleCopyMode {
    kRewriteChecked = 0,
    kRewrite = 1,
    kCopy = 2,  // by /bin/cp, as it is
    kCopyChecked = 3,
};

// Writes the AppleDouble file src to dst with Finder info and resource fork only: header and two
// descriptors in src's order, Finder info at 50, fork at 82. A fork that only says that it is left
// blank becomes an empty one. An existing dst is written over, not cut; one that was written in
// part is removed. dst gets mode 0777.
//
// 0, also when src is missing or empty; -1 NULL, not AppleDouble version 2, or the external copy
// failed; -2 a file could not be opened; -5 src does not declare 2 or 13 entries, or not each of
// the two once, or could not be read or written; -9 no space; -13 an I/O error or failed seek; -14
// fchmod failed; -32, -33 dst's name. No codes; all but refused names and modes is logged.
int EACopyAdoubleV2(const char* src, const char* dst, int mode);

// The same with kRewrite into the empty file on `to`, which stays open, and stays when that fails;
// `dst` is what it is called in the log.
int EARewriteAdouble(const char* src, const char* dst, int to);

// Logs that `path`, of a file to be rewritten or of what it becomes, could not be opened, and
// errno. Returns -2.
int EARewriteNotOpened(const char* path, int line = __builtin_LINE());

}  // namespace mavoea

#endif  // MAVOEA_OPS_EA_COPY_ADOUBLE_H_
