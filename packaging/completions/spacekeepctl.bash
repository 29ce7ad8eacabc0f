# Completion of spacekeepctl for bash. Needs nothing but bash itself.

# The lines on standard input that begin with $1, quoted for the command line.
_spacekeepctl_matches() {
  local line typed=${1//\\/}
  COMPREPLY=()
  while IFS= read -r line; do
    [[ $line == "$typed"* ]] && COMPREPLY+=("$(printf '%q' "$line")")
  done
  return 0
}

# The options of the command in $1; those of the tool itself may stand anywhere.
_spacekeepctl_options() {
  case $1 in
    status) printf '%s\n' --volume ;;
    history) printf '%s\n' --volume --since --limit ;;
    report) printf '%s\n' --html --volume --since ;;
    doctor) printf '%s\n' --root ;;
    purge) printf '%s\n' --urgency --timeout --token --wait-all ;;
    query) printf '%s\n' --itemized --urgency ;;
    'state set') printf '%s\n' --type --force ;;
    check-service)
      printf '%s\n' --volume --endpoint --data --in-use --item --patience --yes --no-purge
      ;;
    'state list' | volumes) printf '%s\n' --names ;;
    '') printf '%s\n' --version ;;
  esac
  printf '%s\n' --json --socket --help
}

# Values of the option in $1, answers whether it takes one.
_spacekeepctl_option_value() {
  case $1 in
    --urgency) _spacekeepctl_matches "$2" <<<$'1\n2\n3\n4' ;;
    --type) _spacekeepctl_matches "$2" <<<$'string\nnumber\nbool\nsize\njson' ;;
    --socket | --endpoint | --data | --in-use | --root | --html)
      compopt -o filenames 2>/dev/null
      mapfile -t COMPREPLY < <(compgen -f -- "$2")
      ;;
    --volume)
      _spacekeepctl_matches "$2" < <("$tool" volumes --names 2>/dev/null)
      ;;
    --timeout | --token | --patience | --item | --since | --limit) COMPREPLY=() ;;
    *) return 1 ;;
  esac
}

_spacekeepctl_state_value() {
  case $1 in
    SPACEKEEP_CACHE_ENABLED | SPACEKEEP_FINISH_EARLY) printf '%s\n' true false ;;
  esac
}

_spacekeepctl() {
  local tool=$1 current=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]} i
  local -a words=() socket=()
  COMPREPLY=()
  # bash splits --option=value into three words.
  [[ $current == = ]] && current=''
  [[ $previous == = ]] && previous=${COMP_WORDS[COMP_CWORD - 2]}
  _spacekeepctl_option_value "$previous" "$current" && return
  for ((i = 1; i < COMP_CWORD; i++)); do
    case ${COMP_WORDS[i]} in
      --)
        # What follows is the service's own command line.
        [[ ${words[0]} == check-service ]] || continue
        ((COMP_CWORD == i + 1)) && mapfile -t COMPREPLY < <(compgen -c -f -- "$current")
        compopt -o default 2>/dev/null
        return
        ;;
      --socket | --urgency | --timeout | --token | --type | --volume | --endpoint | --data | \
        --in-use | --item | --patience | --root | --html | --since | --limit)
        local option=${COMP_WORDS[i]}
        [[ ${COMP_WORDS[i + 1]} == = ]] && ((i++))
        ((i++))
        [[ $option == --socket ]] && socket=(--socket "${COMP_WORDS[i]}")
        ;;
      -*) ;;
      *) words+=("${COMP_WORDS[i]}") ;;
    esac
  done
  local command=${words[0]}
  [[ $command == state && ${#words[@]} -gt 1 ]] && command="state ${words[1]}"
  if [[ $current == -* ]]; then
    _spacekeepctl_matches "$current" < <(_spacekeepctl_options "$command")
    return
  fi
  case "${#words[@]} $command" in
    '0 ') _spacekeepctl_matches "$current" <<<$'status\nexplain\nhistory\nreport\ndoctor\npurge\nquery\nstate\nvolumes\ncancel\ncheck-service' ;;
    '1 explain' | '1 purge' | '1 query')
      _spacekeepctl_matches "$current" < <("$tool" "${socket[@]}" volumes --names 2>/dev/null)
      ;;
    '1 state') _spacekeepctl_matches "$current" <<<$'get\nset\nunset\nlist' ;;
    '2 state get' | '2 state set' | '2 state unset')
      _spacekeepctl_matches "$current" < <("$tool" "${socket[@]}" state list --names 2>/dev/null)
      ;;
    '3 state set') _spacekeepctl_matches "$current" < <(_spacekeepctl_state_value "${words[2]}") ;;
  esac
}

complete -F _spacekeepctl spacekeepctl
