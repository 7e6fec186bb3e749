# Bash completion of tallow(1).

# The names of saved searches.
_tallow_saved() {
  command tallow save 2>/dev/null | cut -d ' ' -f 1
}

_tallow() {
  local cur=${COMP_WORDS[COMP_CWORD]} prev=${COMP_WORDS[COMP_CWORD - 1]}
  local commands='index sync watch status search screen explain show address save mcp delete reset stats metrics ping
    vacuum state dump validate purge help'
  local options='--runtime-dir --state-dir --class --name --format --limit --color --wait --yes
    --verbose --dry-run --prune-missing --retry --reread --attachments --no-attachments --on-battery --query --filter
    --param --offset --sort --count --print0 --threads --maildir --html --raw --attachment --output --force --mutt
    --delete --folder --help --version'
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
    --runtime-dir | --state-dir | --folder | --maildir) compopt -o dirnames; return ;;
    -o | --output | --html) compopt -o default; return ;;
    --class | --name | --limit | --offset | --wait | --attachment | --query | --filter | --param) return ;;
  esac
  if [[ $cur == -* ]]; then
    mapfile -t COMPREPLY < <(compgen -W "$options" -- "$cur")
    return
  fi
  local word
  for word in "${COMP_WORDS[@]:1:COMP_CWORD-1}"; do
    if [[ " $commands " == *" $word "* ]]; then
      case $word in
        index | sync | watch | show | delete) compopt -o default ;;
        search | screen | explain | save)
          # Bash takes @NAME apart as well, and yet replaces all of it.
          [[ $prev == @ || $cur == @* ]] &&
            mapfile -t COMPREPLY < <(compgen -P @ -W "$(_tallow_saved)" -- "${cur#@}")
          ;;
      esac
      return
    fi
  done
  mapfile -t COMPREPLY < <(compgen -W "$commands" -- "$cur")
}

complete -F _tallow tallow
