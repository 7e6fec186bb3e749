#include <CLI/CLI.hpp>

#include "bench/peers/Fts5.h"

// Indexes with Fts5Database in its own process, to measure its memory separately.
namespace {

int run(int argc, char** argv) {
  std::string spoolPath;
  std::string databasePath;
  CLI::App app("Indexes the items that peers_benchmark has spooled.", "fts5_index");
  app.add_option("SPOOL", spoolPath)->required();
  app.add_option("DATABASE", databasePath)->required();
  CLI11_PARSE(app, argc, argv);
  bench::ItemSpool spool(spoolPath);
  peers::Fts5Database database(databasePath);
  database.index(spool);
  database.checkpoint();
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("fts5_index", run, argc, argv);
}
