/* libmavoea.so.5: Mac and SMB metadata kept in step with files.
 *
 * For the path of a file or directory (the object) the library decides where its metadata lives,
 * reads and writes it there, and carries it along when the object is copied, moved, renamed or
 * removed:
 *
 *   "@eaDir/<name>@MavoEAStream"   the EA stream: named attributes, resource fork, Finder info
 *   "@eaDir/<name>@MavoResource"   the resource file: Finder info, resource fork, netatalk record
 *   "._<name>"                     one AppleDouble file for all of it, on AppleDouble volumes
 *   real extended attributes       on volumes that keep them
 *
 * Results. Unless a function says otherwise it returns 0, a count or a size on success and -1 on
 * failure, and a failure records exactly one code (MAVOEA_ERR_...) with the unit and line that
 * decided it on the calling thread's error stack, where MLIBCErrGet() of libmavocore finds it.
 * Where a function sets `errno`, its comment says so; elsewhere a failure leaves the `errno` of the
 * system call that failed.
 *
 * Ownership. The caller owns every descriptor, handle, buffer and string list that it passes in or
 * gets back. The library closes only descriptors that it opened.
 *
 * Threads. Path derivation and the name tests are safe in any thread. The other functions share
 * process-wide state (the effective user id among it), so calls must not overlap.
 *
 * Strings are NUL-terminated bytes; no character set is assumed. On disk every multi-byte field is
 * big-endian.
 */
#ifndef MAVOEA_H_
#define MAVOEA_H_

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#if defined(__GNUC__)
#define MAVOEA_API __attribute__((visibility("default")))
#else
#define MAVOEA_API
#endif

struct flock64;
#ifndef MLIBC_SZ_LIST_DECLARED
#define MLIBC_SZ_LIST_DECLARED
typedef struct MLIBCSzList MLIBCSzList; /* the platform's string list, see mavocore.h */
#endif

/* ---- Version -------------------------------------------------------------------------------- */

/* The version of this header. Its major number is that of the soname. */
#define MAVOEA_VERSION_MAJOR 5
#define MAVOEA_VERSION_MINOR 0
#define MAVOEA_VERSION_PATCH 0

/* As one number to compare with: 50203 is 5.2.3. */
#define MAVOEA_VERSION \
    (MAVOEA_VERSION_MAJOR * 10000 + MAVOEA_VERSION_MINOR * 100 + MAVOEA_VERSION_PATCH)

/* ---- Constants ------------------------------------------------------------------------------ */

/* `form`: how metadata files are named inside the EA directory. */
enum {
    EA_FORM_FOLDER = 0, /* legacy: "@eaDir/<name>/<kind>" */
    EA_FORM_FILE = 1    /* current: "@eaDir/<name>@<kind>" */
};

/* `place`: where an object's metadata file lies. */
enum {
    EA_PLACE_EADIR = 0,      /* in "@eaDir" beside the object */
    EA_PLACE_APPLEDOUBLE = 1 /* the file "._<name>" beside the object */
};

/* Kinds of metadata files. */
#define MAVOEA_KIND_STREAM "MavoEAStream"
#define MAVOEA_KIND_RESOURCE "MavoResource"
#define MAVOEA_KIND_LEGACY_RESOURCE "MAVO:Resource"

/* `flags` of MAVOEASWrite(), a bit mask. */
enum {
    EAS_WRITE_OVERWRITE = 0x1, /* an attribute that exists may be written */
    EAS_WRITE_MUST_EXIST = 0x2 /* the attribute must exist */
};

