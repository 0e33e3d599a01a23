#!/bin/sh
# packages.sh PACKAGE...: installs, with apt, what is missing of these Debian packages. Installing
# needs root; with everything in place nothing is touched.
set -eu
missing=
for package in "$@"; do
    status=$(dpkg-query -W -f '${db:Status-Status}' "$package" 2>/dev/null || true)
    [ "$status" = installed ] || missing="$missing $package"
done
[ -n "$missing" ] || exit 0
export DEBIAN_FRONTEND=noninteractive
apt-get update -q
# shellcheck disable=SC2086: a list of words
apt-get install -q -y --no-install-recommends $missing
