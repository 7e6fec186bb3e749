#include "cli/Examples.h"

namespace cli {

namespace {

struct Row {
  Command command;
  const char* lines;
};

constexpr Row kRows[] = {
    {Command::setup,
     "  tallow setup\n"
     "  tallow setup --dry-run\n"
     "  tallow setup --yes ~/Mail /srv/archive/2010.mbox"},
    {Command::index,
     "  tallow index ~/Mail\n"
     "  tallow index archive.mbox.gz\n"
     "  tallow index - < message.eml"},
    {Command::sync,
     "  tallow sync ~/Mail\n"
     "  tallow sync --dry-run --verbose"},
    {Command::watch,
     "  tallow watch\n"
     "  tallow watch ~/Mail --on-battery"},
    {Command::status, "  tallow status --format=json"},
    {Command::search,
     "  tallow search invoice li\n"
     "  tallow search from:mara date:2010.. -draft\n"
     "  tallow search '\"three loans\" OR subject:invoice' --sort=date\n"
     "  tallow search harbour --threads\n"
     "  tallow search --maildir ~/.cache/tallow/folders/search harbour\n"
     "  tallow search @bills --count"},
    {Command::screen,
     "  tallow\n"
     "  tallow screen from:mara invoice"},
    {Command::explain, "  tallow explain from:mara invoice"},
    {Command::remove,
     "  tallow delete ~/Mail/cur/1707208920.M001:2,S\n"
     "  tallow delete ~/Mail/.Old"},
    {Command::reset, "  tallow reset --class=work"},
    {Command::stats, "  tallow stats --format=json"},
    {Command::metrics, "  tallow metrics"},
    {Command::ping, "  tallow ping --wait=10"},
    {Command::vacuum, "  tallow vacuum"},
    {Command::state, "  tallow state --name=phone"},
    {Command::dump, "  systemctl --user stop 'tallowsearchd*' && tallow dump | less"},
    {Command::validate, "  systemctl --user stop 'tallowsearchd*' && tallow validate"},
    {Command::purge,
     "  tallow purge --dry-run\n"
     "  systemctl --user stop 'tallowsearchd*' && tallow purge"},
    {Command::show,
     "  tallow show 3\n"
     "  tallow show 3 --attachment 1 -o invoice.pdf\n"
     "  tallow show ~/Mail/cur/1707208920.M001:2,S --raw"},
    {Command::address,
     "  tallow address mara\n"
     "  mutt:  set query_command = \"tallow address --mutt -- %s\"\n"
     "  aerc:  address-book-cmd = tallow address -- %s"},
    {Command::save,
     "  tallow save bills subject:invoice OR subject:bill\n"
     "  tallow search @bills date:2010..\n"
     "  tallow save --delete bills"},
    {Command::mcp, "  tallow mcp --folder ~/Mail/lists --folder ~/Mail/work"},
};

}  // namespace

std::string examplesOf(Command command) {
  for (const Row& row : kRows) {
    if (row.command == command) return std::string("Examples:\n") + row.lines;
  }
  return "";
}

}  // namespace cli
