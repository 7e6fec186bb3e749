# Bash completion of tallow(1).

_tallow() {
  local cur=${COMP_WORDS[COMP_CWORD]} prev=${COMP_WORDS[COMP_CWORD - 1]}
  local commands='index sync watch status search explain delete reset stats metrics ping vacuum state dump
    validate purge help'
  local options='--runtime-dir --state-dir --class --name --format --limit --color --wait --yes
    --verbose --dry-run --prune-missing --retry --on-battery --query --filter --param --offset --sort --count
    --print0 --help --version'
  # Bash takes --option=value apart.
  if [[ $prev == = ]]; then
    prev=${COMP_WORDS[COMP_CWORD - 2]}
  elif [[ $cur == = ]]; then
    prev=${COMP_WORDS[COMP_CWORD - 1]} cur=
  fi
  COMPREPLY=()
  case $prev in
    --format) mapfile -t COMPREPLY < <(compgen -W 'text json files message-ids' -- "$cur"); return ;;
    --color) mapfile -t COMPREPLY < <(compgen -W 'auto always never' -- "$cur"); return ;;
    --sort) mapfile -t COMPREPLY < <(compgen -W 'relevance date' -- "$cur"); return ;;
    --runtime-dir | --state-dir) compopt -o dirnames; return ;;
    --class | --name | --limit | --offset | --wait | --query | --filter | --param) return ;;
  esac
  if [[ $cur == -* ]]; then
    mapfile -t COMPREPLY < <(compgen -W "$options" -- "$cur")
    return
  fi
  local word
  for word in "${COMP_WORDS[@]:1:COMP_CWORD-1}"; do
    if [[ " $commands " == *" $word "* ]]; then
      [[ $word == index || $word == sync || $word == watch ]] && compopt -o default
      return
    fi
  done
  mapfile -t COMPREPLY < <(compgen -W "$commands" -- "$cur")
}

complete -F _tallow tallow
