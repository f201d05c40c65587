# bash completion for kvrctl
_kvrctl() {
  local current=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD-1]}
  local commands="status device paired info refresh dismiss schedule-outreach account-added support-app web-url follow-ups activities timeline notify monitor doctor"
  case $previous in
    --policy) COMPREPLY=($(compgen -W "default cache refresh" -- "$current")); return ;;
    --svg) COMPREPLY=($(compgen -f -- "$current")); return ;;
    notify)
      COMPREPLY=($(compgen -W "com.tarsil.language.changed com.tarsil.pairedregistry.device-did-pair
        com.tarsil.pairedregistry.device-did-unpair" -- "$current"))
      return ;;
  esac
  if [ "$COMP_CWORD" -eq 1 ]; then
    COMPREPLY=($(compgen -W "$commands --help" -- "$current"))
    return
  fi
  local options="--json --show-serial --help"
  case ${COMP_WORDS[1]} in
    info) options+=" --policy --all" ;;
    schedule-outreach) options+=" --after" ;;
    account-added) options+=" --no-wait" ;;
    timeline) options+=" --svg" ;;
    status) options+=" --watch" ;;
  esac
  COMPREPLY=($(compgen -W "$options" -- "$current"))
}
complete -F _kvrctl kvrctl
