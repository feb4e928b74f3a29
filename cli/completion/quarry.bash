# Completion of quarry's commands, options and shares for bash.
_quarry_shares() {
  quarry share list 2>/dev/null | awk 'NR > 1 { print $1 }'
}

_quarry_words() {
  local command=$1 below=$2 previous=$3
  case $command:$below:$previous in
    *:--only | *:--with | *:--without) echo document audio video photo ;;
    *:--sort) echo path name document audio video photo ;;
    *:--accounts) echo local domain ldap ;;
    search:*) echo --offset --limit --json ;;
    suggest:*) echo --json; _quarry_shares ;;
    share:remove:remove | share:rename:rename | share:migrate:migrate | queue:show:show | \
      share:pause:pause | share:resume:resume | share:clear:clear) _quarry_shares ;;
    share:migrate:*) echo --copied --json ;;
    folder:add:* | folder:set:*) echo --name --only --with --without --json ;;
    folder:list:*) echo --offset --limit --sort --desc --status --json ;;
    home:*) echo --accounts --json ;;
    doctor:*) echo --check --json ;;
    run:* | completion:* | index:*) ;;
    *) echo --json ;;
  esac
}

_quarry() {
  local current=${COMP_WORDS[COMP_CWORD]} command=${COMP_WORDS[1]} words=""
  case $COMP_CWORD:$command in
    1:*) words="run index share folder search status queue doctor pause resume volume home user suggest
                completion --help --version" ;;
    2:share) words="add list remove rename migrate pause resume clear" ;;
    2:folder) words="add set list get reindex delete" ;;
    2:queue) words="show" ;;
    2:volume) words="pause resume clear" ;;
    2:home) words="enable disable" ;;
    2:user) words="rename" ;;
    *) words=$(_quarry_words "$command" "${COMP_WORDS[2]}" "${COMP_WORDS[COMP_CWORD-1]}") ;;
  esac
  mapfile -t COMPREPLY < <(compgen -W "$words" -- "$current")
  if [ ${#COMPREPLY[@]} -eq 0 ]; then
    mapfile -t COMPREPLY < <(compgen -d -- "$current")
  fi
}
complete -o filenames -F _quarry quarry
