/* The public header compiles by itself, and its types have the sizes that callers rely on. */

#include <stddef.h>

#include "include/mavoea.h"

_Static_assert(offsetof(EASHandle, entries) == 120, "the header image comes first");
_Static_assert(sizeof(((EASHandle*)0)->header) == 120, "as on disk");
_Static_assert(sizeof(((EAAdouble*)0)->data) == 1024, "a record's block");
_Static_assert(sizeof(((EAAdouble*)0)->entries) / sizeof(EAAdoubleEntry) == 20, "slots");

// Promise: "MAVOEASLockGet: <fcntl.h> has struct flock64"
// Promise: "MAVOEASLockGet: nothing else here needs that"
#include <fcntl.h>
struct flock64 {
    int ours; /* an error if <fcntl.h> has one */
};

typedef int not_empty; /* C wants something in a file */
