# zsh -f complete.zsh DIRECTORY LINE...: prints, in a line for each command line, what zsh completes at its
# end with the functions in DIRECTORY. Completion needs a terminal, so a second zsh runs on one.
zmodload zsh/zpty
export ZDOTDIR completions=${1:a}
shift
ZDOTDIR=$(mktemp -d) || exit
mkfifo $ZDOTDIR/answers
exec {answers}<>$ZDOTDIR/answers

cat >$ZDOTDIR/.zshrc <<'END'
fpath=($completions $fpath)
autoload -U compinit && compinit -D -u
compadd() {
  # With one of these options, it shows nothing.
  if [[ ${@[1,(i)(-|--)]} != *-[OAD]\ * ]]; then
    local -a hits
    builtin compadd -A hits "$@"
    found+=($hits)
  fi
  builtin compadd "$@"
}
answer() {
  found=()
  _main_complete
  compstate[insert]='' compstate[list]=''
  print -r -- ${(u)found} >$ZDOTDIR/answers
}
zle -C answer complete-word answer
bindkey '^I' answer
print ready >$ZDOTDIR/answers
END

zpty shell zsh -d -i
{
  read -r -t 20 -u $answers answer || exit
  for line in "$@"; do
    zpty -w -n shell "$line"$'\t'
    read -r -t 20 -u $answers answer || exit
    print -r -- $answer
    zpty -w -n shell $'\x15' # erases the line
  done
} always {
  zpty -d shell
  rm -r $ZDOTDIR
}
