#!/bin/sh
# Runs every fuzz target over a fixed number of inputs, from the builders' seeds, two targets at a
# time: fuzz/run.sh [BUILD_DIR [RUNS_FACTOR]]. Prints what each one ran and reached. An input that
# breaks something is left in BUILD_DIR/fuzz-crashes/, and the result is then not 0.

set -eu

build=${1:-build/fuzz}
factor=${2:-1}

corpus=$build/fuzz-corpus
crashes=$build/fuzz-crashes
logs=$build/fuzz-logs

rm -rf "$corpus" "$crashes" "$logs"
mkdir -p "$corpus" "$crashes" "$logs"
"$build/bin/fuzz_corpus" "$corpus"

# Target, inputs, longest input in bytes: file sequences first, parsers behind them.
targets='
stream_fuzz 20000 8192
upgrade_fuzz 20000 4096
record_fuzz 100000 1200
import_fuzz 100000 4096
resource_copy_fuzz 100000 4096
afp_info_fuzz 100000 128
dos_attributes_fuzz 100000 128
finder_info_fuzz 100000 64
samba_stream_fuzz 100000 512
foreign_object_fuzz 100000 1500
mac_info_fuzz 100000 512
attribute_text_fuzz 100000 512
apple_single_fuzz 100000 512
mac_binary_fuzz 100000 512
bin_hex_fuzz 20000 1024
'

# run NAME INPUTS LONGEST
run() {
    mkdir -p "$corpus/$1" "$crashes/$1"
    begun=$(date +%s.%N)
    status=0
    # A limit on all memory would be a thread's work, whose own allocations would count as a leak.
    "$build/bin/$1" -runs=$(($2 * factor)) -max_len="$3" -seed=1 -timeout=10 \
        -rss_limit_mb=0 -malloc_limit_mb=2048 \
        -print_final_stats=1 -artifact_prefix="$crashes/$1/" "$corpus/$1" \
        >"$logs/$1" 2>&1 || status=$?
    ended=$(date +%s.%N)
    inputs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$logs/$1")
    covered=$(sed -n 's/.* cov: \([0-9]*\) ft: \([0-9]*\) .*/\1 branches, \2 features/p' "$logs/$1" |
        tail -n 1)
    echo "$begun $ended" | awk -v name="$1" -v inputs="${inputs:-?}" -v covered="${covered:-?}" \
        '{ printf "%-20s %8s inputs  %6.1f s  %s\n", name, inputs, $2 - $1, covered }'
    if [ "$status" -ne 0 ]; then
        echo "$1 failed ($status), its log ends:"
        tail -n 40 "$logs/$1"
        touch "$logs/failed"
    fi
}

# lane FIRST: every second target from the FIRST on.
lane() {
    echo "$targets" | sed '/^$/d' | sed -n "$1~2p" | while read -r name inputs longest; do
        run "$name" "$inputs" "$longest"
    done
}

lane 1 &
lane 2
wait

test ! -e "$logs/failed"
