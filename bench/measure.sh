#!/usr/bin/env bash
# SPDX-License-Identifier: BSD-2-Clause
set -euo pipefail

usage() {
  cat <<'EOF'
usage: bench/measure.sh counts DIRECTORY PROGRAM...
       bench/measure.sh wall DIRECTORY ROUNDS PROGRAM...
       bench/measure.sh growth DIRECTORY POPULATE PROGRAM

The part of scripts/bench that runs inside the private device. A PROGRAM is a
file, in which "SCENE" stands for the scene's name; the first one is the floor.
Results are left in DIRECTORY as lines of fields with tabs between them:

  counts.tsv   scene, program's index, instructions, system calls, peak kB
  wall.tsv     scene, program's index, median us, ratio to the floor: median,
               lowest and highest of the rounds
  growth.tsv   series, size, instructions, system calls, peak kB

peak must lie in DIRECTORY.
EOF
}

die() {
  echo "measure: $*" >&2
  exit 1
}

case ${1-} in
  --help) usage; exit 0 ;;
  counts | wall | growth) ;;
  *) echo "measure: unknown job ${1-}; see --help" >&2; exit 2 ;;
esac
if (($# < 4)); then
  echo "measure: too few arguments; see --help" >&2
  exit 2
fi
[[ ${MARLIN_PRIVATE_DEVICE-} == 1 ]] ||
  die "this is no private device; see scripts/private-device"

job=$1
results=$2
shift 2
db=/var/db/timezone
tree=/usr/share/zoneinfo.default
scenes=(quiet update activation reset localtime)

# What the programs get: nothing, but for the script's sake a path to its tools.
# A variable more is some 550 instructions more in the C library's start-up.
boot_environment=(PATH=/usr/bin)

# --- The device -----------------------------------------------------------

install_update() {
  mkdir -p "$db/tz/$1/zoneinfo/America" "$db/tz/$1/icutz"
  echo "${1%%.*}" >"$db/tz/$1/zoneinfo/+VERSION"
  : >"$db/tz/$1/zoneinfo/America/Los_Angeles"
  : >"$db/tz/$1/icutz/icutz44l.dat"
}

install_device() {
  mkdir -p "$db/tz" "$tree/America" /usr/share/icu
  echo 2023c >"$tree/+VERSION"
  echo 44l >/usr/share/icu/icutzformat.txt
  : >"$tree/America/Los_Angeles"
  install_update 2024a.1.0
  install_update 2022a.1.0
}

# A script that brings the links back to where a scene begins. It runs before
# every run, so it is small.
restore=/tmp/restore
prepare_scene() {
  local zoneinfo=$tree icutz='' latest='' localtime=$db/zoneinfo/Europe/Paris
  case $1 in
    quiet) ;;
    update) zoneinfo=$db/tz/2024a.1.0/zoneinfo icutz=$db/tz/2024a.1.0/icutz ;;
    activation) latest=$db/tz/2024a.1.0 ;;
    reset) zoneinfo=$db/tz/2022a.1.0/zoneinfo icutz=$db/tz/2022a.1.0/icutz ;;
    localtime) localtime=/nowhere ;;
  esac
  {
    echo '#!/bin/sh'
    echo "cd $db"
    echo 'rm -f zoneinfo icutz localtime tz_latest TZVersionDiffRecord'
    echo "ln -s $zoneinfo zoneinfo"
    echo "ln -s $localtime localtime"
    [[ -z $icutz ]] || echo "ln -s $icutz icutz"
    [[ -z $latest ]] || echo "ln -s $latest tz_latest"
  } >"$restore"
  chmod +x "$restore"
}

changes_the_device() { [[ $1 != quiet && $1 != update ]]; }

show_device() {
  find /var/db -printf '%P %y %l\n' | sort
  cat "$db/TZVersionDiffRecord" 2>/dev/null || true
}

# --- The programs ---------------------------------------------------------

# The same program in the same place, by a path of the same length, is the same
# number of instructions; so each is copied to a path of its own.
declare -a commands=()
place_programs() {
  local scene=$1 index=0 program
  shift
  commands=()
  for program in "$@"; do
    mkdir -p "/tmp/$index"
    cp "${program/SCENE/$scene}" "/tmp/$index/program"
    chmod +x "/tmp/$index/program"
    commands+=("/tmp/$index/program")
    index=$((index + 1))
  done
}

plain_run() { env -i "${boot_environment[@]}" "$1" 2>/dev/null; }

instructions_once() {
  "$restore"
  rm -f /tmp/callgrind.*
  env -i "${boot_environment[@]}" valgrind -q --tool=callgrind \
    --trace-children=yes --callgrind-out-file=/tmp/callgrind.%p \
    --log-file=/tmp/valgrind.log "$1" >/dev/null 2>&1 ||
    die "$1 failed under valgrind"
  awk '/^(totals|summary):/ && !seen[FILENAME]++ { sum += $2 }
       END { printf "%.0f\n", sum }' /tmp/callgrind.*
}

# A count that differs from run to run is of no use.
instructions() {
  local first second
  first=$(instructions_once "$1")
  second=$(instructions_once "$1")
  ((first == second)) || [[ $1 == */program && $(head -c 2 "$1") == '#!' ]] ||
    die "$1 took $first instructions and then $second"
  echo "$first"
}

system_calls() {
  "$restore"
  env -i "${boot_environment[@]}" strace -f -qq -o /tmp/calls "$1" \
    >/dev/null 2>&1 || die "$1 failed under strace"
  grep -cE '^[0-9]+ +[a-z_0-9]+\(' /tmp/calls
}

peak_memory() {
  "$restore"
  env -i "${boot_environment[@]}" "$results/peak" "$1"
}

