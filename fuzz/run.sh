#!/usr/bin/env bash
# Runs the fuzzers of a build, two at a time: that of the wire for so many seconds, the others together for as long. A
# finding ends the run with its input in BUILD/fuzz/findings.
#
# usage: fuzz/run.sh BUILD SECONDS
set -euo pipefail

if [[ $# -ne 2 ]]; then
  sed -n '2,5p' "$0" >&2
  exit 2
fi
build=$1
seconds=$2

corpus="$build/fuzz/corpus"
findings="$build/fuzz/findings"
mkdir -p "$findings"
"$build/fuzz/make_corpus" "$corpus/seeds"

# The devices' folders are where a write costs nothing, if there is such a place.
if [[ -z ${TMPDIR:-} && -w /dev/shm ]]; then
  export TMPDIR=/dev/shm
fi

# fuzz NAME:SIXTEENTHS: runs one fuzzer for so many sixteenths of the seconds.
fuzz() {
  local name=${1%:*} log budget
  mkdir -p "$corpus/$name"
  # At least a second: to libFuzzer 0 means without end.
  budget=$((seconds * ${1#*:} / 16 + 1))
  # libFuzzer talks a lot; only a finding is worth reading.
  log="$build/fuzz/$name.log"
  if ! "$build/fuzz/$name" -max_total_time="$budget" -max_len=4096 -timeout=60 -rss_limit_mb=2048 -print_final_stats=1 \
    -artifact_prefix="$findings/$name-" "$corpus/$name" "$corpus/seeds/$name" >"$log" 2>&1; then
    tail -n 80 "$log" >&2
    printf '%s has found something: the whole log is %s\n' "$name" "$log" >&2
    return 255  # to xargs: start nothing more
  fi
  printf '%s, %d s\n%s\n' "$name" "$budget" "$(sed -n 's/^stat::/  /p' "$log")"
}

# The wire has as long as all else together, beside it; there the sequences of commands have most to find.
export -f fuzz
export build seconds corpus findings
printf '%s\n' frame_fuzzer:16 command_fuzzer:5 soter_fuzzer:3 marshal_fuzzer:1 signature_fuzzer:1 key_data_fuzzer:1 \
  tlv_fuzzer:1 json_fuzzer:1 utf8_fuzzer:1 statement_fuzzer:1 slot_fuzzer:1 |
  xargs -P 2 -I '{}' bash -c 'fuzz "$1"' fuzz '{}'