/* Codes on the error stack. */
enum {
    MAVOEA_ERR_BUFFER_MEMORY = 0x100,    /* out of memory; a buffer too small or not enlargeable */
    MAVOEA_ERR_MEMORY = 0x200,           /* out of memory */
    MAVOEA_ERR_NOT_PERMITTED = 0x300,    /* the handle's lock does not allow the operation */
    MAVOEA_ERR_LOCK = 0x400,             /* the advisory lock could not be set */
    MAVOEA_ERR_NOTHING_THERE = 0x700,    /* path missing, a directory, or an empty resource fork */
    MAVOEA_ERR_OPEN = 0x900,             /* a metadata file or directory could not be opened */
    MAVOEA_ERR_READ = 0xA00,             /* read or seek failed, or what was read is invalid */
    MAVOEA_ERR_WRITE = 0xB00,            /* write failed, or an attribute could not be set */
    MAVOEA_ERR_BAD_ARGUMENT = 0xD00,     /* invalid argument */
    MAVOEA_ERR_NO_ATTRIBUTE = 0x2000,    /* attribute not found in an EA stream */
    MAVOEA_ERR_STAT = 0x2700,            /* stat failed for a cause other than ENOENT */
    MAVOEA_ERR_RENAME = 0x2800,          /* rename failed */
    MAVOEA_ERR_SYSTEM_CALL = 0x2A00,     /* another system call failed */
    MAVOEA_ERR_REMOVE = 0x3900,          /* unlink, remove or rmdir failed */
    MAVOEA_ERR_MAKE_DIRECTORY = 0x3C00,  /* mkdir failed, or the switch to the superuser */
    MAVOEA_ERR_BAD_APPLEDOUBLE = 0x4000, /* an AppleDouble header is not acceptable */
    MAVOEA_ERR_BASE_NAME = 0x9A00,       /* the base name of a path could not be taken */
    MAVOEA_ERR_RANGE = 0xBF00,           /* the caller's buffer is too small (errno ERANGE) */
    MAVOEA_ERR_NAME_TOO_LONG = 0xC300    /* a derived path would be too long (ENAMETOOLONG) */
};

/* ---- Types ---------------------------------------------------------------------------------- */

/* Which search indexes remove and rename notify; a NULL pointer means both. */
typedef struct EAIndexFlags {
    int fileIndex; /* 1: the platform's file index */
    int index;     /* 1: the search index, see MAVOIndex() */
} EAIndexFlags;

/* One attribute of an open EA stream.
 *
 * A caller may put another name from malloc() in the place of one, of nameLength bytes; it is the
 * handle's then. In a table of up to 32 attributes when it was opened, and of attributes written
 * since, each name is from malloc() itself, and whoever replaces it frees it. In a larger one the
 * names share a block, which is freed with the table, and must not be freed one by one. */
typedef struct EASEntry {
    uint32_t offset;    /* of the value's first byte, from the start of the file */
    uint32_t length;    /* of the value, in bytes */
    uint16_t flags;     /* carried through unchanged */
    uint8_t nameLength; /* of the name in bytes, its NUL included */
    char* name;         /* NUL-terminated, owned by the handle; NULL in unused records */
} EASEntry;

/* An open EA stream, from MAVOEASOpen(). A copy may be used in the place of the original, but not
 * beside it. */
typedef struct EASHandle {
    unsigned char header[120]; /* the file's first 120 bytes, as on disk */
    EASEntry* entries;         /* attribute table, owned by the handle */
    int32_t fd;                /* owned by the caller */
    int32_t capacity;          /* records allocated in `entries` */
    int32_t lockType;          /* F_RDLCK, F_WRLCK or F_UNLCK */
} EASHandle;

/* One entry of a netatalk metadata record; absent when its offset is 0. */
typedef struct EAAdoubleEntry {
    int64_t offset;  /* into the record's data */
    uint32_t length; /* in bytes */
} EAAdoubleEntry;

/* A netatalk metadata record in memory. */
typedef struct EAAdouble {
    uint32_t magic;   /* host order */
    uint32_t version; /* host order */
    uint8_t filler[16];
    EAAdoubleEntry entries[20]; /* ids 1 to 15 at their number, netatalk's own from 16 on */
    uint8_t data[1024];         /* the block as on disk */
} EAAdouble;

/* ---- Paths ---------------------------------------------------------------------------------- */
/* Pure string operations: nothing is looked up, opened or created. One trailing '/' of szPath is
 * ignored. In EA_FORM_FILE a name of more than 242 bytes is shortened to 242, ending in a check
 * character and its extension, so that "<name>@MavoEAStream" fits the 255 bytes of a file name.
 *
 * Buffers. MAVOEADirPath() and, in other forms than EA_FORM_FILE, MAVOEAPathNoADFS() take cbBuf as
 * the number of characters that fit, not counting the terminating NUL: szBuf must have room for
 * cbBuf + 1 bytes. Callers keep buffers of MAVOEA_PATH_SIZE + 1 bytes. szBuf may be szPath.
 *
 * All return 0 or -1. Codes: 0xD00 NULL argument, or an empty szPath (but for MAVOEAADPath(), which
 * gives "._"); 0x200 out of memory (only for paths of more than 4094 bytes); 0xC300 the result
 * would be too long. */

#define MAVOEA_PATH_SIZE 4096

