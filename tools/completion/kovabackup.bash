# Completion of kovabackup for bash. The command itself knows what can follow.

_kovabackup() {
  local word line kind join='' words=() lines=()
  # Readline splits words at = and :, which are parts of ours: --lock=tasks is three of its words.
  for word in "${COMP_WORDS[@]:1:COMP_CWORD}"; do
    if [[ ($join || $word == [=:]*) && ${#words[@]} -gt 0 ]]; then
      words[-1]+=$word
    else
      words+=("$word")
    fi
    [[ $word == *[=:] ]] && join=yes || join=''
  done
  COMPREPLY=()
  { read -r kind && mapfile -t lines; } < <(kovabackup __complete -- "${words[@]}" 2>/dev/null)
  if [[ $kind == "command $((${#words[@]} - 1))" ]]; then # the first word of another command
    mapfile -t COMPREPLY < <(compgen -c -- "$2")
  elif [[ $kind == files* || $kind == command* ]]; then # what Readline takes for the word
    compopt -o filenames 2>/dev/null # a slash after directories, quotes where needed
    mapfile -t COMPREPLY < <(compgen -f -- "$2")
  else
    for line in "${lines[@]}"; do
      word=${line%%$'\t'*}
      [[ $word == "${words[-1]}"* ]] || continue
      word=${word#"${words[-1]%"$2"}"} # what Readline takes for the word being typed
      [[ -z $word ]] || COMPREPLY+=("$(printf %q "$word")")
    done
  fi
}

complete -F _kovabackup kovabackup
