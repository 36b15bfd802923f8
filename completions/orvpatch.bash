# Completion of orvpatch for bash: the options that are still missing, then what fits the option before.

# Offers the directories that begin with the word, and the files of these that match one of the patterns.
# Readline marks a directory by itself and lets the user go on in it. A word that begins with the home as ~ is
# completed with it; $HOME is replaced by its value, since readline would quote the dollar.
_orvpatch_paths() {
  local word=$1 typed='' path pattern
  shift
  case $word in
    \~/*) typed="~" word=$HOME${word:1} ;;
    "\$HOME/"*) word=$HOME${word:5} ;;
    "\${HOME}/"*) word=$HOME${word:7} ;;
  esac
  compopt -o filenames 2>/dev/null
  while IFS= read -r path; do
    if [[ -d $path ]]; then
      COMPREPLY+=("$typed${path#"${typed:+$HOME}"}")
      continue
    fi
    for pattern in "$@"; do
      # shellcheck disable=SC2053 # matched as a pattern on purpose
      [[ ${path##*/} == $pattern ]] && COMPREPLY+=("$typed${path#"${typed:+$HOME}"}")
    done
  done < <(compgen -f -- "$word")
}

# The options that the pairs before the cursor leave open: one home and one action. A value that looks like
# an option is taken for what it is.
_orvpatch_options() {
  local home=-h actions='-i -t -vi' place
  for ((place = 1; place < COMP_CWORD; place += 2)); do
    case ${COMP_WORDS[place]} in
      -h) home= ;;
      -i | -t | -vi) actions= ;;
    esac
  done
  mapfile -t COMPREPLY < <(compgen -W "$home $actions" -- "$1")
}

_orvpatch() {
  local word=$2 previous=$3
  COMPREPLY=()
  if ((COMP_CWORD % 2 == 1)); then
    _orvpatch_options "$word"
    return
  fi
  case $previous in
    -h) _orvpatch_paths "$word" ;;
    -i | -t) _orvpatch_paths "$word" '*_*_vem[as]_*.*' '*_*_vep[sd]_*.*' '*_*_vecm_*.*' ;;
    -vi) _orvpatch_paths "$word" '*.ini' ;;
  esac
}

complete -F _orvpatch orvpatch