/* The EA directory of szPath's object: "<parent>/@eaDir"; in EA_FORM_FOLDER the object's legacy
 * folder "<parent>/@eaDir/<name>". errno: ENOENT with 0xD00, ENAMETOOLONG with 0xC300. */
MAVOEA_API int MAVOEADirPath(int form, const char* szPath, char* szBuf, int cbBuf);

/* The metadata file of kind szName in the EA directory: "<parent>/@eaDir/<name>@<szName>" in
 * EA_FORM_FILE, "<parent>/@eaDir/<name>/<szName>" in EA_FORM_FOLDER, and "<parent>/@eaDir/<szName>"
 * for any other form. errno: ENAMETOOLONG with 0xC300. */
MAVOEA_API int MAVOEAPathNoADFS(int form, const char* szPath, const char* szName, char* szBuf,
                                int cbBuf);

/* The AppleDouble file "<parent>/._<name>". A result longer than cbBuf - 1 bytes is cut short, as
 * snprintf does, and still returns 0; a name of more than 253 bytes gives 0xC300, a cbBuf below 1
 * 0xD00. errno is left alone, but for ENOMEM. */
MAVOEA_API int MAVOEAADPath(const char* szPath, char* szBuf, int cbBuf);

/* MAVOEAPathNoADFS() for EA_PLACE_EADIR, MAVOEAADPath() for EA_PLACE_APPLEDOUBLE (szName must not
 * be NULL there either); any other place gives 0xD00. */
MAVOEA_API int MAVOEAPath(int form, const char* szPath, const char* szName, char* szBuf, int cbBuf,
                          int place);

/* ---- EA directories and metadata files ------------------------------------------------------ */

/* Creates the EA directory szEADirPath (with blParentFirst, the directory that holds it first) as
 * the superuser: mode 0777, the platform's EA-directory ACL and, on volumes of type 7, a Finder
 * info that hides it. A directory that exists is left exactly as it is. Returns 0 when it exists
 * afterwards.
 *
 * Codes: 0xD00 NULL, or no '/' in szEADirPath with blParentFirst; 0x3C00 mkdir or seteuid(0)
 * failed, the latter also where the directory exists; 0x2A00 the new directory could not be opened
 * (it is removed again unless somebody has used it), or the mode or the Finder info could not be
 * set (it stays); 0x100 out of memory. The effective uid is changed for the duration, for the whole
 * process. */
MAVOEA_API int MAVOEAMKDir(int blParentFirst, const char* szEADirPath);

/* Opens the metadata file of kind szName of szPath's object with the open(2) flags oflag, and mode
 * 0777 where it creates. With O_CREAT the EA directory is made as well: who cannot become the
 * superuser gets 0x3C00, even where directory and file exist. Waits, without O_NONBLOCK, for who
 * has a lease on the file, and for nobody else. What is missing is first looked for in earlier
 * layouts, by MAVOEAUpgrade(), but not in EA_FORM_FOLDER; its failures leave their codes. Where it
 * fails, with O_CREAT, nothing is made over what it may have left: -1, with its errno and codes.
 * What is there is opened, with O_EXCL too; only EA_FORM_FOLDER refuses it (errno EEXIST).
 * Returns a descriptor, which the caller closes, or -1: a failed open(2) records no code and leaves
 * its errno, ELOOP for a link, EISDIR for a directory and ENXIO for anything else that is no
 * regular file; 0xD00 NULL argument (errno ENOENT) or unknown place; otherwise the codes of the
 * path functions and of MAVOEAMKDir(). */
MAVOEA_API int MAVOEAOpen(int form, const char* szPath, const char* szName, int oflag, int place);

/* MAVOEAOpen() for EA_PLACE_EADIR. */
MAVOEA_API int MAVOEAOpenNoADFS(int form, const char* szPath, const char* szName, int oflag);

/* ---- Names and marks ------------------------------------------------------------------------ */
/* The tests return 1 or 0, and 0 for NULL unless they say otherwise. Callers pass bare names. */

/* 1 for a name with a ':' in it, the separator of legacy metadata names. */
MAVOEA_API int MAVOEAIsHiddenName(const char* szName);

/* 1 for "@eaDir", "@tmp" and "@sharebin", whatever their case; a path that begins with '/' is
 * reduced to its last component first. -1 on NULL (no code) and on failure: 0x200 out of memory,
 * 0x9A00 no base name. */
MAVOEA_API int MAVOEAIsHiddenDir(const char* szPath);

