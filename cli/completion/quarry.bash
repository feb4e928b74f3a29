# Completion of quarry's commands, options, shares and words to search for bash.

# One name a line; names are kept from each other by two blanks, and may hold single ones.
_quarry_shares() {
  quarry share list 2>/dev/null | awk -F '   *' 'NR > 1 { print $1 }'
}

# Words of the indexes that begin so; none when no system runs.
_quarry_indexed() {
  case $1 in
    "" | -*) ;;
    *) quarry search --complete "$1" 2>/dev/null ;;
  esac
}

# What may stand at a place of the line, one candidate a line.
_quarry_words() {
  local command=$1 below=$2 previous=$3 current=$4
  case $command:$below:$previous in
    *:--only | *:--with | *:--without) printf '%s\n' document audio video photo ;;
    *:--sort) printf '%s\n' path name document audio video photo ;;
    *:--accounts) printf '%s\n' local domain ldap ;;
    search:*:--offset | search:*:--limit | search:*:--complete) ;;
    search:*) printf '%s\n' --offset --limit --complete --json; _quarry_indexed "$current" ;;
    suggest:*) printf '%s\n' --json; _quarry_shares ;;
    share:remove:remove | share:rename:rename | share:migrate:migrate | queue:show:show | \
      share:pause:pause | share:resume:resume | share:clear:clear) _quarry_shares ;;
    share:migrate:*) printf '%s\n' --copied --json ;;
    folder:add:* | folder:set:*) printf '%s\n' --name --only --with --without --json ;;
    folder:list:*) printf '%s\n' --offset --limit --sort --desc --status --json ;;
    home:*) printf '%s\n' --accounts --json ;;
    run:*) printf '%s\n' --full-speed ;;
    doctor:*) printf '%s\n' --check --json ;;
    completion:* | index:*) ;;
    *) printf '%s\n' --json ;;
  esac
}

_quarry_candidates() {
  local command=${COMP_WORDS[1]}
  case $COMP_CWORD:$command in
    1:*) printf '%s\n' run index share folder search status queue doctor pause resume volume home \
      user suggest completion --help --version ;;
    2:share) printf '%s\n' add list remove rename migrate pause resume clear ;;
    2:folder) printf '%s\n' add set list get reindex delete ;;
    2:queue) printf '%s\n' show ;;
    2:volume) printf '%s\n' pause resume clear ;;
    2:home) printf '%s\n' enable disable ;;
    2:user) printf '%s\n' rename ;;
    *) _quarry_words "$command" "${COMP_WORDS[2]}" "${COMP_WORDS[COMP_CWORD-1]}" "$1" ;;
  esac
}

# Candidates are compared as they stand: the words of "compgen -W" would be expanded, and a share
# may be called $(anything).
_quarry() {
  local current=${COMP_WORDS[COMP_CWORD]} candidate
  COMPREPLY=()
  while IFS= read -r candidate; do
    [[ $candidate == "$current"* ]] && COMPREPLY+=("$candidate")
  done < <(_quarry_candidates "$current")
  if [ ${#COMPREPLY[@]} -eq 0 ]; then
    mapfile -t COMPREPLY < <(compgen -d -- "$current")
  elif [ "${COMP_WORDS[1]}" = search ]; then
    # A word is no directory, even where one is called the same.
    compopt +o filenames 2>/dev/null || true
  fi
}
complete -o filenames -F _quarry quarry
