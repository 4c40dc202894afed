# bash completion of portctl: commands, ports of the running daemon, and what a command takes.

_portctl() {
  local cur prev words cword
  if declare -F _init_completion >/dev/null; then
    _init_completion -n : || return
  else
    words=("${COMP_WORDS[@]}")
    cword=$COMP_CWORD
    cur=${words[cword]}
    prev=${words[cword - 1]}
  fi

  case $prev in
    -a | --address | --timeout | --repeat | --title) return ;;
    --notes | --settings)
      mapfile -t COMPREPLY < <(compgen -f -- "$cur")
      return
      ;;
  esac

  # The command is the first word that is no option; what follows it counts up.
  local i command='' place=0
  for ((i = 1; i < cword; i++)); do
    case ${words[i]} in
      -a | --address | --timeout | --repeat | --title | --notes | --settings) ((i++)) ;;
      -*) ;;
      *) if [ -z "$command" ]; then command=${words[i]}; else ((place++)); fi ;;
    esac
  done

  local offers=''
  if [[ $cur == -* ]]; then
    offers='--help --json --address'
    case $command in
      name | active) offers+=' --input --output' ;;
      pulse) offers+=' --wait --virtual' ;;
      sequence) offers+=' --wait --virtual --repeat' ;;
      wait) offers+=' --timeout' ;;
      watch) offers+=' --title --notes' ;;
      check) offers+=' --settings --strict' ;;
    esac
  elif [ -z "$command" ]; then
    offers=$(portctl __words commands 2>/dev/null | cut -d: -f1)
  elif [ "$command" = check ]; then
    mapfile -t COMPREPLY < <(compgen -f -- "$cur")
    return
  else
    case $command:$place in
      get:* | drop:* | set:0 | toggle:0 | direction:0 | name:0 | active:0 | pulse:0 | sequence:0 | \
        virtual:0 | supervised:0 | wait:0)
        offers=$(portctl __words ports 2>/dev/null | cut -d: -f1)
        ;;
      set:1 | virtual:1) offers='active inactive' ;;
      direction:1) offers='input output' ;;
      active:1) offers='low high' ;;
      supervised:1) offers='on off readout ranges range' ;;
      supervised:2) offers='open closed short cut' ;;
      wait:1) offers='active inactive open closed short cut' ;;
    esac
  fi
  # Not compgen -W, which would expand what strangers named "$(...)".
  local offer
  COMPREPLY=()
  while read -r offer; do
    if [ -n "$offer" ] && [[ $offer == "$cur"* ]]; then
      COMPREPLY+=("$(printf '%q' "$offer")")
    fi
  done < <(tr ' ' '\n' <<<"$offers")
}

complete -F _portctl portctl
