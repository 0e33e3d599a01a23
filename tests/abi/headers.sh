#!/bin/sh
# headers.sh SOURCE COMPILER...: the public headers of the source tree, each one alone, twice, and all
# of them together in two orders, pass without a warning in every standard of C and C++ that the
# compilers know, strict and with GNU extensions, and do not ask the C library for more than was
# asked for.
set -eu
source=$1
shift

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
status=0

# unit NAME HEADER...: a source file that includes the headers.
unit() {
    name=$1
    shift
    {
        printf '#ifdef _GNU_SOURCE\n#define ASKED_FOR\n#endif\n'
        for header in "$@"; do
            echo "#include <$header>"
        done
        printf '#if defined(_GNU_SOURCE) && !defined(ASKED_FOR)\n#error "asks for _GNU_SOURCE"\n#endif\n'
        echo "int not_empty;"
    } > "$work/$name.c"
}
for header in mavoea.h mavocore.h mavoacl.h; do
    unit "$header" "$header" "$header"
done
unit together mavoea.h mavocore.h mavoacl.h
unit turned mavoacl.h mavocore.h mavoea.h

# passes COMPILER LANGUAGE STANDARD OPTION...: on all units at once.
passes() {
    compiler=$1
    language=$2
    standard=$3
    shift 3
    "$compiler" -x "$language" "-std=$standard" -Wall -Wextra -pedantic -Werror -Wundef "$@" \
        -I "$source/include" -I "$source/platform/include" -fsyntax-only "$work"/*.c || {
        echo "$compiler -std=$standard does not take the headers" >&2
        status=1
    }
}
for compiler in "$@"; do
    for standard in c99 c11 c17 c2x gnu99 gnu11 gnu17 gnu2x; do
        passes "$compiler" c $standard -Wstrict-prototypes
    done
    for standard in c++11 c++14 c++17 c++20 c++2b gnu++11 gnu++14 gnu++17 gnu++20 gnu++2b; do
        passes "$compiler" c++ $standard
    done
done
exit $status
