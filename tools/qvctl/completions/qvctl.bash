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
  ['qvctl']='--help --version --socket --root --json'
  ['qvctl status']='--help --socket --root --json --start'
  ['qvctl sessions']='--help --socket --root --json --start'
  ['qvctl events']='--help --socket --root --json --kind --session --service --category --type --name
    --since --until --last --full'
  ['qvctl watch']='--help --socket --root --json --kind --session --service --category --type --name
    --since --count --for --full'
  ['qvctl send']='--help --socket --root --session --all --category --type --payload'
  ['qvctl session']='--help'
  ['qvctl session create']='--help --socket --root --json --service --set --configuration --start'
  ['qvctl session start']='--help --socket --root'
  ['qvctl session send']='--help --socket --root --category --type --payload'
  ['qvctl session stop']='--help --socket --root'
  ['qvctl session destroy']='--help --socket --root'
  ['qvctl session run']='--help --socket --root --id --service --set --configuration --category --anyway'
  ['qvctl reporting']='--help'
  ['qvctl reporting on']='--help --socket --root --json'
  ['qvctl reporting off']='--help --socket --root --json'
  ['qvctl reporting show']='--help --socket --root --json'
  ['qvctl summary']='--help'
  ['qvctl summary list']='--help --socket --root --json'
  ['qvctl summary show']='--help --socket --root --json'
  ['qvctl summary open']='--help --socket --root'
  ['qvctl summary plot']='--help --socket --root --json --key --width --height --ascii'
  ['qvctl channels']='--help --socket --root --json --group --interval --count'
  ['qvctl kill']='--help --socket --root'
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

_qvctl_sessions() { _qvctl_ask sessions | while read -r id _; do [[ $id == SESSION ]] || echo "$id"; done; }

# The words that may follow an option; fails where the option takes none.
_qvctl_values() {
  case $1 in
    --socket | --root) compgen -f -- "$2" ;;
    --kind) echo start message analytics energy stop loss ;;
    --session | --id) _qvctl_sessions ;;
    --service) echo $_qvctl_services ;;
    --category) _qvctl_categories ;;
    --type) echo $_qvctl_types ;;
    --since | --until) echo now today yesterday 10m 1h 1d ;;
    --for | --interval) echo 1s 10s 1m ;;
    --group) _qvctl_ask channels | while read -r group _; do [[ $group == GROUP ]] || echo "$group"; done ;;
    --last | -n | --count | --name | --key | --width | --height | --set | --payload | --configuration) ;;
    *) return 1 ;;
  esac
}

_qvctl() {
  local current=${COMP_WORDS[COMP_CWORD]} command=qvctl word values position
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
      --socket | --root) _qvctl_places+=("$word" "${COMP_WORDS[position + 1]}") ;;
    esac
    if [[ " ${_qvctl_commands[$command]-} " == *" $word "* ]]; then
      command="$command $word"
    fi
  done

  if ((COMP_CWORD > 1)) && values=$(_qvctl_values "${COMP_WORDS[COMP_CWORD - 1]}" "$current"); then
    # Of a list, the last part is completed.
    local prefix=''
    if [[ $current == *,* ]]; then prefix=${current%,*},; fi
    mapfile -t COMPREPLY < <(compgen -P "$prefix" -W "$values" -- "${current##*,}")
  elif [[ $current == -* ]]; then
    mapfile -t COMPREPLY < <(compgen -W "${_qvctl_options[$command]-}" -- "$current")
  elif [[ -n ${_qvctl_commands[$command]-} ]]; then
    mapfile -t COMPREPLY < <(compgen -W "${_qvctl_commands[$command]}" -- "$current")
  elif [[ $command == qvctl\ session\ * && $command != *\ create && $command != *\ run ]]; then
    mapfile -t COMPREPLY < <(compgen -W "$(_qvctl_sessions)" -- "$current")
  elif [[ $command == qvctl\ summary\ * && $command != *\ list ]]; then
    mapfile -t COMPREPLY < <(compgen -W "$(_qvctl_ask summary list | sed 1d | sed 's/.* //')" -- "$current")
  fi
}

complete -F _qvctl qvctl
