# Prints what zsh offers to complete, in angle brackets: zsh_complete.zsh FOLDER-OF-_arbory LINE. The
# shell that completes has a terminal of its own, as completion takes one.
zmodload zsh/zpty
zpty inner zsh -f -i
set_up() {
  zpty -w inner "$1"
  zpty -w inner "print SET''UP"
  local text
  zpty -r inner text '*SETUP*'
}
set_up "fpath=(${(q)1} \$fpath); autoload -U compinit; compinit -u -D"
# Matches are told where they are added.
set_up 'compadd() {
  local -a hits; builtin compadd -A hits "$@"; (( $#hits )) && print -rl -- "<"$^hits">"
  builtin compadd "$@" }'
set_up 'compfinish() { zle complete-word; print EN""D }; zle -N compfinish; bindkey "^I" compfinish'
zpty -w -n inner "$2"$'\t'
zpty -r inner text '*END*'
print -r -- $text
zpty -d inner
