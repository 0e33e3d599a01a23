#!/bin/sh
# packages.sh PACKAGE...: installs, with apt, what is missing of these Debian packages. Installing
# needs root; with everything in place nothing is touched. No service among them is started.
set -eu
missing=
for package in "$@"; do
    status=$(dpkg-query -W -f '${db:Status-Status}' "$package" 2>/dev/null || true)
    [ "$status" = installed ] || missing="$missing $package"
done
[ -n "$missing" ] || exit 0
export DEBIAN_FRONTEND=noninteractive
policy=/usr/sbin/policy-rc.d
if [ ! -e $policy ]; then
    trap 'rm -f $policy' EXIT
    trap 'exit 1' HUP INT TERM
    printf '#!/bin/sh\nexit 101\n' > $policy
    chmod 755 $policy
fi
apt-get update -q
# shellcheck disable=SC2086: a list of words
apt-get install -q -y --no-install-recommends $missing
