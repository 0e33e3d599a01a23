/* Carries the metadata of an object along to where its data has been
 * copied, from a volume with EA directories (type 1) to one with
 * "._" files (type 0). -1 has the volume asked. */
#include <errno.h>
#include <mavocore.h>
#include <mavoea.h>
#include <stdio.h>
#include <string.h>

int main(int argc, char** argv) {
    if (argc != 3) {
        fprintf(stderr, "usage: %s SOURCE COPY (absolute paths)\n",
                argv[0]);
        return 2;
    }
    /* What is recorded from here on is new. */
    MLIBCErrSetEx(0, "", 0);
    errno = 0;
    /* No move; both indexes are told. */
    if (MAVOEACopy(argv[1], argv[2], 0, 0, 1, 0, 1, 1) < 0) {
        const int code = MLIBCErrGet();
        fprintf(
            stderr, "%s: the metadata could not be copied: %s\n",
            argv[2],
            code != 0 ? MAVOErrorText(code) : "see the system log");
        return 1;
    }
    return 0;
}
