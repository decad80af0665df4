# Completion of kovabackup for bash.

_kovabackup_words() {
  COMPREPLY+=($(compgen -W "$1" -- "$cur"))
}

# Paths, with a slash after folders.
_kovabackup_files() {
  local IFS=$'\n'
  compopt -o filenames 2>/dev/null
  COMPREPLY+=($(compgen -f -- "$cur"))
}

# The sections of the file that has been typed as the first argument of the verb.
_kovabackup_sections() {
  local IFS=$'\n'
  COMPREPLY+=($(compgen -W "$(kovabackup option sections "${arguments[0]}" 2>/dev/null)" -- "$cur"))
}

_kovabackup_names() {
  local IFS=$'\n'
  local names=$(kovabackup option list "${arguments[0]}" "${arguments[1]}" 2>/dev/null |
    sed 's/=.*//')
  COMPREPLY+=($(compgen -W "$names" -- "$cur"))
}

_kovabackup_ids() {
  _kovabackup_words "$(kovabackup session list 2>/dev/null | cut -f1)"
}

_kovabackup_tokens() {
  _kovabackup_words "$(ls /tmp/kovabackup/lock 2>/dev/null)"
}

# The value of the option before the cursor. Fails when that option takes none.
_kovabackup_value() {
  case "$family $verb $prev" in
  'session create --volume') _kovabackup_words 'max max-ext max-ext-btrfs same:' ;;
  'session prune --older-than' | 'doctor  --older-than') _kovabackup_words '1d 7d 30d' ;;
  'option set --type') _kovabackup_words 'string int bool list' ;;
  'option set --lock' | 'option unset --lock') _kovabackup_tokens ;;
  'filter test --patterns' | 'template fill --json') _kovabackup_files ;;
  'run  --stdout' | 'run  --stderr') _kovabackup_files ;;
  'filter test --include' | 'filter test --exclude' | 'template fill --set') ;;
  'net probe --timeout' | 'run  --env') ;;
  *) return 1 ;;
  esac
}

_kovabackup_argument() {
  case "$family $verb ${#arguments[@]}" in
  'session show 0' | 'session path 0' | 'session destroy '*) _kovabackup_ids ;;
  'option '*' 0' | 'template fill 0') _kovabackup_files ;;
  'option '*' 1') _kovabackup_sections ;;
  'option get 2' | 'option set 2' | 'option unset 2') _kovabackup_names ;;
  'volume pick 0') _kovabackup_words 'max max-ext max-ext-btrfs same:' ;;
  'lock show 0') _kovabackup_tokens ;;
  'run  0') COMPREPLY+=($(compgen -c -- "$cur")) ;;
  'run '*) _kovabackup_files ;;
  esac
}

_kovabackup_options() {
  local common='-h --help --json --no-color'
  case "$family $verb" in
  ' ') _kovabackup_words "$common --version" ;;
  'session list' | 'session show' | 'session path' | 'volume list' | 'lock show') _kovabackup_words "$common -0 --null" ;;
  'session create') _kovabackup_words "$common --volume" ;;
  'session prune') _kovabackup_words "$common --older-than --dry-run --yes -0 --null" ;;
  'option sections' | 'option list') _kovabackup_words "$common -0 --null" ;;
  'option get') _kovabackup_words "$common --reveal -0 --null" ;;
  'option set') _kovabackup_words "$common --type --secret --lock" ;;
  'option unset') _kovabackup_words "$common --lock" ;;
  'filter test') _kovabackup_words "$common --include --exclude --patterns --explain -0 --null" ;;
  'volume pick') _kovabackup_words "$common --fallback-tmp -0 --null" ;;
  'net probe') _kovabackup_words "$common --timeout" ;;
  'template fill') _kovabackup_words "-h --help --no-color --set --json --strict" ;;
  'run ') _kovabackup_words "$common --background --new-session --stdout --stderr --env" ;;
  'doctor ') _kovabackup_words "$common --older-than -0 --null" ;;
  *) _kovabackup_words "$common" ;;
  esac
}

_kovabackup() {
  local cur=${COMP_WORDS[COMP_CWORD]} prev=${COMP_WORDS[COMP_CWORD - 1]}
  local family='' verb='' word i dashes=''
  local -a arguments=()
  local -A verbs=(
    [session]='list show path create destroy prune'
    [option]='sections list get set unset'
    [filter]='test'
    [volume]='list pick'
    [net]='probe'
    [template]='fill'
    [lock]='show'
  )
  COMPREPLY=()
  for ((i = 1; i < COMP_CWORD; i++)); do
    word=${COMP_WORDS[i]}
    if [[ $word == -- ]]; then
      dashes=yes
    elif [[ $word == -* && -z $dashes ]]; then
      continue
    elif [[ -z $family ]]; then
      family=$word
    elif [[ -z $verb && -n ${verbs[$family]} ]]; then
      verb=$word
    else
      arguments+=("$word")
    fi
  done
  if [[ -z $dashes && $cur == -* ]]; then
    _kovabackup_options
  elif [[ -z $family ]]; then
    _kovabackup_words "${!verbs[*]} run doctor"
  elif [[ -z $verb && -n ${verbs[$family]} ]]; then
    _kovabackup_words "${verbs[$family]}"
  elif [[ -n $dashes ]] || ! _kovabackup_value; then
    _kovabackup_argument
  fi
}

complete -F _kovabackup kovabackup