# All programs must leave the same device behind, or their costs say nothing.
check_outcomes() {
  local scene=$1 command expected='' outcome
  for command in "${commands[@]}"; do
    "$restore"
    plain_run "$command" || die "$command failed in the scene $scene"
    outcome=$(show_device)
    [[ -n $expected ]] || expected=$outcome
    [[ $outcome == "$expected" ]] || {
      diff <(echo "$expected") <(echo "$outcome") >&2 || true
      die "$command leaves another device than the floor in the scene $scene"
    }
  done
}

# --- The jobs -------------------------------------------------------------

counts() {
  local scene index command
  : >"$results/counts.tsv"
  for scene in "${scenes[@]}"; do
    prepare_scene "$scene"
    place_programs "$scene" "$@"
    check_outcomes "$scene"
    for index in "${!commands[@]}"; do
      command=${commands[index]}
      printf '%s\t%s\t%s\t%s\t%s\n' "$scene" "$index" \
        "$(instructions "$command")" "$(system_calls "$command")" \
        "$(peak_memory "$command")" >>"$results/counts.tsv"
    done
  done
}

# Each round times the floor and the program one right after the other, in
# turns the one and the other first; a ratio is of one round.
wall() {
  local rounds=$1 scene index round
  shift
  : >"$results/wall.tsv"
  for scene in "${scenes[@]}"; do
    prepare_scene "$scene"
    place_programs "$scene" "$@"
    for index in "${!commands[@]}"; do
      : >/tmp/pairs
      for ((round = 0; round < rounds; round++)); do
        time_pair "$scene" "${commands[0]}" "${commands[index]}" "$round"
      done
      sort -g /tmp/pairs >/tmp/by_ratio
      cut -f 2 /tmp/pairs | sort -g >/tmp/times
      printf '%s\t%s\t%s\t%s\t%s\t%s\n' "$scene" "$index" \
        "$(sed -n "$((rounds / 2 + 1))p" /tmp/times)" \
        "$(sed -n "$((rounds / 2 + 1))p" /tmp/by_ratio | cut -f 1)" \
        "$(head -n 1 /tmp/by_ratio | cut -f 1)" \
        "$(tail -n 1 /tmp/by_ratio | cut -f 1)" >>"$results/wall.tsv"
    done
  done
}

time_pair() {
  local scene=$1 first=$2 second=$3 prepare=()
  changes_the_device "$scene" && prepare=(--prepare "$restore")
  (($4 % 2)) && first=$3 second=$2
  env -i "${boot_environment[@]}" hyperfine -N --style none --warmup 2 \
    --runs 20 "${prepare[@]}" --export-csv /tmp/pair.csv \
    "$first" "$second" >/dev/null 2>&1 || die "hyperfine failed"
  # command,mean,stddev,median,...: one line a command, in the order given.
  awk -F , -v turned="$(($4 % 2))" '
    NR > 1 { median[NR - 2] = $4 }
    END {
      floor = median[turned]; program = median[1 - turned]
      printf "%.3f\t%.0f\n", program / floor, program * 1e6
    }' /tmp/pair.csv >>/tmp/pairs
}

measure_point() {
  printf '%s\t%s\t%s\t%s\t%s\n' "$1" "$2" \
    "$(instructions_once "${commands[0]}")" "$(system_calls "${commands[0]}")" \
    "$(peak_memory "${commands[0]}")" >>"$results/growth.tsv"
}

# Whether the file system lists the file first that was made first.
lists_oldest_first() {
  mkdir -p "$db/order"
  : >"$db/order/a"
  : >"$db/order/b"
  local listed
  # shellcheck disable=SC2012 # the order of the directory is what is asked
  listed=$(ls -U "$db/order" | head -n 1)
  rm -r "$db/order"
  [[ $listed == a ]]
}

fill_icu_directory() {
  local match=$1 others=$2 populate=$3 icu=$db/tz/2024a.1.0/icutz
  local before=last after=first
  if lists_oldest_first; then before=first after=last; fi
  rm -rf "$icu"
  mkdir "$icu"
  [[ $match != "$before" ]] || : >"$icu/icutz44l.dat"
  "$populate" "$icu" "$others"
  [[ $match != "$after" ]] || : >"$icu/icutz44l.dat"
}

fill_with_a_tree() {
  local directories=$1 icu=$db/tz/2024a.1.0/icutz level
  rm -rf "$icu"
  mkdir "$icu"
  : >"$icu/icutz44l.dat"
  # Chains of a hundred, one in the other.
  level=$(printf 'd/%.0s' {1..100})
  local chain
  for ((chain = 0; chain < directories / 100; chain++)); do
    echo "$icu/chain.$chain/$level"
  done | xargs -r mkdir -p
}

# A text of that many bytes that is a version, letters nearly all of it.
make_version() {
  printf 2024
  head -c "$(($1 - 4))" /dev/zero | tr '\0' a
}

growth() {
  local populate=$1 size match
  shift
  : >"$results/growth.tsv"
  place_programs update "$1"
  prepare_scene update
  for size in 10 250000 500000 750000 1000000; do
    for match in first last absent; do
      fill_icu_directory "$match" "$((size - 1))" "$populate"
      measure_point "icu-$match" "$size"
    done
  done
  for size in 100 25000 50000 75000 100000; do
    fill_with_a_tree "$size"
    measure_point icu-tree "$size"
  done
  prepare_scene quiet
  for size in 10 16777216 33554432 50331648 67108864; do
    make_version "$size" >"$tree/+VERSION"
    measure_point version "$size"
  done
}

install_device
case $job in
  counts) counts "$@" ;;
  wall) wall "$@" ;;
  growth) growth "$@" ;;
esac
