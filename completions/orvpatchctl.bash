# Completion of orvpatchctl for bash. Made by "orvpatchctl completion bash".

_orvpatchctl_offer() {
  compopt -o filenames 2>/dev/null
  mapfile -t COMPREPLY < <(compgen "$1" -- "$2")
}

_orvpatchctl() {
  local word=$2 previous=$3 command='' options='' count=0 place
  local -a kinds=()
  COMPREPLY=()
  # The value of an option.
  case $previous in
    --output)
      _orvpatchctl_offer -d "$word"
      return
      ;;
    --keyring | --installer)
      _orvpatchctl_offer -f "$word"
      return
      ;;
    --color)
      mapfile -t COMPREPLY < <(compgen -W 'auto always never' -- "$word")
      return
      ;;
    --product | --level | --name | --description | --platform | --target | --fixpack | --sign | --explain | --since | --transaction | --path | --keep)
      :
      return
      ;;
  esac
  # The command, and the number of its arguments before the cursor.
  for ((place = 1; place < COMP_CWORD; place++)); do
    case ${COMP_WORDS[place]} in
      --output | --keyring | --installer | --color | --product | --level | --name | --description | --platform | --target | --fixpack | --sign | --explain | --since | --transaction | --path | --keep) ((place++)) ;;
      -*) ;;
      *) if [[ -z $command ]]; then command=${COMP_WORDS[place]}; else ((count++)); fi ;;
    esac
  done
  case $command in
    '')
      options='--help --version'
      ;;
    new)
      options='--help --json --color --product --level --name --description'
      kinds=(d)
      ;;
    build)
      options='--help --json --color --output --platform --target --fixpack --sign'
      kinds=(d)
      ;;
    lint)
      options='--help --json --color --explain --strict'
      kinds=(f)
      ((count < 1)) || count=0
      ;;
    show)
      options='--help --json --color'
      kinds=(f)
      ;;
    status)
      options='--help --json --color'
      kinds=(d)
      ;;
    history)
      options='--help --json --color --product --failed --since'
      kinds=(d)
      ;;
    verify)
      options='--help --json --color --transaction'
      kinds=(d f)
      ;;
    log)
      options='--help --json --color --errors --steps --follow'
      kinds=(d -)
      ;;
    check)
      options='--help --json --color --no-report --keyring --installer --path'
      kinds=(d f)
      ;;
    apply)
      options='--help --json --color --yes --dry-run --undo-on-failure --keep --keyring --installer --path'
      kinds=(d f)
      ;;
    undo)
      options='--help --json --color'
      kinds=(d -)
      ;;
    recover)
      options='--help --json --color --fix'
      kinds=(d)
      ;;
  esac
  if [[ $word == -* ]]; then
    mapfile -t COMPREPLY < <(compgen -W "$options" -- "$word")
  elif [[ -z $command ]]; then
    mapfile -t COMPREPLY < <(compgen -W 'new build lint show status history verify log check apply undo recover' -- "$word")
  elif [[ ${kinds[count]:--} != - ]]; then
    _orvpatchctl_offer "-${kinds[count]}" "$word"
  fi
}

complete -F _orvpatchctl orvpatchctl
