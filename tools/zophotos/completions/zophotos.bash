# Completion of zophotos for bash.

_zophotos() {
  local current=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]}
  # bash makes three words of --color=auto.
  if [[ $current == '=' ]]; then
    current=''
  elif [[ $previous == '=' ]]; then
    previous=${COMP_WORDS[COMP_CWORD - 2]}
  fi
  local commands='status ls tree find failed check watch export help'
  local words='--database --json --escape --color --version --help -h'
  local command='' i
  for ((i = 1; i < COMP_CWORD; i++)); do
    case ${COMP_WORDS[i]} in
      --database | --color)
        ((++i))
        [[ ${COMP_WORDS[i]-} != '=' ]] || ((++i))
        ;;
      -*) ;;
      *)
        command=${COMP_WORDS[i]}
        break
        ;;
    esac
  done
  COMPREPLY=()
  case $previous in
    --database | --changes)
      compopt -o filenames 2>/dev/null || true # fails outside a completion
      mapfile -t COMPREPLY < <(compgen -f -- "$current")
      return
      ;;
    --type)
      mapfile -t COMPREPLY < <(compgen -W 'f d' -- "$current")
      return
      ;;
    --color)
      mapfile -t COMPREPLY < <(compgen -W 'auto always never' -- "$current")
      return
      ;;
    -L | --level) return ;;
  esac
  case $command in
    '') words+=" $commands" ;;
    status) words+=' --follow -f' ;;
    ls) words+=' --long -l -1' ;;
    tree) words+=' --level -L' ;;
    find) words+=' --ignore-case --null --type -i -0' ;;
    export) words+=' --csv --jsonl --changes --whole' ;;
    help)
      words=$commands
      # It has one argument.
      [[ $previous == help ]] || return 0
      ;;
  esac
  if [[ -z $command && $current != -* ]]; then
    words=$commands
  elif [[ $command != help && $current != -* ]]; then
    return
  fi
  mapfile -t COMPREPLY < <(compgen -W "$words" -- "$current")
}

complete -F _zophotos zophotos
