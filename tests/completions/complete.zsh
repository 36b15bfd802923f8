# zsh -f complete.zsh FOLDER LINE: prints what zsh itself offers for LINE with the completions in FOLDER, one
# to a line. An interactive zsh runs in a pseudo terminal, is given the line and a tab, and has every match
# written to a file in place of being shown.
zmodload zsh/zpty
hits=$(mktemp)
zpty shell "zsh -f -i"
zpty -w shell "PS1=; unsetopt zle_bracketed_paste; fpath=(${(q)1} \$fpath); autoload -Uz compinit; compinit -u -D"
# The completion functions hand their matches to compadd; -O has the real one sort out which fit the line.
zpty -w shell "compadd() {
  if [[ \${@[1,(i)(-|--)]} == *-(O|A|D)\ * ]]; then builtin compadd \"\$@\"; return; fi
  local -a fitting; builtin compadd -O fitting \"\$@\"; print -rl -- \$fitting >>$hits; builtin compadd \"\$@\"
}"
zpty -w shell "bindkey '^I' complete-word; bindkey -r '^Xz'; done-with-it() { print end >>$hits.end }; zle -N done-with-it; bindkey '^Xz' done-with-it"
zpty -w shell "print ready >$hits.ready"
for wait in {1..3000}; do [[ -s $hits.ready ]] && break; sleep 0.02; done
zpty -w -n shell "$2"$'\t'$'\x18z'
for wait in {1..3000}; do [[ -s $hits.end ]] && break; sleep 0.02; done
sort -u $hits
zpty -d shell
rm -f $hits $hits.ready $hits.end
