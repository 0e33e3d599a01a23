/* Brings what earlier versions kept for an object into the current
 * layout. */
#include <errno.h>
#include <mavocore.h>
#include <mavoea.h>
#include <stdio.h>
#include <string.h>

static int upgrade(const char* object, const char* kind) {
    static const char* const said[] = {"converted", "current",
                                       "nothing there"};
    int result, code;
    /* What is recorded from here on is new. */
    MLIBCErrSetEx(0, "", 0);
    errno = 0;
    result = MAVOEAUpgrade(object, kind);
    code = MLIBCErrGet();
    if (result < 0 || result > 2) {
        fprintf(stderr, "%s: %s: %s\n", object, kind,
                code != 0 ? MAVOErrorText(code) : strerror(errno));
        return -1;
    }
    printf("%s: %s\n", kind, said[result]);
    /* A record although it has succeeded: some of it has stayed
     * where it was. */
    if (code != 0)
        fprintf(stderr, "%s: %s: %s\n", object, kind,
                MAVOErrorText(code));
    return code == 0 ? 0 : -1;
}

int main(int argc, char** argv) {
    int stream, resource;
    if (argc != 2) {
        fprintf(stderr, "usage: %s OBJECT\n", argv[0]);
        return 2;
    }
    stream = upgrade(argv[1], MAVOEA_KIND_STREAM);
    resource = upgrade(argv[1], MAVOEA_KIND_RESOURCE);
    if (fflush(stdout) != 0 || ferror(stdout)) return 1;
    return stream == 0 && resource == 0 ? 0 : 1;
}
