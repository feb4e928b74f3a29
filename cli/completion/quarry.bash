# Completion of quarry's commands, options and shares for bash.
_quarry() {
  local current=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD-1]}
  local command=${COMP_WORDS[1]} below=${COMP_WORDS[2]} words=""
  case $COMP_CWORD:$command in
    1:*) words="run share folder search status queue index completion --help --version" ;;
    2:share) words="add list" ;;
    2:folder) words="add set list get" ;;
    2:queue) words="show" ;;
    *:search) words="--offset --limit --json" ;;
    *:status) words="--json" ;;
    *)
      case $command:$below:$previous in
        *:--only | *:--with | *:--without) words="document audio video photo" ;;
        *:--sort) words="path name document audio video photo" ;;
        folder:add:* | folder:set:*) words="--name --only --with --without --json" ;;
        folder:list:*) words="--offset --limit --sort --desc --json" ;;
        queue:show:show)
          words=$(quarry share list 2>/dev/null | awk 'NR > 1 { print $1 }')
          ;;
        *) words="--json" ;;
      esac
      ;;
  esac
  mapfile -t COMPREPLY < <(compgen -W "$words" -- "$current")
  if [ ${#COMPREPLY[@]} -eq 0 ]; then
    mapfile -t COMPREPLY < <(compgen -d -- "$current")
  fi
}
complete -o filenames -F _quarry quarry
