/* libmavocore, host implementation: what libmavoea needs of the platform's core library.
 *
 * A build for the real platform links the platform's library instead; only the first part of this
 * header is the platform's. The second part, "Host only", exists here alone.
 */
#ifndef MAVOCORE_H_
#define MAVOCORE_H_

#ifdef __cplusplus
extern "C" {
#endif

#if defined(__GNUC__)
#define MAVOCORE_API __attribute__((visibility("default")))
#else
#define MAVOCORE_API
#endif

/* ---- Error stack ---------------------------------------------------------------------------- */
/* One per thread, bounded: when it is full the oldest record goes. Nothing is allocated, errno is
 * left alone. `file` is kept as a pointer and must outlive the record (a string literal). */

MAVOCORE_API void MLIBCErrSetEx(int code, const char* file, int line); /* pushes a record */
MAVOCORE_API int MLIBCErrGet(void);               /* code on top, 0 when the stack is empty */
MAVOCORE_API const char* MLIBCErrorGetFile(void); /* file on top, "" when the stack is empty */
MAVOCORE_API int MLIBCErrorGetLine(void);         /* line on top, 0 when the stack is empty */

/* ---- String lists --------------------------------------------------------------------------- */
/* A growable list of NUL-terminated strings; it owns copies of what is pushed. */

/* C99 takes a typedef once, and mavoea.h has this one, too. */
#ifndef MLIBC_SZ_LIST_DECLARED
#define MLIBC_SZ_LIST_DECLARED
typedef struct MLIBCSzList MLIBCSzList;
#endif

/* An empty list with room for `capacity` strings, 0 or more; it grows past them. NULL with errno
 * EINVAL or ENOMEM. The caller frees it with MLIBCSzListFree(). */
MAVOCORE_API MLIBCSzList* MLIBCSzListAlloc(int capacity);

/* Appends a copy of sz. The list may move: *ppList is updated. 0, or negative with errno EINVAL
 * when an argument is NULL and ENOMEM when memory runs out; the list then stays as it was. */
MAVOCORE_API int MLIBCSzListPush(MLIBCSzList** ppList, const char* sz);

/* String number `index`, from 0, owned by the list until it is emptied or freed; NULL past the end
 * and below 0. */
MAVOCORE_API const char* MLIBCSzListGet(const MLIBCSzList* pList, int index);

/* Both leave errno alone and take NULL for nothing to do. */
MAVOCORE_API void MLIBCSzListRemoveAll(MLIBCSzList* pList); /* empties the list, keeps its room */
MAVOCORE_API void MLIBCSzListFree(MLIBCSzList* pList);

/* ---- Programs and files --------------------------------------------------------------------- */

/* Runs szProgram (a path; no shell, no search) with the arguments up to NULL, and waits for it. The
 * caller's signals and descriptors stay as they are; the program gets the environment, the signal
 * mask, the ignored signals and the descriptors that exec() hands on.
 * Returns its exit status; -1 with errno when it could not be run; -128 less the signal's number
 * when a signal killed it; -2 when it ended but its status is lost, because the process ignores
 * SIGCHLD or waits for any child elsewhere. */
MAVOCORE_API int MLIBCExec(const char* szProgram, ...);

/* The attribute word of MLIBCFileStat(). */
enum {
    MLIBC_ATTRIBUTE_ARCHIVE = 0x1, /* SMB archive bit */
    MLIBC_ATTRIBUTE_HIDDEN = 0x4,
    MLIBC_ATTRIBUTE_LOCKED = 0x20 /* the Mac lock */
};

/* Extended stat of szPath, symbolic links followed, into the 128 bytes at pInfo: the mode, 32-bit,
 * at byte 16; the attribute word, 32-bit, at byte 116; both in host order, all other bytes 0. A
 * file or filesystem without attribute words has 0. The library asks with option 3; the host takes
 * any. 0, or -1 with errno and pInfo untouched. */
MAVOCORE_API int MLIBCFileStat(const char* szPath, int option, void* pInfo);

/* The filesystem type of an absolute path; -1 with errno when it cannot tell: EINVAL for NULL or a
 * path that is not absolute, ENOTSUP for a filesystem that is not among those below, else what the
 * kernel said. `flag` is not used here.
 *
 * First the volume table decides, by its longest entry that is a prefix of the path, component by
 * component. Its entries are those of MAVOVolumeDeclare() and of MAVO_VOLUME_TABLE; of two with the
 * same path the declared one counts. Paths are compared as text, with ".", ".." and repeated
 * slashes resolved and symbolic links not.
 *
 * Otherwise the filesystem decides on which the path is, or its nearest existing parent: FAT,
 * exFAT, NTFS, SMB and NFS 0; ext2/3/4, XFS, tmpfs and the like 1; btrfs 2; HFS and HFS+ 7;
 * anything else -1. A FUSE filesystem on a block device counts as NTFS or exFAT; no other one is
 * known. */
MAVOCORE_API int MAVOGetFSType(const char* szPath, int flag);

/* szIn with the characters of its last component that FAT reserves as their Unicode private-use
 * counterparts, in UTF-8, as SMB clients, NTFS and Samba's catia write them: 0x01 to 0x1F become
 * U+F001 to U+F01F, and " * : < > ? \ | become U+F020 to U+F027, 3 bytes each. Slashes at the end
 * belong to no component. The two buffers must not overlap. 0, or negative with szOut untouched:
 * errno EINVAL when an argument is NULL, ENAMETOOLONG when the result and its NUL do not fit in
 * cbOut bytes. */
MAVOCORE_API int MAVOStrReplaceFATReservedChar(const char* szIn, char* szOut, int cbOut);

/* ---- Search indexes ------------------------------------------------------------------------- */
/* Both tell the registered observer and return what it returns; 0 without one. */

MAVOCORE_API int MLIBMavoFileIndexAdd(const char* szPath, const char* szOldPath, int op);
MAVOCORE_API int MLIBMavoIndexAddEx(const char* szPath, const char* szOldPath, int op,
                                    int reserved1, int reserved2);

/* ---- Host only ------------------------------------------------------------------------------ */

/* What a code on the error stack means to the caller, and what to do about it: static texts in
 * English, never NULL, for any code. Safe in any thread; errno is left alone. */
MAVOCORE_API const char* MAVOErrorText(int code);   /* "There is no such attribute" */
MAVOCORE_API const char* MAVOErrorAdvice(int code); /* a sentence */

/* The volume table: one "PATH TYPE" a line, PATH absolute, TYPE a number or a name as
 * MAVOVolumeTypeFromName() takes it. TYPE is the last field, so PATH may hold blanks. A line that
 * is blank or begins with '#' says nothing; of two lines with the same path the later one counts. A
 * malformed line is reported once to syslog and skipped. The file need not exist, and is read again
 * when it has changed. */
#define MAVO_VOLUME_TABLE "/etc/mavoea/volumes"

/* Types of volumes beside the platform's: directories where other programs keep metadata in ways of
 * their own. A volume table may say so; to MAVOGetFSType(), and to whoever asks it, such a path is
 * of no known type (-1, ENOTSUP), and nothing is written there that those programs do not know. */
enum {
    MAVO_VOLUME_SAMBA = 100,            /* vfs_fruit with netatalk's records, vfs_streams_xattr */
    MAVO_VOLUME_SAMBA_STREAM = 101,     /* the same with "fruit:metadata = stream" */
    MAVO_VOLUME_NETATALK = 102,         /* netatalk, "ea = sys" */
    MAVO_VOLUME_NETATALK_SAMBA = 103,   /* netatalk, "ea = samba" */
    MAVO_VOLUME_LINUX = 104,            /* one extended attribute of the user namespace for each */
    MAVO_VOLUME_SAMBA_ALL_STREAMS = 105 /* as 101 and with "fruit:resource = stream" */
};

/* Declares, for this process, that the directory szPath (absolute) is a volume of `type`, 0 to 12
 * or one of those above. A second declaration of the same path replaces the first. 0, or -1 with
 * errno EINVAL or ENOMEM. */
MAVOCORE_API int MAVOVolumeDeclare(const char* szPath, int type);

/* The type that a volume table's TYPE means: a number from 0 to 12, or "appledouble" (0), "eadir"
 * (1), "fileea" (2), "xattr" (7), "samba" (100), "samba-stream" (101), "netatalk" (102),
 * "netatalk-samba" (103), "linux" (104), "samba-all-streams" (105). -1 when it means none. */
MAVOCORE_API int MAVOVolumeTypeFromName(const char* szName);

/* Where an entry of the volume table comes from. */
enum { MAVO_VOLUME_DECLARED = 1, MAVO_VOLUME_LISTED = 2 };

typedef struct MAVOVolumeEntry {
    int type;   /* 0 to 12, or one of those above */
    int source; /* MAVO_VOLUME_... */
    int line;   /* of MAVO_VOLUME_TABLE, from 1, when listed; else 0 */
} MAVOVolumeEntry;

/* The entry that decides for the absolute path szPath, as MAVOGetFSType() takes it; the filesystem
 * is not asked. 1 and *pEntry; 0 when the table knows of none; -1 with errno EINVAL when an
 * argument is NULL or the path is not absolute, or ENOMEM. *pEntry changes only with 1. */
MAVOCORE_API int MAVOVolumeFind(const char* szPath, MAVOVolumeEntry* pEntry);

/* Looks for what is wrong with MAVO_VOLUME_TABLE. 0: nothing, or the file is not there. 1: line
 * *pLine, from 1, is the first malformed one, and *pszProblem says how, as "does not end in a
 * volume type" does (static text). -1 with errno: the file cannot be read, EISDIR and ENXIO when it
 * is no regular file; EINVAL when an argument is NULL. *pLine and *pszProblem change only with 1.
 */
MAVOCORE_API int MAVOVolumeTableCheck(int* pLine, const char** pszProblem);

/* Which of the two indexes an event is for. */
enum { MAVO_INDEX_FILE = 0, MAVO_INDEX_SEARCH = 1 };

/* Called for every index notification, in the thread that makes it. */
typedef int (*MAVOIndexObserver)(void* context, int which, const char* szPath,
                                 const char* szOldPath, int op);

/* Registers the process's observer, NULL for none. A notification that another thread has begun may
 * still reach the one before. */
MAVOCORE_API void MAVOIndexObserverSet(MAVOIndexObserver observer, void* context);

#ifdef __cplusplus
}
#endif

#endif /* MAVOCORE_H_ */
