#include <CLI/CLI.hpp>
#include <iostream>
#include <memory>

#include "platform/error.h"
#include "platform/xostream.h"
#include "store/dump.h"
#include "tool/cache_option.h"
#include "tool/commands.h"

namespace vemo::tool {

namespace {

struct DumpArguments {
  std::string store;
  std::string map;
  std::optional<std::uint64_t> cacheBytes;
};

ExitCode RunDump(const DumpArguments& arguments) {
  const auto space = CSpace::Open(arguments.store, {.cacheBytes = arguments.cacheBytes});
  Snapshot snapshot(*space);
  xostream os(std::cout);
  DumpMap(snapshot, arguments.map, os);
  std::cout.flush();
  if (!std::cout) throw StoreError("the dump could not be written to standard output");
  return kGood;
}

}  // namespace

void AddDumpCommand(CLI::App& app, Command& chosen) {
  auto arguments = std::make_shared<DumpArguments>();
  CLI::App* command = app.add_subcommand("dump", "Print a root map as text");
  command->add_option("store", arguments->store, "The space: lmdb:PATH")->required();
  command->add_option("map", arguments->map, "The name of the root map, such as insertions")->required();
  AddCacheOption(*command, arguments->cacheBytes);
  command->footer("Example:\n  vemo dump lmdb:/tmp/history tombstones");
  command->callback([arguments, &chosen] { chosen = [arguments] { return RunDump(*arguments); }; });
}

}  // namespace vemo::tool
