/* Sets the type and the creator of an object and gives it a resource
 * fork, in its resource file, and says what is there. Without TYPE
 * it only says so. */
#include <errno.h>
#include <fcntl.h>
#include <mavocore.h>
#include <mavoea.h>
#include <stdint.h>
#include <stdio.h>
#include <string.h>
#include <unistd.h>

/* An AppleDouble file: the number of its entries at 24, from 26 on
 * 12 bytes for each: id, offset and length, big-endian. In a
 * handle's header the first entry is always the Finder info, whose
 * 32 bytes are at 50, and the second one the fork. */
enum {
    COUNT = 24,
    ENTRIES = 26,
    ENTRY = 12,
    FINDER_INFO = 50,
    FINDER_INFO_SIZE = 32,
    FORK_ID = 2
};

static uint32_t number(const unsigned char* at) {
    return (uint32_t)at[0] << 24 | (uint32_t)at[1] << 16 |
           (uint32_t)at[2] << 8 | at[3];
}

static void put(uint32_t value, unsigned char* at) {
    int i;
    for (i = 0; i < 4; ++i)
        at[i] = (unsigned char)(value >> (24 - 8 * i));
}

static int write_at(int fd, const void* bytes, size_t size,
                    off_t offset) {
    const ssize_t put_there = pwrite(fd, bytes, size, offset);
    if (put_there == (ssize_t)size) return 0;
    if (put_there >= 0) errno = ENOSPC;
    return -1;
}

/* The fork is the last one in the file, or it could not change its
 * length. */
static int set_fork(EASHandle* h, const char* fork, uint32_t size) {
    unsigned char entry[ENTRY];
    const off_t end = lseek(h->fd, 0, SEEK_END);
    int i;
    for (i = 0; i < h->header[COUNT] * 256 + h->header[COUNT + 1];
         ++i) {
        const off_t at = ENTRIES + i * ENTRY;
        off_t start;
        if (pread(h->fd, entry, sizeof entry, at) != sizeof entry)
            return -1;
        if (number(entry) != FORK_ID) continue;
        start = (off_t)number(entry + 4);
        if (start < FINDER_INFO + FINDER_INFO_SIZE ||
            start + (off_t)number(entry + 8) < end)
            break;
        put(size, entry + 8);
        if (write_at(h->fd, fork, size, start) != 0) return -1;
        if (write_at(h->fd, entry, sizeof entry, at) != 0) return -1;
        return ftruncate(h->fd, start + (off_t)size) == 0
                   ? MAVOEASFlush(h)
                   : -1;
    }
    errno = ENOTSUP;
    return -1;
}

/* A handle of the resource file, with its descriptor in it; NULL
 * with errno ENOENT and no code when there is none, or an empty one
 * that nobody has written yet. */
static EASHandle* open_resource(const char* object, int oflag,
                                int lock) {
    EASHandle* h;
    int error;
    const int fd =
        MAVOEAOpen(EA_FORM_FILE, object, MAVOEA_KIND_RESOURCE, oflag,
                   EA_PLACE_EADIR);
    if (fd < 0) return NULL;
    h = MAVOEASOpen(fd, lock);
    error = errno;
    if (h != NULL && lseek(fd, 0, SEEK_END) > 0) return h;
    if (h != NULL) {
        (void)MAVOEASClose(h);
        error = ENOENT;
    }
    close(fd);
    errno = error;
    return NULL;
}

static int close_resource(EASHandle* h) {
    const int fd = h->fd; /* not the handle's */
    const int result = MAVOEASClose(h);
    return close(fd) == 0 ? result : -1;
}

/* All under one lock, so that nobody's change in between is lost. */
static int set(const char* object, const char* type,
               const char* creator, const char* fork) {
    static const unsigned char none[FINDER_INFO_SIZE];
    int result;
    EASHandle* h = open_resource(object, O_RDWR, F_WRLCK);
    if (h == NULL && errno == ENOENT && MLIBCErrGet() == 0) {
        /* Makes the file. */
        if (MAVOEAEADirFSFInfoWrite(object, none) != 0) return -1;
        h = open_resource(object, O_RDWR, F_WRLCK);
    }
    if (h == NULL) return -1;
    /* What else the Finder info says, as flags and label, stays. */
    memcpy(h->header + FINDER_INFO, type, 4);
    memcpy(h->header + FINDER_INFO + 4, creator, 4);
    result = EASWriteFinderInfo(h);
    if (result == 0)
        result = set_fork(h, fork, (uint32_t)strlen(fork));
    if (result != 0) {
        const int error = errno;
        (void)close_resource(h);
        errno = error;
        return -1;
    }
    return close_resource(h);
}

static int show(const char* object) {
    const unsigned char* info;
    EASHandle* h = open_resource(object, O_RDONLY, F_RDLCK);
    if (h == NULL) return -1;
    info = h->header + FINDER_INFO;
    printf("type %.4s, creator %.4s, a fork of %lu bytes\n",
           (const char*)info, (const char*)info + 4,
           (unsigned long)number(h->header + ENTRIES + ENTRY + 8));
    return close_resource(h);
}

int main(int argc, char** argv) {
    int result = 0;
    if ((argc != 2 && argc != 5) ||
        (argc == 5 &&
         (strlen(argv[2]) != 4 || strlen(argv[3]) != 4))) {
        fprintf(stderr,
                "usage: %s OBJECT [TYPE CREATOR FORK]; TYPE and "
                "CREATOR have 4 bytes\n",
                argv[0]);
        return 2;
    }
    /* What is recorded from here on is new. */
    MLIBCErrSetEx(0, "", 0);
    errno = 0;
    if (argc == 5) result = set(argv[1], argv[2], argv[3], argv[4]);
    if (result == 0) result = show(argv[1]);
    if (result != 0) {
        const int code = MLIBCErrGet();
        fprintf(stderr, "%s: %s\n", argv[1],
                code != 0 ? MAVOErrorText(code) : strerror(errno));
    }
    return fflush(stdout) == 0 && !ferror(stdout) && result == 0 ? 0
                                                                 : 1;
}
