#!/usr/bin/env bash
# Runs the fuzzers of a build for so many seconds in all. A finding ends the run with its input in BUILD/fuzz/findings.
#
# usage: fuzz/run.sh BUILD SECONDS
set -euo pipefail

if [[ $# -ne 2 ]]; then
  sed -n '2,4p' "$0" >&2
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

# The sequences of commands have most to find.
for target in command_fuzzer:5 soter_fuzzer:3 marshal_fuzzer:1 signature_fuzzer:1 key_data_fuzzer:1 tlv_fuzzer:1 \
  json_fuzzer:1 utf8_fuzzer:1 statement_fuzzer:1; do
  name=${target%:*}
  mkdir -p "$corpus/$name"
  # At least a second: to libFuzzer 0 means without end.
  budget=$((seconds * ${target#*:} / 15 + 1))
  printf '%s, %d s\n' "$name" "$budget"
  # libFuzzer talks a lot; only a finding is worth reading.
  log="$build/fuzz/$name.log"
  if ! "$build/fuzz/$name" -max_total_time="$budget" -max_len=4096 -timeout=60 -rss_limit_mb=2048 -print_final_stats=1 \
    -artifact_prefix="$findings/$name-" "$corpus/$name" "$corpus/seeds/$name" >"$log" 2>&1; then
    tail -n 80 "$log" >&2
    printf '%s has found something: the whole log is %s\n' "$name" "$log" >&2
    exit 1
  fi
  sed -n 's/^stat::/  /p' "$log"
done