/* MAVOEAIsHiddenDir() for a bare name, decided by its first byte where that is enough. -1 on
 * NULL. */
MAVOEA_API int MAVOEAIsHiddenDirName(const char* szName);

/* Appends the three hidden directory names to *ppList. 0, or -1 on NULL (0xD00) or, with no code,
 * when the list takes no more (names appended before stay). */
MAVOEA_API int MAVOEAHiddenDirGet(MLIBCSzList** ppList);

/* 1 for hidden directory names, ".", ".." and names that begin with ".MAVOGALDB". */
MAVOEA_API int MAVOEAIsVetoFile(const char* szName);

/* 1 for veto files, ".DS_Store" and names that begin with "._". */
MAVOEA_API int MAVOEAIsHiddenFile(const char* szName);

/* Tells the platform's search index of a change; returns what the index returns. op is the index's
 * own: the library passes 4 for what has been renamed from szOldPath, and 7, with NULL for that,
 * for what has been removed. */
MAVOEA_API int MAVOIndex(const char* szPath, const char* szOldPath, int op);

/* Sets the SMB archive bit of szPath. 0, or -1 with errno (no code). */
MAVOEA_API int EASetSmbArchive(const char* szPath);

/* ---- EA streams: handle --------------------------------------------------------------------- */
/* A stream is an AppleDouble file with Finder info, an attribute area as Mac OS X writes it, and
 * the resource fork; docs/formats.md has the layout. */

/* Reads the stream on fd (an empty file is a new stream, and stays empty until it is written) under
 * a non-blocking advisory lock on the whole file: F_RDLCK to read, F_WRLCK to write, F_UNLCK for
 * none, which allows searching and enumerating only. fd must be open for reading, and for writing
 * with F_WRLCK; it stays the caller's, to be closed after MAVOEASClose(). Beware: closing any other
 * descriptor of the same file drops the process's locks on it.
 *
 * Returns a handle for MAVOEASClose(), or NULL: 0xD00 fd below 0, or more than 13 entry
 * descriptors; 0x200 out of memory; 0x400 another process holds a conflicting lock (errno EAGAIN or
 * EACCES), fd is not open for what the lock needs (EBADF), or lockType is none of the three
 * (EINVAL); 0xA00 header or table cannot be read, or the file ends before what its header declares.
 */
MAVOEA_API EASHandle* MAVOEASOpen(int fd, int lockType);

/* Frees h and releases its lock; the descriptor stays open. -1 when the lock could not be released
 * (0x400; h is freed all the same) or h is NULL (0xD00). */
MAVOEA_API int MAVOEASClose(EASHandle* h);

/* Asks the kernel whether *lock could be placed (F_GETLK), and fills it in. 0xD00, 0x2A00.
 * <fcntl.h> has struct flock64 under _GNU_SOURCE only; nothing else here needs that. */
MAVOEA_API int MAVOEASLockGet(EASHandle* h, struct flock64* lock);

/* Changes the handle's lock without waiting. The file is not read again: who had no lock until then
 * writes over what others have changed since MAVOEASOpen(). 0xD00; 0x400 with the causes and errno
 * of MAVOEASOpen(), the lock then stays as it was. */
MAVOEA_API int MAVOEASLockSet(EASHandle* h, int lockType);

/* fsync(2). 0xD00, 0x2A00. */
MAVOEA_API int MAVOEASFlush(EASHandle* h);

/* ---- EA streams: attributes ----------------------------------------------------------------- */
/* Names are compared byte by byte and have at most 254 bytes, values that are written at most
 * 2 GiB - 1; a stream holds at most 65,535 attributes and at most 4 GiB. What would pass a limit is
 * refused with 0xD00, before anything has changed. A stream whose offsets, lengths and counts do
 * not fit together is refused with 0xA00 by whatever would rewrite it, before anything on disk has
 * changed.
 *
 * A failed MAVOEASWrite, MAVOEASRemove or MAVOEASTruncate may leave memory ahead of the file:
 * close the handle and open the stream again. */

/* The index of attribute `name` (of the last one, should there be two), or -1: 0xD00; 0x2000 no
 * such attribute. */
MAVOEA_API int MAVOEASSearch(EASHandle* h, const char* name);

/* Appends all attribute names to *ppList, in table order, and returns their number; -1: 0xD00, or,
 * with no code, a name that could not be appended, which empties the list. */
MAVOEA_API int MAVOEASEnum(EASHandle* h, MLIBCSzList** ppList);

