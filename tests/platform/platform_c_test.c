/* The platform libraries from a C11 program: headers, linking, a call of every function. */

#include <stdio.h>
#include <string.h>
#include <unistd.h>

#include "platform/include/mavoacl.h"
#include "platform/include/mavocore.h"

static int failures = 0;

#define CHECK(condition)                                                    \
    do {                                                                    \
        if (!(condition)) {                                                 \
            fprintf(stderr, "%s:%d: %s\n", __FILE__, __LINE__, #condition); \
            ++failures;                                                     \
        }                                                                   \
    } while (0)

static int Observe(void* context, int which, const char* path, const char* old_path, int op) {
    (void)path;
    (void)old_path;
    *(int*)context += which == MAVO_INDEX_SEARCH ? op : 100 * op;
    return 0;
}

int main(void) {
    MLIBCErrSetEx(0xD00, "unit", 12);
    CHECK(MLIBCErrGet() == 0xD00 && MLIBCErrorGetLine() == 12);
    CHECK(strcmp(MLIBCErrorGetFile(), "unit") == 0);

    MLIBCSzList* list = MLIBCSzListAlloc(1);
    CHECK(list != NULL);
    CHECK(MLIBCSzListPush(&list, "a") == 0 && MLIBCSzListPush(&list, "b") == 0);
    CHECK(strcmp(MLIBCSzListGet(list, 1), "b") == 0 && MLIBCSzListGet(list, 2) == NULL);
    MLIBCSzListRemoveAll(list);
    CHECK(MLIBCSzListGet(list, 0) == NULL);
    MLIBCSzListFree(list);

    CHECK(MLIBCExec("/bin/sh", "-c", "exit 5", (char*)NULL) == 5);

    unsigned char info[128];
    CHECK(MLIBCFileStat("/", 3, info) == 0);

    CHECK(MAVOVolumeDeclare("/volume", MAVOVolumeTypeFromName("xattr")) == 0);
    CHECK(MAVOGetFSType("/volume/a", 1) == 7);
    MAVOVolumeEntry entry;
    CHECK(MAVOVolumeFind("/volume/a", &entry) == 1 && entry.type == 7);
    CHECK(entry.source == MAVO_VOLUME_DECLARED && entry.line == 0);
    int line = 0;
    const char* problem = NULL;
    CHECK(MAVOVolumeTableCheck(&line, NULL) == -1);
    CHECK(MAVOVolumeTableCheck(&line, &problem) != 1 || (line > 0 && problem != NULL));

    char name[16];
    CHECK(MAVOStrReplaceFATReservedChar("a?", name, (int)sizeof name) == 0);
    CHECK(strcmp(name, "a\xEF\x80\xA5") == 0);

    int sum = 0;
    MAVOIndexObserverSet(Observe, &sum);
    CHECK(MLIBMavoFileIndexAdd("/volume/a", NULL, 6) == 0);
    CHECK(MLIBMavoIndexAddEx("/volume/a", NULL, 7, 0, 0) == 0);
    MAVOIndexObserverSet(NULL, NULL);
    CHECK(sum == 607);

    CHECK(MAVOACLSetEADirACL("/proc") == 0);
    return failures == 0 ? 0 : 1;
}
