/* Shows the comment in the netatalk record of an object on a volume
 * with EA directories. */
#include <errno.h>
#include <mavocore.h>
#include <mavoea.h>
#include <stdio.h>
#include <string.h>

enum { COMMENT = 4 }; /* an AppleDouble id */

int main(int argc, char** argv) {
    static EAAdouble record; /* zeros, as it must be */
    const EAAdoubleEntry* const comment = &record.entries[COMMENT];
    int result;
    if (argc != 2) {
        fprintf(stderr, "usage: %s OBJECT\n", argv[0]);
        return 2;
    }
    /* What is recorded from here on is new. */
    MLIBCErrSetEx(0, "", 0);
    errno = 0;
    result = MAVOEAEADirAdoubleRead(argv[1], &record);
    if (result < 0) {
        const int code = MLIBCErrGet();
        fprintf(stderr, "%s: %s\n", argv[1],
                code != 0 ? MAVOErrorText(code) : strerror(errno));
        return 1;
    }
    /* 1: there is no record; offset 0: none of a comment. The bytes
     * end without a NUL. */
    if (result == 0 && comment->offset != 0 && comment->length > 0) {
        fwrite(record.data + comment->offset, 1, comment->length,
               stdout);
        putchar('\n');
    }
    return fflush(stdout) == 0 && !ferror(stdout) ? 0 : 1;
}
