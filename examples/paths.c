/* Says where the metadata of an object lies, on volumes with EA
 * directories and with "._" files. */
#include <mavocore.h>
#include <mavoea.h>
#include <stdio.h>

static int say(const char* object, const char* kind, int place) {
    char path[MAVOEA_PATH_SIZE + 1];
    if (MAVOEAPath(EA_FORM_FILE, object, kind, path,
                   MAVOEA_PATH_SIZE, place) == 0) {
        return puts(path) == EOF ? -1 : 0;
    }
    fprintf(stderr, "%s: no path: %s\n", object,
            MAVOErrorText(MLIBCErrGet()));
    return -1;
}

int main(int argc, char** argv) {
    int result;
    if (argc != 2) {
        fprintf(stderr, "usage: %s OBJECT\n", argv[0]);
        return 2;
    }
    result = say(argv[1], MAVOEA_KIND_STREAM, EA_PLACE_EADIR);
    if (say(argv[1], MAVOEA_KIND_RESOURCE, EA_PLACE_EADIR) != 0)
        result = -1;
    /* One "._" file is for both kinds. */
    if (say(argv[1], MAVOEA_KIND_STREAM, EA_PLACE_APPLEDOUBLE) != 0)
        result = -1;
    if (fflush(stdout) != 0 || ferror(stdout)) result = -1;
    return result == 0 ? 0 : 1;
}