/* Copies up to `size` bytes of the value, from `offset` on, into buf (never NULL) and returns their
 * number, 0 behind the end. With size 0 returns the value's length (0 if `offset` is behind it). Of
 * values of 2 GiB and more, pieces can be read. -1: 0xD00; 0x300 no lock; 0x2000; 0xA00, also for a
 * number of 2 GiB and more. */
MAVOEA_API int MAVOEASRead(EASHandle* h, const char* name, void* buf, unsigned size,
                           unsigned offset);

/* Writes `size` bytes at `offset` of the value, creating the attribute unless flags has
 * EAS_WRITE_MUST_EXIST, and syncs the file. A value never shrinks: bytes outside the range stay,
 * a gap before `offset` reads as zeros. The attribute becomes the last of the table. Returns size.
 *
 * errno alone, with no code: ENOENT (-1) the attribute is missing with EAS_WRITE_MUST_EXIST; EEXIST
 * it exists without EAS_WRITE_OVERWRITE: -1, but 0 when size is 0. -1 with a code: 0xD00; 0x200;
 * 0x300 no write lock; 0xA00; 0xB00; 0x2A00 fsync failed. A failure to move the resource fork
 * records none; the log has its cause. */
MAVOEA_API int MAVOEASWrite(EASHandle* h, const char* name, const void* data, unsigned size,
                            unsigned offset, int flags);

/* Removes an attribute, cuts the file at the end of the resource fork and syncs it. -1: 0xD00;
 * 0x200; 0x300; 0x2000; 0xA00; 0xB00; 0x2A00. A failure to move the resource fork records none; the
 * log has its cause. */
MAVOEA_API int MAVOEASRemove(EASHandle* h, const char* name);

/* Sets a value's length, filling with zeros where it grows, and syncs the file. The attribute
 * becomes the last of the table. The resource fork's offset follows while its bytes do not move:
 * for streams without a fork, or whose fork the caller writes afterwards. -1: 0xD00; 0x200; 0x300;
 * 0x2000; 0xA00; 0xB00; 0x2A00 (recorded twice: by the flush, and here). */
MAVOEA_API int MAVOEASTruncate(EASHandle* h, const char* name, unsigned length);

/* Enlarges the attribute table by `count` records, 5 when count is 0. -1: 0xD00; 0x200, the table
 * then stays as it was. */
MAVOEA_API int MAVOEASAllocEntry(EASHandle* h, int count);

/* Writes header and table at the start of the file, and leaves the file position at the start of
 * the data area. Total size, length of the Finder info and offset of the fork follow from the data
 * area's start and length. -1: 0xD00; 0x200; 0x300 no write lock; 0xA00 table, start and length of
 * the data area do not fit together, or the position could not be set; 0xB00. */
MAVOEA_API int MAVOEASWriteHeader(EASHandle* h);

/* Makes record `index` the last one in memory and gathers the data area in buf: with that value at
 * its end or, with `remove`, without it, the record then being dropped. bufSize is at least the
 * size of what is gathered. The file is only read. -1: 0xD00; 0x100 bufSize too small; 0xA00, and
 * then nothing has changed. */
MAVOEA_API int MAVOEASUpdateEntry(EASHandle* h, unsigned index, unsigned char* buf,
                                  unsigned bufSize, int remove);

/* ---- Named attributes ----------------------------------------------------------------------- */
/* The object's own extended attributes, by their full names ("user.comment"); symbolic links are
 * followed. "com.apple.ResourceFork" is the file "rsrc" beneath the object, on filesystems that
 * offer it; an empty fork counts as absent. While a fork is used, a file without the owner-execute
 * bit gets it, as the superuser, and loses it again. Failures of the attribute calls themselves
 * record no code and leave errno; so do those of a fork that have none below, which are logged.
 * Where the filesystem offers no forks, errno is ENOTDIR then. NULL and negative arguments: a log
 * line and 0xD00. */

/* Appends all attribute names to *ppList; empties it, with result 0, when there are none and when
 * the object is missing. -1: 0xD00; 0x2A00; 0x100; or, with no code, the list takes no more
 * (names appended before stay). */
MAVOEA_API int MAVOEAXattrEnum(const char* szPath, MLIBCSzList** ppList);

/* Reads a value into szValue and returns its length; with cbValue 0 only the length. -1: 0xD00;
 * for the fork also 0x700 the object is missing or a directory, or the fork empty (errno ENODATA);
 * 0x2700; 0xBF00 it does not fit (errno ERANGE). A missing fork is ENOENT alone, and not logged. */
