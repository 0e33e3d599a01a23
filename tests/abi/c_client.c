/* A C program that uses the shared library the way a file service does: every exported function is
 * called once, on real files in a directory of its own. */

#define _GNU_SOURCE
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"

static int failures;

#define CHECK(what)                                                                         \
    do {                                                                                    \
        if (!(what)) {                                                                      \
            ++failures;                                                                     \
            fprintf(stderr, "%s:%d: %s (errno %s, code 0x%X)\n", __FILE__, __LINE__, #what, \
                    strerror(errno), (unsigned)MLIBCErrGet());                              \
        }                                                                                   \
    } while (0)

static void paths_are_derived(const char* object) {
    char path[MAVOEA_PATH_SIZE + 1];
    char expected[MAVOEA_PATH_SIZE];
    const int parent = (int)(strrchr(object, '/') - object);

    CHECK(MAVOEADirPath(EA_FORM_FILE, object, path, MAVOEA_PATH_SIZE) == 0);
    snprintf(expected, sizeof expected, "%.*s/@eaDir", parent, object);
    CHECK(strcmp(path, expected) == 0);

    CHECK(MAVOEAPathNoADFS(EA_FORM_FOLDER, object, MAVOEA_KIND_LEGACY_RESOURCE, path,
                           MAVOEA_PATH_SIZE) == 0);
    snprintf(expected, sizeof expected, "%.*s/@eaDir/file/MAVO:Resource", parent, object);
    CHECK(strcmp(path, expected) == 0);

    CHECK(MAVOEAADPath(object, path, MAVOEA_PATH_SIZE) == 0);
    snprintf(expected, sizeof expected, "%.*s/._file", parent, object);
    CHECK(strcmp(path, expected) == 0);

    CHECK(MAVOEAPath(EA_FORM_FILE, object, MAVOEA_KIND_STREAM, path, MAVOEA_PATH_SIZE, 2) == -1);
    CHECK(MLIBCErrGet() == MAVOEA_ERR_BAD_ARGUMENT);
    CHECK(strcmp(MLIBCErrorGetFile(), "ea_path") == 0);
    CHECK(MLIBCErrorGetLine() > 0);
}

static void names_are_told_apart(void) {
    MLIBCSzList* list = MLIBCSzListAlloc(4);
    CHECK(MAVOEAIsHiddenName("MAVO:Resource") == 1);
    CHECK(MAVOEAIsHiddenDir("/volume/share/@eaDir") == 1);
    CHECK(MAVOEAIsHiddenDirName("file") == 0);
    CHECK(MAVOEAIsVetoFile("..") == 1);
    CHECK(MAVOEAIsHiddenFile("._file") == 1);
    CHECK(MAVOEAHiddenDirGet(&list) == 0);
    CHECK(strcmp(MLIBCSzListGet(list, 0), "@eaDir") == 0);
    CHECK(MAVOIndex("/a", NULL, 7) == 0);
    MLIBCSzListFree(list);
}

/* The stream on fd has one attribute, "colour". */
static void names_are_the_callers_to_replace(int fd) {
    EASHandle* const h = MAVOEASOpen(fd, F_RDLCK);
    CHECK(h != NULL);
    if (h == NULL) return;
    free(h->entries[0].name);
    h->entries[0].name = strdup("couleur");
    EASHandle copy = *h;
    CHECK(MAVOEASSearch(&copy, "couleur") == 0);
    CHECK(MAVOEASClose(h) == 0);
}

static void a_stream_keeps_attributes(const char* object) {
    char value[16] = {0};
    unsigned char data[16];
    MLIBCSzList* list = MLIBCSzListAlloc(4);
    struct flock64 lock;
    struct stat info;

    const int fd =
        MAVOEAOpen(EA_FORM_FILE, object, MAVOEA_KIND_STREAM, O_RDWR | O_CREAT, EA_PLACE_EADIR);
    CHECK(fd >= 0);
    EASHandle* const h = MAVOEASOpen(fd, F_WRLCK);
    CHECK(h != NULL);
    if (h == NULL) return;
    CHECK(MAVOEASWrite(h, "colour", "blue", 4, 0, 0) == 4);
    CHECK(MAVOEASWrite(h, "size", "large", 5, 0, 0) == 5);
    CHECK(MAVOEASSearch(h, "size") == 1);
    CHECK(MAVOEASRead(h, "colour", value, sizeof value, 0) == 4 && memcmp(value, "blue", 4) == 0);
    CHECK(MAVOEASEnum(h, &list) == 2 && strcmp(MLIBCSzListGet(list, 1), "size") == 0);
    CHECK(MAVOEASUpdateEntry(h, 0, data, sizeof data, 0) == 0 && memcmp(data, "largeblue", 9) == 0);
    CHECK(MAVOEASAllocEntry(h, 3) == 0 && h->capacity == 8);
    CHECK(MAVOEASWriteHeader(h) == 0);
    CHECK(MAVOEASTruncate(h, "colour", 2) == 0);
    CHECK(MAVOEASRemove(h, "size") == 0);
    CHECK(MAVOEASFlush(h) == 0);
    CHECK(MAVOEASLockSet(h, F_RDLCK) == 0);
    memset(&lock, 0, sizeof lock);
    lock.l_type = F_WRLCK;
    CHECK(MAVOEASLockGet(h, &lock) == 0 && lock.l_type == F_UNLCK);
    CHECK(MAVOEASClose(h) == 0);
    names_are_the_callers_to_replace(fd);
    /* 120 bytes of header, a record of 20, and two bytes of value */
    CHECK(fstat(fd, &info) == 0 && info.st_size == 142);
    CHECK(close(fd) == 0);
    CHECK(MAVOEAOpenNoADFS(EA_FORM_FILE, object, "MavoResource", O_RDONLY) == -1);
    CHECK(errno == ENOENT);
    MLIBCSzListFree(list);
}

static void the_object_keeps_attributes(const char* object) {
    char value[8];
    MLIBCSzList* list = MLIBCSzListAlloc(4);
    if (MAVOEAXattrSet(object, "user.colour", "red", 3, 0) != 0 && errno == ENOTSUP) {
        printf("no extended attributes here: left out\n");
        MLIBCSzListFree(list);
        return;
    }
    CHECK(MAVOEAXattrGet(object, "user.colour", value, sizeof value) == 3);
    CHECK(MAVOEAXattrEnum(object, &list) == 0 && MLIBCSzListGet(list, 0) != NULL);
    CHECK(MAVOEAXattrRemove(object, "user.colour") == 0);
    CHECK(EASetSmbArchive(object) == 0);
    MLIBCSzListFree(list);
}

int main(void) {
    char dir[] = "c-client-XXXXXX";
    char start[2048];
    char object[4096];
    char command[4160];

    CHECK(mkdtemp(dir) != NULL);
    CHECK(getcwd(start, sizeof start) != NULL);
    snprintf(object, sizeof object, "%s/%s/file", start, dir);
    CHECK(close(open(object, O_CREAT | O_WRONLY, 0644)) == 0);

    paths_are_derived(object);
    names_are_told_apart();
    a_stream_keeps_attributes(object);
    the_object_keeps_attributes(object);

    snprintf(command, sizeof command, "%s/%s/@eaDir", start, dir);
    CHECK(MAVOEAMKDir(0, command) == 0); /* exists already */
    snprintf(command, sizeof command, "rm -rf %s", dir);
    CHECK(system(command) == 0);
    return failures == 0 ? 0 : 1;
}
