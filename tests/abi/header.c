/* The public header compiles by itself, and its types have the sizes that callers rely on. */

#include <stddef.h>

#include "include/mavoea.h"

_Static_assert(offsetof(EASHandle, entries) == 120, "the header image comes first");
_Static_assert(sizeof(((EASHandle*)0)->header) == 120, "as on disk");
_Static_assert(sizeof(((EAAdouble*)0)->data) == 1024, "a record's block");
_Static_assert(sizeof(((EAAdouble*)0)->entries) / sizeof(EAAdoubleEntry) == 20, "slots");

// Promise: "MAVOEA_VERSION_MAJOR: The version of this header"
_Static_assert(MAVOEA_VERSION_MAJOR == PROJECT_MAJOR, "the build's version");
_Static_assert(MAVOEA_VERSION_MINOR == PROJECT_MINOR, "the build's version");
_Static_assert(MAVOEA_VERSION_PATCH == PROJECT_PATCH, "the build's version");
// Promise: "MAVOEA_VERSION_MAJOR: Its major number is that of the soname"
_Static_assert(MAVOEA_VERSION_MAJOR == SONAME_MAJOR, "the library's file");
// Promise: "MAVOEA_VERSION: As one number to compare with: 50203 is 5.2.3"
_Static_assert(MAVOEA_VERSION / 10000 == MAVOEA_VERSION_MAJOR, "50203 is 5.");
_Static_assert(MAVOEA_VERSION / 100 % 100 == MAVOEA_VERSION_MINOR, "50203 is .2.");
_Static_assert(MAVOEA_VERSION % 100 == MAVOEA_VERSION_PATCH, "50203 is .3");

// Promise: "MAVOEASLockGet: <fcntl.h> has struct flock64"
// Promise: "MAVOEASLockGet: nothing else here needs that"
#include <fcntl.h>
struct flock64 {
    int ours; /* an error if <fcntl.h> has one */
};

typedef int not_empty; /* C wants something in a file */