MAVOEA_API int MAVOEAXattrGet(const char* szPath, const char* szName, void* szValue, int cbValue);

/* Sets a value; flags as setxattr(2): 1 create only, 2 replace only. szValue must not be NULL, even
 * for cbValue 0. -1: 0xD00; for the fork of a directory 0x700, and errno EEXIST or ENODATA by
 * flags alone, not logged. A fork is written with sync(2) behind it. */
MAVOEA_API int MAVOEAXattrSet(const char* szPath, const char* szName, const void* szValue,
                              int cbValue, int flags);

/* Removes an attribute; a fork is emptied. -1: 0xD00; for the fork of a directory 0x700. */
MAVOEA_API int MAVOEAXattrRemove(const char* szPath, const char* szName);

/* ---- Netatalk record ------------------------------------------------------------------------- */
/* The AFP service's metadata of an object: a small AppleDouble block, in the extended attribute
 * "user.netatalk.Metadata" (402 bytes) on file-EA volumes, at the head of the resource file (741
 * bytes) on EA-directory volumes. docs/formats.md has the layout. */

/* Parses the len bytes at buf into *ad, which the caller has zeroed: absent entries stay as they
 * are. Entries lie within the record's 1024 bytes of data, the resource fork's excepted, which may
 * run past it. 0, or -1 with *ad filled as far as the parse went: 0xD00 NULL, len negative or over
 * 1024, or an entry that is not acceptable (logged); 0xA00 magic or version (logged). */
MAVOEA_API int MAVOEAAdoubleRead(const void* buf, int len, EAAdouble* ad);

/* The record of path's object, from its attribute and from its resource file. 0; 1 there is none,
 * as in a resource file of less than 741 bytes; -1: 0xD00 NULL; and, logged, 0xA00 unreadable or,
 * in the attribute, of another size or incomplete; the code of MAVOEAAdoubleRead() for a damaged
 * one, in the attribute with 0xA00 recorded after it; 0x900 the resource file could not be opened;
 * the path functions' codes. */
MAVOEA_API int MAVOEAFileEAAdoubleRead(const char* path, EAAdouble* ad);
MAVOEA_API int MAVOEAEADirAdoubleRead(const char* path, EAAdouble* ad);

/* Stores the len bytes at buf, 1024 at most, as the record of path's object. 0, or -1: 0xD00; 0x300
 * not permitted (attribute); 0xB00 not written; and, logged, 0x900 the resource file could not be
 * opened; the path functions' codes for it.
 *
 * The resource file is created where it is missing (and removed again when nothing could be
 * written); of one that exists only the head changes. Its EA directory is not made: 0x900 with
 * errno ENOENT where that is missing. MAVOEAEADirAdoubleFlush() keeps the descriptor that it opens,
 * one a call: a caller that flushes many files must allow for that. */
MAVOEA_API int MAVOEAFileEAAdoubleFlush(const void* buf, int len, const char* path);
MAVOEA_API int MAVOEAEADirAdoubleFlush(const void* buf, int len, const char* path);

/* ---- Finder info and flush time -------------------------------------------------------------- */
/* File-EA volumes (type 2) keep an object's 32 bytes of Finder info twice: in the resource file and
 * in the netatalk record of its attribute. Whoever changes one brings the other into step and
 * stamps the time of the change, the attribute "user.mavo.filea.flushtime": seconds since
 * 1970-01-01 UTC, 4 bytes, signed, big-endian. All zeros mean no Finder info.
 *
 * With checkFSType 1 nothing is done, with result 0, unless the platform says that path is on a
 * volume of type 2; with any other value nobody is asked. */

/* Finder info from the resource file (zeros when there is none) into the attribute, then the flush
 * time. The attribute's record is replaced by a fresh one: its comment, dates, AFP file info and
 * private entries are reset. 0, or -1: 0xD00 NULL, but with checkFSType 1 that is on no volume of
 * type 2 and gives 0; what opening the resource file, storing the record and the flush time give.
 */
MAVOEA_API int MAVOEAFileEAFSFinfoEASync(const char* path, int checkFSType);

/* Writes Finder info into the resource file, in place, under its write lock; one that is missing is
 * created, of 82 bytes. One that is removed or replaced before it is locked is opened, or created,
 * anew. When nothing could be written, an empty one is removed again if this call has made it and
 * has its lock. 0, or -1: 0xD00 NULL, or no Finder info in the file; 0xB00 not written; 0x400 it
 * was replaced time and again (errno EAGAIN); what MAVOEAOpen() and MAVOEASOpen() give. */
