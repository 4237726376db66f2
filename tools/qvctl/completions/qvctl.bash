# Completion of qvctl for bash. To be found by bash-completion under the name "qvctl", or sourced.

# The commands below each command, and below the program.
declare -gA _qvctl_commands=(
  ['qvctl']='status sessions events watch send session reporting summary channels kill'
  ['qvctl session']='create start send stop destroy run'
  ['qvctl reporting']='on off show'
  ['qvctl summary']='list show open plot'
)

# The options of each command.
declare -gA _qvctl_options=(
  ['qvctl']='--help -h --version --socket --root --json'
  ['qvctl status']='--help -h --socket --root --json --start'
  ['qvctl sessions']='--help -h --socket --root --json --start'
  ['qvctl events']='--help -h --socket --root --json --kind --session --service --category --type --name
    --since --until --last -n --full'
  ['qvctl watch']='--help -h --socket --root --json --kind --session --service --category --type --name
    --since --count --for --full'
  ['qvctl send']='--help -h --socket --root --session --all --category --type --payload'
  ['qvctl session']='--help -h'
  ['qvctl session create']='--help -h --socket --root --json --service --set --configuration --start'
  ['qvctl session start']='--help -h --socket --root'
  ['qvctl session send']='--help -h --socket --root --category --type --payload'
  ['qvctl session stop']='--help -h --socket --root'
  ['qvctl session destroy']='--help -h --socket --root'
  ['qvctl session run']='--help -h --socket --root --id --service --set --configuration --category --anyway'
  ['qvctl reporting']='--help -h'
  ['qvctl reporting on']='--help -h --socket --root --json'
  ['qvctl reporting off']='--help -h --socket --root --json'
  ['qvctl reporting show']='--help -h --socket --root --json'
  ['qvctl summary']='--help -h'
  ['qvctl summary list']='--help -h --socket --root --json'
  ['qvctl summary show']='--help -h --socket --root --json'
  ['qvctl summary open']='--help -h --socket --root'
  ['qvctl summary plot']='--help -h --socket --root --json --key --width --height --ascii'
  ['qvctl channels']='--help -h --socket --root --json --group --interval --count'
  ['qvctl kill']='--help -h --socket --root'
)

_qvctl_services='generic voxa telephony haptics alarms standalone soundautoconfig longformaudio
  nonlongformaudio audiodeviceusage alerts test apiusage unknown'
_qvctl_kinds='Undefined Generic Record Playback PlaybackAndRecord Setup ClientRequest RouteChange
  Error Tallying Performance Volume Summary'
_qvctl_components='Session DSP HAL Routing Toolbox'
_qvctl_types='Generic Start Stop Setup Error IssueDetector Unknown'

_qvctl_categories() {
  local component kind
  printf '%s\n' $_qvctl_kinds $_qvctl_components
  for component in $_qvctl_components; do
    for kind in $_qvctl_kinds; do printf '%s.%s\n' "$component" "$kind"; done
  done
}

# Runs qvctl for what it knows, with the places that the command line names.
_qvctl_ask() {
  "${COMP_WORDS[0]}" "$@" "${_qvctl_places[@]}" 2>/dev/null
}

# The first column of a table, without its title.
_qvctl_column() {
  local word
  _qvctl_ask "$@" | sed 1d | while read -r word _; do printf '%s\n' "$word"; done
}

# The names of files, which may have spaces; what they begin with tells them from other columns.
_qvctl_summaries() {
  local line
  _qvctl_ask summary list | while IFS= read -r line; do
    if [[ $line =~ [0-9]{8}-[0-9]{6}[-+][0-9]{4}-quietvox-.* ]]; then printf '%s\n' "${BASH_REMATCH[0]}"; fi
  done
}

# The words that may follow an option, one a line; fails where the option takes none.
_qvctl_values() {
  case $1 in
    --socket | --root) compgen -f -- "$2" ;;
    --kind) printf '%s\n' start message analytics energy stop loss ;;
    --session | --id) _qvctl_column sessions ;;
    --service) printf '%s\n' $_qvctl_services ;;
    --category) _qvctl_categories ;;
    --type) printf '%s\n' $_qvctl_types ;;
    --since | --until) printf '%s\n' now today yesterday 10m 1h 1d ;;
    --for | --interval) printf '%s\n' 1s 10s 1m ;;
    --group) _qvctl_column channels ;;
    --last | -n | --count | --name | --key | --width | --height | --set | --payload | --configuration) ;;
    *) return 1 ;;
  esac
  return 0
}

# Offers those of the lines of standard input that begin with $2, with $1 before them.
#
# Clients and drivers choose names, and the shell reads what is offered: a line is compared as it is,
# quoted where it means something to the shell, and never expanded, as the words of compgen -W are.
_qvctl_offer() {
  local word quoted
  while IFS= read -r word; do
    printf -v quoted %q "$word"
    if [[ -n $word && ($word == "$2"* || $quoted == "$2"*) ]]; then COMPREPLY+=("$1$quoted"); fi
  done
}

_qvctl() {
  local current=${COMP_WORDS[COMP_CWORD]} previous='' command=qvctl prefix='' word values position
  local -a _qvctl_places=()
  COMPREPLY=()
  for ((position = 1; position < COMP_CWORD; ++position)); do
    word=${COMP_WORDS[position]}
    case $word in
      --)
        # From here on it is the command that is run.
        if declare -F _command_offset >/dev/null; then _command_offset $((position + 1)); fi
        return
        ;;
      --socket | --root)
        # "--root=DIR" comes as three words.
        if [[ ${COMP_WORDS[position + 1]} == = ]]; then
          _qvctl_places+=("$word=${COMP_WORDS[position + 2]-}")
        else
          _qvctl_places+=("$word" "${COMP_WORDS[position + 1]}")
        fi
        ;;
    esac
    if [[ " ${_qvctl_commands[$command]-} " == *" $word "* ]]; then
      command="$command $word"
    fi
  done

  if ((COMP_CWORD > 1)); then previous=${COMP_WORDS[COMP_CWORD - 1]}; fi
  if [[ $current == = ]]; then
    current=''
  elif [[ $previous == = ]]; then
    previous=${COMP_WORDS[COMP_CWORD - 2]}
  elif [[ $current == --*=* ]]; then
    # One word, where the shell is told not to part words at "=".
    previous=${current%%=*} prefix=${current%%=*}= current=${current#*=}
  fi
  if values=$(_qvctl_values "$previous" "$current"); then
    # Of a list, the last part is completed.
    if [[ $current == *,* ]]; then prefix+=${current%,*},; fi
    _qvctl_offer "$prefix" "${current##*,}" <<<"$values"
  elif [[ $current == -* ]]; then
    _qvctl_offer '' "$current" < <(printf '%s\n' ${_qvctl_options[$command]-})
  elif [[ -n ${_qvctl_commands[$command]-} ]]; then
    _qvctl_offer '' "$current" < <(printf '%s\n' ${_qvctl_commands[$command]})
  elif [[ $command == qvctl\ session\ * && $command != *\ create && $command != *\ run ]]; then
    _qvctl_offer '' "$current" < <(_qvctl_column sessions)
  elif [[ $command == qvctl\ summary\ * && $command != *\ list ]]; then
    _qvctl_offer '' "$current" < <(_qvctl_summaries)
  fi
}

complete -F _qvctl qvctl
