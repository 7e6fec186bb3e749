#compdef tallow
# Zsh completion of tallow(1).

local -a commands options
commands=(
  'index:index mail'
  'sync:bring the index in step with mailboxes'
  'status:show mailboxes and index'
  'search:search for messages'
  'explain:search and show how the query is understood'
  'delete:delete messages by identifier'
  'reset:delete everything that is indexed'
  'stats:show the statistics of store and index'
  'metrics:show the metrics of the text index'
  'ping:ask the daemon whether it is there'
  'vacuum:sort what is new into the index and compact it'
  'state:show the state of a client'
  'dump:print the text index, while no daemon runs'
  'validate:check the text index, while no daemon runs'
)
options=(
  '--runtime-dir=[directory of the sockets]:directory:_files -/'
  '--state-dir=[directory of the data]:directory:_files -/'
  '--class=[protection class]:class:'
  '--name=[name of this client]:name:'
  '--format=[output]:format:(text json files)'
  '--limit=[most results]:number:'
  '--color=[colours]:when:(auto always never)'
  '--wait=[seconds to wait for the daemon]:seconds:'
  '--query=[search by an expression]:expression:'
  '*--filter=[only what it holds for]:expression:'
  '--param=[parameters of this search]:KEY=VALUE,...:'
  '(-y --yes)'{-y,--yes}'[do not ask]'
  '(-v --verbose)'{-v,--verbose}'[name what was cut or ignored]'
  '(-n --dry-run)'{-n,--dry-run}'[only tell what sync would do]'
  '--prune-missing[delete the mail of directories that are not there]'
  '--retry[try again what could not be indexed]'
  '(-h --help)'{-h,--help}'[show help]'
  '--version[show the version]'
)
_arguments -S $options '1:command:{_describe command commands}' '*:argument:{ [[ $words[(I)(index|sync)] -gt 0 ]] && _files }'