MAVOEA_API int MAVOEAEADirFSFInfoWrite(const char* path, const unsigned char finfo[32]);

/* Writes the Finder info of h's header (bytes 50 to 81) into its file, where the file's Finder info
 * is. 0, or -1: 0xD00 NULL, no descriptor, no Finder info behind the file's header, or an offset
 * that cannot be sought (logged); 0x300 no write lock; 0xB00 not written. */
MAVOEA_API int EASWriteFinderInfo(EASHandle* h);

/* Stamps the flush time with the present time. 0, or -1: 0xD00 NULL; 0x2A00 the attribute could not
 * be set. */
MAVOEA_API int MAVOEAFileEAWriteFlushTime(const char* path, int checkFSType);

/* ---- AppleDouble files and earlier layouts --------------------------------------------------- */

/* Whether path is the "._" file of something that is there. 0 it is; -1 0xD00 NULL or empty, 0x200
 * out of memory; and, with no code, -2 its name does not begin with "._", -3 it cannot be opened or
 * does not begin with the AppleDouble magic (which is all that is looked at), -4 what it belongs to
 * is missing (a symbolic link is there, wherever it points). */
MAVOEA_API int MAVOEACheckADFile(const char* path);

/* Repairs the resource file of the object at path, should it hold attributes: they go into the
 * object's EA stream, in the place of those of the same name there, whatever their length, and the
 * resource file is rewritten with Finder info and resource fork only, by way of
 * "<resource file>Tmp", which is locked meanwhile: one that another repair has locked is left alone
 * (0x400), one that nobody has is made anew. 0, also when there were none and the file was only
 * rewritten; -1 with the resource file unchanged, while attributes that were copied stay in the
 * stream: it is missing, is not an AppleDouble file of version 2 with 2 or 13 entries, or an
 * attribute failed. No code of its own. */
MAVOEA_API int MAVOEAFixErrorAD(const char* path);

/* Converts what earlier versions kept for the object at szPath into the current layout; szName is
 * what is about to be opened:
 *
 *   MAVOEA_KIND_STREAM    the files of the legacy folder "@eaDir/<name>/", one per attribute,
 *                         removed once all are in the stream; or a "._" file, which becomes the
 *                         stream as it is when it was read no earlier than all of those
 *   MAVOEA_KIND_RESOURCE  the legacy "MAVO:Resource"; the object gets its marks: write permissions
 *                         for everybody or nobody, and the hidden bit
 *   other "MAVO..."       a file of the legacy folder: its ':' becomes '@' there
 *
 * A legacy folder that is empty then is removed. MAVOEAOpen() calls this. Attribute files that
 * cannot be read, or that no stream can hold, stay where they are, with a code and a line in the
 * log; the others are converted. The stream gets its name when it has all values and they are on
 * disk: what fails before leaves everything as it was. The process's working directory is neither
 * used nor changed, unless szPath is relative to it.
 *
 * 0 converted, of other kinds also when "/bin/mv" has run and failed; 1 the current layout is there
 * already; 2 there is nothing of that kind; -1: 0xD00 an unknown kind or NULL; 0x900 the stream
 * could not be made, or what may be there (a file of either layout, the folder, the "._" file)
 * could not be looked at; 0xA00 the folder could not be read to its end; 0x2A00 none of its files
 * could be looked at; 0x2800 rename; 0x3900 the legacy folder could not be removed, all else is
 * done; no code where "/bin/mv" could not be run; what the path and stream functions give. errno is
 * that of the call that failed. Codes are recorded for files that stay, too: 0x2A00 stat, 0x900
 * open, 0x100 memory, 0xA00 read, 0xD00 a name of 255 bytes; for the "._" file that objects with
 * names of 254 and 255 bytes cannot have: 0xC300; and for marks: 0x900, 0xA00, 0x4000 no
 * AppleDouble file, or one without them. */
MAVOEA_API int MAVOEAUpgrade(const char* szPath, const char* szName);

/* ---- Remove, rename and copy ----------------------------------------------------------------- */
/* For a file service to call with what it does to the object itself. `fsType` is a volume's type as
 * MAVOGetFSType() gives it, or -1 to have it asked; the platform's indexes are told of the change.
 */

