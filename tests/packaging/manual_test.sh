#!/usr/bin/env bash
# Compares the documentation with what the programs say of themselves and with the paths in the
# sources, and checks the manual pages' form:
#   manual_test.sh PROGRAMS SOURCES    the folders of both
set -euo pipefail
programs=$1 sources=$2 pages=$2/docs/man
status=0

complain() {
  echo "FAILED: $*" >&2
  status=1
}

# The subcommands in the help of a command.
subcommands() {
  "$programs/quarry" "$@" --help | awk '/^$/ {on = 0} on && /^  [a-z]/ {print $1} /^Subcommands:/ {on = 1}'
}

# The long options in the help of a command.
options() {
  "$@" --help | grep -oE '^  (-h,)?--[a-z-]+' | grep -oE -- '--.*'
}

# All commands, one a line, as they are typed.
commands() {
  local name inner
  for name in $(subcommands); do
    inner=$(subcommands "$name")
    if [ -z "$inner" ]; then echo "$name"; else sed "s/^/$name /" <<<"$inner"; fi
  done
}

# The commands that a page describes, each as an item.
described() {
  sed -nE "s/^\.It Cm ([a-z]+( [a-z]+)?).*/\1/p" "$1"
}

same() {
  local what=$1 difference
  difference=$(diff <(sort -u <<<"$2") <(sort -u <<<"$3")) && return
  complain "$what, < in the help, > in the manual page:"$'\n'"$difference"
}

has_options() {
  local page=$1 option
  shift
  for option in $(options "$@"); do
    grep -qE "Fl -${option#--}( |\$)" "$page" || complain "$(basename "$page") lacks $option of $*"
  done
}

all=$(commands)
[ -n "$all" ] || complain "quarry --help names no command"
same "the commands of quarry" "$all" "$(described "$pages/quarry.1")"
has_options "$pages/quarry.1" "$programs/quarry"
while read -ra command; do
  has_options "$pages/quarry.1" "$programs/quarry" "${command[@]}"
done <<<"$all"
for daemon in tarnelasticd tarncontentextractd fileindexd tarnotifyd; do
  has_options "$pages/$daemon.8" "$programs/$daemon"
done

while read -r path; do
  grep -qF "$path" "$sources/docs/state-files.md" || complain "state-files.md lacks $path"
done < <(grep -rhoE --include='*.cpp' 'RootedPath\("/[^"]*[a-z]' \
  "$sources"/{common,comm,fileindex,platform,daemons,cli} | cut -d'"' -f2)

# Pages that are not installed here, other programs' as well as these, are not missing.
for page in "$pages"/*.[1-9]; do
  faults=$(mandoc -T lint -W style "$page" 2>&1 | grep -v -e 'referenced manual not found' -e 'mandoc\.db' || true)
  [ -z "$faults" ] || complain "$faults"
done
exit $status
