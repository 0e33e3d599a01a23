/* Writes the value of one of an object's own extended attributes to
 * standard output. */
#include <errno.h>
#include <mavocore.h>
#include <mavoea.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

/* A value that has grown since its length was asked does not fit: it
 * is asked again. */
static int get(const char* object, const char* name, char** value) {
    int tries, length = -1;
    for (tries = 0; tries < 10; ++tries) {
        char* larger;
        const int room = MAVOEAXattrGet(object, name, NULL, 0);
        if (room < 0) return -1;
        larger = realloc(*value, (size_t)room + 1);
        if (larger == NULL) return -1;
        *value = larger;
        length = MAVOEAXattrGet(object, name, *value, room + 1);
        if (length >= 0 || errno != ERANGE) break;
    }
    return length;
}

int main(int argc, char** argv) {
    char* value = NULL;
    int length, result = 1;
    if (argc != 3) {
        fprintf(stderr, "usage: %s OBJECT NAME\n", argv[0]);
        return 2;
    }
    /* What is recorded from here on is new. */
    MLIBCErrSetEx(0, "", 0);
    errno = 0;
    length = get(argv[1], argv[2], &value);
    if (length < 0) {
        /* Most failures record no code and leave errno. */
        const int code = MLIBCErrGet();
        fprintf(stderr, "%s: %s: %s\n", argv[1], argv[2],
                code != 0 ? MAVOErrorText(code) : strerror(errno));
    } else if (fwrite(value, 1, (size_t)length, stdout) ==
                   (size_t)length &&
               fflush(stdout) == 0) {
        result = 0;
    } else {
        perror("standard output");
    }
    free(value);
    return result;
}