/* Removes the metadata of szPath's object and, should nothing else be in it, its EA directory. On
 * types 0 and 5 that is the "._" file and, should it go, the legacy folder (whatever becomes of
 * that one), on 1, 2, 3, 6 and 10 what is in the EA directory in both forms (and the object's
 * archive bit is set), on 7 nothing; other types do nothing at all. 0, or -1, with all done that
 * could be: 0xD00 NULL; 0x2A00 the type (of the parent directory's volume) could not be told;
 * 0x3900 something could not be removed; the path functions' codes. What is in the way in a legacy
 * folder, or the current directory if it cannot be told, is logged and has no code; each of the two
 * forms may record one. */
MAVOEA_API int MAVOEARemove(const char* szPath, int fsType, EAIndexFlags* pFlags);

/* The same, for both indexes, but the EA stream stays. */
MAVOEA_API int MAVOEARemoveWithoutEAStream(const char* szPath, int fsType);

/* Removes what one form of the EA directory holds for the object: the legacy folder with its files,
 * or resource file and stream; then the EA directory if nothing is left in it. 0, also when there
 * was nothing; -1: 0x3900, or logged; the path functions' codes. A folder that cannot be opened is
 * left, with 0x900 and result 0. */
MAVOEA_API int EARemove(int form, const char* szPath);

/* Removes the EA directory in or at szMetaPath (up to its first "@eaDir") if nothing but a regular
 * file ".cover" is left in it. 0 when it is gone, or was not there; -1 when it stays,
 * and for NULL and a path without "@eaDir". No codes. */
MAVOEA_API int EARemoveEADir(const char* szMetaPath);

/* Removes the EA directory, with all that is in it, of a directory that holds nothing else. NULL is
 * none. No codes: a directory that cannot be opened is logged. */
MAVOEA_API void MAVOEARemoveDanglingEADir(const char* szDir);

/* Moves the metadata of an object that has been renamed from szOldPath to szNewPath, over what is
 * there; legacy layouts become current ones on the way. The type is that of szNewPath, which must
 * be absolute for it to be asked: if it cannot be told, that is -1, logged, with no code. Types 0
 * and 5: 0, whatever became of the "._" file and of the legacy folder, which follows it. Types 1,
 * 2, 3, 6, 7 and 10: the sum of three moves, each 0, -1 or the exit status of "/bin/mv" where it
 * takes that to reach another volume; the archive bit is set at szNewPath. Each move that fails
 * records a code, by "/bin/mv" two, or is logged. Other types do nothing: 0. Negative: 0xD00 NULL;
 * 0x2800 rename; the codes of paths, EA directories and the upgrade. */
MAVOEA_API int MAVOEARename(const char* szOldPath, const char* szNewPath, int fsType,
                            EAIndexFlags* pFlags);

/* Carries the metadata of szSrc's object to szDst, where the caller has copied its data, or moved
 * it when `move` is not 0: attributes, resource fork, Finder info, netatalk record, the other files
 * that the EA directory holds for the object and the Mac lock. What was moved is removed at the
 * source; on types 7 only a `move` of exactly 1 removes the source's resource file.
 *
 * szDst is written to for a moment where its type is asked (of its parent directory). copyEADir not
 * 0 carries the other files of the EA directory; between volumes none of which keeps "._" files
 * they always are, and replace those at the destination. copyFn copies single metadata files and
 * returns a negative value on failure; NULL runs "/bin/cp" and "/bin/mv". updateFileIndex and
 * updateIndex tell the two indexes, also of what failed.
 *
 * 0 when it is done, also when the destination's type takes no metadata and when only what follows
 * the copy failed, which is logged; -1 or less: -3 the name is too long for a "._" file, -4
 * the source's type has no metadata, -32 and -33 a "._" name that clients do not take, -1, -2 and
 * any other number failed. What has been done stays done. A failure may record no code, one or
 * several; 0xD00 is NULL. */
MAVOEA_API int MAVOEACopyEx(const char* szSrc, char* szDst, int move, int copyEADir, int srcFSType,
                            int dstFSType, int updateFileIndex, int updateIndex,
                            int (*copyFn)(const char* from, const char* to));

/* The same with the external commands. */
MAVOEA_API int MAVOEACopy(const char* szSrc, char* szDst, int move, int copyEADir, int srcFSType,
                          int dstFSType, int updateFileIndex, int updateIndex);

#ifdef __cplusplus
}
#endif

#endif /* MAVOEA_H_ */
