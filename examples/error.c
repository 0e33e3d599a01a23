/* Opens an object's EA stream, and tells what went wrong. */
#include <errno.h>
#include <fcntl.h>
#include <mavocore.h>
#include <mavoea.h>
#include <stdio.h>
#include <string.h>
#include <unistd.h>

/* `error` is the errno that the failed call left. */
static void tell(const char* object, int error) {
    const int code = MLIBCErrGet();
    /* The call has recorded nothing: errno is all there is. */
    if (code == 0) {
        fprintf(stderr, "%s: %s\n", object, strerror(error));
        return;
    }
    fprintf(stderr, "%s: %s. %s\n", object, MAVOErrorText(code),
            MAVOErrorAdvice(code));
}

int main(int argc, char** argv) {
    int fd;
    EASHandle* h;
    if (argc != 2) {
        fprintf(stderr, "usage: %s OBJECT\n", argv[0]);
        return 2;
    }
    /* So that an old record is not taken for this one. */
    MLIBCErrSetEx(0, "", 0);
    errno = 0;
    fd = MAVOEAOpen(EA_FORM_FILE, argv[1], MAVOEA_KIND_STREAM,
                    O_RDONLY, EA_PLACE_EADIR);
    if (fd < 0) {
        tell(argv[1], errno);
        return 1;
    }
    h = MAVOEASOpen(fd, F_RDLCK);
    if (h == NULL) {
        tell(argv[1], errno);
        close(fd);
        return 1;
    }
    if (MAVOEASClose(h) != 0) {
        tell(argv[1], errno);
        close(fd);
        return 1;
    }
    if (close(fd) != 0) {
        tell(argv[1], errno);
        return 1;
    }
    return 0;
}
