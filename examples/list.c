/* Lists the named attributes of an object's EA stream. */
#include <errno.h>
#include <fcntl.h>
#include <mavocore.h>
#include <mavoea.h>
#include <stdio.h>
#include <string.h>
#include <unistd.h>

static void tell(const char* object) {
    const int code = MLIBCErrGet();
    fprintf(stderr, "%s: %s\n", object,
            code == 0 ? strerror(errno) : MAVOErrorText(code));
}

static int list(int fd) {
    int i, count;
    MLIBCSzList* names;
    EASHandle* h = MAVOEASOpen(fd, F_RDLCK);
    if (h == NULL) return -1;
    names = MLIBCSzListAlloc(8);
    count = names == NULL ? -1 : MAVOEASEnum(h, &names);
    for (i = 0; i < count; ++i) puts(MLIBCSzListGet(names, i));
    MLIBCSzListFree(names);
    return MAVOEASClose(h) == 0 && count >= 0 ? 0 : -1;
}

int main(int argc, char** argv) {
    int fd, result;
    if (argc != 2) {
        fprintf(stderr, "usage: %s OBJECT\n", argv[0]);
        return 2;
    }
    /* What is recorded from here on is new. */
    MLIBCErrSetEx(0, "", 0);
    errno = 0;
    fd = MAVOEAOpen(EA_FORM_FILE, argv[1], MAVOEA_KIND_STREAM,
                    O_RDONLY, EA_PLACE_EADIR);
    /* It has no attributes. */
    if (fd < 0 && errno == ENOENT && MLIBCErrGet() == 0) return 0;
    result = fd < 0 ? -1 : list(fd);
    if (result != 0) tell(argv[1]);
    if (fd >= 0 && close(fd) != 0) {
        if (result == 0) tell(argv[1]);
        result = -1;
    }
    return fflush(stdout) == 0 && !ferror(stdout) && result == 0 ? 0
                                                                 : 1;
}
