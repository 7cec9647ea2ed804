#!/bin/sh
# SPDX-License-Identifier: BSD-2-Clause
#
# The job of marlin as a POSIX shell script, written the way that an integrator
# would who has no such program: built-in commands where they do, the usual
# tools where not. It is there to be measured against; nothing ships it. What it
# leaves on the device is the same in every scene that is measured; its warnings
# are shorter.
set -u
LC_ALL=C
export LC_ALL

usage() {
  cat <<'EOF'
usage: lab/bench/boot.sh

Makes the time-zone links of this device consistent, as marlin does. For
measuring, in a private device only: scripts/private-device lab/bench/boot.sh
EOF
}

case ${1-} in
  '') ;;
  --help) usage; exit 0 ;;
  *) echo "boot.sh: takes no arguments; see --help" >&2; exit 2 ;;
esac

database=/var/db/timezone
downloads=$database/tz/
system_tree=/usr/share/zoneinfo.default
system_icu=/usr/share/icu

say() { echo "boot.sh: $*" >&2; }

# The first word of a file.
first_word() {
  word=
  [ -f "$1" ] || return 0
  while read -r word _ || [ -n "$word" ]; do
    [ -n "$word" ] && return 0
  done <"$1"
  word=
}

is_number() { case $1 in '' | *[!0-9]*) return 1 ;; esac; }

# Splits a version text such as 2024a.1.0; a malformed one is the oldest of all.
parse_version() {
  year=${1%%[!0-9]*}
  rest=${1#"$year"}
  letters=${rest%%[!a-z]*}
  rest=${rest#"$letters"}
  major=0 minor=0 given=$rest
  case $rest in
    '') ;;
    .*.*) major=${rest#.} minor=${rest#.*.} major=${major%%.*} ;;
    .*) major=${rest#.} ;;
    *) letters= ;;
  esac
  if [ -z "$year" ] || [ -z "$letters" ] ||
    ! is_number "$major" || ! is_number "$minor"; then
    say "Cannot parse version string $1"
    year=-1 letters='' given=''
  fi
  case $given in
    '') major=-1 minor=-1 ;;
    .*.*) ;;
    *) minor=-1 ;;
  esac
}

# Whether the first version text is strictly newer than the second.
newer() {
  parse_version "$1"
  left_year=$year left_letters=$letters left_major=$major left_minor=$minor
  parse_version "$2"
  [ "$left_year" -eq "$year" ] || { [ "$left_year" -gt "$year" ]; return; }
  [ "$left_letters" = "$letters" ] ||
    { expr "x$left_letters" '>' "x$letters" >/dev/null; return; }
  [ "$left_major" -eq "$major" ] || { [ "$left_major" -gt "$major" ]; return; }
  [ "$left_minor" -gt "$minor" ]
}

# The schema of a data set: from the format file of the system, or from the
# name of an update's first data file that everybody may read.
schema_of() {
  schema=
  if [ -z "$1" ]; then
    first_word "$system_icu/icutzformat.txt"
    schema=$word
    return
  fi
  for file in "$1"/icutz/icutz*[lbe].dat; do
    name=${file##*/icutz}
    name=${name%.dat}
    case ${name%?} in '' | *[!0-9]*) continue ;; esac
    if [ -L "$file" ] || [ ! -f "$file" ]; then continue; fi
    case $(ls -ld "$file") in ???????r*) schema=$name; return ;; esac
  done
  say "No ICU schema found for $1"
}

# The version text of a data set.
version_of() {
  if [ -z "$1" ]; then
    first_word "$system_tree/+VERSION"
    version=$word.1.0
  else
    version=${1#"$downloads"}
  fi
}

reset_to_system() {
  rm -f "$database/zoneinfo" "$database/icutz" /var/db/icutz
  ln -s "$system_tree" "$database/zoneinfo" || exit 1
}

activate() {
  rm -f "$database/zoneinfo" "$database/icutz" /var/db/icutz
  ln -s "$1/zoneinfo" "$database/zoneinfo" &&
    ln -s "$1/icutz" "$database/icutz"
}

# The data-set directory that the current links name, empty for the system.
current_dataset() {
  current=
  target=
  [ -L "$database/zoneinfo" ] && target=$(readlink "$database/zoneinfo")
  case $target in
    "$downloads"/*) ;;
    "$downloads"*/*) current=${target%/*}; return 0 ;;
    "$system_tree") return 0 ;;
  esac
  say "Bad zoneinfo link $target"
  return 1
}

select_dataset() {
  schema_of ''; system_schema=$schema
  version_of ''; system_version=$version
  latest=
  [ -L "$database/tz_latest" ] && latest=$(readlink "$database/tz_latest")
  if ! current_dataset; then
    say "Invalid current symlinks; resetting to system partition"
    reset_to_system
  fi

  schema_of "$current"
  version_of "$current"; current_version=$version
  active_version=$current_version
  if [ "$schema" != "$system_schema" ] ||
    newer "$system_version" "$current_version"; then
    say "Symlink points at data incompatible with installed system"
    reset_to_system
    active_version=$system_version
  fi

  [ -n "$latest" ] || return 0
  case $latest in
    "$downloads"?*) ;;
    *) say "bad path $latest"; return 1 ;;
  esac
  schema_of "$latest"
  version_of "$latest"
  if [ "$schema" = "$system_schema" ] && newer "$version" "$current_version"
  then
    version_of "$latest"
    activate "$latest" || return 1
    printf %s "${active_version}_$version" >"$database/TZVersionDiffRecord"
  else
    say "New update not compatible or older version:" \
      "$version vs. $current_version"
  fi
}

repair_localtime() {
  target=
  [ -L "$database/localtime" ] && target=$(readlink "$database/localtime")
  case $target in
    "$database/zoneinfo"*) return ;;
    /usr/share/zoneinfo*)
      target=$database/zoneinfo${target#/usr/share/zoneinfo}
      say "Correcting localtime link to $target"
      if [ -e "$target" ]; then
        ln -sfn "$target" "$database/localtime"
        return
      fi
      ;;
  esac
  say "localtime link invalid; resetting to America/Los_Angeles"
  rm -f "$database/localtime"
  ln -s "$database/zoneinfo/America/Los_Angeles" "$database/localtime"
}

if [ -e /var/db/icutz ]; then
  [ -e "$database/icutz" ] ||
    ln -s "$(readlink /var/db/icutz)" "$database/icutz"
  rm -f /var/db/icutz
fi
[ -e /var/db/icu ] && rm -f /var/db/icu
if ! select_dataset; then
  say "Unable to locate data; resetting to system partition"
  reset_to_system
fi
repair_localtime
exit 0
