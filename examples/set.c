/* Gives a named attribute of an object's EA stream a new value.
 *
 * MAVOEASWrite() never makes a value shorter: "red" written over
 * "blue" leaves "rede". So the old value is removed first.
 * MAVOEASTruncate() is for streams without a resource fork only.
 * Removing and writing are two steps: a crash in between leaves the
 * object without the attribute. */
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

static int replace(EASHandle* h, const char* name,
                   const char* value) {
    const unsigned size = (unsigned)strlen(value);
    if (MAVOEASSearch(h, name) >= 0) {
        if (MAVOEASRemove(h, name) != 0) return -1;
    } else if (MLIBCErrGet() != MAVOEA_ERR_NO_ATTRIBUTE) {
        return -1;
    }
    /* That there was none is no error. */
    MLIBCErrSetEx(0, "", 0);
    return MAVOEASWrite(h, name, value, size, 0, 0) == (int)size
               ? 0
               : -1;
}

int main(int argc, char** argv) {
    int fd, result = -1;
    EASHandle* h;
    if (argc != 4) {
        fprintf(stderr, "usage: %s OBJECT NAME VALUE\n", argv[0]);
        return 2;
    }
    /* What is recorded from here on is new. */
    MLIBCErrSetEx(0, "", 0);
    errno = 0;
    fd = MAVOEAOpen(EA_FORM_FILE, argv[1], MAVOEA_KIND_STREAM,
                    O_RDWR | O_CREAT, EA_PLACE_EADIR);
    h = fd < 0 ? NULL : MAVOEASOpen(fd, F_WRLCK);
    if (h != NULL) {
        result = replace(h, argv[2], argv[3]);
        if (MAVOEASClose(h) != 0) result = -1;
    }
    if (result != 0) tell(argv[1]);
    if (fd >= 0 && close(fd) != 0) {
        if (result == 0) tell(argv[1]);
        result = -1;
    }
    return result == 0 ? 0 : 1;
}
