/* A program that somebody else compiles with what is installed: a library call that works, one that
 * fails, the platform's string list and error stack, and the header's version. */

#include <mavocore.h>
#include <mavoea.h>
#include <stdio.h>

int main(void) {
    char path[MAVOEA_PATH_SIZE + 1];
    MLIBCSzList* list = MLIBCSzListAlloc(4);

    if (MAVOEAPath(EA_FORM_FILE, "/volume/file", MAVOEA_KIND_STREAM, path, MAVOEA_PATH_SIZE,
                   EA_PLACE_EADIR) != 0) {
        return 1;
    }
    if (list == NULL || MAVOEAHiddenDirGet(&list) != 0) return 1;
    if (MAVOEAMKDir(0, NULL) != -1) return 1; /* what it takes is in all three libraries */
    printf("%s %s %d %d.%d.%d\n", path, MLIBCSzListGet(list, 0), MLIBCErrGet(),
           MAVOEA_VERSION_MAJOR, MAVOEA_VERSION_MINOR, MAVOEA_VERSION_PATCH);
    MLIBCSzListFree(list);
    return 0;
}
