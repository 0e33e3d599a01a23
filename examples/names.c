/* Lists a directory as clients are to see it: without EA
 * directories, "._" files and the like. */
#include <dirent.h>
#include <errno.h>
#include <mavoea.h>
#include <stdio.h>

int main(int argc, char** argv) {
    DIR* dir;
    const struct dirent* entry;
    int result = 0;
    if (argc != 2) {
        fprintf(stderr, "usage: %s DIRECTORY\n", argv[0]);
        return 2;
    }
    dir = opendir(argv[1]);
    if (dir == NULL) {
        perror(argv[1]);
        return 1;
    }
    /* readdir() gives NULL at the end and on failure, and only errno
     * tells them apart. */
    while (errno = 0, (entry = readdir(dir)) != NULL) {
        if (MAVOEAIsHiddenFile(entry->d_name) == 0)
            puts(entry->d_name);
    }
    if (errno != 0) {
        perror(argv[1]);
        result = 1;
    }
    if (closedir(dir) != 0) result = 1;
    if (fflush(stdout) != 0 || ferror(stdout)) result = 1;
    return result;
}
